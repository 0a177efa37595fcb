// KivRunLoopSemaphore: a one-way "done" flag that a thread can wait for while
// its run loop keeps turning, so a wait on the main thread does not stop
// main-queue work, timers or a host's events.
//
//   auto semaphore = std::make_shared<kivi::KivRunLoopSemaphore>();
//   service->fetch([semaphore] { semaphore->signal(); });
//   if (!semaphore->waitWithTimeout(5.0)) showTimeout();
//
// The wait proceeds in slices whose length a strategy picks from the time
// waited so far; defaultWaitStrategy() gives 10% of it, at most 2 seconds.
// Each slice runs the calling thread's run loop until the slice ends; off the
// main thread the thread then sleeps until the slice end (its run loop
// usually has nothing to run, so that is where it waits). A signal is seen
// at the end of the slice it arrives in, so a wait may overrun its time-out
// by up to one slice. A time-out that is not a number ends the wait at once;
// a null strategy is the default one; a strategy answering a negative or NaN
// slice polls without pausing until the time-out.
//
// Nothing sets `done` back to false except setDone(false): a semaphore serves
// one wait cycle.
//
// Thread contract: signal() and the accessors from any thread, also from
// work the waiting thread's run loop runs; a wait blocks only its caller and
// takes no lock.
#pragma once

#include <atomic>
#include <functional>

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivRunLoopSemaphore : public Object {
 public:
  // Seconds waited so far → seconds of the next slice.
  using WaitStrategy = std::function<double(double elapsed)>;

  // elapsed × 0.1, clamped to 0…2 seconds.
  static const WaitStrategy& defaultWaitStrategy();

  KivRunLoopSemaphore() = default;

  // The flag, false until signal(); setDone(false) readies the semaphore for another wait.
  bool done() const noexcept { return done_.load(); }
  void setDone(bool done) noexcept { done_.store(done); }
  // Sets `done`.
  void signal() noexcept { done_.store(true); }

  // Waits until `done` or the time-out; answers `done` as it is at the end.
  bool waitWithTimeout(double timeout, const WaitStrategy& waitStrategy);
  bool waitWithTimeout(double timeout);
  // Waits with no time-out.
  void waitUntilDone();

  std::string className() const override { return "KivRunLoopSemaphore"; }

 private:
  std::atomic<bool> done_{false};
};

}  // namespace kivi
