#include "kivi/foundation/url.h"

#include <gtest/gtest.h>

#include <functional>
#include <optional>
#include <ostream>
#include <random>
#include <string>
#include <vector>

#include "kivi/foundation/http_cookie.h"
#include "kivi/foundation/url_components.h"
#include "kivi/foundation/value.h"

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

using std::nullopt;

struct ParseCase {
  const char* text;
  std::optional<std::string> encoded;  // absoluteString with encoding on; none: refused
  bool acceptedAsIs;                   // accepted with encoding off
};

TEST(URLTest, ParsesRFC3986ReferencesAndRefusesTheRest) {
  const ParseCase cases[] = {
      {"https://api.example.com/v1/items?a=1#top", "https://api.example.com/v1/items?a=1#top",
       true},
      {"http://[::1]:8080/", "http://[::1]:8080/", true},
      {"http://[2001:db8::7]/x", "http://[2001:db8::7]/x", true},
      {"http://[::ffff:192.0.2.1]/", "http://[::ffff:192.0.2.1]/", true},
      {"http://[1:2:3:4:5:6:7::]/", "http://[1:2:3:4:5:6:7::]/", true},
      {"http://[v1.fe80::a+en1]/", "http://[v1.fe80::a+en1]/", true},
      {"http://[1:2:3:4:5:6:7:8:9]/", nullopt, false},
      {"http://[1::2::3]/", nullopt, false},
      {"http://[1:2:3:4::5:6:7:8]/", nullopt, false},
      {"http://[::1.2.3.04]/", nullopt, false},
      {"http://[vz.x]/", nullopt, false},
      {"http://[::256.1.1.1]/", nullopt, false},
      {"http://[::1", nullopt, false},
      {"http://[::1]x/", nullopt, false},
      {"http://h:/", "http://h:/", true},
      {"http://h:80a/", nullopt, false},
      {"http://h:1:2/", nullopt, false},
      {"http://h:99999999999999999999/", nullopt, false},
      {"ftp://us%65r:pa:ss@h/", "ftp://us%65r:pa:ss@h/", true},
      {"http://a@b@h/", nullopt, false},
      {"//h/p", "//h/p", true},
      {"/p?q=/?#f?", "/p?q=/?#f?", true},
      {"p/q:r", "p/q:r", true},
      {"mailto:a@b", "mailto:a@b", true},
      {"a+b.c-d:x", "a+b.c-d:x", true},
      {"1a:b", nullopt, false},
      {":x", nullopt, false},
      {"a#b#c", nullopt, false},
      {"http://h/a[b]", nullopt, false},
      {"%41", "%41", true},
      {"%4", "%254", false},
      {"a%zz", "a%25zz", false},
      {"http://h/a b", "http://h/a%20b", false},
      {"http://h/\xC3\xA9?q=\xC3\xA9", "http://h/%C3%A9?q=%C3%A9", false},
      {"http://h/{x}|\"<>\\^`", "http://h/%7Bx%7D%7C%22%3C%3E%5C%5E%60", false},
      {"a\tb\x7F", "a%09b%7F", false},
      {"", nullopt, false},
  };
  for (const ParseCase& c : cases) {
    SCOPED_TRACE(c.text);
    URLPtr encoded = URL::URLWithString(c.text);
    ASSERT_EQ(encoded != nullptr, c.encoded.has_value());
    if (encoded) {
      EXPECT_EQ(encoded->absoluteString(), *c.encoded);
    }
    URLPtr asIs = URL::URLWithString(c.text, false);
    ASSERT_EQ(asIs != nullptr, c.acceptedAsIs);
    if (asIs) {
      EXPECT_EQ(asIs->absoluteString(), encoded->absoluteString());
    }
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
  EXPECT_EQ(bare->scheme(), nullopt);
  EXPECT_EQ(bare->host(), nullopt);
  EXPECT_EQ(bare->port(), nullopt);
  EXPECT_EQ(bare->query(), nullopt);
  EXPECT_EQ(URL::URLWithString("http://[::1]:1/")->host(), "::1");
  EXPECT_EQ(URL::URLWithString("http://h?")->query(), "");
}

struct ComponentCase {
  const char* name;
  std::function<void(URLComponents&, const std::string&)> set;
  std::function<std::optional<std::string>(const URLComponents&)> get;
  std::function<std::optional<std::string>(const URLComponents&)> getEncoded;
  std::string decoded;
  std::string encoded;
};

TEST(URLComponentsTest, DecodedSettersEncodeWithTheComponentsOwnSet) {
  const ComponentCase cases[] = {
      {"user", &URLComponents::setUser, &URLComponents::user, &URLComponents::percentEncodedUser,
       "a:b@c d%é", "a%3Ab%40c%20d%25%C3%A9"},
      {"password", &URLComponents::setPassword, &URLComponents::password,
       &URLComponents::percentEncodedPassword, "a:b@c/", "a:b%40c%2F"},
      {"host", &URLComponents::setHost, &URLComponents::host, &URLComponents::percentEncodedHost,
       "ex ample:1", "ex%20ample%3A1"},
      {"IP-literal host", &URLComponents::setHost, &URLComponents::host,
       &URLComponents::percentEncodedHost, "[fe80::1]", "[fe80::1]"},
      {"path", &URLComponents::setPath, &URLComponents::path,
       [](const URLComponents& c) { return std::optional(c.percentEncodedPath()); },
       "/a b/c:@?d#e%", "/a%20b/c:@%3Fd%23e%25"},
      {"query", &URLComponents::setQuery, &URLComponents::query,
       &URLComponents::percentEncodedQuery, "a=1&b=c d#e?/+", "a=1&b=c%20d%23e?/+"},
      {"fragment", &URLComponents::setFragment, &URLComponents::fragment,
       &URLComponents::percentEncodedFragment, "x y#?", "x%20y%23?"},
  };
  for (const ComponentCase& c : cases) {
    SCOPED_TRACE(c.name);
    auto components = *URLComponents::fromString("s://u@h/");
    c.set(components, c.decoded);
    EXPECT_EQ(c.getEncoded(components), c.encoded);
    EXPECT_EQ(c.get(components), c.decoded);
    auto text = components.string();
    ASSERT_TRUE(text);
    auto reparsed = URLComponents::fromString(*text);
    ASSERT_TRUE(reparsed) << *text;
    EXPECT_EQ(*reparsed, components);
    ASSERT_TRUE(components.url());
    EXPECT_EQ(components.url()->absoluteString(), *text);
  }
}

TEST(URLComponentsTest, PercentEncodedSettersRefuseWhatTheComponentCannotHold) {
  URLComponents c;
  const struct {
    std::function<bool(URLComponents&, std::string)> set;
    const char* text;
    bool accepted;
  } cases[] = {
      {&URLComponents::setPercentEncodedUser, "a:b", false},
      {&URLComponents::setPercentEncodedUser, "a%3Ab", true},
      {&URLComponents::setPercentEncodedPassword, "a:b", true},
      {&URLComponents::setPercentEncodedPassword, "a@b", false},
      {&URLComponents::setPercentEncodedHost, "a b", false},
      {&URLComponents::setPercentEncodedHost, "[::1]", true},
      {&URLComponents::setPercentEncodedHost, "[::g]", false},
      {&URLComponents::setPercentEncodedPath, "/a%zz", false},
      {&URLComponents::setPercentEncodedPath, "/a%7a", true},
      {&URLComponents::setPercentEncodedQuery, "a#b", false},
      {&URLComponents::setPercentEncodedQuery, "a=%", false},
      {&URLComponents::setPercentEncodedFragment, "\xC3\xA9", false},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.text);
    URLComponents before = c;
    EXPECT_EQ(row.set(c, row.text), row.accepted);
    if (!row.accepted) {
      EXPECT_EQ(c, before);
    }
  }
}

TEST(URLComponentsTest, QueryItemsSplitTheEncodedQuery) {
  using Items = std::optional<std::vector<URLQueryItem>>;
  using V = std::vector<URLQueryItem>;
  const struct {
    const char* text;
    Items items;
  } cases[] = {
      {"s:p", nullopt},
      {"s:p?", V{}},
      {"s:p?a=1&b=&c&=x&&d=e=f",
       Items{{{"a", "1"}, {"b", ""}, {"c", nullopt}, {"", "x"}, {"", nullopt}, {"d", "e=f"}}}},
      {"s:p?a+b=%2B%20%26", V{{"a+b", "+ &"}}},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.text);
    EXPECT_EQ(URLComponents::fromString(row.text)->queryItems(), row.items);
  }

  auto c = *URLComponents::fromString("s://h/p?old");
  c.setQueryItems(std::vector<URLQueryItem>{});
  EXPECT_EQ(c.string(), "s://h/p?");
  c.setQueryItems(nullopt);
  EXPECT_EQ(c.string(), "s://h/p");
  c.setQueryItems(std::vector<URLQueryItem>{{"a&b=c", "d+e#f"}, {"g", nullopt}});
  EXPECT_EQ(c.percentEncodedQuery(), "a%26b%3Dc=d%2Be%23f&g");
}

TEST(URLComponentsTest, AnyQueryItemNamesAndValuesRoundTrip) {
  const std::vector<std::string> pieces = {
      "&", "=", "+", "#", "%", "%41", " ", "?", "/", "a", "Z", "\xC3\xA9", "\xE2\x82\xAC", ";", ""};
  std::mt19937 random(20240611);
  auto text = [&] {
    std::string out;
    for (int n = random() % 5; n > 0; --n) out += pieces[random() % pieces.size()];
    return out;
  };
  for (int round = 0; round < 500; ++round) {
    std::vector<URLQueryItem> items(1 + random() % 4);
    for (auto& item : items) {
      item.name = text();
      if (random() % 3) item.value = text();
    }
    // A lone item with an empty name and no value writes a bare "?", which
    // reads back as no items.
    if (items.size() == 1 && items[0].name.empty() && !items[0].value) continue;
    URLComponents c = *URLComponents::fromString("https://h/p#f");
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
  URLPtr a = URL::URLWithString("https://h/a b");
  URLPtr same = URL::URLWithString("https://h/a%20b");
  Value value(a);
  EXPECT_EQ(value.kind(), Value::Kind::URL);
  EXPECT_EQ(value.asURL(), a);
  EXPECT_EQ(value.asObject(), nullptr);
  EXPECT_EQ(value, Value(same));
  EXPECT_NE(value, Value(URL::URLWithString("https://h/")));
  EXPECT_NE(value, Value("https://h/a%20b"));
  EXPECT_EQ(value.description(), "https://h/a%20b");
  EXPECT_TRUE(Value(URLPtr()).isNull());
  EXPECT_EQ(Value(Array{value}).description(), "(https://h/a%20b)");
}

TEST(HTTPCookieTest, RefusesNamesValuesAndAttributesACookieCannotCarry) {
  using namespace std::string_literals;
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
