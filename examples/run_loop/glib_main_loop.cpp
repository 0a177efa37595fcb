// run_loop: a GLib program whose GMainLoop drives the library's main run loop,
// with timers firing on other threads and their results hopping back onto
// the main thread.
//
//   $ run_loop
//      51 ms  worker  KivTimer fired
//      51 ms  main    KivTimer firing 1 arrived on the main thread
//      61 ms  worker  KivRunloopTimer fired
//      61 ms  main    KivRunloopTimer firing 1 arrived on the main thread
//   ...
//     152 ms  main    all six firings seen; quitting the GLib loop
//
// What it shows:
//   - GLib owns the main thread's loop; the library's main run loop joins it
//     through its poll descriptor, so main-queue work and run-loop timers run
//     whenever GLib turns;
//   - a repeating KivTimer, which counts down on a worker thread and needs no
//     run loop;
//   - a repeating KivRunloopTimer, which counts down on the main run loop (so
//     only while something runs it: here GLib) and calls back on a private
//     serial queue;
//   - KivMainThreadRunner carrying each firing back to the main thread, where
//     the program's state lives without a lock.
//
// It quits by itself once each timer fired three times (about 150 ms), and
// exits 0 when every callback ran on the thread it should have; 1 when one
// did not, or when the firings did not all arrive within 1.5 seconds.
#include <glib-unix.h>
#include <glib.h>

#include <chrono>
#include <cstdio>
#include <memory>
#include <mutex>
#include <string>

#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/thread.h"
#include "kivi/timing/kiv_main_thread_runner.h"
#include "kivi/timing/kiv_runloop_timer.h"
#include "kivi/timing/kiv_timer.h"
#include "kivi/timing/kiv_timer_protocol.h"

namespace {

constexpr int kFirings = 3;          // of each timer
constexpr guint kDeadlineMs = 1500;  // give up after this long

const auto gStart = std::chrono::steady_clock::now();
std::mutex gSayMutex;

// One line: time since start, the calling thread, the message. Lines come
// from several threads, so they are written under a lock.
void say(const std::string& what) {
  const auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(
                      std::chrono::steady_clock::now() - gStart)
                      .count();
  std::lock_guard lock(gSayMutex);
  std::printf("%6lld ms  %-6s  %s\n", static_cast<long long>(ms),
              kivi::Thread::isMainThread() ? "main" : "worker", what.c_str());
  std::fflush(stdout);
}

// Called by GLib when the run loop's descriptor is readable: some main-queue
// work, performed block or run-loop timer is due. runPendingWork() runs what
// is due and returns without waiting.
gboolean driveMainRunLoop(gint /*fd*/, GIOCondition /*condition*/, gpointer /*data*/) {
  kivi::RunLoop::mainRunLoop()->runPendingWork();
  return G_SOURCE_CONTINUE;
}

// What has arrived so far. Only the main thread reads or writes it: every
// callback from elsewhere hops onto the main thread first.
struct Progress {
  GMainLoop* loop = nullptr;
  int timerFirings = 0;
  int runloopTimerFirings = 0;
  bool allOnExpectedThreads = true;
  bool timedOut = false;

  bool done() const { return timerFirings >= kFirings && runloopTimerFirings >= kFirings; }
};

gboolean giveUp(gpointer data) {
  auto* progress = static_cast<Progress*>(data);
  say("the firings did not all arrive in time; quitting the GLib loop");
  progress->timedOut = true;
  g_main_loop_quit(progress->loop);
  return G_SOURCE_REMOVE;
}

}  // namespace

int main() {
  // The thread that runs main() is the main thread; GLib's default context
  // and the library's main run loop both belong to it.
  GMainLoop* loop = g_main_loop_new(nullptr, FALSE);
  const guint runLoopSource = g_unix_fd_add(kivi::RunLoop::mainRunLoop()->pollDescriptor(), G_IO_IN,
                                            driveMainRunLoop, nullptr);

  Progress progress;
  progress.loop = loop;
  const guint deadlineSource = g_timeout_add(kDeadlineMs, giveUp, &progress);

  std::shared_ptr<kivi::KivTimer> timer;
  std::shared_ptr<kivi::KivRunloopTimer> runloopTimer;

  // Runs on the main thread for every firing of either timer. `firedOffMain`
  // is what the timer's callback saw on its own thread. Both timers stand
  // behind KivTimerProtocol, so one function can stop either.
  auto arrived = [&](const char* name, int& firings, kivi::KivTimerProtocol& source,
                     bool firedOffMain) {
    const bool onMain = kivi::Thread::isMainThread();
    progress.allOnExpectedThreads = progress.allOnExpectedThreads && firedOffMain && onMain;
    if (firings == kFirings) return;  // a late firing, already under way at cancel()
    ++firings;
    say(std::string(name) + " firing " + std::to_string(firings) + " arrived on the main thread");
    // Both timers take cancel() from any thread. KivTimer::cancel() waits
    // only while the timer's own callback runs, and that never waits for us.
    if (firings == kFirings) source.cancel();
    if (progress.done()) {
      say("all " + std::to_string(2 * kFirings) + " firings seen; quitting the GLib loop");
      g_main_loop_quit(loop);
    }
  };

  // A KivTimer fires on a worker thread of its own operation queue; the main
  // thread could be blocked and it would still fire.
  timer = kivi::KivTimer::create(
      [&] {
        const bool offMain = !kivi::Thread::isMainThread();
        say("KivTimer fired");
        // Asynchronous: the block waits in the main queue until GLib next
        // lets the main run loop run, and this worker goes on at once.
        kivi::KivMainThreadRunner::runBlockOnMainThread(
            [&, offMain] { arrived("KivTimer", progress.timerFirings, *timer, offMain); });
      },
      0.05, kivi::KivTimerDispositionRepeating);

  // A KivRunloopTimer counts down on the main run loop, in the mode given;
  // runPendingWork() runs the default mode. Its callback runs on the timer's
  // private serial queue, never on the main thread.
  runloopTimer = kivi::KivRunloopTimer::create(
      0.03, kivi::NSDefaultRunLoopMode, kivi::KivTimerDispositionRepeating,
      [&](const std::shared_ptr<kivi::KivRunloopTimer>& /*self*/) {
        const bool offMain = !kivi::Thread::isMainThread();
        say("KivRunloopTimer fired");
        kivi::KivMainThreadRunner::runBlockOnMainThread([&, offMain] {
          arrived("KivRunloopTimer", progress.runloopTimerFirings, *runloopTimer, offMain);
        });
      });

  timer->start();
  runloopTimer->start();
  g_main_loop_run(loop);

  // Tear down before the state the callbacks refer to goes away. cancel()
  // stops further firings; a KivRunloopTimer firing already handed to its
  // queue still runs, so wait for that queue to drain. Blocks still waiting
  // in the main queue never run: nothing turns the main run loop any more.
  timer->cancel();
  runloopTimer->cancel();
  runloopTimer->operationQueue()->waitUntilAllOperationsAreFinished();
  if (!progress.timedOut) g_source_remove(deadlineSource);
  g_source_remove(runLoopSource);
  g_main_loop_unref(loop);

  if (!progress.allOnExpectedThreads) {
    std::fprintf(stderr, "run_loop: a callback ran on the wrong thread\n");
    return 1;
  }
  return progress.done() && !progress.timedOut ? 0 : 1;
}
