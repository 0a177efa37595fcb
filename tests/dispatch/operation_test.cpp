#include "kivi/dispatch/operation.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>

#include "kivi/dispatch/worker_pool.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::Recorder;
constexpr auto kNew = KeyValueObservingOptionNew;

std::shared_ptr<BlockOperation> counting(std::shared_ptr<std::atomic<int>> runs) {
  return std::make_shared<BlockOperation>([runs] { ++*runs; });
}

// The completion block runs once, on a worker, and is cleared before it is
// handed over; a repeated "isFinished" announcement changes nothing.
TEST(Operation, StartRunsMainOnceAnnouncesTheStatesAndCompletes) {
  struct State {
    std::atomic<int> completions{0};
    std::atomic<bool> onWorker{false};
    testing::Signal completed;
  };
  auto state = std::make_shared<State>();
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto op = counting(runs);
  op->setCompletionBlock([state] {
    state->onWorker = WorkerPool::isWorkerThread();
    ++state->completions;
    state->completed.notify();
  });
  auto recorder = Recorder::watch(*op, {"isExecuting", "isFinished"}, kNew);
  op->start();
  op->start();
  EXPECT_EQ(*runs, 1);
  EXPECT_TRUE(op->isFinished() && !op->isExecuting());
  EXPECT_EQ(recorder->newValues("isExecuting"), (std::vector<Value>{true, false}));
  EXPECT_EQ(recorder->newValues("isFinished"), (std::vector<Value>{true}));
  EXPECT_EQ(recorder->notes().front().key, "isExecuting");
  ASSERT_TRUE(state->completed.wait());
  EXPECT_FALSE(op->completionBlock());
  EXPECT_TRUE(state->onWorker);
  op->willChangeValueForKey("isFinished");
  op->didChangeValueForKey("isFinished");
  EXPECT_FALSE(state->completed.wait(2, testing::kQuiet));
  EXPECT_EQ(state->completions, 1);
}

// Every transition is announced before and after, in the order observers of
// the queue rely on.
TEST(Operation, StartAnnouncesEachChangeBeforeAndAfter) {
  auto op = std::make_shared<BlockOperation>([] {});
  auto recorder =
      Recorder::watch(*op, {"isExecuting", "isFinished"}, kNew | KeyValueObservingOptionPrior);
  op->start();
  using testing::Event;
  EXPECT_EQ(recorder->takeEvents(), (std::vector<Event>{{"will", "isExecuting"},
                                                        {"did", "isExecuting"},
                                                        {"will", "isExecuting"},
                                                        {"will", "isFinished"},
                                                        {"did", "isFinished"},
                                                        {"did", "isExecuting"}}));
}

TEST(Operation, ReadinessFollowsDependenciesAndCancellation) {
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto dependency = counting(runs), op = counting(runs);
  auto recorder = Recorder::watch(*op, {"isReady"}, kNew);
  op->addDependency(dependency);
  op->addDependency(op);  // ignored, as is null
  op->addDependency(nullptr);
  EXPECT_EQ(op->dependencies(), std::vector<OperationPtr>{dependency});
  EXPECT_FALSE(op->isReady());
  op->start();  // refused: not ready
  EXPECT_FALSE(op->isFinished());
  EXPECT_EQ(*runs, 0);
  dependency->start();
  EXPECT_TRUE(op->isReady());
  ASSERT_FALSE(recorder->newValues("isReady").empty());
  EXPECT_EQ(recorder->newValues("isReady").back(), Value(true));
  op->start();
  EXPECT_EQ(*runs, 2);

  // Cancelled before start: ready despite its dependency, finishes without running.
  auto never = counting(runs), cancelled = counting(runs), freed = counting(runs);
  cancelled->addDependency(never);
  freed->addDependency(never);
  auto executing = Recorder::watch(*cancelled, {"isExecuting"}, kNew);
  EXPECT_FALSE(cancelled->isReady());
  cancelled->cancel();
  EXPECT_TRUE(cancelled->isCancelled() && cancelled->isReady());
  cancelled->start();
  EXPECT_TRUE(cancelled->isFinished());
  for (const Value& value : executing->newValues("isExecuting")) EXPECT_NE(value, true);
  freed->removeDependency(never);
  EXPECT_TRUE(freed->isReady());
  EXPECT_EQ(*runs, 2);
}

}  // namespace
}  // namespace kivi
