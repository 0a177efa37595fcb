// KivMainThreadRunner: runs a callback on the main thread — at once when the
// caller is already there, through the main dispatch queue otherwise.
//
//   kivi::KivMainThreadRunner::runBlockOnMainThread([] { window.refresh(); });
//   kivi::KivMainThreadRunner::syncRunBlockOnMainThread([&] { title = window.title(); });
//
// Main-queue work runs while the main run loop turns in a common mode (or a
// host loop calls RunLoop::runPendingWork()); until then an asynchronous
// callback waits and a synchronous one blocks its caller.
//
// Thread contract: both from any thread. A null callback does nothing.
#pragma once

#include <functional>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivMainThreadRunner {
 public:
  KivMainThreadRunner() = delete;

  // On the main thread: runs `block` before returning. Elsewhere: hands it
  // to the main queue and returns without waiting.
  static void runBlockOnMainThread(std::function<void()> block);
  // On the main thread: runs `block` before returning. Elsewhere: hands it
  // to the main queue and returns once it has run.
  static void syncRunBlockOnMainThread(const std::function<void()>& block);
};

}  // namespace kivi
