#include "kivi/dispatch/thread.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <chrono>
#include <cmath>

#include "kivi/dispatch/dispatch_clock.h"

namespace kivi {

bool Thread::isMainThread() noexcept {
  // The first thread of a process has the process's id as its thread id.
  static const pid_t process = ::getpid();
  thread_local const pid_t thread = static_cast<pid_t>(::syscall(SYS_gettid));
  return thread == process;
}

void Thread::sleepForTimeInterval(double seconds) {
  if (!(seconds > 0)) return;
  const auto& clock = DispatchClock::system();
  // A century stands for "for good" without overflowing the clock.
  constexpr double kLongest = 100.0 * 365 * 24 * 3600;
  const auto duration = std::chrono::duration_cast<DispatchDuration>(
      std::chrono::duration<double>(std::min(seconds, kLongest)));
  clock->sleepUntil(clock->now() + duration);
}

void Thread::sleepUntilDate(Date date) { sleepForTimeInterval(date.timeIntervalSinceNow()); }

}  // namespace kivi
