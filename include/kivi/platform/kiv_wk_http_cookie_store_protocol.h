// KivWKHTTPCookieStoreProtocol: the cookie store of an embedded web view,
// whose operations complete asynchronously.
//
// The library implements it only by its double, MockKivWKHTTPCookieStore; a
// host implements it over its web view's cookie manager.
//
//   store->getAllCookies([](const std::vector<kivi::HTTPCookiePtr>& cookies) {
//     for (const auto& c : cookies) inspect(c);
//   });
//   store->setCookie(sessionCookie, [] { reload(); });
//
// Thread contract: that of the implementation; the web view's store is used
// on the main thread and completes there.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/net/http_cookie.h"

namespace kivi {

class KIVI_EXPORT KivWKHTTPCookieStoreProtocol {
 public:
  virtual ~KivWKHTTPCookieStoreProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Calls `completionHandler` with every cookie of the store.
  virtual void getAllCookies(
      std::function<void(const std::vector<HTTPCookiePtr>&)> completionHandler) = 0;
  // Stores `cookie`, in place of one with the same name, domain and path,
  // then calls `completionHandler` (null for none).
  virtual void setCookie(const HTTPCookiePtr& cookie, std::function<void()> completionHandler) = 0;
};

}  // namespace kivi
