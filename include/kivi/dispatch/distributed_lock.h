// NSDistributedLock: a lock shared by every process that names the same path,
// represented by a directory in the file system. Creating a directory is
// atomic, so whoever creates it holds the lock; whoever finds it there does
// not.
//
//   auto lock = kivi::NSDistributedLock::lockWithPath("/run/user/1000/app-export.lock");
//   if (!lock) return;                  // empty or overlong path
//   if (lock->tryLock(5.0)) {           // wait up to 5 s, polling every 0.1 s
//     writeExport();
//     lock->unlock();
//   } else if (auto since = lock->lockDate(); since && since->timeIntervalSinceNow() < -3600) {
//     lock->breakLock();                // an hour old: its holder is presumed dead
//   }
//
// The lock is not tied to a process or to this object's lifetime: it stays
// until its holder calls unlock() or someone calls breakLock(). A holder that
// crashes, or destroys its object without unlocking, leaves the lock behind;
// lockDate() tells how old a lock is, so a host can judge when to break it.
// The lock is not re-entrant: tryLock() answers false while this same object
// holds it.
//
// Refusals. lockWithPath() answers null for an empty path, a path longer than
// PATH_MAX bytes or one holding a NUL byte. Every other path gives an object;
// when its directory cannot be made (the parent is missing, not a directory
// or not writable, a component is longer than NAME_MAX, the file system is
// read-only) every attempt answers false, as for a lock held by someone else.
// Anything already at the path that is not a lock (a file, a non-empty
// directory) likewise keeps tryLock() answering false, and breakLock() leaves
// it in place. A relative path is resolved against the working directory at
// each call.
//
// Time-outs and resolutions (seconds), for the waiting forms:
//   timeout      0, negative, -infinity or NaN: exactly one attempt, no sleep;
//                +infinity: waits until the lock is taken.
//   resolution   NaN, zero or negative: the default 0.1; below 0.001: 0.001,
//                so a waiting thread never spins; +infinity: one attempt.
// The wait is measured on a monotonic clock; changing the wall clock neither
// lengthens nor shortens it. The thread sleeps between attempts (on a worker
// of the pool, it counts as blocked).
//
// Thread contract: every member may be called from any thread; the waiting
// forms block only the calling thread, for at most the time-out plus one
// attempt. The protected callback runs on the calling thread before the call
// returns.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/dispatch/kiv_ns_distribution_lock_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT NSDistributedLock : public Object, public KivNSDistributionLockProtocol {
 public:
  // A lock represented by the directory `path`; null for an empty path, one
  // longer than PATH_MAX or one holding a NUL byte. Nothing is created yet.
  static std::shared_ptr<NSDistributedLock> lockWithPath(std::string path);
  // Does not release a lock this object holds (see above).
  ~NSDistributedLock() override;

  // Creates the directory; true when this call made it. Never blocks.
  [[nodiscard]] bool tryLock() override;
  // tryLock(timeout, 0.1).
  [[nodiscard]] bool tryLock(double timeout) override;
  // Tries once, then again every `resolution` seconds while the next attempt
  // still falls inside `timeout` seconds from the start. Never sleeps past the
  // time-out: tryLock(1, 0.3) on a lock held throughout answers false after
  // four attempts, about 0.9 s.
  [[nodiscard]] bool tryLock(double timeout, double resolution) override;
  // tryLock(timeout, 0.1), then `protectedBlock(taken)` (a null block is not
  // called). Never unlocks: on true the lock is the caller's to release; on
  // false it belongs to someone else and is left alone.
  void tryLock(double timeout, std::function<void(bool)> protectedBlock) override;
  // tryLock(10, protectedBlock).
  void tryLock(std::function<void(bool)> protectedBlock) override;
  // Removes the directory if this object holds the lock and the directory is
  // still the one it made (same identity and modification time). A lock this
  // object does not hold, or one broken and taken by another holder since,
  // is left alone: the call then just returns.
  void unlock() override;
  // Removes the lock directory whoever holds it (only an empty directory is
  // removed). The next tryLock() of any holder may take it.
  void breakLock() override;

  // When the lock was taken: the modification time of what is at the path,
  // or nullopt when nothing is there.
  std::optional<Date> lockDate() const;

 private:
  explicit NSDistributedLock(std::string path);

  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace kivi
