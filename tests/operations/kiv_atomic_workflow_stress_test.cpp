// Many threads start workflows on one service at once; each workflow must run
// alone, every operation exactly once.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <thread>
#include <vector>

#include "kivi/operations/kiv_async_service.h"
#include "operations/async_test_support.h"

namespace kivi {
namespace {

using testing::Finish;

constexpr int kThreads = 8;
constexpr int kWorkflowsPerThread = 1250;  // about 1 s under ThreadSanitizer on 2 cores
constexpr int kWorkflows = kThreads * kWorkflowsPerThread;

struct StressState {
  std::vector<std::atomic<int>> starts = std::vector<std::atomic<int>>(2 * kWorkflows);
  std::atomic<int> active{0}, maxActive{0};
  testing::Signal ended;
};

// Workflows alternate variants and finishing threads.
OperationPtr makeOp(const std::shared_ptr<StressState>& state, int id, bool first, int variety) {
  auto onStart = [state, id, first](Operation&) {
    state->starts[id].fetch_add(1);
    if (!first) return;
    const int now = state->active.fetch_add(1) + 1;
    for (int seen = state->maxActive.load();
         now > seen && !state->maxActive.compare_exchange_weak(seen, now);) {
    }
  };
  const auto finish = variety % 4 < 2 ? Finish::onWorker : Finish::inlineOnce;
  if (variety % 2) return std::make_shared<testing::FlagsProbe>(finish, "", onStart);
  return std::make_shared<testing::EnumProbe>(finish, "", onStart);
}

TEST(KivAtomicWorkflowServiceStress, ConcurrentWorkflowsRunOneAtATime) {
  auto service = std::make_shared<KivAtomicWorkflowService>("stress");
  auto state = std::make_shared<StressState>();
  std::weak_ptr<KivAtomicWorkflowService> weak = service;

  auto startWorkflow = [&](int workflow) {
    const bool twoOps = workflow % 3 == 0;
    OperationPtr first = makeOp(state, 2 * workflow, true, workflow);
    OperationPtr last = twoOps ? makeOp(state, 2 * workflow + 1, false, workflow + 1) : first;
    last->setCompletionBlock([weak, state] {
      state->active.fetch_sub(1);
      if (auto service = weak.lock()) service->endAtomicWorkflow();
      state->ended.notify();
    });
    if (twoOps) {
      first->setCompletionBlock([weak, last] {
        if (auto service = weak.lock()) service->operationQueue()->addOperation(last);
      });
    }
    service->startAtomicWorkflowWithOperation(first);
  };

  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kWorkflowsPerThread; ++i) startWorkflow(t * kWorkflowsPerThread + i);
    });
  }
  for (auto& thread : threads) thread.join();
  ASSERT_TRUE(state->ended.wait(kWorkflows, std::chrono::seconds(60)))
      << "workflows stalled; parked: " << service->pendingOperations()->size();

  EXPECT_EQ(state->maxActive.load(), 1) << "two workflows overlapped";
  int wrong = 0;
  for (int workflow = 0; workflow < kWorkflows; ++workflow) {
    wrong += state->starts[2 * workflow] != 1;
    if (workflow % 3 == 0) wrong += state->starts[2 * workflow + 1] != 1;
  }
  EXPECT_EQ(wrong, 0) << "operations not started exactly once";
  EXPECT_TRUE(service->pendingOperations()->empty());
  EXPECT_FALSE(service->isAtomicWorkflowInProgress());
}

}  // namespace
}  // namespace kivi
