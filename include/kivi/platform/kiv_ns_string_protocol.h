// KivNSStringProtocol: writing a text to a file, behind an interface so that
// code that saves text can be handed a scripted writer in tests.
//
// The library implements it only by its double, MockKivNSString.
//
//   kivi::ErrorPtr error;
//   if (!text->writeToURL(url, true, kivi::NSUTF8StringEncoding, &error)) report(error);
//
// Thread contract: that of the implementation.
#pragma once

#include <cstdint>
#include <string>

#include "kivi/base/error.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// Text encodings (the platform's numbers).
using NSStringEncoding = std::uint64_t;
inline constexpr NSStringEncoding NSASCIIStringEncoding = 1;
inline constexpr NSStringEncoding NSUTF8StringEncoding = 4;
inline constexpr NSStringEncoding NSISOLatin1StringEncoding = 5;
inline constexpr NSStringEncoding NSUTF16StringEncoding = 10;

class KIVI_EXPORT KivNSStringProtocol {
 public:
  virtual ~KivNSStringProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Writes the text to the file `url` names (through a temporary file when
  // `atomically`); false with `*error` set on failure.
  virtual bool writeToURL(const URLPtr& url, bool atomically, NSStringEncoding encoding,
                          ErrorPtr* error) = 0;
};

}  // namespace kivi
