// Feeds arbitrary bytes to the JSON reader. Beyond not crashing or leaking:
//   - a failed read always explains itself with an error, a successful one
//     never leaves one;
//   - without the fragments option exactly the texts with an array or object
//     at the top level read, to the same value as with it;
//   - every value read writes back (compact, pretty, unescaped slashes) and
//     reads again to an equal value.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string_view>

#include "fuzz_check.h"
#include "kivi/foundation/json_serialization.h"

using kivi::fuzz::check;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using kivi::JSONSerialization;
  const std::string_view text(reinterpret_cast<const char*>(data), size);

  kivi::ErrorPtr strictError;
  const auto strict = JSONSerialization::JSONObjectWithData(text, 0, &strictError);
  check(strict.has_value() != (strictError != nullptr), "strict read: value xor error", text);

  kivi::ErrorPtr error;
  const auto value =
      JSONSerialization::JSONObjectWithData(text, kivi::JSONReadingFragmentsAllowed, &error);
  check(value.has_value() != (error != nullptr), "read: value xor error", text);
  if (!value) {
    check(!strict, "the fragments option refused what reads without it", text);
    check(error->code() == kivi::PropertyListReadCorruptError, "read error code", text);
    return 0;
  }
  const bool container =
      value->kind() == kivi::Value::Kind::Array || value->kind() == kivi::Value::Kind::Dictionary;
  check(strict.has_value() == container, "fragments option decides only the top level", text);
  check(!strict || *strict == *value, "same value with and without the fragments option", text);
  check(JSONSerialization::isValidJSONObject(*value) == container, "isValidJSONObject", text);

  for (const kivi::JSONWritingOptions options :
       {kivi::JSONWritingFragmentsAllowed,
        kivi::JSONWritingFragmentsAllowed | kivi::JSONWritingPrettyPrinted,
        kivi::JSONWritingFragmentsAllowed | kivi::JSONWritingWithoutEscapingSlashes}) {
    const auto written = JSONSerialization::dataWithJSONObject(*value, options, &error);
    check(written.has_value() && error == nullptr, "a value read writes back", text);
    const auto back =
        JSONSerialization::JSONObjectWithData(*written, kivi::JSONReadingFragmentsAllowed, &error);
    check(back.has_value() && error == nullptr, "written text reads", text);
    check(*back == *value, "written text reads back equal", text);
  }
  return 0;
}
