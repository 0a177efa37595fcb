// KivNSRunLoopProtocol: the run-loop interface that code holds instead of a
// run loop, so that a test can hand it MockKivNSRunLoop. kivi::RunLoop
// conforms unchanged.
//
// Thread contract: that of the conformer. A run loop is run by its own
// thread; perform() may be called from any thread.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// A run-loop mode is any string; these two are the platform's.
using RunLoopMode = std::string;
inline constexpr const char* NSDefaultRunLoopMode = "kCFRunLoopDefaultMode";
// Not a mode to run in: work added for it belongs to every common mode (the
// default mode is one).
inline constexpr const char* NSRunLoopCommonModes = "kCFRunLoopCommonModes";

class KIVI_EXPORT KivNSRunLoopProtocol {
 public:
  virtual ~KivNSRunLoopProtocol() = default;

  // run()
  virtual void run() = 0;
  // run(until:)
  virtual void run(Date limitDate) = 0;
  // run(mode:before:)
  virtual bool run(const RunLoopMode& mode, Date limitDate) = 0;
  // perform(inModes:block:)
  virtual void perform(const std::vector<RunLoopMode>& modes, std::function<void()> block) = 0;
  // perform(_:)
  virtual void perform(std::function<void()> block) = 0;
};

}  // namespace kivi
