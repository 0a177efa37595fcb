// KivDispatchQueueProtocol: the dispatch-queue interface through which code
// holds a queue, so that a test can put a scriptable double
// (MockDispatchQueue) where the real queue would be.
//
//   class Cache {
//    public:
//     explicit Cache(std::shared_ptr<kivi::KivDispatchQueueProtocol> queue) : queue_(queue) {}
//     void store(Entry entry) { queue_->async([this, entry] { write(entry); }); }
//    private:
//     std::shared_ptr<kivi::KivDispatchQueueProtocol> queue_;
//   };
//
// The pure virtual members are the requirements; kivi::DispatchQueue
// conforms with its own operations of the same names. A null group means
// "no group". The non-virtual overloads stand in for the defaulted arguments
// of the four-argument async() and asyncAfter() (no group, unspecified
// quality of service, no flags): each calls the requirement with the
// defaults filled in and does nothing else.
//
// Looking up a global queue is a static operation, which C++ cannot make
// virtual: each conformer has its own static global(qos) (DispatchQueue's
// answers the process's global queue, MockDispatchQueue's a queue of the
// test's choosing), and the protocol's own static global(qos) forwards to
// DispatchQueue::global(qos). Code generic over the queue type calls
// T::global(qos).
//
// Thread contract: that of the conformer. DispatchQueue is safe from any
// thread; the double is not synchronised.
#pragma once

#include <functional>
#include <memory>

#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_group.h"
#include "kivi/dispatch/dispatch_qos.h"
#include "kivi/dispatch/dispatch_work_item.h"
#include "kivi/export.h"

namespace kivi {

class DispatchQueue;

class KIVI_EXPORT KivDispatchQueueProtocol {
 public:
  virtual ~KivDispatchQueueProtocol() = default;

  // The requirements.

  // Submits `work` to run on the queue, in `group` (entered now, left after the work has run)
  // unless it is null.
  virtual void async(const DispatchGroupPtr& group, DispatchQoS qos, DispatchWorkItemFlags flags,
                     std::function<void()> work) = 0;
  // Runs the work item on the calling thread in the queue's order; returns once it has run.
  virtual void sync(const DispatchWorkItemPtr& workItem) = 0;
  // The global queue of `qos`: DispatchQueue::global(qos).
  static std::shared_ptr<DispatchQueue> global(DispatchQoS::QoSClass qos);
  // Submit a work item, run through its perform(), in `group` unless it is null.
  virtual void async(const DispatchWorkItemPtr& workItem) = 0;
  virtual void async(const DispatchGroupPtr& group, const DispatchWorkItemPtr& workItem) = 0;
  // Submit the work or the work item with async() once `deadline` has passed.
  virtual void asyncAfter(DispatchTime deadline, DispatchQoS qos, DispatchWorkItemFlags flags,
                          std::function<void()> work) = 0;
  virtual void asyncAfter(DispatchTime deadline, const DispatchWorkItemPtr& workItem) = 0;
  // Runs `work` on the calling thread in the queue's order; returns once it has run. `work` is
  // not kept beyond the call.
  virtual void sync(const std::function<void()>& work) = 0;

  // The four-argument async() with what is left out defaulted: no group, unspecified quality
  // of service, no flags.
  void async(std::function<void()> work) { async(nullptr, {}, {}, std::move(work)); }
  // async() with `group`; unspecified quality of service, no flags.
  void async(const DispatchGroupPtr& group, std::function<void()> work) {
    async(group, {}, {}, std::move(work));
  }
  // async() with `qos`; no group, no flags.
  void async(DispatchQoS qos, std::function<void()> work) {
    async(nullptr, qos, {}, std::move(work));
  }
  // async() with `flags`; no group, unspecified quality of service.
  void async(DispatchWorkItemFlags flags, std::function<void()> work) {
    async(nullptr, {}, flags, std::move(work));
  }
  // async() with `qos` and `flags`; no group.
  void async(DispatchQoS qos, DispatchWorkItemFlags flags, std::function<void()> work) {
    async(nullptr, qos, flags, std::move(work));
  }
  // async() with `group` and `qos`; no flags.
  void async(const DispatchGroupPtr& group, DispatchQoS qos, std::function<void()> work) {
    async(group, qos, {}, std::move(work));
  }
  // async() with `group` and `flags`; unspecified quality of service.
  void async(const DispatchGroupPtr& group, DispatchWorkItemFlags flags,
             std::function<void()> work) {
    async(group, {}, flags, std::move(work));
  }

  // The four-argument asyncAfter() with unspecified quality of service and no flags.
  void asyncAfter(DispatchTime deadline, std::function<void()> work) {
    asyncAfter(deadline, {}, {}, std::move(work));
  }
  // asyncAfter() with `qos`; no flags.
  void asyncAfter(DispatchTime deadline, DispatchQoS qos, std::function<void()> work) {
    asyncAfter(deadline, qos, {}, std::move(work));
  }
  // asyncAfter() with `flags`; unspecified quality of service.
  void asyncAfter(DispatchTime deadline, DispatchWorkItemFlags flags, std::function<void()> work) {
    asyncAfter(deadline, {}, flags, std::move(work));
  }
};

}  // namespace kivi
