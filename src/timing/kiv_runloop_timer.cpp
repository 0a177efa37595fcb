#include "kivi/timing/kiv_runloop_timer.h"

#include <utility>

namespace kivi {

KivRunloopTimer::KivRunloopTimer(double timeInterval, RunLoopMode runloopMode,
                                 KivTimerDisposition disposition, TimerBlock block)
    : timeInterval_(timeInterval),
      runloopMode_(std::move(runloopMode)),
      timerBlock_(std::move(block)),
      timerDisposition_(disposition),
      operationQueue_(std::make_shared<OperationQueue>()) {
  operationQueue_->setMaxConcurrentOperationCount(1);
}

std::shared_ptr<KivRunloopTimer> KivRunloopTimer::create(double timeInterval,
                                                         RunLoopMode runloopMode,
                                                         KivTimerDisposition disposition,
                                                         TimerBlock block) {
  auto timer = std::make_shared<KivRunloopTimer>(timeInterval, std::move(runloopMode), disposition,
                                                 std::move(block));
  timer->operationQueue_->setName("com.zorvik.KivRunloopTimer " + timer->description());
  return timer;
}

KivRunloopTimer::~KivRunloopTimer() {
  // An armed run-loop timer would hold this object; only a spent or never
  // started one can be left here.
  if (timer_) timer_->invalidate();
}

void KivRunloopTimer::start() {
  auto self = std::static_pointer_cast<KivRunloopTimer>(weak_from_this().lock());
  if (!self) return;  // not owned by a shared_ptr: nothing may hold it
  std::lock_guard lock(monitor_);
  stopTimer();
  // The main run loop refuses an empty mode; a timer armed for it would hold
  // this object for good without ever firing.
  if (runloopMode_.empty()) return;
  // The run-loop timer holds its target until it is invalidated.
  timer_ = Timer::create(
      timeInterval_, [self](const TimerPtr& timer) { self->onTimerTriggered(timer); }, Value(),
      timerDisposition_ == KivTimerDispositionRepeating);
  RunLoop::mainRunLoop()->addTimer(timer_, runloopMode_);
}

void KivRunloopTimer::cancel() { stopTimer(); }

void KivRunloopTimer::stopTimer() {
  // The run-loop timer may hold the last reference to this object: keep it
  // until the monitor is released.
  const auto keep = weak_from_this().lock();
  std::lock_guard lock(monitor_);
  if (timer_ && timer_->isValid()) timer_->invalidate();
  timer_.reset();
}

void KivRunloopTimer::onTimerTriggered(const TimerPtr&) {
  auto strong = std::static_pointer_cast<KivRunloopTimer>(weak_from_this().lock());
  if (!strong) return;
  std::weak_ptr<KivRunloopTimer> weak = strong;
  const auto queue = operationQueue();
  if (!queue) return;
  // The job keeps the timer alive until it has run.
  queue->addOperation(std::make_shared<BlockOperation>([strong, weak] {
    if (auto self = weak.lock()) {
      if (auto block = self->timerBlock()) block(self);
    }
  }));
}

std::shared_ptr<OperationQueue> KivRunloopTimer::operationQueue() const {
  std::lock_guard lock(monitor_);
  return operationQueue_;
}

void KivRunloopTimer::setOperationQueue(std::shared_ptr<OperationQueue> queue) {
  std::lock_guard lock(monitor_);
  operationQueue_ = std::move(queue);
}

TimerPtr KivRunloopTimer::timer() const {
  std::lock_guard lock(monitor_);
  return timer_;
}

void KivRunloopTimer::setTimer(TimerPtr timer) {
  std::lock_guard lock(monitor_);
  timer_ = std::move(timer);
}

KivRunloopTimer::TimerBlock KivRunloopTimer::timerBlock() const {
  std::lock_guard lock(monitor_);
  return timerBlock_;
}

void KivRunloopTimer::setTimerBlock(TimerBlock block) {
  std::lock_guard lock(monitor_);
  timerBlock_ = std::move(block);
}

}  // namespace kivi
