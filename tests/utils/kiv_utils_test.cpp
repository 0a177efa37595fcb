#include "kivi/utils/kiv_utils.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "test_support.h"

namespace kivi {
namespace {

using namespace std::string_literals;
using std::nullopt;
using Strings = std::vector<std::string>;
namespace U = KivUtils;

TEST(KivUtilsStringTest, HashesUTF8TextAndData) {
  EXPECT_EQ(U::sha256Hash(""), "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
  EXPECT_EQ(U::sha256Hash("abc"),
            "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
  EXPECT_EQ(U::sha256AsString(Data{'a', 'b', 'c'}), *U::sha256Hash("abc"));
  EXPECT_EQ(U::sha256Hash("a\xff"), nullopt);
}

TEST(KivUtilsStringTest, ConvertsBetweenTheThreeBase64Forms) {
  const struct {
    std::string text, standard, url, vrel;
  } cases[] = {
      {"a", "YQ==", "YQ", "YQ--"},
      {"ab", "YWI=", "YWI", "YWI-"},
      {"abc", "YWJj", "YWJj", "YWJj"},
      {"?\?>", "Pz8+", "Pz8-", "Pz8_"},
      {"?\?\?", "Pz8/", "Pz8_", "Pz8!"},
      {"", "", "", ""},
      {"a\0\u00e9"s, "YQDDqQ==", "YQDDqQ", "YQDDqQ--"},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.standard);
    EXPECT_EQ(U::encodeIntoBase64String(row.text), row.standard);
    EXPECT_EQ(U::base64URLEncodedStringFromString(row.text), row.url);
    EXPECT_EQ(U::vrelBase64URLEncodedStringFromString(row.text), row.vrel);
    EXPECT_EQ(U::decodeFromBase64String(row.standard), row.text);
    EXPECT_EQ(U::decodeFromVrelBase64URLEncodedString(row.vrel), row.text);
    EXPECT_EQ(U::base64FromBase64URLEncodedString(row.url), row.standard);
  }
}

TEST(KivUtilsStringTest, GivesNullForTextThatIsNotUTF8OrNotBase64) {
  const std::string notUTF8 = "a\xC0\xAF";
  EXPECT_EQ(U::encodeIntoBase64String(notUTF8), nullopt);
  EXPECT_EQ(U::base64URLEncodedStringFromString(notUTF8), nullopt);
  EXPECT_EQ(U::vrelBase64URLEncodedStringFromString(notUTF8), nullopt);
  for (const char* text : {"YQ", "YQ= ", "/w==", "wK8="}) {  // /w== and wK8= decode to non-UTF-8
    EXPECT_EQ(U::decodeFromBase64String(text), nullopt) << text;
  }
  for (const char* text : {"YQ", "YQ==-", "_w--"}) {
    EXPECT_EQ(U::decodeFromVrelBase64URLEncodedString(text), nullopt) << text;
  }
}

TEST(KivUtilsStringTest, PadsURLSafeTextByUTF16Length) {
  EXPECT_EQ(U::base64FromBase64URLEncodedString("abcde"), "abcde===");
  EXPECT_EQ(U::base64FromBase64URLEncodedString("-_-_-_"), "+/+/+/==");
  EXPECT_EQ(U::base64FromBase64URLEncodedString("\u00e9"), "\u00e9===");  // one unit, two bytes
}

TEST(KivUtilsStringTest, SplitsIntoTrimmedNonEmptyParts) {
  const struct {
    const char *text, *separator;
    std::optional<Strings> parts;
  } cases[] = {
      {" a , ,b ", ",", Strings{"a", "b"}},
      {" , ", ",", nullopt},
      {"", ",", nullopt},
      {"\u00a0a\u3000::\u2028b::", "::", Strings{"a", "b"}},
      {"a, b", "", Strings{"a, b"}},
      {"x y", ",", Strings{"x y"}},
  };
  for (const auto& row : cases) {
    EXPECT_EQ(U::trimmedCommponentsSeparatedByString(row.text, row.separator), row.parts)
        << row.text;
  }
}

TEST(KivUtilsStringTest, TrimsComparesAndTreatsBlankAsEmpty) {
  EXPECT_EQ(U::trim("\u3000 a b\n"), "a b");
  EXPECT_TRUE(U::isCaseInsensitiveEqualToString("\u00c9t\u00e9", "E\u0301T\u00c9"));
  EXPECT_FALSE(U::isCaseInsensitiveEqualToString(" a", "A"));
  EXPECT_FALSE(U::isCaseInsensitiveEqualToString("a\xfe", "a\xff"));
  EXPECT_TRUE(U::isCaseInsensitiveEqualToString("a\xff", "a\xff"));

  EXPECT_TRUE(U::isNilOrEmptyString(nullopt));
  EXPECT_TRUE(U::isNilOrEmptyString("  \n"));
  EXPECT_FALSE(U::isNilOrEmptyString(" x "));
  EXPECT_EQ(U::stringOrEmptyString("  \n"), "  \n");
  EXPECT_EQ(U::stringOrEmptyString(nullopt), "");
}

TEST(KivUtilsArrayTest, FindsTrimmedStringsIgnoringCase) {
  const Array array{Value(123), Value(Dictionary{}), Value("abc\n")};
  EXPECT_TRUE(U::trimmedCaseInsensitiveContains(array, " ABC "));
  EXPECT_FALSE(U::trimmedCaseInsensitiveContains(array, "123"));
  EXPECT_FALSE(U::trimmedCaseInsensitiveContains(Array{}, ""));
}

TEST(KivUtilsArrayTest, FiltersByKindAndByTest) {
  const Array array{Value("a"), Value(1), Value(Dictionary{{"k", Value(2)}}), Value(nullptr),
                    Value("b")};
  EXPECT_EQ(U::subArrayOfStrings(array), (Array{Value("a"), Value("b")}));
  EXPECT_EQ(U::subArrayOfDictionaries(array), (Array{array[2]}));

  std::vector<std::size_t> tested;
  const Array passing =
      U::subarrayWithObjectsPassingTest(array, [&](const Value&, std::size_t index, bool* stop) {
        tested.push_back(index);
        *stop = index == 3;
        return index % 2 == 1;
      });
  EXPECT_EQ(passing, (Array{Value(1), Value(nullptr)}));
  EXPECT_EQ(tested, (std::vector<std::size_t>{0, 1, 2, 3}));
}

TEST(KivUtilsArrayTest, RemovesDuplicatesKeepingFirstOccurrences) {
  EXPECT_EQ(U::removingDuplicates(std::vector<int>{3, 1, 3, 2, 1}), (std::vector<int>{3, 1, 2}));
  EXPECT_EQ(U::removingDuplicates(Strings{"b", "a", "b", ""}), (Strings{"b", "a", ""}));
}

}  // namespace
}  // namespace kivi
