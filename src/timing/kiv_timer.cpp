#include "kivi/timing/kiv_timer.h"

#include <atomic>
#include <mutex>
#include <utility>

#include "kivi/dispatch/operation_queue.h"

namespace kivi {

struct KivTimer::State {
  // The monitor of start(), cancel() and didCompleteTimerOperation().
  std::recursive_mutex monitor;
  // The countdown most recently queued, until its end is handled or the
  // timer is cancelled. Holding it keeps the operation alive for its
  // completion handler, which refers to it only weakly.
  std::shared_ptr<KivTimerOperation> countdown;  // guarded by monitor

  std::atomic<bool> isCancelled{false};
  std::atomic<bool> isRunning{false};
  std::atomic<double> timeInterval;
  std::atomic<KivTimerDisposition> disposition;

  mutable std::mutex fieldsMutex;                          // never held while calling out
  std::shared_ptr<OperationQueueProtocol> operationQueue;  // guarded by fieldsMutex
  CompletionBlock completionBlock;                         // guarded by fieldsMutex

  State(CompletionBlock block, double interval, KivTimerDisposition timerDisposition)
      : timeInterval(interval),
        disposition(timerDisposition),
        operationQueue(std::make_shared<OperationQueue>()),
        completionBlock(std::move(block)) {}
};

namespace {

// NaN fails the comparison as well.
double countdownInterval(double interval) {
  return interval > 0 ? interval : KivTimerMinimumTimeInterval;
}

}  // namespace

std::shared_ptr<KivTimer> KivTimer::create(CompletionBlock completionBlock, double timerInterval,
                                           KivTimerDisposition timerDisposition) {
  return std::make_shared<KivTimer>(std::move(completionBlock), timerInterval, timerDisposition);
}

KivTimer::KivTimer(CompletionBlock completionBlock, double timerInterval,
                   KivTimerDisposition timerDisposition)
    : state_(std::make_unique<State>(std::move(completionBlock), timerInterval, timerDisposition)) {
}

KivTimer::~KivTimer() { cancel(); }

void KivTimer::start() {
  std::weak_ptr<Object> weakTimer = weak_from_this();
  if (weakTimer.expired()) return;
  std::lock_guard guard(state_->monitor);
  setIsCancelled(false);
  if (isRunning()) return;
  auto operation = std::make_shared<KivTimerOperation>(countdownInterval(timeInterval()));
  std::weak_ptr<KivTimerOperation> weakOperation = operation;
  operation->setCompletionBlock([weakTimer, weakOperation] {
    auto timer = std::static_pointer_cast<KivTimer>(weakTimer.lock());
    auto countdown = weakOperation.lock();
    if (timer && countdown) timer->didCompleteTimerOperation(countdown);
  });
  state_->countdown = operation;
  setIsRunning(true);
  if (auto queue = operationQueue()) queue->addOperation(operation);
}

void KivTimer::cancel() {
  std::lock_guard guard(state_->monitor);
  if (auto queue = operationQueue()) queue->cancelAllOperations();
  setIsCancelled(true);
  setIsRunning(false);
  state_->countdown.reset();
}

void KivTimer::didCompleteTimerOperation(const std::shared_ptr<KivTimerOperation>& operation) {
  if (!operation || operation->isCancelled()) return;
  std::lock_guard guard(state_->monitor);
  // A countdown replaced by a later one (after cancel() and start(), its
  // queue no longer reachable by cancel()) ends silently: handling it would
  // run a second countdown beside the current one.
  if (state_->countdown && state_->countdown != operation) return;
  state_->countdown.reset();
  setIsRunning(false);
  if (disposition() == KivTimerDispositionRepeating && !isCancelled()) start();
  if (!isCancelled()) {
    if (auto block = completionBlock()) block();
  }
}

bool KivTimer::isCancelled() const { return state_->isCancelled.load(); }
void KivTimer::setIsCancelled(bool cancelled) { state_->isCancelled.store(cancelled); }
bool KivTimer::isRunning() const { return state_->isRunning.load(); }
void KivTimer::setIsRunning(bool running) { state_->isRunning.store(running); }

std::shared_ptr<OperationQueueProtocol> KivTimer::operationQueue() const {
  std::lock_guard lock(state_->fieldsMutex);
  return state_->operationQueue;
}

void KivTimer::setOperationQueue(std::shared_ptr<OperationQueueProtocol> queue) {
  if (!queue) return;
  std::lock_guard lock(state_->fieldsMutex);
  // The old queue leaves with `queue`, after the lock is released.
  state_->operationQueue.swap(queue);
}

double KivTimer::timeInterval() const { return state_->timeInterval.load(); }
void KivTimer::setTimeInterval(double interval) { state_->timeInterval.store(interval); }
KivTimerDisposition KivTimer::disposition() const { return state_->disposition.load(); }
void KivTimer::setDisposition(KivTimerDisposition disposition) {
  state_->disposition.store(disposition);
}

KivTimer::CompletionBlock KivTimer::completionBlock() const {
  std::lock_guard lock(state_->fieldsMutex);
  return state_->completionBlock;
}

void KivTimer::setCompletionBlock(CompletionBlock block) {
  std::lock_guard lock(state_->fieldsMutex);
  // The old block, and what it holds, leaves with `block`, after the lock is
  // released.
  state_->completionBlock.swap(block);
}

}  // namespace kivi
