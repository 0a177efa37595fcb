// URLComponents: a mutable decomposition of a URL into scheme, user,
// password, host, port, path, query and fragment, and the query into items.
//
// Each component can be read and written decoded (user(), setHost(), …) or
// percent-encoded (percentEncodedUser(), setPercentEncodedHost(), …). "%XX"
// takes hex digits in either case. A component whose decoded bytes are not
// UTF-8 ("%E9" alone) is absent decoded but stays readable encoded. Decoded
// values are encoded, when text is produced, with the component's own allowed
// character set: the URL user, password, host, path, query and fragment
// allowed sets of RFC 3986. Query item names and values are additionally
// encoded where "&", "=", "+" and "#" would change the query's meaning, so
// any UTF-8 name and value come back unchanged through queryItems(). An
// IP-literal host keeps its brackets here ("[::1]"), encoded or not.
//
//   auto c = kivi::URLComponents::fromString("https://h/p?a=1");
//   auto items = c->queryItems().value_or(std::vector<kivi::URLQueryItem>{});
//   items.push_back({"q", "x&y"});
//   c->setQueryItems(items);
//   c->string();   // "https://h/p?a=1&q=x%26y"
//
// Thread contract: a value type; not synchronised.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/export.h"
#include "kivi/net/url.h"

namespace kivi {

// One name=value item of a query.
struct KIVI_EXPORT URLQueryItem {
  std::string name;                  // decoded
  std::optional<std::string> value;  // decoded; absent: a bare name without "="
  friend bool operator==(const URLQueryItem&, const URLQueryItem&) = default;
};

// A URL taken apart into components that can be read and changed one by one.
class KIVI_EXPORT URLComponents {
 public:
  URLComponents() = default;

  // Parses a URL reference; none when the text is not one (no encoding of
  // invalid characters is attempted).
  static std::optional<URLComponents> fromString(std::string_view string);
  // The components of `url`, without resolving it against a base URL.
  static URLComponents fromURL(const URL& url);

  // Decoded components; absent when there is none or its decoded bytes are
  // not UTF-8 (the path is "" when the text has none).
  std::optional<std::string> scheme() const { return scheme_; }
  std::optional<std::string> user() const;
  std::optional<std::string> password() const;
  std::optional<std::string> host() const;
  std::optional<std::int64_t> port() const { return port_; }
  std::optional<std::string> path() const;
  std::optional<std::string> query() const;
  std::optional<std::string> fragment() const;

  // Set decoded components, encoded as each component needs; none removes one. The scheme and
  // port are taken as given: string() refuses a scheme that is not one or a negative port.
  void setScheme(std::optional<std::string> scheme) { scheme_ = std::move(scheme); }
  void setUser(const std::optional<std::string>& user);
  void setPassword(const std::optional<std::string>& password);
  void setHost(const std::optional<std::string>& host);
  void setPort(std::optional<std::int64_t> port) { port_ = port; }
  void setPath(const std::string& path);
  void setQuery(const std::optional<std::string>& query);
  void setFragment(const std::optional<std::string>& fragment);

  // Percent-encoded components, as they appear in the text.
  const std::optional<std::string>& percentEncodedUser() const { return user_; }
  const std::optional<std::string>& percentEncodedPassword() const { return password_; }
  const std::optional<std::string>& percentEncodedHost() const { return host_; }
  const std::string& percentEncodedPath() const { return path_; }
  const std::optional<std::string>& percentEncodedQuery() const { return query_; }
  const std::optional<std::string>& percentEncodedFragment() const { return fragment_; }
  // The setters refuse (return false, change nothing) text that is not
  // validly encoded for the component.
  bool setPercentEncodedUser(std::optional<std::string> user);
  bool setPercentEncodedPassword(std::optional<std::string> password);
  bool setPercentEncodedHost(std::optional<std::string> host);
  bool setPercentEncodedPath(std::string path);
  bool setPercentEncodedQuery(std::optional<std::string> query);
  bool setPercentEncodedFragment(std::optional<std::string> fragment);

  // The query split at "&" into items, each split at its first "="; names
  // and values decoded ("+" stays "+"). A value whose decoded bytes are not
  // UTF-8 is absent, like a bare name's; such a name reads as "" (an item
  // that cannot be looked up by name). None when there is no query; an empty
  // query (a bare "?") gives no items.
  std::optional<std::vector<URLQueryItem>> queryItems() const;
  // Replaces the query; none removes it, an empty list leaves an empty query.
  void setQueryItems(const std::optional<std::vector<URLQueryItem>>& items);

  // The text of the URL reference; none when the components cannot form one
  // (a host with a path not starting with "/", or no host with a path
  // starting with "//", or a relative path whose first segment has a ":", or
  // a scheme that is not one, or a negative port). The authority (user,
  // password, port) is written only when there is a host.
  std::optional<std::string> string() const;
  // string() as a URL; null when there is none.
  URLPtr url() const;

  friend bool operator==(const URLComponents&, const URLComponents&) = default;

 private:
  std::optional<std::string> scheme_;
  std::optional<std::string> user_;
  std::optional<std::string> password_;
  std::optional<std::string> host_;
  std::optional<std::int64_t> port_;
  std::string path_;
  std::optional<std::string> query_;
  std::optional<std::string> fragment_;
};

// Percent-encoding helpers shared by the URL types.
namespace percent_encoding {
// Which bytes a component keeps as they are.
enum class Component { user, password, host, path, query, fragment, queryItem };
// Encodes every byte that `component` does not allow, as %XX.
KIVI_EXPORT std::string encode(std::string_view text, Component component);
// Decodes %XX sequences (either case of hex digit); none when a "%" is not
// followed by two hex digits or the decoded bytes are not UTF-8.
KIVI_EXPORT std::optional<std::string> decode(std::string_view text);
// Decodes %XX sequences as decode() does but keeps any bytes (a file path
// need not be UTF-8); none only for a malformed escape.
KIVI_EXPORT std::optional<std::string> decodeBytes(std::string_view text);
// Whether `text` uses only bytes `component` allows and well-formed %XX.
KIVI_EXPORT bool isValidlyEncoded(std::string_view text, Component component);
}  // namespace percent_encoding

}  // namespace kivi
