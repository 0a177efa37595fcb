// DispatchQueue: runs work items on the worker pool, either one at a time in
// the order they were given (serial) or side by side (concurrent).
//
// A serial queue runs one item at a time, in submission order, on whichever
// worker the pool gives it; sync() onto it waits for the earlier items, then
// runs its work on the calling thread while the queue runs nothing else. A
// concurrent queue hands each async() item to the pool at once, and sync()
// onto it runs the work on the calling thread straight away. global() is the
// process's concurrent queue.
//
//   auto queue = kivi::DispatchQueue::create("com.example.cache");
//   queue->async([] { write(); });
//   queue->sync([&] { value = read(); });   // after write()
//   queue->asyncAfter(kivi::DispatchClock::system()->now() + 2s, [] { flush(); });
//
// asyncAfter() keeps the queue alive until its work has been handed over; a
// ManualClock given to it decides the time instead of the system clock.
//
// Thread contract: every member may be called from any thread. sync() blocks
// the caller until its work has run (a waiting worker counts as blocked, so the
// pool stays at its width). sync() onto a serial queue from work that queue is
// running would wait for itself for ever; it runs the work at once instead.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "kivi/base/object.h"
#include "kivi/dispatch/dispatch_clock.h"

namespace kivi {

class DispatchQueue : public Object {
 public:
  enum class Attributes : std::uint8_t { serial, concurrent };

  [[nodiscard]] static std::shared_ptr<DispatchQueue> create(
      std::string label, Attributes attributes = Attributes::serial);
  // The process-wide concurrent queue.
  static const std::shared_ptr<DispatchQueue>& global();
  ~DispatchQueue() override;

  const std::string& label() const noexcept;
  bool isSerial() const noexcept;

  void async(std::function<void()> work);
  void sync(const std::function<void()>& work);
  // Submits `work` with async() once `deadline` has passed on the clock.
  void asyncAfter(DispatchTime deadline, std::function<void()> work);
  void asyncAfter(DispatchClock& clock, DispatchTime deadline, std::function<void()> work);

  // Whether the calling thread is running work of this queue (also from
  // inside a sync() onto another queue made by that work).
  bool isCurrent() const noexcept;

  std::string className() const override;
  std::string description() const override;

 private:
  struct Core;
  DispatchQueue(std::string label, Attributes attributes);
  std::shared_ptr<Core> core_;
};

using DispatchQueuePtr = std::shared_ptr<DispatchQueue>;

}  // namespace kivi
