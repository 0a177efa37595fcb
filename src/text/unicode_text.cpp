#include "kivi/text/unicode_text.h"

#include <simdjson.h>
#include <unicode/bytestream.h>
#include <unicode/casemap.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/unorm.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>

namespace kivi::unicode {
namespace {

bool isAscii(std::string_view text) {
  return std::all_of(text.begin(), text.end(),
                     [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

char asciiLower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; }
char asciiUpper(char c) { return c >= 'a' && c <= 'z' ? static_cast<char>(c - 32) : c; }

// ICU measures texts in int32_t. Longer ones are handled in pieces (case
// mapping) or byte for byte (comparison), never passed with a wrapped length.
constexpr std::size_t kMaxICULength = INT32_MAX;

icu::UnicodeString utf16(std::string_view text) {
  return icu::UnicodeString::fromUTF8(
      icu::StringPiece(text.data(), static_cast<int32_t>(text.size())));
}

// Compares with unorm_compare, which normalises lazily (FCD) and folds case
// on the fly when asked to.
bool normalizedEquals(std::string_view a, std::string_view b, uint32_t options) {
  if (a.size() > kMaxICULength || b.size() > kMaxICULength) return a == b;
  const icu::UnicodeString ua = utf16(a);
  const icu::UnicodeString ub = utf16(b);
  UErrorCode status = U_ZERO_ERROR;
  const int32_t order =
      unorm_compare(ua.getBuffer(), ua.length(), ub.getBuffer(), ub.length(), options, &status);
  return U_SUCCESS(status) && order == 0;
}

template <typename Mapper>
std::string mapCase(std::string_view text, Mapper mapper) {
  std::string out;
  out.reserve(text.size());
  icu::StringByteSink<std::string> sink(&out);
  // Beyond ICU's reach, the text is mapped in pieces that end on a character
  // boundary.
  while (!text.empty()) {
    std::size_t piece = text.size();
    if (piece > kMaxICULength) {
      piece = kMaxICULength;
      while (piece > 0 && (static_cast<unsigned char>(text[piece]) & 0xC0) == 0x80) --piece;
      if (piece == 0) piece = kMaxICULength;
    }
    UErrorCode status = U_ZERO_ERROR;
    // "" is the root locale: no Turkish or Lithuanian special cases.
    mapper("", 0, icu::StringPiece(text.data(), static_cast<int32_t>(piece)), sink, nullptr,
           status);
    text.remove_prefix(piece);
  }
  return out;
}

}  // namespace

bool isWhitespaceOrNewline(char32_t c) {
  if (c < 0x80) return c == ' ' || (c >= 0x09 && c <= 0x0D);
  if (c == 0x85 || c == 0x2028 || c == 0x2029) return true;
  return u_charType(static_cast<UChar32>(c)) == U_SPACE_SEPARATOR;
}

std::string_view trimView(std::string_view text) {
  const auto* s = reinterpret_cast<const uint8_t*>(text.data());
  const auto length = static_cast<std::int64_t>(text.size());
  std::int64_t begin = 0;
  while (begin < length) {
    std::int64_t next = begin;
    UChar32 c;
    U8_NEXT(s, next, length, c);
    if (c < 0 || !isWhitespaceOrNewline(static_cast<char32_t>(c))) break;
    begin = next;
  }
  std::int64_t end = length;
  while (end > begin) {
    // Back to the lead byte of the last character (at most three
    // continuation bytes), then read it forward: it must end at `end`.
    std::int64_t previous = end - 1;
    while (previous > begin && end - previous < 4 && (s[previous] & 0xC0) == 0x80) --previous;
    std::int64_t next = previous;
    UChar32 c;
    U8_NEXT(s, next, end, c);
    if (next != end || c < 0 || !isWhitespaceOrNewline(static_cast<char32_t>(c))) break;
    end = previous;
  }
  return text.substr(static_cast<size_t>(begin), static_cast<size_t>(end - begin));
}

std::string trim(std::string_view text) { return std::string(trimView(text)); }

bool caseInsensitiveEquals(std::string_view a, std::string_view b) {
  if (isAscii(a) && isAscii(b)) {
    // Pure ASCII folds and normalises to itself; the full comparison would
    // give the same answer.
    return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) {
             return asciiLower(x) == asciiLower(y);
           });
  }
  return normalizedEquals(a, b, U_COMPARE_IGNORE_CASE | U_FOLD_CASE_DEFAULT);
}

bool canonicalEquals(std::string_view a, std::string_view b) {
  if (a == b) return true;
  if (isAscii(a) && isAscii(b)) return false;
  return normalizedEquals(a, b, 0);
}

std::string toLower(std::string_view text) {
  if (isAscii(text)) {
    std::string out(text);
    for (char& c : out) c = asciiLower(c);
    return out;
  }
  return mapCase(text, [](auto&&... args) {
    icu::CaseMap::utf8ToLower(std::forward<decltype(args)>(args)...);
  });
}

std::string toUpper(std::string_view text) {
  if (isAscii(text)) {
    std::string out(text);
    for (char& c : out) c = asciiUpper(c);
    return out;
  }
  return mapCase(text, [](auto&&... args) {
    icu::CaseMap::utf8ToUpper(std::forward<decltype(args)>(args)...);
  });
}

bool isValidUTF8(std::string_view bytes) {
  return simdjson::validate_utf8(bytes.data(), bytes.size());
}

std::size_t utf16Length(std::string_view text) {
  const auto* s = reinterpret_cast<const uint8_t*>(text.data());
  const auto length = static_cast<std::int64_t>(text.size());
  std::size_t units = 0;
  for (std::int64_t i = 0; i < length;) {
    if (s[i] < 0x80) {
      ++units;
      ++i;
      continue;
    }
    UChar32 c;
    U8_NEXT(s, i, length, c);
    units += c > 0xFFFF ? 2 : 1;
  }
  return units;
}

}  // namespace kivi::unicode
