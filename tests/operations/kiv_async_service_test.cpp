#include "kivi/operations/kiv_async_service.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "kivi/base/recursive_lock.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/doubles/mock_kiv_ns_operation_queue.h"
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

// The one-argument constructors make a serial queue.
TEST(KivAsyncServices, MakeTheirQueueWithNameAndLimit) {
  expectRealQueue(KivAsyncServiceObjC("Q").operationQueue(), "Q", 1);
  expectRealQueue(KivAtomicWorkflowService("W").operationQueue(), "W", 1);
  expectRealQueue(KivAsyncServiceObjC("", 4).operationQueue(), "", 4);
  expectRealQueue(KivAsyncService("P", -1).operationQueue(), "P", -1);
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

// Every entry point is reached through the base class, and the service's own
// operations go through the subclass's overrides: end() releases through the
// overridden start(), and the parked list is the one the subclass answers.
class WorkflowSubclass : public KivAtomicWorkflowService {
 public:
  using KivAtomicWorkflowService::KivAtomicWorkflowService;
  void startAtomicWorkflowWithOperation(const OperationPtr& operation) override {
    calls.push_back("start " + operation->name());
    KivAtomicWorkflowService::startAtomicWorkflowWithOperation(operation);
  }
  void endAtomicWorkflow() override {
    calls.push_back("end");
    KivAtomicWorkflowService::endAtomicWorkflow();
  }
  void cancelAllPendingOperations() override {
    calls.push_back("cancel");
    KivAtomicWorkflowService::cancelAllPendingOperations();
  }
  void enumeratePendingOperationsUsingBlock(
      const std::function<void(const OperationPtr&, std::uint64_t, bool*)>& block) override {
    calls.push_back("enumerate");
    KivAtomicWorkflowService::enumeratePendingOperationsUsingBlock(block);
  }
  std::shared_ptr<PendingOperationList> pendingOperations() const override { return parked; }

  Names calls;
  const std::shared_ptr<PendingOperationList> parked = std::make_shared<PendingOperationList>();
};

TEST_F(AtomicWorkflowWithMockQueue, SubclassOverridesAreReachedFromTheServiceItself) {
  auto subclass = std::make_shared<WorkflowSubclass>("sub");
  subclass->setOperationQueue(queue_);
  KivAtomicWorkflowService& service = *subclass;
  for (const char* tag : {"A", "B", "C"}) service.startAtomicWorkflowWithOperation(op(tag));
  EXPECT_EQ(subclass->parked->size(), 2u);
  service.cancelAllPendingOperations();
  service.enumeratePendingOperationsUsingBlock([](const OperationPtr&, std::uint64_t, bool*) {});
  service.endAtomicWorkflow();
  EXPECT_EQ(subclass->calls,
            (Names{"start A", "start B", "start C", "cancel", "enumerate", "end", "start B"}));
  EXPECT_EQ(takeHanded(), (Names{"A", "B"}));
  EXPECT_EQ(cancels_, (Names{"B", "C"}));
  EXPECT_EQ(subclass->parked->size(), 1u);
}

// Each setter announces its property, the workflow operations included (they
// set the flag through its setter); valueForKey answers for every property.
TEST_F(AtomicWorkflowWithMockQueue, SettersAnnounceTheirPropertyToObservers) {
  const auto recorder = testing::Recorder::watch(
      *service_,
      {"operationQueue", "isAtomicWorkflowInProgress", "atomicWorkFlowLock", "pendingOperations"},
      KeyValueObservingOptionPrior | KeyValueObservingOptionOld | KeyValueObservingOptionNew);
  using Events = std::vector<testing::Event>;
  const auto announced = [](const std::string& key, int times = 1) {
    Events events;
    for (int i = 0; i < times; ++i) events.insert(events.end(), {{"will", key}, {"did", key}});
    return events;
  };
  const std::string flag = "isAtomicWorkflowInProgress";
  std::vector<Value> flagValues;  // every "new" value of the flag, in order
  recorder->onNote = [&](const testing::Note& note) {
    if (!note.prior && note.key == flag) flagValues.push_back(note.change.at(KeyValueChangeNewKey));
  };

  auto other = std::make_shared<MockKivNSOperationQueue>();
  service_->setOperationQueue(other);
  EXPECT_EQ(recorder->takeEvents(), announced("operationQueue"));
  EXPECT_EQ(service_->valueForKey("operationQueue"), Value(other));
  service_->setOperationQueue(queue_);
  ASSERT_EQ(recorder->count(), 2u);
  EXPECT_EQ(recorder->changes().back().second.at(KeyValueChangeOldKey), Value(other));
  EXPECT_EQ(recorder->changes().back().second.at(KeyValueChangeNewKey), Value(queue_));
  recorder->takeEvents();

  start("A");
  EXPECT_EQ(recorder->takeEvents(), announced(flag));
  EXPECT_EQ(service_->valueForKey(flag), Value(true));
  start("B");
  EXPECT_EQ(recorder->takeEvents(), Events{}) << "parking sets nothing";
  service_->endAtomicWorkflow();  // false, then true again for B
  EXPECT_EQ(recorder->takeEvents(), announced(flag, 2));
  service_->endAtomicWorkflow();
  service_->setIsAtomicWorkflowInProgress(false);  // the same value is announced too
  EXPECT_EQ(recorder->takeEvents(), announced(flag, 2));
  EXPECT_EQ(flagValues, (std::vector<Value>{Value(true), Value(false), Value(true), Value(false),
                                            Value(false)}));

  auto lock = std::make_shared<RecursiveLock>();
  service_->setAtomicWorkFlowLock(lock);
  service_->setAtomicWorkFlowLock(nullptr);  // refused: nothing to announce
  EXPECT_EQ(recorder->takeEvents(), announced("atomicWorkFlowLock"));
  EXPECT_EQ(service_->valueForKey("atomicWorkFlowLock"), Value(lock));

  auto list = std::make_shared<PendingOperationList>(PendingOperationList{op("C"), op("D")});
  service_->setPendingOperations(list);
  service_->setPendingOperations(nullptr);
  EXPECT_EQ(recorder->newValues("pendingOperations"),  // the prior notification carries none
            (std::vector<Value>{Value(), Value(Array{op("C"), op("D")})}));
  EXPECT_EQ(recorder->takeEvents(), announced("pendingOperations"));
  EXPECT_EQ(service_->valueForKey("pendingOperations"), Value(Array{op("C"), op("D")}));

  auto plain = std::make_shared<KivAsyncServiceObjC>("plain");
  const auto watcher =
      testing::Recorder::watch(*plain, {"operationQueue"}, KeyValueObservingOptionNew);
  plain->setOperationQueue(nullptr);
  EXPECT_EQ(watcher->newValues("operationQueue"), std::vector<Value>{Value()});
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
