// DispatchWorkItem: a block of work as an object that can be handed to a
// queue, performed directly, cancelled before it starts, waited for, and
// followed by other work once it has run.
//
//   auto item = std::make_shared<kivi::DispatchWorkItem>([] { rebuildIndex(); });
//   item->notify(kivi::DispatchQueue::main(), [] { showIndex(); });
//   queue->async(item);
//   ...
//   item->cancel();  // if it has not started yet, it never will
//
// The item is done once it has been performed: by perform() or by the queue
// it was given to, a cancelled item counting as performed (without running
// its block) when the queue gets to it. Done is when wait() returns and when
// the notify() blocks are handed to their queues, once; a notify() made after
// that hands its block over at once. An item that is never performed is never
// done: wait() on it waits for good, so give such a wait a time-out.
//
// An item may be performed more than once; each perform() runs the block
// unless the item is cancelled. The `barrier` flag makes the item a barrier
// on a private concurrent queue (see DispatchQueue).
//
// Thread contract: every member from any thread. The block runs on the thread
// that performs it. wait() blocks the caller (a waiting worker of the pool
// counts as blocked); a notify() with a null queue or block does nothing.
#pragma once

#include <functional>
#include <memory>

#include "kivi/base/object.h"
#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_qos.h"
#include "kivi/export.h"

namespace kivi {

class KivDispatchQueueProtocol;

class KIVI_EXPORT DispatchWorkItem : public Object {
 public:
  // An item that runs `block`, with `flags` (none by default) and `qos` (unspecified by
  // default) kept for the queue.
  explicit DispatchWorkItem(std::function<void()> block);
  DispatchWorkItem(DispatchWorkItemFlags flags, std::function<void()> block);
  DispatchWorkItem(DispatchQoS qos, DispatchWorkItemFlags flags, std::function<void()> block);

  ~DispatchWorkItem() override;

  // Runs the block on the calling thread unless the item is cancelled, then
  // marks the item done.
  void perform();

  // Returns once the item is done.
  void wait();
  // The same with a deadline: timedOut when the item was not done by then.
  DispatchTimeoutResult wait(DispatchTime timeout);

  // Hands `block` to `queue` (async) once the item is done.
  void notify(const std::shared_ptr<KivDispatchQueueProtocol>& queue, std::function<void()> block);

  // A cancelled item that has not started never runs its block; one that is
  // running goes on to its end.
  void cancel() noexcept;
  bool isCancelled() const noexcept;

  // The quality of service and the flags given at creation.
  DispatchQoS qos() const noexcept;
  DispatchWorkItemFlags flags() const noexcept;

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// How work items are held.
using DispatchWorkItemPtr = std::shared_ptr<DispatchWorkItem>;

}  // namespace kivi
