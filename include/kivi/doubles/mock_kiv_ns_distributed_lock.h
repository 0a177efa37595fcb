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

  std::function<bool()> tryLockBlock;
  std::function<bool(double)> tryLockWithTimeOutBlock;
  std::function<bool(double, double)> tryLockWithTimeOutAndResolutionBlock;
  std::function<void(double, std::function<void(bool)>)> tryLockWithTimeOutAndProtectedBlock;
  std::function<void(std::function<void(bool)>)> tryLockWithProtectedBlock;
  std::function<void()> unlockBlock;
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
