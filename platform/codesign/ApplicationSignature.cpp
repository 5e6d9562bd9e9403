#include "platform/codesign/ApplicationSignature.h"

#include <sys/stat.h>

#include <filesystem>
#include <list>
#include <mutex>
#include <tuple>
#include <vector>

#include "platform/codesign/BundleSignature.h"
#include "platform/codesign/DigestCache.h"
#include "platform/codesign/TrustStore.h"
#include "platform/os/Digest.h"
#include "platform/os/Log.h"
#include "platform/value/PropertyList.h"

namespace codesign {

namespace {

namespace fs = std::filesystem;

constexpr std::size_t kKeptBundles = 16;

// What the files of a bundle are, as far as their metadata tells.
using Fingerprint =
    std::vector<std::tuple<std::string, dev_t, ino_t, off_t, std::int64_t, std::int64_t>>;

struct Kept {
  std::string bundle;
  Fingerprint fingerprint;
  BundleSignature::Verification verification;
};

std::int64_t nanoseconds(const timespec& time) {
  return static_cast<std::int64_t>(time.tv_sec) * 1000000000 + time.tv_nsec;
}

Fingerprint fingerprintOf(const std::string& bundle) {
  Fingerprint fingerprint;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(bundle, ec), end; !ec && it != end; it.increment(ec)) {
    // A bundle this large never verifies; walking on would only cost every connection.
    if (fingerprint.size() > BundleSignature::kMaxFiles) break;
    struct stat st {};
    if (lstat(it->path().c_str(), &st) != 0) continue;
    fingerprint.emplace_back(it->path().string(), st.st_dev, st.st_ino, st.st_size,
                             nanoseconds(st.st_mtim), nanoseconds(st.st_ctim));
  }
  return fingerprint;
}

// The verification of |bundle|, kept while its files stay as they were.
BundleSignature::Verification verified(const std::string& bundle) {
  static std::mutex mutex;
  static std::list<Kept> kept;  // most recently used first
  Fingerprint now = fingerprintOf(bundle);
  std::lock_guard lock(mutex);
  for (auto it = kept.begin(); it != kept.end(); ++it) {
    if (it->bundle != bundle || it->fingerprint != now) continue;
    kept.splice(kept.begin(), kept, it);
    return kept.front().verification;
  }
  kept.push_front({bundle, std::move(now), BundleSignature::verify(bundle)});
  if (kept.size() > kKeptBundles) kept.pop_back();
  return kept.front().verification;
}

std::optional<std::string> enclosingApplication(const std::string& path) {
  for (fs::path at = fs::path(path).parent_path(); at.has_relative_path(); at = at.parent_path()) {
    if (at.filename().string().ends_with(".app")) return at.string();
  }
  return std::nullopt;
}

std::string identifierOf(const std::string& bundle) {
  os::Result<value::Value> info = value::PropertyList::readFile(bundle + "/Info.plist");
  const value::Dictionary* fields = info.ok() ? info.value().asDictionary() : nullptr;
  const value::Value* identifier = fields ? fields->find("QFBundleIdentifier") : nullptr;
  return identifier && identifier->asString() ? *identifier->asString() : std::string();
}

// The dictionary of the bundle's Entitlements.plist when it holds the bytes the signature names.
std::optional<value::Dictionary> signedEntitlements(const std::string& bundle,
                                                    const BundleSignature::Digests& files) {
  auto listed = files.find("Entitlements.plist");
  if (listed == files.end()) return value::Dictionary();
  std::string path = bundle + "/Entitlements.plist";
  os::Result<std::string> digest = os::Digest::sha256File(path);
  os::Result<value::Value> contents = value::PropertyList::readFile(path);
  if (!digest.ok() || digest.value() != listed->second || !contents.ok() ||
      !contents.value().asDictionary()) {
    return std::nullopt;
  }
  return *contents.value().asDictionary();
}

void refuse(const std::string& path, const std::string& bundle, const std::string& why) {
  os::Log::write(5, "host " + path + ": application " + bundle + " grants no entitlements: " + why);
}

}  // namespace

std::optional<value::Dictionary> ApplicationSignature::entitlementsFor(const std::string& path,
                                                                       int imageFd) {
  std::optional<std::string> bundle = enclosingApplication(path);
  if (!bundle) return std::nullopt;
  BundleSignature::Verification verification = verified(*bundle);
  if (verification.state == BundleSignature::State::Unsigned) return std::nullopt;
  os::Result<TrustStore> store = TrustStore::load();
  TrustStore::Judgement judged =
      store.ok()
          ? store.value().judge(verification, identifierOf(*bundle))
          : TrustStore::Judgement{TrustStore::Outcome::UntrustedSigner, {}, store.error().message};
  if (judged.outcome != TrustStore::Outcome::Trusted) {
    refuse(path, *bundle, judged.reason);
    return std::nullopt;
  }
  auto image = verification.files.find(fs::relative(path, *bundle).generic_string());
  std::optional<std::string> running;
  if (imageFd >= 0) {
    auto digest = DigestCache::shared().sha256(imageFd, path);
    if (digest.ok()) running = digest.value();
  }
  if (image == verification.files.end() || running != image->second) {
    refuse(path, *bundle, "the running program is not a file the bundle signed");
    return std::nullopt;
  }
  std::optional<value::Dictionary> entitlements = signedEntitlements(*bundle, verification.files);
  if (!entitlements) refuse(path, *bundle, "Entitlements.plist is not the one signed");
  return entitlements;
}

}  // namespace codesign
