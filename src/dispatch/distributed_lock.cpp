#include "kivi/dispatch/distributed_lock.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <climits>
#include <cmath>
#include <mutex>
#include <utility>

#include "kivi/dispatch/detail/distributed_lock_attempts.h"
#include "kivi/dispatch/thread.h"

namespace kivi {

namespace {

constexpr double kDefaultResolution = 0.1;
constexpr double kShortestResolution = 0.001;
constexpr double kProtectedBlockTimeout = 10.0;

using AttemptObserver = std::function<void(const std::string&, bool)>;

std::mutex& observerMutex() {
  static std::mutex mutex;
  return mutex;
}

std::shared_ptr<const AttemptObserver>& observerSlot() {
  static std::shared_ptr<const AttemptObserver> observer;
  return observer;
}

void reportAttempt(const std::string& path, bool taken) {
  std::shared_ptr<const AttemptObserver> observer;
  {
    std::lock_guard guard(observerMutex());
    observer = observerSlot();
  }
  if (observer) (*observer)(path, taken);
}

// What identifies the directory one holder made: a directory made again at
// the same path after a break has another inode or another modification time.
// Time stamps advance in clock ticks of a few milliseconds, so a lock broken
// and taken again within the tick it was first taken in, on a reused inode,
// would pass for the first; a lock worth breaking is much older.
struct Identity {
  dev_t device = 0;
  ino_t inode = 0;
  timespec modified{};

  static std::optional<Identity> of(const std::string& path) {
    struct stat info;
    if (::lstat(path.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) return std::nullopt;
    return Identity{info.st_dev, info.st_ino, info.st_mtim};
  }
  bool operator==(const Identity& other) const {
    return device == other.device && inode == other.inode &&
           modified.tv_sec == other.modified.tv_sec && modified.tv_nsec == other.modified.tv_nsec;
  }
};

double secondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

}  // namespace

namespace detail {

void setDistributedLockAttemptObserverForTesting(AttemptObserver observer) {
  auto shared = observer ? std::make_shared<const AttemptObserver>(std::move(observer)) : nullptr;
  std::lock_guard guard(observerMutex());
  observerSlot() = std::move(shared);
}

}  // namespace detail

struct NSDistributedLock::State {
  std::string path;
  std::mutex mutex;
  // While this object holds the lock: the directory it made.
  std::optional<Identity> held;
};

std::shared_ptr<NSDistributedLock> NSDistributedLock::lockWithPath(std::string path) {
  if (path.empty() || path.size() > PATH_MAX || path.find('\0') != std::string::npos) {
    return nullptr;
  }
  return std::shared_ptr<NSDistributedLock>(new NSDistributedLock(std::move(path)));
}

NSDistributedLock::NSDistributedLock(std::string path) : state_(std::make_unique<State>()) {
  state_->path = std::move(path);
}

NSDistributedLock::~NSDistributedLock() = default;

bool NSDistributedLock::tryLock() {
  bool taken;
  {
    std::lock_guard guard(state_->mutex);
    taken = ::mkdir(state_->path.c_str(), 0777) == 0;
    // Absent only if the directory was already broken again; unlock() then
    // has nothing of ours to remove.
    if (taken) state_->held = Identity::of(state_->path);
  }
  reportAttempt(state_->path, taken);
  return taken;
}

bool NSDistributedLock::tryLock(double timeout) { return tryLock(timeout, kDefaultResolution); }

bool NSDistributedLock::tryLock(double timeout, double resolution) {
  if (std::isnan(resolution) || resolution <= 0) resolution = kDefaultResolution;
  resolution = std::max(resolution, kShortestResolution);
  // NaN compares false with everything: read it as "no waiting".
  if (std::isnan(timeout)) timeout = 0;

  const auto start = std::chrono::steady_clock::now();
  if (tryLock()) return true;
  for (;;) {
    // Seconds from the start to the next attempt; +infinity for an infinite
    // resolution, which no finite time-out admits and an infinite one would
    // wait on for good.
    const double next = secondsSince(start) + resolution;
    if (next > timeout || std::isinf(next)) return false;
    Thread::sleepUntilDate(Date::now().addingTimeInterval(resolution));
    if (tryLock()) return true;
  }
}

void NSDistributedLock::tryLock(double timeout, std::function<void(bool)> protectedBlock) {
  const bool taken = tryLock(timeout, kDefaultResolution);
  if (protectedBlock) protectedBlock(taken);
}

void NSDistributedLock::tryLock(std::function<void(bool)> protectedBlock) {
  tryLock(kProtectedBlockTimeout, std::move(protectedBlock));
}

void NSDistributedLock::unlock() {
  std::lock_guard guard(state_->mutex);
  const auto mine = std::exchange(state_->held, std::nullopt);
  if (mine && Identity::of(state_->path) == mine) ::rmdir(state_->path.c_str());
}

void NSDistributedLock::breakLock() {
  std::lock_guard guard(state_->mutex);
  // rmdir removes only an empty directory: a file or a directory with
  // content at the path is not a lock and stays.
  if (::rmdir(state_->path.c_str()) == 0 || errno == ENOENT) state_->held.reset();
}

std::optional<Date> NSDistributedLock::lockDate() const {
  struct stat info;
  if (::lstat(state_->path.c_str(), &info) != 0) return std::nullopt;
  return Date{static_cast<double>(info.st_mtim.tv_sec) +
              static_cast<double>(info.st_mtim.tv_nsec) / 1e9};
}

}  // namespace kivi
