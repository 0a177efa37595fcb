#include "kivi/doubles/mock_dispatch_queue.h"

#include <gtest/gtest.h>

#include <memory>
#include <thread>
#include <vector>

#include "test_support.h"

namespace kivi {
namespace {

using QoSClass = DispatchQoS::QoSClass;

// Without callbacks nothing runs, through any operation; with one, the
// callback gets the arguments unchanged, including the defaults the
// protocol's shorter forms fill in.
TEST(MockDispatchQueue, RunsNothingUnlessACallbackDoes) {
  auto mock = std::make_shared<MockDispatchQueue>();
  std::shared_ptr<KivDispatchQueueProtocol> queue = mock;
  int ran = 0;
  auto work = [&ran] { ++ran; };
  auto item = std::make_shared<DispatchWorkItem>(work);
  auto group = std::make_shared<DispatchGroup>();
  const DispatchTime later = DispatchClock::system()->now();
  queue->async(work);
  queue->async(group, DispatchQoS::utility, DispatchWorkItemFlags::barrier, work);
  queue->async(item);
  queue->async(group, item);
  queue->asyncAfter(later, work);
  queue->asyncAfter(later, item);
  queue->sync(work);
  queue->sync(item);
  EXPECT_EQ(ran, 0);
  EXPECT_EQ(group->wait(DispatchTime::min()), DispatchTimeoutResult::success);  // never entered

  const auto caller = std::this_thread::get_id();
  mock->syncBlock = [&](const std::function<void()>& w) {
    EXPECT_EQ(std::this_thread::get_id(), caller);
    w();
  };
  queue->sync(work);
  EXPECT_EQ(ran, 1);

  std::vector<std::tuple<DispatchGroupPtr, DispatchQoS, DispatchWorkItemFlags>> asyncs;
  mock->asyncBlock = [&](const DispatchGroupPtr& g, DispatchQoS qos, DispatchWorkItemFlags flags,
                         std::function<void()> w) {
    asyncs.emplace_back(g, qos, flags);
    w();
  };
  queue->async(work);
  queue->async(DispatchQoS::background, work);
  queue->async(group, DispatchWorkItemFlags::barrier, work);
  ASSERT_EQ(asyncs.size(), 3u);
  EXPECT_EQ(asyncs[0], std::make_tuple(nullptr, DispatchQoS::unspecified, DispatchWorkItemFlags{}));
  EXPECT_EQ(asyncs[1], std::make_tuple(nullptr, DispatchQoS::background, DispatchWorkItemFlags{}));
  EXPECT_EQ(asyncs[2],
            std::make_tuple(group, DispatchQoS::unspecified, DispatchWorkItemFlags::barrier));
  EXPECT_EQ(ran, 4);

  DispatchTime seen{};
  mock->asyncAfterWithWorkItemBlock = [&](DispatchTime deadline, const DispatchWorkItemPtr& i) {
    seen = deadline;
    i->perform();
  };
  queue->asyncAfter(later, item);
  EXPECT_EQ(seen, later);
  EXPECT_EQ(ran, 5);
}

// global(qos): a new real serial "MockQueue" each time, unless the
// class-level callback answers instead.
TEST(MockDispatchQueue, GlobalAnswersAFreshMockQueueOrTheCallbacks) {
  auto first = MockDispatchQueue::global(QoSClass::utility);
  auto second = MockDispatchQueue::global(QoSClass::utility);
  ASSERT_TRUE(first && second);
  EXPECT_NE(first, second);
  EXPECT_EQ(first->label(), "MockQueue");
  EXPECT_TRUE(first->isSerial());
  EXPECT_EQ(first->qos(), DispatchQoS::unspecified);
  bool ran = false;
  first->sync([&] { ran = first->isCurrent(); });  // a real queue
  EXPECT_TRUE(ran);

  auto chosen = DispatchQueue::create("kivi.tests.chosen");
  std::vector<QoSClass> asked;
  MockDispatchQueue::globalQueuewithQOSBlock = [&](QoSClass qos) {
    asked.push_back(qos);
    return chosen;
  };
  EXPECT_EQ(MockDispatchQueue::global(QoSClass::background), chosen);
  MockDispatchQueue::globalQueuewithQOSBlock = nullptr;
  EXPECT_EQ(asked, std::vector<QoSClass>{QoSClass::background});
  EXPECT_NE(MockDispatchQueue::global(QoSClass::background), chosen);
}

}  // namespace
}  // namespace kivi
