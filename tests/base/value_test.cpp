#include "kivi/base/value.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>

#include "kivi/base/error.h"
#include "kivi/text/json_serialization.h"
#include "test_support.h"

namespace kivi {
namespace {

class Probe : public Object {};
class OtherProbe : public Object {};
namespace nested::deeper {
class NestedProbe : public Object {};
}  // namespace nested::deeper

using K = Value::Kind;
constexpr std::int64_t kI64Max = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kI64Min = std::numeric_limits<std::int64_t>::min();
constexpr std::uint64_t kU64Max = std::numeric_limits<std::uint64_t>::max();

TEST(Value, KindSelectsExactlyOneTypedView) {
  auto probe = std::make_shared<Probe>();
  const std::pair<Value, K> cases[] = {
      {Value(), K::Null},        {Value(Null{}), K::Null},    {Value(true), K::Number},
      {Value(2.5), K::Number},   {Value("text"), K::String},  {Value(Data{1, 2}), K::Data},
      {Value(Date{3}), K::Date}, {Value(Array{1}), K::Array}, {Dictionary{{"k", 1}}, K::Dictionary},
      {Value(probe), K::Object}};
  for (const auto& [value, kind] : cases) {
    SCOPED_TRACE(value.description());
    EXPECT_EQ(value.kind(), kind);
    EXPECT_EQ(value.isNull(), kind == K::Null);
    EXPECT_EQ(value.asNumber() != nullptr, kind == K::Number);
    EXPECT_EQ(value.asString() != nullptr, kind == K::String);
    EXPECT_EQ(value.asData() != nullptr, kind == K::Data);
    EXPECT_EQ(value.asDate() != nullptr, kind == K::Date);
    EXPECT_EQ(value.asArray() != nullptr, kind == K::Array);
    EXPECT_EQ(value.asDictionary() != nullptr, kind == K::Dictionary);
    EXPECT_EQ(value.asObject() != nullptr, kind == K::Object);
  }
  EXPECT_EQ(Value(probe).asObjectOf<Probe>(), probe);
  EXPECT_EQ(Value(probe).asObjectOf<OtherProbe>(), nullptr);
}

TEST(Value, NumbersKeepTheirFlavourButCompareByValue) {
  using T = Number::Type;
  const std::pair<Value, T> flavours[] = {{Value(true), T::Bool}, {Value(-1), T::Int},
                                          {Value(1L), T::Int},    {Value(1u), T::UInt},
                                          {Value(1ULL), T::UInt}, {Value(0.5), T::Double}};
  for (const auto& [value, type] : flavours) EXPECT_EQ(value.asNumber()->type(), type);

  const Value u64Top = std::uint64_t(1) << 63, u64Same = std::uint64_t(kI64Max);
  const std::pair<Value, Value> equal[] = {
      {true, 1},          {false, 0},         {1, 1.0},           {1u, 1},
      {kI64Max, u64Same}, {Value(), nullptr}, {Data{1}, Data{1}}, {Date{1}, Date{1}}};
  const std::pair<Value, Value> unequal[] = {{true, 2}, {kU64Max, -1}, {u64Top, kI64Min}, {0.5, 0},
                                             {1, "1"},  {Value(), 0},  {Date{1}, Date{2}}};
  for (const auto& [a, b] : equal) EXPECT_TRUE(a == b && b == a) << a.description();
  for (const auto& [a, b] : unequal) EXPECT_FALSE(a == b || b == a) << a.description();

  const std::pair<Number, const char*> strings[] = {{Number(kU64Max), "18446744073709551615"},
                                                    {Number(kI64Min), "-9223372036854775808"},
                                                    {Number(2.5), "2.5"},
                                                    {Number(0.1), "0.1"},
                                                    {Number(1.0 / 3), "0.3333333333333333"},
                                                    {Number(1e20), "1e+20"},
                                                    {Number(-1e-7), "-1e-07"},
                                                    {Number(100.0), "100"},
                                                    {Number(true), "1"}};
  for (const auto& [number, text] : strings) EXPECT_EQ(number.stringValue(), text);
  EXPECT_EQ(Number(kU64Max).longLongValue(), kI64Max);  // saturates
  EXPECT_EQ(Number(1e300).longLongValue(), kI64Max);
  EXPECT_EQ(Number(-1e300).longLongValue(), kI64Min);
  EXPECT_EQ(Number(-2.7).longLongValue(), -2);
  EXPECT_EQ(Number(-1.0).unsignedLongLongValue(), kU64Max);  // two's complement
}

TEST(Value, LookupsEqualityAndDescriptionOfCollections) {
  const Value doc(Dictionary{{"a", 1}, {"list", Array{"x\"", Dictionary{{"deep", true}}}}});
  EXPECT_EQ(*doc.find("list")->at(1)->find("deep"), Value(true));
  EXPECT_EQ(doc.find("missing"), nullptr);
  EXPECT_EQ(doc.at(0), nullptr);
  EXPECT_EQ(doc.find("list")->at(2), nullptr);
  EXPECT_EQ(Value("a").find("a"), nullptr);
  EXPECT_EQ(Value(doc).asDictionary(), doc.asDictionary());  // shared, not copied
  EXPECT_EQ(doc.description(), R"({"a" = 1; "list" = ("x\"", {"deep" = 1})})");
  EXPECT_EQ(Value(Array{Data{1, 2, 3, 4, 0xab}, Date{1.5}, nullptr}).description(),
            "(<01020304 ab>, <date 1.500>, <null>)");

  // Deep equality across number flavours; any differing leaf breaks it.
  EXPECT_EQ(doc, Value(Dictionary{{"a", 1.0}, {"list", Array{"x\"", Dictionary{{"deep", 1}}}}}));
  EXPECT_NE(doc, Value(Dictionary{{"a", 1}, {"list", Array{"x\"", Dictionary{{"deep", 0}}}}}));
  EXPECT_NE(doc, Value(Dictionary{{"a", 1}, {"list", Array{"x\"", Dictionary{{"deeq", true}}}}}));
  EXPECT_NE(doc, Value(Dictionary{{"a", 1}}));
  EXPECT_NE(Value(Array{1, 2}), Value(Array{2, 1}));
  EXPECT_NE(Value(Array{}), Value(Dictionary{}));
  auto p1 = std::make_shared<Probe>(), p2 = std::make_shared<Probe>();
  EXPECT_EQ(Value(Array{p1}), Value(Array{p1}));
  EXPECT_NE(Value(Array{p1}), Value(Array{p2}));  // objects compare by identity
}

TEST(Value, AMillionLevelsDeepIsComparedDescribedAndDroppedWithoutRecursion) {
  auto nest = [](int levels, Value value, auto wrap) {
    for (int i = 1; i < levels; ++i) value = wrap(std::move(value));
    return value;
  };
  auto inArray = [](Value v) { return Value(Array{std::move(v)}); };
  auto inDictionary = [](Value v) { return Value(Dictionary{{"k", std::move(v)}}); };
  constexpr int kLevels = 1'000'000;
  const Value arrays = nest(kLevels, Array{}, inArray);
  EXPECT_EQ(arrays, nest(kLevels, Array{}, inArray));
  EXPECT_NE(arrays, nest(kLevels, Array{nullptr}, inArray));
  EXPECT_EQ(arrays.description(), std::string(kLevels, '(') + std::string(kLevels, ')'));
  ErrorPtr error;  // the JSON writer refuses it as the reader would
  EXPECT_FALSE(JSONSerialization::dataWithJSONObject(arrays, 0, &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), PropertyListWriteInvalidError);

  const Value dictionaries = nest(100'000, Dictionary{}, inDictionary);
  EXPECT_EQ(dictionaries, nest(100'000, Dictionary{}, inDictionary));
  EXPECT_NE(dictionaries, nest(100'000, Dictionary{{"k", 1}}, inDictionary));
  EXPECT_EQ(dictionaries.description().size(), 8u * (100'000 - 1) + 2);  // {"k" = ...}
  const Value shared = Array{dictionaries, dictionaries};
}

TEST(Error, LocalizedDescriptionAndDescription) {
  const std::string fallback = "The operation couldn\u2019t be completed. (MyDomain error -5.)";
  const std::pair<Dictionary, std::string> cases[] = {
      {{}, fallback},
      {{{LocalizedDescriptionKey, "Bad input"}}, "Bad input"},
      {{{LocalizedDescriptionKey, 5}}, fallback},
      {{{LocalizedFailureReasonErrorKey, "why"}}, fallback}};
  for (const auto& [userInfo, expected] : cases) {
    const auto error = Error::create("MyDomain", -5, userInfo);
    EXPECT_EQ(error->localizedDescription(), expected);
    const std::string description = error->description();
    EXPECT_NE(description.find("Domain=MyDomain"), std::string::npos) << description;
    EXPECT_NE(description.find("Code=-5"), std::string::npos) << description;
    EXPECT_EQ(*error, Error("MyDomain", -5, userInfo));
  }
  EXPECT_FALSE(Error("D", 1) == Error("D", 2));
  EXPECT_FALSE(Error("D", 1) == Error("D", 1, {{DebugDescriptionErrorKey, "x"}}));
}

// Names come without namespaces; a description tells two objects apart.
TEST(Object, DescriptionAndClassName) {
  auto probe = std::make_shared<Probe>(), other = std::make_shared<Probe>();
  EXPECT_TRUE(probe->description().starts_with("<Probe: 0x")) << probe->description();
  EXPECT_TRUE(probe->description().ends_with(">"));
  EXPECT_NE(probe->description(), other->description());
  EXPECT_EQ(nested::deeper::NestedProbe().className(), "NestedProbe");
}

}  // namespace
}  // namespace kivi
