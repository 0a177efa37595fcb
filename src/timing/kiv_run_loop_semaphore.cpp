#include "kivi/timing/kiv_run_loop_semaphore.h"

#include <algorithm>
#include <limits>

#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/thread.h"

namespace kivi {

const KivRunLoopSemaphore::WaitStrategy& KivRunLoopSemaphore::defaultWaitStrategy() {
  static const WaitStrategy strategy = [](double elapsed) {
    return std::clamp(elapsed * 0.1, 0.0, 2.0);
  };
  return strategy;
}

bool KivRunLoopSemaphore::waitWithTimeout(double timeout, const WaitStrategy& waitStrategy) {
  const WaitStrategy& strategy = waitStrategy ? waitStrategy : defaultWaitStrategy();
  const bool onMainThread = Thread::isMainThread();
  const auto runLoop = RunLoop::currentRunLoop();
  const Date start = Date::now();
  if (!done()) {
    for (;;) {
      // Written so that a NaN time-out ends the wait too.
      if (!(-start.timeIntervalSinceNow() < timeout)) break;
      const double slice = strategy(-start.timeIntervalSinceNow());
      const Date sliceEnd = Date::now().addingTimeInterval(slice);
      runLoop->runUntilDate(sliceEnd);
      if (done()) break;
      if (!onMainThread) Thread::sleepUntilDate(sliceEnd);
      if (done()) break;
    }
  }
  return done();
}

bool KivRunLoopSemaphore::waitWithTimeout(double timeout) {
  return waitWithTimeout(timeout, defaultWaitStrategy());
}

void KivRunLoopSemaphore::waitUntilDone() {
  (void)waitWithTimeout(std::numeric_limits<double>::infinity());
}

}  // namespace kivi
