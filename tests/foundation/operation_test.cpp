#include "kivi/foundation/operation.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

#include "foundation/kvo_recorder.h"
#include "kivi/foundation/worker_pool.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::Latch;
using testing::Recorder;

std::shared_ptr<BlockOperation> counting(std::shared_ptr<std::atomic<int>> runs) {
  return std::make_shared<BlockOperation>([runs] { ++*runs; });
}

TEST(Operation, StartRunsMainOnceAndAnnouncesTheStates) {
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto op = counting(runs);
  auto recorder = std::make_shared<Recorder>();
  for (const char* key : {"isExecuting", "isFinished"}) {
    op->addObserver(recorder, key, KeyValueObservingOptionNew, nullptr);
  }
  EXPECT_TRUE(op->isReady());
  EXPECT_FALSE(op->isAsynchronous());
  op->start();
  op->start();
  EXPECT_EQ(*runs, 1);
  EXPECT_TRUE(op->isFinished());
  EXPECT_FALSE(op->isExecuting());
  EXPECT_EQ(op->valueForKey("isFinished"), Value(true));
  EXPECT_EQ(recorder->newValues("isExecuting"), (std::vector<Value>{true, false}));
  EXPECT_EQ(recorder->newValues("isFinished"), (std::vector<Value>{true}));
  EXPECT_EQ(recorder->notes().front().key, "isExecuting");
}

TEST(Operation, CancelledBeforeStartFinishesWithoutRunning) {
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto op = counting(runs);
  auto recorder = std::make_shared<Recorder>();
  op->addObserver(recorder, "isExecuting", KeyValueObservingOptionNew, nullptr);
  op->cancel();
  EXPECT_TRUE(op->isCancelled());
  op->start();
  EXPECT_EQ(*runs, 0);
  EXPECT_TRUE(op->isFinished());
  for (const Value& executing : recorder->newValues("isExecuting")) EXPECT_NE(executing, true);
}

TEST(Operation, ReadinessFollowsDependenciesAndCancellation) {
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto dependency = counting(runs), op = counting(runs);
  auto recorder = std::make_shared<Recorder>();
  op->addObserver(recorder, "isReady", KeyValueObservingOptionNew, nullptr);
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

  auto never = counting(runs), cancelled = counting(runs), freed = counting(runs);
  cancelled->addDependency(never);
  freed->addDependency(never);
  EXPECT_FALSE(cancelled->isReady());
  cancelled->cancel();
  EXPECT_TRUE(cancelled->isReady());  // cancellation overrides dependencies
  cancelled->start();
  EXPECT_TRUE(cancelled->isFinished());
  freed->removeDependency(never);
  EXPECT_TRUE(freed->isReady());
  EXPECT_EQ(*runs, 2);
}

TEST(Operation, CompletionBlockRunsOnceOnAWorkerThenIsCleared) {
  struct State {
    std::atomic<int> calls{0};
    std::atomic<bool> onWorker{false};
    Latch done;
  };
  auto state = std::make_shared<State>();
  auto op = std::make_shared<BlockOperation>([] {});
  op->setCompletionBlock([state] {
    state->onWorker = WorkerPool::isWorkerThread();
    ++state->calls;
    state->done.countDown();
  });
  op->start();
  ASSERT_TRUE(state->done.wait());
  EXPECT_TRUE(testing::waitFor([&] { return !op->completionBlock(); }));
  EXPECT_TRUE(state->onWorker);
  op->willChangeValueForKey("isFinished");  // a repeated announcement changes nothing
  op->didChangeValueForKey("isFinished");
  EXPECT_EQ(state->calls, 1);
}

TEST(Operation, WaitUntilFinishedReturnsAfterFinishOnAnotherThread) {
  auto gate = std::make_shared<Latch>();
  auto op = std::make_shared<BlockOperation>([gate] { gate->wait(); });
  std::thread runner([op] { op->start(); });
  auto returned = std::make_shared<Latch>();
  std::thread waiter([op, returned] {
    op->waitUntilFinished();
    returned->countDown();
  });
  EXPECT_FALSE(returned->wait(std::chrono::milliseconds(50)));
  gate->countDown();
  runner.join();
  if (returned->wait()) {
    waiter.join();
  } else {
    ADD_FAILURE() << "waitUntilFinished did not return";
    waiter.detach();
  }
  EXPECT_TRUE(op->isFinished());
  EXPECT_TRUE(testing::returnsWithin([op] { op->waitUntilFinished(); }));
}

}  // namespace
}  // namespace kivi
