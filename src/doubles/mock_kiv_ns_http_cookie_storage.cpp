#include "kivi/doubles/mock_kiv_ns_http_cookie_storage.h"

#include <algorithm>

namespace kivi {

void MockKivNSHTTPCookieStorage::deleteCookie(const HTTPCookiePtr& cookie) {
  std::erase_if(internalCookies, [&](const HTTPCookiePtr& kept) {
    if (!kept || !cookie) return kept == cookie;
    return *kept == *cookie;
  });
}

}  // namespace kivi
