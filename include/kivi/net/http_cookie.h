// HTTPCookie: one cookie: name, value, domain, path, expiry and flags, and
// the parser that reads cookies from the "Set-Cookie" field of an answer.
//
//   auto url = kivi::URL::URLWithString("https://www.example.com/app/login");
//   auto cookies = kivi::HTTPCookie::cookiesWithResponseHeaderFields(
//       {{"Set-Cookie", "sid=abc; Domain=example.com; Secure, lang=en"}}, *url);
//   cookies[0]->domain();   // ".example.com"
//   cookies[1]->domain();   // "www.example.com" (host-only)
//   cookies[1]->path();     // "/app"
//
// Thread contract: immutable; share freely between threads. The parser is a
// pure function and may run on any thread at once.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/net/url.h"
#include "kivi/net/url_request.h"

namespace kivi {

// The keys under which cookie properties are listed in dictionaries.
inline constexpr const char* HTTPCookieName = "NSHTTPCookieName";
inline constexpr const char* HTTPCookieValue = "NSHTTPCookieValue";
inline constexpr const char* HTTPCookieDomain = "NSHTTPCookieDomain";

class HTTPCookie;
// A cookie, shared and immutable.
using HTTPCookiePtr = std::shared_ptr<const HTTPCookie>;

class KIVI_EXPORT HTTPCookie : public Object {
 public:
  // What a cookie is made of, as cookieWithProperties takes it.
  struct Properties {
    std::string name;        // not empty
    std::string value;       // may be empty
    std::string domain;      // may start with "." (the cookie applies to subdomains)
    std::string path = "/";  // the cookie goes with requests for this path and those under it
    std::optional<Date> expiresDate;            // none: a session cookie
    bool secure = false;                        // sent over HTTPS only
    bool HTTPOnly = false;                      // kept from scripts: sent with requests only
    std::optional<std::string> sameSitePolicy;  // "Lax", "Strict", "None"
    friend bool operator==(const Properties&, const Properties&) = default;
  };

  // Null when the name is empty or the name, value, domain or path hold a
  // character a cookie cannot carry (CR, LF, NUL; ";" in name, domain or
  // path; "=" in the name).
  static HTTPCookiePtr cookieWithProperties(Properties properties);

  // The cookies that the "Set-Cookie" fields of `headerFields` (the name in
  // any letter case) set for a request to `url`, in the order they appear.
  // One field may hold several cookies separated by commas; a comma that
  // follows the weekday of an Expires date belongs to the date.
  //
  // Each cookie follows RFC 6265 section 5.2 (attribute names in any case,
  // the last of an attribute wins, Max-Age before Expires, a Max-Age of 0 or
  // less gives the expiry 1970-01-01), with these outcomes:
  //   - no Domain attribute: a host-only cookie whose domain is the URL's
  //     host, lowercased;
  //   - Domain=d: the domain is "." + d (lowercased, one leading dot
  //     dropped), and the cookie is left out unless the host domain-matches
  //     d (equal, or a name under d; an IP address only equal);
  //   - Domain=d where d is a single label ("org", "localhost"; a trailing
  //     dot aside): left out, so that no host sets a cookie for a whole
  //     top-level domain, unless the host is d itself ("localhost" setting
  //     Domain=localhost), which gets a host-only cookie;
  //   - no Path attribute, or one not starting with "/": the directory of
  //     the URL's path as written, percent-encoded ("/" for "/x", "/a" for
  //     "/a/b");
  //   - Expires: read as RFC 6265 section 5.1.1 reads dates, so the usual
  //     forms ("Wed, 21 Oct 2015 07:28:00 GMT", "Wednesday, 21-Oct-15 …",
  //     "Wed Oct 21 07:28:00 2015") all work; always UTC;
  //   - SameSite: "Lax", "Strict" or "None" in any case, written thus; other
  //     values are ignored;
  //   - a text without "=" before its first ";", an empty name, or a name
  //     or value that a cookie cannot carry (see cookieWithProperties) gives
  //     no cookie; neither does a URL without a host.
  // Unparsable attribute values (a date that is not one, a Max-Age that is
  // not a number) are ignored. The public suffix list is not consulted:
  // "a.co.uk" may still set Domain=co.uk.
  static std::vector<HTTPCookiePtr> cookiesWithResponseHeaderFields(
      const StringDictionary& headerFields, const URL& url);

  // The properties the cookie was made with (see Properties).
  const std::string& name() const noexcept { return p_.name; }
  const std::string& value() const noexcept { return p_.value; }
  const std::string& domain() const noexcept { return p_.domain; }
  const std::string& path() const noexcept { return p_.path; }
  const std::optional<Date>& expiresDate() const noexcept { return p_.expiresDate; }
  bool isSecure() const noexcept { return p_.secure; }
  bool isHTTPOnly() const noexcept { return p_.HTTPOnly; }
  // True when the cookie has no expiry date: it lasts until the session ends.
  bool isSessionOnly() const noexcept { return !p_.expiresDate; }
  // The SameSite policy ("Lax", "Strict", "None"), none when not set; and all properties at once.
  const std::optional<std::string>& sameSitePolicy() const noexcept { return p_.sameSitePolicy; }
  const Properties& properties() const noexcept { return p_; }

  std::string className() const override { return "NSHTTPCookie"; }
  std::string description() const override;

  // All properties equal.
  friend bool operator==(const HTTPCookie& a, const HTTPCookie& b) noexcept { return a.p_ == b.p_; }

  // Takes the properties unchecked; cookieWithProperties refuses those a cookie cannot carry.
  explicit HTTPCookie(Properties properties) : p_(std::move(properties)) {}

 private:
  Properties p_;
};

}  // namespace kivi
