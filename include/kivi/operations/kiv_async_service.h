// Services: the objects through which a host component runs its operations.
// Each owns one operation queue, held through OperationQueueProtocol so that a
// host can put a double in its place.
//
//   KivAsyncServiceObjC     observable (see below); the one-argument
//                           constructor gives a serial queue (limit 1)
//   KivAsyncService         plain; the caller always chooses the limit
//   KivAtomicWorkflowService  serial; runs one atomic workflow at a time
//
// An atomic workflow begins when the host hands its first operation to
// startAtomicWorkflowWithOperation() and lasts until the host calls
// endAtomicWorkflow(), typically from the completion of the workflow's last
// operation. Starts that arrive meanwhile are parked in arrival order and
// released one per endAtomicWorkflow():
//
//   auto service = std::make_shared<kivi::KivAtomicWorkflowService>("sync");
//   op->setCompletionBlock([weak = std::weak_ptr(service)] {
//     if (auto s = weak.lock()) s->endAtomicWorkflow();
//   });
//   service->startAtomicWorkflowWithOperation(op);
//
// Observable: every setter of KivAsyncServiceObjC and KivAtomicWorkflowService
// announces its change with willChangeValueForKey / didChangeValueForKey under
// the property's name ("operationQueue", "isAtomicWorkflowInProgress",
// "atomicWorkFlowLock", "pendingOperations"), also when the value stays the
// same, and valueForKey answers for each (a queue that is no Object, and a
// missing one, read as the null marker; the pending list as an Array copy).
// The workflow operations set the flag through its setter, so observers of
// "isAtomicWorkflowInProgress" see every start and end, on the calling thread
// with the lock held. The workflow operations and every accessor are virtual
// and read and write the fields only through the accessors: a subclass may
// override any of them, and endAtomicWorkflow() hands a released operation to
// the subclass's startAtomicWorkflowWithOperation().
//
// Thread contract: the workflow operations may be called from any thread; all
// four hold atomicWorkFlowLock (a recursive lock) for their whole length,
// including the call into the queue and the whole enumeration. An enumeration
// callback may call back into the service on the same thread but must not
// park or release operations. The field accessors take no lock; replacing the
// queue, the lock or the list while other threads use the service is not
// synchronised.
#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "kivi/base/object.h"
#include "kivi/base/recursive_lock.h"
#include "kivi/dispatch/operation.h"
#include "kivi/dispatch/operation_queue_protocol.h"
#include "kivi/export.h"

namespace kivi {

// An observable service that runs its operations on one queue.
class KIVI_EXPORT KivAsyncServiceObjC : public Object {
 public:
  // A queue named `operationQueueName` with a concurrency limit of 1.
  explicit KivAsyncServiceObjC(std::string operationQueueName);
  // A new kivi::OperationQueue; then its name, then its limit, passed through
  // unchanged.
  KivAsyncServiceObjC(std::string operationQueueName, std::int64_t maxConcurrentOperationCount);

  // The queue the service's operations run on; a host may put a double in its place.
  virtual std::shared_ptr<OperationQueueProtocol> operationQueue() const;
  // Announces "operationQueue".
  virtual void setOperationQueue(std::shared_ptr<OperationQueueProtocol> operationQueue);

  Value valueForKey(std::string_view key) const override;

 private:
  std::shared_ptr<OperationQueueProtocol> operationQueue_;
};

// A plain service that runs its operations on one queue; nothing is announced.
class KIVI_EXPORT KivAsyncService {
 public:
  // A new kivi::OperationQueue with this name and concurrency limit, passed through unchanged.
  KivAsyncService(std::string operationQueueName, std::int64_t maxConcurrentOperationCount);

  virtual ~KivAsyncService() = default;

  // The queue the service's operations run on; a host may put a double in its place.
  virtual std::shared_ptr<OperationQueueProtocol> operationQueue() const;
  virtual void setOperationQueue(std::shared_ptr<OperationQueueProtocol> operationQueue);

 private:
  std::shared_ptr<OperationQueueProtocol> operationQueue_;
};

// The operations parked while a workflow runs, oldest first.
using PendingOperationList = std::deque<OperationPtr>;

// A serial service that runs one atomic workflow at a time and parks the starts that come
// meanwhile.
class KIVI_EXPORT KivAtomicWorkflowService : public KivAsyncServiceObjC {
 public:
  // Always serial: the queue's limit is 1. This is the service's only
  // constructor, so every service has its lock and its pending list.
  explicit KivAtomicWorkflowService(std::string operationQueueName);

  // Idle: hands `operation` to the queue and becomes Busy. Busy: parks it.
  // A null operation is refused; nothing changes.
  virtual void startAtomicWorkflowWithOperation(const OperationPtr& operation);
  // Becomes Idle, then releases the oldest parked operation, if any, through
  // startAtomicWorkflowWithOperation() (which makes the service Busy again).
  virtual void endAtomicWorkflow();
  // Cancels every parked operation, oldest first; they stay parked.
  virtual void cancelAllPendingOperations();
  // Calls `block` with each parked operation and its index, oldest first,
  // until it sets *stop to true.
  virtual void enumeratePendingOperationsUsingBlock(
      const std::function<void(const OperationPtr& operation, std::uint64_t index, bool* stop)>&
          block);

  // True from a workflow's start until endAtomicWorkflow().
  virtual bool isAtomicWorkflowInProgress() const;
  // Announces "isAtomicWorkflowInProgress".
  virtual void setIsAtomicWorkflowInProgress(bool inProgress);
  // The lock the workflow operations hold.
  virtual std::shared_ptr<RecursiveLock> atomicWorkFlowLock() const;
  // Announces "atomicWorkFlowLock". A null lock is refused (nothing changes,
  // nothing is announced).
  virtual void setAtomicWorkFlowLock(std::shared_ptr<RecursiveLock> lock);
  // The parked operations, oldest first.
  virtual std::shared_ptr<PendingOperationList> pendingOperations() const;
  // Announces "pendingOperations". A null list is refused.
  virtual void setPendingOperations(std::shared_ptr<PendingOperationList> pendingOperations);

  Value valueForKey(std::string_view key) const override;

 private:
  std::atomic<bool> isAtomicWorkflowInProgress_{false};
  std::shared_ptr<RecursiveLock> atomicWorkFlowLock_;
  std::shared_ptr<PendingOperationList> pendingOperations_;
};

}  // namespace kivi
