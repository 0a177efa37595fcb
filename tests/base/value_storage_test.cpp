// How Values are stored: inline and shared strings, flat dictionaries, and
// documents read into one arena whose parts outlive the document.
#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/text/json_serialization.h"

namespace kivi {
namespace {

Value read(std::string_view json) {
  auto value = JSONSerialization::JSONObjectWithData(json, JSONReadingFragmentsAllowed, nullptr);
  EXPECT_TRUE(value.has_value()) << json;
  return value ? *value : Value();
}

TEST(ValueStorage, StringsAtTheInlineLimitAndBeyondBehaveAlike) {
  for (std::size_t n : {0, 1, 21, 22, 23, 100}) {
    const std::string text(n, 'x');
    const String s(text);
    String copy = s;
    String moved = std::move(copy);
    EXPECT_EQ(moved, text);
    EXPECT_EQ(moved.size(), n);
    EXPECT_EQ(Value(text), Value(moved));
    EXPECT_EQ(*Value(s).asString(), text);
    // The same text read from a document (kept in its arena) and copied out.
    const Value document = read("[\"" + text + "\"]");
    const Value element = *document.at(0);
    EXPECT_EQ(*element.asString(), text);
    EXPECT_EQ(element, Value(text));
  }
  const String a = "abc";
  EXPECT_TRUE(a < "abd" && "abb" < a && a == std::string("abc"));
  EXPECT_EQ(a + "!", "abc!");
  EXPECT_EQ("<" + a, "<abc");
}

TEST(ValueStorage, PartsOfADocumentOutliveItAndCopiesOutAreTheirOwn) {
  Value part;
  Array copied;
  {
    const Value document = read(R"([{"name":"a string longer than twenty-two bytes",
                                      "list":[1,2,{"deep":"also longer than twenty-two bytes"}]}])");
    part = *document.at(0)->find("list");
    copied = *part.asArray();
  }
  // The document is gone; what was taken from it is intact (ASan would see
  // a read of freed memory otherwise).
  EXPECT_EQ(*part.at(2)->find("deep")->asString(), "also longer than twenty-two bytes");
  copied.push_back(Value(3));
  copied.erase(copied.begin());
  copied.insert(copied.begin(), Value("first"));
  EXPECT_EQ(copied.size(), 4u);
  EXPECT_EQ(*part.asArray(), (Array{1, 2, *part.at(2)}));  // unchanged
  EXPECT_EQ(copied[0], Value("first"));
  EXPECT_EQ(copied[3], Value(3));
}

TEST(ValueStorage, DictionariesAreSortedByBytesAndResolveDuplicateKeys) {
  // A literal keeps the first of duplicate keys, as std::map does; a JSON
  // text the last, on both the fast and the careful reading path.
  const Dictionary literal{{"b", 1}, {"a", 2}, {"b", 3}};
  EXPECT_EQ(literal.at("b"), Value(1));
  EXPECT_EQ(*read(R"({"b":1,"a":2,"b":3})").find("b"), Value(3));
  EXPECT_EQ(*read(R"([{"b":1,"a":2,"b":3},18446744073709551616])").at(0)->find("b"), Value(3));
  EXPECT_TRUE(read(R"([{},18446744073709551616])").at(0)->asDictionary()->empty());
  // The same layout again (the reader remembers layouts) and a new one.
  const Value records = read(R"([{"z":1,"é":2,"B":3,"a":4},{"z":5,"é":6,"B":7,"a":8},
                                 {"z":9,"é":10,"B":11,"a":12,"a":13}])");
  for (const Value& record : *records.asArray()) {
    std::vector<std::string> keys;
    for (const auto& [key, value] : *record.asDictionary()) keys.push_back(key);
    EXPECT_EQ(keys, (std::vector<std::string>{"B", "a", "z", "é"}));
  }
  EXPECT_EQ(*records.at(1)->find("é"), Value(6));
  EXPECT_EQ(*records.at(2)->find("a"), Value(13));

  Dictionary d = *records.at(0)->asDictionary();
  d["new"] = Value("x");
  EXPECT_EQ(d.erase("z"), 1u);
  EXPECT_TRUE(d.at("absent").isNull());
  EXPECT_EQ(d.size(), 4u);
  EXPECT_EQ(records.at(0)->asDictionary()->size(), 4u);  // the document is untouched
  EXPECT_TRUE(std::is_sorted(d.begin(), d.end(), [](const auto& x, const auto& y) {
    return x.first.view() < y.first.view();
  }));
}

TEST(ValueStorage, ALargeDictionaryBuiltFromEntriesSortsOnce) {
  std::vector<DictionaryEntry> entries;
  for (int i = 0; i < 100000; ++i) entries.push_back({String(std::to_string(i)), Value(i)});
  entries.push_back({String("7"), Value(-7)});
  std::shuffle(entries.begin(), entries.end(), std::mt19937(1));
  const Dictionary last(std::move(entries), /*lastWins=*/true);
  EXPECT_EQ(last.size(), 100000u);
  EXPECT_EQ(last.at("99999"), Value(99999));
  EXPECT_TRUE(last.at("7") == Value(7) || last.at("7") == Value(-7));
}

TEST(ValueStorage, CopiesOfOneDocumentComeAndGoOnManyThreads) {
  std::string json = "[";
  for (int i = 0; i < 64; ++i)
    json += (i ? "," : "") + std::string(R"({"k":"a longer string value here"})");
  json += "]";
  Value document = read(json);
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([document, t] {
      for (int i = 0; i < 20000; ++i) {
        const Value part = *document.at(static_cast<std::size_t>((i + t) % 64));
        const Value text = *part.find("k");
        ASSERT_EQ(text.asString()->size(), 26u);
      }
    });
  }
  const Value kept = *document.at(3);
  document = Value();  // the threads' copies keep the document
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(*kept.find("k"), Value("a longer string value here"));
}

}  // namespace
}  // namespace kivi
