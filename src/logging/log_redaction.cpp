#include "kivi/logging/log_redaction.h"

#include <algorithm>
#include <optional>
#include <string>

#include "kivi/net/http_cookie.h"
#include "kivi/net/url_components.h"
#include "kivi/text/unicode_text.h"

namespace kivi {

namespace {

constexpr const char* kMask = "***";

std::string masked(const std::string& value) { return value.empty() ? "" : kMask; }
Value masked(const Value& value) {
  const String* text = value.asString();
  return Value(text && text->empty() ? "" : kMask);
}

std::optional<std::string> text(const std::string& value) { return value; }
std::optional<std::string> text(const Value& value) {
  const String* s = value.asString();
  return s ? std::optional<std::string>(s->str()) : std::nullopt;
}

// Masks "Authorization" and rewrites "Set-Cookie" in place; works on both
// header dictionary forms. Names are matched exactly: the cookies come from
// the field spelt "Set-Cookie" alone, never from a "set-cookie" beside it.
template <class Headers>
void redact(Headers& headers, const URLPtr& url) {
  if (auto authorization = headers.find("Authorization"); authorization != headers.end()) {
    authorization->second = masked(authorization->second);
  }
  if (!url) return;
  const auto field = headers.find("Set-Cookie");
  const std::optional<std::string> value =
      field == headers.end() ? std::nullopt : text(field->second);
  if (!value) return;
  const auto cookies = HTTPCookie::cookiesWithResponseHeaderFields({{"Set-Cookie", *value}}, *url);
  if (cookies.empty()) return;
  std::string list;
  for (const HTTPCookiePtr& cookie : cookies) {
    list += cookie->name() + "=" + masked(cookie->value()) + ", path=" + cookie->path() +
            ", domain=" + cookie->domain() + ";";
  }
  field->second = std::move(list);
}

bool kept(const std::string& name, const std::vector<std::string>& keep) {
  return std::find(keep.begin(), keep.end(), name) != keep.end();
}

}  // namespace

std::optional<std::string> KivSdkURLForLogging(const URLPtr& url) {
  if (!url) return std::nullopt;
  URLComponents components = URLComponents::fromURL(*url);
  // Values are masked by what is written, so that one that does not decode
  // (not UTF-8) is masked like any other; names stay as written.
  std::optional<std::string> query;
  if (const auto& written = components.percentEncodedQuery(); written && !written->empty()) {
    query.emplace();
    for (std::string_view rest = *written;;) {
      const std::size_t amp = rest.find('&');
      const std::string_view piece = rest.substr(0, amp);
      const std::size_t equals = piece.find('=');
      const bool secret = equals != std::string_view::npos && equals + 1 < piece.size();
      query->append(piece.substr(0, equals)).append("=").append(secret ? kMask : "");
      if (amp == std::string_view::npos) break;
      query->push_back('&');
      rest.remove_prefix(amp + 1);
    }
  }
  components.setPercentEncodedQuery(query);
  const auto text = components.string();
  if (!text) return std::nullopt;
  auto decoded = percent_encoding::decode(*text);
  if (!decoded || !unicode::isValidUTF8(*decoded)) return std::nullopt;
  return decoded;
}

std::string KivSdkTokenForLogging(const std::optional<std::string>& token) {
  return token && !token->empty() ? kMask : "nil";
}

HeaderDictionaryPtr KivSdkResponseHeadersForLogging(const HeaderDictionaryPtr& headers,
                                                    const URLPtr& url) {
  if (!headers || headers->empty()) return headers;
  StringDictionary copy = *headers;
  redact(copy, url);
  return std::make_shared<const StringDictionary>(std::move(copy));
}

Value KivSdkResponseHeadersForLogging(const Value& headers, const URLPtr& url) {
  const Dictionary* dictionary = headers.asDictionary();
  if (!dictionary || dictionary->empty()) return headers;
  Dictionary copy = *dictionary;
  redact(copy, url);
  return Value(std::move(copy));
}

HTTPURLResponsePtr KivSdkResponseForLogging(const HTTPURLResponsePtr& response) {
  if (!response) return nullptr;
  const HeaderDictionaryPtr headers = KivSdkResponseHeadersForLogging(
      std::make_shared<const StringDictionary>(response->allHeaderFields()), response->URL());
  const auto text = KivSdkURLForLogging(response->URL());
  URLPtr url = text ? URL::URLWithString(*text) : nullptr;
  if (!url) return response;
  return HTTPURLResponse::create(std::move(url), response->statusCode(), "1.0", *headers);
}

StringDictionary KivSdkObfuscateHeadersForLogging(const HeaderDictionaryPtr& headers,
                                                  const std::vector<std::string>& keep) {
  StringDictionary result;
  if (!headers) return result;
  for (const auto& [name, value] : *headers) {
    result.emplace_hint(result.end(), name, kept(name, keep) ? value : kMask);
  }
  return result;
}

Dictionary KivSdkObfuscateHeadersForLogging(const Value& headers,
                                            const std::vector<std::string>& keep) {
  Dictionary result;
  const Dictionary* dictionary = headers.asDictionary();
  if (!dictionary) return result;
  for (const auto& [name, value] : *dictionary) {
    result.emplace_hint(result.end(), name, kept(name, keep) ? value : Value(kMask));
  }
  return result;
}

}  // namespace kivi
