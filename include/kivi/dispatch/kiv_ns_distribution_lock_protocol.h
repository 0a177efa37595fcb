// KivNSDistributionLockProtocol: the interface of an inter-process lock that
// can be tried once, waited for with a time-out, or tried with a callback that
// is told whether the lock was taken. kivi::NSDistributedLock implements it on
// the file system; MockKivNSDistributedLock is its scriptable double, so code
// that holds the interface can be tested without touching the disk.
//
//   void exportOnce(kivi::KivNSDistributionLockProtocol& lock) {
//     if (!lock.tryLock(5.0)) return;  // another process is exporting
//     writeExport();
//     lock.unlock();
//   }
//
// The callback forms never release the lock: when the callback is told true,
// the lock is the caller's and the caller unlocks it.
//
// Thread contract: that of the conformer. NSDistributedLock may be called
// from any thread; the double is not synchronised.
#pragma once

#include <functional>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivNSDistributionLockProtocol {
 public:
  virtual ~KivNSDistributionLockProtocol() = default;

  // Takes the lock now, without waiting; false when it is held.
  [[nodiscard]] virtual bool tryLock() = 0;
  // Takes the lock within `timeout` seconds, polling every 0.1 seconds.
  [[nodiscard]] virtual bool tryLock(double timeout) = 0;
  // Takes the lock within `timeout` seconds, polling every `resolution`
  // seconds.
  [[nodiscard]] virtual bool tryLock(double timeout, double resolution) = 0;
  // Tries as tryLock(timeout, 0.1), then calls `protectedBlock` once, on the
  // calling thread, with the result.
  virtual void tryLock(double timeout, std::function<void(bool)> protectedBlock) = 0;
  // The same with a time-out of 10 seconds.
  virtual void tryLock(std::function<void(bool)> protectedBlock) = 0;
  // Releases the lock this object holds.
  virtual void unlock() = 0;
  // Removes the lock whoever holds it.
  virtual void breakLock() = 0;
};

}  // namespace kivi
