// DispatchGroup: counts work under way, so that a thread can wait for all of
// it or have a block run once it has all finished.
//
//   auto group = std::make_shared<kivi::DispatchGroup>();
//   for (const auto& file : files) {
//     queue->async(group, kivi::DispatchQoS::utility, {}, [file] { load(file); });
//   }
//   group->enter();                 // work the queues do not know about
//   fetch([group] { group->leave(); });
//   group->notify(kivi::DispatchQueue::main(), [] { showAll(); });
//
// enter() counts one piece of work, leave() ends one; a queue's async() with
// a group enters before it takes the work and leaves after the work has run.
// The group is empty when every enter() has its leave(). A leave() without a
// matching enter() is ignored: the count never goes below zero.
//
// wait() returns once the group is empty, at once if it already is; with a
// deadline it answers timedOut when the group has not been empty since the
// call began. notify() blocks are handed to their queues (async), each once,
// the next time the group becomes empty, or at once when it is empty. A group
// released while not empty drops its pending notify() blocks.
//
// Thread contract: every member from any thread. wait() blocks the caller (a
// waiting worker of the pool counts as blocked); a notify() with a null
// queue or block does nothing.
#pragma once

#include <functional>
#include <memory>

#include "kivi/base/object.h"
#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_qos.h"
#include "kivi/export.h"

namespace kivi {

class KivDispatchQueueProtocol;

class KIVI_EXPORT DispatchGroup : public Object {
 public:
  DispatchGroup();
  ~DispatchGroup() override;

  // Count one more piece of work under way, or one less (never below zero).
  void enter();
  void leave();

  // Block until the group is empty, or until the deadline `timeout` (then timedOut).
  void wait();
  DispatchTimeoutResult wait(DispatchTime timeout);

  // Hands `block` to `queue` (async) once the group is empty, as described above.
  void notify(const std::shared_ptr<KivDispatchQueueProtocol>& queue, std::function<void()> block);

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// How groups are held; a null group given to a queue means no group.
using DispatchGroupPtr = std::shared_ptr<DispatchGroup>;

}  // namespace kivi
