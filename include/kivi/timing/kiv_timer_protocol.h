// KivTimerProtocol: the one small interface behind which the library's timers
// (KivTimer, KivRunloopTimer) and their double (MockKivTimer) stand, so that
// code that needs a callback after an interval, once or repeatedly, can be
// handed any of them.
//
//   class Poller {
//    public:
//     explicit Poller(std::shared_ptr<kivi::KivTimerProtocol> timer) : timer_(std::move(timer)) {}
//     void resume() { timer_->start(); }
//     void pause() { timer_->cancel(); }
//
//    private:
//     std::shared_ptr<kivi::KivTimerProtocol> timer_;
//   };
//
// KivTimerDisposition is given to a timer when it is made: repeating (1)
// re-arms after each firing until cancelled; every other value, one-shot (0)
// included, fires once per start.
//
// Thread contract: that of the conformer. Both library timers take start()
// and cancel() from any thread; the double is not synchronised.
#pragma once

#include <cstdint>
#include <string>

#include "kivi/export.h"

namespace kivi {

// Whether a timer repeats: one of the two values below (any other value is one-shot).
using KivTimerDisposition = std::uint64_t;
// Fires once per start().
inline constexpr KivTimerDisposition KivTimerDispositionOneShot = 0;
// Re-arms after each firing until cancel().
inline constexpr KivTimerDisposition KivTimerDispositionRepeating = 1;

class KIVI_EXPORT KivTimerProtocol {
 public:
  virtual ~KivTimerProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Arms the timer.
  virtual void start() = 0;
  // Disarms the timer.
  virtual void cancel() = 0;
};

}  // namespace kivi
