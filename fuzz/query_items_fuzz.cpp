// Feeds arbitrary bytes to the query and URL parsers. Beyond not crashing:
//   - components that parse give text that parses back to equal components;
//   - every decoded component, query item name and value is UTF-8 or absent;
//   - query items written back with setQueryItems() read back unchanged
//     (but for a lone item with an empty name and no value, which writes an
//     empty query);
//   - a URL's text gives an equal URL again, with or without encoding.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "fuzz_check.h"
#include "kivi/net/url.h"
#include "kivi/net/url_components.h"
#include "kivi/text/unicode_text.h"
#include "kivi/utils/url_utils.h"

using kivi::fuzz::check;
using kivi::unicode::isValidUTF8;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);

  (void)kivi::getQueryItemsDictionary(text);

  if (auto components = kivi::URLComponents::fromString(text)) {
    const auto written = components->string();
    check(written.has_value(), "parsed components have text", text);
    const auto reparsed = kivi::URLComponents::fromString(*written);
    check(reparsed.has_value(), "components text parses", text);
    check(*reparsed == *components, "components round trip", text);
    // Empty text is the one reference URL refuses.
    check(written->empty() || components->url() != nullptr, "components give a URL", text);

    for (const auto& component :
         {components->user(), components->password(), components->host(), components->path(),
          components->query(), components->fragment()}) {
      check(!component || isValidUTF8(*component), "decoded components are UTF-8", text);
    }
    if (auto items = components->queryItems()) {
      for (const auto& item : *items) {
        check(isValidUTF8(item.name) && (!item.value || isValidUTF8(*item.value)),
              "query items are UTF-8", text);
      }
      kivi::URLComponents rewritten = *components;
      rewritten.setQueryItems(items);
      const bool loneEmpty = items->size() == 1 && items->front() == kivi::URLQueryItem{};
      check(loneEmpty || rewritten.queryItems() == items, "query items round trip", text);
      check(rewritten.url() != nullptr, "rewritten query gives a URL", text);
    }
  }

  for (bool encoding : {true, false}) {
    const kivi::URLPtr url = kivi::URL::URLWithString(text, encoding);
    if (!url) continue;
    const kivi::URLPtr again = kivi::URL::URLWithString(url->absoluteString());
    check(again && *again == *url, "URL text gives an equal URL", text);
    const kivi::URLPtr asIs = kivi::URL::URLWithString(url->absoluteString(), false);
    check(asIs && *asIs == *url, "URL text needs no encoding", text);
    check(kivi::URLComponents::fromURL(*url).url() != nullptr, "URL components give a URL", text);
    for (const auto& component : {url->host(), url->path(), url->user(), url->password()}) {
      check(!component || isValidUTF8(*component), "decoded URL components are UTF-8", text);
    }
    (void)url->port();
  }
  return 0;
}
