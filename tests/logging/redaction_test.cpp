#include <gtest/gtest.h>

#include <optional>
#include <random>
#include <string>
#include <vector>

#include "kivi/logging/log_redaction.h"
#include "kivi/net/url_components.h"
#include "kivi/utils/url_utils.h"

namespace kivi {
namespace {

using std::nullopt;

HeaderDictionaryPtr headers(StringDictionary fields) {
  return std::make_shared<const StringDictionary>(std::move(fields));
}

TEST(URLForLoggingTest, MasksQueryValuesAndDecodesTheWholeURL) {
  const struct {
    const char* url;
    std::optional<std::string> expected;
  } cases[] = {
      {"https://h/p", "https://h/p"},
      {"https://h/p?a=1&b=&c", "https://h/p?a=***&b=&c="},
      {"https://h/p?b=2&a=1&b=3#f", "https://h/p?b=***&a=***&b=***#f"},
      {"https://u:pw@h:8080/a%20b/%C3%A9?n%20m=v%26w#x%2Fy",
       "https://u:pw@h:8080/a b/é?n m=***#x/y"},
      {"https://h/?a%26b%3D=1&%2B", "https://h/?a&b==***&+="},
      {"https://h/p?", "https://h/p"},
      {"https://h/%FF?a=1", nullopt},                             // not UTF-8 once decoded
      {"https://h/p?a=%E9&b=%c3%a9", "https://h/p?a=***&b=***"},  // masked, decodable or not
  };
  for (const auto& row : cases) {
    EXPECT_EQ(KivSdkURLForLogging(URL::URLWithString(row.url)), row.expected) << row.url;
  }
  EXPECT_EQ(KivSdkURLForLogging(nullptr), nullopt);
  EXPECT_EQ(KivSdkTokenForLogging("x"), "***");
  EXPECT_EQ(KivSdkTokenForLogging(""), "nil");
  EXPECT_EQ(KivSdkTokenForLogging(nullopt), "nil");
}

TEST(ResponseHeadersForLoggingTest, MasksAuthorizationAndRewritesCookies) {
  const URLPtr url = URL::URLWithString("https://d/x");
  const auto fields = headers({{"Authorization", "t"},
                               {"authorization", "t"},
                               {"Set-Cookie", "a=1, b="},
                               {"set-cookie", "c=2"},
                               {"X", "y"}});
  // Names match exactly: "set-cookie" adds no cookie and keeps its value.
  EXPECT_EQ(*KivSdkResponseHeadersForLogging(fields, url),
            (StringDictionary{{"Authorization", "***"},
                              {"authorization", "t"},
                              {"Set-Cookie", "a=***, path=/, domain=d;b=, path=/, domain=d;"},
                              {"set-cookie", "c=2"},
                              {"X", "y"}}));
  EXPECT_EQ(*KivSdkResponseHeadersForLogging(headers({{"set-cookie", "c=2"}}), url),
            (StringDictionary{{"set-cookie", "c=2"}}));
  // No URL, or no cookie parsed: the field stays as it came.
  EXPECT_EQ(
      *KivSdkResponseHeadersForLogging(headers({{"Authorization", ""}, {"Set-Cookie", "a"}}), url),
      (StringDictionary{{"Authorization", ""}, {"Set-Cookie", "a"}}));
  EXPECT_EQ(KivSdkResponseHeadersForLogging(fields, nullptr)->at("Set-Cookie"), "a=1, b=");
  const auto none = headers({});
  EXPECT_EQ(KivSdkResponseHeadersForLogging(none, url), none);
  EXPECT_EQ(KivSdkResponseHeadersForLogging(nullptr, url), nullptr);

  // Values of other kinds, as an error's user info may hold them.
  const Dictionary values{{"Authorization", 42}, {"Set-Cookie", Data{'a'}}, {"set-cookie", "b=2"}};
  EXPECT_EQ(
      *KivSdkResponseHeadersForLogging(Value(values), url).asDictionary(),
      (Dictionary{{"Authorization", "***"}, {"Set-Cookie", Data{'a'}}, {"set-cookie", "b=2"}}));
  EXPECT_EQ(*KivSdkResponseHeadersForLogging(
                 Value(Dictionary{{"Set-Cookie", "a=1"}, {"set-cookie", "b=2"}}), url)
                 .asDictionary(),
            (Dictionary{{"Set-Cookie", "a=***, path=/, domain=d;"}, {"set-cookie", "b=2"}}));
  const Value empty{Dictionary{}};
  EXPECT_EQ(KivSdkResponseHeadersForLogging(empty, url).asDictionary(), empty.asDictionary());
  EXPECT_EQ(KivSdkObfuscateHeadersForLogging(Value(values), {"Authorization"}),
            (Dictionary{{"Authorization", 42}, {"Set-Cookie", "***"}, {"set-cookie", "***"}}));
}

TEST(ResponseForLoggingTest, RebuildsTheAnswerAsVersionOneZero) {
  const auto response = HTTPURLResponse::create(URL::URLWithString("https://d/p?k=s"), 418,
                                                "HTTP/2", {{"Authorization", "t"}});
  const auto redacted = KivSdkResponseForLogging(response);
  EXPECT_EQ(redacted->URL()->absoluteString(), "https://d/p?k=***");
  EXPECT_EQ(redacted->statusCode(), 418);
  EXPECT_EQ(redacted->HTTPVersion(), "1.0");
  EXPECT_EQ(redacted->allHeaderFields(), (StringDictionary{{"Authorization", "***"}}));
  EXPECT_EQ(KivSdkResponseForLogging(nullptr), nullptr);
  const auto withoutURL = HTTPURLResponse::create(nullptr, 200, "1.1", {{"Authorization", "t"}});
  EXPECT_EQ(KivSdkResponseForLogging(withoutURL), withoutURL);
}

TEST(ObfuscateHeadersForLoggingTest, KeepsOnlyTheNamedValuesAndMasksEvenEmptyOnes) {
  const auto fields = headers({{"Accept", ""}, {"Date", "today"}, {"date", "x"}, {"E", ""}});
  EXPECT_EQ(KivSdkObfuscateHeadersForLogging(fields, {"Date", "Accept", "Missing"}),
            (StringDictionary{{"Accept", ""}, {"Date", "today"}, {"date", "***"}, {"E", "***"}}));
  EXPECT_EQ(KivSdkObfuscateHeadersForLogging(fields, {}),
            (StringDictionary{{"Accept", "***"}, {"Date", "***"}, {"date", "***"}, {"E", "***"}}));
  EXPECT_TRUE(KivSdkObfuscateHeadersForLogging(nullptr, {"Date"}).empty());
}

TEST(CookiesForLoggingTest, KeepsNameAndDomainOnly) {
  const auto cookies = HTTPCookie::cookiesWithResponseHeaderFields(
      {{"Set-Cookie", "a=1; Domain=h.d; Path=/p; Secure, b="}},
      *URL::URLWithString("https://h.d/"));
  EXPECT_EQ(HTTPCookieUtils::cookiesForLogging(cookies),
            (std::vector<Dictionary>{
                {{HTTPCookieName, "a"}, {HTTPCookieValue, "***"}, {HTTPCookieDomain, ".h.d"}},
                {{HTTPCookieName, "b"}, {HTTPCookieValue, ""}, {HTTPCookieDomain, "h.d"}}}));
}

// Random URLs, headers and cookies whose secret values use only letters that
// no name, host or path holds: no secret may survive, every name must.
TEST(RedactionPropertyTest, SecretsNeverSurviveNamesAlways) {
  std::mt19937_64 rng(6265);
  const auto text = [&](std::string_view letters, std::size_t min, std::size_t max) {
    std::string out(min + rng() % (max - min + 1), ' ');
    for (char& c : out) c = letters[rng() % letters.size()];
    return out;
  };
  const std::string_view kNameLetters = "abcdefghijklmnopqrstuvwy0123456789-_.~ %&=+#/?";
  for (int round = 0; round < 500; ++round) {
    std::vector<std::string> secrets, names;
    const auto secret = [&] { return secrets.emplace_back(text("QXZ", 4, 12)); };
    const auto name = [&](std::string_view letters) {
      return names.emplace_back(text(letters, 1, 8));
    };
    URLComponents components;
    components.setScheme("https");
    const std::string host = text("abcdefgh", 1, 6);
    components.setHost(host);
    components.setPath("/" + text(kNameLetters, 0, 10));
    std::vector<URLQueryItem> items;
    for (auto n = rng() % 5; n > 0; --n)
      items.push_back({name(kNameLetters), rng() % 4 ? secret() : ""});
    if (!items.empty()) components.setQueryItems(items);
    const URLPtr url = components.url();

    StringDictionary fields{{"Authorization", secret()}};
    for (auto n = 1 + rng() % 3; n > 0; --n) {
      fields["Set-Cookie"] += name("abcdefgh") + "=" + secret();
      if (rng() % 2) fields["Set-Cookie"] += "; Expires=Wed, 21 Oct 2015 07:28:00 GMT";
      if (rng() % 2) fields["Set-Cookie"] += "; Domain=" + host + "; path=/" + text("abc", 0, 4);
      fields["Set-Cookie"] += ", ";
    }
    for (auto n = rng() % 4; n > 0; --n) fields[name(kNameLetters)] = "v";

    std::string all = KivSdkURLForLogging(url).value() + "\n";
    const auto add = [&](const StringDictionary& dictionary) {
      for (const auto& field : dictionary) all += field.first + ": " + field.second + "\n";
    };
    add(*KivSdkResponseHeadersForLogging(headers(fields), url));
    // Decoded query text holding "#", "%" or spaces must still parse again;
    // otherwise the answer would come back unredacted.
    const auto original = HTTPURLResponse::create(url, 200, "HTTP/1.1", fields);
    const auto response = KivSdkResponseForLogging(original);
    ASSERT_NE(response, original) << url->absoluteString();
    add(response->allHeaderFields());
    all += response->URL()->absoluteString() + "\n";
    for (const auto& record : HTTPCookieUtils::cookiesForLogging(
             HTTPCookie::cookiesWithResponseHeaderFields(fields, *url))) {
      for (const auto& entry : record) all += *entry.second.asString() + "\n";
    }
    for (const auto& s : secrets) EXPECT_EQ(all.find(s), std::string::npos) << s << " in\n" << all;
    for (const auto& n : names)
      EXPECT_NE(all.find(n), std::string::npos) << n << " not in\n" << all;
  }
}

}  // namespace
}  // namespace kivi
