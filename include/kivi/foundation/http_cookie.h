// HTTPCookie: one cookie: name, value, domain, path, expiry and flags.
//
// Thread contract: immutable; share freely between threads.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "kivi/foundation/object.h"
#include "kivi/foundation/value.h"

namespace kivi {

class HTTPCookie;
using HTTPCookiePtr = std::shared_ptr<const HTTPCookie>;

class HTTPCookie : public Object {
 public:
  struct Properties {
    std::string name;
    std::string value;
    std::string domain;  // may start with "." (the cookie applies to subdomains)
    std::string path = "/";
    std::optional<Date> expiresDate;  // none: a session cookie
    bool secure = false;
    bool HTTPOnly = false;
    std::optional<std::string> sameSitePolicy;  // "Lax", "Strict", "None"
    friend bool operator==(const Properties&, const Properties&) = default;
  };

  // Null when the name is empty or the name, value, domain or path hold a
  // character a cookie cannot carry (CR, LF, NUL; ";" in name, domain or
  // path; "=" in the name).
  static HTTPCookiePtr cookieWithProperties(Properties properties);

  const std::string& name() const noexcept { return p_.name; }
  const std::string& value() const noexcept { return p_.value; }
  const std::string& domain() const noexcept { return p_.domain; }
  const std::string& path() const noexcept { return p_.path; }
  const std::optional<Date>& expiresDate() const noexcept { return p_.expiresDate; }
  bool isSecure() const noexcept { return p_.secure; }
  bool isHTTPOnly() const noexcept { return p_.HTTPOnly; }
  bool isSessionOnly() const noexcept { return !p_.expiresDate; }
  const std::optional<std::string>& sameSitePolicy() const noexcept { return p_.sameSitePolicy; }
  const Properties& properties() const noexcept { return p_; }

  std::string className() const override { return "NSHTTPCookie"; }
  std::string description() const override;

  // All properties equal.
  friend bool operator==(const HTTPCookie& a, const HTTPCookie& b) noexcept { return a.p_ == b.p_; }

  explicit HTTPCookie(Properties properties) : p_(std::move(properties)) {}

 private:
  Properties p_;
};

}  // namespace kivi
