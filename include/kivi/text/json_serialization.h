// JSONSerialization: JSON text to Values and back, with the platform's rules.
//
// A valid JSON object (isValidJSONObject) is an array or dictionary at the
// top level whose members are, all the way down, arrays, dictionaries,
// strings, numbers that are neither NaN nor infinite, and the null marker,
// nested at most kMaxDepth levels deep.
//
// Reading gives dictionaries, arrays, strings (valid UTF-8 only), the null
// marker and numbers: true/false as Bool numbers, integers that fit as Int
// (UInt above INT64_MAX), everything else as Double (integers beyond 64 bits
// too). A document nested deeper than kMaxDepth is refused with an error,
// never a stack overflow; so is writing a Value nested deeper than that (it
// could not be read back).
//
//   kivi::ErrorPtr error;
//   auto value = kivi::JSONSerialization::JSONObjectWithData(bytes, 0, &error);
//   auto text = kivi::JSONSerialization::dataWithJSONObject(*value,
//       kivi::JSONWritingPrettyPrinted | kivi::JSONWritingSortedKeys, &error);
//
// Errors are in kivi::CocoaErrorDomain, code 3840 for reading and 3852 for
// writing, with a description that says what is wrong and where.
//
// Thread contract: all functions are safe from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/error.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// The text is not valid JSON (or not valid UTF-8, or too deep).
inline constexpr std::int64_t PropertyListReadCorruptError = 3840;
// The value cannot be written as JSON.
inline constexpr std::int64_t PropertyListWriteInvalidError = 3852;

// How dataWithJSONObject() writes: a bitwise OR of the options below (0: compact text).
using JSONWritingOptions = std::uint64_t;
// Indented by two spaces, with "key" : value.
inline constexpr JSONWritingOptions JSONWritingPrettyPrinted = 1;
// Keys in byte order, as they are always written anyway.
inline constexpr JSONWritingOptions JSONWritingSortedKeys = 2;
// A lone string, number or null marker is allowed at the top level.
inline constexpr JSONWritingOptions JSONWritingFragmentsAllowed = 4;
// "/" is written as it is, not as "\/".
inline constexpr JSONWritingOptions JSONWritingWithoutEscapingSlashes = 8;

// How JSONObjectWithData() reads: a bitwise OR of the options below (0: none).
using JSONReadingOptions = std::uint64_t;
// Accepted and ignored: a Value is changed by copying it out (see Value).
inline constexpr JSONReadingOptions JSONReadingMutableContainers = 1;
inline constexpr JSONReadingOptions JSONReadingMutableLeaves = 2;
// Any value is allowed at the top level, not only an array or a dictionary.
inline constexpr JSONReadingOptions JSONReadingFragmentsAllowed = 4;

class KIVI_EXPORT JSONSerialization {
 public:
  // The deepest nesting of arrays and dictionaries read or written.
  static constexpr std::size_t kMaxDepth = 1024;

  // Whether `value` is a valid JSON object as defined above, so that writing it succeeds.
  static bool isValidJSONObject(const Value& value);

  // Null and *error set when `value` is not valid JSON (with
  // JSONWritingFragmentsAllowed a lone string, number or null marker is
  // allowed at the top level) or nested deeper than kMaxDepth. Pretty
  // printing indents by two spaces and writes "key" : value; "/" is written
  // "\/" unless JSONWritingWithoutEscapingSlashes. `error` may be null; when
  // given it is written on every call.
  static std::optional<Data> dataWithJSONObject(const Value& value, JSONWritingOptions options,
                                                ErrorPtr* error);

  // None and *error set when the text is not JSON (or, without
  // JSONReadingFragmentsAllowed, its top level is not an array or object).
  static std::optional<Value> JSONObjectWithData(std::string_view data, JSONReadingOptions options,
                                                 ErrorPtr* error);
  static std::optional<Value> JSONObjectWithData(const Data& data, JSONReadingOptions options,
                                                 ErrorPtr* error) {
    return JSONObjectWithData(
        std::string_view(reinterpret_cast<const char*>(data.data()), data.size()), options, error);
  }
};

}  // namespace kivi
