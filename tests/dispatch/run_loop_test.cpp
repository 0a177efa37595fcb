#include "kivi/dispatch/run_loop.h"

#include <gtest/gtest.h>
#include <poll.h>

#include <atomic>
#include <chrono>
#include <cmath>
#include <limits>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/thread.h"
#include "kivi/dispatch/timer.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::kTimeout;
using testing::returnsWithin;

// Runs `body` on a thread of its own (whose run loop is not the main one)
// and waits for it.
template <typename Body>
void onOwnThread(Body body) {
  std::thread thread(body);
  thread.join();
}

Date in(double seconds) { return Date::now().addingTimeInterval(seconds); }

bool readable(int fd, int timeoutMs) {
  pollfd entry{fd, POLLIN, 0};
  return ::poll(&entry, 1, timeoutMs) == 1;
}

TEST(RunLoopTest, TimersFireOnlyInTheModesTheyWereAddedFor) {
  onOwnThread([] {
    auto loop = RunLoop::currentRunLoop();
    ASSERT_NE(loop, RunLoop::mainRunLoop());
    EXPECT_EQ(loop, RunLoop::currentRunLoop());
    std::vector<std::string> fired;
    auto record = [&](const char* name) {
      return [&, name](const TimerPtr&) { fired.push_back(name + (":" + *loop->currentMode())); };
    };
    auto modal = Timer::create(0.001, false, record("modal"));
    auto common = Timer::create(0.001, false, record("common"));
    auto plain = Timer::create(0.001, false, record("default"));
    loop->addTimer(modal, "modal");
    // Nothing waits in the default mode: a run returns at once.
    EXPECT_FALSE(loop->runMode(NSDefaultRunLoopMode, Date::distantFuture()));
    loop->addTimer(common, NSRunLoopCommonModes);
    loop->addTimer(plain, NSDefaultRunLoopMode);
    // Runs until both default-mode timers have fired and the mode is empty.
    loop->runUntilDate(Date::distantFuture());
    EXPECT_EQ(fired, (std::vector<std::string>{"common:kCFRunLoopDefaultMode",
                                               "default:kCFRunLoopDefaultMode"}));
    EXPECT_TRUE(modal->isValid());
    EXPECT_FALSE(common->isValid());
    EXPECT_TRUE(loop->runMode("modal", Date::distantFuture()));
    EXPECT_EQ(fired.back(), "modal:modal");
    EXPECT_FALSE(loop->runMode("modal", Date::distantFuture()));
    EXPECT_FALSE(loop->currentMode().has_value());
  });
}

TEST(RunLoopTest, RepeatingTimerKeepsItsScheduleAndSkipsMissedFirings) {
  onOwnThread([] {
    constexpr double kInterval = 0.02;
    auto loop = RunLoop::currentRunLoop();
    std::vector<double> dues;    // the next due date, read in each firing
    std::vector<double> firing;  // when each firing ran
    const double firstDue = in(kInterval).timeIntervalSince1970;
    auto timer = Timer::create(kInterval, true, [&](const TimerPtr& timer) {
      firing.push_back(Date::now().timeIntervalSince1970);
      dues.push_back(timer->fireDate().timeIntervalSince1970);
      // The loop is busy for several intervals once: those firings are missed.
      if (firing.size() == 1) std::this_thread::sleep_for(std::chrono::milliseconds(75));
      if (firing.size() == 4) timer->invalidate();
    });
    loop->addTimer(timer, NSDefaultRunLoopMode);
    loop->run();  // until the timer is invalid and the mode empty
    ASSERT_EQ(dues.size(), 4u);
    double previous = firstDue;
    for (std::size_t i = 0; i < dues.size(); ++i) {
      // Every due date lies on the schedule and after the firing that set it:
      // missed firings are skipped, not run back to back.
      const double steps = (dues[i] - firstDue) / kInterval;
      EXPECT_NEAR(steps, std::round(steps), 0.05) << i;
      EXPECT_GT(dues[i], previous) << i;
      EXPECT_GT(dues[i], firing[i]) << i;
      previous = dues[i];
    }
    EXPECT_GE(std::round((dues[1] - firstDue) / kInterval), 4) << "the busy firing skips ahead";
  });
}

TEST(RunLoopTest, PerformedBlocksRunInOrderInTheirModesAndRunsNest) {
  onOwnThread([] {
    auto loop = RunLoop::currentRunLoop();
    std::vector<std::string> ran;
    loop->performInModes({"modal"}, [&] { ran.push_back("modal:" + *loop->currentMode()); });
    loop->performBlock([&] {
      ran.push_back("first");
      // A nested run in another mode, from inside a block.
      EXPECT_TRUE(loop->runMode("modal", Date::distantPast()));
      EXPECT_EQ(*loop->currentMode(), NSDefaultRunLoopMode);
    });
    loop->perform({"", "other"}, [&] { ran.push_back("other"); });
    loop->performInModes({""}, [&] { ran.push_back("never"); });  // no usable mode
    std::thread([&] { loop->performBlock([&] { ran.push_back("second"); }); }).join();
    EXPECT_TRUE(loop->runMode(NSDefaultRunLoopMode, in(5)));
    EXPECT_EQ(ran, (std::vector<std::string>{"first", "modal:modal", "second"}));
    EXPECT_TRUE(loop->runMode("other", Date::distantPast()));
    EXPECT_EQ(ran.back(), "other");
    EXPECT_FALSE(loop->runMode("", Date::distantFuture()));
  });
}

TEST(RunLoopTest, InvalidatingFromAnotherThreadEndsARunLeftWithNothing) {
  onOwnThread([] {
    auto loop = RunLoop::currentRunLoop();
    std::weak_ptr<int> captured;
    auto timer = [&] {
      auto held = std::make_shared<int>(1);
      captured = held;
      return Timer::create(3600, true, [held](const TimerPtr&) {});
    }();
    loop->addTimer(timer, "waiting");
    std::thread other([timer] {
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
      timer->invalidate();
    });
    const auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(loop->runMode("waiting", Date::distantFuture()));
    EXPECT_LT(std::chrono::steady_clock::now() - start, kTimeout);
    other.join();
    EXPECT_FALSE(timer->isValid());
    EXPECT_TRUE(captured.expired()) << "an invalid timer lets go of its block";
  });
}

TEST(RunLoopTest, ATimerHoldsItsBlockUntilItIsDone) {
  onOwnThread([] {
    auto loop = RunLoop::currentRunLoop();
    std::weak_ptr<int> captured;
    int fired = 0;
    {
      auto held = std::make_shared<int>(1);
      captured = held;
      // Only the run loop holds the timer.
      loop->addTimer(Timer::create(0.001, false, [held, &fired](const TimerPtr&) { ++fired; }),
                     NSDefaultRunLoopMode);
    }
    EXPECT_FALSE(captured.expired());
    loop->runUntilDate(in(5));
    EXPECT_EQ(fired, 1);
    EXPECT_TRUE(captured.expired()) << "a one-shot timer is invalidated after it fires";

    // A run nested in a one-shot timer's block does not fire it again.
    fired = 0;
    loop->addTimer(Timer::create(0.001, false,
                                 [&](const TimerPtr&) {
                                   ++fired;
                                   loop->runUntilDate(in(0.02));
                                 }),
                   NSDefaultRunLoopMode);
    loop->addTimer(Timer::create(0.01, false, nullptr), NSDefaultRunLoopMode);  // keeps it busy
    loop->runUntilDate(in(5));
    EXPECT_EQ(fired, 1);
  });
}

TEST(RunLoopTest, TimerValuesAndBadIntervals) {
  auto oneShot = Timer::create(5, false, nullptr);
  EXPECT_EQ(oneShot->timeInterval(), 0);
  EXPECT_NEAR(oneShot->fireDate().timeIntervalSinceNow(), 5, 0.5);
  oneShot->setFireDate(in(100));
  EXPECT_NEAR(oneShot->fireDate().timeIntervalSinceNow(), 100, 0.5);
  const double nan = std::numeric_limits<double>::quiet_NaN();
  const double inf = std::numeric_limits<double>::infinity();
  for (double bad : {0.0, -1.0, nan}) {
    EXPECT_EQ(Timer::create(bad, true, nullptr)->timeInterval(), 0.0001) << bad;
  }
  auto forever = Timer::create(inf, true, nullptr);
  EXPECT_GT(forever->timeInterval(), 1e9);
  EXPECT_GT(forever->fireDate().timeIntervalSinceNow(), 1e9);
  auto withInfo = Timer::create(
      1, [](const TimerPtr&) {}, Value("info"), false);
  EXPECT_EQ(withInfo->userInfo(), Value("info"));
  // fire() runs the block now; a one-shot timer is then spent.
  int fired = 0;
  auto manual = Timer::create(100, false, [&](const TimerPtr&) { ++fired; });
  manual->fire();
  manual->fire();
  EXPECT_EQ(fired, 1);
  EXPECT_FALSE(manual->isValid());
  onOwnThread([nan] {
    auto loop = RunLoop::currentRunLoop();
    loop->addTimer(nullptr, NSDefaultRunLoopMode);
    loop->addTimer(Timer::create(0.001, false, nullptr), "");
    EXPECT_FALSE(loop->runMode(NSDefaultRunLoopMode, Date::distantFuture()));
    EXPECT_FALSE(loop->runMode("", Date::distantFuture()));
    loop->runUntilDate(Date{nan});  // returns
    loop->run();                    // nothing to wait for: returns
  });
}

TEST(MainRunLoopTest, RunsMainQueueWorkAndReturnsAfterIt) {
  ASSERT_TRUE(Thread::isMainThread());
  auto loop = RunLoop::currentRunLoop();
  ASSERT_EQ(loop, RunLoop::mainRunLoop());
  std::atomic<bool> ran{false};
  std::thread poster([&] {
    EXPECT_FALSE(Thread::isMainThread());
    DispatchQueue::main()->async([&] {
      EXPECT_TRUE(Thread::isMainThread());
      ran = true;
    });
  });
  // The default mode of the main run loop always has the main queue to wait
  // for; this run returns once main-queue work has run.
  EXPECT_TRUE(loop->runMode(NSDefaultRunLoopMode, in(10)));
  poster.join();
  EXPECT_TRUE(ran);
  // A mode that is not common does not run main-queue work.
  DispatchQueue::main()->async([&] { ran = false; });
  loop->addTimer(Timer::create(0.001, false, nullptr), "modal");
  EXPECT_TRUE(loop->runMode("modal", in(10)));
  EXPECT_TRUE(ran);
  loop->runUntilDate(Date::distantPast());
  EXPECT_FALSE(ran);
}

TEST(MainRunLoopTest, AHostLoopDrivesItThroughItsDescriptor) {
  auto loop = RunLoop::mainRunLoop();
  const int fd = loop->pollDescriptor();
  ASSERT_GE(fd, 0);
  loop->runPendingWork();
  EXPECT_FALSE(readable(fd, 0));
  bool performed = false;
  std::thread([&] { loop->performBlock([&] { performed = true; }); }).join();
  EXPECT_TRUE(readable(fd, 0));
  loop->runPendingWork();
  EXPECT_TRUE(performed);
  EXPECT_FALSE(readable(fd, 0));
  // A due timer of a common mode makes it readable; one of another mode not.
  int fired = 0;
  loop->addTimer(Timer::create(0.001, false, [&](const TimerPtr&) { ++fired; }), "modal");
  loop->addTimer(Timer::create(0.02, false, [&](const TimerPtr&) { fired += 10; }),
                 NSRunLoopCommonModes);
  ASSERT_TRUE(readable(fd, static_cast<int>(kTimeout.count())));
  loop->runPendingWork();
  EXPECT_EQ(fired, 10);
  EXPECT_FALSE(readable(fd, 50));
  EXPECT_TRUE(loop->runMode("modal", Date::distantPast()));
  EXPECT_EQ(fired, 11);

  // Main-queue work announced while the loop ran another mode is still
  // announced to the host afterwards.
  loop->runPendingWork();
  bool ran = false;
  loop->addTimer(Timer::create(0.01, false, nullptr), "modal");
  loop->performInModes({"modal"}, [&] {
    std::thread([&] { DispatchQueue::main()->async([&] { ran = true; }); }).join();
  });
  EXPECT_TRUE(loop->runMode("modal", Date::now().addingTimeInterval(5)));
  EXPECT_FALSE(ran);
  ASSERT_TRUE(readable(fd, static_cast<int>(kTimeout.count())));
  loop->runPendingWork();
  EXPECT_TRUE(ran);
}

}  // namespace
}  // namespace kivi
