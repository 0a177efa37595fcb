#include <gtest/gtest.h>

#include <cstdint>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "kivi/logging/kiv_obfuscator.h"

namespace kivi {
namespace {

using std::nullopt;

TEST(ObfuscatorTest, WorkedValuesAndEdges) {
  const struct {
    std::optional<std::string> text;
    std::uint64_t transformation;
    std::optional<std::string> expected;
  } cases[] = {
      {"abc", 0, "][Y"},
      {"#", 0, "}"},
      {"~", 0, "|"},
      {"|", 1, "\""},  // so '~' comes back as '"'
      {"AAA", 0, "=:7"},
      {" ! ", 0, "xvr"},
      {"xvr", 1, "|}|"},                                // space and '!' come back 92 higher
      {std::string(91, 'k'), 0, std::string(91, 'j')},  // at length 91 every shift is 1
      {"", 0, ""},
      {"~x y", 2, "~x y"},
      {nullopt, 0, nullopt},
      {nullopt, 1, nullopt},
      {std::string("a\0b", 3), 2, nullopt},  // U+0000 cannot be copied out
      {"\xC3\xA9", 0, "\x1C"},               // "é": its second byte becomes 0
      {"\xE2\x82\xAC", 0, nullopt},          // "€": the result is no UTF-8
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.text.value_or("(null)") + " " + std::to_string(row.transformation));
    EXPECT_EQ(KivObfuscator::transformString(row.text, row.transformation), row.expected);
  }
  EXPECT_EQ(KivObfuscator::obfuscateString("abc"), "][Y");
  EXPECT_EQ(KivObfuscator::unobfuscateString("][Y"), "abc");
  EXPECT_EQ(KivObfuscator::transformString(nullptr, 0), nullopt);
  EXPECT_EQ(KivObfuscator::obfuscateString(nullptr), nullopt);
  EXPECT_EQ(KivObfuscator::unobfuscateString(nullptr), nullopt);
}

// Every byte value, at lengths around the 91-byte period and the 2912-byte
// block, against the per-byte rule written out plainly.
TEST(ObfuscatorTest, BufferFormsFollowThePerByteRule) {
  std::mt19937_64 rng(2912);
  for (std::size_t n : {1u, 90u, 91u, 256u, 2911u, 2912u, 2913u, 3 * 2912u + 7}) {
    std::vector<std::uint8_t> bytes(n), obfuscated(n), unobfuscated(n);
    for (auto& b : bytes) b = static_cast<std::uint8_t>(rng());
    for (std::size_t i = 0; i < n; ++i) {
      const int c = bytes[i], s = static_cast<int>(n * (i + 1) % 91) + 1;
      obfuscated[i] =
          static_cast<std::uint8_t>(s - 1 < static_cast<std::int8_t>(c - 35) ? c - s : c - s + 92);
      unobfuscated[i] =
          static_cast<std::uint8_t>(s < static_cast<std::int8_t>(126 - c) ? c + s : c + s - 92);
    }
    auto buffer = bytes;
    KivObfuscator::obfuscateString(buffer.data(), n);
    EXPECT_EQ(buffer, obfuscated) << n;
    buffer = bytes;
    KivObfuscator::unobfuscateString(buffer.data(), n);
    EXPECT_EQ(buffer, unobfuscated) << n;
  }
  KivObfuscator::obfuscateString(static_cast<char*>(nullptr), 5);  // nothing to do
}

TEST(ObfuscatorTest, EveryTextOfBytes34To125ComesBack) {
  std::mt19937_64 rng(3340);
  for (std::size_t length = 1; length <= 200; ++length) {
    for (int round = 0; round < 20; ++round) {
      std::string text(length, ' ');
      for (char& c : text) c = static_cast<char>(34 + rng() % 92);
      const auto obfuscated = KivObfuscator::obfuscateString(text);
      ASSERT_TRUE(obfuscated) << text;
      ASSERT_EQ(obfuscated->size(), length);
      for (char c : *obfuscated) ASSERT_TRUE(c >= 35 && c <= 126) << text;
      ASSERT_EQ(KivObfuscator::unobfuscateString(obfuscated), text);
    }
  }
}

}  // namespace
}  // namespace kivi
