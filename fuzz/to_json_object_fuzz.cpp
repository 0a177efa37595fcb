// Feeds arbitrary bytes to KivUtils::toJSONObject. Beyond not crashing:
//   - text that is not UTF-8 gives no value and no error;
//   - any other failure is thrown as the reader's error, in CocoaErrorDomain
//     with code PropertyListReadCorruptError;
//   - a value is an array or dictionary that writes as JSON and reads back to
//     an equal value.
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "fuzz_check.h"
#include "kivi/text/json_serialization.h"
#include "kivi/text/unicode_text.h"
#include "kivi/utils/dictionary_utils.h"

using kivi::fuzz::check;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const bool utf8 = kivi::unicode::isValidUTF8(text);
  std::optional<kivi::Value> value;
  try {
    value = kivi::KivUtils::toJSONObject(text);
  } catch (const kivi::ErrorPtr& error) {
    check(utf8, "an error only for UTF-8 text", text);
    check(error && error->domain() == kivi::CocoaErrorDomain &&
              error->code() == kivi::PropertyListReadCorruptError,
          "the reader's error", text);
    return 0;
  }
  check(value.has_value() == utf8, "a value exactly for UTF-8 text that is JSON", text);
  if (!value) return 0;
  check(value->asArray() || value->asDictionary(), "an array or dictionary at the top", text);

  kivi::ErrorPtr error;
  const auto written = kivi::JSONSerialization::dataWithJSONObject(*value, 0, &error);
  check(written.has_value() && !error, "the value writes as JSON", text);
  const auto back = kivi::JSONSerialization::JSONObjectWithData(*written, 0, &error);
  check(back.has_value() && !error, "the written text reads", text);
  check(*back == *value, "the written text reads back equal", text);
  return 0;
}
