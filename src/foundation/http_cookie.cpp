#include "kivi/foundation/http_cookie.h"

#include <cstdio>
#include <string_view>

namespace kivi {

namespace {

bool holdsAny(std::string_view text, std::string_view characters) {
  return text.find_first_of(characters) != std::string_view::npos;
}

// CR, LF and NUL end a header line or a C string; a cookie never carries them.
constexpr std::string_view kLineBreaking("\r\n\0", 3);

}  // namespace

HTTPCookiePtr HTTPCookie::cookieWithProperties(Properties properties) {
  const Properties& p = properties;
  if (p.name.empty() || holdsAny(p.name, kLineBreaking) || holdsAny(p.name, ";=") ||
      holdsAny(p.value, kLineBreaking) || holdsAny(p.domain, kLineBreaking) ||
      holdsAny(p.domain, ";") || holdsAny(p.path, kLineBreaking) || holdsAny(p.path, ";")) {
    return nullptr;
  }
  return std::make_shared<const HTTPCookie>(std::move(properties));
}

// The value is left out: descriptions end up in logs, and cookie values are
// often credentials.
std::string HTTPCookie::description() const {
  std::string out = "<NSHTTPCookie name=" + p_.name + "; domain=" + p_.domain + "; path=" + p_.path;
  if (p_.expiresDate) {
    char buf[48];
    std::snprintf(buf, sizeof buf, "; expires=%.3f", p_.expiresDate->timeIntervalSince1970);
    out += buf;
  } else {
    out += "; session";
  }
  if (p_.secure) out += "; secure";
  if (p_.HTTPOnly) out += "; HttpOnly";
  if (p_.sameSitePolicy) out += "; SameSite=" + *p_.sameSitePolicy;
  out += '>';
  return out;
}

}  // namespace kivi
