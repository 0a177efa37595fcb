#include "kivi/launch/kiv_ulo_file_parser.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>

#include "kivi/text/regular_expression.h"
#include "kivi/text/unicode_text.h"

namespace kivi {
namespace detail {
namespace {

// The value a match gives: the matched text, trimmed, after its first "=".
// A name that can match without its "=" (such as "A|") leaves none.
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

std::optional<std::string> uloValueByPattern(std::string_view text, std::string_view key,
                                             ErrorPtr* error,
                                             std::optional<std::int32_t> stepLimit) {
  if (error) *error = nullptr;
  std::string pattern;
  pattern.reserve(key.size() + 11);
  pattern.append(key).append("=.*[\\r\\n]+");
  const RegularExpressionPtr expression = RegularExpression::create(pattern);
  if (!expression) return std::nullopt;
  const auto match = expression->firstMatch(
      text, kWholeText, stepLimit.value_or(KivUloFileParser::stepBudget(text)), error);
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

// Cost of the search, in steps of ten thousand saved backtracking states: a
// name starting with a repetition tries every position of a line and runs to
// the line's end from each, so its cost grows with each line's length
// squared; lines end where "." stops. Lengths are counted in bytes, never
// fewer than the characters the engine reads.
std::int32_t KivUloFileParser::stepBudget(std::string_view text) {
  constexpr std::uint64_t kMax = kMaxSteps;
  // A line this long reaches the maximum by itself; the sum stays far from
  // overflowing.
  constexpr std::uint64_t kLongLine = std::uint64_t{1} << 24;
  const std::uint64_t fixed = kBaseSteps + kStepsPerKilobyte * (text.size() / 1024 + 1);
  if (fixed >= kMax) return kMaxSteps;
  std::uint64_t squares = 0;  // of the lines' lengths, in bytes
  for (std::size_t from = 0;;) {
    const auto lineEnd = detail::findLineEnd(text, from);
    const std::uint64_t length =
        std::min<std::uint64_t>((lineEnd ? lineEnd->at : text.size()) - from, kLongLine);
    squares += length * length;
    if (fixed + squares * kStepsPerSquareKilobyte / (1024 * 1024) >= kMax) return kMaxSteps;
    if (!lineEnd) break;
    from = lineEnd->at + lineEnd->length;
  }
  return static_cast<std::int32_t>(fixed + squares * kStepsPerSquareKilobyte / (1024 * 1024));
}

std::optional<std::string> KivUloFileParser::getValue(std::string_view key, ErrorPtr* error) const {
  if (!detail::isPlainUloKey(key)) return detail::uloValueByPattern(uloFile_, key, error);
  if (error) *error = nullptr;
  return detail::uloValueByPlainSearch(uloFile_, key);
}

bool KivUloFileParser::getBooleanValue(std::string_view key,
                                       const std::vector<std::string>& validBooleanValues,
                                       ErrorPtr* error) const {
  const auto value = getValue(key, error);
  if (!value) return false;
  const std::string lowered = unicode::toLower(*value);
  return std::any_of(
      validBooleanValues.begin(), validBooleanValues.end(),
      [&lowered](const std::string& entry) { return unicode::canonicalEquals(entry, lowered); });
}

}  // namespace kivi
