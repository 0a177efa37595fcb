#include "kivi/dispatch/detail/event_loop.h"

#include <sys/epoll.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>

#include "kivi/dispatch/detail/thread_start.h"

namespace kivi::detail {

namespace {
// The epoll identifier of the clock's timer; watches count from 1.
constexpr std::uint64_t kClockIdentifier = 0;
}  // namespace

struct EventLoop::State {
  struct Watch {
    int fd;
    Handler handler;
  };

  std::mutex mutex;
  const int epollFd = ::epoll_create1(EPOLL_CLOEXEC);
  const int timerFd = ::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
  bool started = false;                                               // guarded by mutex
  std::uint64_t nextIdentifier = 1;                                   // guarded by mutex
  std::unordered_map<std::uint64_t, std::shared_ptr<Watch>> watches;  // guarded by mutex
  std::unordered_map<int, std::uint64_t> byDescriptor;                // guarded by mutex

  State() {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u64 = kClockIdentifier;
    if (epollFd >= 0 && timerFd >= 0) ::epoll_ctl(epollFd, EPOLL_CTL_ADD, timerFd, &event);
  }

  bool usable() const { return epollFd >= 0 && timerFd >= 0; }

  bool ensureStartedLocked() {
    if (started) return true;
    if (!usable()) return false;
    started = startDetachedThread([this] { run(); });
    return started;
  }

  void forgetLocked(std::uint64_t identifier) {
    const auto it = watches.find(identifier);
    if (it == watches.end()) return;
    const auto fd = byDescriptor.find(it->second->fd);
    if (fd != byDescriptor.end() && fd->second == identifier) byDescriptor.erase(fd);
    watches.erase(it);
  }

  void run() {
    epoll_event events[64];
    for (;;) {
      const int count = ::epoll_wait(epollFd, events, 64, -1);
      for (int i = 0; i < count; ++i) {
        const std::uint64_t identifier = events[i].data.u64;
        if (identifier == kClockIdentifier) {
          std::uint64_t expirations = 0;
          (void)!::read(timerFd, &expirations, sizeof expirations);
          fireSystemClock();
          continue;
        }
        std::shared_ptr<Watch> watch;
        {
          std::lock_guard lock(mutex);
          const auto it = watches.find(identifier);
          if (it != watches.end()) watch = it->second;
        }
        if (watch) watch->handler(events[i].events);
      }
    }
  }
};

EventLoop::EventLoop() : state_(new State) {}

EventLoop& EventLoop::shared() {
  // Never destroyed: its thread runs until the process exits.
  static EventLoop* loop = new EventLoop;
  return *loop;
}

std::uint64_t EventLoop::watch(int fd, std::uint32_t events, Handler handler) {
  State& s = *state_;
  std::lock_guard lock(s.mutex);
  if (fd < 0 || !s.ensureStartedLocked()) return 0;
  const std::uint64_t identifier = s.nextIdentifier++;
  epoll_event event{};
  event.events = events;
  event.data.u64 = identifier;
  if (::epoll_ctl(s.epollFd, EPOLL_CTL_ADD, fd, &event) != 0) {
    // The number still belongs to a watch whose descriptor was closed before
    // it was unwatched: this watch replaces it.
    if (errno != EEXIST || ::epoll_ctl(s.epollFd, EPOLL_CTL_MOD, fd, &event) != 0) return 0;
    if (const auto old = s.byDescriptor.find(fd); old != s.byDescriptor.end()) {
      s.forgetLocked(old->second);
    }
  }
  s.watches.emplace(identifier,
                    std::make_shared<State::Watch>(State::Watch{fd, std::move(handler)}));
  s.byDescriptor[fd] = identifier;
  return identifier;
}

void EventLoop::modify(std::uint64_t identifier, std::uint32_t events) {
  State& s = *state_;
  std::lock_guard lock(s.mutex);
  const auto it = s.watches.find(identifier);
  if (it == s.watches.end()) return;
  epoll_event event{};
  event.events = events;
  event.data.u64 = identifier;
  ::epoll_ctl(s.epollFd, EPOLL_CTL_MOD, it->second->fd, &event);
}

void EventLoop::unwatch(std::uint64_t identifier) {
  State& s = *state_;
  std::lock_guard lock(s.mutex);
  const auto it = s.watches.find(identifier);
  if (it == s.watches.end()) return;
  ::epoll_ctl(s.epollFd, EPOLL_CTL_DEL, it->second->fd, nullptr);
  s.forgetLocked(identifier);
}

void EventLoop::armClockAt(DispatchTime deadline) {
  State& s = *state_;
  itimerspec spec{};  // all zero: disarmed
  if (deadline != DispatchTime::max()) {
    const auto since =
        std::chrono::duration_cast<std::chrono::nanoseconds>(deadline.time_since_epoch());
    const auto count = std::max<std::int64_t>(since.count(), 1);  // 0 would disarm
    spec.it_value.tv_sec = static_cast<time_t>(count / 1'000'000'000);
    spec.it_value.tv_nsec = static_cast<long>(count % 1'000'000'000);
  }
  ::timerfd_settime(s.timerFd, TFD_TIMER_ABSTIME, &spec, nullptr);
  // Without a thread the timer stays armed for the one a later call starts.
  std::lock_guard lock(s.mutex);
  s.ensureStartedLocked();
}

}  // namespace kivi::detail
