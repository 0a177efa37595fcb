// Internal: the state a timer shares with the run loops it was added to.
#pragma once

#include <chrono>
#include <cmath>
#include <memory>
#include <mutex>
#include <vector>

#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/timer.h"

namespace kivi::detail {

// Lock order: a run loop's mutex, then a timer's. A timer's mutex is never
// held while a run loop's is taken.
struct TimerCore {
  std::mutex mutex;
  bool valid = true;                                // guarded by mutex
  bool repeats = false;                             // fixed at creation
  double intervalSeconds = 0;                       // fixed at creation
  DispatchDuration interval{};                      // fixed at creation
  DispatchTime due{};                               // guarded by mutex
  Timer::Block block;                               // guarded by mutex
  std::vector<std::weak_ptr<RunLoop::Core>> loops;  // guarded by mutex
};

// The longest wait the library makes: a century stands for "for good"
// without overflowing the steady clock.
inline constexpr double kLongestWaitSeconds = 100.0 * 365 * 24 * 3600;

// `seconds` (> 0) as a duration of the steady clock, capped at a century.
inline DispatchDuration cappedDuration(double seconds) {
  return std::chrono::duration_cast<DispatchDuration>(
      std::chrono::duration<double>(std::min(seconds, kLongestWaitSeconds)));
}

// Seconds from now to `date` as a deadline of the steady clock: NaN and
// dates long past are now, dates beyond a century are a century away.
inline DispatchTime deadlineForDate(Date date) {
  const auto now = DispatchClock::system()->now();
  const double seconds = date.timeIntervalSinceNow();
  return seconds > 0 ? now + cappedDuration(seconds) : now;
}

// The platform's smallest timer interval, for intervals at or below zero.
inline constexpr double kMinimumTimerInterval = 0.0001;

inline double usableTimerInterval(double seconds) {
  if (!(seconds > 0)) return kMinimumTimerInterval;
  return std::min(seconds, kLongestWaitSeconds);
}

}  // namespace kivi::detail

namespace kivi::detail {
// Called by a timer when it is invalidated or moved, without its own lock.
void runLoopForgetTimer(RunLoop::Core& loop, const Timer* timer);
void runLoopTimerMoved(RunLoop::Core& loop);
}  // namespace kivi::detail
