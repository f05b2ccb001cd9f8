#include "linux/vald/cloud/ContentHash.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <stdexcept>

namespace skein::vald {

std::optional<ContentHash> ContentHash::parse(std::string_view text) {
  const auto digit = [](char c) -> int {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    return -1;
  };
  Bytes bytes;
  if (text.size() != 2 * bytes.size()) return std::nullopt;
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    const int high = digit(text[2 * i]);
    const int low = digit(text[2 * i + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    bytes[i] = static_cast<std::uint8_t>(high * 16 + low);
  }
  return ContentHash(bytes);
}

std::string ContentHash::asString() const {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * _bytes.size());
  for (const std::uint8_t byte : _bytes) {
    text += kDigits[byte >> 4];
    text += kDigits[byte & 15];
  }
  return text;
}

ContentHash keyedHash(std::string_view key, std::string_view text) {
  ContentHash::Bytes bytes{};
  unsigned int size = 0;
  if (HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()),
           reinterpret_cast<const unsigned char*>(text.data()), text.size(), bytes.data(),
           &size) == nullptr ||
      size != bytes.size()) {
    throw std::runtime_error("the keyed hash failed");
  }
  return ContentHash(bytes);
}

// libcrypto, since it uses the processor's own instructions where there are some: 4 times
// as fast as portable code.
struct ContentHasher::Context {
  Context() : digest(EVP_MD_CTX_new()) {
    if (digest == nullptr || EVP_DigestInit_ex(digest, EVP_sha256(), nullptr) != 1) {
      EVP_MD_CTX_free(digest);
      throw std::runtime_error("libcrypto offers no SHA-256");
    }
  }
  ~Context() { EVP_MD_CTX_free(digest); }
  Context(const Context&) = delete;
  Context& operator=(const Context&) = delete;

  EVP_MD_CTX* digest;
};

ContentHasher::ContentHasher() : _context(std::make_unique<Context>()) {}
ContentHasher::~ContentHasher() = default;

void ContentHasher::update(const void* data, std::size_t size) {
  if (EVP_DigestUpdate(_context->digest, data, size) != 1) {
    throw std::runtime_error("SHA-256 failed");
  }
}

ContentHash ContentHasher::finish() {
  ContentHash::Bytes bytes;
  unsigned int size = 0;
  if (EVP_DigestFinal_ex(_context->digest, bytes.data(), &size) != 1 || size != bytes.size()) {
    throw std::runtime_error("SHA-256 failed");
  }
  return ContentHash(bytes);
}

}  // namespace skein::vald
