#include "kivi/foundation/value.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>

#include "kivi/foundation/error.h"
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
  const struct {
    Value value;
    K kind;
  } cases[] = {{Value(), K::Null},           {Value(nullptr), K::Null},
               {Value(Null{}), K::Null},     {Value(42), K::Number},
               {Value(true), K::Number},     {Value(2.5), K::Number},
               {Value("text"), K::String},   {Value(std::string_view("sv")), K::String},
               {Value(Data{1, 2}), K::Data}, {Value(Date{3.0}), K::Date},
               {Value(Array{1}), K::Array},  {Value(Dictionary{{"k", 1}}), K::Dictionary},
               {Value(probe), K::Object}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.value.description());
    EXPECT_EQ(c.value.kind(), c.kind);
    EXPECT_EQ(c.value.isNull(), c.kind == K::Null);
    EXPECT_EQ(c.value.asNumber() != nullptr, c.kind == K::Number);
    EXPECT_EQ(c.value.asString() != nullptr, c.kind == K::String);
    EXPECT_EQ(c.value.asData() != nullptr, c.kind == K::Data);
    EXPECT_EQ(c.value.asDate() != nullptr, c.kind == K::Date);
    EXPECT_EQ(c.value.asArray() != nullptr, c.kind == K::Array);
    EXPECT_EQ(c.value.asDictionary() != nullptr, c.kind == K::Dictionary);
    EXPECT_EQ(c.value.asObject() != nullptr, c.kind == K::Object);
  }
  EXPECT_EQ(Value(probe).asObjectOf<Probe>(), probe);
  EXPECT_EQ(Value(probe).asObjectOf<OtherProbe>(), nullptr);
  EXPECT_EQ(Value(1).asObjectOf<Probe>(), nullptr);
}

TEST(Value, NumbersKeepTheirFlavourButCompareByValue) {
  using T = Number::Type;
  const std::pair<Value, T> flavours[] = {{Value(true), T::Bool}, {Value(-1), T::Int},
                                          {Value(1L), T::Int},    {Value(1u), T::UInt},
                                          {Value(1ULL), T::UInt}, {Value(0.5), T::Double}};
  for (const auto& [value, type] : flavours) EXPECT_EQ(value.asNumber()->type(), type);

  const Value i64Max = kI64Max, u64Same = std::uint64_t(kI64Max), u64Top = std::uint64_t(1) << 63;
  const std::pair<Value, Value> equal[] = {
      {true, 1},         {false, 0},         {1, 1.0},           {1u, 1},
      {i64Max, u64Same}, {Value(), nullptr}, {Data{1}, Data{1}}, {Date{1}, Date{1}}};
  const std::pair<Value, Value> unequal[] = {{true, 2}, {kU64Max, -1}, {u64Top, kI64Min}, {0.5, 0},
                                             {1, "1"},  {Value(), 0},  {Date{1}, Date{2}}};
  for (const auto& [a, b] : equal) EXPECT_TRUE(a == b && b == a) << a.description();
  for (const auto& [a, b] : unequal) EXPECT_FALSE(a == b || b == a) << a.description();
}

TEST(Value, NumberConversionsAtTheExtremes) {
  EXPECT_EQ(Number(kU64Max).unsignedLongLongValue(), kU64Max);
  EXPECT_EQ(Number(kU64Max).longLongValue(), kI64Max);  // saturates
  EXPECT_EQ(Number(kI64Min).longLongValue(), kI64Min);
  EXPECT_EQ(Number(1e300).longLongValue(), kI64Max);
  EXPECT_EQ(Number(-1e300).longLongValue(), kI64Min);
  EXPECT_EQ(Number(-2.7).longLongValue(), -2);
  EXPECT_TRUE(Number(std::int64_t{2}).boolValue());
  EXPECT_FALSE(Number(0.0).boolValue());
  const std::pair<Number, const char*> strings[] = {{Number(kU64Max), "18446744073709551615"},
                                                    {Number(kI64Min), "-9223372036854775808"},
                                                    {Number(std::int64_t{-3}), "-3"},
                                                    {Number(2.5), "2.5"},
                                                    {Number(true), "1"},
                                                    {Number(false), "0"}};
  for (const auto& [number, text] : strings) EXPECT_EQ(number.stringValue(), text);
}

TEST(Value, LookupsAndSharedCollections) {
  const Value doc(Dictionary{{"a", 1}, {"list", Array{"x", Dictionary{{"deep", true}}}}});
  ASSERT_NE(doc.find("a"), nullptr);
  EXPECT_EQ(*doc.find("a"), Value(1));
  EXPECT_EQ(doc.find("missing"), nullptr);
  EXPECT_EQ(doc.at(0), nullptr);
  ASSERT_NE(doc.find("list")->at(1), nullptr);
  EXPECT_EQ(*doc.find("list")->at(1)->find("deep"), Value(true));
  EXPECT_EQ(doc.find("list")->at(2), nullptr);
  EXPECT_EQ(doc.find("list")->find("0"), nullptr);
  for (const Value& scalar : {Value(), Value(1), Value("a"), Value(Data{1}), Value(Date{})}) {
    EXPECT_EQ(scalar.find("a"), nullptr);
    EXPECT_EQ(scalar.at(0), nullptr);
  }

  const Value copy = doc;  // collections are shared, not copied
  EXPECT_EQ(copy.asDictionary(), doc.asDictionary());
  EXPECT_EQ(copy.find("list")->asArray(), doc.find("list")->asArray());

  // Deep equality across number flavours; any differing leaf breaks it.
  EXPECT_EQ(doc, Value(Dictionary{{"a", 1.0}, {"list", Array{"x", Dictionary{{"deep", 1}}}}}));
  EXPECT_FALSE(doc == Value(Dictionary{{"a", 1}, {"list", Array{"x", Dictionary{{"deep", 0}}}}}));
  EXPECT_FALSE(doc == Value(Dictionary{{"a", 1}}));
  EXPECT_FALSE(Value(Array{1, 2}) == Value(Array{2, 1}));
  EXPECT_FALSE(Value(Array{}) == Value(Dictionary{}));
  auto p1 = std::make_shared<Probe>(), p2 = std::make_shared<Probe>();
  EXPECT_EQ(Value(Array{p1}), Value(Array{p1}));
  EXPECT_FALSE(Value(Array{p1}) == Value(Array{p2}));  // objects compare by identity
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

TEST(Object, DescriptionAndClassName) {
  auto probe = std::make_shared<Probe>();
  const std::string description = probe->description();
  const std::string prefix = "<Probe: 0x";
  ASSERT_TRUE(description.starts_with(prefix) && description.ends_with(">")) << description;
  const std::string hex = description.substr(prefix.size(), description.size() - prefix.size() - 1);
  ASSERT_EQ(hex.find_first_not_of("0123456789abcdef"), std::string::npos) << description;
  EXPECT_EQ(std::stoull(hex, nullptr, 16), reinterpret_cast<std::uintptr_t>(probe.get()));
  EXPECT_EQ(nested::deeper::NestedProbe().className(), "NestedProbe");
}

}  // namespace
}  // namespace kivi
