#include "kivi/text/regular_expression.h"

#include <gtest/gtest.h>

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

  // Exponential backtracking: the budget ends it.
  const auto runaway = RegularExpression::create("(a|aa)*c");
  EXPECT_EQ(runaway->firstMatch(std::string(64, 'a'), kWholeText, 10), std::nullopt);
  EXPECT_EQ(runaway->firstMatch(std::string(64, 'a') + "c", kWholeText, 10), (TextRange{0, 65}));
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
