// Error values shared by the process layer's sources.
#pragma once

#include <cstdint>
#include <cstring>
#include <string>

#include "kivi/base/error.h"
#include "kivi/net/kiv_ns_url_protocol.h"
#include "kivi/text/json_serialization.h"

namespace kivi::detail {

inline ErrorPtr posixError(int code, const std::string& path = {}) {
  Dictionary info{{LocalizedDescriptionKey, Value(std::strerror(code))}};
  if (!path.empty()) info[FilePathErrorKey] = Value(path);
  return Error::create(POSIXErrorDomain, code, std::move(info));
}

// An NSCocoaErrorDomain file error about `path`, with the errno (when not 0)
// as its underlying error.
inline ErrorPtr fileError(std::int64_t code, const std::string& path, int errnoValue = 0) {
  Dictionary info;
  if (!path.empty()) info[FilePathErrorKey] = Value(path);
  if (errnoValue != 0)
    info[UnderlyingErrorKey] = Value(std::const_pointer_cast<Error>(posixError(errnoValue)));
  return Error::create(CocoaErrorDomain, code, std::move(info));
}

}  // namespace kivi::detail
