// MockKivNSOperationQueue: a scriptable OperationQueueProtocol.
//
// Every operation calls the matching callback property, if set, with its
// arguments unchanged, and does nothing otherwise. Operations handed in are
// neither run nor kept: operations() stays empty and operationCount() 0.
// maxConcurrentOperationCount and name are plain stored values.
//
//   auto queue = std::make_shared<kivi::MockKivNSOperationQueue>();
//   std::vector<kivi::OperationPtr> added;
//   queue->addOperationBlock = [&](const kivi::OperationPtr& op) { added.push_back(op); };
//   service->setOperationQueue(queue);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/dispatch/operation_queue_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivNSOperationQueue : public Object, public OperationQueueProtocol {
 public:
  MockKivNSOperationQueue() = default;

  // Called by addOperation(operation); without it the operation is dropped.
  std::function<void(const OperationPtr&)> addOperationBlock;
  // Called by addOperations(operations, waitUntilFinished); without it they are dropped.
  std::function<void(const std::vector<OperationPtr>&, bool)> addOperationsBlock;
  // Called by cancelAllOperations(); without it nothing happens.
  std::function<void()> cancelAllOperationsBlock;
  // Called by waitUntilAllOperationsAreFinished(); without it the call returns at once.
  std::function<void()> waitUntilAllOperationsAreFinishedBlock;
  // Called by the key-value addObserver(observer, keyPath, options, context); without it nothing is
  // observed.
  std::function<void(const std::shared_ptr<Object>&, std::string_view, KeyValueObservingOptions,
                     void*)>
      addObserverBlock;
  // Called by removeObserver(observer, keyPath); without it nothing happens.
  std::function<void(const Object*, std::string_view)> removeObserverBlock;

  std::string description() const override { return Object::description(); }

  void addOperation(const OperationPtr& operation) override;
  void addOperations(const std::vector<OperationPtr>& operations, bool waitUntilFinished) override;
  void cancelAllOperations() override;
  void waitUntilAllOperationsAreFinished() override;
  void addObserver(const std::shared_ptr<Object>& observer, std::string_view keyPath,
                   KeyValueObservingOptions options, void* context) override;
  void removeObserver(const Object* observer, std::string_view keyPath) override;
  using Object::removeObserver;

  std::int64_t maxConcurrentOperationCount() const override { return maxConcurrentOperationCount_; }
  void setMaxConcurrentOperationCount(std::int64_t count) override {
    maxConcurrentOperationCount_ = count;
  }
  std::string name() const override { return name_; }
  void setName(std::string name) override { name_ = std::move(name); }
  std::vector<OperationPtr> operations() const override { return {}; }
  std::uint64_t operationCount() const override { return 0; }

 private:
  std::int64_t maxConcurrentOperationCount_ = 0;
  std::string name_;
};

}  // namespace kivi
