#include <gtest/gtest.h>

#include <atomic>
#include <memory>

#include "kivi/operations/kiv_url_session_task_operation.h"

namespace kivi {
namespace {

// A task that belongs to no session and counts the cancel() calls that came
// before, and after, the operation read as cancelled.
class TaskDouble : public URLSessionTask {
 public:
  explicit TaskDouble(const Operation& operation) : operation_(operation) {}
  void cancel() override { ++(operation_.isCancelled() ? cancels : cancelsBeforeFlag); }
  std::atomic<int> cancels{0}, cancelsBeforeFlag{0};

 private:
  const Operation& operation_;
};

template <class Op>
class UrlSessionTaskOperationTest : public ::testing::Test {};
using Variants = ::testing::Types<KivUrlSessionTaskOperationObjC, KivUrlSessionTaskOperation>;
TYPED_TEST_SUITE(UrlSessionTaskOperationTest, Variants);

TYPED_TEST(UrlSessionTaskOperationTest, CancelSetsTheFlagThenReachesTheStoredTask) {
  const auto session = URLSession::sessionWithConfiguration(URLSessionConfiguration{});
  auto op = std::make_shared<TypeParam>(session);
  const auto stored = [&] {
    if constexpr (std::is_same_v<TypeParam, KivUrlSessionTaskOperation>)
      return op->urlSessionTask();
    else
      return op->sessionTaskOperationHandle();
  };
  EXPECT_EQ(stored(), nullptr);
  auto task = std::make_shared<TaskDouble>(*op);
  if constexpr (std::is_same_v<TypeParam, KivUrlSessionTaskOperation>)
    op->setUrlSessionTask(task);
  else
    op->setSessionTaskOperationHandle(task);
  op->cancel();
  op->cancel();
  EXPECT_EQ(task->cancels, 2);
  EXPECT_EQ(task->cancelsBeforeFlag, 0);
  EXPECT_EQ(stored(), task);
  EXPECT_TRUE(op->isCancelled());
  // Cancelling a task operation does not start or finish it.
  EXPECT_TRUE(op->isReady());
  EXPECT_FALSE(op->isExecuting() || op->isFinished());
}

}  // namespace
}  // namespace kivi
