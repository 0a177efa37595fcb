// MockKivNSDistributedLock: a scriptable KivNSDistributionLockProtocol.
//
// Every operation calls the matching callback property, if set, with its
// arguments unchanged and answers what it answers. Without a callback the
// three try operations answer true, the two protected-block forms do not run
// the protected block, and unlock() and breakLock() do nothing. Nothing
// reaches the file system.
//
//   auto lock = std::make_shared<kivi::MockKivNSDistributedLock>();
//   lock->tryLockWithTimeOutBlock = [](double) { return false; };  // always held
//   lock->tryLockWithProtectedBlock = [](std::function<void(bool)> work) { work(true); };
//   exporter.setLock(lock);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/dispatch/kiv_ns_distribution_lock_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivNSDistributedLock : public Object, public KivNSDistributionLockProtocol {
 public:
  MockKivNSDistributedLock() = default;

  // Answers tryLock(); without it, true.
  std::function<bool()> tryLockBlock;
  // Answers tryLock(timeout); without it, true.
  std::function<bool(double)> tryLockWithTimeOutBlock;
  // Answers tryLock(timeout, resolution); without it, true.
  std::function<bool(double, double)> tryLockWithTimeOutAndResolutionBlock;
  // Called by tryLock(timeout, protectedBlock); without it the protected block never runs.
  std::function<void(double, std::function<void(bool)>)> tryLockWithTimeOutAndProtectedBlock;
  // Called by tryLock(protectedBlock); without it the protected block never runs.
  std::function<void(std::function<void(bool)>)> tryLockWithProtectedBlock;
  // Called by unlock(); without it nothing happens.
  std::function<void()> unlockBlock;
  // Called by breakLock(); without it nothing happens.
  std::function<void()> breakLockBlock;

  [[nodiscard]] bool tryLock() override;
  [[nodiscard]] bool tryLock(double timeout) override;
  [[nodiscard]] bool tryLock(double timeout, double resolution) override;
  void tryLock(double timeout, std::function<void(bool)> protectedBlock) override;
  void tryLock(std::function<void(bool)> protectedBlock) override;
  void unlock() override;
  void breakLock() override;
};

}  // namespace kivi
