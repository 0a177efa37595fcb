// Copies of URLs, tokens, header dictionaries and HTTP answers that are safe
// to put into a log line.
//
// A secret value becomes "***" when it is set and the empty string when it is
// empty, so that a reader of the log can still tell the two apart. Names
// (query parameter, header and cookie names) are always kept. Header names
// are matched exactly, letter case included: only "Authorization" and
// "Set-Cookie" spelt thus are redacted.
//
//   auto url = kivi::URL::URLWithString("https://api.example.com/items?key=s3cr3t&page=");
//   kivi::KivSdkURLForLogging(url);          // "https://api.example.com/items?key=***&page="
//   kivi::KivSdkTokenForLogging("s3cr3t");   // "***"
//   kivi::KivSdkResponseForLogging(response);
//   auto headers = std::make_shared<const kivi::StringDictionary>(response->allHeaderFields());
//   kivi::KivSdkObfuscateHeadersForLogging(headers, {"Content-Type", "Date"});
//
// Header dictionaries come in two forms: the StringDictionary of an
// HTTPURLResponse, held by a shared pointer, and a Value holding a
// Dictionary, such as the ResponseHeadersKeyName entry of a
// KivJSONAPIOperation error. A bare nullptr means "no dictionary" for both.
//
// Thread contract: pure functions without state; call them from any thread
// at once. They never change their arguments.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/net/http_url_response.h"
#include "kivi/net/url.h"
#include "kivi/net/url_request.h"

namespace kivi {

// Header fields shared read-only; null for none.
using HeaderDictionaryPtr = std::shared_ptr<const StringDictionary>;

// The URL's absolute string with every query value masked, percent-decoded
// as a whole: "https://h/a%20b?x=1&y=&z" gives "https://h/a b?x=***&y=&z=".
// Parameters keep their order; a query without parameters is dropped with
// its "?". Everything but query values (user, password, fragment included)
// is kept. None for a null URL, and when the decoded text is not UTF-8.
KIVI_EXPORT std::optional<std::string> KivSdkURLForLogging(const URLPtr& url);

// "***" for a token with at least one character, "nil" for an empty or
// absent one. Nothing of the token is kept, not even its length.
KIVI_EXPORT std::string KivSdkTokenForLogging(const std::optional<std::string>& token);
inline std::string KivSdkTokenForLogging(std::nullptr_t) { return "nil"; }

// A copy of `headers` in which the value under "Authorization" is masked
// and, when `url` is given and the value under "Set-Cookie" sets at least one
// cookie for it, that value becomes the list of those cookies, each written
// "name=<masked value>, path=<path>, domain=<domain>;" with nothing in
// between. Only these two exact names are read and changed: a field spelt
// "authorization" or "set-cookie" keeps its value and adds no cookie.
// URLSession's answers spell names canonically; for dictionaries from
// elsewhere, the allow-list form is the safe one.
// A null or empty `headers` is returned itself (the very same pointer).
KIVI_EXPORT HeaderDictionaryPtr KivSdkResponseHeadersForLogging(const HeaderDictionaryPtr& headers,
                                                                const URLPtr& url);
// The same for a Value. One that is not a dictionary, or an empty one, comes
// back as it is (sharing its dictionary). A "Set-Cookie" value that is not a
// string is left as it is; an "Authorization" value of another kind becomes
// "***", other values of any kind pass through.
KIVI_EXPORT Value KivSdkResponseHeadersForLogging(const Value& headers, const URLPtr& url);
// Null, for a bare nullptr.
inline HeaderDictionaryPtr KivSdkResponseHeadersForLogging(std::nullptr_t, const URLPtr&) {
  return nullptr;
}

// A new answer with the URL of KivSdkURLForLogging, the headers of
// KivSdkResponseHeadersForLogging, the same status code and the HTTP
// version "1.0". Null for null. When the redacted URL cannot be made (see
// KivSdkURLForLogging) or does not parse again (a user name holding a
// decoded "@", say), `response` itself is returned, unredacted.
KIVI_EXPORT HTTPURLResponsePtr KivSdkResponseForLogging(const HTTPURLResponsePtr& response);

// An allow-list: every entry of `headers` with its value when its name is
// one of `keep` (exact match) and "***" otherwise, empty values included.
// Empty for null or empty headers (and for a Value that is no dictionary).
KIVI_EXPORT StringDictionary KivSdkObfuscateHeadersForLogging(const HeaderDictionaryPtr& headers,
                                                              const std::vector<std::string>& keep);
KIVI_EXPORT Dictionary KivSdkObfuscateHeadersForLogging(const Value& headers,
                                                        const std::vector<std::string>& keep);
inline StringDictionary KivSdkObfuscateHeadersForLogging(std::nullptr_t,
                                                         const std::vector<std::string>&) {
  return {};
}

}  // namespace kivi
