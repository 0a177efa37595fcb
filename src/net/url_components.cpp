#include "kivi/net/url_components.h"

#include <algorithm>
#include <limits>

#include "kivi/text/unicode_text.h"

namespace kivi {

namespace percent_encoding {
namespace {

constexpr int hexValue(char c) noexcept {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
}

constexpr bool isAlpha(char c) noexcept { return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z'); }
constexpr bool isDigit(char c) noexcept { return c >= '0' && c <= '9'; }
constexpr bool isHexDigit(char c) noexcept { return hexValue(c) >= 0; }

constexpr bool isUnreserved(char c) noexcept {
  return isAlpha(c) || isDigit(c) || c == '-' || c == '.' || c == '_' || c == '~';
}

constexpr bool isSubDelim(char c) noexcept {
  switch (c) {
    case '!':
    case '$':
    case '&':
    case '\'':
    case '(':
    case ')':
    case '*':
    case '+':
    case ',':
    case ';':
    case '=':
      return true;
    default:
      return false;
  }
}

constexpr bool isPchar(char c) noexcept {
  return isUnreserved(c) || isSubDelim(c) || c == ':' || c == '@';
}

// Whether `c` may appear literally in `component` (percent signs aside).
constexpr bool allowed(char c, Component component) noexcept {
  switch (component) {
    case Component::user:
    case Component::host:
      return isUnreserved(c) || isSubDelim(c);
    case Component::password:
      return isUnreserved(c) || isSubDelim(c) || c == ':';
    case Component::path:
      return isPchar(c) || c == '/';
    case Component::query:
    case Component::fragment:
      return isPchar(c) || c == '/' || c == '?';
    case Component::queryItem:
      return (isPchar(c) || c == '/' || c == '?') && c != '&' && c != '=' && c != '+';
  }
  return false;
}

// Whether text[i] starts a "%XX" sequence.
bool isPercentSequence(std::string_view text, std::size_t i) noexcept {
  return i + 2 < text.size() && text[i] == '%' && isHexDigit(text[i + 1]) &&
         isHexDigit(text[i + 2]);
}

// dec-octet "." dec-octet "." dec-octet "." dec-octet, without leading zeros.
bool isIPv4Address(std::string_view text) noexcept {
  int octets = 0;
  std::size_t i = 0;
  while (true) {
    std::size_t start = i;
    int value = 0;
    while (i < text.size() && isDigit(text[i]) && i - start < 3)
      value = value * 10 + (text[i++] - '0');
    const std::size_t length = i - start;
    if (length == 0 || value > 255 || (length > 1 && text[start] == '0')) return false;
    ++octets;
    if (i == text.size()) return octets == 4;
    if (text[i] != '.' || octets == 4) return false;
    ++i;
  }
}

// Counts the 16-bit groups of `part` (h16 separated by ":"; an IPv4 address
// as the last piece counts twice when `allowIPv4` holds). False when a piece
// is malformed.
bool countIPv6Groups(std::string_view part, bool allowIPv4, int& groups) {
  groups = 0;
  if (part.empty()) return true;
  while (true) {
    const std::size_t colon = part.find(':');
    const std::string_view piece = part.substr(0, colon);
    if (colon == std::string_view::npos && allowIPv4 && piece.find('.') != piece.npos) {
      if (!isIPv4Address(piece)) return false;
      groups += 2;
      return true;
    }
    if (piece.empty() || piece.size() > 4) return false;
    for (char c : piece) {
      if (!isHexDigit(c)) return false;
    }
    ++groups;
    if (colon == std::string_view::npos) return true;
    part.remove_prefix(colon + 1);
  }
}

bool isIPv6Address(std::string_view text) {
  const std::size_t elision = text.find("::");
  int left = 0;
  int right = 0;
  if (elision == std::string_view::npos) return countIPv6Groups(text, true, left) && left == 8;
  if (text.find("::", elision + 1) != std::string_view::npos) return false;
  return countIPv6Groups(text.substr(0, elision), false, left) &&
         countIPv6Groups(text.substr(elision + 2), true, right) && left + right <= 7;
}

// "v" 1*HEXDIG "." 1*( unreserved / sub-delims / ":" )
bool isIPvFuture(std::string_view text) noexcept {
  if (text.size() < 4 || (text[0] != 'v' && text[0] != 'V')) return false;
  std::size_t i = 1;
  while (i < text.size() && isHexDigit(text[i])) ++i;
  if (i == 1 || i >= text.size() || text[i] != '.' || i + 1 == text.size()) return false;
  for (++i; i < text.size(); ++i) {
    const char c = text[i];
    if (!isUnreserved(c) && !isSubDelim(c) && c != ':') return false;
  }
  return true;
}

// "[" ( IPv6address / IPvFuture ) "]"
bool isIPLiteral(std::string_view text) {
  if (text.size() < 2 || text.front() != '[' || text.back() != ']') return false;
  const std::string_view inside = text.substr(1, text.size() - 2);
  return isIPvFuture(inside) || isIPv6Address(inside);
}

}  // namespace

std::string encode(std::string_view text, Component component) {
  if (component == Component::host && isIPLiteral(text)) return std::string(text);
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    if (allowed(c, component)) {
      out += c;
    } else {
      const auto byte = static_cast<unsigned char>(c);
      out += '%';
      out += kHex[byte >> 4];
      out += kHex[byte & 15];
    }
  }
  return out;
}

std::optional<std::string> decode(std::string_view text) {
  auto out = decodeBytes(text);
  if (!out || !unicode::isValidUTF8(*out)) return std::nullopt;
  return out;
}

std::optional<std::string> decodeBytes(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '%') {
      out += text[i];
      continue;
    }
    if (!isPercentSequence(text, i)) return std::nullopt;
    out += static_cast<char>(hexValue(text[i + 1]) * 16 + hexValue(text[i + 2]));
    i += 2;
  }
  return out;
}

bool isValidlyEncoded(std::string_view text, Component component) {
  if (component == Component::host && isIPLiteral(text)) return true;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '%') {
      if (!isPercentSequence(text, i)) return false;
      i += 2;
    } else if (!allowed(text[i], component)) {
      return false;
    }
  }
  return true;
}

}  // namespace percent_encoding

namespace {

using percent_encoding::Component;
using percent_encoding::isValidlyEncoded;

// ALPHA *( ALPHA / DIGIT / "+" / "-" / "." )
bool isValidScheme(std::string_view scheme) noexcept {
  if (scheme.empty()) return false;
  for (std::size_t i = 0; i < scheme.size(); ++i) {
    const char c = scheme[i];
    const bool alpha = (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
    const bool more = (c >= '0' && c <= '9') || c == '+' || c == '-' || c == '.';
    if (!alpha && (i == 0 || !more)) return false;
  }
  return true;
}

// *DIGIT; none for an empty port; false when not digits or too large.
bool parsePort(std::string_view text, std::optional<std::int64_t>& port) {
  port.reset();
  if (text.empty()) return true;
  std::int64_t value = 0;
  for (char c : text) {
    if (c < '0' || c > '9') return false;
    const int digit = c - '0';
    if (value > (std::numeric_limits<std::int64_t>::max() - digit) / 10) return false;
    value = value * 10 + digit;
  }
  port = value;
  return true;
}

// A stored component decoded; none when there is none or its bytes are not
// UTF-8 (what is stored is always validly encoded).
std::optional<std::string> decoded(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return percent_encoding::decode(*text);
}

std::optional<std::string> encoded(const std::optional<std::string>& text, Component component) {
  if (!text) return std::nullopt;
  return percent_encoding::encode(*text, component);
}

}  // namespace

std::optional<URLComponents> URLComponents::fromString(std::string_view text) {
  URLComponents c;
  std::string_view rest = text;

  // A ":" before any "/", "?" or "#" ends a scheme; a relative reference may
  // not have one in its first segment.
  const std::size_t stop = rest.find_first_of(":/?#");
  if (stop != std::string_view::npos && rest[stop] == ':') {
    const std::string_view scheme = rest.substr(0, stop);
    if (!isValidScheme(scheme)) return std::nullopt;
    c.scheme_ = std::string(scheme);
    rest.remove_prefix(stop + 1);
  }

  if (const std::size_t hash = rest.find('#'); hash != std::string_view::npos) {
    const std::string_view fragment = rest.substr(hash + 1);
    if (!isValidlyEncoded(fragment, Component::fragment)) return std::nullopt;
    c.fragment_ = std::string(fragment);
    rest = rest.substr(0, hash);
  }
  if (const std::size_t question = rest.find('?'); question != std::string_view::npos) {
    const std::string_view query = rest.substr(question + 1);
    if (!isValidlyEncoded(query, Component::query)) return std::nullopt;
    c.query_ = std::string(query);
    rest = rest.substr(0, question);
  }

  if (rest.starts_with("//")) {
    rest.remove_prefix(2);
    const std::size_t slash = rest.find('/');
    std::string_view authority = rest.substr(0, slash);
    rest = slash == std::string_view::npos ? std::string_view() : rest.substr(slash);

    if (const std::size_t at = authority.rfind('@'); at != std::string_view::npos) {
      const std::string_view userinfo = authority.substr(0, at);
      authority.remove_prefix(at + 1);
      const std::size_t colon = userinfo.find(':');
      const std::string_view user = userinfo.substr(0, colon);
      if (!isValidlyEncoded(user, Component::user)) return std::nullopt;
      c.user_ = std::string(user);
      if (colon != std::string_view::npos) {
        const std::string_view password = userinfo.substr(colon + 1);
        if (!isValidlyEncoded(password, Component::password)) return std::nullopt;
        c.password_ = std::string(password);
      }
    }

    std::size_t hostEnd;
    if (authority.starts_with('[')) {
      hostEnd = authority.find(']');
      if (hostEnd == std::string_view::npos) return std::nullopt;
      ++hostEnd;
      if (!percent_encoding::isIPLiteral(authority.substr(0, hostEnd))) return std::nullopt;
    } else {
      hostEnd = std::min(authority.find(':'), authority.size());
      if (!isValidlyEncoded(authority.substr(0, hostEnd), Component::host)) return std::nullopt;
    }
    c.host_ = std::string(authority.substr(0, hostEnd));
    authority.remove_prefix(hostEnd);
    if (!authority.empty()) {
      if (authority.front() != ':' || !parsePort(authority.substr(1), c.port_)) return std::nullopt;
    }
  }

  if (!isValidlyEncoded(rest, Component::path)) return std::nullopt;
  c.path_ = std::string(rest);
  return c;
}

URLComponents URLComponents::fromURL(const URL& url) {
  // A URL only ever holds text that parses.
  return fromString(url.absoluteString()).value_or(URLComponents());
}

std::optional<std::string> URLComponents::user() const { return decoded(user_); }
std::optional<std::string> URLComponents::password() const { return decoded(password_); }
std::optional<std::string> URLComponents::host() const { return decoded(host_); }
std::optional<std::string> URLComponents::path() const { return percent_encoding::decode(path_); }
std::optional<std::string> URLComponents::query() const { return decoded(query_); }
std::optional<std::string> URLComponents::fragment() const { return decoded(fragment_); }

void URLComponents::setUser(const std::optional<std::string>& user) {
  user_ = encoded(user, Component::user);
}
void URLComponents::setPassword(const std::optional<std::string>& password) {
  password_ = encoded(password, Component::password);
}
void URLComponents::setHost(const std::optional<std::string>& host) {
  host_ = encoded(host, Component::host);
}
void URLComponents::setPath(const std::string& path) {
  path_ = percent_encoding::encode(path, Component::path);
}
void URLComponents::setQuery(const std::optional<std::string>& query) {
  query_ = encoded(query, Component::query);
}
void URLComponents::setFragment(const std::optional<std::string>& fragment) {
  fragment_ = encoded(fragment, Component::fragment);
}

namespace {

bool setIfValid(std::optional<std::string>& slot, std::optional<std::string> value,
                Component component) {
  if (value && !isValidlyEncoded(*value, component)) return false;
  slot = std::move(value);
  return true;
}

}  // namespace

bool URLComponents::setPercentEncodedUser(std::optional<std::string> user) {
  return setIfValid(user_, std::move(user), Component::user);
}
bool URLComponents::setPercentEncodedPassword(std::optional<std::string> password) {
  return setIfValid(password_, std::move(password), Component::password);
}
bool URLComponents::setPercentEncodedHost(std::optional<std::string> host) {
  return setIfValid(host_, std::move(host), Component::host);
}
bool URLComponents::setPercentEncodedPath(std::string path) {
  if (!isValidlyEncoded(path, Component::path)) return false;
  path_ = std::move(path);
  return true;
}
bool URLComponents::setPercentEncodedQuery(std::optional<std::string> query) {
  return setIfValid(query_, std::move(query), Component::query);
}
bool URLComponents::setPercentEncodedFragment(std::optional<std::string> fragment) {
  return setIfValid(fragment_, std::move(fragment), Component::fragment);
}

std::optional<std::vector<URLQueryItem>> URLComponents::queryItems() const {
  if (!query_) return std::nullopt;
  std::vector<URLQueryItem> items;
  if (query_->empty()) return items;
  std::string_view rest = *query_;
  while (true) {
    const std::size_t amp = rest.find('&');
    const std::string_view piece = rest.substr(0, amp);
    const std::size_t equals = piece.find('=');
    URLQueryItem item;
    item.name = percent_encoding::decode(piece.substr(0, equals)).value_or("");
    if (equals != std::string_view::npos) {
      item.value = percent_encoding::decode(piece.substr(equals + 1));
    }
    items.push_back(std::move(item));
    if (amp == std::string_view::npos) break;
    rest.remove_prefix(amp + 1);
  }
  return items;
}

void URLComponents::setQueryItems(const std::optional<std::vector<URLQueryItem>>& items) {
  if (!items) {
    query_.reset();
    return;
  }
  std::string query;
  for (std::size_t i = 0; i < items->size(); ++i) {
    const URLQueryItem& item = (*items)[i];
    if (i) query += '&';
    query += percent_encoding::encode(item.name, Component::queryItem);
    if (item.value) {
      query += '=';
      query += percent_encoding::encode(*item.value, Component::queryItem);
    }
  }
  query_ = std::move(query);
}

std::optional<std::string> URLComponents::string() const {
  if (scheme_ && !isValidScheme(*scheme_)) return std::nullopt;
  if (port_ && *port_ < 0) return std::nullopt;
  std::string out;
  if (scheme_) {
    out += *scheme_;
    out += ':';
  }
  if (host_) {
    if (!path_.empty() && path_.front() != '/') return std::nullopt;
    out += "//";
    if (user_ || password_) {
      out += user_.value_or("");
      if (password_) {
        out += ':';
        out += *password_;
      }
      out += '@';
    }
    out += *host_;
    if (port_) {
      out += ':';
      out += std::to_string(*port_);
    }
  } else {
    if (path_.starts_with("//")) return std::nullopt;
    if (!scheme_ && path_.substr(0, path_.find('/')).find(':') != std::string::npos) {
      return std::nullopt;
    }
  }
  out += path_;
  if (query_) {
    out += '?';
    out += *query_;
  }
  if (fragment_) {
    out += '#';
    out += *fragment_;
  }
  return out;
}

URLPtr URLComponents::url() const {
  auto text = string();
  if (!text) return nullptr;
  return URL::URLWithString(*text, false);
}

}  // namespace kivi
