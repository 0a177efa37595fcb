// KivRunloopTimer: a timer that counts down on the main run loop, in a mode
// the caller picks, and runs its callback on a private serial queue.
//
// It fires only while the main run loop runs in `runloopMode` (a host loop
// calling RunLoop::runPendingWork() runs the default mode), so a timer of a
// mode the loop is not in waits. The callback never runs on the main thread;
// its invocations run one at a time, in firing order.
//
//   auto timer = kivi::KivRunloopTimer::create(
//       1.0, kivi::NSDefaultRunLoopMode, kivi::KivTimerDispositionRepeating,
//       [](const std::shared_ptr<kivi::KivRunloopTimer>& timer) { poll(); });
//   timer->start();
//   ...
//   timer->cancel();
//
// While armed, the run loop's timer holds this object (as the platform's
// timer holds its target): a repeating timer stays alive until cancel(), even
// when the caller lets go of it. Dispositions other than repeating are
// one-shot. An interval of zero, below zero or NaN is the run loop's minimum.
//
// Thread contract: start() and cancel() from any thread; they serialise on
// the timer's own monitor. Firings already handed to the private queue still
// run after cancel(). The properties are plain values: set them before
// start() or from the thread that starts it.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "kivi/base/object.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/timer.h"
#include "kivi/export.h"
#include "kivi/timing/kiv_timer_protocol.h"

namespace kivi {

class KIVI_EXPORT KivRunloopTimer : public Object, public KivTimerProtocol {
 public:
  // The callback; it is given the timer that fired.
  using TimerBlock = std::function<void(const std::shared_ptr<KivRunloopTimer>& timer)>;

  // initWithTimeInterval:runloopMode:timerDisposition:block: — does not
  // start. The private queue is named "com.zorvik.KivRunloopTimer " followed
  // by the timer's description.
  [[nodiscard]] static std::shared_ptr<KivRunloopTimer> create(double timeInterval,
                                                               RunLoopMode runloopMode,
                                                               KivTimerDisposition disposition,
                                                               TimerBlock block);

  ~KivRunloopTimer() override;

  // Stops an armed timer and arms a fresh one on the main run loop.
  void start() override;
  // Stops the armed timer.
  void cancel() override;
  // The run-loop timer's action (main thread): hands one invocation of
  // timerBlock to the private queue.
  void onTimerTriggered(const TimerPtr& timer);
  // Invalidates the run-loop timer if it is valid and forgets it.
  void stopTimer();

  // Seconds from start() to the first firing and between firings; read by start().
  double timeInterval() const { return timeInterval_; }
  void setTimeInterval(double interval) { timeInterval_ = interval; }
  // The run loop's timer while armed, null otherwise.
  TimerPtr timer() const;
  void setTimer(TimerPtr timer);
  // The main run loop's mode the timer fires in; read by start(), which arms nothing for an
  // empty mode.
  const RunLoopMode& runloopMode() const { return runloopMode_; }
  void setRunloopMode(RunLoopMode mode) { runloopMode_ = std::move(mode); }
  // The callback; a new one applies to the invocations that have not run yet.
  TimerBlock timerBlock() const;
  void setTimerBlock(TimerBlock block);
  // Repeating or one-shot (see KivTimerProtocol); read by start().
  KivTimerDisposition timerDisposition() const { return timerDisposition_; }
  void setTimerDisposition(KivTimerDisposition disposition) { timerDisposition_ = disposition; }
  // The queue the callback runs on: a private one that runs one invocation at a time, made
  // with the timer. While it is null, firings run nothing.
  std::shared_ptr<OperationQueue> operationQueue() const;
  void setOperationQueue(std::shared_ptr<OperationQueue> queue);

  std::string description() const override { return Object::description(); }
  std::string className() const override { return "KivRunloopTimer"; }

  // Use create().
  KivRunloopTimer(double timeInterval, RunLoopMode runloopMode, KivTimerDisposition disposition,
                  TimerBlock block);

 private:
  mutable std::recursive_mutex monitor_;
  double timeInterval_;
  TimerPtr timer_;  // guarded by monitor_
  RunLoopMode runloopMode_;
  TimerBlock timerBlock_;  // guarded by monitor_
  KivTimerDisposition timerDisposition_;
  std::shared_ptr<OperationQueue> operationQueue_;  // guarded by monitor_
};

}  // namespace kivi
