// The main run loop driven by a GLib main loop, as in a GTK application: the
// host adds the run loop's descriptor to its own loop and never runs ours.
#include <glib-unix.h>
#include <glib.h>
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <thread>

#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/thread.h"
#include "kivi/timing/kiv_main_thread_runner.h"
#include "kivi/timing/kiv_run_loop_semaphore.h"
#include "kivi/timing/kiv_runloop_timer.h"
#include "test_support.h"

namespace kivi {
namespace {

gboolean runPending(gint, GIOCondition, gpointer) {
  RunLoop::mainRunLoop()->runPendingWork();
  return G_SOURCE_CONTINUE;
}

TEST(HostLoopTest, AGLibMainLoopDrivesTheMainRunLoop) {
  ASSERT_TRUE(Thread::isMainThread());
  GMainLoop* glibLoop = g_main_loop_new(nullptr, FALSE);
  const guint watch = g_unix_fd_add(RunLoop::mainRunLoop()->pollDescriptor(), G_IO_IN,
                                    runPending, nullptr);
  struct State {
    GMainLoop* loop;
    std::atomic<int> runnerCalls{0};
    std::atomic<int> timerFirings{0};
    std::atomic<bool> timerOnMain{false};
    bool semaphoreWait = false;
    bool mainQueueRanDuringWait = false;
    bool timedOut = false;
    void quitIfDone() {
      if (runnerCalls == 3 && timerFirings >= 3 && semaphoreWait) g_main_loop_quit(loop);
    }
  } state{glibLoop};

  // 1. Work for the main thread from a worker, through the runner.
  std::thread worker([&] {
    for (int i = 0; i < 3; ++i) {
      KivMainThreadRunner::runBlockOnMainThread([&] {
        if (Thread::isMainThread()) ++state.runnerCalls;
        state.quitIfDone();
      });
    }
  });
  // 2. A run-loop timer of the default mode, which the host loop runs.
  auto timer = KivRunloopTimer::create(
      0.005, NSDefaultRunLoopMode, KivTimerDispositionRepeating,
      [&](const std::shared_ptr<KivRunloopTimer>&) {
        if (Thread::isMainThread()) state.timerOnMain = true;
        if (++state.timerFirings == 3) {
          KivMainThreadRunner::runBlockOnMainThread([&] { state.quitIfDone(); });
        }
      });
  timer->start();
  // 3. Inside a host callback, a main-thread semaphore wait that main-queue
  // work signals: the GLib loop is paused, ours keeps running.
  g_idle_add_full(
      G_PRIORITY_DEFAULT,
      [](gpointer data) -> gboolean {
        auto& state = *static_cast<State*>(data);
        auto semaphore = std::make_shared<KivRunLoopSemaphore>();
        std::thread([semaphore, &state] {
          KivMainThreadRunner::runBlockOnMainThread([semaphore, &state] {
            state.mainQueueRanDuringWait = Thread::isMainThread();
            semaphore->signal();
          });
        }).detach();
        state.semaphoreWait = semaphore->waitWithTimeout(10);
        state.quitIfDone();
        return G_SOURCE_REMOVE;
      },
      &state, nullptr);
  g_timeout_add_full(
      G_PRIORITY_DEFAULT, static_cast<guint>(testing::kTimeout.count()),
      [](gpointer data) -> gboolean {
        auto& state = *static_cast<State*>(data);
        state.timedOut = true;
        g_main_loop_quit(state.loop);
        return G_SOURCE_REMOVE;
      },
      &state, nullptr);

  g_main_loop_run(glibLoop);
  worker.join();
  timer->cancel();
  timer->operationQueue()->waitUntilAllOperationsAreFinished();
  g_source_remove(watch);
  g_main_loop_unref(glibLoop);

  EXPECT_FALSE(state.timedOut);
  EXPECT_EQ(state.runnerCalls, 3);
  EXPECT_GE(state.timerFirings, 3);
  EXPECT_FALSE(state.timerOnMain);
  EXPECT_TRUE(state.semaphoreWait);
  EXPECT_TRUE(state.mainQueueRanDuringWait);
}

}  // namespace
}  // namespace kivi
