// KivNSHTTPCookieStorageProtocol: a store of HTTP cookies, and its policy for
// accepting new ones.
//
// The library implements it only by its double, MockKivNSHTTPCookieStorage
// (which keeps its cookies in a list); a host implements it over its HTTP
// stack's cookie jar.
//
//   for (const auto& cookie : storage->cookies())
//     if (cookie->name() == "session") storage->deleteCookie(cookie);
//
// Thread contract: that of the implementation.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/net/http_cookie.h"

namespace kivi {

// Which cookies setCookies() accepts: all, none, or only those of the main
// document's domain.
using NSHTTPCookieAcceptPolicy = std::uint64_t;
inline constexpr NSHTTPCookieAcceptPolicy NSHTTPCookieAcceptPolicyAlways = 0;
inline constexpr NSHTTPCookieAcceptPolicy NSHTTPCookieAcceptPolicyNever = 1;
inline constexpr NSHTTPCookieAcceptPolicy NSHTTPCookieAcceptPolicyOnlyFromMainDocumentDomain = 2;

class KIVI_EXPORT KivNSHTTPCookieStorageProtocol {
 public:
  virtual ~KivNSHTTPCookieStorageProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Stores `cookie`, in place of a stored one with the same name, domain and
  // path.
  virtual void setCookie(const HTTPCookiePtr& cookie) = 0;
  // Removes `cookie` from the store.
  virtual void deleteCookie(const HTTPCookiePtr& cookie) = 0;
  // Stores the `cookies` a response from `url` set, as far as the accept
  // policy allows; `mainDocumentURL` is the page that made the request (null
  // for none).
  virtual void setCookies(const std::vector<HTTPCookiePtr>& cookies, const URLPtr& url,
                          const URLPtr& mainDocumentURL) = 0;
  // The stored cookies a request to `url` would send.
  virtual std::vector<HTTPCookiePtr> cookiesForURL(const URLPtr& url) = 0;
  // Removes the cookies stored since `date`.
  virtual void removeCookiesSinceDate(Date date) = 0;
  // Every stored cookie.
  virtual std::vector<HTTPCookiePtr> cookies() const = 0;
  // The policy setCookies() follows.
  virtual NSHTTPCookieAcceptPolicy cookieAcceptPolicy() const = 0;
  virtual void setCookieAcceptPolicy(NSHTTPCookieAcceptPolicy policy) = 0;
};

}  // namespace kivi
