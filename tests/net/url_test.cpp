#include "kivi/net/url.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <optional>
#include <ostream>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/net/http_cookie.h"
#include "kivi/net/url_components.h"

namespace kivi {

// Readable failure messages (internal linkage: other suites may print these
// types their own way).
static void PrintTo(const URLComponents& c, std::ostream* os) {
  *os << c.string().value_or("<no text>");
}
static void PrintTo(const URLQueryItem& item, std::ostream* os) {
  *os << '{' << item.name << (item.value ? "=" + *item.value : "") << '}';
}

namespace {

using namespace std::string_literals;
using std::nullopt;

// The space-separated texts of `list`.
std::vector<std::string> texts(std::string_view list) {
  std::vector<std::string> out;
  for (std::size_t start = 0, end; start < list.size(); start = end + 1) {
    end = std::min(list.find(' ', start), list.size());
    if (end > start) out.emplace_back(list.substr(start, end - start));
  }
  return out;
}

TEST(URLTest, ParsesRFC3986ReferencesAndRefusesTheRest) {
  const auto accepted = texts(
      "https://api.example.com/v1/items?a=1#top http://[::1]:8080/ http://[2001:db8::7]/x "
      "http://[::ffff:192.0.2.1]/ http://[1:2:3:4:5:6:7::]/ http://[v1.fe80::a+en1]/ http://h:/ "
      "ftp://us%65r:pa:ss@h/ //h/p /p?q=/?#f? p/q:r mailto:a@b a+b.c-d:x %41 "
      "http://h/%c3%a9?q=%e9#%7e");
  auto refused = texts(
      "http://[1:2:3:4:5:6:7:8:9]/ http://[1::2::3]/ http://[1:2:3:4::5:6:7:8]/ "
      "http://[::1.2.3.04]/ http://[vz.x]/ http://[::256.1.1.1]/ http://[::1 http://[::1]x/ "
      "http://h:80a/ http://h:1:2/ http://h:99999999999999999999/ http://a@b@h/ 1a:b :x "
      "http://h/a[b]");
  refused.emplace_back("");
  // Accepted only with encoding on, as the second text.
  const std::pair<const char*, const char*> encoded[] = {
      {"%4", "%254"},
      {"a%zz", "a%25zz"},
      {"http://h/a b", "http://h/a%20b"},
      {"http://h/\xC3\xA9?q=\xC3\xA9", "http://h/%C3%A9?q=%C3%A9"},
      {"http://h/{x}|\"<>\\^`", "http://h/%7Bx%7D%7C%22%3C%3E%5C%5E%60"},
      {"a\tb\x7F", "a%09b%7F"},
      {"a#b#c", "a#b%23c"},
      {"http://h/p?k=v#f#g?x", "http://h/p?k=v#f%23g?x"}};
  for (const std::string& text : accepted) {
    for (const bool encoding : {true, false}) {
      URLPtr url = URL::URLWithString(text, encoding);
      ASSERT_TRUE(url) << text;
      EXPECT_EQ(url->absoluteString(), text);
    }
  }
  for (const std::string& text : refused) {
    EXPECT_FALSE(URL::URLWithString(text)) << text;
    EXPECT_FALSE(URL::URLWithString(text, false)) << text;
  }
  for (const auto& [text, expected] : encoded) {
    URLPtr url = URL::URLWithString(text);
    ASSERT_TRUE(url) << text;
    EXPECT_EQ(url->absoluteString(), expected);
    EXPECT_FALSE(URL::URLWithString(text, false)) << text;
  }
}

TEST(URLTest, AccessorsDecodeHostPathAndUserButNotQueryOrFragment) {
  URLPtr url = URL::URLWithString("HTTP://us%20er:p%3Aw@%68ost:8080/a%20b/c?x=%41#%42");
  ASSERT_TRUE(url);
  EXPECT_EQ(url->scheme(), "HTTP");
  EXPECT_EQ(url->user(), "us er");
  EXPECT_EQ(url->password(), "p:w");
  EXPECT_EQ(url->host(), "host");
  EXPECT_EQ(url->port(), 8080);
  EXPECT_EQ(url->path(), "/a b/c");
  EXPECT_EQ(url->query(), "x=%41");
  EXPECT_EQ(url->fragment(), "%42");

  URLPtr bare = URL::URLWithString("p");
  EXPECT_FALSE(bare->scheme() || bare->host() || bare->port() || bare->query());
  EXPECT_EQ(URL::URLWithString("http://[::1]:1/")->host(), "::1");
  EXPECT_EQ(URL::URLWithString("http://h?")->query(), "");
}

// Escapes decode in either case; a component whose decoded bytes are not
// UTF-8 is absent, from URL and URLComponents alike.
TEST(URLTest, DecodedComponentsAreUTF8OrAbsent) {
  using O = std::optional<std::string>;
  const struct {
    const char* text;
    O user, password, host, path, query, fragment;  // the last two: URLComponents only
  } cases[] = {
      {"http://%c3%a9:%C3%a9@%c3%A9/%c3%a9?%c3%a9#%c3%a9", "\u00e9", "\u00e9", "\u00e9", "/\u00e9",
       "\u00e9", "\u00e9"},
      {"http://%E9:%e9@%E9/%e9?%E9#%e9", nullopt, nullopt, nullopt, nullopt, nullopt, nullopt},
      {"http://u@h/a%C3?%ED%A0%80#%C0%AF", "u", nullopt, "h", nullopt, nullopt, nullopt},
      {"http://u:@h/%F4%8F%BF%BF%00", "u", "", "h", "/\U0010FFFF\0"s, nullopt, nullopt},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.text);
    const URLPtr url = URL::URLWithString(row.text, false);
    ASSERT_TRUE(url);
    const URLComponents components = URLComponents::fromURL(*url);
    EXPECT_EQ(url->user(), row.user);
    EXPECT_EQ(components.user(), row.user);
    EXPECT_EQ(url->password(), row.password);
    EXPECT_EQ(components.password(), row.password);
    EXPECT_EQ(url->host(), row.host);
    EXPECT_EQ(components.host(), row.host);
    EXPECT_EQ(url->path(), row.path);
    EXPECT_EQ(components.path(), row.path);
    EXPECT_EQ(components.query(), row.query);
    EXPECT_EQ(components.fragment(), row.fragment);
  }
}

TEST(URLComponentsTest, DecodedSettersEncodeWithTheComponentsOwnSet) {
  URLComponents c;
  c.setScheme("s");
  c.setUser("a:b@c d%é");
  c.setPassword("a:b@c/");
  c.setHost("ex ample:1");
  c.setPath("/a b/c:@?d#e%");
  c.setQuery("a=1&b=c d#e?/+");
  c.setFragment("x y#?");
  const std::optional<std::string> text = c.string();
  EXPECT_EQ(text,
            "s://a%3Ab%40c%20d%25%C3%A9:a:b%40c%2F@ex%20ample%3A1/a%20b/c:@%3Fd%23e%25"
            "?a=1&b=c%20d%23e?/+#x%20y%23?");
  ASSERT_TRUE(c.url());
  EXPECT_EQ(c.url()->absoluteString(), text);
  const auto back = URLComponents::fromString(text.value_or(""));
  ASSERT_TRUE(back);
  EXPECT_EQ(*back, c);
  EXPECT_EQ(back->user(), "a:b@c d%é");
  EXPECT_EQ(back->password(), "a:b@c/");
  EXPECT_EQ(back->host(), "ex ample:1");
  EXPECT_EQ(back->path(), "/a b/c:@?d#e%");
  EXPECT_EQ(back->query(), "a=1&b=c d#e?/+");
  EXPECT_EQ(back->fragment(), "x y#?");
  c.setHost("[fe80::1]");
  EXPECT_EQ(c.percentEncodedHost(), "[fe80::1]");
}

TEST(URLComponentsTest, PercentEncodedSettersRefuseWhatTheComponentCannotHold) {
  const struct {
    std::function<bool(URLComponents&, std::string)> set;
    const char *takes, *refuses;  // refused: nothing changes
  } cases[] = {
      {&URLComponents::setPercentEncodedUser, "a%3Ab", "a:b"},
      {&URLComponents::setPercentEncodedPassword, "a:b", "a@b"},
      {&URLComponents::setPercentEncodedHost, "[::1]", "a b"},
      {&URLComponents::setPercentEncodedHost, "[::1]", "[::g]"},
      {&URLComponents::setPercentEncodedPath, "/a%7a", "/a%zz"},
      {&URLComponents::setPercentEncodedQuery, "a=%41?", "a#b"},
      {&URLComponents::setPercentEncodedQuery, "a=%41?", "a=%"},
      {&URLComponents::setPercentEncodedFragment, "%C3%A9", "\xC3\xA9"},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.refuses);
    URLComponents c;
    EXPECT_TRUE(row.set(c, row.takes));
    const URLComponents before = c;
    EXPECT_FALSE(row.set(c, row.refuses));
    EXPECT_EQ(c, before);
  }
}

TEST(URLComponentsTest, QueryItemsSplitTheQueryAndAnyNamesAndValuesRoundTrip) {
  using V = std::vector<URLQueryItem>;
  const std::pair<const char*, std::optional<V>> cases[] = {
      {"s:p", nullopt},
      {"s:p?", V{}},
      {"s:p?a=1&b=&c&=x&&d=e=f",
       V{{"a", "1"}, {"b", ""}, {"c", nullopt}, {"", "x"}, {"", nullopt}, {"d", "e=f"}}},
      {"s:p?a+b=%2B%20%26", V{{"a+b", "+ &"}}},
      // Either case of hex digit; bytes that are not UTF-8 give no value,
      // and an empty name.
      {"s:p?%c3%a9=%e2%82%ac&b=%C3%a9", V{{"\u00e9", "\u20ac"}, {"b", "\u00e9"}}},
      {"s:p?a=%E9&b=%c3&%FF=1&%e9&c=%C3%A9%FF",
       V{{"a", nullopt}, {"b", nullopt}, {"", "1"}, {"", nullopt}, {"c", nullopt}}},
  };
  for (const auto& [text, items] : cases) {
    EXPECT_EQ(URLComponents::fromString(text)->queryItems(), items) << text;
  }
  auto c = *URLComponents::fromString("s://h/p?old#f");
  c.setQueryItems(V{});
  EXPECT_EQ(c.string(), "s://h/p?#f");
  c.setQueryItems(nullopt);
  EXPECT_EQ(c.string(), "s://h/p#f");
  c.setQueryItems(V{{"a&b=c", "d+e#f"}, {"g", nullopt}});
  EXPECT_EQ(c.percentEncodedQuery(), "a%26b%3Dc=d%2Be%23f&g");

  const std::string_view pieces[] = {"&", "=", "+", "#", "%", "%41", " ",
                                     "?", "/", "a", ";", "",  "é",   "\xE2\x82\xAC"};
  std::mt19937 random(20240611);
  auto text = [&] {
    std::string out;
    for (int n = random() % 5; n > 0; --n) out += pieces[random() % std::size(pieces)];
    return out;
  };
  for (int round = 0; round < 500; ++round) {
    V items(1 + random() % 4);
    for (auto& item : items) {
      item.name = text();
      if (random() % 3) item.value = text();
    }
    // A lone item with an empty name and no value writes a bare "?", which
    // reads back as no items.
    if (items.size() == 1 && items[0].name.empty() && !items[0].value) continue;
    c.setQueryItems(items);
    ASSERT_EQ(c.queryItems(), items);
    auto reparsed = URLComponents::fromString(c.string().value());
    ASSERT_TRUE(reparsed) << *c.string();
    ASSERT_EQ(reparsed->queryItems(), items) << *c.string();
    ASSERT_EQ(reparsed->fragment(), "f");
  }
}

TEST(URLComponentsTest, StringIsNoneWhenTheComponentsCannotFormAReference) {
  auto opt = [](const char* s) { return s ? std::optional<std::string>(s) : nullopt; };
  const struct {
    const char *scheme, *user, *password, *host;
    std::optional<std::int64_t> port;
    const char *path, *text;  // text null: none
  } cases[] = {
      {nullptr, nullptr, nullptr, "h", nullopt, "p", nullptr},  // host, relative path
      {nullptr, nullptr, nullptr, nullptr, nullopt, "//p", nullptr},
      {nullptr, nullptr, nullptr, nullptr, nullopt, "a:b/c", nullptr},
      {nullptr, nullptr, nullptr, nullptr, nullopt, "a/b:c", "a/b:c"},
      {"m", nullptr, nullptr, nullptr, nullopt, "a:b", "m:a:b"},
      {"1x", nullptr, nullptr, nullptr, nullopt, "", nullptr},
      {"", nullptr, nullptr, nullptr, nullopt, "", nullptr},
      {nullptr, nullptr, nullptr, "h", -1, "", nullptr},
      {nullptr, "u", nullptr, nullptr, 1, "", ""},  // no host: no authority
      {nullptr, nullptr, "p", "", nullopt, "", "//:p@"},
      {"s", "u", "p", "h", 1, "/x", "s://u:p@h:1/x"},
  };
  for (const auto& row : cases) {
    URLComponents c;
    c.setScheme(opt(row.scheme));
    c.setUser(opt(row.user));
    c.setPassword(opt(row.password));
    c.setHost(opt(row.host));
    c.setPort(row.port);
    c.setPath(row.path);
    SCOPED_TRACE(::testing::Message() << "row " << &row - cases);
    EXPECT_EQ(c.string(), opt(row.text));
    EXPECT_EQ(c.url() != nullptr, row.text && *row.text);
  }
}

TEST(URLTest, IsAValueKindComparedByText) {
  const Value value(URL::URLWithString("https://h/a b"));
  EXPECT_EQ(value.kind(), Value::Kind::URL);
  EXPECT_EQ(value, Value(URL::URLWithString("https://h/a%20b")));
  EXPECT_NE(value, Value(URL::URLWithString("https://h/")));
  EXPECT_NE(value, Value("https://h/a%20b"));
  EXPECT_EQ(Value(Array{value}).description(), "(https://h/a%20b)");
  EXPECT_TRUE(Value(URLPtr()).isNull());
}

TEST(HTTPCookieTest, RefusesNamesValuesAndAttributesACookieCannotCarry) {
  const struct {
    std::string name, value, domain, path;
    bool accepted;
  } cases[] = {
      {"id", "a;b=c", ".example.com", "/", true}, {"", "v", "example.com", "/", false},
      {"a=b", "v", "example.com", "/", false},    {"a;b", "v", "example.com", "/", false},
      {"a\rb", "v", "example.com", "/", false},   {"id", "a\nb", "example.com", "/", false},
      {"id", "a\0b"s, "example.com", "/", false}, {"id", "v", "example.com;x", "/", false},
      {"id", "v", "example.com\n", "/", false},   {"id", "v", "example.com", "/a;b", false},
      {"id", "v", "example.com", "/\r", false},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(::testing::Message() << "row " << &row - cases);
    HTTPCookie::Properties p;
    p.name = row.name;
    p.value = row.value;
    p.domain = row.domain;
    p.path = row.path;
    p.secure = true;
    HTTPCookiePtr cookie = HTTPCookie::cookieWithProperties(p);
    ASSERT_EQ(cookie != nullptr, row.accepted);
    if (cookie) {
      EXPECT_EQ(cookie->properties(), p);
    }
  }
}

}  // namespace
}  // namespace kivi
