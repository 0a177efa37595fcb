#include "kivi/text/json_serialization.h"

#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "test_support.h"

namespace kivi {
namespace {

using std::string_literals::operator""s;
using T = Number::Type;
constexpr auto kFragments = JSONReadingFragmentsAllowed;
// Appended to a text, an integer beyond 64 bits sends it to the careful reader.
constexpr std::string_view kBeyond64Bits = ",18446744073709551616]";

std::string text(const Data& d) { return std::string(d.begin(), d.end()); }

std::string debugDescription(const ErrorPtr& error) {
  const auto it = error->userInfo().find(DebugDescriptionErrorKey);
  return it != error->userInfo().end() && it->second.asString() ? *it->second.asString() : "";
}

std::string readFailure(std::string_view json, JSONReadingOptions options = 0) {
  ErrorPtr error;
  EXPECT_FALSE(JSONSerialization::JSONObjectWithData(json, options, &error).has_value());
  if (!error) return "(no error)";
  EXPECT_EQ(error->domain(), CocoaErrorDomain);
  EXPECT_EQ(error->code(), PropertyListReadCorruptError);
  EXPECT_EQ(error->localizedDescription(),
            "The data couldn\u2019t be read because it isn\u2019t in the correct format.");
  return debugDescription(error);
}

std::string writeFailure(const Value& value, JSONWritingOptions options = 0) {
  ErrorPtr error;
  EXPECT_FALSE(JSONSerialization::dataWithJSONObject(value, options, &error).has_value());
  if (!error) return "(no error)";
  EXPECT_EQ(error->code(), PropertyListWriteInvalidError);
  return debugDescription(error);
}

std::string nested(std::size_t depth, std::string_view open, std::string_view close,
                   std::string_view inner) {
  std::string s;
  for (std::size_t i = 0; i < depth; ++i) s += open;
  s += inner;
  for (std::size_t i = 0; i < depth; ++i) s += close;
  return s;
}

TEST(JSONSerialization, ReadsEachKindAndNumberFlavourOnBothPaths) {
  const auto kI64Min = std::numeric_limits<std::int64_t>::min();
  const auto kU64Max = std::numeric_limits<std::uint64_t>::max();
  const struct {
    std::string json;
    Value expected;
    int flavour;  // the Number::Type of a number, -1 for other kinds
  } cases[] = {
      {"\n\t{\"a\":1, \"b\":[true,null,\"x\"], \"c\":{}, \"a\":[ ]}\r\n",
       Dictionary{{"a", Array{}}, {"b", Array{true, nullptr, "x"}}, {"c", Dictionary{}}}, -1},
      {R"( "\u00e9\ud83d\ude00\"\\\/\b\f\n\r\t\u0000 é")", "é😀\"\\/\b\f\n\r\t\0 é"s, -1},
      {"null", nullptr, -1},
      {"true", true, int(T::Bool)},
      {"-0", 0, int(T::Int)},
      {"-9223372036854775808", kI64Min, int(T::Int)},
      {"9223372036854775807", std::numeric_limits<std::int64_t>::max(), int(T::Int)},
      {"9223372036854775808", Number(std::uint64_t{1} << 63), int(T::UInt)},
      {"18446744073709551615", kU64Max, int(T::UInt)},
      {"18446744073709551616", 18446744073709551616.0, int(T::Double)},
      {"-9223372036854775809", -9223372036854775808.0, int(T::Double)},
      {"2.5E+3", 2500.0, int(T::Double)},
      {"4.9e-324", 4.9406564584124654e-324, int(T::Double)},
      {"-0.0", -0.0, int(T::Double)},
      {"-1e-400", -0.0, int(T::Double)},
      {"0." + std::string(400, '0') + "1e10", 0.0, int(T::Double)},
  };
  for (const auto& c : cases) {
    const bool container = c.expected.asArray() || c.expected.asDictionary();
    if (!container) {
      EXPECT_EQ(readFailure(c.json), readFailure("\"x\""));  // needs the option
    }
    for (const bool careful : {false, true}) {
      const std::string json = careful ? "[" + c.json + std::string(kBeyond64Bits) : c.json;
      SCOPED_TRACE(json);
      ErrorPtr error = Error::create("stale", 1);
      const auto read = JSONSerialization::JSONObjectWithData(json, kFragments, &error);
      ASSERT_TRUE(read.has_value()) << error->description();
      EXPECT_EQ(error, nullptr);
      const Value& value = careful ? *read->at(0) : *read;
      EXPECT_EQ(value, c.expected);
      if (c.flavour < 0) continue;
      EXPECT_EQ(int(value.asNumber()->type()), c.flavour);
      if (c.flavour == int(T::Double)) {
        EXPECT_EQ(std::signbit(value.asNumber()->doubleValue()), c.json[0] == '-');
      }
    }
  }
  EXPECT_EQ(readFailure("42"),
            "JSON text did not start with array or object and option to allow fragments not set.");
}

TEST(JSONSerialization, RefusesInvalidTextsSayingWhatAndWhere) {
  const std::pair<std::string, std::string> cases[] = {
      {"", "Unexpected end of input around line 1, column 1."},
      {"  \n ", "Unexpected end of input around line 2, column 2."},
      {"[1,2", "Unexpected end of input around line 1, column 5."},
      {"[\"abc", "Unexpected end of input around line 1, column 6."},
      {"{\n  \"a\": 1,\n  x\n}", "Unexpected character 'x' around line 3, column 3."},
      {"[1,]", "Unexpected character ']' around line 1, column 4."},
      {"[] []", "Unexpected character '[' around line 1, column 4."},
      {"[1]\0"s, "Unexpected character U+0000 around line 1, column 4."},
      {"[1,\0]"s, "Unexpected character U+0000 around line 1, column 4."},
      {"\xef\xbb\xbf[]", "Unexpected character '\xef\xbb\xbf' around line 1, column 1."},
      {"{12:2}", "Unexpected character '1' around line 1, column 2."},
      {"[1 false]", "Unexpected character 'f' around line 1, column 4."},
      {"[tru]", "Unexpected character ']' around line 1, column 5."},
      {"[\xc3\xa9]", "Unexpected character '\xc3\xa9' around line 1, column 2."},
      {"[\xff]", "Invalid UTF-8 around line 1, column 2."},
      {"[01]", "Invalid number '01' around line 1, column 2."},
      {"[1.5.2]", "Invalid number '1.5.2' around line 1, column 2."},
      {"[1.]", "Invalid number '1.' around line 1, column 2."},
      {"[-1e400]", "Number out of range '-1e400' around line 1, column 2."},
      {R"(["\ud800"])", "Unpaired surrogate '\\ud800' around line 1, column 3."},
      {R"(["\udc00"])", "Unpaired surrogate '\\udc00' around line 1, column 3."},
      {R"(["\ud800\u0041"])", "Unpaired surrogate '\\ud800' around line 1, column 3."},
      {R"(["\u12g4"])", "Invalid unicode escape '\\u12g4' around line 1, column 3."},
      {R"(["\x"])", "Invalid escape sequence '\\x' around line 1, column 3."},
      {"[\"a\tb\"]", "Unescaped control character U+0009 in string around line 1, column 4."},
      {"[\"abc\xff\"]", "Invalid UTF-8 around line 1, column 6."},
      {"[\"\xed\xa0\x80\"]", "Invalid UTF-8 around line 1, column 3."},      // a surrogate
      {"[\"\xc0\xaf\"]", "Invalid UTF-8 around line 1, column 3."},          // overlong
      {"[\"\xf4\x90\x80\x80\"]", "Invalid UTF-8 around line 1, column 3."},  // > U+10FFFF
      {"[\"\xe2\x82\"]", "Invalid UTF-8 around line 1, column 3."},          // truncated
  };
  for (const auto& [json, message] : cases) {
    SCOPED_TRACE(json);
    EXPECT_EQ(readFailure(json, kFragments), message);
  }
}

TEST(JSONSerialization, DepthIsLimitedOnReadingAndWriting) {
  // Each shape repeated `deepest` times around `inner` nests exactly 1024
  // levels; once more is too deep. `careful` holds an integer beyond 64 bits
  // at the same depth, which sends the text to the careful reader.
  const std::string big(kBeyond64Bits.substr(1, 20));
  const struct {
    std::string open, close, inner, careful;
    std::size_t deepest;
    int column;  // of the 1025th level
  } shapes[] = {{"[", "]", "1", big, 1024, 1025},
                {"{\"[\\\"\":", "}", "1", big, 1024, 7169},  // a key holding [ and "
                {"[{\"k\":", "}]", "1", big, 512, 3073},
                // An empty innermost container, which simdjson counts as no
                // level, is a level all the same.
                {"[", "]", "", "", 1024, 1025},
                {"[", "]", "{}", "{\"k\":" + big + "}", 1023, 1025},
                {"{\"k\":", "}", "[]", "[" + big + "]", 1023, 5121}};
  for (const auto& c : shapes) {
    SCOPED_TRACE(c.open + c.inner);
    const std::string tooDeep =
        "Too deeply nested around line 1, column " + std::to_string(c.column) + ".";
    for (const std::string& inner : {c.inner, c.careful}) {
      const auto value = JSONSerialization::JSONObjectWithData(
          nested(c.deepest, c.open, c.close, inner), 0, nullptr);
      ASSERT_TRUE(value.has_value()) << inner;
      EXPECT_TRUE(JSONSerialization::isValidJSONObject(*value));
      EXPECT_EQ(readFailure(nested(c.deepest + 1, c.open, c.close, inner)), tooDeep) << inner;
    }
    EXPECT_EQ(readFailure(nested(10'000, c.open, c.close, c.inner)), tooDeep);
  }

  // Writing stops where reading does (a million levels: value_test.cpp).
  Value deep = Array{};
  for (int level = 2; level <= 1025; ++level) deep = Array{std::move(deep)};
  EXPECT_TRUE(JSONSerialization::dataWithJSONObject(*deep.at(0), 0, nullptr));
  EXPECT_FALSE(JSONSerialization::isValidJSONObject(deep));
  EXPECT_EQ(writeFailure(deep, JSONWritingPrettyPrinted),
            "Too deeply nested in JSON write (more than 1024 levels).");
}

TEST(JSONSerialization, WritesJSONAndRefusesTheRest) {
  const double kTwo53 = 9007199254740992.0;
  std::string longEscaped;
  for (int i = 0; i < 5000; ++i) longEscaped += "\\u0001";
  const Value document =
      Dictionary{{"a", 1}, {"b", Array{true, nullptr, "x"}}, {"c", Dictionary{}}, {"d", Array{}}};
  constexpr auto kPretty = JSONWritingPrettyPrinted;
  const struct {
    Value value;
    JSONWritingOptions options;
    std::string text, error = {};  // the error's debug description when refused
  } cases[] = {
      {document, JSONWritingSortedKeys, R"({"a":1,"b":[true,null,"x"],"c":{},"d":[]})"},
      {document, kPretty,
       "{\n  \"a\" : 1,\n  \"b\" : [\n    true,\n    null,\n    \"x\"\n  ],\n"
       "  \"c\" : {},\n  \"d\" : []\n}"},
      {Array{Array{Array{}}}, kPretty, "[\n  [\n    []\n  ]\n]"},
      {Array{1.0, 2.5, -0.0, 0.1, 1e300, 1e-7, kTwo53, -kTwo53, 2 * kTwo53, false}, 0,
       "[1,2.5,-0,0.1,1e+300,1e-07,9007199254740992,-9007199254740992,1.8014398509481984e+16,"
       "false]"},
      {Array{std::numeric_limits<std::int64_t>::min(), std::numeric_limits<std::uint64_t>::max()},
       0, "[-9223372036854775808,18446744073709551615]"},
      {Array{"a/b\"\\\b\f\n\r\t\x01\x1f\x7f é😀\0"s}, 0,
       R"(["a\/b\"\\\b\f\n\r\t\u0001\u001f)"
       "\x7f é😀\\u0000\"]"},
      {Dictionary{{"/", "/"}}, JSONWritingWithoutEscapingSlashes, R"({"/":"/"})"},
      {"x", JSONWritingFragmentsAllowed, R"("x")"},
      {nullptr, JSONWritingFragmentsAllowed | kPretty, "null"},
      {Array{std::string(5000, '\x01') + "/"}, 0, "[\"" + longEscaped + "\\/\"]"},
      {42, 0, "", "Invalid top-level type in JSON write."},
      {Array{Data{1}}, 0, "", "Invalid type in JSON write (NSData)."},
      {Dictionary{{"d", Date{1}}}, kPretty, "", "Invalid type in JSON write (NSDate)."},
      {Array{std::make_shared<Error>("d", 1)}, 0, "", "Invalid type in JSON write (NSError)."},
      {Array{1, Array{std::nan("")}}, kPretty, "", "Invalid number value (NaN) in JSON write."},
      {Array{-HUGE_VAL}, 0, "", "Invalid number value (infinite) in JSON write."},
      {Array{"ok\xff"}, kPretty, "", "Invalid UTF-8 in string in JSON write."},
      {Dictionary{{"\xc0\x80", 1}}, 0, "", "Invalid UTF-8 in string in JSON write."},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text + c.error);
    EXPECT_EQ(JSONSerialization::isValidJSONObject(c.value),
              c.error.empty() && (c.value.asArray() || c.value.asDictionary()));
    if (!c.error.empty()) {
      EXPECT_EQ(writeFailure(c.value, c.options), c.error);
      continue;
    }
    ErrorPtr error = Error::create("stale", 1);
    const auto data = JSONSerialization::dataWithJSONObject(c.value, c.options, &error);
    ASSERT_TRUE(data.has_value()) << error->description();
    EXPECT_EQ(error, nullptr);
    EXPECT_EQ(text(*data), c.text);
  }
}

// Random JSON values: strings with escapes, control and multi-byte
// characters; numbers of every flavour, extremes included.
Value randomValue(std::mt19937_64& random, int depth = 0) {
  auto pick = [&](int n) { return std::uniform_int_distribution<int>(0, n - 1)(random); };
  auto string = [&] {
    static const std::string_view kPieces[] = {"a",    "/", "\"", "\\", "\n",      "\x01",
                                               "\x7f", "é", "😀",  "\t", {"\0", 1}, "\u2028"};
    std::string s;
    for (int n = pick(8); n > 0; --n) s += kPieces[pick(std::size(kPieces))];
    return s;
  };
  const std::uint64_t bits = random();
  const double d = std::bit_cast<double>(bits);
  const int kind = pick(depth >= 6 ? 4 : 7);  // scalars, arrays (4), dictionaries
  if (kind == 0) return pick(2) ? Value() : Value(pick(2) == 0);
  if (kind == 1) return string();
  if (kind == 2)
    return pick(2) ? Number(std::int64_t(bits)) : Number(bits | std::uint64_t{1} << 63);
  if (kind == 3) return pick(2) ? (pick(2000) - 1000) / 8.0 : (std::isfinite(d) ? d : 0.5);
  Array array;
  Dictionary dictionary;
  for (int n = pick(5); n > 0; --n) {
    if (kind == 4) array.push_back(randomValue(random, depth + 1));
    if (kind != 4) dictionary.insert_or_assign(string(), randomValue(random, depth + 1));
  }
  return kind == 4 ? Value(std::move(array)) : Value(std::move(dictionary));
}

TEST(JSONSerialization, RandomValuesReadBackEqualOnBothPathsFromManyThreads) {
  // Each thread reuses its own parser and output buffer: texts must not mix.
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([t] {
      std::mt19937_64 random(20240611 + t);
      for (int i = 0; i < 500; ++i) {
        const Value value = randomValue(random);
        const JSONWritingOptions options = JSONWritingFragmentsAllowed |
                                           (i % 2 ? JSONWritingPrettyPrinted : 0) |
                                           (i % 3 ? JSONWritingWithoutEscapingSlashes : 0);
        const auto data = JSONSerialization::dataWithJSONObject(value, options, nullptr);
        ASSERT_TRUE(data.has_value()) << value.description();
        for (const bool careful : {false, true}) {
          const std::string json =
              careful ? "[" + text(*data) + std::string(kBeyond64Bits) : text(*data);
          ErrorPtr error;
          const auto back = JSONSerialization::JSONObjectWithData(json, kFragments, &error);
          ASSERT_TRUE(back.has_value()) << json << "\n" << error->description();
          EXPECT_EQ(careful ? *back->at(0) : *back, value) << json;
        }
      }
    });
  }
  for (auto& thread : threads) thread.join();
}

}  // namespace
}  // namespace kivi
