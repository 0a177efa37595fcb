#include "kivi/text/format.h"

#include <gtest/gtest.h>

#include <cfloat>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <memory>
#include <string>
#include <utility>

#include "test_support.h"

namespace kivi {
namespace {

class Described : public Object {
 public:
  std::string description() const override { return "<Described 7>"; }
};

// The C library's answer for one conversion, with "ll" or nothing inserted
// before the conversion character.
template <class T>
std::string printfReference(const std::string& conversion, T value) {
  std::string cFormat = conversion;
  if constexpr (std::is_integral_v<T>) cFormat.insert(cFormat.find_last_of("diouxX"), "ll");
  char buf[2048];
  std::snprintf(buf, sizeof buf, cFormat.c_str(), value);
  return buf;
}

TEST(Format, IntegersMatchTheCLibrary) {
  const char* conversions[] = {"%d",     "%i",     "%5d",   "%-5d|", "%05d", "%+d",
                               "% d",    "%.3d",   "%.0d",  "%8.3d", "%u",   "%x",
                               "%#x",    "%X",     "%#X",   "%o",    "%#o",  "%#.3o",
                               "%08.3x", "%-#8x|", "%+05d", "%+.0d", "%#.0o"};
  constexpr long long kMin = std::numeric_limits<int64_t>::min();
  constexpr long long kMax = std::numeric_limits<int64_t>::max();
  const long long values[] = {0, 1, -1, 42, -42, 255, 1'000'000, kMin, kMax};
  for (const char* conversion : conversions) {
    for (long long v : values) {
      EXPECT_EQ(format(conversion, v), printfReference(conversion, v)) << conversion << " " << v;
    }
  }
  EXPECT_EQ(format("%d %u", std::numeric_limits<std::uint64_t>::max(), -1),
            "18446744073709551615 18446744073709551615");
  EXPECT_EQ(format("%hhd %ld %lld %qd %zu %td %jd %Lf", 1, 2, 3, 4, 5u, 6, 7, 8.0),
            "1 2 3 4 5 6 7 8.000000");
}

TEST(Format, FloatsMatchTheCLibrary) {
  const char* conversions[] = {"%f", "%.0f", "%#.0f", "%.3f",  "%+010.2f", "%-12.4f|", "% f",
                               "%F", "%e",   "%.0e",  "%#.0e", "%E",       "%.10e",    "%g",
                               "%G", "%.0g", "%#g",   "%#.3g", "%.12g",    "%010g",    "%a",
                               "%A", "%.2a", "%#.0a", "%+.3a", "%012.1a",  "%.800f",   "%.20e"};
  const double values[] = {0.0,  -0.0,   1.0,        -1.5,      0.1,     2.5,     3.5,
                           1e-5, 0.0001, 123456.789, 1e300,     -1e-300, DBL_MAX, 9.9999995,
                           1e15, 1e16,   HUGE_VAL,   -HUGE_VAL, NAN};
  for (const char* conversion : conversions) {
    for (double v : values) {
      EXPECT_EQ(format(conversion, v), printfReference(conversion, v)) << conversion << " " << v;
    }
  }
  EXPECT_EQ(format("%.2f", 1.0f), "1.00");
}

TEST(Format, StringsObjectsPointersPositionsAndStars) {
  auto described = std::make_shared<Described>();
  std::shared_ptr<Described> nullObject;
  const char* nullString = nullptr;
  const char unterminated[3] = {'a', 'b', 'c'};
  const std::pair<std::string, std::string> cases[] = {
      {format("%s|%5s|%-5s|%.2s", "abc", "ab", "ab", "abc"), "abc|   ab|ab   |ab"},
      {format("%s %S %s", std::string("str"), std::string_view("view"), unterminated),
       "str view abc"},
      {format("%s %@", nullString, nullString), "(null) (null)"},
      {format("%.1s|%.2s|%.4s", "é", "€", "a😀"), "||a"},  // never cut a sequence
      {format("%@ %@ %@", Value("text"), Value(7), Value(2.5)), "text 7 2.5"},
      {format("%@ %@", Value(true), Value()), "1 <null>"},
      {format("%@", Value(Array{Value("a"), Value(1)})),
       Value(Array{Value("a"), Value(1)}).description()},
      {format("%@ %@ %@", described, *described, described.get()),
       "<Described 7> <Described 7> <Described 7>"},
      {format("%@ %@", nullObject, Value(described)), "(null) <Described 7>"},
      {format("%@ %@ %@ %@", 42, -3, 0.25, "c"), "42 -3 0.25 c"},
      {format("%10.4@|%-6@|", Value("abcdefgh"), 12), "      abcd|12    |"},
      {format("%p %p", static_cast<void*>(nullptr), reinterpret_cast<void*>(0x1f)), "0x0 0x1f"},
      {format("%c%c%C%c", 'a', 0xe9, 0x1F600, -1), "a\u00e9\U0001F600\uFFFD"},
      {format("%3c|%-3c|", 'x', 'y'), "  x|y  |"},
      {format("%%|%5%|%"), "%|%|%"},
      // Numbered arguments and "*" widths and precisions.
      {format("%2$s %1$s %2$s", "a", "b"), "b a b"},
      {format("%1$d %d %d", 1, 2), "1 1 2"},  // numbered ones do not move the sequence
      {format("%*d|%-*d|%.*f", 4, 1, 4, 2, 2, 3.14159), "   1|2   |3.14"},
      {format("%*d|%.*d", -4, 1, -1, 7), "1   |7"},  // negative: "-" flag, no precision
      {format("%2$*1$d", 5, 9), "    9"},
      {format("%.*s", 2u, "abc"), "ab"},
  };
  for (const auto& [actual, expected] : cases) EXPECT_EQ(actual, expected);
  EXPECT_EQ(format("%p", described), format("%p", static_cast<const void*>(described.get())));
}

TEST(Format, BadInputIsMarkedInTheText) {
  int count = 0;
  const std::pair<std::string, std::string> cases[] = {
      {format("%d and %s"), "%!d(MISSING) and %!s(MISSING)"},
      {format("%d", "abc"), "%!d(string=abc)"},
      {format("%s|%f|%c", 5, 7u, 2.5), "%!s(int=5)|%!f(uint=7)|%!c(double=2.5)"},
      {format("%p|%x", Value("v"), Value(1)), "%!p(value=v)|%!x(value=1)"},
      {format("%d%n%d", 1, &count, 2), "1%!n(BADVERB)2"},  // %n uses up its argument
      {format("%y %d", 3), "%!y(BADVERB) 3"},              // unknown: no argument used
      {format("%\xc3\xa9|"), "%!\xc3\xa9(BADVERB)|"},
      {format("%*d", "w", 3), "%!(BADWIDTH)3"},
      {format("%.*d", 2.0, 3), "%!(BADPREC)3"},
      {format("%*d"), "%!(BADWIDTH)%!d(MISSING)"},
      {format("%3$d %0$d", 1), "%!d(MISSING) %!$(BADVERB)d"},
      {format("100%"), "100%"},
      {format("50%-5"), "50%-5"},
      {format("%d", 1, 2, "extra"), "1"},
      {format(std::string_view("a\0%d", 4), 5), std::string("a\0005", 3)},  // "a", NUL, "5"
  };
  for (const auto& [actual, expected] : cases) EXPECT_EQ(actual, expected);
  EXPECT_EQ(count, 0);
}

TEST(Format, HugeFieldsAreClamped) {
  EXPECT_EQ(format("%999999999999d", 1).size(), static_cast<std::size_t>(kMaxFormatField));
  EXPECT_EQ(format("%*d", std::numeric_limits<std::int64_t>::min(), 1).size(),
            static_cast<std::size_t>(kMaxFormatField));
  EXPECT_EQ(format("%.99999f", 1.0).size(), 2u + kMaxFormatField);
  EXPECT_EQ(format("%.99999e", DBL_MAX).size(), 7u + kMaxFormatField);
}

}  // namespace
}  // namespace kivi
