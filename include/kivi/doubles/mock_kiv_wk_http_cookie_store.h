// MockKivWKHTTPCookieStore: a scriptable KivWKHTTPCookieStoreProtocol.
//
// getAllCookies() calls its completion at once with availableCookies, or
// with an empty list while that is unset, and does nothing when the
// completion is null. setCookie() hands the cookie and its completion to
// setCookiesWithCompletionHandlerBlock; without it nothing is stored and the
// completion is not called.
//
//   auto store = std::make_shared<kivi::MockKivWKHTTPCookieStore>();
//   store->availableCookies = std::vector<kivi::HTTPCookiePtr>{sessionCookie};
//   webLogin.syncCookies(store);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/platform/kiv_wk_http_cookie_store_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivWKHTTPCookieStore : public Object, public KivWKHTTPCookieStoreProtocol {
 public:
  MockKivWKHTTPCookieStore() = default;

  // Called by setCookie(cookie, completionHandler); without it nothing is stored and the completion
  // is never called.
  std::function<void(const HTTPCookiePtr&, std::function<void()>)>
      setCookiesWithCompletionHandlerBlock;
  // What getAllCookies() hands its completion; nullopt: an empty list.
  std::optional<std::vector<HTTPCookiePtr>> availableCookies;

  std::string description() const override { return Object::description(); }

  void getAllCookies(
      std::function<void(const std::vector<HTTPCookiePtr>&)> completionHandler) override {
    if (!completionHandler) return;
    completionHandler(availableCookies ? *availableCookies : std::vector<HTTPCookiePtr>{});
  }
  void setCookie(const HTTPCookiePtr& cookie, std::function<void()> completionHandler) override {
    if (setCookiesWithCompletionHandlerBlock) {
      setCookiesWithCompletionHandlerBlock(cookie, std::move(completionHandler));
    }
  }
};

}  // namespace kivi
