#include "kivi/dispatch/worker_pool.h"

#include <fcntl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <mutex>
#include <string_view>
#include <thread>
#include <vector>

#include "kivi/dispatch/detail/current_queue.h"
#include "kivi/dispatch/detail/thread_start.h"

namespace kivi {

namespace detail {

namespace {
std::atomic<int> gFailingThreadStarts{0};
}  // namespace

bool startDetachedThread(std::function<void()> body) noexcept {
  if (gFailingThreadStarts.load(std::memory_order_relaxed) > 0 &&
      gFailingThreadStarts.fetch_sub(1, std::memory_order_relaxed) > 0) {
    return false;
  }
  try {
    std::thread(std::move(body)).detach();
    return true;
  } catch (...) {  // std::system_error: the system has no thread for us now
    return false;
  }
}

void failThreadStartsForTesting(int count) noexcept {
  gFailingThreadStarts.store(count, std::memory_order_relaxed);
}

}  // namespace detail

namespace {

constexpr auto kIdleTimeout = std::chrono::seconds(5);
// How often the monitor looks at the workers while work waits for one.
constexpr auto kMonitorInterval = std::chrono::milliseconds(10);
// A worker found stuck is looked at again every this many intervals while it
// stays in the same job.
constexpr int kRecheckIntervals = 10;

// One worker thread, as the pool and its monitor see it.
struct WorkerRecord {
  // Guarded by the pool's mutex.
  pid_t tid = 0;  // 0 until the thread runs
  std::uint64_t jobsTaken = 0;
  bool busy = false;
  bool blocked = false;
  bool stuck = false;  // the monitor found it off the processor in a long job
  // The monitor's own notes, touched only by the monitor thread.
  std::uint64_t jobsSeen = UINT64_MAX;
  int stuckIntervals = 0;  // > 0 while judged stuck in its current job
};

thread_local WorkerRecord* tWorker = nullptr;
thread_local int tBlockingDepth = 0;
// The queues whose work this thread runs, innermost last; a small fixed
// stack, since sync() onto a queue from another queue's work nests.
thread_local const void* tQueues[16];
thread_local int tQueueDepth = 0;

struct Job {
  std::function<void()> work;
  const void* queue = nullptr;
  std::shared_ptr<const void> keepAlive;
};

// First in, first out, in one ring that grows with the backlog and shrinks
// again once the backlog has gone: adding and taking jobs allocates nothing
// in between.
class JobRing {
 public:
  bool empty() const { return size_ == 0; }
  std::size_t size() const { return size_; }
  void push(Job job) {
    if (size_ == slots_.size()) grow();
    slots_[(head_ + size_) & (slots_.size() - 1)] = std::move(job);
    ++size_;
  }
  Job pop() {
    Job job = std::move(slots_[head_]);
    head_ = (head_ + 1) & (slots_.size() - 1);
    --size_;
    if (slots_.size() > kKept && size_ < slots_.size() / 8) resize(slots_.size() / 4);
    return job;
  }

 private:
  static constexpr std::size_t kKept = 1024;  // slots never given back

  void grow() { resize(std::max<std::size_t>(64, slots_.size() * 2)); }

  void resize(std::size_t capacity) {
    std::vector<Job> slots(capacity);
    for (std::size_t i = 0; i < size_; ++i) {
      slots[i] = std::move(slots_[(head_ + i) & (slots_.size() - 1)]);
    }
    slots_ = std::move(slots);
    head_ = 0;
  }
  std::vector<Job> slots_;  // a power of two long
  std::size_t head_ = 0;
  std::size_t size_ = 0;
};

// Whether the thread is neither running nor waiting for a processor
// (/proc/self/task/<tid>/stat, the field after the command name).
bool isOffProcessor(pid_t tid) {
  char path[64];
  std::snprintf(path, sizeof path, "/proc/self/task/%d/stat", static_cast<int>(tid));
  const int fd = ::open(path, O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;  // gone: it is not holding anything up
  char buffer[512];
  const ssize_t length = ::read(fd, buffer, sizeof buffer);
  ::close(fd);
  if (length <= 0) return false;
  const std::string_view stat(buffer, static_cast<std::size_t>(length));
  const auto paren = stat.rfind(')');
  if (paren == std::string_view::npos || paren + 2 >= stat.size()) return false;
  return stat[paren + 2] != 'R';
}

}  // namespace

struct WorkerPool::State {
  std::mutex mutex;
  std::condition_variable wake;  // idle workers wait here
  JobRing jobs;
  std::vector<std::shared_ptr<WorkerRecord>> workers;
  std::size_t threads = 0;   // counts workers being started
  std::size_t idle = 0;      // waiting for work
  std::size_t signaled = 0;  // of the idle, woken and not up yet
  std::size_t blocked = 0;   // inside a blocking call or BlockingScope
  std::size_t stuck = 0;     // busy, but the monitor found them stuck
  std::size_t width = 2;
  std::condition_variable monitorWake;
  bool monitorArmed = false;
  bool monitorStarted = false;

  using Starts = std::vector<std::shared_ptr<WorkerRecord>>;

  // Workers running, about to run, or being started.
  std::size_t runningLocked() const { return threads - (idle - signaled) - blocked - stuck; }

  // Under mutex: wakes an idle worker (true) if one is left unclaimed.
  bool claimIdleLocked() {
    if (idle == signaled) return false;
    ++signaled;
    return true;
  }

  // Under mutex: the worker is no longer in the job the monitor judged.
  void unstickLocked(WorkerRecord& record) {
    if (!record.stuck) return;
    record.stuck = false;
    --stuck;
  }

  // Under mutex: books up to `count` new workers; start them after unlocking.
  Starts bookWorkersLocked(std::size_t count) {
    Starts starts;
    while (starts.size() < count && threads < kMaxThreads) {
      ++threads;
      starts.push_back(std::make_shared<WorkerRecord>());
      workers.push_back(starts.back());
    }
    return starts;
  }

  // Under mutex: whether the monitor must be woken (or started).
  bool armMonitorLocked() {
    if (monitorArmed) return false;
    monitorArmed = true;
    return true;
  }

  void startWorkers(const Starts& starts) {
    bool refused = false;
    for (const auto& record : starts) {
      if (detail::startDetachedThread([this, record] { run(record); })) continue;
      // The system has no thread for us now: undo, and let the monitor try
      // again while work waits.
      std::lock_guard lock(mutex);
      --threads;
      std::erase(workers, record);
      refused = true;
    }
    if (refused) wakeMonitor();
  }

  void wakeMonitor() {
    bool start = false;
    {
      std::lock_guard lock(mutex);
      monitorArmed = true;
      if (!monitorStarted) start = monitorStarted = true;
    }
    if (!start) {
      monitorWake.notify_one();
    } else if (!detail::startDetachedThread([this] { monitor(); })) {
      std::lock_guard lock(mutex);
      monitorStarted = false;  // the next submit that finds work waiting tries again
      monitorArmed = false;
    }
  }

  void run(const std::shared_ptr<WorkerRecord>& record) {
    tWorker = record.get();
    const auto tid = static_cast<pid_t>(::syscall(SYS_gettid));
    std::unique_lock lock(mutex);
    record->tid = tid;
    for (;;) {
      unstickLocked(*record);
      while (jobs.empty()) {
        record->busy = false;
        ++idle;
        const bool timedOut = wake.wait_for(lock, kIdleTimeout) == std::cv_status::timeout;
        --idle;
        if (signaled > 0) --signaled;  // any wake-up uses up a claim
        if (jobs.empty() && timedOut && threads > width) {
          --threads;
          std::erase(workers, record);
          tWorker = nullptr;
          return;
        }
      }
      Job job = jobs.pop();
      record->busy = true;
      ++record->jobsTaken;
      lock.unlock();
      if (job.queue) {
        detail::CurrentQueueScope current(job.queue);
        job.work();
      } else {
        job.work();
      }
      job = {};  // release captures outside the lock
      lock.lock();
    }
  }

  void enterBlocking() {
    Starts starts;
    bool wakeOne = false;
    {
      std::lock_guard lock(mutex);
      ++blocked;
      tWorker->blocked = true;
      if (!jobs.empty() && runningLocked() < width) {
        wakeOne = claimIdleLocked();
        if (!wakeOne) starts = bookWorkersLocked(1);
      }
    }
    if (wakeOne) wake.notify_one();
    startWorkers(starts);
  }

  void leaveBlocking() {
    std::lock_guard lock(mutex);
    --blocked;
    tWorker->blocked = false;
  }

  // While work waits and no worker is idle: every interval, counts the busy
  // workers that are actually running and adds workers up to the width.
  void monitor() {
    struct Look {
      std::shared_ptr<WorkerRecord> record;
      pid_t tid;
      std::uint64_t jobsTaken;
    };
    std::vector<Look> looks;
    std::unique_lock lock(mutex);
    for (;;) {
      monitorWake.wait(lock, [&] { return monitorArmed; });
      monitorWake.wait_for(lock, kMonitorInterval);
      if (jobs.empty()) {
        monitorArmed = false;
        continue;
      }
      looks.clear();
      for (const auto& record : workers) {
        if (record->tid != 0 && record->busy && !record->blocked) {
          looks.push_back({record, record->tid, record->jobsTaken});
        }
      }
      lock.unlock();
      // Judged outside the lock: reading /proc takes system calls.
      std::vector<WorkerRecord*> foundStuck, foundRunning;
      for (auto& look : looks) {
        WorkerRecord& w = *look.record;
        if (look.jobsTaken != w.jobsSeen) {  // it has moved on since the last look
          w.jobsSeen = look.jobsTaken;
          w.stuckIntervals = 0;
          continue;
        }
        if (w.stuckIntervals > 0 && w.stuckIntervals++ % kRecheckIntervals != 0) continue;
        if (isOffProcessor(look.tid)) {
          w.stuckIntervals = std::max(w.stuckIntervals, 1);
          foundStuck.push_back(&w);
        } else {
          w.stuckIntervals = 0;
          foundRunning.push_back(&w);
        }
      }
      lock.lock();
      for (std::size_t i = 0; i < looks.size(); ++i) {
        WorkerRecord& w = *looks[i].record;
        // Only a worker still in the job it was judged in.
        if (!w.busy || w.blocked || w.jobsTaken != looks[i].jobsTaken) continue;
        const bool isStuck =
            std::find(foundStuck.begin(), foundStuck.end(), &w) != foundStuck.end();
        const bool isRunning =
            std::find(foundRunning.begin(), foundRunning.end(), &w) != foundRunning.end();
        if (isStuck && !w.stuck) {
          w.stuck = true;
          ++stuck;
        } else if (isRunning) {
          unstickLocked(w);
        }
      }
      looks.clear();  // the records stay alive: the pool holds them while their threads run
      Starts starts;
      std::size_t wakes = 0;
      while (jobs.size() > wakes + starts.size() && runningLocked() < width) {
        if (claimIdleLocked()) {
          ++wakes;
        } else {
          auto more = bookWorkersLocked(1);
          if (more.empty()) break;
          starts.push_back(std::move(more.front()));
        }
      }
      for (std::size_t i = 0; i < wakes; ++i) wake.notify_one();
      if (!starts.empty()) {
        lock.unlock();
        startWorkers(starts);
        lock.lock();
      }
    }
  }
};

WorkerPool::WorkerPool() : state_(new State) {
  state_->width = std::max(2u, std::thread::hardware_concurrency());
}

WorkerPool& WorkerPool::shared() {
  // Never destroyed: workers may still be waiting when the process exits.
  static WorkerPool* pool = new WorkerPool;
  return *pool;
}

bool WorkerPool::isWorkerThread() noexcept { return tWorker != nullptr; }

std::size_t WorkerPool::width() const noexcept { return state_->width; }

void WorkerPool::submit(std::function<void()> job) { submit(std::move(job), nullptr, nullptr); }

void WorkerPool::submit(std::function<void()> work, const void* queue,
                        std::shared_ptr<const void> keepAlive) {
  if (!work) return;  // nothing to run; a worker would throw calling it
  State& s = *state_;
  bool wake = false;
  bool monitor = false;
  State::Starts starts;
  {
    std::lock_guard lock(s.mutex);
    s.jobs.push({std::move(work), queue, std::move(keepAlive)});
    // While fewer than the width run, wake an idle worker or start one;
    // otherwise a running worker takes the job when it is done with its own.
    if (s.runningLocked() < s.width) {
      wake = s.claimIdleLocked();
      if (!wake) starts = s.bookWorkersLocked(1);
    }
    if (!wake && starts.empty()) monitor = s.armMonitorLocked();
  }
  // Woken after the unlock, the worker does not run straight into our lock.
  if (wake) s.wake.notify_one();
  s.startWorkers(starts);
  if (monitor) s.wakeMonitor();
}

WorkerPool::Statistics WorkerPool::statistics() const {
  std::lock_guard lock(state_->mutex);
  return {state_->threads, state_->idle, state_->blocked, state_->jobs.size()};
}

WorkerPool::BlockingScope::BlockingScope() noexcept : counted_(false) {
  if (!tWorker) return;
  counted_ = tBlockingDepth++ == 0;
  if (counted_) WorkerPool::shared().state_->enterBlocking();
}

WorkerPool::BlockingScope::~BlockingScope() {
  if (!tWorker) return;
  --tBlockingDepth;
  if (counted_) WorkerPool::shared().state_->leaveBlocking();
}

namespace detail {

CurrentQueueScope::CurrentQueueScope(const void* queue) {
  // Deeper nesting than the stack holds is not remembered (isCurrent() then
  // answers false for the innermost queues).
  if (tQueueDepth < static_cast<int>(std::size(tQueues))) tQueues[tQueueDepth] = queue;
  ++tQueueDepth;
}

CurrentQueueScope::~CurrentQueueScope() { --tQueueDepth; }

bool CurrentQueueScope::contains(const void* queue) noexcept {
  const int depth = std::min(tQueueDepth, static_cast<int>(std::size(tQueues)));
  for (int i = 0; i < depth; ++i) {
    if (tQueues[i] == queue) return true;
  }
  return false;
}

}  // namespace detail

}  // namespace kivi
