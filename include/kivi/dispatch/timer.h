// Timer: a timer that fires on a run loop, in the platform's NSTimer shape.
//
// A timer fires only while a run loop it was added to runs in one of the
// modes it was added for. A repeating timer keeps its schedule: each firing is
// due one interval after the previous one was due (not after it ran); firings
// missed while the run loop was busy or in another mode are skipped, not
// made up in a burst. A one-shot timer invalidates itself after it fires.
//
//   auto timer = kivi::Timer::create(0.5, true, [](const kivi::TimerPtr& t) { tick(); });
//   kivi::RunLoop::mainRunLoop()->addTimer(timer, kivi::NSDefaultRunLoopMode);
//   ...
//   timer->invalidate();  // from any thread
//
// An interval of zero, below zero or NaN is the platform's minimum, 0.1 ms.
// An infinite or huge interval (beyond about a century) is capped there.
// A run loop holds the timers added to it until they are invalidated, and a
// timer holds its block (and what the block captures) until then as well.
//
// Thread contract: every member may be called from any thread. The block
// runs on the thread of the run loop that fires the timer.
#pragma once

#include <functional>
#include <memory>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class Timer;
// How timers are held; a run loop holds those added to it until they are invalidated.
using TimerPtr = std::shared_ptr<Timer>;

namespace detail {
struct TimerCore;
}

class KIVI_EXPORT Timer : public Object {
 public:
  // The timer's work; it is given the timer that fires.
  using Block = std::function<void(const TimerPtr& timer)>;

  // timerWithTimeInterval:repeats:block: — first due `interval` from now; not
  // yet added to any run loop.
  [[nodiscard]] static TimerPtr create(double interval, bool repeats, Block block);
  // timerWithTimeInterval:target:selector:userInfo:repeats: — the target and
  // its selector are the block (which holds the target strongly, as the
  // platform's timer holds its target); userInfo is kept for the block.
  [[nodiscard]] static TimerPtr create(double interval, Block action, Value userInfo, bool repeats);
  // initWithFireDate:interval:repeats:block:
  [[nodiscard]] static TimerPtr create(Date fireDate, double interval, bool repeats, Block block);
  // scheduledTimerWithTimeInterval:repeats:block: — also added to the calling
  // thread's run loop in the default mode.
  static TimerPtr scheduledTimer(double interval, bool repeats, Block block);

  ~Timer() override;

  // Runs the block now, on the calling thread, without changing the schedule
  // of a repeating timer; a one-shot timer is invalidated afterwards. Does
  // nothing on an invalid timer.
  void fire();
  // Stops the timer for good: it leaves every run loop and releases its
  // block. From any thread; a firing already under way finishes.
  void invalidate();
  bool isValid() const;

  // When the timer is next due.
  Date fireDate() const;
  // Moves the next firing; a repeating timer's schedule continues from there.
  void setFireDate(Date date);
  // The interval of a repeating timer; 0 for a one-shot timer.
  double timeInterval() const;
  const Value& userInfo() const;

  std::string className() const override;

  // Internal.
  const std::shared_ptr<detail::TimerCore>& core() const noexcept { return core_; }
  Timer(std::shared_ptr<detail::TimerCore> core, Value userInfo);

 private:
  std::shared_ptr<detail::TimerCore> core_;
  Value userInfo_;
};

}  // namespace kivi
