#include "kivi/utils/url_utils.h"

#include <unicode/locid.h>
#include <unicode/unistr.h>

namespace kivi {

namespace KiviOSSdkUtils {

// The new items go behind the existing query's text as it stands, so that
// existing items that do not decode (a value that is not UTF-8) keep their
// text rather than losing it on the way through queryItems().
void addQueryItems(URLComponents& components, const std::vector<URLQueryItem>& items) {
  if (items.empty()) return;
  const std::optional<std::string> existing = components.percentEncodedQuery();
  components.setQueryItems(items);
  if (existing && !existing->empty()) {
    components.setPercentEncodedQuery(*existing + "&" + *components.percentEncodedQuery());
  }
}

}  // namespace KiviOSSdkUtils

std::map<std::string, std::string> getQueryItemsDictionary(std::string_view queryString) {
  std::map<std::string, std::string> dictionary;
  const auto components = URLComponents::fromString(std::string("?").append(queryString));
  if (!components) return dictionary;
  for (auto& item : components->queryItems().value_or(std::vector<URLQueryItem>{})) {
    if (item.value) dictionary[std::move(item.name)] = std::move(*item.value);
  }
  return dictionary;
}

namespace CustomHeaders {

void setHeaders(MutableURLRequest& request, const std::optional<StringDictionary>& headers) {
  if (!headers) return;
  for (const auto& [field, value] : *headers) request.setValue(value, field);
}

}  // namespace CustomHeaders

std::shared_ptr<const KivURL> KivURL::initWithString(std::string_view string) {
  const URLPtr url = URL::URLWithString(string, false);
  if (!url) return nullptr;
  return std::shared_ptr<const KivURL>(new KivURL(url->absoluteString()));
}

std::shared_ptr<const KivURL> KivURL::URLWithString(const std::optional<std::string>& string) {
  return string ? initWithString(*string) : nullptr;
}

namespace {

// Unicode lowercasing with the root locale (no language-specific rules).
std::string lowercased(std::string_view text) {
  icu::UnicodeString unicode = icu::UnicodeString::fromUTF8(
      icu::StringPiece(text.data(), static_cast<int32_t>(text.size())));
  unicode.toLower(icu::Locale::getRoot());
  std::string out;
  unicode.toUTF8String(out);
  return out;
}

std::string_view trimmedDots(std::string_view text) {
  const std::size_t first = text.find_first_not_of('.');
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of('.') - first + 1);
}

}  // namespace

std::vector<HTTPCookiePtr> HTTPCookieUtils::filterCookies(const std::vector<HTTPCookiePtr>& cookies,
                                                          const std::vector<std::string>& domains) {
  std::vector<HTTPCookiePtr> kept;
  if (domains.empty()) return kept;
  std::vector<std::string> wanted;
  wanted.reserve(domains.size());
  for (const std::string& domain : domains) wanted.push_back(lowercased(domain));
  for (const HTTPCookiePtr& cookie : cookies) {
    if (!cookie) continue;
    const std::string domain = lowercased(cookie->domain());
    const std::string_view bare = trimmedDots(domain);
    for (const std::string& suffix : wanted) {
      if (bare.ends_with(suffix)) {
        kept.push_back(cookie);
        break;
      }
    }
  }
  return kept;
}

std::vector<Dictionary> HTTPCookieUtils::cookiesForLogging(
    const std::vector<HTTPCookiePtr>& cookies) {
  std::vector<Dictionary> records;
  records.reserve(cookies.size());
  for (const HTTPCookiePtr& cookie : cookies) {
    if (!cookie) continue;
    records.push_back({{HTTPCookieName, Value(cookie->name())},
                       {HTTPCookieValue, Value(cookie->value().empty() ? "" : "***")},
                       {HTTPCookieDomain, Value(cookie->domain())}});
  }
  return records;
}

}  // namespace kivi
