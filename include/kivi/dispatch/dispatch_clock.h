// DispatchClock: the library's one mechanism for delayed work. Every deadline
// in the library (a dispatch queue's asyncAfter, the URL session's time-outs)
// is a DispatchTimer of a clock.
//
// DispatchClock::system() runs on the steady (monotonic) clock; its timers
// fire on one thread of the library's own, which only hands work on. A test
// injects a ManualClock instead and moves time by hand, so nothing sleeps:
//
//   auto clock = kivi::ManualClock::create();
//   queue->asyncAfter(*clock, clock->now() + std::chrono::seconds(30), work);
//   clock->advance(std::chrono::seconds(30));  // hands `work` to the queue now
//
//   auto timer = kivi::DispatchClock::system()->makeTimer([] { poke(); });
//   timer->schedule(kivi::DispatchClock::system()->now() + 5ms);
//
// Thread contract: every member may be called from any thread. A timer's
// handler runs on the clock's firing thread (the system clock's own thread;
// for a ManualClock, the thread that advances it), one handler at a time, and
// must be short and must not block: a handler that has work to do hands it to
// a queue. A handler may arm or cancel timers, its own included.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>

#include "kivi/export.h"

namespace kivi {

// A point and a span of time on the steady (monotonic) clock, as deadlines and delays use.
using DispatchTime = std::chrono::steady_clock::time_point;
using DispatchDuration = std::chrono::steady_clock::duration;

class DispatchClock;

namespace detail {
struct TimerHeap;
struct TimerState;
}  // namespace detail

// A re-armable timer: its handler runs once per schedule(), at or after the
// deadline. Releasing the timer cancels it.
class KIVI_EXPORT DispatchTimer {
 public:
  ~DispatchTimer();
  DispatchTimer(const DispatchTimer&) = delete;
  DispatchTimer& operator=(const DispatchTimer&) = delete;

  // Arms the timer for `deadline`, replacing a deadline it already had. A
  // deadline in the past fires as soon as the clock's thread gets to it. Does
  // nothing once the clock is gone.
  void schedule(DispatchTime deadline);
  // Disarms the timer. False when it was not armed: it never was, or it has
  // fired (its handler may be running or about to run).
  bool cancel();
  bool isScheduled() const;

 private:
  friend class DispatchClock;
  explicit DispatchTimer(std::shared_ptr<detail::TimerState> state);
  std::shared_ptr<detail::TimerState> state_;
};

class KIVI_EXPORT DispatchClock : public std::enable_shared_from_this<DispatchClock> {
 public:
  virtual ~DispatchClock();
  DispatchClock(const DispatchClock&) = delete;
  DispatchClock& operator=(const DispatchClock&) = delete;

  // The steady clock, whose timers fire on the library's own thread.
  static const std::shared_ptr<DispatchClock>& system();

  // The clock's current time.
  virtual DispatchTime now() const = 0;

  // A disarmed timer whose handler runs on this clock's firing thread.
  [[nodiscard]] std::unique_ptr<DispatchTimer> makeTimer(std::function<void()> handler);
  // Runs `handler` once, on the firing thread, at or after `deadline`.
  void callAt(DispatchTime deadline, std::function<void()> handler);

  // Blocks the calling thread until now() reaches `deadline`. A worker of
  // the pool counts as blocked meanwhile, so the pool stays at its width.
  virtual void sleepUntil(DispatchTime deadline) = 0;
  void sleepFor(DispatchDuration duration) { sleepUntil(now() + duration); }

 protected:
  DispatchClock();

  // Runs the handler of every timer due at `now`, earliest first (equal
  // deadlines in the order they were armed), on the calling thread.
  // `beforeEach` is told each timer's deadline before its handler runs.
  void fireDue(DispatchTime now, const std::function<void(DispatchTime)>& beforeEach = {});
  // The earliest armed deadline, if any.
  std::optional<DispatchTime> earliestDeadline() const;
  // Called with the clock's internal lock held whenever the earliest armed
  // deadline changes (DispatchTime::max() when none is left). Must not call
  // back into the clock.
  virtual void earliestDeadlineChanged(DispatchTime deadline) = 0;
  // Calls earliestDeadlineChanged() with the earliest deadline now, changed or
  // not.
  void announceEarliestDeadline();

 private:
  friend class DispatchTimer;
  std::shared_ptr<detail::TimerHeap> heap_;
};

// A clock that moves only when told to. Starts at DispatchTime{} plus one
// hour unless given a start.
class KIVI_EXPORT ManualClock : public DispatchClock {
 public:
  // A clock at `start`, or at DispatchTime{} plus one hour.
  static std::shared_ptr<ManualClock> create();
  static std::shared_ptr<ManualClock> create(DispatchTime start);

  // The time the clock has been moved to.
  DispatchTime now() const override;

  // Moves the clock forward, running on the calling thread the handler of
  // every timer that comes due on the way, each at its own deadline (now()
  // reads that deadline while the handler runs). A handler that arms a timer
  // due within the advance sees it fire in the same advance. Moving to an
  // earlier time does nothing.
  void advance(DispatchDuration duration);
  void advanceTo(DispatchTime time);

  // The deadline of the earliest armed timer, if any.
  std::optional<DispatchTime> nextDeadline() const { return earliestDeadline(); }

  // Waits until another thread has advanced the clock to `deadline`.
  void sleepUntil(DispatchTime deadline) override;

 protected:
  void earliestDeadlineChanged(DispatchTime) override {}

 private:
  explicit ManualClock(DispatchTime start);
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace kivi
