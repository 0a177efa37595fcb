// Feeds arbitrary bytes to the base64 codec and the KivUtils base64 forms.
// Beyond not crashing:
//   - any bytes encode to text that decodes back to them;
//   - text that decodes re-encodes to text of the same length that decodes to
//     the same bytes (it may differ in unused bits before the padding);
//   - for UTF-8 text, the standard, URL-safe and vrel forms each decode back
//     to it and the URL-safe form turns back into the standard one; for other
//     bytes every encoder gives null;
//   - vrel decoding agrees with standard decoding of the translated text.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "fuzz_check.h"
#include "kivi/text/base64.h"
#include "kivi/text/unicode_text.h"
#include "kivi/utils/kiv_utils.h"

using kivi::fuzz::check;
namespace base64 = kivi::base64;
namespace U = kivi::KivUtils;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);

  check(base64::decodeToString(base64::encode(text)) == text, "bytes round trip", text);

  if (const auto decoded = base64::decode(text)) {
    const std::string again = base64::encode(*decoded);
    check(again.size() == text.size(), "re-encoding keeps the length", text);
    check(base64::decode(again) == decoded, "re-encoding decodes alike", text);
  }

  const auto standard = U::encodeIntoBase64String(text);
  const auto url = U::base64URLEncodedStringFromString(text);
  const auto vrel = U::vrelBase64URLEncodedStringFromString(text);
  const auto hash = U::sha256Hash(text);
  if (kivi::unicode::isValidUTF8(text)) {
    check(standard && url && vrel && hash, "UTF-8 text encodes", text);
    check(U::decodeFromBase64String(*standard) == text, "standard round trip", text);
    check(U::decodeFromVrelBase64URLEncodedString(*vrel) == text, "vrel round trip", text);
    check(U::base64FromBase64URLEncodedString(*url) == *standard, "URL-safe to standard", text);
  } else {
    check(!standard && !url && !vrel && !hash, "non-UTF-8 text gives null", text);
  }

  std::string translated(text);
  std::replace(translated.begin(), translated.end(), '_', '+');
  std::replace(translated.begin(), translated.end(), '!', '/');
  std::replace(translated.begin(), translated.end(), '-', '=');
  check(U::decodeFromVrelBase64URLEncodedString(text) == U::decodeFromBase64String(translated),
        "vrel decoding is standard decoding of the translated text", text);

  (void)U::base64FromBase64URLEncodedString(text);
  return 0;
}
