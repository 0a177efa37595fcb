// RecursiveLock: a mutual-exclusion lock that the thread holding it may take
// again; each lock() needs its unlock(). Usable with std::lock_guard and
// std::unique_lock.
//
//   auto lock = std::make_shared<kivi::RecursiveLock>();
//   std::lock_guard guard(*lock);
//
// Thread contract: any thread; unlock() only by the holding thread.
#pragma once

#include <mutex>
#include <string>

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT RecursiveLock : public Object {
 public:
  RecursiveLock() = default;

  // Waits until the lock is free or already held by this thread, then takes it.
  void lock() { mutex_.lock(); }
  // Releases one lock() (or successful tryLock()) of the holding thread.
  void unlock() { mutex_.unlock(); }
  // Takes the lock if it can without waiting; false when another thread holds it.
  bool tryLock() { return mutex_.try_lock(); }
  // BasicLockable / Lockable spellings.
  bool try_lock() { return tryLock(); }

  // A name for debugging; empty until set.
  std::string name() const;
  void setName(std::string name);

  std::string className() const override { return "NSRecursiveLock"; }

 private:
  std::recursive_mutex mutex_;
  mutable std::mutex nameMutex_;
  std::string name_;  // guarded by nameMutex_
};

}  // namespace kivi
