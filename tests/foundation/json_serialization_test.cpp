#include "kivi/foundation/json_serialization.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
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

std::string text(const Data& d) { return std::string(d.begin(), d.end()); }

std::string readFailure(std::string_view json, JSONReadingOptions options = 0) {
  ErrorPtr error;
  const auto value = JSONSerialization::JSONObjectWithData(json, options, &error);
  EXPECT_FALSE(value.has_value());
  if (!error) return "(no error)";
  EXPECT_EQ(error->domain(), CocoaErrorDomain);
  EXPECT_EQ(error->code(), PropertyListReadCorruptError);
  EXPECT_EQ(error->localizedDescription(),
            "The data couldn\u2019t be read because it isn\u2019t in the correct format.");
  const Value* debug = error->userInfo().count(DebugDescriptionErrorKey)
                           ? &error->userInfo().at(DebugDescriptionErrorKey)
                           : nullptr;
  return debug && debug->asString() ? *debug->asString() : "(no debug description)";
}

std::string writeFailure(const Value& value, JSONWritingOptions options = 0) {
  ErrorPtr error;
  EXPECT_FALSE(JSONSerialization::dataWithJSONObject(value, options, &error).has_value());
  if (!error) return "(no error)";
  EXPECT_EQ(error->code(), PropertyListWriteInvalidError);
  const auto it = error->userInfo().find(DebugDescriptionErrorKey);
  return it != error->userInfo().end() && it->second.asString() ? *it->second.asString() : "";
}

std::string nested(std::size_t depth, std::string_view open, std::string_view close,
                   std::string_view inner = "") {
  std::string s;
  for (std::size_t i = 0; i < depth; ++i) s += open;
  s += inner;
  for (std::size_t i = 0; i < depth; ++i) s += close;
  return s;
}

TEST(JSONSerialization, ReadsEachKindAndNumberFlavour) {
  const auto kI64Min = std::numeric_limits<std::int64_t>::min();
  const auto kI64Max = std::numeric_limits<std::int64_t>::max();
  const auto kU64Max = std::numeric_limits<std::uint64_t>::max();
  const struct {
    std::string json;
    Value expected;
    int flavour;  // the Number::Type of the first element, -1 if not a number
  } cases[] = {
      {R"( {"a":1, "b":[true,null,"x"], "c":{}} )",
       Dictionary{{"a", 1}, {"b", Array{true, nullptr, "x"}}, {"c", Dictionary{}}}, -1},
      {R"({"k":1,"k":2})", Dictionary{{"k", 2}}, -1},
      {"\n\t[ ]\r\n", Array{}, -1},
      {"[true]", Array{true}, int(T::Bool)},
      {"[-9223372036854775808]", Array{kI64Min}, int(T::Int)},
      {"[9223372036854775807]", Array{kI64Max}, int(T::Int)},
      {"[9223372036854775808]", Array{Number(std::uint64_t{1} << 63)}, int(T::UInt)},
      {"[18446744073709551615]", Array{kU64Max}, int(T::UInt)},
      {"[18446744073709551616]", Array{18446744073709551616.0}, int(T::Double)},
      {"[-9223372036854775809]", Array{-9223372036854775808.0}, int(T::Double)},
      {"[123456789012345678901234567890]", Array{1.2345678901234568e29}, int(T::Double)},
      {"[2.5e-3]", Array{0.0025}, int(T::Double)},
      {"[1E+2]", Array{100.0}, int(T::Double)},
      {"[1e-400]", Array{0.0}, int(T::Double)},
      {"[4.9e-324]", Array{4.9406564584124654e-324}, int(T::Double)},
      {"[-0.0]", Array{-0.0}, int(T::Double)},
      {"[-1e-400]", Array{-0.0}, int(T::Double)},
      {"[0." + std::string(400, '0') + "1e10]", Array{0.0}, int(T::Double)},
      {R"(["\u00e9\ud83d\ude00\"\\\/\b\f\n\r\t\u0000 é"])", Array{"é😀\"\\/\b\f\n\r\t\0 é"s}, -1},
  };
  // Each text also goes through the careful reader, which takes over when a
  // text holds an integer beyond 64 bits.
  for (const auto& c : cases) {
    for (const bool careful : {false, true}) {
      const std::string json = careful ? "[" + c.json + ",18446744073709551616]" : c.json;
      SCOPED_TRACE(json);
      ErrorPtr error = Error::create("stale", 1);
      const auto read = JSONSerialization::JSONObjectWithData(json, 0, &error);
      ASSERT_TRUE(read.has_value()) << error->description();
      EXPECT_EQ(error, nullptr);
      const Value& value = careful ? *read->at(0) : *read;
      EXPECT_EQ(value, c.expected);
      if (c.flavour >= 0) {
        EXPECT_EQ(int(value.at(0)->asNumber()->type()), c.flavour);
        EXPECT_EQ(std::signbit(value.at(0)->asNumber()->doubleValue()), c.json[1] == '-');
      }
    }
  }
}

TEST(JSONSerialization, FragmentsNeedTheOption) {
  const std::pair<const char*, Value> cases[] = {
      {"\"x\"", "x"}, {" 42 ", 42}, {"null", nullptr}, {"false", false}, {"-1.5", -1.5}};
  for (const auto& [json, expected] : cases) {
    SCOPED_TRACE(json);
    EXPECT_EQ(JSONSerialization::JSONObjectWithData(json, kFragments, nullptr), expected);
    EXPECT_EQ(readFailure(json),
              "JSON text did not start with array or object and option to allow fragments not "
              "set.");
  }
}

TEST(JSONSerialization, RefusesInvalidTextsSayingWhatAndWhere) {
  const struct {
    std::string json;
    std::string message;
  } cases[] = {
      {"", "Unexpected end of input around line 1, column 1."},
      {"  \n ", "Unexpected end of input around line 2, column 2."},
      {"[1,2", "Unexpected end of input around line 1, column 5."},
      {"[\"abc", "Unexpected end of input around line 1, column 6."},
      {"{\n  \"a\": 1,\n  x\n}", "Unexpected character 'x' around line 3, column 3."},
      {"[1,]", "Unexpected character ']' around line 1, column 4."},
      {"[1] x", "Unexpected character 'x' around line 1, column 5."},
      {"[] []", "Unexpected character '[' around line 1, column 4."},
      {"[1]\0"s, "Unexpected character U+0000 around line 1, column 4."},
      {"{\"a\" 1}", "Unexpected character '1' around line 1, column 6."},
      {"{1:2}", "Unexpected character '1' around line 1, column 2."},
      {"[tru]", "Unexpected character ']' around line 1, column 5."},
      {"[nul", "Unexpected end of input around line 1, column 5."},
      {"x", "Unexpected character 'x' around line 1, column 1."},
      {"[01]", "Invalid number '01' around line 1, column 2."},
      {"[1.]", "Invalid number '1.' around line 1, column 2."},
      {"[-]", "Invalid number '-' around line 1, column 2."},
      {"[1e400]", "Number out of range '1e400' around line 1, column 2."},
      {"[-1.8e308]", "Number out of range '-1.8e308' around line 1, column 2."},
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
      {"[\xc3\xa9]", "Unexpected character '\xc3\xa9' around line 1, column 2."},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.json);
    EXPECT_EQ(readFailure(c.json, kFragments), c.message);
  }
}

TEST(JSONSerialization, DepthIsLimitedWithoutExhaustingTheStack) {
  // Each shape repeated `deepest` times nests 1024 levels; once more is too deep.
  const struct {
    std::string open, close, inner;
    std::size_t deepest;
    int column;  // of the 1025th level
  } shapes[] = {{"[", "]", "", 1024, 1025},
                {"[", "]", "1", 1024, 1025},
                {"{\"k\":", "}", "1", 1024, 5121},
                {"[{\"k\":", "}]", "1", 512, 3073}};
  for (const auto& c : shapes) {
    SCOPED_TRACE(c.open + c.inner);
    const auto value = JSONSerialization::JSONObjectWithData(
        nested(c.deepest, c.open, c.close, c.inner), 0, nullptr);
    ASSERT_TRUE(value.has_value());
    EXPECT_TRUE(JSONSerialization::isValidJSONObject(*value));
    const std::string tooDeep =
        "Too deeply nested around line 1, column " + std::to_string(c.column) + ".";
    EXPECT_EQ(readFailure(nested(c.deepest + 1, c.open, c.close, c.inner)), tooDeep);
    EXPECT_EQ(readFailure(nested(10'000, c.open, c.close, c.inner)), tooDeep);
  }
  EXPECT_EQ(readFailure(std::string(10'000, '[')), "Too deeply nested around line 1, column 1025.");
}

TEST(JSONSerialization, WritesCompactAndPrettyText) {
  const double kTwo53 = 9007199254740992.0;
  std::string longEscaped;
  for (int i = 0; i < 5000; ++i) longEscaped += "\\u0001";
  const Value document =
      Dictionary{{"a", 1}, {"b", Array{true, nullptr, "x"}}, {"c", Dictionary{}}, {"d", Array{}}};
  const struct {
    Value value;
    JSONWritingOptions options;
    std::string expected;
  } cases[] = {
      {document, 0, R"({"a":1,"b":[true,null,"x"],"c":{},"d":[]})"},
      {document, JSONWritingSortedKeys, R"({"a":1,"b":[true,null,"x"],"c":{},"d":[]})"},
      {document, JSONWritingPrettyPrinted,
       "{\n  \"a\" : 1,\n  \"b\" : [\n    true,\n    null,\n    \"x\"\n  ],\n"
       "  \"c\" : {},\n  \"d\" : []\n}"},
      {Array{Array{Array{}}}, JSONWritingPrettyPrinted, "[\n  [\n    []\n  ]\n]"},
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
      {-7, JSONWritingFragmentsAllowed, "-7"},
      {nullptr, JSONWritingFragmentsAllowed | JSONWritingPrettyPrinted, "null"},
      {Array{std::string(5000, '\x01') + "/"}, 0, "[\"" + longEscaped + "\\/\"]"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.expected);
    ErrorPtr error = Error::create("stale", 1);
    const auto data = JSONSerialization::dataWithJSONObject(c.value, c.options, &error);
    ASSERT_TRUE(data.has_value()) << error->description();
    EXPECT_EQ(error, nullptr);
    EXPECT_EQ(text(*data), c.expected);
  }
}

TEST(JSONSerialization, RefusesValuesThatAreNotJSON) {
  const struct {
    Value value;
    std::string message;
  } cases[] = {
      {"x", "Invalid top-level type in JSON write."},
      {42, "Invalid top-level type in JSON write."},
      {Array{Data{1}}, "Invalid type in JSON write (NSData)."},
      {Dictionary{{"d", Date{1}}}, "Invalid type in JSON write (NSDate)."},
      {Array{std::make_shared<Error>("d", 1)}, "Invalid type in JSON write (NSError)."},
      {Array{1, Array{std::nan("")}}, "Invalid number value (NaN) in JSON write."},
      {Array{-HUGE_VAL}, "Invalid number value (infinite) in JSON write."},
      {Array{"ok\xff"}, "Invalid UTF-8 in string in JSON write."},
      {Dictionary{{"\xc0\x80", 1}}, "Invalid UTF-8 in string in JSON write."},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.message);
    EXPECT_FALSE(JSONSerialization::isValidJSONObject(c.value));
    EXPECT_EQ(writeFailure(c.value), c.message);
    if (c.message.find("top-level") != std::string::npos) {
      EXPECT_TRUE(
          JSONSerialization::dataWithJSONObject(c.value, JSONWritingFragmentsAllowed, nullptr));
    } else {
      EXPECT_EQ(writeFailure(Dictionary{{"k", c.value}}, JSONWritingPrettyPrinted), c.message);
    }
  }
  EXPECT_TRUE(JSONSerialization::isValidJSONObject(Dictionary{{"a", Array{1.5, nullptr, "é"}}}));
}

TEST(JSONSerialization, RefusesToWriteDeeperThanItReads) {
  // Kept level by level so that dropping the chain never recurses deeply.
  std::vector<Value> chain{Array{}};
  for (int i = 0; i < 100'000; ++i) chain.push_back(Array{chain.back()});
  EXPECT_TRUE(JSONSerialization::dataWithJSONObject(chain[1023], 0, nullptr).has_value());
  EXPECT_FALSE(JSONSerialization::isValidJSONObject(chain[1024]));
  EXPECT_EQ(writeFailure(chain[1024]), "Too deeply nested in JSON write (more than 1024 levels).");
  EXPECT_FALSE(JSONSerialization::isValidJSONObject(chain.back()));
  EXPECT_EQ(writeFailure(chain.back(), JSONWritingPrettyPrinted),
            "Too deeply nested in JSON write (more than 1024 levels).");
  while (!chain.empty()) chain.pop_back();
}

// Random values for the round trip: all kinds of JSON values, strings with
// escapes, control characters and multi-byte characters, extreme numbers.
class RandomValues {
 public:
  explicit RandomValues(std::uint64_t seed) : random_(seed) {}

  Value make(int depth) {
    const int kind = pick(depth >= 6 ? 4 : 7);
    if (kind == 0) return nullptr;
    if (kind == 1) return string();
    if (kind == 2) return number();
    if (kind == 3) return pick(2) == 0;
    Array array;
    Dictionary dictionary;
    for (int n = pick(5); n > 0; --n) {
      if (kind == 6) dictionary.insert_or_assign(string(), make(depth + 1));
      if (kind != 6) array.push_back(make(depth + 1));
    }
    return kind == 6 ? Value(std::move(dictionary)) : Value(std::move(array));
  }

 private:
  int pick(int n) { return std::uniform_int_distribution<int>(0, n - 1)(random_); }

  std::string string() {
    static const std::string_view kPieces[] = {"a",  "Z",      " ",       "/",    "\"", "\\",
                                               "\n", "\x01",   "\x1f",    "\x7f", "é",  "€",
                                               "😀",  "\u2028", {"\0", 1}, "\t"};
    std::string s;
    for (int n = pick(8); n > 0; --n) s += kPieces[pick(std::size(kPieces))];
    return s;
  }

  Value number() {
    const std::uint64_t bits = random_();
    const double d = std::bit_cast<double>(bits);
    switch (pick(5)) {
      case 0:
        return Number(static_cast<std::int64_t>(bits));
      case 1:
        return Number(bits | std::uint64_t{1} << 63);
      case 2:
        return pick(1000) - 500;
      case 3:
        return (pick(2000) - 1000) / 8.0;
      default:
        return std::isfinite(d) ? d : 0.5;
    }
  }

  std::mt19937_64 random_;
};

TEST(JSONSerialization, RandomValuesReadBackEqual) {
  RandomValues values(20240611);
  for (int i = 0; i < 2000; ++i) {
    const Value value = values.make(0);
    const JSONWritingOptions options = JSONWritingFragmentsAllowed |
                                       (i % 2 ? JSONWritingPrettyPrinted : 0) |
                                       (i % 3 ? JSONWritingWithoutEscapingSlashes : 0);
    ErrorPtr error;
    const auto data = JSONSerialization::dataWithJSONObject(value, options, &error);
    ASSERT_TRUE(data.has_value()) << value.description() << error->description();
    const auto back = JSONSerialization::JSONObjectWithData(*data, kFragments, &error);
    ASSERT_TRUE(back.has_value()) << text(*data) << "\n" << error->description();
    EXPECT_EQ(*back, value) << text(*data);
    // An integer beyond 64 bits sends the whole text through the careful reader.
    const auto careful = JSONSerialization::JSONObjectWithData(
        "[" + text(*data) + ",18446744073709551616]", 0, &error);
    ASSERT_TRUE(careful.has_value()) << text(*data) << "\n" << error->description();
    EXPECT_EQ(*careful->at(0), value) << text(*data);
  }
}

TEST(JSONSerialization, ThreadsReadAndWriteAtOnce) {
  // Each thread reuses its own parser and output buffer: texts must not mix.
  std::atomic<int> mismatches{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([t, &mismatches] {
      RandomValues values(t);
      for (int i = 0; i < 300; ++i) {
        const Value value = Array{t, values.make(1)};
        const auto data = JSONSerialization::dataWithJSONObject(value, 0, nullptr);
        const auto back =
            data ? JSONSerialization::JSONObjectWithData(*data, 0, nullptr) : std::nullopt;
        if (!back || !(*back == value)) ++mismatches;
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(mismatches, 0);
}

}  // namespace
}  // namespace kivi
