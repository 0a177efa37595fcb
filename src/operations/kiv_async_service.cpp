#include "kivi/operations/kiv_async_service.h"

#include <mutex>

#include "kivi/dispatch/operation_queue.h"

namespace kivi {

namespace {

std::shared_ptr<OperationQueueProtocol> makeQueue(std::string name, std::int64_t count) {
  auto queue = std::make_shared<OperationQueue>();
  queue->setName(std::move(name));
  queue->setMaxConcurrentOperationCount(count);
  return queue;
}

}  // namespace

KivAsyncServiceObjC::KivAsyncServiceObjC(std::string operationQueueName)
    : KivAsyncServiceObjC(std::move(operationQueueName), 1) {}

KivAsyncServiceObjC::KivAsyncServiceObjC(std::string operationQueueName,
                                         std::int64_t maxConcurrentOperationCount)
    : operationQueue_(makeQueue(std::move(operationQueueName), maxConcurrentOperationCount)) {}

std::shared_ptr<OperationQueueProtocol> KivAsyncServiceObjC::operationQueue() const {
  return operationQueue_;
}

void KivAsyncServiceObjC::setOperationQueue(std::shared_ptr<OperationQueueProtocol> queue) {
  willChangeValueForKey("operationQueue");
  operationQueue_ = std::move(queue);
  didChangeValueForKey("operationQueue");
}

Value KivAsyncServiceObjC::valueForKey(std::string_view key) const {
  if (key == "operationQueue") return Value(std::dynamic_pointer_cast<Object>(operationQueue()));
  return Object::valueForKey(key);
}

KivAsyncService::KivAsyncService(std::string operationQueueName,
                                 std::int64_t maxConcurrentOperationCount)
    : operationQueue_(makeQueue(std::move(operationQueueName), maxConcurrentOperationCount)) {}

std::shared_ptr<OperationQueueProtocol> KivAsyncService::operationQueue() const {
  return operationQueue_;
}

void KivAsyncService::setOperationQueue(std::shared_ptr<OperationQueueProtocol> queue) {
  operationQueue_ = std::move(queue);
}

KivAtomicWorkflowService::KivAtomicWorkflowService(std::string operationQueueName)
    : KivAsyncServiceObjC(std::move(operationQueueName), 1),
      atomicWorkFlowLock_(std::make_shared<RecursiveLock>()),
      pendingOperations_(std::make_shared<PendingOperationList>()) {}

void KivAtomicWorkflowService::startAtomicWorkflowWithOperation(const OperationPtr& operation) {
  if (!operation) return;
  auto lock = atomicWorkFlowLock();
  if (!lock) return;
  std::lock_guard guard(*lock);
  if (isAtomicWorkflowInProgress()) {
    if (auto pending = pendingOperations()) pending->push_back(operation);
    return;
  }
  setIsAtomicWorkflowInProgress(true);
  if (auto queue = operationQueue()) queue->addOperation(operation);
}

void KivAtomicWorkflowService::endAtomicWorkflow() {
  auto lock = atomicWorkFlowLock();
  if (!lock) return;
  std::lock_guard guard(*lock);
  setIsAtomicWorkflowInProgress(false);
  auto pending = pendingOperations();
  if (pending && !pending->empty()) {
    OperationPtr next = std::move(pending->front());
    pending->pop_front();
    startAtomicWorkflowWithOperation(next);
  }
}

void KivAtomicWorkflowService::cancelAllPendingOperations() {
  auto lock = atomicWorkFlowLock();
  if (!lock) return;
  std::lock_guard guard(*lock);
  auto pending = pendingOperations();
  if (!pending) return;
  // By index: a cancel may call back into the service on this thread.
  for (std::size_t i = 0; i < pending->size(); ++i) {
    OperationPtr operation = (*pending)[i];
    if (operation) operation->cancel();
  }
}

void KivAtomicWorkflowService::enumeratePendingOperationsUsingBlock(
    const std::function<void(const OperationPtr&, std::uint64_t, bool*)>& block) {
  if (!block) return;
  auto lock = atomicWorkFlowLock();
  if (!lock) return;
  std::lock_guard guard(*lock);
  auto pending = pendingOperations();
  if (!pending) return;
  bool stop = false;
  for (std::size_t i = 0; i < pending->size() && !stop; ++i) {
    OperationPtr operation = (*pending)[i];
    block(operation, i, &stop);
  }
}

bool KivAtomicWorkflowService::isAtomicWorkflowInProgress() const {
  return isAtomicWorkflowInProgress_;
}

void KivAtomicWorkflowService::setIsAtomicWorkflowInProgress(bool inProgress) {
  willChangeValueForKey("isAtomicWorkflowInProgress");
  isAtomicWorkflowInProgress_ = inProgress;
  didChangeValueForKey("isAtomicWorkflowInProgress");
}

std::shared_ptr<RecursiveLock> KivAtomicWorkflowService::atomicWorkFlowLock() const {
  return atomicWorkFlowLock_;
}

void KivAtomicWorkflowService::setAtomicWorkFlowLock(std::shared_ptr<RecursiveLock> lock) {
  if (!lock) return;
  willChangeValueForKey("atomicWorkFlowLock");
  atomicWorkFlowLock_ = std::move(lock);
  didChangeValueForKey("atomicWorkFlowLock");
}

std::shared_ptr<PendingOperationList> KivAtomicWorkflowService::pendingOperations() const {
  return pendingOperations_;
}

void KivAtomicWorkflowService::setPendingOperations(
    std::shared_ptr<PendingOperationList> pendingOperations) {
  if (!pendingOperations) return;
  willChangeValueForKey("pendingOperations");
  pendingOperations_ = std::move(pendingOperations);
  didChangeValueForKey("pendingOperations");
}

Value KivAtomicWorkflowService::valueForKey(std::string_view key) const {
  if (key == "isAtomicWorkflowInProgress") return Value(isAtomicWorkflowInProgress());
  if (key == "atomicWorkFlowLock") return Value(atomicWorkFlowLock());
  if (key == "pendingOperations") {
    const auto pending = pendingOperations();
    if (!pending) return Value();
    Array operations;
    operations.reserve(pending->size());
    for (const OperationPtr& operation : *pending) operations.emplace_back(operation);
    return Value(std::move(operations));
  }
  return KivAsyncServiceObjC::valueForKey(key);
}

}  // namespace kivi
