#include "kivi/timing/kiv_key_value_observer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/doubles/mock_dispatch_queue.h"
#include "test_support.h"

namespace kivi {
namespace {

// An object with one observable property, "level".
class Gauge : public Object {
 public:
  void setLevel(int level) {
    willChangeValueForKey("level");
    level_ = level;
    didChangeValueForKey("level");
  }
  Value valueForKey(std::string_view key) const override {
    return key == "level" ? Value(level_.load()) : Value();
  }
  // Removals by (observer, key, context), recorded before they are made.
  using Object::removeObserver;
  void removeObserver(const Object* observer, std::string_view key, void* context) override {
    removals.emplace_back(observer, std::string(key), context);
    Object::removeObserver(observer, key, context);
  }
  std::vector<std::tuple<const Object*, std::string, void*>> removals;

 private:
  std::atomic<int> level_{0};
};

struct Change {
  Value before, after;
  void* context;
  std::string block;
};

// Collects the callbacks' arguments; read after the queue has been flushed.
struct Changes {
  std::mutex mutex;
  std::vector<Change> list;
  KivKeyValueObserver::OnChangeBlock block(std::string name, DispatchQueuePtr queue) {
    return [this, name, queue](const Value& before, const Value& after, void* context) {
      EXPECT_TRUE(queue->isCurrent());
      std::lock_guard lock(mutex);
      list.push_back({before, after, context, name});
    };
  }
  std::vector<Change> take() {
    std::lock_guard lock(mutex);
    return std::exchange(list, {});
  }
};

// A second registration replaces the callback and the queue but keeps the
// one observation with the first options and context.
TEST(KivKeyValueObserver, ASecondRegistrationReplacesOnlyTheCallbackAndQueue) {
  auto gauge = std::make_shared<Gauge>();
  auto first = DispatchQueue::create("kivi.tests.kvo.first");
  auto second = DispatchQueue::create("kivi.tests.kvo.second");
  Changes changes;
  int contextA = 0, contextB = 0;
  auto observer = KivKeyValueObserver::create(gauge, "level");
  EXPECT_FALSE(observer->isObserverAdded());
  EXPECT_EQ(observer->target(), gauge);
  observer->registerObserverWithOptions(KeyValueObservingOptionNew | KeyValueObservingOptionOld,
                                        changes.block("first", first), first, &contextA);
  gauge->setLevel(1);
  first->sync([] {});
  observer->registerObserverWithOptions(KeyValueObservingOptionNew, changes.block("second", second),
                                        second, &contextB);
  EXPECT_TRUE(observer->isObserverAdded());
  EXPECT_EQ(observer->onChangeQueue(), second);
  gauge->setLevel(2);
  first->sync([] {});
  second->sync([] {});  // both flushed: nothing more is on its way
  auto seen = changes.take();
  ASSERT_EQ(seen.size(), 2u);
  EXPECT_EQ(seen[0].block, "first");
  EXPECT_EQ(seen[0].before, Value(0));
  EXPECT_EQ(seen[0].after, Value(1));
  EXPECT_EQ(seen[1].block, "second");
  EXPECT_EQ(seen[1].before, Value(1));  // the first registration's Old option
  EXPECT_EQ(seen[1].after, Value(2));
  EXPECT_EQ(seen[1].context, &contextA);
}

// With New only, the old value is null; Initial comes back in during the
// registration; the default queue is the global user-interactive one.
TEST(KivKeyValueObserver, NewOnlyInitialAndTheDefaultQueue) {
  auto gauge = std::make_shared<Gauge>();
  gauge->setLevel(5);
  const auto& user = DispatchQueue::global(DispatchQoS::QoSClass::userInteractive);
  Changes changes;
  auto arrived = std::make_shared<testing::Signal>();
  auto observer = KivKeyValueObserver::create(gauge, "level");
  auto record = changes.block("default", user);
  observer->registerObserverWithOptions(
      KeyValueObservingOptionNew | KeyValueObservingOptionInitial,
      [record, arrived](const Value& before, const Value& after, void* context) {
        record(before, after, context);
        arrived->notify();
      },
      nullptr, nullptr);
  EXPECT_EQ(observer->onChangeQueue(), user);
  ASSERT_TRUE(arrived->wait());
  gauge->setLevel(6);
  ASSERT_TRUE(arrived->wait(2));
  auto seen = changes.take();
  ASSERT_EQ(seen.size(), 2u);
  for (const auto& change : seen) EXPECT_TRUE(change.before.isNull());
  EXPECT_TRUE(seen[0].after == Value(5) || seen[1].after == Value(5));  // may arrive out of order
  EXPECT_TRUE(seen[0].after == Value(6) || seen[1].after == Value(6));
}

// Releasing the observer removes its observation (although it was added
// with a context); the target outlives it and later changes reach nothing.
// The observer kept the target alive until then.
TEST(KivKeyValueObserver, ReleaseRemovesTheObservation) {
  auto gauge = std::make_shared<Gauge>();
  std::weak_ptr<Gauge> weakGauge = gauge;
  auto mock = std::make_shared<MockDispatchQueue>();
  int delivered = 0;
  mock->asyncBlock = [&](const DispatchGroupPtr&, DispatchQoS, DispatchWorkItemFlags,
                         std::function<void()> work) {
    ++delivered;
    work();
  };
  int context = 0, calls = 0;
  auto observer = KivKeyValueObserver::create(gauge, "level");
  observer->registerObserverWithOptions(
      KeyValueObservingOptionNew, [&](const Value&, const Value&, void*) { ++calls; }, mock,
      &context);
  gauge->setLevel(1);
  EXPECT_EQ(delivered, 1);
  EXPECT_EQ(calls, 1);
  gauge.reset();
  EXPECT_FALSE(weakGauge.expired());
  gauge = weakGauge.lock();
  const Object* address = observer.get();
  observer.reset();
  EXPECT_EQ(gauge->removals, (std::vector<std::tuple<const Object*, std::string, void*>>{
                                 {address, "level", &context}}));  // the context it was added with
  EXPECT_FALSE(gauge->hasObservers("level"));
  gauge->setLevel(2);
  EXPECT_EQ(delivered, 1);

  // No callback: the change is dropped; not owned by a shared_ptr or
  // without a target: nothing is observed.
  auto silent = KivKeyValueObserver::create(gauge, "level");
  silent->registerObserverWithOptions(KeyValueObservingOptionNew, nullptr, mock, nullptr);
  gauge->setLevel(3);
  EXPECT_EQ(delivered, 1);
  KivKeyValueObserver onStack(gauge, "level");
  onStack.registerObserverWithOptions(KeyValueObservingOptionNew, nullptr, mock, nullptr);
  EXPECT_FALSE(onStack.isObserverAdded());
  auto noTarget = KivKeyValueObserver::create(nullptr, "level");
  noTarget->registerObserverWithOptions(KeyValueObservingOptionNew, nullptr, mock, nullptr);
  EXPECT_FALSE(noTarget->isObserverAdded());
}

}  // namespace
}  // namespace kivi
