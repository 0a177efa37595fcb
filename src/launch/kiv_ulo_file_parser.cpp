#include "kivi/launch/kiv_ulo_file_parser.h"

#include <algorithm>
#include <cstddef>

#include "kivi/text/regular_expression.h"
#include "kivi/text/unicode_text.h"

namespace kivi {
namespace detail {
namespace {

// The step budget of a regular-expression lookup over `size` bytes of text.
RegularExpression::StepLimit stepBudget(std::size_t size) {
  constexpr std::size_t kMaxKilobytes = INT32_MAX / KivUloFileParser::kStepsPerKilobyte;
  const std::size_t kilobytes = std::min(size / 1024 + 1, kMaxKilobytes);
  return static_cast<RegularExpression::StepLimit>(kilobytes) * KivUloFileParser::kStepsPerKilobyte;
}

// Steps 5 and 6 of a lookup: trim the matched text, answer what follows its
// first "=". A name that can match without its "=" (such as "A|") leaves none.
std::optional<std::string> valueOfMatch(std::string_view match) {
  const std::string_view trimmed = unicode::trimView(match);
  const std::size_t equals = trimmed.find('=');
  if (equals == std::string_view::npos) return std::nullopt;
  return std::string(trimmed.substr(equals + 1));
}

struct LineEnd {
  std::size_t at;
  std::size_t length;
};

// The first line terminator at or after `from`: LF, VT, FF, CR, U+0085,
// U+2028 or U+2029, the characters "." does not match. Their lead bytes never
// occur inside another sequence, so malformed UTF-8 cannot hide or fake one.
std::optional<LineEnd> findLineEnd(std::string_view text, std::size_t from) {
  const auto byte = [&text](std::size_t i) {
    return i < text.size() ? static_cast<unsigned char>(text[i]) : 0u;
  };
  for (std::size_t i = from; i < text.size(); ++i) {
    const unsigned char c = byte(i);
    if (c < 0x80) {
      if (c >= '\n' && c <= '\r') return LineEnd{i, 1};
    } else if (c == 0xC2 && byte(i + 1) == 0x85) {
      return LineEnd{i, 2};
    } else if (c == 0xE2 && byte(i + 1) == 0x80 && (byte(i + 2) == 0xA8 || byte(i + 2) == 0xA9)) {
      return LineEnd{i, 3};
    }
  }
  return std::nullopt;
}

}  // namespace

bool isPlainUloKey(std::string_view key) {
  return std::all_of(key.begin(), key.end(), [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' ||
           c == '-';
  });
}

std::optional<std::string> uloValueByPattern(std::string_view text, std::string_view key) {
  std::string pattern;
  pattern.reserve(key.size() + 11);
  pattern.append(key).append("=.*[\\r\\n]+");
  const RegularExpressionPtr expression = RegularExpression::create(pattern);
  if (!expression) return std::nullopt;
  const auto match = expression->firstMatch(text, kWholeText, stepBudget(text.size()));
  if (!match) return std::nullopt;
  return valueOfMatch(text.substr(match->location, match->length));
}

// The pattern's leftmost match is the first occurrence of key + "=" whose
// line ends in CR or LF: ".*" runs to the first line terminator and
// "[\r\n]+" then needs CR or LF there, taking the whole run of them. Every
// occurrence on a line that ends otherwise fails the same way, so the search
// resumes behind that line.
std::optional<std::string> uloValueByPlainSearch(std::string_view text, std::string_view key) {
  std::string needle;
  needle.reserve(key.size() + 1);
  needle.append(key).push_back('=');
  for (std::size_t from = 0;;) {
    const std::size_t start = text.find(needle, from);
    if (start == std::string_view::npos) return std::nullopt;
    const auto lineEnd = findLineEnd(text, start + needle.size());
    if (!lineEnd) return std::nullopt;
    const char terminator = text[lineEnd->at];
    if (terminator == '\r' || terminator == '\n') {
      const std::size_t runEnd = std::min(text.find_first_not_of("\r\n", lineEnd->at), text.size());
      return valueOfMatch(text.substr(start, runEnd - start));
    }
    from = lineEnd->at + lineEnd->length;
  }
}

}  // namespace detail

std::optional<std::string> KivUloFileParser::getValue(std::string_view key) const {
  return detail::isPlainUloKey(key) ? detail::uloValueByPlainSearch(uloFile_, key)
                                    : detail::uloValueByPattern(uloFile_, key);
}

bool KivUloFileParser::getBooleanValue(std::string_view key,
                                       const std::vector<std::string>& validBooleanValues) const {
  const auto value = getValue(key);
  if (!value) return false;
  const std::string lowered = unicode::toLower(*value);
  return std::any_of(
      validBooleanValues.begin(), validBooleanValues.end(),
      [&lowered](const std::string& entry) { return unicode::canonicalEquals(entry, lowered); });
}

}  // namespace kivi
