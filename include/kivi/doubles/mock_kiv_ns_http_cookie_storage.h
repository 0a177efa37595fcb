// MockKivNSHTTPCookieStorage: a KivNSHTTPCookieStorageProtocol that keeps
// its cookies in a list, internalCookies (empty at first, replaceable as a
// whole):
//   - setCookie() appends, even a cookie equal to one already there;
//   - deleteCookie() removes every cookie equal to the given one (all
//     properties equal);
//   - cookies() answers a copy of the list, in the order of insertion;
//   - cookieAcceptPolicy is a stored value (Always at first).
// cookiesForURL(), removeCookiesSinceDate() and setCookies() leave the list
// alone and go to their callbacks (nothing, or an empty list, without).
//
//   auto jar = std::make_shared<kivi::MockKivNSHTTPCookieStorage>();
//   jar->internalCookies = {sessionCookie};
//   logout.run(jar);
//   EXPECT_TRUE(jar->cookies().empty());
//
// Thread contract: none; not synchronised. Callbacks run synchronously on
// the calling thread; set them before handing the double out.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_http_cookie_storage_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSHTTPCookieStorage : public Object,
                                               public KivNSHTTPCookieStorageProtocol {
 public:
  MockKivNSHTTPCookieStorage() = default;

  // Answers cookiesForURL(url); without it, an empty list.
  std::function<std::vector<HTTPCookiePtr>(const URLPtr&)> cookiesForURLBlock;
  // Called by removeCookiesSinceDate(date); without it nothing is removed.
  std::function<void(Date)> removeCookiesSinceDateBlock;
  // Called by setCookies(cookies, url, mainDocumentURL); without it nothing is stored.
  std::function<void(const std::vector<HTTPCookiePtr>&, const URLPtr&, const URLPtr&)>
      setCookiesWithMainDocumentURLBlock;
  // The stored cookies, in the order of insertion.
  std::vector<HTTPCookiePtr> internalCookies;

  std::string description() const override { return Object::description(); }

  // Appends `cookie` to internalCookies, even when an equal one is there.
  void setCookie(const HTTPCookiePtr& cookie) override { internalCookies.push_back(cookie); }
  // Removes from internalCookies every cookie equal to `cookie`.
  void deleteCookie(const HTTPCookiePtr& cookie) override;
  // Goes to setCookiesWithMainDocumentURLBlock; internalCookies stay as they are.
  void setCookies(const std::vector<HTTPCookiePtr>& cookies, const URLPtr& url,
                  const URLPtr& mainDocumentURL) override {
    if (setCookiesWithMainDocumentURLBlock) {
      setCookiesWithMainDocumentURLBlock(cookies, url, mainDocumentURL);
    }
  }
  std::vector<HTTPCookiePtr> cookiesForURL(const URLPtr& url) override {
    if (cookiesForURLBlock) return cookiesForURLBlock(url);
    return {};
  }
  void removeCookiesSinceDate(Date date) override {
    if (removeCookiesSinceDateBlock) removeCookiesSinceDateBlock(date);
  }
  std::vector<HTTPCookiePtr> cookies() const override { return internalCookies; }
  NSHTTPCookieAcceptPolicy cookieAcceptPolicy() const override { return cookieAcceptPolicy_; }
  void setCookieAcceptPolicy(NSHTTPCookieAcceptPolicy policy) override {
    cookieAcceptPolicy_ = policy;
  }

 private:
  NSHTTPCookieAcceptPolicy cookieAcceptPolicy_ = NSHTTPCookieAcceptPolicyAlways;
};

}  // namespace kivi
