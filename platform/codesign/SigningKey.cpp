#include "platform/codesign/SigningKey.h"

#include <fcntl.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "platform/os/Digest.h"

namespace codesign {

namespace {

std::shared_ptr<EVP_PKEY> adopt(EVP_PKEY* key) {
  return std::shared_ptr<EVP_PKEY>(key, EVP_PKEY_free);
}

os::Error cryptoError(const std::string& what) {
  return os::Error{EINVAL, what};
}

}  // namespace

SigningKey::SigningKey(std::shared_ptr<EVP_PKEY> key, bool isPrivate)
    : key_(std::move(key)), private_(isPrivate) {
  std::size_t length = publicKey_.size();
  EVP_PKEY_get_raw_public_key(key_.get(), publicKey_.data(), &length);
}

os::Result<SigningKey> SigningKey::generate() {
  EVP_PKEY* key = EVP_PKEY_Q_keygen(nullptr, nullptr, "ED25519");
  if (!key) return cryptoError("cannot make an Ed25519 key");
  return SigningKey(adopt(key), true);
}

os::Result<SigningKey> SigningKey::readPrivate(const std::string& path) {
  std::FILE* file = std::fopen(path.c_str(), "re");
  if (!file) return os::Error::fromErrno(path);
  EVP_PKEY* key = PEM_read_PrivateKey(file, nullptr, nullptr, nullptr);
  std::fclose(file);
  if (!key) return cryptoError(path + ": no private key in PEM form");
  auto owned = adopt(key);
  if (EVP_PKEY_get_id(key) != EVP_PKEY_ED25519) {
    return cryptoError(path + ": not an Ed25519 key");
  }
  return SigningKey(owned, true);
}

os::Result<SigningKey> SigningKey::fromPublic(std::span<const std::uint8_t> bytes) {
  if (bytes.size() != PublicKey().size()) {
    return cryptoError("an Ed25519 public key has 32 bytes, not " + std::to_string(bytes.size()));
  }
  EVP_PKEY* key =
      EVP_PKEY_new_raw_public_key(EVP_PKEY_ED25519, nullptr, bytes.data(), bytes.size());
  if (!key) return cryptoError("not an Ed25519 public key");
  return SigningKey(adopt(key), false);
}

os::Status SigningKey::writePrivate(const std::string& path) const {
  if (!private_) return cryptoError("a public key cannot be written as a private one");
  int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
  if (fd < 0) return os::Error::fromErrno(path);
  std::FILE* file = fdopen(fd, "w");
  if (!file) {
    os::Error error = os::Error::fromErrno(path);
    close(fd);
    return error;
  }
  bool written = PEM_write_PrivateKey(file, key_.get(), nullptr, nullptr, 0, nullptr, nullptr) == 1;
  bool closed = std::fclose(file) == 0;
  if (!written || !closed) {
    unlink(path.c_str());
    return os::Error{EIO, path + ": cannot write the key"};
  }
  return os::success();
}

std::string SigningKey::keyIdOf(std::span<const std::uint8_t> publicKey) {
  os::Digest::Sha256 digest = os::Digest::sha256(
      std::string_view(reinterpret_cast<const char*>(publicKey.data()), publicKey.size()));
  return os::Digest::hex(digest);
}

os::Result<SigningKey::Signature> SigningKey::sign(std::string_view message) const {
  if (!private_) return cryptoError("a public key cannot sign");
  std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(),
                                                                  EVP_MD_CTX_free);
  Signature signature{};
  std::size_t length = signature.size();
  const auto* bytes = reinterpret_cast<const unsigned char*>(message.data());
  if (!context || EVP_DigestSignInit(context.get(), nullptr, nullptr, nullptr, key_.get()) != 1 ||
      EVP_DigestSign(context.get(), signature.data(), &length, bytes, message.size()) != 1) {
    return cryptoError("cannot sign");
  }
  return signature;
}

bool SigningKey::verify(std::string_view message, std::span<const std::uint8_t> signature) const {
  std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(),
                                                                  EVP_MD_CTX_free);
  const auto* bytes = reinterpret_cast<const unsigned char*>(message.data());
  return context &&
         EVP_DigestVerifyInit(context.get(), nullptr, nullptr, nullptr, key_.get()) == 1 &&
         EVP_DigestVerify(context.get(), signature.data(), signature.size(), bytes,
                          message.size()) == 1;
}

}  // namespace codesign
