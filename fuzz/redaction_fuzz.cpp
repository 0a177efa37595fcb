// The log redaction helpers, the cookie parser and KivObfuscator on input
// made from the fuzz bytes. Beyond not crashing:
//   - raw text taken as a URL, header lines and a Set-Cookie field gives
//     in-band answers: UTF-8 URL text, a masked Authorization, cookies with
//     a path, a name and a domain the host matches;
//   - a URL, headers and cookies built from the bytes, whose secret values
//     are made of the letters Q, X and Z that nothing else holds: no secret
//     appears in any redacted output, and every name does;
//   - texts of bytes 34...125 come back through obfuscate and unobfuscate;
//     any text gives none or UTF-8 no longer than itself.
#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz_check.h"
#include "kivi/logging/kiv_obfuscator.h"
#include "kivi/logging/log_redaction.h"
#include "kivi/net/http_cookie.h"
#include "kivi/net/url_components.h"
#include "kivi/text/unicode_text.h"
#include "kivi/utils/url_utils.h"

namespace {

using kivi::fuzz::check;

constexpr std::string_view kSecretLetters = "QXZ";

kivi::StringDictionary headerLines(std::string_view text) {
  kivi::StringDictionary fields;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    if (const auto colon = line.find(':'); colon != std::string_view::npos) {
      fields[std::string(line.substr(0, colon))] = std::string(line.substr(colon + 1));
    }
  }
  return fields;
}

void rawText(const std::string& text) {
  const kivi::URLPtr url = kivi::URL::URLWithString(text);
  if (auto redacted = kivi::KivSdkURLForLogging(url)) {
    check(kivi::unicode::isValidUTF8(*redacted), "redacted URL is UTF-8", text);
  }
  kivi::StringDictionary fields = headerLines(text);
  fields["Set-Cookie"] = text;
  const auto headers = std::make_shared<const kivi::StringDictionary>(fields);
  const auto redacted = kivi::KivSdkResponseHeadersForLogging(headers, url);
  check(redacted->size() == fields.size(), "same header names", text);
  if (auto authorization = redacted->find("Authorization"); authorization != redacted->end()) {
    check(authorization->second == "" || authorization->second == "***", "masked", text);
  }
  for (const auto& field : kivi::KivSdkObfuscateHeadersForLogging(headers, {})) {
    check(field.second == "***", "allow-list masks all", text);
  }
  check(kivi::KivSdkResponseForLogging(
            kivi::HTTPURLResponse::create(url, 200, "HTTP/1.1", fields)) != nullptr,
        "an answer for an answer", text);

  if (!url || !url->host()) return;
  const std::string host = kivi::unicode::toLower(*url->host());
  for (const auto& cookie : kivi::HTTPCookie::cookiesWithResponseHeaderFields(fields, *url)) {
    check(!cookie->name().empty() && cookie->path().starts_with('/'), "name and path", text);
    std::string_view domain = cookie->domain();
    if (domain != host) {
      check(domain.starts_with('.'), "a Domain cookie has a dot", text);
      domain.remove_prefix(1);
      check(host == domain ||
                (host.ends_with(domain) && host[host.size() - domain.size() - 1] == '.'),
            "the host domain-matches", text);
    }
  }
}

void obfuscator(const std::string& text) {
  for (std::uint64_t transformation : {0, 1, 2}) {
    const auto result = kivi::KivObfuscator::transformString(text, transformation);
    check(!result || (kivi::unicode::isValidUTF8(*result) && result->size() <= text.size()),
          "none or shorter UTF-8", text);
  }
  std::string printable = text;
  for (char& c : printable) c = static_cast<char>(34 + static_cast<unsigned char>(c) % 92);
  check(kivi::KivObfuscator::unobfuscateString(kivi::KivObfuscator::obfuscateString(printable)) ==
            printable,
        "printable text comes back", text);
}

// Fuzz text without the secret letters (and without `also`).
std::string plain(FuzzedDataProvider& fuzz, std::size_t max, std::string_view also = "") {
  std::string text = fuzz.ConsumeRandomLengthString(max);
  std::erase_if(text, [&](char c) {
    return kSecretLetters.find(c) != std::string_view::npos ||
           also.find(c) != std::string_view::npos;
  });
  return text;
}

void secrets(FuzzedDataProvider& fuzz, const std::string& input) {
  std::vector<std::string> secrets, cookieSecrets, names;
  const auto secret = [&](std::vector<std::string>& into) {
    std::string s(fuzz.ConsumeIntegralInRange<std::size_t>(4, 12), 'Q');
    for (char& c : s) c = kSecretLetters[fuzz.ConsumeIntegralInRange<std::size_t>(0, 2)];
    return into.emplace_back(std::move(s));
  };

  kivi::URLComponents components;
  components.setScheme("https");
  components.setHost(kivi::unicode::toLower(plain(fuzz, 16, "[]")));
  components.setPath("/" + plain(fuzz, 16));
  std::vector<kivi::URLQueryItem> items;
  for (int n = fuzz.ConsumeIntegralInRange(0, 4); n > 0; --n) {
    items.push_back({plain(fuzz, 8), fuzz.ConsumeBool() ? secret(secrets) : ""});
  }
  if (!items.empty()) components.setQueryItems(items);
  const kivi::URLPtr url = components.url();
  if (!url) return;

  kivi::StringDictionary fields;
  std::vector<std::string> others;
  for (int n = fuzz.ConsumeIntegralInRange(0, 3); n > 0; --n) {
    const std::string name = plain(fuzz, 8);
    if (name != "Authorization" && name != "Set-Cookie")
      fields[others.emplace_back(name)] = plain(fuzz, 8);
  }
  fields["Authorization"] = secret(secrets);
  std::string setCookie;
  static constexpr const char* kAttributes[] = {"Expires", "Max-Age",  "Domain",   "Path",
                                                "Secure",  "HttpOnly", "SameSite", "junk"};
  for (int n = fuzz.ConsumeIntegralInRange(1, 3); n > 0; --n) {
    setCookie += plain(fuzz, 8, ";,=") + "=" + secret(cookieSecrets);
    for (int a = fuzz.ConsumeIntegralInRange(0, 3); a > 0; --a) {
      setCookie += std::string("; ") + kAttributes[fuzz.ConsumeIntegralInRange(0, 7)] + "=" +
                   plain(fuzz, 30, ";");
    }
    setCookie += ", ";
  }
  fields["Set-Cookie"] = setCookie;

  const auto cookies = kivi::HTTPCookie::cookiesWithResponseHeaderFields(fields, *url);
  std::string all;
  // Without a cookie parsed the field is logged as it came (and an answer
  // joins it with fields named alike), so it is left out of the check then.
  const auto add = [&](const auto& dictionary) {
    for (const auto& field : dictionary) {
      if (cookies.empty() && kivi::headerFieldNamesEqual(field.first, "Set-Cookie")) continue;
      all += field.first + ": " + field.second + "\n";
    }
  };
  secrets.insert(secrets.end(), cookieSecrets.begin(), cookieSecrets.end());

  const auto urlText = kivi::KivSdkURLForLogging(url);
  if (urlText) {
    all += *urlText + "\n";
    // A name that is not UTF-8 cannot be read back out of the query.
    for (const auto& item : items) {
      check(!kivi::unicode::isValidUTF8(item.name) || urlText->find(item.name) != std::string::npos,
            "query name", input);
    }
  }
  const auto headers = std::make_shared<const kivi::StringDictionary>(fields);
  const auto redacted = kivi::KivSdkResponseHeadersForLogging(headers, url);
  add(*redacted);
  for (const auto& cookie : cookies) {
    check(redacted->at("Set-Cookie").find(cookie->name() + "=") != std::string::npos, "cookie name",
          input);
  }
  add(kivi::KivSdkObfuscateHeadersForLogging(headers, others));
  for (const auto& record : kivi::HTTPCookieUtils::cookiesForLogging(cookies)) {
    for (const auto& entry : record) all += *entry.second.asString() + "\n";
  }
  const auto original = kivi::HTTPURLResponse::create(url, 200, "HTTP/2", fields);
  if (const auto response = kivi::KivSdkResponseForLogging(original); response != original) {
    all += response->URL()->absoluteString() + "\n";
    add(response->allHeaderFields());
  }
  for (const auto& s : secrets) check(all.find(s) == std::string::npos, "a secret survived", input);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string input(reinterpret_cast<const char*>(data), size);
  FuzzedDataProvider fuzz(data, size);
  const std::string raw = fuzz.ConsumeRandomLengthString(512);
  rawText(raw);
  obfuscator(raw);
  secrets(fuzz, input);
  return 0;
}
