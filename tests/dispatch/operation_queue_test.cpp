#include "kivi/dispatch/operation_queue.h"

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

#include "test_support.h"

namespace kivi {
namespace {

using std::chrono::milliseconds;
using testing::kQuiet;
using testing::Signal;
using QueuePtr = std::shared_ptr<OperationQueue>;

std::shared_ptr<BlockOperation> blockOp(std::function<void()> block) {
  return std::make_shared<BlockOperation>(std::move(block));
}

void expectDrains(const QueuePtr& queue) {
  ASSERT_TRUE(testing::returnsWithin([queue] { queue->waitUntilAllOperationsAreFinished(); }));
  EXPECT_EQ(queue->operationCount(), 0u);
  EXPECT_TRUE(queue->operations().empty());
}

// Operations that each hold their slot until limit - 1 later ones have started,
// then watch briefly for one more: a queue over its limit shows as a higher peak.
class ConcurrencyProbe {
 public:
  ConcurrencyProbe(int limit, int total) : limit_(limit), total_(total) {}
  void enter() {
    std::unique_lock lock(mutex_);
    const int order = ++started_;
    peak_ = std::max(peak_, ++running_);
    cv_.notify_all();
    const int partners = std::min(order + limit_ - 1, total_);
    if (!cv_.wait_for(lock, testing::kTimeout, [&] { return started_ >= partners; }))
      timedOut_ = true;
    if (order + limit_ <= total_)
      cv_.wait_for(lock, milliseconds(5), [&] { return started_ > partners; });
    --running_;
    lock.unlock();
    done_.notify();
  }
  // The most operations seen running at once, once all have run.
  int peak() {
    EXPECT_TRUE(done_.wait(total_));
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
  Signal done_;
};

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
    EXPECT_EQ(probe->peak(), limit);
    expectDrains(queue);
  }
}

// Held-back operations start once released, even when nothing else holds the
// queue any more: a busy queue keeps itself alive.
TEST(OperationQueue, ZeroLimitAndSuspensionHoldOperationsBack) {
  for (bool suspend : {false, true}) {
    SCOPED_TRACE(suspend ? "suspended" : "zero limit");
    auto queue = std::make_shared<OperationQueue>();
    suspend ? queue->setSuspended(true) : queue->setMaxConcurrentOperationCount(0);
    auto ran = std::make_shared<Signal>();
    for (int i = 0; i < 3; ++i) queue->addOperationWithBlock([ran] { ran->notify(); });
    EXPECT_FALSE(ran->wait(1, kQuiet));
    EXPECT_EQ(queue->operationCount(), 3u);
    suspend ? queue->setSuspended(false) : queue->setMaxConcurrentOperationCount(2);
    queue.reset();
    EXPECT_TRUE(ran->wait(3));
  }
}

// A serial queue runs what it accepted in addition order; it refuses null,
// duplicate, already queued and finished operations.
TEST(OperationQueue, SerialQueueRunsAcceptedOperationsInAdditionOrder) {
  auto queue = std::make_shared<OperationQueue>(), other = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  queue->setSuspended(true);
  auto order = std::make_shared<std::vector<int>>();  // serial: no lock needed
  auto finished = blockOp([] {});
  finished->start();
  std::vector<OperationPtr> ops;
  for (int i = 0; i < 20; ++i) {
    ops.push_back(blockOp([order, i] { order->push_back(i); }));
    queue->addOperation(ops.back());
  }
  queue->addOperation(nullptr);
  queue->addOperation(ops[0]);
  other->addOperation(ops[1]);
  queue->addOperations({ops[2], nullptr, finished}, false);
  EXPECT_EQ(queue->operations(), ops);
  EXPECT_EQ(queue->operationCount(), 20u);
  EXPECT_EQ(other->operationCount(), 0u);
  queue->setSuspended(false);
  expectDrains(queue);
  std::vector<int> expected(20);
  for (int i = 0; i < 20; ++i) expected[i] = i;
  EXPECT_EQ(*order, expected);
}

// addOperations(…, true) and an operation's waitUntilFinished() block until
// the work is done; waiting on a finished operation returns at once.
TEST(OperationQueue, BlockingWaitsReturnOnceTheWorkIsDone) {
  auto queue = std::make_shared<OperationQueue>();
  auto gate = std::make_shared<Signal>(), returned = std::make_shared<Signal>();
  std::vector<OperationPtr> ops{blockOp([gate] { ASSERT_TRUE(gate->wait()); })};
  for (int i = 0; i < 7; ++i) ops.push_back(blockOp([] {}));
  std::thread([=] {
    queue->addOperations(ops, true);
    returned->notify();
  }).detach();
  std::thread([=] {
    ops[0]->waitUntilFinished();
    returned->notify();
  }).detach();
  EXPECT_FALSE(returned->wait(1, kQuiet));
  gate->notify();
  ASSERT_TRUE(returned->wait(2)) << "a wait did not return";
  for (const auto& op : ops) EXPECT_TRUE(op->isFinished());
  EXPECT_TRUE(testing::returnsWithin([op = ops[0]] { op->waitUntilFinished(); }));
  // By the time a wait returns, the queue has let the operation go.
  for (int i = 0; i < 200; ++i) {
    auto single = blockOp([] {});
    queue->addOperation(single);
    single->waitUntilFinished();
    ASSERT_EQ(queue->operationCount(), 0u) << "round " << i;
  }
}

// As many operations as the default limit runs, all started, then each
// waiting for work of a second queue, some through waitUntilFinished() and
// some on a signal the pool cannot see: the second queue's work still runs.
TEST(OperationQueue, OperationsWaitingOnAnotherQueueDoNotStarveIt) {
  auto outer = std::make_shared<OperationQueue>(), inner = std::make_shared<OperationQueue>();
  auto started = std::make_shared<Signal>();
  std::atomic<int> done{0};
  const int count = static_cast<int>(OperationQueue::kDefaultConcurrency);
  for (int i = 0; i < count; ++i) {
    outer->addOperation(blockOp([=, &done, silent = i % 4 == 0] {
      started->notify();
      EXPECT_TRUE(started->wait(count));
      auto signal = std::make_shared<Signal>();
      auto op = blockOp([signal] { signal->notify(); });
      inner->addOperation(op);
      if (silent) {
        EXPECT_TRUE(signal->wait());
      } else {
        op->waitUntilFinished();
      }
      ++done;
    }));
  }
  ASSERT_TRUE(testing::returnsWithin([outer] { outer->waitUntilAllOperationsAreFinished(); }));
  EXPECT_EQ(done, count);
}

// A dependency added after the queue picked a ready operation, before it
// called start(): the operation is turned away by start(), waits for the
// dependency and then runs, instead of staying in the running list for ever.
TEST(OperationQueue, DependencyAddedWhileTheQueueStartsTheOperation) {
  auto queue = std::make_shared<OperationQueue>();
  std::atomic<int> runs{0};
  constexpr int kRounds = 30'000;
  for (int i = 0; i < kRounds; ++i) {
    auto dependency = blockOp([] {});
    auto op = blockOp([&runs] { ++runs; });
    queue->addOperation(op);
    op->addDependency(dependency);
    dependency->start();
  }
  ASSERT_TRUE(testing::returnsWithin([queue] { queue->waitUntilAllOperationsAreFinished(); }));
  EXPECT_EQ(runs, kRounds);
}

TEST(OperationQueue, CancelAllOperations) {
  auto queue = std::make_shared<OperationQueue>();
  queue->setMaxConcurrentOperationCount(1);
  auto started = std::make_shared<Signal>(), gate = std::make_shared<Signal>();
  auto runs = std::make_shared<std::atomic<int>>(0);
  auto running = blockOp([=] {
    started->notify();
    ASSERT_TRUE(gate->wait());
  });
  queue->addOperation(running);
  ASSERT_TRUE(started->wait());
  std::vector<OperationPtr> pending;
  for (int i = 0; i < 4; ++i) pending.push_back(blockOp([runs] { ++*runs; }));
  pending[0]->addDependency(blockOp([] {}));  // never runs: only cancellation makes it ready
  queue->addOperations(pending, false);
  queue->cancelAllOperations();
  EXPECT_TRUE(running->isCancelled());
  gate->notify();
  expectDrains(queue);
  for (const auto& op : pending) EXPECT_TRUE(op->isCancelled() && op->isFinished());
  EXPECT_EQ(*runs, 0);
}

// Observed through the protocol, as services do.
TEST(OperationQueue, NameAndLimitAreObservable) {
  auto queue = std::make_shared<OperationQueue>();
  OperationQueueProtocol& protocol = *queue;
  EXPECT_EQ(protocol.maxConcurrentOperationCount(),
            OperationQueueDefaultMaxConcurrentOperationCount);
  auto recorder = std::make_shared<testing::Recorder>();
  for (const char* key : {"name", "maxConcurrentOperationCount"})
    protocol.addObserver(recorder, key, KeyValueObservingOptionNew, nullptr);
  protocol.setName("uploads");
  protocol.setMaxConcurrentOperationCount(2);
  protocol.removeObserver(recorder.get(), "name");
  protocol.setName("downloads");
  EXPECT_EQ(recorder->newValues("name"), std::vector<Value>{"uploads"});
  EXPECT_EQ(recorder->newValues("maxConcurrentOperationCount"), std::vector<Value>{2});
}

}  // namespace
}  // namespace kivi
