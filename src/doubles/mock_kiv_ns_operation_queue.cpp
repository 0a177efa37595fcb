#include "kivi/doubles/mock_kiv_ns_operation_queue.h"

namespace kivi {

void MockKivNSOperationQueue::addOperation(const OperationPtr& operation) {
  if (addOperationBlock) addOperationBlock(operation);
}

void MockKivNSOperationQueue::addOperations(const std::vector<OperationPtr>& operations,
                                            bool waitUntilFinished) {
  if (addOperationsBlock) addOperationsBlock(operations, waitUntilFinished);
}

void MockKivNSOperationQueue::cancelAllOperations() {
  if (cancelAllOperationsBlock) cancelAllOperationsBlock();
}

void MockKivNSOperationQueue::waitUntilAllOperationsAreFinished() {
  if (waitUntilAllOperationsAreFinishedBlock) waitUntilAllOperationsAreFinishedBlock();
}

void MockKivNSOperationQueue::addObserver(const std::shared_ptr<Object>& observer,
                                          std::string_view keyPath,
                                          KeyValueObservingOptions options, void* context) {
  if (addObserverBlock) addObserverBlock(observer, keyPath, options, context);
}

void MockKivNSOperationQueue::removeObserver(const Object* observer, std::string_view keyPath) {
  if (removeObserverBlock) removeObserverBlock(observer, keyPath);
}

}  // namespace kivi
