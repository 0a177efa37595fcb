// OperationQueueProtocol: the operation-queue interface through which
// services and timers hold their queue, so that a host can put a scriptable
// double (MockKivNSOperationQueue) where the real queue would be.
//
// The members have exactly the names and meanings of kivi::OperationQueue's
// own, which conforms unchanged.
//
// Thread contract: that of the conformer. kivi::OperationQueue is safe from
// any thread; the double is not synchronised.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class Operation;
// How operations are held: to be queued, have dependents or be observed.
using OperationPtr = std::shared_ptr<Operation>;

class KIVI_EXPORT OperationQueueProtocol {
 public:
  virtual ~OperationQueueProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // OperationQueue's members of the same names.
  virtual void addOperation(const OperationPtr& operation) = 0;
  virtual void addOperations(const std::vector<OperationPtr>& operations,
                             bool waitUntilFinished) = 0;
  virtual void cancelAllOperations() = 0;
  virtual void waitUntilAllOperationsAreFinished() = 0;
  virtual void addObserver(const std::shared_ptr<Object>& observer, std::string_view keyPath,
                           KeyValueObservingOptions options, void* context) = 0;
  virtual void removeObserver(const Object* observer, std::string_view keyPath) = 0;

  // OperationQueue's members of the same names.
  virtual std::int64_t maxConcurrentOperationCount() const = 0;
  virtual void setMaxConcurrentOperationCount(std::int64_t count) = 0;
  virtual std::string name() const = 0;
  virtual void setName(std::string name) = 0;
  // A copy of the list of operations in the queue.
  virtual std::vector<OperationPtr> operations() const = 0;
  // How many operations are in the queue.
  virtual std::uint64_t operationCount() const = 0;
};

}  // namespace kivi
