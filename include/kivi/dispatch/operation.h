// Operation: one unit of work with a Ready / Executing / Finished life cycle,
// run by an OperationQueue or started by hand.
//
// A synchronous operation overrides main(); the base start() runs it and
// finishes the operation. An asynchronous operation overrides start(),
// isAsynchronous(), isExecuting() and isFinished(), and announces its own
// transitions with willChangeValueForKey / didChangeValueForKey of
// "isExecuting" and "isFinished" (kivi::KivAsyncOperation does this for you).
//
// Readiness: an operation is ready when all its dependencies have finished,
// or when it is cancelled. Subclasses may narrow isReady() and announce
// changes to it under the key "isReady"; a queue re-reads readiness on each
// announcement.
//
// When the operation announces "isFinished" and isFinished() reads true (the
// first time only): its dependents are told that their readiness may have
// changed, its completion block is handed to a worker thread (and cleared),
// its queue forgets it, and waitUntilFinished() returns.
//
//   auto op = std::make_shared<kivi::BlockOperation>([] { work(); });
//   op->setCompletionBlock([] { done(); });
//   queue->addOperation(op);
//
// Thread contract: every member may be called from any thread. Notifications
// are delivered on the thread that makes the change. An operation must be
// owned by a std::shared_ptr to be queued, to have dependents or to be
// observed.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

namespace detail {
struct OperationState;
struct QueueCore;
// Room for an operation's private state, kept inside the operation so that
// making one allocates nothing more.
inline constexpr std::size_t kOperationStateSize = 272;
}  // namespace detail

class Operation;
// How operations are held: to be queued, have dependents or be observed.
using OperationPtr = std::shared_ptr<Operation>;

class KIVI_EXPORT Operation : public Object {
 public:
  Operation();
  ~Operation() override;

  // Base behaviour for a synchronous operation: refused (ignored) when
  // already started, executing or finished, or when not ready and not
  // cancelled. Otherwise, unless cancelled, moves to executing and runs
  // main(); then finishes. For an asynchronous operation it does nothing:
  // such an operation's own start() does the work and owns the state.
  virtual void start();
  // The work of a synchronous operation. Does nothing by default.
  virtual void main();
  // Sets the cancelled flag (announced as "isCancelled") and, if unfinished,
  // announces "isReady": a cancelled operation is ready.
  virtual void cancel();

  // The state. isCancelled(): cancel() was called. The base isExecuting() and isFinished()
  // follow the base start(); isAsynchronous() is false unless overridden, and isConcurrent()
  // answers the same. isReady() is described above.
  virtual bool isCancelled() const;
  virtual bool isExecuting() const;
  virtual bool isFinished() const;
  virtual bool isAsynchronous() const;
  virtual bool isReady() const;
  bool isConcurrent() const { return isAsynchronous(); }

  // Dependencies are held strongly. Adding or removing one announces
  // "isReady". Adding the operation itself, or null, is ignored.
  void addDependency(const OperationPtr& operation);
  void removeDependency(const OperationPtr& operation);
  [[nodiscard]] std::vector<OperationPtr> dependencies() const;

  // Run on a worker thread once the operation has finished, then cleared; empty by default.
  [[nodiscard]] std::function<void()> completionBlock() const;
  void setCompletionBlock(std::function<void()> block);

  // A name for debugging, empty by default; setName() announces "name".
  [[nodiscard]] std::string name() const;
  void setName(std::string name);

  // Blocks until the operation has finished and its queue, if any, has let
  // it go. A worker of the pool counts as blocked meanwhile.
  void waitUntilFinished();

  // "isReady", "isExecuting", "isFinished", "isCancelled", "isAsynchronous",
  // "isConcurrent" and "name".
  Value valueForKey(std::string_view key) const override;

 protected:
  void keyValueDidChange(std::string_view key) override;

 private:
  friend struct detail::QueueCore;

  void didFinish();
  // Marks the finish as complete (its queue has let go) and wakes waiters.
  void deliverFinish();

  detail::OperationState& state() const noexcept;

  alignas(16) mutable unsigned char state_[detail::kOperationStateSize];
};

// An operation whose work is a function.
class KIVI_EXPORT BlockOperation : public Operation {
 public:
  // `block` is the work: main() calls it (an empty one does nothing).
  explicit BlockOperation(std::function<void()> block) : block_(std::move(block)) {}
  void main() override;
  std::string className() const override { return "NSBlockOperation"; }

 private:
  std::function<void()> block_;
};

}  // namespace kivi
