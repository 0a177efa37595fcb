#include "kivi/doubles/mock_kiv_ns_operation_queue.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "kivi/foundation/operation.h"

namespace kivi {
namespace {

class Watcher : public Object {};

TEST(MockKivNSOperationQueue, WithoutCallbacksEveryCallDoesNothing) {
  auto mock = std::make_shared<MockKivNSOperationQueue>();
  OperationQueueProtocol& queue = *mock;
  int runs = 0;
  auto op = std::make_shared<BlockOperation>([&] { ++runs; });
  auto watcher = std::make_shared<Watcher>();

  queue.addOperation(op);
  EXPECT_EQ(queue.operationCount(), 0u);
  EXPECT_TRUE(queue.operations().empty());
  queue.addOperations({op}, true);  // would never return if it waited for real
  queue.addObserver(watcher, "operationCount", KeyValueObservingOptionNew, nullptr);
  EXPECT_FALSE(mock->hasObservers()) << "addObserver must not register on the double itself";
  queue.removeObserver(watcher.get(), "operationCount");
  queue.cancelAllOperations();
  queue.waitUntilAllOperationsAreFinished();

  EXPECT_EQ(queue.operationCount(), 0u);
  EXPECT_TRUE(queue.operations().empty());
  EXPECT_EQ(runs, 0);
  EXPECT_FALSE(op->isExecuting());
  EXPECT_FALSE(op->isFinished());
  EXPECT_FALSE(op->isCancelled());
}

// Each callback sees exactly what the caller passed, through the protocol.
TEST(MockKivNSOperationQueue, CallbacksReceiveArgumentsUnchanged) {
  auto mock = std::make_shared<MockKivNSOperationQueue>();
  auto a = std::make_shared<BlockOperation>([] {});
  auto b = std::make_shared<BlockOperation>([] {});
  auto watcher = std::make_shared<Watcher>();
  int token = 0;
  std::vector<std::string> calls;
  mock->addOperationBlock = [&](const OperationPtr& op) {
    calls.push_back(op == a ? "add a" : "add ?");
  };
  mock->addOperationsBlock = [&](const std::vector<OperationPtr>& ops, bool wait) {
    calls.push_back((ops == std::vector<OperationPtr>{a, b} ? "addOps ab "
                     : ops == std::vector<OperationPtr>{b}  ? "addOps b "
                                                            : "addOps ? ") +
                    std::to_string(wait));
  };
  mock->cancelAllOperationsBlock = [&] { calls.push_back("cancelAll"); };
  mock->waitUntilAllOperationsAreFinishedBlock = [&] { calls.push_back("wait"); };
  auto who = [&](const Object* o) { return o == watcher.get() ? " watcher" : " ?"; };
  mock->addObserverBlock = [&](const std::shared_ptr<Object>& observer, std::string_view key,
                               KeyValueObservingOptions options, void* context) {
    calls.push_back("addObserver " + std::string(key) + who(observer.get()) + " options " +
                    std::to_string(options) + (context == &token ? " token" : " ?"));
  };
  mock->removeObserverBlock = [&](const Object* observer, std::string_view key) {
    calls.push_back("removeObserver " + std::string(key) + who(observer));
  };

  OperationQueueProtocol& queue = *mock;
  queue.addOperation(a);
  queue.addOperations({a, b}, true);
  queue.addOperations({b}, false);
  queue.cancelAllOperations();
  queue.waitUntilAllOperationsAreFinished();
  queue.addObserver(watcher, "operations",
                    KeyValueObservingOptionNew | KeyValueObservingOptionPrior, &token);
  queue.removeObserver(watcher.get(), "operationCount");
  EXPECT_EQ(calls,
            (std::vector<std::string>{"add a", "addOps ab 1", "addOps b 0", "cancelAll", "wait",
                                      "addObserver operations watcher options 9 token",
                                      "removeObserver operationCount watcher"}));
  EXPECT_EQ(queue.operationCount(), 0u);
  EXPECT_FALSE(a->isFinished() || b->isFinished());
}

TEST(MockKivNSOperationQueue, NameAndLimitAreStoredValues) {
  MockKivNSOperationQueue queue;
  EXPECT_EQ(queue.name(), "");
  EXPECT_EQ(queue.maxConcurrentOperationCount(), 0);
  for (std::int64_t limit : {std::int64_t{-1}, std::int64_t{-7}, std::int64_t{1}, std::int64_t{64},
                             std::numeric_limits<std::int64_t>::max(), std::int64_t{0}}) {
    queue.setMaxConcurrentOperationCount(limit);
    EXPECT_EQ(queue.maxConcurrentOperationCount(), limit);
  }
  for (const char* name : {"Q", "with space", ""}) {
    queue.setName(name);
    EXPECT_EQ(queue.name(), name);
  }
}

}  // namespace
}  // namespace kivi
