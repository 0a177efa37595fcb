// RegularExpression: an ICU regular expression matched against UTF-8 text.
//
// Patterns use ICU's syntax and matching rules. Matches are reported as byte
// ranges into the UTF-8 text that was searched; the text is read in place,
// never copied or converted, so searching a 100 MB text costs no extra memory.
//
//   kivi::ErrorPtr error;
//   auto re = kivi::RegularExpression::create("b+", 0, &error);
//   if (auto m = re->firstMatch("aébbb!")) {
//     // m->location == 3, m->length == 3 ("é" takes two bytes)
//   }
//   re->numberOfMatches("b_bb_b");   // 3
//
// Malformed UTF-8 in the text or the pattern reads as U+FFFD; an embedded NUL
// is an ordinary character. A pattern that does not compile gives nullptr and
// an error. A search that cannot finish (it exhausts its step budget or its
// backtracking memory, ICU's 8 MB default, or the text is over 2 GiB, ICU's
// bound for UTF-8 input) reports no further match and, when asked, an error
// in RegularExpressionSearchErrorDomain, so that "stopped" never passes for
// "no match":
//
//   auto runaway = kivi::RegularExpression::create("(a|aa)*c");
//   runaway->firstMatch(std::string(64, 'a'), kivi::kWholeText, 10, &error);
//   // std::nullopt, error->code() == kivi::RegularExpressionStepLimitError
//
// Thread contract: a compiled expression is immutable and may be used from any
// number of threads at once; each search makes its own matcher.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/error.h"
#include "kivi/export.h"

namespace kivi {

// A span of a UTF-8 text, in bytes.
struct KIVI_EXPORT TextRange {
  std::size_t location = 0;  // the offset of the first byte
  std::size_t length = 0;    // in bytes

  // The offset just past the range.
  std::size_t end() const noexcept { return location + length; }
  friend bool operator==(const TextRange&, const TextRange&) = default;
};

// The whole of any text: ranges are clamped to the text they are used with.
inline constexpr TextRange kWholeText{0, std::numeric_limits<std::size_t>::max()};

// How a pattern compiles: a bitwise OR of the options below (0: none), each ICU's flag of the
// same meaning.
using RegularExpressionOptions = std::uint32_t;
// Letters match whatever their case.
inline constexpr RegularExpressionOptions RegularExpressionCaseInsensitive = 1 << 0;
// White space in the pattern is ignored, and `#` starts a comment up to the end of the line.
inline constexpr RegularExpressionOptions RegularExpressionAllowCommentsAndWhitespace = 1 << 1;
// The whole pattern is literal text.
inline constexpr RegularExpressionOptions RegularExpressionIgnoreMetacharacters = 1 << 2;
// `.` matches line separators too.
inline constexpr RegularExpressionOptions RegularExpressionDotMatchesLineSeparators = 1 << 3;
// `^` and `$` match at the start and end of every line, not only of the text.
inline constexpr RegularExpressionOptions RegularExpressionAnchorsMatchLines = 1 << 4;
// Only `\n` ends a line for `.`, `^` and `$`.
inline constexpr RegularExpressionOptions RegularExpressionUseUnixLineSeparators = 1 << 5;
// `\b` finds word boundaries by Unicode's rules (UAX #29) instead of ICU's simple ones.
inline constexpr RegularExpressionOptions RegularExpressionUseUnicodeWordBoundaries = 1 << 6;

// The error code of a pattern that does not compile (in kivi::CocoaErrorDomain,
// "NSCocoaErrorDomain"); the user info's "NSInvalidValue" holds the pattern.
inline constexpr std::int64_t RegularExpressionInvalidPatternError = 2048;

// The errors of a search that stopped before it could tell whether (more)
// matches follow: its step budget ran out, its backtracking memory ran out,
// or its text is over 2 GiB. The user info's NSDebugDescription says which.
inline constexpr const char* RegularExpressionSearchErrorDomain =
    "KivRegularExpressionSearchErrorDomain";
inline constexpr std::int64_t RegularExpressionStepLimitError = 1;
inline constexpr std::int64_t RegularExpressionBacktrackLimitError = 2;
inline constexpr std::int64_t RegularExpressionTextTooLongError = 3;

class KIVI_EXPORT RegularExpression {
 public:
  // Step budget of a search: 0 is unlimited. A step is ICU's unit of match
  // work, ten thousand saved backtracking states (0.2 to 1 ms); the count is
  // deterministic, not a clock. A search that runs out reports no (further)
  // match and RegularExpressionStepLimitError.
  using StepLimit = std::int32_t;

  // Nullptr, and *error (when given) set, if `pattern` does not compile.
  // *error is set to nullptr on success.
  static std::shared_ptr<const RegularExpression> create(std::string_view pattern,
                                                         RegularExpressionOptions options = 0,
                                                         ErrorPtr* error = nullptr);

  ~RegularExpression();
  RegularExpression(const RegularExpression&) = delete;
  RegularExpression& operator=(const RegularExpression&) = delete;

  // The pattern and the options it was compiled with.
  const std::string& pattern() const noexcept { return pattern_; }
  RegularExpressionOptions options() const noexcept { return options_; }

  // Each search sets *error (when given) on every call: nullptr when it ran
  // to its end (or `visit` ended it), else the reason it stopped (see
  // RegularExpressionSearchErrorDomain); what it found until then stands.

  // The leftmost match inside `range` of `text`. The range acts as the whole
  // text: "^", "$" and look-around stop at its ends. A range boundary inside
  // a multi-byte character cuts that character, which then reads as U+FFFD.
  std::optional<TextRange> firstMatch(std::string_view text, TextRange range = kWholeText,
                                      StepLimit stepLimit = 0, ErrorPtr* error = nullptr) const;

  // Calls `visit` with each non-overlapping match in order until it returns
  // false; returns the number of matches visited.
  std::size_t enumerateMatches(std::string_view text, TextRange range,
                               const std::function<bool(TextRange)>& visit, StepLimit stepLimit = 0,
                               ErrorPtr* error = nullptr) const;

  // How many non-overlapping matches `range` of `text` holds (up to a stop, see above).
  std::size_t numberOfMatches(std::string_view text, TextRange range = kWholeText,
                              StepLimit stepLimit = 0, ErrorPtr* error = nullptr) const;

 private:
  struct Compiled;
  RegularExpression(std::string pattern, RegularExpressionOptions options,
                    std::unique_ptr<Compiled> compiled);

  const std::string pattern_;
  const RegularExpressionOptions options_;
  const std::unique_ptr<Compiled> compiled_;
};

// How compiled expressions are held: shared and immutable.
using RegularExpressionPtr = std::shared_ptr<const RegularExpression>;

}  // namespace kivi
