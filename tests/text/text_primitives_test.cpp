#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <unicode/locid.h>
#include <unicode/utf8.h>

#include <cstdint>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "kivi/text/base64.h"
#include "kivi/text/sha256.h"
#include "kivi/text/unicode_text.h"

namespace kivi {
namespace {

using namespace std::string_literals;

TEST(Sha256Test, MatchesFips180Vectors) {
  const struct {
    std::string message;
    const char* digest;
  } cases[] = {
      {"", "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855"},
      {"abc", "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
      {"abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq",
       "248d6a61d20638b8e5c026930c3e6039a33ce45964ff2167f6ecedd419db06c1"},
      {std::string(1'000'000, 'a'),
       "cdc76e5c9914fb9281a1c7e284d73e67f1809a48a497200e046d39ccc7112cd0"},
  };
  for (const auto& row : cases) {
    EXPECT_EQ(sha256Hex(row.message), row.digest) << row.message.substr(0, 8);
    EXPECT_EQ(sha256Hex(Data(row.message.begin(), row.message.end())), row.digest);
  }
}

TEST(Base64Test, EncodesAndDecodesRfc4648Vectors) {
  const std::string_view input = "foobar";
  const char* const encodings[] = {"", "Zg==", "Zm8=", "Zm9v", "Zm9vYg==", "Zm9vYmE=", "Zm9vYmFy"};
  for (std::size_t n = 0; n <= input.size(); ++n) {
    EXPECT_EQ(base64::encode(input.substr(0, n)), encodings[n]);
    EXPECT_EQ(base64::decodeToString(encodings[n]), input.substr(0, n));
  }
}

// Every length up to a few fast-loop steps, every byte value: the encoding
// agrees with OpenSSL's and decodes back.
TEST(Base64Test, AgreesWithOpenSSLAndRoundTripsAtEveryLength) {
  std::mt19937 random(7);
  for (std::size_t size = 0; size <= 100; ++size) {
    Data bytes(size);
    for (auto& b : bytes) b = static_cast<std::uint8_t>(random());
    std::string expected(base64::encodedLength(size) + 1, '\0');
    expected.resize(static_cast<std::size_t>(EVP_EncodeBlock(
        reinterpret_cast<unsigned char*>(expected.data()), bytes.data(), static_cast<int>(size))));
    const std::string text = base64::encode(bytes);
    ASSERT_EQ(text, expected) << size;
    ASSERT_EQ(base64::decode(text), bytes) << size;
  }
}

TEST(Base64Test, RefusesAnythingButStrictPaddedText) {
  const std::string valid = base64::encode(std::string(30, 'x'));  // 40 characters
  const std::string rejected[] = {"YQ",       "YQ=",      "Y===",  "====",   "YQ=a",
                                  "=YQ=",     "YQ==YQ==", "YW I=", "YWI=\n", "\nYWI=",
                                  "YWJj\r\n", "YW\0I"s,   "Y-I=",  "Y_I=",   "YWI\xC3\xA9",
                                  "YWJj=",    "YWJj===="};
  for (const auto& text : rejected) EXPECT_EQ(base64::decode(text), std::nullopt) << text;
  // A stray character anywhere, in the fast loop or the tail.
  for (std::size_t at = 0; at < valid.size(); ++at) {
    std::string text = valid;
    text[at] = '*';
    EXPECT_EQ(base64::decode(text), std::nullopt) << at;
  }
  // Non-zero unused bits before the padding are accepted.
  EXPECT_EQ(base64::decodeToString("YR=="), "a");
  EXPECT_EQ(base64::decodeToString("YWJ="), "ab");
}

TEST(UnicodeTextTest, TrimsTheUnicodeWhitespaceSetOnly) {
  const std::pair<std::string, std::string> cases[] = {
      {"\u00a0 abc\u3000", "abc"}, {"\u2028\u2029x\u0085\t\r\n", "x"},
      {"a \u00a0b", "a \u00a0b"},  {"\u200bx\ufeff", "\u200bx\ufeff"},  // format characters
      {"\xff \xfe", "\xff \xfe"},  {" \v\f ", ""},
  };
  for (const auto& [text, trimmed] : cases) EXPECT_EQ(unicode::trim(text), trimmed) << text;

  // Against a forward reading of the whole text (ICU's U8_NEXT, malformed
  // bytes as U+FFFD-like negatives): trimming from the back must stop at the
  // same characters, whatever truncated or stray bytes sit there.
  const std::string_view pieces[] = {" ",      "\t",   "\u0085",   "\u2028", "\u3000", "a",
                                     "\u00e9", "\x80", "\xe2\x80", "\xe3",   "\xa8"};
  std::mt19937 rng(2028);
  for (int round = 0; round < 20000; ++round) {
    std::string text;
    for (int n = rng() % 7; n > 0; --n) text += pieces[rng() % std::size(pieces)];
    std::vector<std::pair<std::size_t, bool>> chars;  // start, is white space
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    for (std::int32_t i = 0, length = static_cast<std::int32_t>(text.size()); i < length;) {
      const std::int32_t start = i;
      UChar32 c;
      U8_NEXT(bytes, i, length, c);
      chars.emplace_back(start, c >= 0 && unicode::isWhitespaceOrNewline(static_cast<char32_t>(c)));
    }
    std::size_t first = 0, last = chars.size();
    while (first < last && chars[first].second) ++first;
    while (last > first && chars[last - 1].second) --last;
    const std::size_t begin = first < chars.size() ? chars[first].first : text.size();
    const std::size_t end = last < chars.size() ? chars[last].first : text.size();
    ASSERT_EQ(unicode::trimView(text), text.substr(begin, end - begin)) << round;
  }
}

TEST(UnicodeTextTest, ComparesIgnoringCaseAndCanonicalForm) {
  const struct {
    const char *a, *b;
    bool equal;
  } cases[] = {
      {"\u00c4", "a\u0308", true},  // Ä, a + combining diaeresis
      {"\u00e9t\u00c9", "E\u0301T\u00e9", true},
      {"Stra\u00dfe", "STRASSE", true},  // full folding
      {"\u0130", "i\u0307", true},       // İ
      {"\u0131", "I", false},            // dotless ı is not I
      {" a", "a", false},
  };
  for (const auto& row : cases) {
    EXPECT_EQ(unicode::caseInsensitiveEquals(row.a, row.b), row.equal) << row.a << " " << row.b;
  }
}

// Case mapping ignores the process locale: under Turkish, I would lower-case
// to dotless ı and i would upper-case to İ.
TEST(UnicodeTextTest, CaseMappingIgnoresATurkishDefaultLocale) {
  const icu::Locale previous = icu::Locale::getDefault();
  UErrorCode status = U_ZERO_ERROR;
  icu::Locale::setDefault(icu::Locale("tr"), status);
  ASSERT_TRUE(U_SUCCESS(status));
  EXPECT_EQ(unicode::toLower("\u00c0I"), "\u00e0i");
  EXPECT_EQ(unicode::toLower("\u0130STANBUL"), "i\u0307stanbul");
  EXPECT_EQ(unicode::toUpper("\u00e0i"), "\u00c0I");
  EXPECT_EQ(unicode::toUpper("stra\u00dfe"), "STRASSE");
  EXPECT_FALSE(unicode::caseInsensitiveEquals("\u00c0I", "\u00e0\u0131"));
  icu::Locale::setDefault(previous, status);
}

TEST(UnicodeTextTest, ValidatesUTF8AndCountsUTF16Units) {
  const struct {
    std::string text;
    bool valid;
    std::size_t units;
  } cases[] = {
      {"a\0\u00e9\u20ac"s, true, 4},  {"\U0001F600", true, 2},
      {"\xC0\xAF", false, 2},          // overlong "/"
      {"\xED\xA0\x80", false, 3},      // surrogate
      {"\xF4\x90\x80\x80", false, 4},  // above U+10FFFF
      {"\xE2\x82", false, 1},          // truncated "€"
  };
  for (const auto& row : cases) {
    EXPECT_EQ(unicode::isValidUTF8(row.text), row.valid) << row.text;
    EXPECT_EQ(unicode::utf16Length(row.text), row.units) << row.text;
  }
}

}  // namespace
}  // namespace kivi
