#include "kivi/dispatch/thread.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <chrono>
#include <cmath>

#include "kivi/dispatch/dispatch_clock.h"
#include "run_loop_internals.h"

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
  clock->sleepUntil(clock->now() + detail::cappedDuration(seconds));
}

void Thread::sleepUntilDate(Date date) { sleepForTimeInterval(date.timeIntervalSinceNow()); }

}  // namespace kivi
