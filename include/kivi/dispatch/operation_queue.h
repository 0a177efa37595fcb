// OperationQueue: runs operations on the process's shared worker threads.
//
// An added operation is started (its start() called on a worker thread) once
// it is ready and fewer than maxConcurrentOperationCount operations of the
// queue are executing; among ready operations the earliest added starts
// first. An operation counts as executing from its start() until it announces
// "isFinished" with isFinished() reading true; an asynchronous operation thus
// keeps its place after start() returns. Readiness is re-read whenever the
// operation announces "isReady".
//
//   auto queue = std::make_shared<kivi::OperationQueue>();
//   queue->setName("uploads");
//   queue->setMaxConcurrentOperationCount(2);
//   queue->addOperation(op);
//   queue->waitUntilAllOperationsAreFinished();
//
// maxConcurrentOperationCount: -1 (the default) lets the queue decide
// (kDefaultConcurrency); 0 starts nothing; any other negative value behaves
// as -1. Operations are held until they finish; the queue keeps itself alive
// while it holds operations, so releasing the last reference to a busy queue
// does not stop its work.
//
// Refused without effect: a null operation, one already in a queue, one that
// has finished.
//
// Thread contract: every member may be called from any thread. Nothing the
// queue calls (start, isReady, cancel) runs under the queue's lock. The wait
// calls block the caller; calling them from an operation of the same queue
// deadlocks. "name" and "maxConcurrentOperationCount" are observable.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/dispatch/operation.h"
#include "kivi/dispatch/operation_queue_protocol.h"
#include "kivi/export.h"

namespace kivi {

namespace detail {
struct QueueCore;
}

// The default maxConcurrentOperationCount: the queue decides.
inline constexpr std::int64_t OperationQueueDefaultMaxConcurrentOperationCount = -1;

class KIVI_EXPORT OperationQueue : public Object, public OperationQueueProtocol {
 public:
  // What "the queue decides" means here.
  static constexpr std::int64_t kDefaultConcurrency = 64;

  OperationQueue();
  ~OperationQueue() override;

  std::string description() const override { return Object::description(); }
  std::string className() const override { return "NSOperationQueue"; }

  // Adds an operation (refused ones as described above); it starts when its turn comes.
  void addOperation(const OperationPtr& operation) override;
  // Adds each operation; with `waitUntilFinished`, blocks until all those accepted have
  // finished and left the queue.
  void addOperations(const std::vector<OperationPtr>& operations, bool waitUntilFinished) override;
  // Adds a BlockOperation running `block`.
  void addOperationWithBlock(std::function<void()> block);
  // Calls cancel() on each operation the queue holds; they still leave it by finishing.
  void cancelAllOperations() override;
  // Blocks until the queue holds no operation, also those added meanwhile.
  void waitUntilAllOperationsAreFinished() override;

  void addObserver(const std::shared_ptr<Object>& observer, std::string_view keyPath,
                   KeyValueObservingOptions options, void* context) override {
    Object::addObserver(observer, keyPath, options, context);
  }
  void removeObserver(const Object* observer, std::string_view keyPath) override {
    Object::removeObserver(observer, keyPath);
  }
  using Object::removeObserver;

  // How many operations may execute at once; see above for -1, 0 and other negatives.
  std::int64_t maxConcurrentOperationCount() const override;
  void setMaxConcurrentOperationCount(std::int64_t count) override;
  // A name for debugging, empty by default.
  std::string name() const override;
  void setName(std::string name) override;
  // The operations the queue holds, waiting or executing (a copy of the list), and their number.
  [[nodiscard]] std::vector<OperationPtr> operations() const override;
  std::uint64_t operationCount() const override;

  // A suspended queue starts nothing new; setSuspended() announces "isSuspended".
  bool isSuspended() const;
  void setSuspended(bool suspended);

  Value valueForKey(std::string_view key) const override;

 private:
  std::shared_ptr<detail::QueueCore> core_;
};

}  // namespace kivi
