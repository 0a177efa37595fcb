// KivUloFileParser: reads single settings out of a ULO launch file's text.
//
// A setting is a name, "=" directly behind it and a value running to the end
// of its line. A lookup takes the first place in the text where the name is
// followed by "=" on a line that ends in CR or LF (the name may be the tail
// of a longer name or sit inside an earlier value), and answers the rest of
// that line with trailing white space and line breaks removed. A line that
// ends in VT, FF, U+0085, U+2028, U+2029 or at the end of the text holds no
// setting. Nothing is parsed ahead: each lookup scans the text from its start.
//
//   kivi::KivUloFileParser ulo("[Launch]\r\nAddress=10.0.0.7\r\nFullScreen=Yes\r\n");
//   ulo.getValue("Address");                          // "10.0.0.7"
//   ulo.getValue("Missing");                          // std::nullopt
//   ulo.getBooleanValue("FullScreen", {"yes", "1"});  // true ("Yes" lower-cased)
//
// The name is a regular expression in ICU syntax (the pattern searched for is
// name + "=.*[\r\n]+"), so "A.B" also finds "AxB=..." and a name that does not
// compile, such as "A(", is never found. Names made only of ASCII letters,
// digits, "_" and "-" are plain text and take a linear search instead of the
// regular-expression engine, with identical results.
//
// Text that is not valid UTF-8 is searched with each malformed sequence read
// as U+FFFD; values are handed back byte for byte as they stand in the text.
// In a text over 2 GiB (ICU's input bound) only plain names can be looked up:
// other names are undecided, as below.
//
// A name with regular-expression syntax can make a search take very long
// (".*.*b" costs the cube of a line's length). Such a lookup has a step
// budget, stepBudget(), which stops a runaway search within about two minutes
// whatever the text, and which is four times what a name with one repetition
// (".*Screen", "\w+Screen") needs on any text whose lines' lengths, squared,
// add up to less than 300 square KiB: a few hundred lines of 1 KiB, or one
// line of 17 KiB. A lookup stopped by the budget has no answer: it gives
// absent (false for the yes/no lookup) and sets *error, which stays nullptr
// for every lookup that decided. Plain names never stop early.
//
//   kivi::ErrorPtr error;
//   const auto value = ulo.getValue(name, &error);
//   if (error) {
//     // undecided: error->domain() is RegularExpressionSearchErrorDomain
//   }
//
// Thread contract: a parser is immutable after construction; lookups on one
// parser may run on any number of threads at once.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivUloFileParser {
 public:
  // The step budget of a regular-expression lookup, in RegularExpression's
  // steps of 0.2 to 1 ms: kBaseSteps, plus kStepsPerKilobyte for each KiB of
  // text, plus kStepsPerSquareKilobyte for each line's length in KiB squared,
  // at most kMaxSteps. (".*" at the start of a name costs about 50 steps per
  // square KiB of each line, "\w+" about 100.)
  static constexpr std::int32_t kBaseSteps = 1024;
  static constexpr std::int32_t kStepsPerKilobyte = 4;
  static constexpr std::int32_t kStepsPerSquareKilobyte = 420;
  static constexpr std::int32_t kMaxSteps = 1 << 17;

  // A parser of the launch file's whole text, kept as given.
  explicit KivUloFileParser(std::string uloFile) : uloFile_(std::move(uloFile)) {}

  // The setting's value, or absent when the name is not set on a line ending
  // in CR or LF, or does not compile as a pattern. An empty value is "".
  // *error (when given) is nullptr, or the search's error when it stopped
  // before it could decide (the answer is then absent, meaning "unknown").
  std::optional<std::string> getValue(std::string_view key, ErrorPtr* error = nullptr) const;

  // Whether the value, lower-cased (full Unicode mapping, root locale), is
  // canonically equal to an entry of `validBooleanValues`. Entries are taken
  // as given, neither lower-cased nor trimmed. False when the value is absent;
  // *error as for getValue().
  bool getBooleanValue(std::string_view key, const std::vector<std::string>& validBooleanValues,
                       ErrorPtr* error = nullptr) const;

  // The step budget of a regular-expression lookup in `text` (see above).
  static std::int32_t stepBudget(std::string_view text);

 private:
  const std::string uloFile_;
};

namespace detail {

// Whether `key` is made only of ASCII letters, digits, "_" and "-" (the empty
// name included), so that its pattern has no special characters.
KIVI_EXPORT bool isPlainUloKey(std::string_view key);

// The lookup through the regular-expression engine, for any name, with
// `stepLimit` steps (none: KivUloFileParser::stepBudget(text); 0: no limit);
// *error as for getValue().
KIVI_EXPORT std::optional<std::string> uloValueByPattern(
    std::string_view text, std::string_view key, ErrorPtr* error = nullptr,
    std::optional<std::int32_t> stepLimit = std::nullopt);

// The same lookup as a plain search; `key` must be plain.
KIVI_EXPORT std::optional<std::string> uloValueByPlainSearch(std::string_view text,
                                                             std::string_view key);

}  // namespace detail

}  // namespace kivi
