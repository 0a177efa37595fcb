// DispatchQueue: runs work items on the worker pool, either one at a time in
// the order they were given (serial) or side by side (concurrent).
//
// A serial queue runs one item at a time, in submission order, on whichever
// worker the pool gives it; sync() onto it waits for the earlier items, then
// runs its work on the calling thread while the queue runs nothing else. A
// concurrent queue hands each async() item to the pool at once, and sync()
// onto it runs the work on the calling thread straight away (both wait while
// a barrier is pending, see below).
//
//   auto queue = kivi::DispatchQueue::create("com.example.cache");
//   queue->async([] { write(); });
//   queue->sync([&] { value = read(); });   // after write()
//   queue->asyncAfter(kivi::DispatchClock::system()->now() + 2s, [] { flush(); });
//
//   auto group = std::make_shared<kivi::DispatchGroup>();
//   auto images = kivi::DispatchQueue::global(kivi::DispatchQoS::QoSClass::utility);
//   for (auto& file : files) images->async(group, [&file] { decode(file); });
//   group->wait();
//
// The queues of the process:
//   - main(): the serial queue of the main thread. Its work runs on the main
//     thread, in order, while the main run loop turns in a common mode (or a
//     host loop asks the run loop to run what is pending); until then it
//     waits. sync() onto it from the main thread runs the work at once, even
//     with earlier work pending, since waiting there could never end; from
//     any other thread it returns once the main thread has run the work.
//   - global(qos): one concurrent queue per quality-of-service class, all on
//     the same pool; qos() answers the class. global() is the default class's
//     queue; an unspecified or unknown class also answers that one.
//   - create(): a private queue of the caller, serial unless asked otherwise.
//
// A barrier (DispatchWorkItemFlags::barrier, on the work or on a work item)
// given to a private concurrent queue waits until the work given before it
// has finished, then runs alone; work given after it waits until it has run.
// sync() with a barrier work item waits likewise and runs it on the caller.
// On serial queues and on the global queues a barrier is ordinary work.
// The quality of service given with work is accepted and not acted on.
//
// With a group, async() enters the group when it takes the work and leaves
// it after the work has run. Work items run through perform(): a cancelled
// one is dropped when its turn comes. Null work or a null work item does
// nothing (a null group is no group).
//
// asyncAfter() keeps the queue alive until its work has been handed over; a
// ManualClock given to it decides the time instead of the system clock.
//
// Thread contract: every member may be called from any thread. sync() blocks
// the caller until its work has run (a waiting worker counts as blocked, so
// the pool stays at its width). sync() onto a queue from work that queue is
// running would wait for itself for ever; it runs the work at once instead.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "kivi/base/object.h"
#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_group.h"
#include "kivi/dispatch/dispatch_qos.h"
#include "kivi/dispatch/dispatch_work_item.h"
#include "kivi/dispatch/kiv_dispatch_queue_protocol.h"
#include "kivi/export.h"

namespace kivi {

namespace detail {
struct DispatchQueueCore;
}  // namespace detail

class KIVI_EXPORT DispatchQueue : public Object, public KivDispatchQueueProtocol {
 public:
  // Whether a private queue runs its work one item at a time or side by side.
  enum class Attributes : std::uint8_t { serial, concurrent };

  // A private queue named `label`, serial unless asked otherwise; `qos` is recorded for qos()
  // (unspecified when not given).
  [[nodiscard]] static std::shared_ptr<DispatchQueue> create(
      std::string label, Attributes attributes = Attributes::serial);
  [[nodiscard]] static std::shared_ptr<DispatchQueue> create(std::string label, DispatchQoS qos,
                                                             Attributes attributes);
  // The main thread's serial queue.
  static const std::shared_ptr<DispatchQueue>& main();
  // The process-wide concurrent queue of the default class.
  static const std::shared_ptr<DispatchQueue>& global();
  // The process-wide concurrent queue of `qos`.
  static const std::shared_ptr<DispatchQueue>& global(DispatchQoS::QoSClass qos);

  ~DispatchQueue() override;

  // The label given at creation ("kivi.main", "kivi.global.utility" and the like for the
  // process's queues), whether the queue is serial, and its quality of service.
  const std::string& label() const noexcept;
  bool isSerial() const noexcept;
  DispatchQoS qos() const noexcept;

  using KivDispatchQueueProtocol::async;
  using KivDispatchQueueProtocol::asyncAfter;
  using KivDispatchQueueProtocol::sync;

  // Submit work, or a work item run through its perform(), as described above; in `group`
  // when one is given. The quality of service is not acted on.
  void async(std::function<void()> work);
  void async(const DispatchGroupPtr& group, DispatchQoS qos, DispatchWorkItemFlags flags,
             std::function<void()> work) override;
  void async(const DispatchWorkItemPtr& workItem) override;
  void async(const DispatchGroupPtr& group, const DispatchWorkItemPtr& workItem) override;

  // Run the work or the work item on the calling thread in the queue's order, as described
  // above; return once it has run.
  void sync(const std::function<void()>& work) override;
  void sync(const DispatchWorkItemPtr& workItem) override;

  // Submits the work with async() once `deadline` has passed on the clock (the system clock
  // unless `clock` is given).
  void asyncAfter(DispatchTime deadline, std::function<void()> work);
  void asyncAfter(DispatchClock& clock, DispatchTime deadline, std::function<void()> work);
  void asyncAfter(DispatchTime deadline, DispatchQoS qos, DispatchWorkItemFlags flags,
                  std::function<void()> work) override;
  void asyncAfter(DispatchTime deadline, const DispatchWorkItemPtr& workItem) override;

  // Whether the calling thread is running work of this queue (also from
  // inside a sync() onto another queue made by that work). For main(),
  // whether the calling thread is the main thread.
  bool isCurrent() const noexcept;

  std::string className() const override;
  std::string description() const override;

 private:
  explicit DispatchQueue(std::shared_ptr<detail::DispatchQueueCore> core);
  std::shared_ptr<detail::DispatchQueueCore> core_;
};

// How dispatch queues are held.
using DispatchQueuePtr = std::shared_ptr<DispatchQueue>;

}  // namespace kivi
