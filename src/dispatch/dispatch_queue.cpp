#include "kivi/dispatch/dispatch_queue.h"

#include <array>
#include <atomic>
#include <deque>
#include <mutex>
#include <vector>

#include "kivi/dispatch/detail/current_queue.h"
#include "kivi/dispatch/detail/main_queue.h"
#include "kivi/dispatch/thread.h"
#include "kivi/dispatch/worker_pool.h"
#include "latch.h"

namespace kivi {

namespace {

// Items a drain job runs before it lets other work of the pool go first.
constexpr int kDrainBatch = 256;

using RunningScope = detail::CurrentQueueScope;

// Passes a queue to a thread waiting in sync(). Shared, so that the thread
// that gives it never touches memory the waiter has already left.
struct Handoff {
  detail::Latch yours;
  // Concurrent queues: the batch the waiter's work belongs to, held while
  // it runs.
  std::shared_ptr<const void> token;

  void give() { yours.set(); }
  void await() {
    WorkerPool::BlockingScope blocking;
    yours.wait();
  }
};

}  // namespace

namespace detail {

// The state of a queue, kept alive by the queue object and by its work.
//
// Serial queues (and the main queue) keep their work in `items`; `owned`
// says that a drain job or a sync() caller runs the queue (for the main
// queue: that the run loop has been told there is work).
//
// Private concurrent queues hand work straight to the pool while no barrier
// is about. Every job then holds a copy of `epoch`, a token whose last
// release calls epochEnded(). A barrier closes the gate: it takes the
// queue's own reference to the token, so the token ends once the work
// given before the barrier has finished, and work given from then on waits
// in `items` behind it. The gated run takes the barrier, runs it alone,
// then releases the work up to the next barrier under a fresh token, and
// so on; once nothing waits any more it opens the gate with a new epoch.
struct DispatchQueueCore : std::enable_shared_from_this<DispatchQueueCore> {
  enum class Kind : std::uint8_t { serial, concurrent, global, main };

  struct Item {
    std::function<void()> work;
    std::shared_ptr<Handoff> handoff;  // a sync() caller waiting for its turn
    bool barrier = false;
  };

  DispatchQueueCore(std::string l, DispatchQoS q, Kind k) : label(std::move(l)), qos(q), kind(k) {}

  const std::string label;
  const DispatchQoS qos;
  const Kind kind;

  std::mutex mutex;
  std::deque<Item> items;  // guarded by mutex
  // Serial: a drain job or a sync() caller is running the queue; main: the
  // run loop has been told of the work. Guarded by mutex.
  bool owned = false;
  // Concurrent. Guarded by mutex.
  bool gated = false;                 // work waits behind a barrier
  bool closed = false;                // the queue object has gone
  std::shared_ptr<const void> epoch;  // null while gated

  bool isSerial() const noexcept { return kind == Kind::serial || kind == Kind::main; }

  // --- Serial queues ---

  void enqueueSerial(std::function<void()>&& work) {
    bool schedule = false;
    {
      std::lock_guard lock(mutex);
      items.push_back({std::move(work), nullptr});
      if (!owned) schedule = owned = true;
    }
    if (!schedule) return;
    if (kind == Kind::main) {
      mainQueueHasWork();
    } else {
      scheduleDrain();
    }
  }

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
        item.handoff->give();
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

  void syncSerial(const std::function<void()>& work) {
    std::shared_ptr<Handoff> handoff;
    {
      std::lock_guard lock(mutex);
      if (owned) {
        handoff = std::make_shared<Handoff>();
        items.push_back({nullptr, handoff});
      } else {
        owned = true;
      }
    }
    if (handoff) handoff->await();
    {
      RunningScope running(this);
      work();
    }
    release();
  }

  // --- The main queue ---

  void syncMain(const std::function<void()>& work) {
    if (Thread::isMainThread()) {  // waiting here could never end
      RunningScope running(this);
      work();
      return;
    }
    auto handoff = std::make_shared<Handoff>();
    bool announce = false;
    {
      std::lock_guard lock(mutex);
      items.push_back({std::cref(work), handoff});
      if (!owned) announce = owned = true;
    }
    if (announce) mainQueueHasWork();
    handoff->await();  // given once the main thread has run the work
  }

  // Runs the items present when the call began, taken one at a time from
  // the queue itself: a run of the main loop nested in an item (a semaphore
  // wait) continues with the next item in order instead of skipping ahead.
  bool drainMain() {
    std::size_t count = 0;
    {
      std::lock_guard lock(mutex);
      count = items.size();
      owned = false;  // work added from now on is announced again
    }
    if (count == 0) return false;
    RunningScope running(this);
    for (std::size_t i = 0; i < count; ++i) {
      Item item;
      {
        std::lock_guard lock(mutex);
        if (items.empty()) break;  // a nested drain ran the rest
        item = std::move(items.front());
        items.pop_front();
      }
      item.work();
      if (item.handoff) item.handoff->give();
    }
    return true;
  }

  // --- Private concurrent queues ---

  std::shared_ptr<const void> makeEpoch() {
    auto self = shared_from_this();
    const void* address = self.get();
    return std::shared_ptr<const void>(
        address, [self = std::move(self)](const void*) { self->epochEnded(); });
  }

  // The work of a token has all finished.
  void epochEnded() {
    {
      std::lock_guard lock(mutex);
      if (!gated) return;  // the queue object went while nothing waited
    }
    scheduleGated();
  }

  void scheduleGated() {
    WorkerPool::shared().submit([core = shared_from_this()] { core->runGated(); }, this, nullptr);
  }

  void enqueueConcurrent(std::function<void()>&& work, bool barrier) {
    std::shared_ptr<const void> token;  // released after the lock
    {
      std::lock_guard lock(mutex);
      if (gated || barrier) {
        items.push_back({std::move(work), nullptr, barrier});
        if (!gated) {
          gated = true;
          token = std::move(epoch);  // ends once the work given so far has finished
        }
        return;
      }
      token = epoch;
    }
    WorkerPool::shared().submit(std::move(work), this, std::move(token));
  }

  void syncConcurrent(const std::function<void()>& work, bool barrier) {
    std::shared_ptr<Handoff> handoff;
    std::shared_ptr<const void> token;
    {
      std::lock_guard lock(mutex);
      if (!gated && !barrier) {
        token = epoch;
      } else {
        handoff = std::make_shared<Handoff>();
        items.push_back({nullptr, handoff, barrier});
        if (!gated) {
          gated = true;
          token = std::move(epoch);
        }
      }
    }
    if (handoff) {
      token.reset();  // the barrier waits for the work given before it
      handoff->await();
      token = std::move(handoff->token);
    }
    {
      RunningScope running(this);
      work();
    }
    if (barrier && releaseBatch()) scheduleGated();
  }

  // Runs the barrier at the front of `items`, nothing else of the queue
  // running, and what follows it.
  void runGated() {
    for (;;) {
      Item item;
      {
        std::lock_guard lock(mutex);
        if (!items.empty() && items.front().barrier) {
          item = std::move(items.front());
          items.pop_front();
        }
      }
      if (item.handoff) {  // a sync() caller runs it, then goes on with releaseBatch()
        item.handoff->give();
        return;
      }
      if (item.work) item.work();
      item = {};
      if (!releaseBatch()) return;
    }
  }

  // After a barrier: hands the work up to the next barrier to the pool (in
  // order, under the lock) with a token of its own, or opens the gate when
  // nothing is left. True when a barrier is next and may run at once.
  bool releaseBatch() {
    std::shared_ptr<const void> token;  // released after the lock
    std::lock_guard lock(mutex);
    std::size_t count = 0;
    while (count < items.size() && !items[count].barrier) ++count;
    if (count == items.size()) {
      gated = false;
      token = makeEpoch();
      if (!closed) epoch = token;
    } else if (count == 0) {
      return true;
    } else {
      token = makeEpoch();
    }
    for (std::size_t i = 0; i < count; ++i) {
      Item item = std::move(items.front());
      items.pop_front();
      if (item.handoff) {
        item.handoff->token = token;
        item.handoff->give();
      } else {
        WorkerPool::shared().submit(std::move(item.work), this, token);
      }
    }
    return false;
  }

  // The queue object has gone: the core no longer holds its epoch (which
  // holds the core), so it lives only as long as its work.
  void close() {
    std::shared_ptr<const void> ending;
    std::lock_guard lock(mutex);
    closed = true;
    ending = std::move(epoch);
  }

  // --- Every kind ---

  void submit(std::function<void()>&& work, bool barrier) {
    switch (kind) {
      case Kind::global:
        // The global queues live as long as the process.
        WorkerPool::shared().submit(std::move(work), this, nullptr);
        return;
      case Kind::concurrent:
        enqueueConcurrent(std::move(work), barrier);
        return;
      case Kind::serial:
      case Kind::main:
        enqueueSerial(std::move(work));
        return;
    }
  }

  void sync(const std::function<void()>& work, bool barrier) {
    if (kind == Kind::main) {
      syncMain(work);
      return;
    }
    if (kind == Kind::global || CurrentQueueScope::contains(this)) {
      RunningScope running(this);
      work();
      return;
    }
    if (kind == Kind::serial) {
      syncSerial(work);
    } else {
      syncConcurrent(work, barrier);
    }
  }
};

namespace {

const std::shared_ptr<DispatchQueueCore>& mainCore() {
  static const auto* core =
      new std::shared_ptr<DispatchQueueCore>(std::make_shared<DispatchQueueCore>(
          "kivi.main", DispatchQoS::userInteractive, DispatchQueueCore::Kind::main));
  return *core;
}

}  // namespace

bool drainMainQueue() {
  if (!Thread::isMainThread()) return false;
  return mainCore()->drainMain();
}

}  // namespace detail

using detail::DispatchQueueCore;

std::shared_ptr<DispatchQueue> KivDispatchQueueProtocol::global(DispatchQoS::QoSClass qos) {
  return DispatchQueue::global(qos);
}

DispatchQueue::DispatchQueue(std::shared_ptr<DispatchQueueCore> core) : core_(std::move(core)) {
  if (core_->kind == DispatchQueueCore::Kind::concurrent) core_->epoch = core_->makeEpoch();
}

DispatchQueue::~DispatchQueue() {
  if (core_->kind == DispatchQueueCore::Kind::concurrent) core_->close();
}

std::shared_ptr<DispatchQueue> DispatchQueue::create(std::string label, Attributes attributes) {
  return create(std::move(label), DispatchQoS::unspecified, attributes);
}

std::shared_ptr<DispatchQueue> DispatchQueue::create(std::string label, DispatchQoS qos,
                                                     Attributes attributes) {
  const auto kind = attributes == Attributes::concurrent ? DispatchQueueCore::Kind::concurrent
                                                         : DispatchQueueCore::Kind::serial;
  return std::shared_ptr<DispatchQueue>(
      new DispatchQueue(std::make_shared<DispatchQueueCore>(std::move(label), qos, kind)));
}

const std::shared_ptr<DispatchQueue>& DispatchQueue::main() {
  static const auto* queue =
      new std::shared_ptr<DispatchQueue>(new DispatchQueue(detail::mainCore()));
  return *queue;
}

const std::shared_ptr<DispatchQueue>& DispatchQueue::global() {
  return global(DispatchQoS::QoSClass::default_);
}

const std::shared_ptr<DispatchQueue>& DispatchQueue::global(DispatchQoS::QoSClass qos) {
  using QoSClass = DispatchQoS::QoSClass;
  static constexpr std::array<std::pair<QoSClass, const char*>, 5> kClasses{{
      {QoSClass::userInteractive, "kivi.global.user-interactive"},
      {QoSClass::userInitiated, "kivi.global.user-initiated"},
      {QoSClass::default_, "kivi.global.default"},
      {QoSClass::utility, "kivi.global.utility"},
      {QoSClass::background, "kivi.global.background"},
  }};
  // Made once, never destroyed: work may reach them until the process ends.
  static const auto* const queues = [] {
    auto* made = new std::array<std::shared_ptr<DispatchQueue>, kClasses.size()>;
    for (std::size_t i = 0; i < kClasses.size(); ++i) {
      (*made)[i] = std::shared_ptr<DispatchQueue>(new DispatchQueue(
          std::make_shared<DispatchQueueCore>(kClasses[i].second, DispatchQoS(kClasses[i].first),
                                              DispatchQueueCore::Kind::global)));
    }
    return made;
  }();
  for (std::size_t i = 0; i < kClasses.size(); ++i) {
    if (kClasses[i].first == qos) return (*queues)[i];
  }
  return (*queues)[2];  // unspecified or unknown: the default class
}

const std::string& DispatchQueue::label() const noexcept { return core_->label; }

bool DispatchQueue::isSerial() const noexcept { return core_->isSerial(); }

DispatchQoS DispatchQueue::qos() const noexcept { return core_->qos; }

bool DispatchQueue::isCurrent() const noexcept {
  if (core_->kind == DispatchQueueCore::Kind::main) return Thread::isMainThread();
  return detail::CurrentQueueScope::contains(core_.get());
}

void DispatchQueue::async(std::function<void()> work) {
  if (work) core_->submit(std::move(work), false);
}

void DispatchQueue::async(const DispatchGroupPtr& group, DispatchQoS, DispatchWorkItemFlags flags,
                          std::function<void()> work) {
  if (!work) return;
  if (group) {
    group->enter();
    work = [group, work = std::move(work)] {
      work();
      group->leave();
    };
  }
  core_->submit(std::move(work), flags.contains(DispatchWorkItemFlags::barrier));
}

void DispatchQueue::async(const DispatchWorkItemPtr& workItem) {
  if (!workItem) return;
  core_->submit([workItem] { workItem->perform(); },
                workItem->flags().contains(DispatchWorkItemFlags::barrier));
}

void DispatchQueue::async(const DispatchGroupPtr& group, const DispatchWorkItemPtr& workItem) {
  if (!group) {
    async(workItem);
    return;
  }
  if (!workItem) return;
  group->enter();
  core_->submit(
      [group, workItem] {
        workItem->perform();
        group->leave();
      },
      workItem->flags().contains(DispatchWorkItemFlags::barrier));
}

void DispatchQueue::sync(const std::function<void()>& work) {
  if (work) core_->sync(work, false);
}

void DispatchQueue::sync(const DispatchWorkItemPtr& workItem) {
  if (!workItem) return;
  core_->sync([&workItem] { workItem->perform(); },
              workItem->flags().contains(DispatchWorkItemFlags::barrier));
}

void DispatchQueue::asyncAfter(DispatchTime deadline, std::function<void()> work) {
  asyncAfter(*DispatchClock::system(), deadline, std::move(work));
}

void DispatchQueue::asyncAfter(DispatchClock& clock, DispatchTime deadline,
                               std::function<void()> work) {
  if (!work) return;
  auto self = std::static_pointer_cast<DispatchQueue>(shared_from_this());
  clock.callAt(deadline, [self = std::move(self), work = std::move(work)]() mutable {
    self->core_->submit(std::move(work), false);
  });
}

void DispatchQueue::asyncAfter(DispatchTime deadline, DispatchQoS, DispatchWorkItemFlags flags,
                               std::function<void()> work) {
  if (!work) return;
  auto self = std::static_pointer_cast<DispatchQueue>(shared_from_this());
  const bool barrier = flags.contains(DispatchWorkItemFlags::barrier);
  DispatchClock::system()->callAt(
      deadline, [self = std::move(self), barrier, work = std::move(work)]() mutable {
        self->core_->submit(std::move(work), barrier);
      });
}

void DispatchQueue::asyncAfter(DispatchTime deadline, const DispatchWorkItemPtr& workItem) {
  if (!workItem) return;
  auto self = std::static_pointer_cast<DispatchQueue>(shared_from_this());
  DispatchClock::system()->callAt(deadline,
                                  [self = std::move(self), workItem] { self->async(workItem); });
}

std::string DispatchQueue::className() const {
  switch (core_->kind) {
    case DispatchQueueCore::Kind::main:
      return "OS_dispatch_queue_main";
    case DispatchQueueCore::Kind::global:
      return "OS_dispatch_queue_global";
    case DispatchQueueCore::Kind::concurrent:
      return "OS_dispatch_queue_concurrent";
    case DispatchQueueCore::Kind::serial:
      break;
  }
  return "OS_dispatch_queue_serial";
}

std::string DispatchQueue::description() const {
  std::string text = Object::description();  // "<Class: 0x...>"
  text.insert(text.size() - 1, "; label = " + core_->label);
  return text;
}

}  // namespace kivi
