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
  operationQueue_ = std::move(queue);
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
  isAtomicWorkflowInProgress_ = inProgress;
}

std::shared_ptr<RecursiveLock> KivAtomicWorkflowService::atomicWorkFlowLock() const {
  return atomicWorkFlowLock_;
}

void KivAtomicWorkflowService::setAtomicWorkFlowLock(std::shared_ptr<RecursiveLock> lock) {
  if (lock) atomicWorkFlowLock_ = std::move(lock);
}

std::shared_ptr<PendingOperationList> KivAtomicWorkflowService::pendingOperations() const {
  return pendingOperations_;
}

void KivAtomicWorkflowService::setPendingOperations(
    std::shared_ptr<PendingOperationList> pendingOperations) {
  if (pendingOperations) pendingOperations_ = std::move(pendingOperations);
}

}  // namespace kivi
