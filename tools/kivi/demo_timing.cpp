#include "demo_timing.h"

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <mutex>
#include <ostream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "journal.h"
#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/operation.h"
#include "kivi/dispatch/run_loop.h"
#include "kivi/dispatch/thread.h"
#include "kivi/timing/kiv_key_value_observer.h"
#include "kivi/timing/kiv_main_thread_runner.h"
#include "kivi/timing/kiv_run_loop_semaphore.h"
#include "kivi/timing/kiv_runloop_timer.h"
#include "kivi/timing/kiv_timer.h"

extern char** environ;

namespace kivi::tool {

namespace {

using Clock = std::chrono::steady_clock;

// Journal lines, marked when they come from the main thread.
class Lines {
 public:
  explicit Lines(std::ostream& out) : journal_(out) {}
  void print(const std::string& who, const std::string& what) {
    journal_.line(who + (Thread::isMainThread() ? " (main) " : " "), what);
  }
  void heading(const std::string& text) { journal_.heading(text); }

 private:
  Journal journal_;
};

Date in(double seconds) { return Date::now().addingTimeInterval(seconds); }

// Runs the main run loop in `mode` until `done()` or 10 seconds.
template <typename Done>
bool runMainUntil(const RunLoopMode& mode, Done done) {
  const Date deadline = in(10);
  auto loop = RunLoop::mainRunLoop();
  while (!done() && Date::now() < deadline) loop->runMode(mode, in(0.01));
  return done();
}

// Two `kivi lock` children, started together, each holding the lock for a
// moment; their lines go to one file, read back when both are done.
bool lockChildrenTakeTurns(Lines& lines) {
  const auto dir =
      std::filesystem::temp_directory_path() / ("kivi-demo-" + std::to_string(::getpid()));
  std::filesystem::create_directories(dir);
  const std::string lock = (dir / "turns.lock").string();
  const std::string log = (dir / "turns.log").string();
  std::vector<pid_t> children;
  for (const char* name : {"child-1", "child-2"}) {
    const std::string stamp = "$(date +%H:%M:%S.%3N)";
    const std::string script = std::string("echo \"") + stamp + " " + name +
                               " holds the lock\" >> '" + log + "'; sleep 0.2; echo \"" + stamp +
                               " " + name + " lets go\" >> '" + log + "'";
    std::vector<std::string> args = {"kivi", "lock",    lock, "--timeout", "10",
                                     "--",   "/bin/sh", "-c", script};
    std::vector<char*> argv;
    for (auto& arg : args) argv.push_back(arg.data());
    argv.push_back(nullptr);
    pid_t pid = -1;
    if (::posix_spawn(&pid, "/proc/self/exe", nullptr, nullptr, argv.data(), environ) == 0) {
      children.push_back(pid);
      lines.print("lock", std::string(name) + " started: kivi lock " + lock + " -- sh -c ...");
    }
  }
  bool ok = children.size() == 2;
  for (pid_t pid : children) {
    int status = 0;
    ok = ::waitpid(pid, &status, 0) == pid && WIFEXITED(status) && WEXITSTATUS(status) == 0 && ok;
  }
  std::ifstream in(log);
  for (std::string line; std::getline(in, line);) lines.print("lock", line);
  std::error_code ignored;
  std::filesystem::remove_all(dir, ignored);
  return ok;
}

}  // namespace

int runTimingDemo(std::ostream& out, std::ostream& err) {
  Lines lines(out);

  lines.heading("A repeating KivTimer (50 ms), cancelled after its third firing");
  {
    std::atomic<int> firings{0};
    auto semaphore = std::make_shared<KivRunLoopSemaphore>();
    std::weak_ptr<KivTimer> weak;
    auto timer = KivTimer::create(
        [&, semaphore] {
          const int n = ++firings;
          lines.print("KivTimer", "fired #" + std::to_string(n) + " on a worker");
          if (n == 3) {
            if (auto self = weak.lock()) self->cancel();  // re-enters its monitor
            semaphore->signal();
          }
        },
        0.05, KivTimerDispositionRepeating);
    weak = timer;
    timer->start();
    if (!semaphore->waitWithTimeout(10)) {
      err << "kivi demo: the KivTimer did not fire three times\n";
      return 1;
    }
  }

  lines.heading("A KivRunloopTimer (20 ms) in the mode \"kivi.demo.mode\"");
  {
    std::atomic<int> firings{0};
    auto timer = KivRunloopTimer::create(0.02, "kivi.demo.mode", KivTimerDispositionRepeating,
                                         [&](const std::shared_ptr<KivRunloopTimer>&) {
                                           ++firings;
                                           lines.print("runloop", "fired on its private queue");
                                         });
    timer->start();
    RunLoop::mainRunLoop()->runUntilDate(in(0.1));
    timer->operationQueue()->waitUntilAllOperationsAreFinished();
    lines.print("runloop", "100 ms of the main run loop in the default mode: " +
                               std::to_string(firings.load()) + " firings");
    const bool fired = runMainUntil("kivi.demo.mode", [&] { return firings >= 3; });
    timer->cancel();
    timer->operationQueue()->waitUntilAllOperationsAreFinished();
    if (!fired) {
      err << "kivi demo: the KivRunloopTimer did not fire in its mode\n";
      return 1;
    }
    lines.print("runloop", "cancelled after " + std::to_string(firings.load()) +
                               " firings in \"kivi.demo.mode\"");
  }

  lines.heading("A main-thread KivRunLoopSemaphore wait while main-queue work flows");
  {
    auto semaphore = std::make_shared<KivRunLoopSemaphore>();
    std::thread worker([&lines, semaphore] {
      for (int i = 1; i <= 3; ++i) {
        KivMainThreadRunner::runBlockOnMainThread(
            [&lines, i] { lines.print("main queue", "job " + std::to_string(i) + " ran"); });
      }
      KivMainThreadRunner::runBlockOnMainThread([&lines, semaphore] {
        lines.print("main queue", "signals the semaphore");
        semaphore->signal();
      });
    });
    const bool signalled = semaphore->waitWithTimeout(10);
    worker.join();
    lines.print("semaphore", signalled ? "wait returned true" : "wait timed out");
    if (!signalled) {
      err << "kivi demo: the semaphore was not signalled\n";
      return 1;
    }
  }

  lines.heading("A KivKeyValueObserver reporting \"isFinished\" on queue \"kivi.demo.observer\"");
  {
    auto queue = DispatchQueue::create("kivi.demo.observer");
    auto operation =
        std::make_shared<BlockOperation>([&lines] { lines.print("operation", "runs"); });
    auto observer = std::make_shared<KivKeyValueObserver>(operation, "isFinished");
    auto semaphore = std::make_shared<KivRunLoopSemaphore>();
    observer->registerObserverWithOptions(
        KeyValueObservingOptionNew | KeyValueObservingOptionOld,
        [&lines, queue, semaphore](const Value& oldValue, const Value& newValue, void*) {
          lines.print("observer", "isFinished " + oldValue.description() + " -> " +
                                      newValue.description() + " on " +
                                      (queue->isCurrent() ? queue->label() : "another queue"));
          semaphore->signal();
        },
        queue, nullptr);
    DispatchQueue::global()->async([operation] { operation->start(); });
    if (!semaphore->waitWithTimeout(10)) {
      err << "kivi demo: the observer reported nothing\n";
      return 1;
    }
  }

  lines.heading("Two `kivi lock` children taking turns on one lock");
  if (!lockChildrenTakeTurns(lines)) {
    err << "kivi demo: the kivi lock children did not both finish\n";
    return 1;
  }
  return 0;
}

}  // namespace kivi::tool
