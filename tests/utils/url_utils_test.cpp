#include "kivi/utils/url_utils.h"

#include <gtest/gtest.h>

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace kivi {
namespace {

using std::nullopt;
using Items = std::vector<URLQueryItem>;

TEST(AddQueryItemsTest, AppendsToExistingItemsAndLeavesAnEmptyListAlone) {
  const struct {
    const char* url;
    Items items;
    const char* expected;
  } cases[] = {
      {"https://h/p?a=1", {{"b", "2"}}, "https://h/p?a=1&b=2"},
      {"https://h/p?a=1", {{"a", "3"}, {"a", nullopt}}, "https://h/p?a=1&a=3&a"},
      {"https://h/p", {{"q", "x&y=z+#"}}, "https://h/p?q=x%26y%3Dz%2B%23"},
      {"https://h/p#f", {{"b", ""}}, "https://h/p?b=#f"},
      {"https://h/p", {}, "https://h/p"},
      {"https://h/p?", {}, "https://h/p?"},
      {"https://h/p?a=%41", {}, "https://h/p?a=%41"},
      // An empty query holds no items: the new ones replace it.
      {"https://h/p?", {{"b", "2"}}, "https://h/p?b=2"},
      // Existing items keep their text, even where it does not decode.
      {"https://h/p?a=%E9&b=%c3%a9&", {{"c", "\u00e9"}}, "https://h/p?a=%E9&b=%c3%a9&&c=%C3%A9"},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.url);
    auto components = URLComponents::fromString(row.url).value();
    KiviOSSdkUtils::addQueryItems(components, row.items);
    EXPECT_EQ(components.string(), row.expected);
  }
}

TEST(GetQueryItemsDictionaryTest, KeepsItemsWithValuesDecodedLastOneWinning) {
  using Map = std::map<std::string, std::string>;
  const struct {
    const char* query;
    Map expected;
  } cases[] = {
      {"a=1&b=&c", {{"a", "1"}, {"b", ""}}},
      {"", {}},
      {"x=%41%20b", {{"x", "A b"}}},
      {"a=1&a=2&a", {{"a", "2"}}},
      {"a+b=c+d&=v&e==", {{"a+b", "c+d"}, {"", "v"}, {"e", "="}}},
      {"k=%26%3D&n=%C3%A9", {{"k", "&="}, {"n", "\xC3\xA9"}}},
      {"n=%c3%a9&v=%E9&%FF=1", {{"n", "\u00e9"}, {"", "1"}}},  // %E9 alone is not UTF-8
      {"x=1#y=2", {{"x", "1"}}},
      {"a=b c", {}},  // not a query
      {"a=%zz", {}},  // nor is this
      {"a=1?b=2", {{"a", "1?b=2"}}},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.query);
    EXPECT_EQ(getQueryItemsDictionary(row.query), row.expected);
  }
}

TEST(CustomHeadersTest, SetsEachFieldReplacingAnyLetterCase) {
  MutableURLRequest request(URL::URLWithString("https://example.com/"));
  request.setValue("text/plain", "content-type");
  request.setValue("keep", "X-Keep");

  CustomHeaders::setHeaders(request, nullopt);
  EXPECT_EQ(request.headerFields().size(), 2u);

  CustomHeaders::setHeaders(
      request, StringDictionary{{"Content-Type", "application/json"}, {"Accept", "*/*"}});
  EXPECT_EQ(request.valueForHTTPHeaderField("Content-Type"), "application/json");
  EXPECT_EQ(request.valueForHTTPHeaderField("accept"), "*/*");
  EXPECT_EQ(request.valueForHTTPHeaderField("X-Keep"), "keep");
  EXPECT_EQ(request.headerFields().size(), 3u);

  CustomHeaders::setHeaders(request, StringDictionary{});
  EXPECT_EQ(request.headerFields().size(), 3u);
}

TEST(KivURLTest, RefusesTextThatWouldNeedEncoding) {
  const struct {
    std::optional<std::string> text;
    bool accepted;
  } cases[] = {
      {"https://example.com/p?q=1#f", true},
      {"https://[::1]:8443/a%20b", true},
      {"relative/path", true},
      {"https://example.com/a b", false},
      {"https://example.com/\xC3\xA9", false},
      {"https://ex\xC3\xA4mple.com/", false},
      {"https://example.com/%", false},
      {"", false},
      {nullopt, false},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.text.value_or("<none>"));
    std::shared_ptr<const KivURL> url = KivURL::URLWithString(row.text);
    ASSERT_EQ(url != nullptr, row.accepted);
    if (!url) continue;
    EXPECT_EQ(url->className(), "KivURL");
    EXPECT_EQ(*url, *URL::URLWithString(*row.text));
    EXPECT_EQ(url->absoluteString(), *row.text);
    EXPECT_EQ(*KivURL::initWithString(*row.text), *url);
    EXPECT_EQ(Value(url), Value(URL::URLWithString(*row.text)));
  }
}

std::vector<HTTPCookiePtr> cookiesFor(const std::vector<std::string>& domains) {
  std::vector<HTTPCookiePtr> cookies;
  for (const std::string& domain : domains) {
    HTTPCookie::Properties p;
    p.name = "id";
    p.value = "v";
    p.domain = domain;
    cookies.push_back(HTTPCookie::cookieWithProperties(p));
  }
  return cookies;
}

std::vector<std::string> domainsOf(const std::vector<HTTPCookiePtr>& cookies) {
  std::vector<std::string> domains;
  for (const auto& cookie : cookies) domains.push_back(cookie->domain());
  return domains;
}

TEST(HTTPCookieUtilsTest, KeepsCookiesWhoseDomainEndsWithAListedOne) {
  const std::vector<std::string> all = {"example.com",  ".example.com",      "x.example.com",
                                        "xexample.com", "EXAMPLE.COM.",      "other.com",
                                        "example.org",  "..x.Example.Com..", ""};
  using Domains = std::vector<std::string>;
  const struct {
    const char* name;
    Domains list;
    Domains kept;
  } cases[] = {
      {"mixed-case list domain",
       {"ExAmple.COM"},
       {"example.com", ".example.com", "x.example.com", "xexample.com", "EXAMPLE.COM.",
        "..x.Example.Com.."}},
      {"leading dot keeps subdomains only",
       {".EXAMPLE.com"},
       {"x.example.com", "..x.Example.Com.."}},
      {"several list domains, input order kept",
       {"org", "other.com"},
       {"other.com", "example.org"}},
      {"empty list", {}, {}},
      {"empty domain keeps all", {"nothing.net", ""}, all},
      {"no match", {"example.net"}, {}},
  };
  const std::vector<HTTPCookiePtr> cookies = cookiesFor(all);
  for (const auto& row : cases) {
    SCOPED_TRACE(row.name);
    EXPECT_EQ(domainsOf(HTTPCookieUtils::filterCookies(cookies, row.list)), row.kept);
  }
}

TEST(HTTPCookieUtilsTest, LowercasesInternationalDomainsBeyondASCII) {
  const auto cookies =
      cookiesFor({"B\xC3\x9C"
                  "CHER.example",
                  "\xCE\x91\xCE\x92.gr", "x.gr"});
  EXPECT_EQ(domainsOf(HTTPCookieUtils::filterCookies(cookies, {"b\xC3\xBC"
                                                               "cher.EXAMPLE"})),
            std::vector<std::string>{"B\xC3\x9C"
                                     "CHER.example"});
  EXPECT_EQ(domainsOf(HTTPCookieUtils::filterCookies(cookies, {"\xCE\xB1\xCE\xB2.gr"})),
            std::vector<std::string>{"\xCE\x91\xCE\x92.gr"});
  EXPECT_EQ(domainsOf(HTTPCookieUtils::filterCookies(cookies, {"\xCE\x91\xCE\x92.GR"})),
            std::vector<std::string>{"\xCE\x91\xCE\x92.gr"});
  // Missing cookies are skipped.
  EXPECT_TRUE(HTTPCookieUtils::filterCookies({nullptr}, {""}).empty());
}

}  // namespace
}  // namespace kivi
