#include "kivi/text/regular_expression.h"

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <cstdint>
#include <string>
#include <thread>
#include <vector>

#include "kivi/text/json_serialization.h"

namespace kivi {
namespace {

TEST(RegularExpressionTest, InvalidPatternGivesNullAndAnError) {
  ErrorPtr error;
  EXPECT_EQ(RegularExpression::create("a(", 0, &error), nullptr);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), CocoaErrorDomain);
  EXPECT_EQ(error->code(), RegularExpressionInvalidPatternError);
  EXPECT_NE(RegularExpression::create("a(", RegularExpressionIgnoreMetacharacters, &error),
            nullptr);
  EXPECT_EQ(error, nullptr);
}

TEST(RegularExpressionTest, FirstMatchGivesByteRanges) {
  const struct {
    const char* pattern;
    RegularExpressionOptions options;
    std::string text;
    TextRange range;
    std::optional<TextRange> expected;
  } cases[] = {
      {"b+", 0, "a\u00e9bbb!", kWholeText, TextRange{3, 3}},
      {"\U0001F600.", 0, "x\U0001F600\u00e9", kWholeText, TextRange{1, 6}},
      {"a", 0, "abab", {1, 3}, TextRange{2, 1}},
      {"^b", 0, "abab", {1, 2}, TextRange{1, 1}},  // the range acts as the whole text
      {"b$", 0, "abab", {0, 2}, TextRange{1, 1}},
      {"a", 0, "abab", {9, 1}, std::nullopt},
      {"ABC", RegularExpressionCaseInsensitive, "xabc", kWholeText, TextRange{1, 3}},
      {"a.b", RegularExpressionIgnoreMetacharacters, "axb a.b", kWholeText, TextRange{4, 3}},
      {"a.b", 0,
       "a\nb a\u2028b a\xff"
       "b",
       kWholeText, TextRange{10, 3}},
      {"x\\x00y", 0, std::string("-x\0y", 4), kWholeText, TextRange{1, 3}},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.pattern);
    const auto expression = RegularExpression::create(row.pattern, row.options);
    ASSERT_NE(expression, nullptr);
    EXPECT_EQ(expression->firstMatch(row.text, row.range), row.expected);
  }
}

TEST(RegularExpressionTest, EnumeratesMatchesAndHonoursTheStepLimit) {
  const auto b = RegularExpression::create("b+");
  EXPECT_EQ(RegularExpression::create("")->numberOfMatches("ab"), 3u);
  std::vector<TextRange> seen;
  const auto visit = [&](TextRange r) {
    seen.push_back(r);
    return seen.size() < 2;
  };
  EXPECT_EQ(b->enumerateMatches("bb_b_b", kWholeText, visit), 2u);
  EXPECT_EQ(seen, (std::vector<TextRange>{{0, 2}, {3, 1}}));

  // A search that stops early says why; one that ends, or that its visitor
  // ends, sets no error. Matches found before the stop stand.
  const auto runaway = RegularExpression::create("(a|aa)*c");
  const auto grouped = RegularExpression::create("(a|b)+c|x");
  const std::string as(64, 'a');
  const std::string million(1 << 20, 'a');
  const struct {
    RegularExpressionPtr expression;
    std::string text;
    RegularExpression::StepLimit limit;
    std::size_t matches;
    std::int64_t code;  // 0: no error
  } cases[] = {
      {runaway, as, 10, 0, RegularExpressionStepLimitError},
      {runaway, as + "c", 10, 1, 0},
      {runaway, "c" + as, 10, 1, RegularExpressionStepLimitError},
      // A saved state per letter: a million letters are too many.
      {grouped, "x" + million + "c", 0, 1, RegularExpressionBacktrackLimitError},
      {grouped, "x" + million.substr(0, 1000) + "c", 0, 2, 0},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.expression->pattern() + " " + row.text.substr(0, 8));
    ErrorPtr error = Error::create("stale", 1);
    EXPECT_EQ(row.expression->numberOfMatches(row.text, kWholeText, row.limit, &error),
              row.matches);
    EXPECT_EQ(error ? error->code() : 0, row.code);
    EXPECT_EQ(error ? error->domain() : RegularExpressionSearchErrorDomain,
              RegularExpressionSearchErrorDomain);
  }
  ErrorPtr error = Error::create("stale", 1);
  EXPECT_EQ(runaway->enumerateMatches(
                "c" + as, kWholeText, [](TextRange) { return false; }, 10, &error),
            1u);
  EXPECT_EQ(error, nullptr);

  // Over 2 GiB of text (reserved, never touched): refused before reading.
  const std::size_t size = (std::size_t{1} << 31) + 1;
  void* huge = mmap(nullptr, size, PROT_READ, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
  ASSERT_NE(huge, MAP_FAILED);
  const std::string_view text(static_cast<const char*>(huge), size);
  EXPECT_EQ(b->firstMatch(text, kWholeText, 0, &error), std::nullopt);
  EXPECT_EQ(error ? error->code() : 0, RegularExpressionTextTooLongError);
  EXPECT_EQ(b->firstMatch(text, {size - 5, 5}, 0, &error), std::nullopt);
  EXPECT_EQ(error, nullptr);
  munmap(huge, size);
}

TEST(RegularExpressionTest, OneExpressionServesManyThreads) {
  const auto expression = RegularExpression::create("[0-9]+");
  std::string text;
  for (int i = 0; i < 1000; ++i) text += std::to_string(i) + ",";
  std::vector<std::size_t> counts(4);
  std::vector<std::thread> threads;
  for (std::size_t t = 0; t < counts.size(); ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 20; ++i) counts[t] += expression->numberOfMatches(text);
    });
  }
  for (auto& thread : threads) thread.join();
  for (std::size_t count : counts) EXPECT_EQ(count, 20u * 1000u);
}

}  // namespace
}  // namespace kivi
