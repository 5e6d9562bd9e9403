#include "platform/codesign/BundleSignature.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <vector>

#include "platform/os/AtomicFile.h"
#include "platform/os/Digest.h"
#include "platform/value/PropertyList.h"

namespace codesign {

namespace {

namespace fs = std::filesystem;

constexpr std::int64_t kFormat = 1;

os::Error refused(const std::string& why) {
  return os::Error{EINVAL, why};
}

// The SHA-256 of the regular file at |path|, opened without following a link or blocking.
os::Result<std::string> fileDigest(const std::string& path, std::uint64_t& bytes) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
  if (fd < 0) return os::Error::fromErrno(path);
  struct stat st {};
  os::Result<std::string> digest = os::Error{EINVAL, path + ": not a regular file"};
  if (fstat(fd, &st) == 0 && S_ISREG(st.st_mode)) {
    bytes += static_cast<std::uint64_t>(st.st_size);
    digest = bytes > BundleSignature::kMaxBytes
                 ? os::Result<std::string>(refused("more than 256 MiB of files"))
                 : os::Digest::sha256File(fd);
  }
  close(fd);
  return digest;
}

// The bundles inside |bundle|, innermost first.
std::vector<std::string> innerBundles(const std::string& bundle) {
  std::vector<std::string> inner;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(bundle, ec), end; !ec && it != end; it.increment(ec)) {
    if (!it->is_directory(ec) || it->is_symlink(ec)) continue;
    std::string name = it->path().filename().string();
    if (name.ends_with(".appex") || name.ends_with(".app")) inner.push_back(it->path().string());
  }
  std::sort(inner.begin(), inner.end(), [](const std::string& a, const std::string& b) {
    return std::count(a.begin(), a.end(), '/') > std::count(b.begin(), b.end(), '/');
  });
  return inner;
}

os::Status signOne(const std::string& bundle, const SigningKey& key) {
  os::Result<BundleSignature::Digests> files = BundleSignature::digests(bundle);
  if (!files.ok()) return files.error();
  os::Result<SigningKey::Signature> signature = key.sign(BundleSignature::message(files.value()));
  if (!signature.ok()) return signature.error();
  std::map<std::string, value::Value> listed;
  for (const auto& [path, digest] : files.value()) listed[path] = value::Value::string(digest);
  const SigningKey::PublicKey& publicKey = key.publicKey();
  value::Dictionary contents{
      {"Format", value::Value::integer(kFormat)},
      {"PublicKey", value::Value::data(value::Data(publicKey.begin(), publicKey.end()))},
      {"Files", value::Value::dictionary(value::Dictionary(std::move(listed)))},
      {"Signature",
       value::Value::data(value::Data(signature.value().begin(), signature.value().end()))},
  };
  os::Result<std::string> xml = value::PropertyList::toXml(value::Value::dictionary(contents));
  if (!xml.ok()) return xml.error();
  return os::AtomicFile::replace(bundle + "/" + std::string(BundleSignature::kFileName),
                                 xml.value(), os::AtomicFile::Durability::Durable, 0644);
}

BundleSignature::Verification tampered(std::string reason) {
  return {BundleSignature::State::Tampered, {}, std::move(reason), {}};
}

// The first difference between the signed digests and the bundle's; empty when there is none.
std::string difference(const BundleSignature::Digests& signed_,
                       const BundleSignature::Digests& now) {
  for (const auto& [path, digest] : signed_) {
    auto found = now.find(path);
    if (found == now.end()) return path + " is missing";
    if (found->second != digest) return path + " was changed";
  }
  for (const auto& entry : now) {
    if (!signed_.contains(entry.first)) return entry.first + " was added";
  }
  return {};
}

}  // namespace

os::Result<BundleSignature::SignatureFile> BundleSignature::parse(const value::Value& file) {
  const value::Dictionary* fields = file.asDictionary();
  const value::Value* format = fields ? fields->find("Format") : nullptr;
  const value::Value* publicKey = fields ? fields->find("PublicKey") : nullptr;
  const value::Value* listed = fields ? fields->find("Files") : nullptr;
  const value::Value* signature = fields ? fields->find("Signature") : nullptr;
  if (!format || format->integerValue() != kFormat || !publicKey || !publicKey->asData() ||
      !listed || !listed->asDictionary() || !signature || !signature->asData()) {
    return refused("the signature file is not of format 1");
  }
  os::Result<SigningKey> key = SigningKey::fromPublic(*publicKey->asData());
  if (!key.ok()) return refused("the signature file's key: " + key.error().message);
  Digests files;
  for (const auto& [path, digest] : *listed->asDictionary()) {
    if (!digest.asString())
      return refused("the signature file's digest of " + path + " is no string");
    files[path] = *digest.asString();
  }
  return SignatureFile{std::move(key).value(), std::move(files), *signature->asData()};
}

os::Result<BundleSignature::Digests> BundleSignature::digests(const std::string& bundle) {
  Digests files;
  std::uint64_t bytes = 0;
  std::error_code ec;
  fs::recursive_directory_iterator it(bundle, ec), end;
  if (ec) return os::Error{ec.value(), bundle + ": " + ec.message()};
  for (; it != end; it.increment(ec)) {
    if (ec) return os::Error{ec.value(), bundle + ": " + ec.message()};
    std::string relative = fs::relative(it->path(), bundle, ec).generic_string();
    fs::file_status status = it->symlink_status(ec);
    if (fs::is_directory(status)) continue;
    if (fs::is_symlink(status)) return refused("a symbolic link at " + relative);
    if (!fs::is_regular_file(status)) return refused("a special file at " + relative);
    if (relative.find('\n') != std::string::npos) return refused("a line break in a file name");
    if (relative == kFileName) continue;
    if (files.size() == kMaxFiles) return refused("more than 4096 files");
    os::Result<std::string> digest = fileDigest(it->path().string(), bytes);
    if (!digest.ok()) return digest.error();
    files[relative] = digest.value();
  }
  return files;
}

std::string BundleSignature::message(const Digests& files) {
  std::string text(kHeader);
  for (const auto& [path, digest] : files) text += digest + "  " + path + "\n";
  return text;
}

os::Status BundleSignature::sign(const std::string& bundle, const SigningKey& key) {
  for (const std::string& inner : innerBundles(bundle)) {
    os::Status signedInner = signOne(inner, key);
    if (!signedInner.ok()) return signedInner;
  }
  return signOne(bundle, key);
}

BundleSignature::Verification BundleSignature::verify(const std::string& bundle) {
  std::string path = bundle + "/" + std::string(kFileName);
  struct stat st {};
  if (lstat(path.c_str(), &st) != 0 && errno == ENOENT) return {};
  if (!S_ISREG(st.st_mode)) return tampered("the signature file is not a regular file");
  os::Result<value::Value> file = value::PropertyList::readFile(path);
  if (!file.ok()) return tampered("the signature file: " + file.error().message);
  os::Result<SignatureFile> parsed = parse(file.value());
  if (!parsed.ok()) return tampered(parsed.error().message);
  const SignatureFile& signature = parsed.value();
  if (!signature.key.verify(message(signature.files), signature.signature)) {
    return tampered("the signature does not verify");
  }
  os::Result<Digests> now = digests(bundle);
  if (!now.ok()) return tampered(now.error().message);
  std::string changed = difference(signature.files, now.value());
  if (!changed.empty()) return tampered(changed);
  return {State::Signed, signature.key.keyId(), {}, signature.files};
}

std::string_view BundleSignature::stateName(State state) {
  switch (state) {
    case State::Unsigned:
      return "unsigned";
    case State::Signed:
      return "signed";
    case State::Tampered:
      return "tampered";
  }
  return "unsigned";
}

}  // namespace codesign
