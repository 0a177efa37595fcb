// MockKivNSString: a scriptable KivNSStringProtocol.
//
// writeToURL() answers writeNSStringToURLImplementationBlock, which also
// decides what the error out-parameter receives; without it nothing is
// written, the answer is false and the error is left as it was.
//
//   auto text = std::make_shared<kivi::MockKivNSString>();
//   text->writeNSStringToURLImplementationBlock =
//       [](const kivi::URLPtr&, bool, std::uint64_t, kivi::ErrorPtr* error) {
//         if (error) *error = kivi::Error::create(kivi::POSIXErrorDomain, 28);  // disk full
//         return false;
//       };
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_ns_string_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSString : public Object, public KivNSStringProtocol {
 public:
  MockKivNSString() = default;

  // Answers writeToURL(url, atomically, encoding, error); without it, false.
  std::function<bool(const URLPtr&, bool, NSStringEncoding, ErrorPtr*)>
      writeNSStringToURLImplementationBlock;

  std::string description() const override { return Object::description(); }

  bool writeToURL(const URLPtr& url, bool atomically, NSStringEncoding encoding,
                  ErrorPtr* error) override {
    return writeNSStringToURLImplementationBlock
               ? writeNSStringToURLImplementationBlock(url, atomically, encoding, error)
               : false;
  }
};

}  // namespace kivi
