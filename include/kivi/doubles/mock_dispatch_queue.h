// MockDispatchQueue: a scriptable KivDispatchQueueProtocol.
//
// Every operation calls the matching callback property, if set, with its
// arguments unchanged, and does nothing otherwise: without a callback no
// work runs, not even by sync(). The double keeps nothing it is given.
//
//   auto queue = std::make_shared<kivi::MockDispatchQueue>();
//   queue->syncBlock = [](const std::function<void()>& work) { work(); };
//   queue->asyncBlock = [&](const kivi::DispatchGroupPtr&, kivi::DispatchQoS,
//                           kivi::DispatchWorkItemFlags, std::function<void()> work) {
//     pending.push_back(std::move(work));  // the test runs it when it likes
//   };
//   cache.setQueue(queue);
//
// global(qos) is static, like the operation it stands in for: it makes a new
// real serial queue labelled "MockQueue"; when the class-level
// globalQueuewithQOSBlock is set, that queue is dropped and the callback's
// answer for `qos` is returned instead.
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out. globalQueuewithQOSBlock
// is shared by the whole process: a test that sets it resets it.
#pragma once

#include <functional>
#include <memory>

#include "kivi/base/object.h"
#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/kiv_dispatch_queue_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockDispatchQueue : public Object, public KivDispatchQueueProtocol {
 public:
  MockDispatchQueue() = default;

  // Called by async(group, qos, flags, work), and so by the protocol's shorter async() forms;
  // without it the work never runs.
  std::function<void(const DispatchGroupPtr&, DispatchQoS, DispatchWorkItemFlags,
                     std::function<void()>)>
      asyncBlock;
  // Called by async(group, workItem); without it the item never runs.
  std::function<void(const DispatchGroupPtr&, const DispatchWorkItemPtr&)> asyncWithGroupBlock;
  // Called by async(workItem); without it the item never runs.
  std::function<void(const DispatchWorkItemPtr&)> asyncWithWorkItemBlock;
  // Called by asyncAfter(deadline, qos, flags, work), and so by the protocol's shorter asyncAfter()
  // forms; without it the work never runs.
  std::function<void(DispatchTime, DispatchQoS, DispatchWorkItemFlags, std::function<void()>)>
      asyncAfterBlock;
  // Called by asyncAfter(deadline, workItem); without it the item never runs.
  std::function<void(DispatchTime, const DispatchWorkItemPtr&)> asyncAfterWithWorkItemBlock;
  // Called by sync(workItem); without it the item does not run.
  std::function<void(const DispatchWorkItemPtr&)> syncWithWorkItemBlock;
  // Called by sync(work); without it the work does not run.
  std::function<void(const std::function<void()>&)> syncBlock;
  // Class-level: answers global(qos) for every MockDispatchQueue user.
  static std::function<DispatchQueuePtr(DispatchQoS::QoSClass)> globalQueuewithQOSBlock;

  // The answer of globalQueuewithQOSBlock for `qos`; without it, a new serial queue labelled
  // "MockQueue".
  static DispatchQueuePtr global(DispatchQoS::QoSClass qos);

  // The protocol's overloads not overridden here stay reachable: the shorter
  // async() and asyncAfter() forms, which end in the callbacks above.
  using KivDispatchQueueProtocol::async;
  using KivDispatchQueueProtocol::asyncAfter;
  using KivDispatchQueueProtocol::sync;

  void async(const DispatchGroupPtr& group, DispatchQoS qos, DispatchWorkItemFlags flags,
             std::function<void()> work) override;
  void sync(const DispatchWorkItemPtr& workItem) override;
  void async(const DispatchWorkItemPtr& workItem) override;
  void async(const DispatchGroupPtr& group, const DispatchWorkItemPtr& workItem) override;
  void asyncAfter(DispatchTime deadline, DispatchQoS qos, DispatchWorkItemFlags flags,
                  std::function<void()> work) override;
  void asyncAfter(DispatchTime deadline, const DispatchWorkItemPtr& workItem) override;
  void sync(const std::function<void()>& work) override;
};

}  // namespace kivi
