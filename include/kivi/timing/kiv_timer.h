// KivTimer: a timer that counts down on a worker thread of an operation
// queue, once or repeatedly. It needs no run loop, so it works from any thread
// and while the main thread is blocked.
//
//   auto timer = kivi::KivTimer::create([] { refreshToken(); }, 30.0,
//                                       kivi::KivTimerDispositionRepeating);
//   timer->start();
//   ...
//   timer->cancel();  // or let go of the last reference
//
// Each countdown is one KivTimerOperation, which sleeps a worker of
// operationQueue for timeInterval seconds. When it ends, the timer, holding
// its monitor, marks itself idle, queues the next countdown if it repeats
// (before the callback runs, so the period does not drift by the callback's
// length), then calls completionBlock. So:
//   - start() while a countdown is in progress changes nothing: the countdown
//     is neither restarted nor duplicated.
//   - cancel() cancels every operation of operationQueue (not only this
//     timer's countdowns), sets isCancelled and clears isRunning. A countdown
//     already sleeping keeps its thread until its interval has passed, then
//     ends silently. The next start() clears isCancelled and counts down
//     afresh.
//   - A null completionBlock suppresses the callback, not the re-arming.
//   - Every disposition other than KivTimerDispositionRepeating is one-shot;
//     a one-shot timer may be started again after it fired.
//   - Releasing the last reference cancels.
//   - Only the countdown most recently queued counts: the late completion of
//     an earlier one (replaced after a cancel() and start()) is ignored.
//
// Intervals: an interval of zero, below zero or NaN counts down for
// KivTimerMinimumTimeInterval (0.1 ms), the platform's minimum for timers, so
// a repeating timer never spins without pause. An infinite interval never
// fires (its countdown sleeps for about a century and holds a worker thread
// meanwhile, even after cancel()).
//
// A timer must be owned by a std::shared_ptr (create() makes one); start()
// does nothing on one that is not.
//
// Thread contract: start(), cancel() and the handling of each countdown's end
// serialise on the timer's own recursive monitor. completionBlock runs on a
// worker thread with the monitor held: start() or cancel() called from inside
// the callback works at once; called from another thread it waits until the
// callback has returned. Callbacks of one timer therefore never overlap,
// while the next countdown of a repeating timer already sleeps on another
// worker. The callback must not wait for another thread that is calling into
// the same timer. The property accessors may be used from any thread and
// never wait for the monitor; a change takes effect at the next countdown.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/base/object.h"
#include "kivi/dispatch/operation_queue_protocol.h"
#include "kivi/export.h"
#include "kivi/timing/kiv_timer_operation.h"
#include "kivi/timing/kiv_timer_protocol.h"

namespace kivi {

// The shortest countdown; stands in for intervals of zero, below zero or NaN.
inline constexpr double KivTimerMinimumTimeInterval = 0.0001;

class KIVI_EXPORT KivTimer : public Object, public KivTimerProtocol {
 public:
  // The timer's callback.
  using CompletionBlock = std::function<void()>;

  // initWithCompletionBlock:timerInterval:timerDisposition: — makes a new
  // operation queue with default settings; does not start.
  [[nodiscard]] static std::shared_ptr<KivTimer> create(CompletionBlock completionBlock,
                                                        double timerInterval,
                                                        KivTimerDisposition timerDisposition);
  // Use create().
  KivTimer(CompletionBlock completionBlock, double timerInterval,
           KivTimerDisposition timerDisposition);
  // Performs cancel().
  ~KivTimer() override;

  // Clears isCancelled; unless a countdown is in progress, queues a new one
  // and sets isRunning.
  void start() override;
  // Cancels every operation of operationQueue, sets isCancelled, clears
  // isRunning.
  void cancel() override;
  // Handles the end of one countdown; called by the countdown's completion
  // handler. A cancelled (or null) operation is ignored at once, without
  // taking the monitor.
  void didCompleteTimerOperation(const std::shared_ptr<KivTimerOperation>& operation);

  // Whether cancel() was called after the last start(). The setters here change the flag only.
  bool isCancelled() const;
  void setIsCancelled(bool cancelled);
  // Whether a countdown is in progress: set by start(), cleared when it ends and by cancel().
  bool isRunning() const;
  void setIsRunning(bool running);
  // The queue the countdowns run on; the timer makes its own at creation.
  std::shared_ptr<OperationQueueProtocol> operationQueue() const;
  // A null queue is refused (nothing changes). Countdowns already queued stay
  // in the old queue, and cancel() no longer reaches them.
  void setOperationQueue(std::shared_ptr<OperationQueueProtocol> queue);
  // Seconds per countdown (see Intervals above).
  double timeInterval() const;
  void setTimeInterval(double interval);
  // Repeating or one-shot (see KivTimerProtocol).
  KivTimerDisposition disposition() const;
  void setDisposition(KivTimerDisposition disposition);
  // Called at the end of each countdown, as described above; null suppresses the call.
  CompletionBlock completionBlock() const;
  void setCompletionBlock(CompletionBlock block);

  std::string description() const override { return Object::description(); }
  std::string className() const override { return "KivTimer"; }

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace kivi
