// Asynchronous operations run by a real kivi::OperationQueue.
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "kivi/foundation/operation_queue.h"
#include "operations/async_test_support.h"

namespace kivi {
namespace {

using optest::Finish;
using optest::FlagsProbe;
using optest::Signal;

std::function<void()> notifier(const std::shared_ptr<Signal>& signal) {
  return [signal] { signal->notify(); };
}

bool drains(const std::shared_ptr<OperationQueue>& queue) {
  return optest::finishesWithin10s([queue] { queue->waitUntilAllOperationsAreFinished(); }) &&
         queue->operationCount() == 0;
}

// Finished inline or from another thread; cancelled before start with
// Finish::manual: a probe that missed the cancellation would never finish.
TEST(AsyncOperationInQueue, RunsToCompletionOrSkipsWorkWhenCancelled) {
  const std::pair<Finish, bool> cases[] = {
      {Finish::inlineOnce, false}, {Finish::onWorker, false}, {Finish::manual, true}};
  for (const auto& [finishValue, cancelledValue] : cases) {
    const Finish finish = finishValue;  // plain copies: captured below
    const bool cancelled = cancelledValue;
    SCOPED_TRACE(cancelled ? "cancelled" : finish == Finish::onWorker ? "on worker" : "inline");
    optest::forBothVariants([finish, cancelled]<class Probe>() {
      auto queue = std::make_shared<OperationQueue>();
      auto done = std::make_shared<Signal>();
      auto op = std::make_shared<Probe>(finish);
      op->setCompletionBlock(notifier(done));
      if (cancelled) op->cancel();
      queue->addOperation(op);
      ASSERT_TRUE(done->waitFor(1));
      EXPECT_EQ(op->starts, 1);
      EXPECT_EQ(op->executions, cancelled ? 0 : 1);
      EXPECT_TRUE(op->isFinished());
      EXPECT_FALSE(op->isExecuting());
      EXPECT_TRUE(drains(queue));
    });
  }
}

// A closed gate keeps the operation waiting while later operations pass it,
// even on a serial queue; opening it lets the queue start it.
TEST(AsyncOperationInQueue, ReadyGateHoldsOperationUntilOpened) {
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  auto gated = std::make_shared<FlagsProbe>(Finish::inlineOnce);
  auto done = std::make_shared<Signal>();
  gated->setCompletionBlock(notifier(done));
  gated->setReadyState(false);
  queue->addOperation(gated);
  for (int i = 0; i < 3; ++i) queue->addOperation(std::make_shared<BlockOperation>(notifier(done)));
  ASSERT_TRUE(done->waitFor(3));
  EXPECT_EQ(gated->starts, 0);
  auto listed = queue->operations();
  EXPECT_NE(std::find(listed.begin(), listed.end(), gated), listed.end());

  gated->setReadyState(true);
  ASSERT_TRUE(done->waitFor(4));
  EXPECT_EQ(gated->executions, 1);
  EXPECT_TRUE(drains(queue));
}

TEST(AsyncOperationInQueue, DependenciesOrderStarts) {
  auto queue = std::make_shared<OperationQueue>();  // wide: only the dependencies order them
  auto log = std::make_shared<optest::OrderLog>();
  auto done = std::make_shared<Signal>();
  auto recordStart = [log](auto& op) {
    for (const auto& dependency : op.dependencies())
      if (!dependency->isFinished()) log->add(op.name() + " started early");
    log->add(op.name());
  };
  auto a = std::make_shared<FlagsProbe>(Finish::onWorker, "a");
  auto b = std::make_shared<optest::EnumProbe>(Finish::onWorker, "b");
  auto c = std::make_shared<FlagsProbe>(Finish::onWorker, "c");
  a->onStart = c->onStart = recordStart;
  b->onStart = recordStart;
  b->addDependency(a);
  c->addDependency(b);
  for (OperationPtr op : {OperationPtr(a), OperationPtr(b), OperationPtr(c)})
    op->setCompletionBlock(notifier(done));
  queue->addOperations({c, b, a}, false);
  ASSERT_TRUE(done->waitFor(3));
  EXPECT_EQ(log->snapshot(), (std::vector<std::string>{"a", "b", "c"}));
  EXPECT_TRUE(drains(queue));
}

// Completing twice, or being started by hand while queued, must not wedge or
// corrupt a serial queue.
TEST(AsyncOperationInQueue, MisusedOperationsDoNotCorruptQueue) {
  optest::forBothVariants([]<class Probe>() {
    auto queue = std::make_shared<OperationQueue>();
    queue->setMaxConcurrentOperationCount(1);
    auto done = std::make_shared<Signal>();
    auto byHand = std::make_shared<Probe>(Finish::inlineOnce);
    auto twice = std::make_shared<Probe>(Finish::inlineTwice);
    byHand->setCompletionBlock(notifier(done));
    twice->setCompletionBlock(notifier(done));
    queue->setSuspended(true);
    queue->addOperation(byHand);
    byHand->start();
    queue->addOperation(twice);
    queue->setSuspended(false);
    queue->addOperation(std::make_shared<BlockOperation>(notifier(done)));
    ASSERT_TRUE(done->waitFor(3));
    EXPECT_EQ(twice->executions, 1);
    EXPECT_TRUE(drains(queue));

    queue->addOperation(std::make_shared<Probe>(Finish::onWorker));
    queue->addOperation(std::make_shared<BlockOperation>(notifier(done)));
    ASSERT_TRUE(done->waitFor(4)) << "the queue stopped starting operations";
    EXPECT_TRUE(drains(queue));
  });
}

}  // namespace
}  // namespace kivi
