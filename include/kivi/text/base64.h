// Standard base64 (RFC 4648 §4): the alphabet A–Z a–z 0–9 + /, padded with
// "=" to a multiple of four characters, without line breaks.
//
//   kivi::base64::encode("ab")                  // "YWI="
//   kivi::base64::decode("YWI=")                // Data{'a', 'b'}
//   kivi::base64::decode("YWI")                 // std::nullopt: padding missing
//   kivi::base64::decode("YW I=")               // std::nullopt: stray blank
//
// Decoding is strict. The text is refused (std::nullopt) when its length is
// not a multiple of four, when it holds any character outside the alphabet
// (blanks and line breaks included), when "=" appears anywhere but as one or
// two final characters, or when a final group has fewer than two alphabet
// characters ("Y==="). The unused low bits of the last character before the
// padding are not checked: "YR==" decodes like "YQ==" to "a". RFC 4648 §3.5
// leaves that check to the decoder, and the common platform decoders accept
// such text; refusing it would reject data that peers already send.
//
// Thread contract: every function is pure and may run on any thread at once.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi::base64 {

// The length of the encoding of `byteCount` bytes: 4 * ceil(byteCount / 3).
constexpr std::size_t encodedLength(std::size_t byteCount) noexcept {
  return (byteCount / 3 + (byteCount % 3 != 0)) * 4;
}

// The padded base64 text of `bytes`, encodedLength() characters long.
KIVI_EXPORT std::string encode(std::span<const std::uint8_t> bytes);
KIVI_EXPORT std::string encode(std::string_view bytes);

// The bytes `text` encodes, or std::nullopt when it is not strict standard
// base64 (see above). The empty text decodes to no bytes.
KIVI_EXPORT std::optional<Data> decode(std::string_view text);

// As decode(), with the bytes in a std::string. They are not checked to be
// UTF-8 or free of NUL.
KIVI_EXPORT std::optional<std::string> decodeToString(std::string_view text);

}  // namespace kivi::base64
