#include "kivi/logging/kiv_obfuscator.h"

#include <algorithm>
#include <new>

#include "kivi/text/unicode_text.h"

namespace kivi {

namespace {

// r is the position's n × (i + 1) mod 91; the shift is r + 1. The compare
// is between signed 8-bit values, which is what makes bytes outside the
// rotation's range behave as they do (and lets the loops below run on
// vectors of bytes).
inline std::uint8_t obfuscated(std::uint8_t c, std::uint8_t r) noexcept {
  const auto d = static_cast<std::int8_t>(c - 35);
  const auto below = static_cast<std::int8_t>(r) < d;
  return static_cast<std::uint8_t>(c - r - 1 + (below ? 0 : 92));
}

inline std::uint8_t unobfuscated(std::uint8_t c, std::uint8_t r) noexcept {
  const auto e = static_cast<std::int8_t>(126 - c);
  const auto below = static_cast<std::int8_t>(r + 1) < e;
  return static_cast<std::uint8_t>(c + r + 1 - (below ? 0 : 92));
}

// The residues repeat every 91 positions (while n × (i + 1) stays below
// 2^64). Long buffers go in blocks of 32 periods against a table, so that
// every block is a whole number of vectors of any width.
constexpr std::uint64_t kBlock = 91 * 32;

template <std::uint8_t (*apply)(std::uint8_t, std::uint8_t) noexcept>
void transform(std::uint8_t* buffer, std::uint64_t n) noexcept {
  if (!buffer || n == 0) return;
  if (n > 0xFFFFFFFFu) {
    // Here n × (i + 1) passes 2^64 and wraps, as unsigned 64-bit values do.
    std::uint64_t k = 0;
    for (std::uint64_t i = 0; i < n; ++i) {
      k += n;
      buffer[i] = apply(buffer[i], static_cast<std::uint8_t>(k % 91));
    }
    return;
  }
  const auto step = static_cast<std::uint8_t>(n % 91);
  std::uint8_t residues[kBlock];
  const auto tableLength = static_cast<unsigned>(std::min(n, kBlock));
  for (unsigned i = 0, r = step; i < tableLength;
       ++i, r = r + step >= 91 ? r + step - 91 : r + step) {
    residues[i] = static_cast<std::uint8_t>(r);
  }
  std::uint64_t start = 0;
  for (; n - start >= kBlock; start += kBlock) {
    std::uint8_t* block = buffer + start;
    for (unsigned i = 0; i < kBlock; ++i) block[i] = apply(block[i], residues[i]);
  }
  std::uint8_t* tail = buffer + start;
  for (unsigned i = 0; i < n - start; ++i) tail[i] = apply(tail[i], residues[i]);
}

}  // namespace

void KivObfuscator::obfuscateString(std::uint8_t* buffer, std::uint64_t length) noexcept {
  transform<obfuscated>(buffer, length);
}

void KivObfuscator::unobfuscateString(std::uint8_t* buffer, std::uint64_t length) noexcept {
  transform<unobfuscated>(buffer, length);
}

std::optional<std::string> KivObfuscator::transformString(const std::optional<std::string>& string,
                                                          std::uint64_t transformation) noexcept {
  if (!string || string->find('\0') != std::string::npos) return std::nullopt;
  try {
    std::string text = *string;  // the one buffer, handed back as the result
    if (transformation == kObfuscate) obfuscateString(text.data(), text.size());
    if (transformation == kUnobfuscate) unobfuscateString(text.data(), text.size());
    if (const auto zero = text.find('\0'); zero != std::string::npos) text.resize(zero);
    if (!unicode::isValidUTF8(text)) return std::nullopt;
    return text;
  } catch (const std::bad_alloc&) {
    return std::nullopt;
  }
}

}  // namespace kivi
