#include "kivi/operations/kiv_async_service.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "kivi/doubles/mock_kiv_ns_operation_queue.h"
#include "kivi/dispatch/operation_queue.h"
#include "operations/async_test_support.h"

namespace kivi {
namespace {

using testing::Finish;
using testing::FlagsProbe;
using Names = std::vector<std::string>;

void expectRealQueue(const std::shared_ptr<OperationQueueProtocol>& queue, const std::string& name,
                     std::int64_t limit) {
  ASSERT_NE(std::dynamic_pointer_cast<OperationQueue>(queue), nullptr);
  EXPECT_EQ(queue->name(), name);
  EXPECT_EQ(queue->maxConcurrentOperationCount(), limit);
}

TEST(KivAsyncServices, MakeTheirQueueWithNameAndLimit) {
  expectRealQueue(KivAsyncServiceObjC("Q").operationQueue(), "Q", 1);
  const std::pair<const char*, std::int64_t> cases[] = {{"Q", 4}, {"", -1}, {"idle", 0}, {"s", 1}};
  for (auto [name, limit] : cases) {
    SCOPED_TRACE(std::string("\"") + name + "\", " + std::to_string(limit));
    expectRealQueue(KivAsyncServiceObjC(name, limit).operationQueue(), name, limit);
    expectRealQueue(KivAsyncService(name, limit).operationQueue(), name, limit);
  }
  expectRealQueue(KivAtomicWorkflowService("Q").operationQueue(), "Q", 1);
}

class AtomicWorkflowWithMockQueue : public ::testing::Test {
 protected:
  void SetUp() override {
    queue_->addOperationBlock = [this](const OperationPtr& op) {
      handed_.push_back(op ? op->name() : "<null>");
    };
    queue_->addOperationsBlock = [](auto&, bool) { ADD_FAILURE() << "addOperations called"; };
    queue_->cancelAllOperationsBlock = [] { ADD_FAILURE() << "cancelAllOperations called"; };
    service_->setOperationQueue(queue_);
  }
  // The probe named `tag`, made on first use; "" is the null operation.
  OperationPtr op(const std::string& tag) {
    if (tag.empty()) return nullptr;
    auto& probe = ops_[tag];
    if (!probe) {
      probe = std::make_shared<FlagsProbe>(Finish::manual, tag);
      probe->onCancel = [this](Operation& p) { cancels_.push_back(p.name()); };
    }
    return probe;
  }
  void start(const std::string& tag) { service_->startAtomicWorkflowWithOperation(op(tag)); }
  Names takeHanded() { return std::exchange(handed_, {}); }
  Names pending() const {
    Names names;
    for (const auto& op : *service_->pendingOperations()) names.push_back(op->name());
    return names;
  }

  std::shared_ptr<KivAtomicWorkflowService> service_ =
      std::make_shared<KivAtomicWorkflowService>("workflow");
  std::shared_ptr<MockKivNSOperationQueue> queue_ = std::make_shared<MockKivNSOperationQueue>();
  std::map<std::string, std::shared_ptr<FlagsProbe>> ops_;
  Names handed_, cancels_;
};

TEST_F(AtomicWorkflowWithMockQueue, StateTable) {
  struct Step {
    const char* action;  // "start" (tag "" = null), "end", or "busy" (sets the flag by hand)
    const char* tag;
    Names handed, pending;
    bool busy;
  };
  const Step steps[] = {
      {"start", "", {}, {}, false},  // null refused while idle
      {"start", "A", {"A"}, {}, true},
      {"start", "B", {}, {"B"}, true},
      {"start", "C", {}, {"B", "C"}, true},
      {"start", "", {}, {"B", "C"}, true},  // null refused while busy
      {"end", "", {"B"}, {"C"}, true},
      {"end", "", {"C"}, {}, true},  // B never finished: end() alone releases
      {"end", "", {}, {}, false},
      {"end", "", {}, {}, false},
      {"busy", "", {}, {}, true},
      {"end", "", {}, {}, false},  // idle, nothing parked: only clears the flag
  };
  int index = 0;
  for (const Step& step : steps) {
    SCOPED_TRACE("step " + std::to_string(index++) + ": " + step.action + " " + step.tag);
    const std::string action = step.action;
    if (action == "start") start(step.tag);
    if (action == "end") service_->endAtomicWorkflow();
    if (action == "busy") service_->setIsAtomicWorkflowInProgress(true);
    EXPECT_EQ(takeHanded(), step.handed);
    EXPECT_EQ(pending(), step.pending);
    EXPECT_EQ(service_->isAtomicWorkflowInProgress(), step.busy);
  }
  for (auto& [tag, probe] : ops_) EXPECT_EQ(probe->starts, 0) << tag << ": the mock runs nothing";
}

TEST_F(AtomicWorkflowWithMockQueue, EnumerateAndCancelParkedOperations) {
  std::vector<std::pair<std::string, std::uint64_t>> seen;
  std::string stopAt;
  auto visit = [&](const OperationPtr& op, std::uint64_t index, bool* stop) {
    seen.emplace_back(op->name(), index);
    *stop = op->name() == stopAt;
  };
  service_->enumeratePendingOperationsUsingBlock(visit);
  EXPECT_TRUE(seen.empty());
  for (const char* tag : {"A", "B", "C"}) start(tag);
  service_->enumeratePendingOperationsUsingBlock(visit);
  EXPECT_EQ(seen, (decltype(seen){{"B", 0}, {"C", 1}}));
  stopAt = "B";
  service_->enumeratePendingOperationsUsingBlock(visit);
  EXPECT_EQ(seen.size(), 3u) << "C visited after *stop";

  int busySeen = 0;  // the callback calls back into the service on the same thread
  ASSERT_TRUE(testing::returnsWithin([&] {
    service_->enumeratePendingOperationsUsingBlock([&](const OperationPtr&, std::uint64_t, bool*) {
      busySeen += service_->isAtomicWorkflowInProgress();
      service_->cancelAllPendingOperations();
    });
  })) << "re-entering the service from the enumeration deadlocked";
  EXPECT_EQ(busySeen, 2);
  EXPECT_EQ(cancels_, (Names{"B", "C", "B", "C"})) << "parked only, oldest first";
  EXPECT_EQ(pending(), (Names{"B", "C"})) << "cancelled operations stay parked";
  EXPECT_TRUE(service_->isAtomicWorkflowInProgress());
  EXPECT_EQ(takeHanded(), Names{"A"});
  service_->endAtomicWorkflow();
  EXPECT_EQ(takeHanded(), Names{"B"}) << "a cancelled parked operation still reaches the queue";
}

// With the real queue, parked operations stay out of it until end() releases
// them, one at a time and in arrival order.
TEST(AtomicWorkflowWithRealQueue, ParkedOperationsStartOnlyWhenReleased) {
  auto service = std::make_shared<KivAtomicWorkflowService>("real");
  std::vector<std::shared_ptr<FlagsProbe>> ops;
  for (const char* tag : {"A", "B", "C"})
    ops.push_back(std::make_shared<FlagsProbe>(Finish::manual, tag));
  for (const auto& op : ops) service->startAtomicWorkflowWithOperation(op);
  auto queue = service->operationQueue();
  for (std::size_t i = 0; i < ops.size(); ++i) {
    SCOPED_TRACE("workflow " + ops[i]->name());
    ASSERT_TRUE(ops[i]->startReturned.wait());
    EXPECT_EQ(queue->operationCount(), 1u) << "parked operations must not be in the queue";
    EXPECT_EQ(service->pendingOperations()->size(), ops.size() - 1 - i);
    for (std::size_t later = i + 1; later < ops.size(); ++later) EXPECT_EQ(ops[later]->starts, 0);
    ops[i]->coreCompleteOperation();
    service->endAtomicWorkflow();
  }
  EXPECT_FALSE(service->isAtomicWorkflowInProgress());
  for (const auto& op : ops) EXPECT_EQ(op->starts, 1) << op->name();
}

}  // namespace
}  // namespace kivi
