#include "kivi/utils/kiv_utils.h"

#include <algorithm>
#include <array>

#include "kivi/text/base64.h"
#include "kivi/text/sha256.h"
#include "kivi/text/unicode_text.h"

namespace kivi::KivUtils {
namespace {

// Replaces each character of `from` with the one at the same place in `to`.
std::string& translate(std::string& text, std::string_view from, std::string_view to) {
  std::array<char, 256> map;
  for (std::size_t i = 0; i < map.size(); ++i) map[i] = static_cast<char>(i);
  for (std::size_t i = 0; i < from.size(); ++i) map[static_cast<unsigned char>(from[i])] = to[i];
  for (char& c : text) c = map[static_cast<unsigned char>(c)];
  return text;
}

bool caseInsensitiveEquals(std::string_view a, std::string_view b) {
  // The Unicode comparison reads every malformed byte as U+FFFD, which would
  // make different malformed texts equal.
  if (!unicode::isValidUTF8(a) || !unicode::isValidUTF8(b)) return a == b;
  return unicode::caseInsensitiveEquals(a, b);
}

}  // namespace

std::optional<std::string> sha256Hash(std::string_view string) {
  if (!unicode::isValidUTF8(string)) return std::nullopt;
  std::string hex = sha256Hex(string);
  if (hex.empty()) return std::nullopt;
  return hex;
}

std::string trim(std::string_view string) { return unicode::trim(string); }

bool isCaseInsensitiveEqualToString(std::string_view string, std::string_view other) {
  return caseInsensitiveEquals(string, other);
}

std::optional<std::vector<std::string>> trimmedCommponentsSeparatedByString(
    std::string_view string, std::string_view separator) {
  std::vector<std::string> parts;
  auto keep = [&parts](std::string_view part) {
    if (const auto trimmed = unicode::trimView(part); !trimmed.empty()) parts.emplace_back(trimmed);
  };
  if (!separator.empty()) {
    for (std::size_t at; (at = string.find(separator)) != std::string_view::npos;) {
      keep(string.substr(0, at));
      string.remove_prefix(at + separator.size());
    }
  }
  keep(string);
  if (parts.empty()) return std::nullopt;
  return parts;
}

std::optional<std::string> encodeIntoBase64String(std::string_view string) {
  if (!unicode::isValidUTF8(string)) return std::nullopt;
  return base64::encode(string);
}

std::optional<std::string> decodeFromBase64String(std::string_view string) {
  auto bytes = base64::decodeToString(string);
  if (!bytes || !unicode::isValidUTF8(*bytes)) return std::nullopt;
  return bytes;
}

std::string base64FromBase64URLEncodedString(std::string_view string) {
  std::string text(string);
  translate(text, "-_", "+/");
  // Lengths count UTF-16 code units, which matters only for text that is not
  // base64 anyway.
  const std::size_t remainder = unicode::utf16Length(text) % 4;
  if (remainder != 0) text.append(4 - remainder, '=');
  return text;
}

std::optional<std::string> base64URLEncodedStringFromString(std::string_view string) {
  auto text = encodeIntoBase64String(string);
  if (!text) return std::nullopt;
  translate(*text, "+/", "-_");
  text->erase(std::find(text->begin(), text->end(), '='), text->end());
  return text;
}

std::optional<std::string> vrelBase64URLEncodedStringFromString(std::string_view string) {
  auto text = encodeIntoBase64String(string);
  if (text) translate(*text, "+/=", "_!-");
  return text;
}

std::optional<std::string> decodeFromVrelBase64URLEncodedString(std::string_view string) {
  std::string text(string);
  return decodeFromBase64String(translate(text, "_!-", "+/="));
}

std::string stringOrEmptyString(const std::optional<std::string>& string) {
  return string.value_or(std::string());
}

bool isNilOrEmptyString(const std::optional<std::string>& string) {
  return !string || unicode::trimView(*string).empty();
}

std::string sha256AsString(const Data& data) { return sha256Hex(data); }

bool trimmedCaseInsensitiveContains(const Array& array, std::string_view needle) {
  const std::string_view trimmedNeedle = unicode::trimView(needle);
  return std::any_of(array.begin(), array.end(), [&](const Value& element) {
    const String* text = element.asString();
    return text && caseInsensitiveEquals(unicode::trimView(*text), trimmedNeedle);
  });
}

Array subArrayOfDictionaries(const Array& array) {
  Array dictionaries;
  std::copy_if(array.begin(), array.end(), std::back_inserter(dictionaries),
               [](const Value& element) { return element.asDictionary() != nullptr; });
  return dictionaries;
}

Array subArrayOfStrings(const Array& array) {
  Array strings;
  std::copy_if(array.begin(), array.end(), std::back_inserter(strings),
               [](const Value& element) { return element.asString() != nullptr; });
  return strings;
}

}  // namespace kivi::KivUtils
