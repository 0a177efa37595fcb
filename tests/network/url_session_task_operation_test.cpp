#include <gtest/gtest.h>

#include <atomic>
#include <memory>

#include "kivi/operations/kiv_url_session_task_operation.h"

namespace kivi {
namespace {

// A task that belongs to no session and notes each cancel(), and whether the
// operation already read as cancelled when it came.
class TaskDouble : public URLSessionTask {
 public:
  explicit TaskDouble(const Operation& operation) : operation_(operation) {}
  void cancel() override {
    ++cancels;
    if (!operation_.isCancelled()) ++cancelsBeforeFlag;
  }
  std::atomic<int> cancels{0}, cancelsBeforeFlag{0};

 private:
  const Operation& operation_;
};

// The two variants, behind one set of accessors.
URLSessionTaskPtr storedTask(const KivUrlSessionTaskOperationObjC& op) {
  return op.sessionTaskOperationHandle();
}
URLSessionTaskPtr storedTask(const KivUrlSessionTaskOperation& op) { return op.urlSessionTask(); }
void storeTask(KivUrlSessionTaskOperationObjC& op, URLSessionTaskPtr task) {
  op.setSessionTaskOperationHandle(std::move(task));
}
void storeTask(KivUrlSessionTaskOperation& op, URLSessionTaskPtr task) {
  op.setUrlSessionTask(std::move(task));
}
bool isReadyState(const KivUrlSessionTaskOperationObjC& op) {
  return op.isReady() && !op.isExecuting() && !op.isFinished();
}
bool isReadyState(const KivUrlSessionTaskOperation& op) {
  return op.state() == KivAsyncOperation::State::ready && op.isReady();
}

template <class Op>
class UrlSessionTaskOperationTest : public ::testing::Test {
 protected:
  URLSessionPtr session =
      URLSession::sessionWithConfiguration(URLSessionConfiguration::defaultSessionConfiguration());
  std::shared_ptr<Op> op = std::make_shared<Op>(session);
};
using Variants = ::testing::Types<KivUrlSessionTaskOperationObjC, KivUrlSessionTaskOperation>;
TYPED_TEST_SUITE(UrlSessionTaskOperationTest, Variants);

TYPED_TEST(UrlSessionTaskOperationTest, StartsWithTheSessionOnlyAndReady) {
  EXPECT_EQ(this->op->urlSession(), this->session);
  EXPECT_EQ(this->op->urlRequest(), std::nullopt);
  EXPECT_EQ(this->op->urlResponse(), nullptr);
  EXPECT_EQ(storedTask(*this->op), nullptr);
  EXPECT_TRUE(isReadyState(*this->op));
  EXPECT_FALSE(this->op->isCancelled());
}

TYPED_TEST(UrlSessionTaskOperationTest, CancelWithoutATaskOnlySetsTheFlag) {
  this->op->cancel();
  EXPECT_TRUE(this->op->isCancelled());
  EXPECT_TRUE(isReadyState(*this->op));
  EXPECT_EQ(storedTask(*this->op), nullptr);
}

TYPED_TEST(UrlSessionTaskOperationTest, CancelReachesTheStoredTaskAfterTheFlag) {
  auto task = std::make_shared<TaskDouble>(*this->op);
  storeTask(*this->op, task);
  this->op->cancel();
  EXPECT_EQ(task->cancels, 1);
  EXPECT_EQ(task->cancelsBeforeFlag, 0);
  this->op->cancel();
  EXPECT_EQ(task->cancels, 2);
  EXPECT_TRUE(isReadyState(*this->op));
  EXPECT_EQ(storedTask(*this->op), task);
}

}  // namespace
}  // namespace kivi
