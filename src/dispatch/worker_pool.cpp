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
#include <deque>
#include <memory>
#include <mutex>
#include <string_view>
#include <thread>
#include <vector>

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
  // The monitor's own notes, touched only by the monitor thread.
  std::uint64_t jobsSeen = UINT64_MAX;
  int stuckIntervals = 0;  // > 0 while judged stuck in its current job
};

thread_local WorkerRecord* tWorker = nullptr;
thread_local int tBlockingDepth = 0;

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
  std::deque<std::function<void()>> jobs;
  std::vector<std::shared_ptr<WorkerRecord>> workers;
  std::size_t threads = 0;  // counts workers being started
  std::size_t idle = 0;
  std::size_t blocked = 0;
  std::size_t width = 2;
  std::condition_variable monitorWake;
  bool monitorArmed = false;
  bool monitorStarted = false;

  using Starts = std::vector<std::shared_ptr<WorkerRecord>>;

  std::size_t runningLocked() const { return threads - idle - blocked; }

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
      while (jobs.empty()) {
        record->busy = false;
        ++idle;
        const bool woke = wake.wait_for(lock, kIdleTimeout, [&] { return !jobs.empty(); });
        --idle;
        if (!woke && threads > width) {
          --threads;
          std::erase(workers, record);
          tWorker = nullptr;
          return;
        }
      }
      auto job = std::move(jobs.front());
      jobs.pop_front();
      record->busy = true;
      ++record->jobsTaken;
      lock.unlock();
      job();
      job = nullptr;  // release captures outside the lock
      lock.lock();
    }
  }

  void enterBlocking() {
    Starts starts;
    {
      std::lock_guard lock(mutex);
      ++blocked;
      tWorker->blocked = true;
      if (jobs.size() > idle && runningLocked() < width) starts = bookWorkersLocked(1);
    }
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
      std::size_t starting = 0;
      looks.clear();
      for (const auto& record : workers) {
        if (record->tid == 0) {
          ++starting;
        } else if (record->busy && !record->blocked) {
          looks.push_back({record, record->tid, record->jobsTaken});
        }
      }
      lock.unlock();
      std::size_t stuck = 0;
      for (auto& look : looks) {
        WorkerRecord& w = *look.record;
        if (look.jobsTaken != w.jobsSeen) {  // it has moved on since the last look
          w.jobsSeen = look.jobsTaken;
          w.stuckIntervals = 0;
          continue;
        }
        if (w.stuckIntervals > 0 && w.stuckIntervals++ % kRecheckIntervals != 0) {
          ++stuck;
          continue;
        }
        if (isOffProcessor(look.tid)) {
          w.stuckIntervals = std::max(w.stuckIntervals, 1);
          ++stuck;
        } else {
          w.stuckIntervals = 0;
        }
      }
      const std::size_t running = looks.size() - stuck + starting;
      looks.clear();  // drop the references outside the lock
      lock.lock();
      Starts starts;
      if (idle > 0) {
        wake.notify_all();
      } else if (running < width) {
        starts = bookWorkersLocked(std::min(width - running, jobs.size()));
      }
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

void WorkerPool::submit(std::function<void()> job) {
  State& s = *state_;
  bool wake = false;
  bool monitor = false;
  State::Starts starts;
  {
    std::lock_guard lock(s.mutex);
    s.jobs.push_back(std::move(job));
    // Wake an idle worker while there are at least as many idle workers as
    // queued jobs; otherwise start one if fewer than the width are running.
    if (s.jobs.size() <= s.idle) {
      wake = true;
    } else if (s.runningLocked() < s.width) {
      starts = s.bookWorkersLocked(1);
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

}  // namespace kivi
