// KivTimerOperation: one countdown of a KivTimer. A plain synchronous
// operation whose main() puts its worker thread to sleep for timerInterval
// seconds; it finishes when main() returns.
//
//   auto countdown = std::make_shared<kivi::KivTimerOperation>(0.5);
//   countdown->setCompletionBlock([] { halfASecondLater(); });
//   queue->addOperation(countdown);
//
// The sleep tells the worker pool that the worker is blocked, so many
// countdowns sleeping at once never hold up other work. An interval of zero,
// below zero or NaN returns at once; infinity sleeps for good (about a
// century). Cancelling an operation that is already sleeping does not wake
// it: it keeps its thread until the interval has passed, then finishes
// cancelled. One cancelled before it started never sleeps.
//
// Thread contract: every member may be called from any thread; a change of
// timerInterval made while main() sleeps does not shorten that sleep.
#pragma once

#include <atomic>
#include <string>

#include "kivi/dispatch/operation.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivTimerOperation : public Operation {
 public:
  // initWithTimeInterval:
  explicit KivTimerOperation(double timerInterval) : timerInterval_(timerInterval) {}

  // Sleeps the calling thread for timerInterval seconds.
  void main() override;

  // Seconds main() sleeps; read when the sleep begins.
  double timerInterval() const { return timerInterval_.load(std::memory_order_relaxed); }
  void setTimerInterval(double interval) {
    timerInterval_.store(interval, std::memory_order_relaxed);
  }

  std::string className() const override { return "KivTimerOperation"; }

 private:
  std::atomic<double> timerInterval_;
};

}  // namespace kivi
