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

// An asynchronous operation whose state is two flags, with a readiness gate the host controls.
class KIVI_EXPORT KivAsyncOperationObjC : public Operation {
 public:
  KivAsyncOperationObjC() = default;

  // Always true: the work ends after start() has returned.
  bool isAsynchronous() const override { return true; }
  // From moveToExecutingState() until coreCompleteOperation().
  bool isExecuting() const override;
  // From coreCompleteOperation() on.
  bool isFinished() const override;
  // readyState() (through the virtual getter) and, if it is true, the base
  // readiness (dependencies finished).
  bool isReady() const override;

  // Sets Executing (announced as above); called from start(), at most once.
  virtual void moveToExecutingState();
  // Sets Finished and no longer Executing (announced as above); the last call of the work.
  virtual void coreCompleteOperation();

  // The host's readiness gate: true unless the host set it false.
  virtual bool readyState() const;
  // Announces "isReady", even when the value does not change.
  virtual void setReadyState(bool readyState);

  // The error the work ended with; null for success. Set before coreCompleteOperation().
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

// An asynchronous operation whose state is one State value.
class KIVI_EXPORT KivAsyncOperation : public Operation {
 public:
  // Ready until moveToExecutingState(), then executing until coreCompleteOperation().
  enum class State : std::uint8_t { ready, executing, finished };

  // "Ready", "Executing", "Finished".
  static std::string_view rawValue(State state) noexcept;
  // The state with exactly this raw value (case-sensitive), or none.
  static std::optional<State> stateFromRawValue(std::string_view rawValue) noexcept;

  KivAsyncOperation() = default;

  // The error the work ended with; null for success. Set before coreCompleteOperation().
  virtual ErrorPtr completionError() const;
  virtual void setCompletionError(ErrorPtr error);
  // The current state. setState() only stores it: the transitions below announce the change.
  virtual State state() const;
  virtual void setState(State state);

  // Moves to executing (announced as above); called from start(), at most once.
  virtual void moveToExecutingState();
  // Moves to finished (announced as above); the last call of the work.
  virtual void coreCompleteOperation();

  // Always true: the work ends after start() has returned.
  bool isAsynchronous() const override { return true; }
  // Whether state() is executing, or finished.
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
