#include "kivi/doubles/mock_kiv_ns_operation_queue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <string_view>
#include <vector>

#include "kivi/dispatch/operation.h"

namespace kivi {
namespace {

using ::testing::MockFunction;

// Through the protocol: without callbacks every call does nothing (and
// returns at once); with them, each callback sees exactly what was passed.
TEST(MockKivNSOperationQueue, ForwardsEachCallToItsCallbackOrDoesNothing) {
  auto mock = std::make_shared<MockKivNSOperationQueue>();
  OperationQueueProtocol& queue = *mock;
  auto a = std::make_shared<BlockOperation>([] {}), b = std::make_shared<BlockOperation>([] {});
  auto watcher = std::make_shared<BlockOperation>([] {});
  int token = 0;
  const auto callAll = [&] {
    queue.addOperation(a);
    queue.addOperations({a, b}, true);
    queue.addOperations({b}, false);
    queue.cancelAllOperations();
    queue.waitUntilAllOperationsAreFinished();
    queue.addObserver(watcher, "operations",
                      KeyValueObservingOptionNew | KeyValueObservingOptionPrior, &token);
    queue.removeObserver(watcher.get(), "operationCount");
  };
  callAll();
  EXPECT_FALSE(mock->hasObservers()) << "addObserver must not register on the double itself";
  EXPECT_FALSE(a->isExecuting() || a->isFinished() || a->isCancelled() || b->isFinished());

  MockFunction<void(const OperationPtr&)> add;
  MockFunction<void(const std::vector<OperationPtr>&, bool)> addAll;
  MockFunction<void()> cancelAll, waitAll;
  MockFunction<void(const std::shared_ptr<Object>&, std::string_view, KeyValueObservingOptions,
                    void*)>
      observe;
  MockFunction<void(const Object*, std::string_view)> unobserve;
  mock->addOperationBlock = add.AsStdFunction();
  mock->addOperationsBlock = addAll.AsStdFunction();
  mock->cancelAllOperationsBlock = cancelAll.AsStdFunction();
  mock->waitUntilAllOperationsAreFinishedBlock = waitAll.AsStdFunction();
  mock->addObserverBlock = observe.AsStdFunction();
  mock->removeObserverBlock = unobserve.AsStdFunction();
  ::testing::InSequence inOrder;
  EXPECT_CALL(add, Call(OperationPtr(a)));
  EXPECT_CALL(addAll, Call(std::vector<OperationPtr>{a, b}, true));
  EXPECT_CALL(addAll, Call(std::vector<OperationPtr>{b}, false));
  EXPECT_CALL(cancelAll, Call());
  EXPECT_CALL(waitAll, Call());
  EXPECT_CALL(observe, Call(std::shared_ptr<Object>(watcher), "operations", 9, &token));
  EXPECT_CALL(unobserve, Call(watcher.get(), "operationCount"));
  callAll();

  queue.setName("Q");
  queue.setMaxConcurrentOperationCount(-7);  // stored as given
  EXPECT_EQ(queue.name(), "Q");
  EXPECT_EQ(queue.maxConcurrentOperationCount(), -7);
  EXPECT_EQ(queue.operationCount(), 0u);
  EXPECT_TRUE(queue.operations().empty());
}

}  // namespace
}  // namespace kivi
