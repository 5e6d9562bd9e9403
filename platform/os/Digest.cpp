#include "platform/os/Digest.h"

#include <fcntl.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <new>
#include <vector>

namespace os {

namespace {

template <std::size_t N>
std::array<std::uint8_t, N> digest(const EVP_MD* md, std::string_view bytes) {
  std::array<std::uint8_t, N> out{};
  unsigned int length = 0;
  if (!EVP_Digest(bytes.data(), bytes.size(), out.data(), &length, md, nullptr) || length != N) {
    throw std::bad_alloc();
  }
  return out;
}

using DigestContext = std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)>;

DigestContext newSha256Context() {
  DigestContext context(EVP_MD_CTX_new(), &EVP_MD_CTX_free);
  if (!context || !EVP_DigestInit_ex(context.get(), EVP_sha256(), nullptr)) {
    throw std::bad_alloc();
  }
  return context;
}

}  // namespace

Digest::Sha1 Digest::sha1(std::string_view bytes) {
  return digest<20>(EVP_sha1(), bytes);
}

Digest::Sha256 Digest::sha256(std::string_view bytes) {
  return digest<32>(EVP_sha256(), bytes);
}

Digest::Sha256 Digest::hmacSha256(std::string_view key, std::string_view bytes) {
  Sha256 out{};
  unsigned int length = 0;
  const auto* data = reinterpret_cast<const unsigned char*>(bytes.data());
  if (!HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()), data, bytes.size(), out.data(),
            &length) ||
      length != out.size()) {
    throw std::bad_alloc();
  }
  return out;
}

Result<std::string> Digest::sha256File(const std::string& path) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return Error::fromErrno("open " + path);
  Result<std::string> result = sha256File(fd);
  close(fd);
  return result;
}

Result<std::string> Digest::sha256File(int fd) {
  DigestContext context = newSha256Context();
  std::vector<char> buffer(1 << 16);
  off_t offset = 0;
  for (;;) {
    ssize_t n = pread(fd, buffer.data(), buffer.size(), offset);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::fromErrno("read for sha256");
    if (n == 0) break;
    if (!EVP_DigestUpdate(context.get(), buffer.data(), static_cast<std::size_t>(n))) {
      throw std::bad_alloc();
    }
    offset += n;
  }
  Sha256 out{};
  if (!EVP_DigestFinal_ex(context.get(), out.data(), nullptr)) throw std::bad_alloc();
  return hex(out);
}

std::string Digest::hex(std::span<const std::uint8_t> bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(bytes.size() * 2);
  for (std::uint8_t byte : bytes) {
    text.push_back(kDigits[byte >> 4]);
    text.push_back(kDigits[byte & 0xf]);
  }
  return text;
}

}  // namespace os
