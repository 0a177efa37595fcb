#include "kivi/operations/kiv_async_operation.h"

namespace kivi {

// KivAsyncOperationObjC

bool KivAsyncOperationObjC::isExecuting() const { return executing_; }
bool KivAsyncOperationObjC::isFinished() const { return finished_; }

bool KivAsyncOperationObjC::isReady() const {
  if (!readyState()) return false;
  return Operation::isReady();
}

void KivAsyncOperationObjC::transition(bool executing, bool finished) {
  // Observers (the queue among them) may drop their last reference while
  // they are being told; stay alive until the last announcement.
  auto self = weak_from_this().lock();
  willChangeValueForKey("isExecuting");
  willChangeValueForKey("isFinished");
  executing_ = executing;
  finished_ = finished;
  didChangeValueForKey("isFinished");
  didChangeValueForKey("isExecuting");
}

void KivAsyncOperationObjC::moveToExecutingState() { transition(true, false); }
void KivAsyncOperationObjC::coreCompleteOperation() { transition(false, true); }

bool KivAsyncOperationObjC::readyState() const { return readyState_; }

void KivAsyncOperationObjC::setReadyState(bool readyState) {
  auto self = weak_from_this().lock();
  willChangeValueForKey("isReady");
  readyState_ = readyState;
  didChangeValueForKey("isReady");
}

ErrorPtr KivAsyncOperationObjC::completionError() const { return completionError_; }
void KivAsyncOperationObjC::setCompletionError(ErrorPtr error) {
  completionError_ = std::move(error);
}

Value KivAsyncOperationObjC::valueForKey(std::string_view key) const {
  if (key == "readyState") return Value(readyState());
  if (key == "completionError") {
    return completionError() ? Value(std::const_pointer_cast<Error>(completionError())) : Value();
  }
  return Operation::valueForKey(key);
}

// KivAsyncOperation

std::string_view KivAsyncOperation::rawValue(State state) noexcept {
  switch (state) {
    case State::ready:
      return "Ready";
    case State::executing:
      return "Executing";
    case State::finished:
      return "Finished";
  }
  return {};
}

std::optional<KivAsyncOperation::State> KivAsyncOperation::stateFromRawValue(
    std::string_view rawValue) noexcept {
  for (State state : {State::ready, State::executing, State::finished}) {
    if (KivAsyncOperation::rawValue(state) == rawValue) return state;
  }
  return std::nullopt;
}

std::string_view KivAsyncOperation::keyPath(State state) noexcept {
  // "is" followed by the raw value; spelled out once so that announcing a
  // transition builds no strings.
  static constexpr std::string_view kKeys[] = {"isReady", "isExecuting", "isFinished"};
  return kKeys[static_cast<std::size_t>(state)];
}

ErrorPtr KivAsyncOperation::completionError() const { return completionError_; }
void KivAsyncOperation::setCompletionError(ErrorPtr error) { completionError_ = std::move(error); }
KivAsyncOperation::State KivAsyncOperation::state() const { return state_; }
void KivAsyncOperation::setState(State state) { state_ = state; }

void KivAsyncOperation::changeState(State newState) {
  auto self = weak_from_this().lock();
  const State oldState = state();
  willChangeValueForKey(keyPath(oldState));
  willChangeValueForKey(keyPath(newState));
  setState(newState);
  didChangeValueForKey(keyPath(newState));
  didChangeValueForKey(keyPath(oldState));
}

void KivAsyncOperation::moveToExecutingState() { changeState(State::executing); }
void KivAsyncOperation::coreCompleteOperation() { changeState(State::finished); }

Value KivAsyncOperation::valueForKey(std::string_view key) const {
  if (key == "state") return Value(std::string(rawValue(state())));
  if (key == "completionError") {
    return completionError() ? Value(std::const_pointer_cast<Error>(completionError())) : Value();
  }
  return Operation::valueForKey(key);
}

}  // namespace kivi
