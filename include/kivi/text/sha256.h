// SHA-256 digests (FIPS 180-4) of byte strings, and lowercase hexadecimal text
// for any digest or byte string.
//
//   kivi::sha256Hex("abc")
//   // "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"
//
//   std::optional<kivi::Sha256Digest> digest = kivi::sha256(data);
//   std::string text = kivi::hexString(*digest);   // 64 lowercase digits
//
// The digest comes from OpenSSL. It fails only when OpenSSL cannot allocate
// its context; that is answered in band (std::nullopt, or an empty text).
//
// Thread contract: every function is pure and may run on any thread at once.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "kivi/export.h"

namespace kivi {

// A digest: 32 bytes.
inline constexpr std::size_t kSha256DigestLength = 32;
using Sha256Digest = std::array<std::uint8_t, kSha256DigestLength>;

// The digest of `bytes`; std::nullopt only when OpenSSL fails.
KIVI_EXPORT std::optional<Sha256Digest> sha256(std::span<const std::uint8_t> bytes) noexcept;
KIVI_EXPORT std::optional<Sha256Digest> sha256(std::string_view bytes) noexcept;

// Each byte as two lowercase hexadecimal digits ("%02x"), first to last.
KIVI_EXPORT std::string hexString(std::span<const std::uint8_t> bytes);

// The digest of `bytes` as 64 lowercase hexadecimal digits; empty only when
// OpenSSL fails.
KIVI_EXPORT std::string sha256Hex(std::span<const std::uint8_t> bytes);
KIVI_EXPORT std::string sha256Hex(std::string_view bytes);

}  // namespace kivi
