// Small helpers around URLs, requests and cookies that clients of the
// library's network layer keep needing:
//
//   KiviOSSdkUtils::addQueryItems    appends query items to URL components
//   getQueryItemsDictionary          a query string as a name -> value map
//   CustomHeaders::setHeaders        sets several header fields on a request
//   KivURL                           a URL that refuses text needing encoding
//   HTTPCookieUtils::filterCookies   the cookies belonging to some domains
//   HTTPCookieUtils::cookiesForLogging  cookies with their values masked
//
//   auto components = *kivi::URLComponents::fromString("https://api.example.com/v1/items");
//   kivi::KiviOSSdkUtils::addQueryItems(components, {{"page", "2"}, {"q", "a&b"}});
//   components.string();   // "https://api.example.com/v1/items?page=2&q=a%26b"
//
//   kivi::getQueryItemsDictionary("a=1&b=&c");   // {"a": "1", "b": ""}
//
//   kivi::MutableURLRequest request(kivi::KivURL::initWithString("https://example.com/"));
//   kivi::CustomHeaders::setHeaders(request, kivi::StringDictionary{{"Accept", "text/plain"}});
//
//   auto mine = kivi::HTTPCookieUtils::filterCookies(cookies, {"example.com"});
//   auto records = kivi::HTTPCookieUtils::cookiesForLogging(mine);
//
// Thread contract: all of these are pure functions of their arguments, safe to
// call from any thread. addQueryItems and setHeaders change only the object
// they are given, without synchronisation: that object must not be used by
// another thread meanwhile.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/export.h"
#include "kivi/net/http_cookie.h"
#include "kivi/net/url.h"
#include "kivi/net/url_components.h"
#include "kivi/net/url_request.h"

namespace kivi {

namespace KiviOSSdkUtils {
// Appends `items` to the query items of `components`, in order, keeping the
// existing ones as they are written (names are never merged; an existing
// value that does not decode keeps its text). An empty `items` changes
// nothing, not even an empty query.
KIVI_EXPORT void addQueryItems(URLComponents& components, const std::vector<URLQueryItem>& items);
}  // namespace KiviOSSdkUtils

// The items of `queryString` (the text after "?") that have a value (an empty
// one counts; a bare name does not, nor does a value whose decoded bytes are
// not UTF-8), decoded; "+" stays "+"; a name that is not UTF-8 decoded is
// listed as "". A name given more than once keeps its last value. Empty when
// the text is not a query.
KIVI_EXPORT std::map<std::string, std::string> getQueryItemsDictionary(
    std::string_view queryString);

namespace CustomHeaders {
// Sets each header field of `headers` on `request`, replacing a value set
// earlier under the same name in any letter case; other fields stay. None
// changes nothing.
KIVI_EXPORT void setHeaders(MutableURLRequest& request,
                            const std::optional<StringDictionary>& headers);
}  // namespace CustomHeaders

// A URL made from text that is already a valid URL reference: unlike
// URL::URLWithString, nothing is percent-encoded, so text holding a space or
// a non-ASCII character gives null.
class KIVI_EXPORT KivURL : public URL {
 public:
  // The URL of `string` as it stands, or null when it is not a valid URL reference.
  static std::shared_ptr<const KivURL> initWithString(std::string_view string);
  // Null for none; otherwise initWithString().
  static std::shared_ptr<const KivURL> URLWithString(const std::optional<std::string>& string);

  std::string className() const override { return "KivURL"; }

 private:
  explicit KivURL(std::string string) : URL(std::move(string)) {}
};

// Cookie lists: filtering by domain, and a form that is safe to log.
class KIVI_EXPORT HTTPCookieUtils {
 public:
  // The cookies, in their order, whose domain (lowercased, without leading
  // and trailing dots) ends with one of `domains` (lowercased). This is a
  // plain suffix test: "example.com" also keeps "myexample.com", and a
  // leading dot in `domains` (".example.com") keeps subdomains only. An empty
  // string in `domains` keeps every cookie. Lowercasing follows Unicode, so
  // internationalised domains compare as expected.
  static std::vector<HTTPCookiePtr> filterCookies(const std::vector<HTTPCookiePtr>& cookies,
                                                  const std::vector<std::string>& domains);

  // One record per cookie, in order, safe to log: exactly the entries
  // HTTPCookieName (the name), HTTPCookieValue ("***", or "" for an empty
  // value) and HTTPCookieDomain (the domain). Null pointers are skipped.
  static std::vector<Dictionary> cookiesForLogging(const std::vector<HTTPCookiePtr>& cookies);
};

}  // namespace kivi
