#include "kivi/net/http_cookie.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <string_view>

#include "kivi/net/url_components.h"
#include "kivi/text/unicode_text.h"

namespace kivi {

namespace {

bool holdsAny(std::string_view text, std::string_view characters) {
  return text.find_first_of(characters) != std::string_view::npos;
}

// CR, LF and NUL end a header line or a C string; a cookie never carries them.
constexpr std::string_view kLineBreaking("\r\n\0", 3);

constexpr bool isDigit(char c) noexcept { return c >= '0' && c <= '9'; }
constexpr bool isAsciiLetter(char c) noexcept {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
}

// Without the blanks and tabs around it.
std::string_view trimmed(std::string_view s) noexcept {
  const std::size_t first = s.find_first_not_of(" \t");
  if (first == std::string_view::npos) return {};
  return s.substr(first, s.find_last_not_of(" \t") - first + 1);
}

bool named(std::string_view attribute, std::string_view name) {
  return unicode::caseInsensitiveEquals(attribute, name);
}

// --- Cookie dates (RFC 6265 section 5.1.1) ---------------------------------

constexpr bool isDateDelimiter(unsigned char c) noexcept {
  return c == 0x09 || (c >= 0x20 && c <= 0x2F) || (c >= 0x3B && c <= 0x40) ||
         (c >= 0x5B && c <= 0x60) || (c >= 0x7B && c <= 0x7E);
}

// A token starting with `min` to `max` digits (anything else may follow
// them, but not a further digit).
bool leadingNumber(std::string_view token, std::size_t min, std::size_t max, int& value) {
  std::size_t n = 0;
  while (n < token.size() && isDigit(token[n])) ++n;
  if (n < min || n > max) return false;
  value = 0;
  for (std::size_t i = 0; i < n; ++i) value = value * 10 + (token[i] - '0');
  return true;
}

// "h:m:s", each field one or two digits, then anything but a digit.
bool timeOfDay(std::string_view token, int (&hms)[3]) {
  int fields[3] = {0, 0, 0};
  std::size_t i = 0;
  for (int& field : fields) {
    if (&field != fields && (i >= token.size() || token[i++] != ':')) return false;
    const std::size_t start = i;
    while (i < token.size() && i - start < 2 && isDigit(token[i])) {
      field = field * 10 + (token[i++] - '0');
    }
    if (i == start) return false;
  }
  if (i < token.size() && isDigit(token[i])) return false;
  std::copy(fields, fields + 3, hms);
  return true;
}

int monthOf(std::string_view token) {
  static constexpr std::string_view kMonths[] = {"jan", "feb", "mar", "apr", "may", "jun",
                                                 "jul", "aug", "sep", "oct", "nov", "dec"};
  if (token.size() < 3) return 0;
  char prefix[3];
  for (int i = 0; i < 3; ++i) {
    const char c = token[i];
    prefix[i] = c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c;
  }
  for (int m = 0; m < 12; ++m) {
    if (kMonths[m] == std::string_view(prefix, 3)) return m + 1;
  }
  return 0;
}

// The tolerant date reader of cookie user agents: the first token that looks
// like a time, a day of the month, a month and a year each fills that field,
// whatever the order and the separators.
std::optional<Date> parseCookieDate(std::string_view text) {
  int hms[3] = {-1, -1, -1};
  int day = -1, month = 0, year = -1;
  for (std::size_t i = 0; i < text.size();) {
    while (i < text.size() && isDateDelimiter(static_cast<unsigned char>(text[i]))) ++i;
    const std::size_t start = i;
    while (i < text.size() && !isDateDelimiter(static_cast<unsigned char>(text[i]))) ++i;
    const std::string_view token = text.substr(start, i - start);
    if (token.empty()) continue;
    if (hms[0] < 0 && timeOfDay(token, hms)) continue;
    if (day < 0 && leadingNumber(token, 1, 2, day)) continue;
    if (month == 0 && (month = monthOf(token)) != 0) continue;
    if (year < 0) leadingNumber(token, 2, 4, year);
  }
  if (year >= 70 && year <= 99) year += 1900;
  if (year >= 0 && year <= 69) year += 2000;
  if (hms[0] < 0 || day < 1 || month == 0 || year < 1601 || hms[0] > 23 || hms[1] > 59 ||
      hms[2] > 59) {
    return std::nullopt;
  }
  using namespace std::chrono;
  const year_month_day date{std::chrono::year(year), std::chrono::month(month),
                            std::chrono::day(day)};
  if (!date.ok()) return std::nullopt;
  const double dayCount = sys_days(date).time_since_epoch().count();
  return Date{dayCount * 86400 + hms[0] * 3600 + hms[1] * 60 + hms[2]};
}

// --- Set-Cookie fields -----------------------------------------------------

// Whether the attribute text before a comma is "Expires=" and a weekday name:
// "Expires=Wed, 09 Jun 2021 10:18:14 GMT" must not be split at its comma.
bool isExpiresWeekday(std::string_view attribute) {
  const std::size_t equals = attribute.find('=');
  if (equals == std::string_view::npos || !named(trimmed(attribute.substr(0, equals)), "expires")) {
    return false;
  }
  const std::string_view weekday = trimmed(attribute.substr(equals + 1));
  return !weekday.empty() && std::all_of(weekday.begin(), weekday.end(), isAsciiLetter);
}

// One field may set several cookies, separated by commas.
std::vector<std::string_view> splitCookies(std::string_view field) {
  std::vector<std::string_view> pieces;
  std::size_t start = 0;
  std::size_t attribute = std::string_view::npos;  // start of the current attribute, if any
  for (std::size_t i = 0; i < field.size(); ++i) {
    if (field[i] == ';') {
      attribute = i + 1;
    } else if (field[i] == ',' && !(attribute != std::string_view::npos &&
                                    isExpiresWeekday(field.substr(attribute, i - attribute)))) {
      pieces.push_back(field.substr(start, i - start));
      start = i + 1;
      attribute = std::string_view::npos;
    }
  }
  pieces.push_back(field.substr(start));
  return pieces;
}

// Whether `host` domain-matches `domain` (RFC 6265 section 5.1.3).
bool domainMatches(std::string_view host, std::string_view domain) {
  if (host == domain) return true;
  const bool ipAddress =
      host.find(':') != std::string_view::npos ||
      std::all_of(host.begin(), host.end(), [](char c) { return isDigit(c) || c == '.'; });
  return !ipAddress && host.size() > domain.size() && host.ends_with(domain) &&
         host[host.size() - domain.size() - 1] == '.';
}

// Whether `domain` is a single label ("org", "localhost", "org." with the
// root's dot): a top-level domain or a name of the local network, never a
// registrable domain.
bool isSingleLabel(std::string_view domain) {
  if (domain.ends_with('.')) domain.remove_suffix(1);
  return domain.find('.') == std::string_view::npos;
}

// The directory of a request path (RFC 6265 section 5.1.4).
std::string defaultPath(std::string_view path) {
  const std::size_t slash = path.rfind('/');
  if (path.empty() || path.front() != '/' || slash == 0) return "/";
  return std::string(path.substr(0, slash));
}

// Max-Age: an optional "-" and digits; the expiry it gives.
std::optional<Date> maxAgeExpiry(std::string_view value, double now) {
  const bool negative = value.starts_with('-');
  const std::string_view digits = value.substr(negative ? 1 : 0);
  if (digits.empty() || !std::all_of(digits.begin(), digits.end(), isDigit)) return std::nullopt;
  double seconds = 0;
  for (char c : digits) seconds = std::min(seconds * 10 + (c - '0'), 1e18);
  if (negative || seconds == 0) return Date{0};
  return Date{now + seconds};
}

struct RequestFacts {
  std::string host;  // lowercased
  std::string defaultPath;
  double now;
};

HTTPCookiePtr parseCookie(std::string_view text, const RequestFacts& request) {
  const std::size_t semicolon = text.find(';');
  const std::string_view pair = text.substr(0, semicolon);
  const std::size_t equals = pair.find('=');
  if (equals == std::string_view::npos) return nullptr;

  HTTPCookie::Properties p;
  p.name = trimmed(pair.substr(0, equals));
  p.value = trimmed(pair.substr(equals + 1));
  p.path = request.defaultPath;
  std::optional<Date> expires, maxAge;
  std::string domain;  // empty: host-only

  std::string_view rest = semicolon == std::string_view::npos ? "" : text.substr(semicolon + 1);
  while (!rest.empty()) {
    const std::size_t end = rest.find(';');
    const std::string_view attribute = rest.substr(0, end);
    rest = end == std::string_view::npos ? "" : rest.substr(end + 1);
    const std::size_t eq = attribute.find('=');
    const std::string_view name = trimmed(attribute.substr(0, eq));
    const std::string_view value =
        eq == std::string_view::npos ? std::string_view() : trimmed(attribute.substr(eq + 1));
    if (named(name, "expires")) {
      if (auto date = parseCookieDate(value)) expires = date;
    } else if (named(name, "max-age")) {
      if (auto date = maxAgeExpiry(value, request.now)) maxAge = date;
    } else if (named(name, "domain")) {
      if (!value.empty()) domain = unicode::toLower(value.substr(value.front() == '.' ? 1 : 0));
    } else if (named(name, "path")) {
      p.path = value.starts_with('/') ? std::string(value) : request.defaultPath;
    } else if (named(name, "secure")) {
      p.secure = true;
    } else if (named(name, "httponly")) {
      p.HTTPOnly = true;
    } else if (named(name, "samesite")) {
      for (const char* policy : {"Lax", "Strict", "None"}) {
        if (named(value, policy)) p.sameSitePolicy = policy;
      }
    }
  }

  // A single-label Domain would reach every host under it: it is taken only
  // from that very host, and then sets a host-only cookie.
  if (domain.empty() || (domain == request.host && isSingleLabel(domain))) {
    p.domain = request.host;
  } else if (domainMatches(request.host, domain) && !isSingleLabel(domain)) {
    p.domain = "." + domain;
  } else {
    return nullptr;
  }
  p.expiresDate = maxAge ? maxAge : expires;
  return HTTPCookie::cookieWithProperties(std::move(p));
}

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

std::vector<HTTPCookiePtr> HTTPCookie::cookiesWithResponseHeaderFields(
    const StringDictionary& headerFields, const URL& url) {
  std::vector<HTTPCookiePtr> cookies;
  const std::optional<std::string> host = url.host();
  if (!host || host->empty()) return cookies;
  const RequestFacts request{
      unicode::toLower(*host), defaultPath(URLComponents::fromURL(url).percentEncodedPath()),
      std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count()};
  for (const auto& field : headerFields) {
    if (!headerFieldNamesEqual(field.first, "Set-Cookie")) continue;
    for (std::string_view text : splitCookies(field.second)) {
      if (auto cookie = parseCookie(text, request)) cookies.push_back(std::move(cookie));
    }
  }
  return cookies;
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
