// Both asynchronous operation variants, alone and run by a real kivi::OperationQueue.
#include "kivi/operations/kiv_async_operation.h"

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/dispatch/operation_queue.h"
#include "operations/async_test_support.h"

namespace kivi {
namespace {

using testing::Finish;
using testing::FlagsProbe;
using testing::kQuiet;
using testing::Recorder;
using testing::Signal;
using QueuePtr = std::shared_ptr<OperationQueue>;
constexpr auto kPrior = KeyValueObservingOptionPrior;

// Recorded events as "wE dF …": will/did, then R/E/F for isReady/isExecuting/isFinished.
std::string script(const std::vector<testing::Event>& events) {
  std::string out;
  for (const auto& [when, key] : events)
    out += (out.empty() ? "" : " ") + when.substr(0, 1) + key[2];
  return out;
}
std::function<void()> notifier(const std::shared_ptr<Signal>& signal) {
  return [signal] { signal->notify(); };
}
OperationPtr notifying(const std::shared_ptr<Signal>& signal) {
  return std::make_shared<BlockOperation>(notifier(signal));
}
QueuePtr serialQueue() {
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  return queue;
}
bool drains(const QueuePtr& queue) {
  return testing::returnsWithin([queue] { queue->waitUntilAllOperationsAreFinished(); }) &&
         queue->operationCount() == 0;
}

// What each path announces to an observer of the three state keys, from a new
// operation. `setup` runs unrecorded, then `steps`; E = moveToExecutingState,
// C = coreCompleteOperation. Observers of "isFinished" already see the
// completion error and a new value that matches the final state.
TEST(AsyncOperationTransitions, AnnounceExactSequences) {
  struct Case {
    bool flags;
    const char *setup, *steps, *expected;
    bool executing, finished;
  };
  const Case cases[] = {
      {true, "", "E", "wE wF dF dE", true, false},
      {true, "E", "C", "wE wF dF dE", false, true},
      {true, "", "C", "wE wF dF dE", false, true},  // completed without starting
      {true, "E", "CC", "wE wF dF dE wE wF dF dE", false, true},
      {false, "", "E", "wR wE dE dR", true, false},
      {false, "E", "C", "wE wF dF dE", false, true},
      {false, "", "C", "wR wF dF dR", false, true},
      {false, "C", "C", "wF wF dF dF", false, true},  // completed twice
  };
  const auto error = Error::create("Test", 7);
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.flags ? "ObjC " : "enum ") + c.setup + "|" + c.steps);
    auto run = [&](auto& op) {
      EXPECT_TRUE(op.isReady() && !op.isExecuting() && !op.isFinished());
      EXPECT_EQ(op.completionError(), nullptr);
      auto step = [&op](char s) {
        s == 'E' ? op.moveToExecutingState() : op.coreCompleteOperation();
      };
      for (const char* s = c.setup; *s; ++s) step(*s);
      op.setCompletionError(error);
      auto recorder = Recorder::watch(op, {"isReady", "isExecuting", "isFinished"},
                                      kPrior | KeyValueObservingOptionNew);
      recorder->onNote = [&](const testing::Note& note) {
        if (note.prior || note.key != "isFinished") return;
        EXPECT_EQ(op.completionError(), error);
        EXPECT_EQ(note.change.at(KeyValueChangeNewKey), Value(c.finished));
      };
      for (const char* s = c.steps; *s; ++s) step(*s);
      EXPECT_EQ(script(recorder->takeEvents()), c.expected);
      EXPECT_EQ(op.isExecuting(), c.executing);
      EXPECT_EQ(op.isFinished(), c.finished);
    };
    c.flags ? run(*std::make_shared<KivAsyncOperationObjC>())
            : run(*std::make_shared<KivAsyncOperation>());
  }
}

// The gate announces every set, even of the same value, and narrows the
// dependencies' readiness. A queued operation behind a closed gate waits while
// later ones pass it, even on a serial queue.
TEST(KivAsyncOperationObjC, ReadyGateHoldsTheOperationBack) {
  auto queue = serialQueue();
  auto gated = std::make_shared<FlagsProbe>(Finish::inlineOnce);
  auto dependency = std::make_shared<BlockOperation>([] {});
  auto done = std::make_shared<Signal>();
  gated->setCompletionBlock(notifier(done));
  auto recorder = Recorder::watch(*gated, {"isReady"}, kPrior);
  for (bool gate : {true, false, false}) {
    gated->setReadyState(gate);
    EXPECT_EQ(gated->isReady(), gate);
    EXPECT_EQ(script(recorder->takeEvents()), "wR dR");
  }
  gated->addDependency(dependency);
  queue->addOperation(gated);
  for (int i = 0; i < 3; ++i) queue->addOperation(notifying(done));
  ASSERT_TRUE(done->wait(3));
  gated->setReadyState(true);
  EXPECT_FALSE(gated->isReady()) << "gate open, dependency unfinished";
  gated->setReadyState(false);
  dependency->start();
  EXPECT_FALSE(gated->isReady()) << "dependency finished, gate closed";
  EXPECT_FALSE(done->wait(4, kQuiet));
  EXPECT_EQ(gated->starts, 0);
  EXPECT_EQ(queue->operationCount(), 1u);
  gated->setReadyState(true);
  ASSERT_TRUE(done->wait(4));
  EXPECT_EQ(gated->executions, 1);
  EXPECT_TRUE(drains(queue));
}

// Finished inline or from another thread; cancelled before start with
// Finish::manual: a probe that missed the cancellation would never finish.
TEST(AsyncOperationInQueue, RunsToCompletionOrSkipsWorkWhenCancelled) {
  const struct {
    const char* name;
    Finish finish;
    bool cancelled;
  } cases[] = {{"inline", Finish::inlineOnce, false},
               {"on worker", Finish::onWorker, false},
               {"cancelled", Finish::manual, true}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    testing::forBothVariants([c]<class Probe>() {
      auto queue = std::make_shared<OperationQueue>();
      auto done = std::make_shared<Signal>();
      auto op = std::make_shared<Probe>(c.finish);
      op->setCompletionBlock(notifier(done));
      if (c.cancelled) op->cancel();
      queue->addOperation(op);
      ASSERT_TRUE(done->wait());
      EXPECT_EQ(op->starts, 1);
      EXPECT_EQ(op->executions, c.cancelled ? 0 : 1);
      EXPECT_TRUE(op->isFinished() && !op->isExecuting());
      EXPECT_TRUE(drains(queue));
    });
  }
}

// a → b → c, spread over two wide queues: only the dependencies order them.
TEST(AsyncOperationInQueue, DependenciesOrderStartsAcrossQueues) {
  auto first = std::make_shared<OperationQueue>(), second = std::make_shared<OperationQueue>();
  auto done = std::make_shared<Signal>();
  auto checkDependencies = [](Operation& op) {
    for (const auto& dependency : op.dependencies())
      EXPECT_TRUE(dependency->isFinished()) << op.name() << " started early";
  };
  auto a = std::make_shared<FlagsProbe>(Finish::onWorker, "a", checkDependencies);
  auto b = std::make_shared<testing::EnumProbe>(Finish::onWorker, "b", checkDependencies);
  auto c = std::make_shared<FlagsProbe>(Finish::onWorker, "c", checkDependencies);
  b->addDependency(a);
  c->addDependency(b);
  for (OperationPtr op : {OperationPtr(a), OperationPtr(b), OperationPtr(c)})
    op->setCompletionBlock(notifier(done));
  first->addOperations({c, a}, false);
  second->addOperation(b);
  ASSERT_TRUE(done->wait(3));
  EXPECT_TRUE(drains(first) && drains(second));
}

// A serial queue counts an operation as executing until it announces
// "isFinished" reading true. Announcing early, completing twice (inline or
// late) or being started by hand while queued must neither free a second slot
// nor wedge the queue.
TEST(AsyncOperationInQueue, KeepsOneSlotPerOperationDespiteMisuse) {
  testing::forBothVariants([]<class Probe>() {
    auto queue = serialQueue();
    auto held = std::make_shared<Probe>(Finish::manual);
    auto byHand = std::make_shared<Probe>(Finish::inlineOnce);
    auto twice = std::make_shared<Probe>(Finish::inlineTwice);
    auto done = std::make_shared<Signal>(), next = std::make_shared<Signal>();
    for (const auto& op : {held, byHand, twice}) op->setCompletionBlock(notifier(done));
    queue->addOperation(held);
    queue->addOperation(notifying(next));
    ASSERT_TRUE(held->startReturned.wait());
    held->willChangeValueForKey("isFinished");  // isFinished() still reads false
    held->didChangeValueForKey("isFinished");
    EXPECT_FALSE(next->wait(1, kQuiet)) << "the slot was freed before the operation finished";
    EXPECT_EQ(queue->operationCount(), 2u);
    std::thread([held] { held->coreCompleteOperation(); }).join();
    ASSERT_TRUE(next->wait() && done->wait());
    held->coreCompleteOperation();  // late

    queue->setSuspended(true);
    queue->addOperation(byHand);
    byHand->start();
    queue->addOperation(twice);
    auto gate = std::make_shared<Signal>();
    queue->addOperation(std::make_shared<BlockOperation>([gate] { ASSERT_TRUE(gate->wait()); }));
    queue->addOperation(notifying(next));
    queue->setSuspended(false);
    EXPECT_FALSE(next->wait(2, kQuiet)) << "two operations ran at once";
    gate->notify();
    ASSERT_TRUE(next->wait(2)) << "the queue stopped starting operations";
    EXPECT_EQ(twice->executions, 1);
    EXPECT_TRUE(drains(queue));
    EXPECT_FALSE(done->wait(4, std::chrono::milliseconds(0))) << "a completion block ran twice";
  });
}

}  // namespace
}  // namespace kivi
