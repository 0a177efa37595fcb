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

using NSHTTPCookieAcceptPolicy = std::uint64_t;
inline constexpr NSHTTPCookieAcceptPolicy NSHTTPCookieAcceptPolicyAlways = 0;
inline constexpr NSHTTPCookieAcceptPolicy NSHTTPCookieAcceptPolicyNever = 1;
inline constexpr NSHTTPCookieAcceptPolicy NSHTTPCookieAcceptPolicyOnlyFromMainDocumentDomain = 2;

class KIVI_EXPORT KivNSHTTPCookieStorageProtocol {
 public:
  virtual ~KivNSHTTPCookieStorageProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  virtual void setCookie(const HTTPCookiePtr& cookie) = 0;
  virtual void deleteCookie(const HTTPCookiePtr& cookie) = 0;
  virtual void setCookies(const std::vector<HTTPCookiePtr>& cookies, const URLPtr& url,
                          const URLPtr& mainDocumentURL) = 0;
  virtual std::vector<HTTPCookiePtr> cookiesForURL(const URLPtr& url) = 0;
  virtual void removeCookiesSinceDate(Date date) = 0;
  virtual std::vector<HTTPCookiePtr> cookies() const = 0;
  virtual NSHTTPCookieAcceptPolicy cookieAcceptPolicy() const = 0;
  virtual void setCookieAcceptPolicy(NSHTTPCookieAcceptPolicy policy) = 0;
};

}  // namespace kivi
