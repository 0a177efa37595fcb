// Internal: which dispatch queues the calling thread is running work of, for
// DispatchQueue::isCurrent(). A queue is known by its address.
#pragma once

namespace kivi::detail {

class CurrentQueueScope {
 public:
  explicit CurrentQueueScope(const void* queue);
  ~CurrentQueueScope();
  CurrentQueueScope(const CurrentQueueScope&) = delete;
  CurrentQueueScope& operator=(const CurrentQueueScope&) = delete;

  static bool contains(const void* queue) noexcept;
};

}  // namespace kivi::detail
