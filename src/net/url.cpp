#include "kivi/net/url.h"

#include <utility>

#include "kivi/net/url_components.h"

namespace kivi {

namespace {

bool isHexDigit(char c) noexcept {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'F') || (c >= 'a' && c <= 'f');
}

// Bytes that no part of a URL may hold literally.
bool neverAllowed(unsigned char c) noexcept {
  if (c <= 0x20 || c >= 0x7F) return true;
  switch (c) {
    case '"':
    case '<':
    case '>':
    case '\\':
    case '^':
    case '`':
    case '{':
    case '|':
    case '}':
      return true;
    default:
      return false;
  }
}

// Percent-encodes the bytes of `text` that could never be valid in a URL,
// leaving its structure ("/", "?", the first "#", ...) alone. A "#" after the
// first belongs to the fragment's text, so it is encoded too.
std::string encodeInvalidCharacters(std::string_view text) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string out;
  out.reserve(text.size());
  bool inFragment = false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const auto c = static_cast<unsigned char>(text[i]);
    const bool strayPercent =
        c == '%' && !(i + 2 < text.size() && isHexDigit(text[i + 1]) && isHexDigit(text[i + 2]));
    const bool secondHash = c == '#' && std::exchange(inFragment, true);
    if (strayPercent || secondHash || neverAllowed(c)) {
      out += '%';
      out += kHex[c >> 4];
      out += kHex[c & 15];
    } else {
      out += static_cast<char>(c);
    }
  }
  return out;
}

// A component decoded; none when there is none or its bytes are not UTF-8.
std::optional<std::string> decoded(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return percent_encoding::decode(*text);
}

// The components of a URL's text, which always parses: the constructor is
// only given text that did.
URLComponents parts(const std::string& text) {
  if (auto components = URLComponents::fromString(text)) return std::move(*components);
  return URLComponents();
}

}  // namespace

URL::URL(std::string string) : string_(std::move(string)) {}

URLPtr URL::URLWithString(std::string_view string, bool encodingInvalidCharacters) {
  if (string.empty()) return nullptr;
  std::string text =
      encodingInvalidCharacters ? encodeInvalidCharacters(string) : std::string(string);
  if (!URLComponents::fromString(text)) return nullptr;
  return URLPtr(new URL(std::move(text)));
}

std::optional<std::string> URL::scheme() const { return parts(string_).scheme(); }

std::optional<std::string> URL::user() const {
  return decoded(parts(string_).percentEncodedUser());
}

std::optional<std::string> URL::password() const {
  return decoded(parts(string_).percentEncodedPassword());
}

std::optional<std::string> URL::host() const {
  auto host = parts(string_).percentEncodedHost();
  if (host && host->size() >= 2 && host->front() == '[') return host->substr(1, host->size() - 2);
  return decoded(host);
}

std::optional<std::int64_t> URL::port() const { return parts(string_).port(); }

std::optional<std::string> URL::path() const {
  return percent_encoding::decode(parts(string_).percentEncodedPath());
}

std::optional<std::string> URL::query() const { return parts(string_).percentEncodedQuery(); }

std::optional<std::string> URL::fragment() const { return parts(string_).percentEncodedFragment(); }

}  // namespace kivi
