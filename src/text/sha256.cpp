#include "kivi/text/sha256.h"

#include <openssl/evp.h>

namespace kivi {
namespace {

// Fetched once: the implicit fetch behind EVP_sha256() looks the algorithm up
// again on every call, which dominates the cost of short inputs. The fetched
// method is immutable and may be shared by all threads; it lives until exit.
const EVP_MD* sha256Method() noexcept {
  static const EVP_MD* const method = [] {
    const EVP_MD* fetched = EVP_MD_fetch(nullptr, "SHA256", nullptr);
    return fetched ? fetched : EVP_sha256();
  }();
  return method;
}

}  // namespace

std::optional<Sha256Digest> sha256(std::span<const std::uint8_t> bytes) noexcept {
  Sha256Digest digest;
  unsigned int length = 0;
  if (EVP_Digest(bytes.data(), bytes.size(), digest.data(), &length, sha256Method(), nullptr) !=
          1 ||
      length != digest.size()) {
    return std::nullopt;
  }
  return digest;
}

std::optional<Sha256Digest> sha256(std::string_view bytes) noexcept {
  return sha256(std::span(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()));
}

std::string hexString(std::span<const std::uint8_t> bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text(bytes.size() * 2, '\0');
  char* out = text.data();
  for (const std::uint8_t byte : bytes) {
    *out++ = kDigits[byte >> 4];
    *out++ = kDigits[byte & 0x0F];
  }
  return text;
}

std::string sha256Hex(std::span<const std::uint8_t> bytes) {
  const auto digest = sha256(bytes);
  return digest ? hexString(*digest) : std::string();
}

std::string sha256Hex(std::string_view bytes) {
  const auto digest = sha256(bytes);
  return digest ? hexString(*digest) : std::string();
}

}  // namespace kivi
