#include <gtest/gtest.h>

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "kivi/net/http_cookie.h"

namespace kivi {
namespace {

std::vector<HTTPCookiePtr> parse(const char* url, const StringDictionary& fields) {
  return HTTPCookie::cookiesWithResponseHeaderFields(fields, *URL::URLWithString(url));
}

// "name=value domain path" for each cookie.
std::vector<std::string> summaries(const std::vector<HTTPCookiePtr>& cookies) {
  std::vector<std::string> out;
  for (const auto& c : cookies)
    out.push_back(c->name() + "=" + c->value() + " " + c->domain() + " " + c->path());
  return out;
}

TEST(CookieParsingTest, DomainPathAndSplittingFollowRFC6265) {
  const struct {
    const char* url;
    const char* field;
    std::vector<std::string> expected;
  } cases[] = {
      // Default path: the directory of the request path.
      {"https://h/a/b/c", "a=1", {"a=1 h /a/b"}},
      {"https://h/a", "a=1", {"a=1 h /"}},
      {"https://h", "a=1", {"a=1 h /"}},
      {"https://h/a/b", "a=1; Path=rel", {"a=1 h /a"}},
      {"https://h/a/b", "a=1; path=/x/; Path=/y", {"a=1 h /y"}},
      // Domain: lowercased, stored with one leading dot, must domain-match.
      {"https://www.Example.com/", "a=1", {"a=1 www.example.com /"}},
      {"https://www.example.com/", "a=1; Domain=EXAMPLE.com", {"a=1 .example.com /"}},
      {"https://www.example.com/", "a=1; domain=.example.com", {"a=1 .example.com /"}},
      {"https://example.com/", "a=1; Domain=.example.com", {"a=1 .example.com /"}},
      {"https://www.example.com/", "a=1; Domain=ample.com", {}},
      {"https://example.com/", "a=1; Domain=www.example.com", {}},
      {"https://www.example.com/", "a=1; Domain=", {"a=1 www.example.com /"}},
      {"https://10.0.0.1/", "a=1; Domain=0.0.1", {}},
      // A single label reaches a whole top-level domain: refused, unless it
      // is the host itself, which then gets a host-only cookie.
      {"https://home.example.org/", "a=1; Domain=.org", {}},
      {"https://home.example.org/", "a=1; Domain=ORG", {}},
      {"https://home.example.org./", "a=1; Domain=org.", {}},
      {"https://home.example.org/", "a=1; Domain=example.org", {"a=1 .example.org /"}},
      {"http://localhost/", "a=1; Domain=LocalHost", {"a=1 localhost /"}},
      {"http://localhost/", "a=1; Domain=.localhost", {"a=1 localhost /"}},
      {"http://app.localhost/", "a=1; Domain=localhost", {}},
      {"https://[::1]/", "a=1", {"a=1 ::1 /"}},
      // Several cookies in one field; an Expires comma does not split.
      {"https://h/",
       "a=1, b=2; Expires=Wed, 21 Oct 2015 07:28:00 GMT, c=3;Expires=Sunday, 06-Nov-94 08:49:37 "
       "GMT",
       {"a=1 h /", "b=2 h /", "c=3 h /"}},
      {"https://h/", " a = x=y ;Secure,b=\"q\"", {"a=x=y h /", "b=\"q\" h /"}},
      // Cookies without a name=value pair, or with text a cookie cannot
      // hold, are dropped; the others stay.
      {"https://h/", "flag, =v, a=1, ;b=2, c=3\r\nd=4, e=", {"a=1 h /", "e= h /"}},
      {"file:///tmp/x", "a=1", {}},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(std::string(row.url) + " " + row.field);
    EXPECT_EQ(summaries(parse(row.url, {{"Set-Cookie", row.field}})), row.expected);
  }
}

TEST(CookieParsingTest, ReadsEverySetCookieFieldInAnyCaseAndNothingElse) {
  const auto cookies = parse(
      "https://h/",
      {{"set-cookie", "a=1"}, {"SET-COOKIE", "b=2"}, {"Set-Cookie2", "c=3"}, {"Cookie", "d=4"}});
  EXPECT_EQ(summaries(cookies), (std::vector<std::string>{"b=2 h /", "a=1 h /"}));
}

TEST(CookieParsingTest, AttributesAndExpiry) {
  const auto expiry = [](const char* field) {
    const auto cookies = parse("https://h/", {{"Set-Cookie", field}});
    return cookies.size() == 1 ? cookies[0]->expiresDate() : std::optional<Date>(Date{-1});
  };
  const auto before = std::chrono::system_clock::now();
  const struct {
    const char* field;
    std::optional<double> expected;  // seconds since 1970
  } cases[] = {
      {"a=1", std::nullopt},
      {"a=1; Expires=Wed, 21 Oct 2015 07:28:00 GMT", 1445412480},
      {"a=1; expires=Sun Nov  6 08:49:37 1994", 784111777},
      {"a=1; EXPIRES=6 nov 94 8:49:37", 784111777},
      {"a=1; Expires=Thu, 01-Jan-70 00:00:01 GMT", 1},
      {"a=1; Expires=01 Jan 2069 00:00:00", 3124224000},
      {"a=1; Max-Age=0; Expires=Wed, 21 Oct 2015 07:28:00 GMT", 0},
      {"a=1; Expires=Wed, 21 Oct 2015 07:28:00 GMT; max-age=-5", 0},
      {"a=1; Max-Age=1x; Expires=Wed, 21 Oct 2015 07:28:00 GMT", 1445412480},
      // Not dates: no such day, a year before 1601, a field out of range.
      {"a=1; Expires=30 Feb 2020 00:00:00", std::nullopt},
      {"a=1; Expires=1 Jan 1600 00:00:00", std::nullopt},
      {"a=1; Expires=1 Jan 2020 24:00:00", std::nullopt},
      {"a=1; Expires=1 Jan 2020", std::nullopt},
  };
  for (const auto& row : cases) {
    SCOPED_TRACE(row.field);
    const auto date = expiry(row.field);
    EXPECT_EQ(date ? std::optional(date->timeIntervalSince1970) : std::nullopt, row.expected);
  }
  const double now = std::chrono::duration<double>(before.time_since_epoch()).count();
  const auto later = expiry("a=1; Max-Age=3600; Expires=Wed, 21 Oct 2015 07:28:00 GMT");
  ASSERT_TRUE(later);
  EXPECT_GE(later->timeIntervalSince1970, now + 3600);
  EXPECT_LT(later->timeIntervalSince1970, now + 3600 + 600);

  const auto flags = parse("https://h/", {{"Set-Cookie", "a=1; sEcUrE; HTTPONLY; SameSite=lax"},
                                          {"set-cookie", "b=2; SameSite=Strict; SameSite=bogus"}});
  ASSERT_EQ(flags.size(), 2u);
  EXPECT_TRUE(flags[0]->isSecure());
  EXPECT_TRUE(flags[0]->isHTTPOnly());
  EXPECT_EQ(flags[0]->sameSitePolicy(), "Lax");
  EXPECT_FALSE(flags[1]->isSecure());
  EXPECT_EQ(flags[1]->sameSitePolicy(), "Strict");
}

}  // namespace
}  // namespace kivi
