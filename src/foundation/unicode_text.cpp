#include "kivi/foundation/unicode_text.h"

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

icu::UnicodeString utf16(std::string_view text) {
  return icu::UnicodeString::fromUTF8(
      icu::StringPiece(text.data(), static_cast<int32_t>(text.size())));
}

// Compares with unorm_compare, which normalises lazily (FCD) and folds case
// on the fly when asked to.
bool normalizedEquals(std::string_view a, std::string_view b, uint32_t options) {
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
  UErrorCode status = U_ZERO_ERROR;
  // "" is the root locale: no Turkish or Lithuanian special cases.
  mapper("", 0, icu::StringPiece(text.data(), static_cast<int32_t>(text.size())), sink, nullptr,
         status);
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
  const auto length = static_cast<int32_t>(text.size());
  int32_t begin = 0;
  while (begin < length) {
    int32_t next = begin;
    UChar32 c;
    U8_NEXT(s, next, length, c);
    if (c < 0 || !isWhitespaceOrNewline(static_cast<char32_t>(c))) break;
    begin = next;
  }
  int32_t end = length;
  while (end > begin) {
    int32_t previous = end;
    UChar32 c;
    U8_PREV(s, begin, previous, c);
    if (c < 0 || !isWhitespaceOrNewline(static_cast<char32_t>(c))) break;
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
  const auto length = static_cast<int32_t>(text.size());
  std::size_t units = 0;
  for (int32_t i = 0; i < length;) {
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
