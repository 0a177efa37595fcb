#include "kivi/text/regular_expression.h"

#include <unicode/regex.h>
#include <unicode/unistr.h>
#include <unicode/utext.h>

#include <algorithm>
#include <string>
#include <utility>

#include "kivi/text/json_serialization.h"

namespace kivi {

struct RegularExpression::Compiled {
  std::unique_ptr<icu::RegexPattern> pattern;
};

namespace {

uint32_t icuFlags(RegularExpressionOptions options) {
  static constexpr std::pair<RegularExpressionOptions, uint32_t> kFlags[] = {
      {RegularExpressionCaseInsensitive, UREGEX_CASE_INSENSITIVE},
      {RegularExpressionAllowCommentsAndWhitespace, UREGEX_COMMENTS},
      {RegularExpressionIgnoreMetacharacters, UREGEX_LITERAL},
      {RegularExpressionDotMatchesLineSeparators, UREGEX_DOTALL},
      {RegularExpressionAnchorsMatchLines, UREGEX_MULTILINE},
      {RegularExpressionUseUnixLineSeparators, UREGEX_UNIX_LINES},
      {RegularExpressionUseUnicodeWordBoundaries, UREGEX_UWORD},
  };
  uint32_t flags = 0;
  for (const auto& [option, flag] : kFlags) {
    if (options & option) flags |= flag;
  }
  return flags;
}

ErrorPtr invalidPatternError(std::string_view pattern) {
  return Error::create(CocoaErrorDomain, RegularExpressionInvalidPatternError,
                       {{"NSInvalidValue", Value(std::string(pattern))}});
}

// Why a search stopped early, from ICU's status; a status ICU gives for
// nothing else here (an allocation failure) counts as running out of memory.
ErrorPtr searchStoppedError(UErrorCode status, RegularExpression::StepLimit stepLimit) {
  if (status == U_REGEX_TIME_OUT) {
    return Error::create(RegularExpressionSearchErrorDomain, RegularExpressionStepLimitError,
                         {{DebugDescriptionErrorKey, "The search used up its budget of " +
                                                         std::to_string(stepLimit) + " steps."}});
  }
  return Error::create(RegularExpressionSearchErrorDomain, RegularExpressionBacktrackLimitError,
                       {{DebugDescriptionErrorKey, "The search ran out of backtracking memory."}});
}

}  // namespace

RegularExpression::RegularExpression(std::string pattern, RegularExpressionOptions options,
                                     std::unique_ptr<Compiled> compiled)
    : pattern_(std::move(pattern)), options_(options), compiled_(std::move(compiled)) {}

RegularExpression::~RegularExpression() = default;

std::shared_ptr<const RegularExpression> RegularExpression::create(std::string_view pattern,
                                                                   RegularExpressionOptions options,
                                                                   ErrorPtr* error) {
  if (error) *error = nullptr;
  if (pattern.size() > static_cast<std::size_t>(INT32_MAX)) {
    if (error) *error = invalidPatternError(pattern);
    return nullptr;
  }
  const icu::UnicodeString source = icu::UnicodeString::fromUTF8(
      icu::StringPiece(pattern.data(), static_cast<int32_t>(pattern.size())));
  UParseError where;
  UErrorCode status = U_ZERO_ERROR;
  auto compiled = std::make_unique<Compiled>();
  compiled->pattern.reset(icu::RegexPattern::compile(source, icuFlags(options), where, status));
  if (U_FAILURE(status) || !compiled->pattern) {
    if (error) *error = invalidPatternError(pattern);
    return nullptr;
  }
  return std::shared_ptr<const RegularExpression>(
      new RegularExpression(std::string(pattern), options, std::move(compiled)));
}

std::size_t RegularExpression::enumerateMatches(std::string_view text, TextRange range,
                                                const std::function<bool(TextRange)>& visit,
                                                StepLimit stepLimit, ErrorPtr* error) const {
  if (error) *error = nullptr;
  const std::size_t begin = std::min(range.location, text.size());
  const std::string_view slice = text.substr(begin, range.length);
  if (slice.size() > static_cast<std::size_t>(INT32_MAX)) {
    if (error) {
      *error = Error::create(
          RegularExpressionSearchErrorDomain, RegularExpressionTextTooLongError,
          {{DebugDescriptionErrorKey, "The text is over 2 GiB, too long for the search."}});
    }
    return 0;
  }

  // A UTF-8 UText reads the bytes in place; its native indexes are byte
  // offsets, so match boundaries need no mapping back.
  UErrorCode status = U_ZERO_ERROR;
  icu::LocalUTextPointer input(
      utext_openUTF8(nullptr, slice.data(), static_cast<int64_t>(slice.size()), &status));
  std::unique_ptr<icu::RegexMatcher> matcher(compiled_->pattern->matcher(status));
  if (matcher && stepLimit > 0) matcher->setTimeLimit(stepLimit, status);
  if (U_FAILURE(status) || !matcher) {
    if (error) *error = searchStoppedError(U_MEMORY_ALLOCATION_ERROR, stepLimit);
    return 0;
  }
  matcher->reset(input.getAlias());

  std::size_t count = 0;
  while (matcher->find(status) && U_SUCCESS(status)) {
    const int64_t start = matcher->start64(status);
    const int64_t end = matcher->end64(status);
    if (U_FAILURE(status)) break;
    ++count;
    if (!visit({begin + static_cast<std::size_t>(start), static_cast<std::size_t>(end - start)})) {
      return count;
    }
  }
  if (U_FAILURE(status) && error) *error = searchStoppedError(status, stepLimit);
  return count;
}

std::optional<TextRange> RegularExpression::firstMatch(std::string_view text, TextRange range,
                                                       StepLimit stepLimit, ErrorPtr* error) const {
  std::optional<TextRange> first;
  enumerateMatches(
      text, range,
      [&first](TextRange match) {
        first = match;
        return false;
      },
      stepLimit, error);
  return first;
}

std::size_t RegularExpression::numberOfMatches(std::string_view text, TextRange range,
                                               StepLimit stepLimit, ErrorPtr* error) const {
  return enumerateMatches(
      text, range, [](TextRange) { return true; }, stepLimit, error);
}

}  // namespace kivi
