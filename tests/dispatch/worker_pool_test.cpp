#include "kivi/dispatch/worker_pool.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

#include "test_support.h"

namespace kivi {
namespace {

using testing::Signal;

// Runs `jobs` jobs that each submit one more; all must run on workers.
void runBurst(int jobs) {
  struct State {
    std::atomic<int> onWorker{0};
    Signal done;
  };
  auto state = std::make_shared<State>();
  for (int i = 0; i < jobs; ++i) {
    WorkerPool::shared().submit([state] {
      if (WorkerPool::isWorkerThread()) ++state->onWorker;
      WorkerPool::shared().submit([state] { state->done.notify(); });
      state->done.notify();
    });
  }
  ASSERT_TRUE(state->done.wait(2 * jobs));
  EXPECT_EQ(state->onWorker, jobs);
}

// Each round first checks that every job runs, jobs submitted by jobs included.
TEST(WorkerPool, RunsEveryJobAndBlockedJobsDoNotHoldBackLaterOnes) {
  EXPECT_FALSE(WorkerPool::isWorkerThread());
  WorkerPool::shared().submit(nullptr);  // ignored; calling it would end the process
  // More blocked jobs than cores, after a burst that leaves idle workers behind:
  // the last job needs an idle or a new worker promptly (an idle worker's
  // timeout is no substitute for a wake-up).
  const int blockers =
      std::min<int>(std::thread::hardware_concurrency() + 4, WorkerPool::kMaxThreads - 4);
  for (int round = 0; round < 3 && !HasFailure(); ++round) {
    runBurst(500);
    auto gate = std::make_shared<Signal>(), released = std::make_shared<Signal>();
    for (int i = 0; i < blockers; ++i) {
      WorkerPool::shared().submit([gate, released] {
        EXPECT_TRUE(gate->wait());
        released->notify();
      });
    }
    WorkerPool::shared().submit([gate] { gate->notify(); });
    EXPECT_TRUE(gate->wait(1, std::chrono::seconds(2))) << "round " << round;
    EXPECT_TRUE(released->wait(blockers));
  }
}

}  // namespace
}  // namespace kivi
