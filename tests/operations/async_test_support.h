// A scriptable asynchronous operation for the operations suites, in both
// variants.
#pragma once

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <utility>

#include "kivi/dispatch/worker_pool.h"
#include "kivi/operations/kiv_async_operation.h"
#include "test_support.h"

namespace kivi::testing {

// How a probe ends the work it began in start().
enum class Finish { manual, inlineOnce, inlineTwice, onWorker };

// An asynchronous operation written the way subclasses are told to: cancelled
// → complete at once; else executing, then complete as scripted.
template <class Base>
class AsyncProbe : public Base {
 public:
  using Hook = std::function<void(Operation&)>;
  explicit AsyncProbe(Finish finish = Finish::manual, std::string tag = "", Hook onStart = {})
      : onStart_(std::move(onStart)), finish_(finish) {
    this->setName(std::move(tag));
  }

  std::atomic<int> starts{0}, executions{0};
  Signal startReturned;
  Hook onCancel;  // set before handing the probe out

  void start() override {
    ++starts;
    if (onStart_) onStart_(*this);
    if (this->isCancelled()) {
      this->coreCompleteOperation();
    } else {
      this->moveToExecutingState();
      ++executions;
      if (finish_ == Finish::inlineTwice) this->coreCompleteOperation();
      if (finish_ == Finish::inlineOnce || finish_ == Finish::inlineTwice)
        this->coreCompleteOperation();
      if (finish_ == Finish::onWorker)
        WorkerPool::shared().submit(
            [self = std::static_pointer_cast<AsyncProbe>(this->shared_from_this())] {
              self->coreCompleteOperation();
            });
    }
    startReturned.notify();
  }
  void cancel() override {
    if (onCancel) onCancel(*this);
    Base::cancel();
  }

 private:
  const Hook onStart_;
  const Finish finish_;
};

using FlagsProbe = AsyncProbe<KivAsyncOperationObjC>;
using EnumProbe = AsyncProbe<KivAsyncOperation>;

// Runs `test.template operator()<Probe>()` for both variants.
template <class Test>
void forBothVariants(Test&& test) {
  {
    SCOPED_TRACE("KivAsyncOperationObjC");
    test.template operator()<FlagsProbe>();
  }
  {
    SCOPED_TRACE("KivAsyncOperation");
    test.template operator()<EnumProbe>();
  }
}

}  // namespace kivi::testing
