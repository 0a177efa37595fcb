// Internal: the library's one event thread. It waits (epoll) on the system
// clock's timer and on file descriptors that other layers watch, and runs
// their handlers itself. Handlers must be short and must not block: the URL
// session drives its sockets here, the system clock hands due work to queues.
//
// The thread starts with the first watch or the first armed deadline. If the
// system refuses it a thread, watch() fails and deadlines wait until a later
// call starts it.
//
// Thread contract: every member may be called from any thread, also from a
// handler. After unwatch() returns a handler may still run once, if its event
// had already been taken: handlers must tolerate a late call.
#pragma once

#include <cstdint>
#include <functional>

#include "kivi/dispatch/dispatch_clock.h"

namespace kivi::detail {

class EventLoop {
 public:
  using Handler = std::function<void(std::uint32_t events)>;

  static EventLoop& shared();

  // Watches `fd` for `events` (EPOLLIN, EPOLLOUT); the handler is told the
  // events seen. Returns an identifier, or 0 when the descriptor cannot be
  // watched.
  std::uint64_t watch(int fd, std::uint32_t events, Handler handler);
  void modify(std::uint64_t identifier, std::uint32_t events);
  void unwatch(std::uint64_t identifier);

  // For the system clock: fire at `deadline` (DispatchTime::max(): never).
  void armClockAt(DispatchTime deadline);

 private:
  EventLoop();
  struct State;
  State* state_;  // lives as long as the process
};

// Runs the system clock's due timers; the event thread calls it when the
// deadline it was given passes.
void fireSystemClock();

}  // namespace kivi::detail
