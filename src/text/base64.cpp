#include "kivi/text/base64.h"

#include <array>
#include <bit>
#include <cstring>

namespace kivi::base64 {
namespace {

constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

// Encoding looks up twelve bits at a time: entry i holds the two characters
// for the six-bit values i >> 6 and i & 63, in output order.
constexpr auto kPairs = [] {
  std::array<std::array<char, 2>, 4096> pairs{};
  for (std::size_t i = 0; i < pairs.size(); ++i) pairs[i] = {kAlphabet[i >> 6], kAlphabet[i & 63]};
  return pairs;
}();

// Decoding ORs one table entry per character of a group of four: the entry
// holds the character's six bits already shifted into place in the 24-bit
// group value, or kInvalid, which sets a bit above the group value and so
// survives the OR.
constexpr std::uint32_t kInvalid = 0x01000000;

constexpr std::array<std::uint32_t, 256> decodeTable(int shift) {
  std::array<std::uint32_t, 256> table{};
  table.fill(kInvalid);
  for (std::uint32_t value = 0; value < 64; ++value) {
    table[static_cast<unsigned char>(kAlphabet[value])] = value << shift;
  }
  return table;
}

constexpr auto kDecode0 = decodeTable(18);
constexpr auto kDecode1 = decodeTable(12);
constexpr auto kDecode2 = decodeTable(6);
constexpr auto kDecode3 = decodeTable(0);

std::uint64_t loadBigEndian64(const std::uint8_t* p) noexcept {
  std::uint64_t value;
  std::memcpy(&value, p, sizeof value);
  if constexpr (std::endian::native == std::endian::little) value = __builtin_bswap64(value);
  return value;
}

void storeBigEndian64(std::uint8_t* p, std::uint64_t value) noexcept {
  if constexpr (std::endian::native == std::endian::little) value = __builtin_bswap64(value);
  std::memcpy(p, &value, sizeof value);
}

void putPair(char* out, std::uint64_t twelveBits) noexcept {
  std::memcpy(out, kPairs[twelveBits & 0xFFF].data(), 2);
}

void encodeInto(const std::uint8_t* in, std::size_t size, char* out) noexcept {
  std::size_t i = 0;
  // Six bytes (48 bits, four pairs) per step, read as one eight-byte load.
  for (; size - i >= 8; i += 6, out += 8) {
    const std::uint64_t bits = loadBigEndian64(in + i);
    putPair(out, bits >> 52);
    putPair(out + 2, bits >> 40);
    putPair(out + 4, bits >> 28);
    putPair(out + 6, bits >> 16);
  }
  for (; size - i >= 3; i += 3, out += 4) {
    const std::uint32_t bits =
        (std::uint32_t{in[i]} << 16) | (std::uint32_t{in[i + 1]} << 8) | std::uint32_t{in[i + 2]};
    putPair(out, bits >> 12);
    putPair(out + 2, bits);
  }
  if (size - i == 1) {
    const std::uint32_t bits = std::uint32_t{in[i]} << 4;  // 12 bits, low four zero
    putPair(out, bits);
    out[2] = out[3] = '=';
  } else if (size - i == 2) {
    const std::uint32_t bits = (std::uint32_t{in[i]} << 10) | (std::uint32_t{in[i + 1]} << 2);
    putPair(out, bits >> 6);
    out[2] = kAlphabet[bits & 63];
    out[3] = '=';
  }
}

std::uint32_t group(const std::uint8_t* in) noexcept {
  return kDecode0[in[0]] | kDecode1[in[1]] | kDecode2[in[2]] | kDecode3[in[3]];
}

// The number of bytes `text` decodes to, or std::nullopt when its length or
// padding cannot be standard base64. The characters are checked later.
std::optional<std::size_t> decodedSize(std::string_view text) noexcept {
  if (text.size() % 4 != 0) return std::nullopt;
  std::size_t padding = 0;
  if (!text.empty() && text.back() == '=') padding = text[text.size() - 2] == '=' ? 2 : 1;
  return text.size() / 4 * 3 - padding;
}

// Decodes `text`, whose size decodedSize() accepted, into `out`, which holds
// exactly that many bytes. False on any character that is out of place.
bool decodeInto(std::string_view text, std::uint8_t* out, std::size_t outSize) noexcept {
  const auto* in = reinterpret_cast<const std::uint8_t*>(text.data());
  const std::size_t size = text.size();
  if (size == 0) return true;
  const std::size_t padding = size / 4 * 3 - outSize;
  const std::size_t fullGroups = size / 4 - (padding != 0);
  std::size_t g = 0;
  // Two groups (six bytes) per step, written as one eight-byte store while
  // the output has room for its two surplus bytes; later groups overwrite them.
  for (; g + 2 <= fullGroups && outSize - g * 3 >= 8; g += 2) {
    const std::uint32_t first = group(in + g * 4);
    const std::uint32_t second = group(in + g * 4 + 4);
    if ((first | second) & kInvalid) return false;
    storeBigEndian64(out + g * 3, (std::uint64_t{first} << 40) | (std::uint64_t{second} << 16));
  }
  for (; g < fullGroups; ++g) {
    const std::uint32_t bits = group(in + g * 4);
    if (bits & kInvalid) return false;
    std::uint8_t* o = out + g * 3;
    o[0] = static_cast<std::uint8_t>(bits >> 16);
    o[1] = static_cast<std::uint8_t>(bits >> 8);
    o[2] = static_cast<std::uint8_t>(bits);
  }
  if (padding == 0) return true;
  // The last group: two or three alphabet characters, then the padding.
  const std::uint8_t* last = in + fullGroups * 4;
  std::uint8_t* o = out + fullGroups * 3;
  std::uint32_t bits = kDecode0[last[0]] | kDecode1[last[1]];
  if (padding == 1) bits |= kDecode2[last[2]];
  if (bits & kInvalid) return false;
  o[0] = static_cast<std::uint8_t>(bits >> 16);
  if (padding == 1) o[1] = static_cast<std::uint8_t>(bits >> 8);
  return true;
}

template <typename Bytes>
std::optional<Bytes> decodeAs(std::string_view text) {
  const auto size = decodedSize(text);
  if (!size) return std::nullopt;
  Bytes bytes(*size, 0);
  if (!decodeInto(text, reinterpret_cast<std::uint8_t*>(bytes.data()), bytes.size())) {
    return std::nullopt;
  }
  return bytes;
}

}  // namespace

std::string encode(std::span<const std::uint8_t> bytes) {
  std::string text(encodedLength(bytes.size()), '\0');
  encodeInto(bytes.data(), bytes.size(), text.data());
  return text;
}

std::string encode(std::string_view bytes) {
  return encode(std::span(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()));
}

std::optional<Data> decode(std::string_view text) { return decodeAs<Data>(text); }

std::optional<std::string> decodeToString(std::string_view text) {
  return decodeAs<std::string>(text);
}

}  // namespace kivi::base64
