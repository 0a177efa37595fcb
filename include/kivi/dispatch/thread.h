// Thread: facts about the calling thread and sleeping it, in the platform's
// NSThread shape.
//
// The main thread is the process's first thread (the one that ran main());
// the main run loop and the main dispatch queue belong to it.
//
//   if (!kivi::Thread::isMainThread()) kivi::Thread::sleepForTimeInterval(0.25);
//   kivi::Thread::sleepUntilDate(kivi::Date{kivi::Date::now().timeIntervalSince1970 + 1});
//
// A sleep on one of the pool's workers counts as blocked: the pool starts
// another worker meanwhile, so sleeping work never holds up other work.
//
// Thread contract: every member may be called from any thread; the sleeps
// block only the calling thread.
#pragma once

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT Thread {
 public:
  Thread() = delete;

  // Whether the calling thread is the process's main thread.
  static bool isMainThread() noexcept;

  // Sleeps for `seconds`. Zero, negative and NaN return at once; infinity
  // sleeps for good.
  static void sleepForTimeInterval(double seconds);
  // Sleeps until the wall clock reads `date`; a date in the past (or NaN)
  // returns at once. The date is turned into a duration when the call is
  // made: a later change of the wall clock does not move the wake-up.
  static void sleepUntilDate(Date date);
};

}  // namespace kivi
