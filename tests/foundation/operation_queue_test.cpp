#include "kivi/foundation/operation_queue.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "foundation/kvo_recorder.h"
#include "test_support.h"

namespace kivi {
namespace {

using std::chrono::milliseconds;
using testing::Latch;
using testing::waitFor;
using QueuePtr = std::shared_ptr<OperationQueue>;

constexpr milliseconds kQuiet{50};  // how long "nothing happens" is watched

std::shared_ptr<BlockOperation> blockOp(std::function<void()> block) {
  return std::make_shared<BlockOperation>(std::move(block));
}

// Operations that each hold their slot until limit - 1 later ones have started,
// then watch briefly for one more: a queue over its limit shows as a higher peak.
class ConcurrencyProbe {
 public:
  ConcurrencyProbe(int limit, int total) : limit_(limit), total_(total), done(total) {}
  void enter() {
    std::unique_lock lock(mutex_);
    const int order = ++started_;
    peak_ = std::max(peak_, ++running_);
    cv_.notify_all();
    const int partners = std::min(order + limit_ - 1, total_);
    if (!cv_.wait_for(lock, std::chrono::seconds(10), [&] { return started_ >= partners; })) {
      timedOut_ = true;
    }
    if (order + limit_ <= total_)
      cv_.wait_for(lock, milliseconds(5), [&] { return started_ > partners; });
    --running_;
    lock.unlock();
    done.countDown();
  }
  int peak() {
    std::lock_guard lock(mutex_);
    EXPECT_FALSE(timedOut_);
    return peak_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  const int limit_, total_;
  int started_ = 0, running_ = 0, peak_ = 0;
  bool timedOut_ = false;

 public:
  Latch done;
};

// Starts, then finishes (or pretends to) only when told.
class ManualAsyncOperation : public Operation {
 public:
  bool isAsynchronous() const override { return true; }
  bool isExecuting() const override { return executing_; }
  bool isFinished() const override { return finished_; }
  void start() override {
    willChangeValueForKey("isExecuting");
    executing_ = true;
    didChangeValueForKey("isExecuting");
    started.countDown();
  }
  void finish() {
    willChangeValueForKey("isExecuting");
    willChangeValueForKey("isFinished");
    executing_ = false;
    finished_ = true;
    didChangeValueForKey("isExecuting");
    didChangeValueForKey("isFinished");
  }
  void announceFinished() {
    willChangeValueForKey("isFinished");
    didChangeValueForKey("isFinished");
  }
  Latch started;

 private:
  std::atomic<bool> executing_{false}, finished_{false};
};

void expectDrains(const QueuePtr& queue) {
  EXPECT_TRUE(waitFor([&] { return queue->operationCount() == 0; }));
  EXPECT_TRUE(queue->operations().empty());
}

TEST(OperationQueue, NeverExceedsMaxConcurrentOperationCount) {
  for (int limit : {1, 2, 3}) {
    SCOPED_TRACE(limit);
    constexpr int kTotal = 24;
    auto queue = std::make_shared<OperationQueue>();
    queue->setMaxConcurrentOperationCount(limit);
    auto probe = std::make_shared<ConcurrencyProbe>(limit, kTotal);
    std::vector<OperationPtr> ops;
    for (int i = 0; i < kTotal; ++i) ops.push_back(blockOp([probe] { probe->enter(); }));
    queue->addOperations(ops, false);
    ASSERT_TRUE(probe->done.wait());
    EXPECT_EQ(probe->peak(), limit);
    expectDrains(queue);
  }
}

TEST(OperationQueue, ZeroLimitAndSuspensionHoldOperationsBack) {
  const struct {
    const char* name;
    std::function<void(OperationQueue&)> hold, release;
  } cases[] = {
      {"zero limit", [](auto& q) { q.setMaxConcurrentOperationCount(0); },
       [](auto& q) { q.setMaxConcurrentOperationCount(2); }},
      {"suspended", [](auto& q) { q.setSuspended(true); }, [](auto& q) { q.setSuspended(false); }}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    auto queue = std::make_shared<OperationQueue>();
    c.hold(*queue);
    auto ran = std::make_shared<Latch>(3);
    for (int i = 0; i < 3; ++i) queue->addOperationWithBlock([ran] { ran->countDown(); });
    EXPECT_FALSE(ran->wait(kQuiet));
    EXPECT_EQ(queue->operationCount(), 3u);
    c.release(*queue);
    EXPECT_TRUE(ran->wait());
    EXPECT_FALSE(queue->isSuspended());
    expectDrains(queue);
  }
}

TEST(OperationQueue, SerialQueueRunsInAdditionOrderAndListsItsOperations) {
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  queue->setSuspended(true);
  auto order = std::make_shared<std::vector<int>>();  // serial: no lock needed
  auto done = std::make_shared<Latch>(20);
  std::vector<OperationPtr> ops;
  std::vector<int> expected;
  for (int i = 0; i < 20; ++i) {
    expected.push_back(i);
    ops.push_back(blockOp([order, done, i] {
      order->push_back(i);
      done->countDown();
    }));
    queue->addOperation(ops.back());
  }
  EXPECT_EQ(queue->operations(), ops);
  EXPECT_EQ(queue->operationCount(), 20u);
  queue->setSuspended(false);
  ASSERT_TRUE(done->wait());
  EXPECT_EQ(*order, expected);
  expectDrains(queue);
}

TEST(OperationQueue, DependencyOnAnOperationOfAnotherQueue) {
  auto first = std::make_shared<OperationQueue>(), second = std::make_shared<OperationQueue>();
  auto gate = std::make_shared<Latch>(), ran = std::make_shared<Latch>();
  auto before = blockOp([gate] { gate->wait(); });
  std::weak_ptr<Operation> weakBefore = before;
  auto sawFinished = std::make_shared<std::atomic<bool>>(false);
  auto after = blockOp([=] {
    *sawFinished = weakBefore.lock()->isFinished();
    ran->countDown();
  });
  after->addDependency(before);
  second->addOperation(after);
  first->addOperation(before);
  EXPECT_FALSE(ran->wait(kQuiet));
  gate->countDown();
  ASSERT_TRUE(ran->wait());
  EXPECT_TRUE(*sawFinished);
}

TEST(OperationQueue, AddOperationsCanWaitForThemAll) {
  auto queue = std::make_shared<OperationQueue>();
  auto gate = std::make_shared<Latch>(), returned = std::make_shared<Latch>();
  std::vector<OperationPtr> ops{blockOp([gate] { gate->wait(); })};
  for (int i = 0; i < 7; ++i) ops.push_back(blockOp([] {}));
  std::thread caller([=] {
    queue->addOperations(ops, true);
    returned->countDown();
  });
  EXPECT_FALSE(returned->wait(kQuiet));
  gate->countDown();
  if (!returned->wait()) {
    caller.detach();
    FAIL() << "addOperations did not return";
  }
  caller.join();
  for (const auto& op : ops) EXPECT_TRUE(op->isFinished());
}

TEST(OperationQueue, RefusesNullDuplicateAndFinishedOperations) {
  auto queue = std::make_shared<OperationQueue>(), other = std::make_shared<OperationQueue>();
  queue->setSuspended(true);
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto op = blockOp([runs] { ++*runs; }), finished = blockOp([runs] { ++*runs; });
  finished->start();
  queue->addOperation(nullptr);
  queue->addOperation(op);
  queue->addOperation(op);
  other->addOperation(op);
  queue->addOperations({op, nullptr, finished}, false);
  EXPECT_EQ(queue->operations(), std::vector<OperationPtr>{op});
  EXPECT_EQ(other->operationCount(), 0u);
  queue->setSuspended(false);
  EXPECT_TRUE(waitFor([&] { return op->isFinished(); }));
  expectDrains(queue);
  EXPECT_EQ(*runs, 2);
}

TEST(OperationQueue, CancelAllOperations) {
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  auto started = std::make_shared<Latch>(), gate = std::make_shared<Latch>();
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto running = blockOp([=] {
    started->countDown();
    gate->wait();
  });
  queue->addOperation(running);
  ASSERT_TRUE(started->wait());
  std::vector<OperationPtr> pending;
  for (int i = 0; i < 4; ++i) pending.push_back(blockOp([runs] { ++*runs; }));
  pending[0]->addDependency(blockOp([] {}));  // never runs: only cancellation makes it ready
  queue->addOperations(pending, false);
  queue->cancelAllOperations();
  EXPECT_TRUE(running->isCancelled());
  gate->countDown();
  expectDrains(queue);
  for (const auto& op : pending) EXPECT_TRUE(op->isCancelled() && op->isFinished());
  EXPECT_EQ(*runs, 0);
}

TEST(OperationQueue, ReleasedQueueStillRunsItsOperations) {
  auto gate = std::make_shared<Latch>(), ran = std::make_shared<Latch>(5);
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  queue->addOperationWithBlock([=] {
    gate->wait();
    ran->countDown();
  });
  for (int i = 0; i < 4; ++i) queue->addOperationWithBlock([ran] { ran->countDown(); });
  queue.reset();
  gate->countDown();
  EXPECT_TRUE(ran->wait());
}

TEST(OperationQueue, AsynchronousOperationHoldsItsSlotUntilReallyFinished) {
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  auto async = std::make_shared<ManualAsyncOperation>();
  auto completions = std::make_shared<std::atomic<int>>(0);
  async->setCompletionBlock([completions] { ++*completions; });
  auto nextRan = std::make_shared<Latch>();
  queue->addOperation(async);
  queue->addOperationWithBlock([nextRan] { nextRan->countDown(); });
  ASSERT_TRUE(async->started.wait());
  EXPECT_FALSE(nextRan->wait(kQuiet));  // start() returned, the slot is still taken
  async->announceFinished();            // isFinished() still reads false
  EXPECT_FALSE(nextRan->wait(kQuiet));
  EXPECT_EQ(queue->operationCount(), 2u);
  std::thread([async] { async->finish(); }).join();
  EXPECT_TRUE(nextRan->wait());
  async->announceFinished();  // a second, late announcement must not free another slot

  auto probe = std::make_shared<ConcurrencyProbe>(1, 6);
  for (int i = 0; i < 6; ++i) queue->addOperationWithBlock([probe] { probe->enter(); });
  ASSERT_TRUE(probe->done.wait());
  EXPECT_EQ(probe->peak(), 1);
  expectDrains(queue);
  EXPECT_TRUE(waitFor([&] { return *completions == 1; }));
}

TEST(OperationQueue, NameAndLimitAreObservable) {
  auto queue = std::make_shared<OperationQueue>();
  OperationQueueProtocol& protocol = *queue;
  auto recorder = std::make_shared<testing::Recorder>();
  protocol.addObserver(recorder, "name", KeyValueObservingOptionNew, nullptr);
  protocol.addObserver(recorder, "maxConcurrentOperationCount", KeyValueObservingOptionNew,
                       nullptr);
  EXPECT_EQ(protocol.maxConcurrentOperationCount(),
            OperationQueueDefaultMaxConcurrentOperationCount);
  protocol.setName("uploads");
  protocol.setMaxConcurrentOperationCount(2);
  EXPECT_EQ(recorder->newValues("name"), std::vector<Value>{"uploads"});
  EXPECT_EQ(recorder->newValues("maxConcurrentOperationCount"), std::vector<Value>{2});
  EXPECT_EQ(queue->valueForKey("name"), Value("uploads"));
  protocol.removeObserver(recorder.get(), "name");
  protocol.setName("downloads");
  EXPECT_EQ(recorder->count(), 2u);
  EXPECT_EQ(protocol.name(), "downloads");
}

}  // namespace
}  // namespace kivi
