#include "kivi/dispatch/dispatch_queue.h"

#include <atomic>
#include <deque>
#include <mutex>

#include "kivi/dispatch/detail/current_queue.h"
#include "kivi/dispatch/worker_pool.h"

namespace kivi {

namespace {

// Items a drain job runs before it lets other work of the pool go first.
constexpr int kDrainBatch = 256;

using RunningScope = detail::CurrentQueueScope;

// Passes a serial queue to a thread waiting in sync(). Shared, so that the
// thread that sets it never touches memory the waiter has already left.
struct Handoff {
  std::atomic<bool> yours{false};
};

}  // namespace

struct DispatchQueue::Core : std::enable_shared_from_this<Core> {
  struct Item {
    std::function<void()> work;
    std::shared_ptr<Handoff> handoff;  // a sync() caller waiting for its turn
  };

  Core(std::string l, bool s) : label(std::move(l)), serial(s) {}

  const std::string label;
  const bool serial;
  std::mutex mutex;
  std::deque<Item> items;  // guarded by mutex
  // A drain job or a sync() caller is running the queue. Guarded by mutex.
  bool owned = false;

  void scheduleDrain() {
    WorkerPool::shared().submit([core = shared_from_this()] { core->drain(); });
  }

  void drain() {
    RunningScope running(this);
    for (int count = 0;; ++count) {
      Item item;
      {
        std::lock_guard lock(mutex);
        if (items.empty()) {
          owned = false;
          return;
        }
        if (count == kDrainBatch) break;  // keeps the queue; continues in a new job
        item = std::move(items.front());
        items.pop_front();
      }
      if (item.handoff) {  // the queue passes to the waiting thread
        item.handoff->yours.store(true, std::memory_order_release);
        item.handoff->yours.notify_one();
        return;
      }
      item.work();
    }
    scheduleDrain();
  }

  // After a sync() caller ran its work: the queue goes on, or rests.
  void release() {
    bool more = false;
    {
      std::lock_guard lock(mutex);
      more = !items.empty();
      owned = more;
    }
    if (more) scheduleDrain();
  }
};

DispatchQueue::DispatchQueue(std::string label, Attributes attributes)
    : core_(std::make_shared<Core>(std::move(label), attributes == Attributes::serial)) {}

DispatchQueue::~DispatchQueue() = default;

std::shared_ptr<DispatchQueue> DispatchQueue::create(std::string label, Attributes attributes) {
  return std::shared_ptr<DispatchQueue>(new DispatchQueue(std::move(label), attributes));
}

const std::shared_ptr<DispatchQueue>& DispatchQueue::global() {
  static auto* queue =
      new std::shared_ptr<DispatchQueue>(create("kivi.global", Attributes::concurrent));
  return *queue;
}

const std::string& DispatchQueue::label() const noexcept { return core_->label; }

bool DispatchQueue::isSerial() const noexcept { return core_->serial; }

bool DispatchQueue::isCurrent() const noexcept {
  return detail::CurrentQueueScope::contains(core_.get());
}

void DispatchQueue::async(std::function<void()> work) {
  Core& core = *core_;
  if (!core.serial) {
    // The global queue lives as long as the process; any other is kept alive
    // by its work.
    const bool immortal = this == global().get();
    WorkerPool::shared().submit(std::move(work), core_.get(),
                                immortal ? nullptr : std::shared_ptr<const void>(core_));
    return;
  }
  bool schedule = false;
  {
    std::lock_guard lock(core.mutex);
    core.items.push_back({std::move(work), nullptr});
    if (!core.owned) schedule = core.owned = true;
  }
  if (schedule) core.scheduleDrain();
}

void DispatchQueue::sync(const std::function<void()>& work) {
  Core& core = *core_;
  if (!core.serial || isCurrent()) {
    RunningScope running(&core);
    work();
    return;
  }
  std::shared_ptr<Handoff> handoff;
  {
    std::lock_guard lock(core.mutex);
    if (core.owned) {
      handoff = std::make_shared<Handoff>();
      core.items.push_back({nullptr, handoff});
    } else {
      core.owned = true;
    }
  }
  if (handoff) {
    WorkerPool::BlockingScope blocking;
    handoff->yours.wait(false, std::memory_order_acquire);
  }
  {
    RunningScope running(&core);
    work();
  }
  core.release();
}

void DispatchQueue::asyncAfter(DispatchTime deadline, std::function<void()> work) {
  asyncAfter(*DispatchClock::system(), deadline, std::move(work));
}

void DispatchQueue::asyncAfter(DispatchClock& clock, DispatchTime deadline,
                               std::function<void()> work) {
  auto self = std::static_pointer_cast<DispatchQueue>(shared_from_this());
  clock.callAt(deadline, [self = std::move(self), work = std::move(work)] { self->async(work); });
}

std::string DispatchQueue::className() const {
  return core_->serial ? "OS_dispatch_queue_serial" : "OS_dispatch_queue_concurrent";
}

std::string DispatchQueue::description() const {
  std::string text = Object::description();  // "<Class: 0x...>"
  text.insert(text.size() - 1, "; label = " + core_->label);
  return text;
}

}  // namespace kivi
