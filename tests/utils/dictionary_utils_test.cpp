#include "kivi/utils/dictionary_utils.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "kivi/text/json_serialization.h"
#include "test_support.h"

namespace kivi {
namespace {

using std::nullopt;

TEST(CaseInsensitiveTest, LooksUpWithFullFoldingAndCanonicalEquivalence) {
  const Dictionary headers = {{"Content-Type", "text/html"},
                              {"Stra\u00dfe", "street"},
                              {"A\u0308rger", "trouble"},
                              {"Empty", ""},
                              {"Null", Value()}};
  const struct {
    const char* key;
    std::optional<Value> plain, withDefault, withoutDefault;
  } cases[] = {{"CONTENT-TYPE", "text/html", "text/html", "text/html"},
               {" content-type\n", nullopt, "text/html", "text/html"},
               {"STRASSE", "street", "street", "street"},
               {"\u00e4RGER", "trouble", "trouble", "trouble"},
               {"empty", "", "default", ""},
               {"NULL", Value(), Value(), Value()},
               {"Content-Typ", nullopt, "default", nullopt}};
  for (const auto& row : cases) {
    SCOPED_TRACE(row.key);
    EXPECT_EQ(CaseInsensitive::valueForCaseInsensitiveKey(headers, row.key), row.plain);
    EXPECT_EQ(CaseInsensitive::valueForCaseInsensitiveKey(headers, row.key, Value("default")),
              row.withDefault);
    EXPECT_EQ(CaseInsensitive::valueForCaseInsensitiveKey(headers, row.key, nullopt),
              row.withoutDefault);
  }
}

TEST(CaseInsensitiveTest, BoolConvertsStringsAndNumbersElseGivesTheDefault) {
  const auto boolFor = [](Value value, bool fallback) {
    return CaseInsensitive::boolForCaseInsensitiveKey({{"Flag", value}}, "FLAG", fallback);
  };
  for (Value yes : {"YES", "yes", "true", "T", "1", "0001", "-5", "+09x", "\u00a0\ty"}) {
    EXPECT_TRUE(boolFor(yes, false)) << yes.description();
  }
  for (Value no : {Value("NO"), Value("false"), Value("0"), Value("0.9"), Value(""), Value("abc"),
                   Value("-0"), Value("+-1"), Value(false)}) {
    EXPECT_FALSE(boolFor(no, true)) << no.description();
  }
  EXPECT_TRUE(boolFor(2, false));
  EXPECT_TRUE(boolFor(0.5, false));
  for (const bool fallback : {false, true}) {
    for (Value other : {Value(), Value(Array{}), Value(Dictionary{})}) {
      EXPECT_EQ(boolFor(other, fallback), fallback) << other.description();
    }
    EXPECT_EQ(CaseInsensitive::boolForCaseInsensitiveKey({{"Flag", "1"}}, " flag", fallback),
              fallback);
  }
}

TEST(CaseInsensitiveTest, LowercaseKeysLetTheLastInOrderWin) {
  const Dictionary lowered = CaseInsensitive::dictionaryWithLowercaseKeys(
      {{"Content-TYPE", 1}, {"X", 2}, {"x", 3}, {"\u0130D", 4}, {"\u00c4B", 5}});
  EXPECT_EQ(Value(lowered),
            Value(Dictionary{{"content-type", 1}, {"x", 3}, {"i\u0307d", 4}, {"\u00e4b", 5}}));
}

TEST(JSONSupportTest, GettersAnswerOnlyForTheirOwnKind) {
  const auto json = KivUtils::toJSONObject(R"({"s":"text","s12":"12","strue":"true","n":12,
      "t":true,"f":false,"two":2,"a":[1],"d":{"k":null},"null":null})");
  const Dictionary& d = *json->asDictionary();
  const std::pair<JSONSupport::OptionalKey, char> cases[] = {
      {"s", 's'},   {std::string_view("s12"), 's'},
      {"n", 'n'},   {"t", 'n'},
      {"a", 'a'},   {"d", 'd'},
      {"null", 0},  {"S", 0},
      {nullopt, 0}, {static_cast<const char*>(nullptr), 0}};
  for (const auto& [key, kind] : cases) {
    SCOPED_TRACE(key.get().value_or("<none>"));
    EXPECT_EQ(JSONSupport::jsonStringForKey(d, key) != nullptr, kind == 's');
    EXPECT_EQ(JSONSupport::jsonNumberForKey(d, key).has_value(), kind == 'n');
    EXPECT_EQ(JSONSupport::jsonArrayForKey(d, key) != nullptr, kind == 'a');
    EXPECT_EQ(JSONSupport::jsonDictionaryForKey(d, key) != nullptr, kind == 'd');
  }
  EXPECT_EQ(*JSONSupport::jsonStringForKey(d, "s12"), "12");
  EXPECT_EQ(JSONSupport::jsonNumberForKey(d, "n"), Number(std::int64_t{12}));
  for (const char* key : {"t", "two"}) EXPECT_TRUE(JSONSupport::jsonBoolForKey(d, key)) << key;
  for (const char* key : {"f", "strue", "s12", "null", "missing"}) {
    EXPECT_FALSE(JSONSupport::jsonBoolForKey(d, key)) << key;
  }
}

TEST(JSONSupportTest, DatesAndURLs) {
  const auto epochDates = [](Value value) {
    const Dictionary d{{"when", value}};
    return std::pair(JSONSupport::jsonDateFromEpochValueForKey(d, "when"),
                     JSONSupport::jsonDateFromEpochMillisecondsValueForKey(d, "when"));
  };
  EXPECT_EQ(epochDates(1.9), std::pair(std::optional(Date{1}), std::optional(Date{0})));
  EXPECT_EQ(epochDates(1500), std::pair(std::optional(Date{1500}), std::optional(Date{1})));
  EXPECT_EQ(epochDates(999), std::pair(std::optional(Date{999}), std::optional(Date{0})));
  EXPECT_EQ(epochDates(-0.5), std::pair(std::optional(Date{0}), std::optional(Date{0})));
  EXPECT_EQ(epochDates(UINT64_MAX),
            std::pair(std::optional(Date{0x1p64}), std::optional(Date{18446744073709551.0})));
  for (Value none : {Value(-1), Value(-1.5), Value(NAN), Value(1e30), Value("1500"), Value()}) {
    EXPECT_EQ(epochDates(none), std::pair(std::optional<Date>(), std::optional<Date>()))
        << none.description();
  }
  const Dictionary d{{"date", "2021-03-04T05:06:07.089+0000"},
                     {"short", "2021-03-04T05:06:07+0000"},
                     {"url", " https://example.com/a b\n"},
                     {"blank", " \t\n"},
                     {"bad", "http://[::1"},
                     {"number", 1}};
  EXPECT_EQ(JSONSupport::jsonDateFromUTCStringForKey(d, "date"), Date{1614834367.089});
  EXPECT_EQ(JSONSupport::jsonDateFromUTCStringForKey(d, "short"), nullopt);
  EXPECT_EQ(JSONSupport::jsonDateFromUTCStringForKey(d, "number"), nullopt);
  ASSERT_NE(JSONSupport::jsonUrlForKey(d, "url"), nullptr);
  EXPECT_EQ(JSONSupport::jsonUrlForKey(d, "url")->absoluteString(), "https://example.com/a%20b");
  for (const char* key : {"blank", "bad", "number"}) {
    EXPECT_EQ(JSONSupport::jsonUrlForKey(d, key), nullptr) << key;
  }
}

TEST(ToJSONObjectTest, ParsesContainersRefusesBadUTF8AndThrowsTheReadersError) {
  EXPECT_EQ(KivUtils::toJSONObject("{}"), Value(Dictionary{}));
  EXPECT_EQ(KivUtils::toJSONObject(" [1,2] "), Value(Array{1, 2}));
  EXPECT_EQ(KivUtils::toJSONObject("[\"\xff\"]"), nullopt);
  EXPECT_EQ(KivUtils::toJSONObject("[\"\xed\xa0\x80\"]"), nullopt);  // a UTF-16 surrogate
  const std::string deep = std::string(10'000, '[') + std::string(10'000, ']');
  const std::string huge(100'000'000, '[');
  const std::string_view malformed[] = {
      "12", "", "null", "[1,", "{\"a\":1}x", std::string_view("[1]\0", 4), deep, huge};
  for (const auto& text : malformed) {
    SCOPED_TRACE(text.substr(0, 20));
    try {
      KivUtils::toJSONObject(text);
      ADD_FAILURE() << "no error";
    } catch (const ErrorPtr& error) {
      EXPECT_EQ(error->domain(), CocoaErrorDomain);
      EXPECT_EQ(error->code(), PropertyListReadCorruptError);
      EXPECT_TRUE(error->userInfo().contains(DebugDescriptionErrorKey));  // where it went wrong
    }
  }
}

}  // namespace
}  // namespace kivi
