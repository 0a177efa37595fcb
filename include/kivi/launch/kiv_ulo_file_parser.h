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
// A regular-expression lookup is bounded by a step budget that grows with the
// text (kStepsPerKilobyte), so that a pathological name over a huge text
// answers absent instead of running for hours; plain names need no budget.
// (In a text over 2 GiB only plain names are found: ICU's input bound.)
//
// Thread contract: a parser is immutable after construction; lookups on one
// parser may run on any number of threads at once.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kivi {

class KivUloFileParser {
 public:
  // ICU match steps allowed per KiB of text (at least one KiB's worth) for a
  // lookup that goes through the regular-expression engine.
  static constexpr std::int32_t kStepsPerKilobyte = 2;

  explicit KivUloFileParser(std::string uloFile) : uloFile_(std::move(uloFile)) {}

  // The setting's value, or absent when the name is not set on a line ending
  // in CR or LF, or does not compile as a pattern. An empty value is "".
  std::optional<std::string> getValue(std::string_view key) const;

  // Whether the value, lower-cased (full Unicode mapping, root locale), is
  // canonically equal to an entry of `validBooleanValues`. Entries are taken
  // as given, neither lower-cased nor trimmed. False when the value is absent.
  bool getBooleanValue(std::string_view key,
                       const std::vector<std::string>& validBooleanValues) const;

 private:
  const std::string uloFile_;
};

namespace detail {

// Whether `key` is made only of ASCII letters, digits, "_" and "-" (the empty
// name included), so that its pattern has no special characters.
bool isPlainUloKey(std::string_view key);

// The lookup through the regular-expression engine, for any name.
std::optional<std::string> uloValueByPattern(std::string_view text, std::string_view key);

// The same lookup as a plain search; `key` must be plain.
std::optional<std::string> uloValueByPlainSearch(std::string_view text, std::string_view key);

}  // namespace detail

}  // namespace kivi
