#include "kivi/doubles/mock_kiv_ns_distributed_lock.h"

#include <utility>

namespace kivi {

bool MockKivNSDistributedLock::tryLock() { return tryLockBlock ? tryLockBlock() : true; }

bool MockKivNSDistributedLock::tryLock(double timeout) {
  return tryLockWithTimeOutBlock ? tryLockWithTimeOutBlock(timeout) : true;
}

bool MockKivNSDistributedLock::tryLock(double timeout, double resolution) {
  return tryLockWithTimeOutAndResolutionBlock
             ? tryLockWithTimeOutAndResolutionBlock(timeout, resolution)
             : true;
}

void MockKivNSDistributedLock::tryLock(double timeout, std::function<void(bool)> protectedBlock) {
  if (tryLockWithTimeOutAndProtectedBlock) {
    tryLockWithTimeOutAndProtectedBlock(timeout, std::move(protectedBlock));
  }
}

void MockKivNSDistributedLock::tryLock(std::function<void(bool)> protectedBlock) {
  if (tryLockWithProtectedBlock) tryLockWithProtectedBlock(std::move(protectedBlock));
}

void MockKivNSDistributedLock::unlock() {
  if (unlockBlock) unlockBlock();
}

void MockKivNSDistributedLock::breakLock() {
  if (breakLockBlock) breakLockBlock();
}

}  // namespace kivi
