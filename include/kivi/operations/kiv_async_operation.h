// Asynchronous operation base classes: operations whose work ends later, on
// another thread, when a callback arrives. They stay Executing in their
// queue's eyes until the subclass declares them done.
//
// Two variants with one design:
//   KivAsyncOperationObjC  state as two flags (isExecuting, isFinished) plus a
//                          host-controlled readiness gate, readyState;
//   KivAsyncOperation      state as one enumeration, State; no gate.
//
// Contract for subclasses (both variants): override start(). In it, first
// finish at once if the operation is already cancelled (set the outcome,
// call coreCompleteOperation()); otherwise call moveToExecutingState() and
// begin the work. When the work ends, set completionError (and any result
// fields) first and call coreCompleteOperation() last, exactly once.
//
//   class Fetch : public kivi::KivAsyncOperation {
//     void start() override {
//       if (isCancelled()) {
//         coreCompleteOperation();
//         return;
//       }
//       moveToExecutingState();
//       client.fetch([weak = weak_from_this()](auto result) {
//         auto self = std::static_pointer_cast<Fetch>(weak.lock());
//         if (!self) return;
//         self->setCompletionError(result.error);
//         self->coreCompleteOperation();
//       });
//     }
//   };
//
// Announcements (will-change / did-change, in this order):
//   KivAsyncOperationObjC, both transitions:
//     will "isExecuting", will "isFinished", (set), did "isFinished", did "isExecuting"
//   KivAsyncOperation, from state old to state new:
//     will key(old), will key(new), (set), did key(new), did key(old)
//   where key(s) is "is" + rawValue(s): "isReady", "isExecuting", "isFinished".
//
// Thread contract: there is no lock here. Transitions announce on the calling
// thread. The subclass must make sure two transitions of one operation never
// run at the same time, and must call moveToExecutingState at most once and
// only before coreCompleteOperation; the core does not check the current
// state. completionError must be set before coreCompleteOperation and not
// changed afterwards while other threads may read it.
#pragma once

#include <atomic>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/error.h"
#include "kivi/dispatch/operation.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivAsyncOperationObjC : public Operation {
 public:
  KivAsyncOperationObjC() = default;

  bool isAsynchronous() const override { return true; }
  bool isExecuting() const override;
  bool isFinished() const override;
  // readyState() (through the virtual getter) and, if it is true, the base
  // readiness (dependencies finished).
  bool isReady() const override;

  virtual void moveToExecutingState();
  virtual void coreCompleteOperation();

  virtual bool readyState() const;
  // Announces "isReady", even when the value does not change.
  virtual void setReadyState(bool readyState);

  virtual ErrorPtr completionError() const;
  virtual void setCompletionError(ErrorPtr error);

  Value valueForKey(std::string_view key) const override;

 private:
  void transition(bool executing, bool finished);

  std::atomic<bool> executing_{false};
  std::atomic<bool> finished_{false};
  std::atomic<bool> readyState_{true};
  ErrorPtr completionError_;
};

class KIVI_EXPORT KivAsyncOperation : public Operation {
 public:
  enum class State : std::uint8_t { ready, executing, finished };

  // "Ready", "Executing", "Finished".
  static std::string_view rawValue(State state) noexcept;
  // The state with exactly this raw value (case-sensitive), or none.
  static std::optional<State> stateFromRawValue(std::string_view rawValue) noexcept;

  KivAsyncOperation() = default;

  virtual ErrorPtr completionError() const;
  virtual void setCompletionError(ErrorPtr error);
  virtual State state() const;
  virtual void setState(State state);

  virtual void moveToExecutingState();
  virtual void coreCompleteOperation();

  bool isAsynchronous() const override { return true; }
  bool isExecuting() const override { return state() == State::executing; }
  bool isFinished() const override { return state() == State::finished; }

  Value valueForKey(std::string_view key) const override;

 private:
  // "is" + rawValue(state).
  static std::string_view keyPath(State state) noexcept;
  void changeState(State newState);

  ErrorPtr completionError_;
  std::atomic<State> state_{State::ready};
};

}  // namespace kivi
