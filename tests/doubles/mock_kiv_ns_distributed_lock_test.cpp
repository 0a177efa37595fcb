#include "kivi/doubles/mock_kiv_ns_distributed_lock.h"

#include <gtest/gtest.h>

#include <vector>

namespace kivi {
namespace {

TEST(MockKivNSDistributedLock, DefaultsAndCallbacks) {
  MockKivNSDistributedLock lock;
  KivNSDistributionLockProtocol& seam = lock;
  std::vector<double> seen;
  std::vector<bool> told;
  const auto tell = [&](bool taken) { told.push_back(taken); };
  EXPECT_TRUE(seam.tryLock() && seam.tryLock(1.0) && seam.tryLock(1.0, 0.5));
  seam.tryLock(1.0, tell);
  seam.tryLock(tell);
  EXPECT_TRUE(told.empty()) << "protected work ran without a callback";

  lock.tryLockBlock = [] { return false; };
  lock.tryLockWithTimeOutBlock = [&](double t) { return seen.push_back(t), false; };
  lock.tryLockWithTimeOutAndResolutionBlock = [&](double t, double r) {
    return seen.insert(seen.end(), {t, r}), false;
  };
  lock.tryLockWithTimeOutAndProtectedBlock = [&](double t, std::function<void(bool)> work) {
    seen.push_back(t);
    work(false);
  };
  lock.tryLockWithProtectedBlock = [](std::function<void(bool)> work) { work(true); };
  lock.unlockBlock = [&] { seen.push_back(-1); };
  lock.breakLockBlock = [&] { seen.push_back(-2); };
  EXPECT_FALSE(seam.tryLock() || seam.tryLock(2.5) || seam.tryLock(3.0, 0.25));
  seam.tryLock(4.0, tell);
  seam.tryLock(tell);
  seam.unlock();
  seam.breakLock();
  EXPECT_EQ(seen, (std::vector<double>{2.5, 3.0, 0.25, 4.0, -1, -2}));
  EXPECT_EQ(told, (std::vector<bool>{false, true}));
}

}  // namespace
}  // namespace kivi
