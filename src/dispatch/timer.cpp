#include "kivi/dispatch/timer.h"

#include <utility>

#include "run_loop_internals.h"

namespace kivi {

namespace {

TimerPtr makeTimer(DispatchTime due, double interval, bool repeats, Timer::Block block,
                   Value userInfo) {
  auto core = std::make_shared<detail::TimerCore>();
  core->repeats = repeats;
  core->intervalSeconds = detail::usableTimerInterval(interval);
  core->interval = detail::cappedDuration(core->intervalSeconds);
  if (core->interval <= DispatchDuration::zero()) core->interval = DispatchDuration(1);
  core->due = due;
  core->block = std::move(block);
  return std::make_shared<Timer>(std::move(core), std::move(userInfo));
}

DispatchTime dueAfter(double interval) {
  return DispatchClock::system()->now() +
         detail::cappedDuration(detail::usableTimerInterval(interval));
}

}  // namespace

Timer::Timer(std::shared_ptr<detail::TimerCore> core, Value userInfo)
    : core_(std::move(core)), userInfo_(std::move(userInfo)) {}

Timer::~Timer() = default;

TimerPtr Timer::create(double interval, bool repeats, Block block) {
  return makeTimer(dueAfter(interval), interval, repeats, std::move(block), Value());
}

TimerPtr Timer::create(double interval, Block action, Value userInfo, bool repeats) {
  return makeTimer(dueAfter(interval), interval, repeats, std::move(action), std::move(userInfo));
}

TimerPtr Timer::create(Date fireDate, double interval, bool repeats, Block block) {
  return makeTimer(detail::deadlineForDate(fireDate), interval, repeats, std::move(block), Value());
}

TimerPtr Timer::scheduledTimer(double interval, bool repeats, Block block) {
  auto timer = create(interval, repeats, std::move(block));
  RunLoop::currentRunLoop()->addTimer(timer, NSDefaultRunLoopMode);
  return timer;
}

void Timer::fire() {
  Block block;
  {
    std::lock_guard lock(core_->mutex);
    if (!core_->valid) return;
    block = core_->block;
  }
  const auto self = std::static_pointer_cast<Timer>(shared_from_this());
  if (block) block(self);
  if (!core_->repeats) invalidate();
}

void Timer::invalidate() {
  Block released;
  std::vector<std::weak_ptr<RunLoop::Core>> loops;
  {
    std::lock_guard lock(core_->mutex);
    if (!core_->valid) return;
    core_->valid = false;
    released = std::move(core_->block);
    loops = std::move(core_->loops);
  }
  for (const auto& weak : loops) {
    if (auto loop = weak.lock()) detail::runLoopForgetTimer(*loop, this);
  }
  // `released` (and what it holds) goes here, outside every lock.
}

bool Timer::isValid() const {
  std::lock_guard lock(core_->mutex);
  return core_->valid;
}

Date Timer::fireDate() const {
  DispatchTime due;
  {
    std::lock_guard lock(core_->mutex);
    due = core_->due;
  }
  const auto remaining = std::chrono::duration<double>(due - DispatchClock::system()->now());
  return Date::now().addingTimeInterval(remaining.count());
}

void Timer::setFireDate(Date date) {
  std::vector<std::weak_ptr<RunLoop::Core>> loops;
  {
    std::lock_guard lock(core_->mutex);
    if (!core_->valid) return;
    core_->due = detail::deadlineForDate(date);
    loops = core_->loops;
  }
  for (const auto& weak : loops) {
    if (auto loop = weak.lock()) detail::runLoopTimerMoved(*loop);
  }
}

double Timer::timeInterval() const { return core_->repeats ? core_->intervalSeconds : 0; }

const Value& Timer::userInfo() const { return userInfo_; }

std::string Timer::className() const { return "NSTimer"; }

}  // namespace kivi
