#include "kivi/launch/kiv_ulo_file_parser.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "kivi/text/regular_expression.h"

namespace kivi {
namespace {

using namespace std::string_literals;
using std::nullopt;

// A launch file of the usual size and shape (about 1.7 KB), "FullScreen" last.
std::string launchFile() {
  std::string text = "[Launch]\r\n";
  for (int i = 0; i < 24; ++i) {
    text += "Setting" + std::to_string(i) +
            "=s:C:\\Program Files\\Vendor\\Client\\client.exe /arg " + std::to_string(i) + "\r\n";
  }
  return text + "FullScreen=Yes\r\n";
}

// Every row runs through the parser, the regular-expression lookup and, for
// plain names, the plain search: all must agree, and every search decides.
TEST(KivUloFileParserTest, LookupsAgreeOnEveryPath) {
  const std::string bigValue = "Blob=" + std::string(4096, 'x') + "\r\n";
  const struct {
    std::string text;
    std::string key;
    std::optional<std::string> expected;
  } cases[] = {
      {"A=1\r\nB=2\r\n", "A", "1"},
      {"A=1\r\nB=2\r\n", "B", "2"},
      {"A=1\r\nB=2\r\n", "a", nullopt},
      {"A=1\nB=2", "B", nullopt},
      {"A=1\nB=2", "A", "1"},
      {"A=1\nA=2\n", "A", "1"},
      {"ClientAddress=10.0.0.1\nAddress=2\n", "Address", "10.0.0.1"},
      {"A= x \n", "A", " x"},
      {"A=\n", "A", ""},
      {"A = 1\n", "A", nullopt},
      {"X=1;A=2\n", "A", "2"},
      {"[Section]\n# A=comment\nA=1\n", "A", "comment"},
      {"x=1\n", "", "1"},
      // Names with regular-expression syntax.
      {"A(=1\n", "A(", nullopt},
      {"AxB=5\n", "A.B", "5"},
      {"AAA=3\n", "A+", "3"},
      {"A+=3\n", "A+", nullopt},
      {"[=1\n", "[", nullopt},
      {"B=2\n", "A|B", "2"},
      {"A=1\n", "A|B", nullopt},  // matches "A" alone: no "=" to split at
      {"A=B=C\n", "A=B", "B=C"},
      {"x A=1\n", " A", "1"},
      // Lines ending in a terminator other than CR or LF hold no setting.
      {"A=1\vB=2\n", "A", nullopt},
      {"A=1\vB=2\n", "B", "2"},
      {"A=1\f\n", "A", nullopt},
      {"A=1\u0085\n", "A", nullopt},
      {"A=1\u2028\n", "A", nullopt},
      {"A=1\u2029A=2\r\n", "A", "2"},
      {"A=1 A=2\vA=3\n", "A", "3"},
      // CR and LF runs, trailing white space of any kind.
      {"A=1\r\n\r\n\nB=2\r\n", "B", "2"},
      {"A=x\r\r\n\n", "A", "x"},
      {"A=1\r", "A", "1"},
      {"A=x\t \u00a0\n", "A", "x"},
      {"A=\u3000x\u3000\r\n", "A", "\u3000x"},
      {"A=x\0y\n"s, "A", "x\0y"s},
      // Malformed UTF-8 reads as U+FFFD; values come back byte for byte.
      {"\xff"
       "A=\xfe\xe2\x80\n",
       "A", "\xfe\xe2\x80"},
      {"A=1\xe2\xe2\x80\xa8"
       "A=2\n",
       "A", "2"},
      {"A=1\xc2\n", "A", "1\xc2"},
      // Ordinary files whose search costs the engine more than a quick scan:
      // a repetition before the name tries every position of each line.
      {launchFile(), ".*Screen", "Yes"},
      {launchFile(), "Full.creen", "Yes"},
      {bigValue + "FullScreen=Yes\r\n", "\\w+Screen", "Yes"},
      {bigValue + "FullScreen=Yes\r\n", "[A-Za-z]+Screen", "Yes"},
      {std::string(3000, '=') + "\xff\v=x\n", "", "x"},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(testing::PrintToString(row.text.substr(0, 80)) + " key " + row.key);
    ErrorPtr error = Error::create("stale", 1);
    EXPECT_EQ(KivUloFileParser(row.text).getValue(row.key, &error), row.expected);
    EXPECT_EQ(error, nullptr);
    error = Error::create("stale", 1);
    EXPECT_EQ(detail::uloValueByPattern(row.text, row.key, &error), row.expected);
    EXPECT_EQ(error, nullptr);
    if (detail::isPlainUloKey(row.key)) {
      EXPECT_EQ(detail::uloValueByPlainSearch(row.text, row.key), row.expected);
    }
  }
}

TEST(KivUloFileParserTest, BooleanValueLowerCasesTheValueOnly) {
  using List = std::vector<std::string>;
  const struct {
    const char* text;
    List trueValues;
    bool expected;
  } cases[] = {
      {"Flag=ON\n", {"on"}, true},
      {"Flag=ON\n", {"ON"}, false},
      {"Flag=ON\n", {}, false},
      {"Flag=\tyes\n", {"yes"}, false},
      {"Flag=\n", {"", "on"}, true},
      {"Other=1\n", {"1"}, false},
      {"Flag=E\u0301\n", {"\u00e9"}, true},  // lower-cased, then canonically equal
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.text);
    EXPECT_EQ(KivUloFileParser(row.text).getBooleanValue("Flag", row.trueValues), row.expected);
  }
}

TEST(KivUloFileParserTest, LargeAdversarialTextsStayBounded) {
  // Every "K=" sits on a line ending in VT: the plain search skips the line
  // once, where a backtracking search would rescan it per occurrence.
  std::string repeats;
  for (int i = 0; i < (1 << 19); ++i) repeats += "K=";
  EXPECT_EQ(KivUloFileParser(repeats + "\vK=ok\n").getValue("K"), "ok");
}

// A search that cannot decide within its budget answers absent (false) with
// an error, never a plain absent; the same name decides on a short text.
TEST(KivUloFileParserTest, RunawaySearchesStopWithAnError) {
  const struct {
    std::string text;
    std::string key;
    std::int64_t code;
  } cases[] = {
      // Cubic in the line's length, then exponential: both far over the
      // budget of about 1,500 steps.
      {std::string(1024, 'a') + "\n", ".*.*b", RegularExpressionStepLimitError},
      {std::string(1024, 'a') + "\n", "(a|aa)*(a|aa)*b", RegularExpressionStepLimitError},
      // One saved state per "a": the backtracking memory runs out first.
      {std::string(1 << 20, 'a') + "=1\n", "(a|b)+", RegularExpressionBacktrackLimitError},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.key);
    const KivUloFileParser parser(row.text);
    ErrorPtr error;
    EXPECT_EQ(parser.getValue(row.key, &error), nullopt);
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->domain(), RegularExpressionSearchErrorDomain);
    EXPECT_EQ(error->code(), row.code);
    error = nullptr;
    EXPECT_FALSE(parser.getBooleanValue(row.key, {""}, &error));
    EXPECT_NE(error, nullptr);

    const KivUloFileParser decided(row.text.substr(0, 20) + "b=1\n");
    EXPECT_EQ(decided.getValue(row.key, &error), "1");
    EXPECT_EQ(error, nullptr);
  }
}

}  // namespace
}  // namespace kivi
