// What the JSON reader and writer share: their messages and errors.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "kivi/base/error.h"

namespace kivi::json_detail {

inline constexpr const char* kReadFailure =
    "The data couldn\u2019t be read because it isn\u2019t in the correct format.";
inline constexpr const char* kWriteFailure =
    "The data couldn\u2019t be written because it isn\u2019t in the correct format.";
inline constexpr const char* kNotAContainer =
    "JSON text did not start with array or object and option to allow fragments not set.";

// The thread's reader and writer buffers are not kept after a text this
// large.
inline constexpr std::size_t kLargestReusedCapacity = std::size_t{8} << 20;

// A Cocoa-domain error with the platform's description and ours.
ErrorPtr makeError(std::int64_t code, const char* description, std::string debugDescription);

}  // namespace kivi::json_detail
