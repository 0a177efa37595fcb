#include "kivi/doubles/mock_dispatch_queue.h"

namespace kivi {

std::function<DispatchQueuePtr(DispatchQoS::QoSClass)> MockDispatchQueue::globalQueuewithQOSBlock;

DispatchQueuePtr MockDispatchQueue::global(DispatchQoS::QoSClass qos) {
  auto queue = DispatchQueue::create("MockQueue", DispatchQoS::unspecified,
                                     DispatchQueue::Attributes::serial);
  if (globalQueuewithQOSBlock) return globalQueuewithQOSBlock(qos);
  return queue;
}

void MockDispatchQueue::async(const DispatchGroupPtr& group, DispatchQoS qos,
                              DispatchWorkItemFlags flags, std::function<void()> work) {
  if (asyncBlock) asyncBlock(group, qos, flags, std::move(work));
}

void MockDispatchQueue::sync(const DispatchWorkItemPtr& workItem) {
  if (syncWithWorkItemBlock) syncWithWorkItemBlock(workItem);
}

void MockDispatchQueue::async(const DispatchWorkItemPtr& workItem) {
  if (asyncWithWorkItemBlock) asyncWithWorkItemBlock(workItem);
}

void MockDispatchQueue::async(const DispatchGroupPtr& group, const DispatchWorkItemPtr& workItem) {
  if (asyncWithGroupBlock) asyncWithGroupBlock(group, workItem);
}

void MockDispatchQueue::asyncAfter(DispatchTime deadline, DispatchQoS qos,
                                   DispatchWorkItemFlags flags, std::function<void()> work) {
  if (asyncAfterBlock) asyncAfterBlock(deadline, qos, flags, std::move(work));
}

void MockDispatchQueue::asyncAfter(DispatchTime deadline, const DispatchWorkItemPtr& workItem) {
  if (asyncAfterWithWorkItemBlock) asyncAfterWithWorkItemBlock(deadline, workItem);
}

void MockDispatchQueue::sync(const std::function<void()>& work) {
  if (syncBlock) syncBlock(work);
}

}  // namespace kivi
