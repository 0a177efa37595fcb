#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include "kivi/base/object.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::Note;
using testing::Recorder;
constexpr auto kNew = KeyValueObservingOptionNew;
constexpr auto kOld = KeyValueObservingOptionOld;
constexpr auto kInitial = KeyValueObservingOptionInitial;
constexpr auto kPrior = KeyValueObservingOptionPrior;

// An object with freely named observable properties.
class Subject : public Object {
 public:
  void set(const std::string& key, Value value) {
    willChangeValueForKey(key);
    store(key, std::move(value));
    didChangeValueForKey(key);
  }
  void store(const std::string& key, Value value) {
    std::lock_guard lock(mutex_);
    values_[key] = std::move(value);
  }
  Value valueForKey(std::string_view key) const override {
    std::lock_guard lock(mutex_);
    const auto it = values_.find(key);
    return it == values_.end() ? Value() : it->second;
  }

 private:
  mutable std::mutex mutex_;
  Dictionary values_;
};

TEST(KeyValueObserving, OptionsShapeTheChangeDictionary) {
  const struct {
    KeyValueObservingOptions options;
    std::vector<Dictionary> expected;
  } cases[] = {
      {0, {Dictionary{{"kind", 1}}}},
      {kNew, {Dictionary{{"kind", 1}, {"new", 2}}}},
      {kOld, {Dictionary{{"kind", 1}, {"old", 1}}}},
      {kNew | kOld, {Dictionary{{"kind", 1}, {"new", 2}, {"old", 1}}}},
      {kPrior, {Dictionary{{"kind", 1}, {"notificationIsPrior", true}}, Dictionary{{"kind", 1}}}},
      {kPrior | kOld | kNew,
       {Dictionary{{"kind", 1}, {"old", 1}, {"notificationIsPrior", true}},
        Dictionary{{"kind", 1}, {"new", 2}, {"old", 1}}}},
      {kInitial | kNew, {Dictionary{{"kind", 1}, {"new", 1}}, Dictionary{{"kind", 1}, {"new", 2}}}},
  };
  int context = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.options);
    auto subject = std::make_shared<Subject>();
    subject->store("a", 1);
    auto recorder = std::make_shared<Recorder>();
    subject->addObserver(recorder, "a", c.options, &context);
    subject->set("a", 2);
    subject->set("ab", 3);  // keys match as whole strings
    std::vector<Dictionary> changes;
    for (const Note& note : recorder->notes()) {
      EXPECT_TRUE(note.key == "a" && note.object == subject.get() && note.context == &context);
      changes.push_back(note.change);
    }
    EXPECT_EQ(changes, c.expected);
  }
}

TEST(KeyValueObserving, NestedChangesOfTwoKeysPairOldValues) {
  auto subject = std::make_shared<Subject>();
  subject->store("a", 1);
  subject->store("b", 10);
  auto recorder = Recorder::watch(*subject, {"a", "b"}, kPrior | kOld | kNew);
  subject->willChangeValueForKey("a");
  subject->willChangeValueForKey("b");
  subject->store("a", 2);
  subject->store("b", 20);
  subject->didChangeValueForKey("b");
  subject->didChangeValueForKey("a");
  EXPECT_EQ(recorder->changes(),
            (std::vector<std::pair<std::string, Dictionary>>{
                {"a", {{"kind", 1}, {"old", 1}, {"notificationIsPrior", true}}},
                {"b", {{"kind", 1}, {"old", 10}, {"notificationIsPrior", true}}},
                {"b", {{"kind", 1}, {"old", 10}, {"new", 20}}},
                {"a", {{"kind", 1}, {"old", 1}, {"new", 2}}}}));
}

// Registrations of observers destroyed while registered are skipped and forgotten.
TEST(KeyValueObserving, EachRegistrationCountsAndRemovalTakesTheMostRecent) {
  auto subject = std::make_shared<Subject>();
  auto recorder = std::make_shared<Recorder>(), gone = std::make_shared<Recorder>();
  int c1 = 0, c2 = 0;
  const auto contextsOfOneChange = [&] {
    const std::size_t before = recorder->count();
    subject->set("a", 0);
    std::vector<void*> contexts;
    const auto notes = recorder->notes();
    for (std::size_t i = before; i < notes.size(); ++i) contexts.push_back(notes[i].context);
    return contexts;
  };
  subject->addObserver(gone, "a", kNew, nullptr);
  subject->addObserver(recorder, "a", kNew, &c1);
  subject->addObserver(recorder, "a", kNew, &c2);
  gone.reset();
  EXPECT_EQ(contextsOfOneChange(), (std::vector<void*>{&c1, &c2}));
  subject->removeObserver(recorder.get(), "a");
  EXPECT_EQ(contextsOfOneChange(), (std::vector<void*>{&c1}));
  subject->addObserver(recorder, "a", kNew, &c2);
  subject->addObserver(recorder, "a", kNew, &c1);
  subject->removeObserver(recorder.get(), "a", &c1);
  EXPECT_EQ(contextsOfOneChange(), (std::vector<void*>{&c1, &c2}));
  subject->removeObserver(recorder.get(), "a", &c2);
  subject->removeObserver(recorder.get(), "a", &c2);  // unknown pairs are ignored
  subject->removeObserver(recorder.get(), "zzz");
  EXPECT_TRUE(subject->hasObservers("a"));
  subject->removeObserver(recorder.get(), "a");
  EXPECT_FALSE(subject->hasObservers());
  EXPECT_TRUE(contextsOfOneChange().empty());
}

TEST(KeyValueObserving, ObserversAddedOrRemovedDuringADelivery) {
  auto subject = std::make_shared<Subject>();
  auto first = std::make_shared<Recorder>(), second = std::make_shared<Recorder>();
  auto late = std::make_shared<Recorder>();
  bool added = false;
  first->onNote = [&](const Note&) {
    subject->removeObserver(second.get(), "a");
    if (!std::exchange(added, true)) subject->addObserver(late, "a", kInitial | kNew, nullptr);
  };
  subject->addObserver(first, "a", kNew, nullptr);
  subject->addObserver(second, "a", kNew, nullptr);
  subject->set("a", 1);
  subject->set("a", 2);
  EXPECT_EQ(first->count(), 2u);
  EXPECT_EQ(second->count(), 0u);  // removed before its turn
  // The initial notification, then only the change after its registration.
  EXPECT_EQ(late->newValues("a"), (std::vector<Value>{1, 2}));
}

TEST(KeyValueObserving, ObserversLeavingInThePriorNotificationLeaveNothingBehind) {
  auto subject = std::make_shared<Subject>();
  auto payload = std::make_shared<Recorder>();
  const std::weak_ptr<Recorder> weakPayload = payload;
  subject->store("a", std::move(payload));
  auto quitter = std::make_shared<Recorder>(), wantsOld = std::make_shared<Recorder>();
  quitter->onNote = [&](const Note&) {
    subject->removeObserver(quitter.get(), "a");
    subject->removeObserver(wantsOld.get(), "a");
  };
  subject->addObserver(quitter, "a", kPrior, nullptr);
  subject->addObserver(wantsOld, "a", kOld, nullptr);
  subject->set("a", 2);
  EXPECT_EQ(quitter->count(), 1u);
  EXPECT_EQ(wantsOld->count(), 0u);
  EXPECT_TRUE(weakPayload.expired());  // the old value captured for the change is let go
}

TEST(KeyValueObserving, ObjectReleasedByItsObserverSurvivesTheDelivery) {
  auto held = std::make_shared<Subject>();
  Subject* const subject = held.get();
  const std::weak_ptr<Subject> weak = held;
  auto releaser = std::make_shared<Recorder>(), after = std::make_shared<Recorder>();
  releaser->onNote = [&](const Note&) { held.reset(); };  // drops the last owner
  subject->addObserver(releaser, "a", kOld | kNew, nullptr);
  subject->addObserver(after, "a", kOld | kNew, nullptr);
  subject->set("a", 1);
  EXPECT_EQ(releaser->count(), 1u);
  EXPECT_EQ(after->newValues("a"), (std::vector<Value>{1}));
  EXPECT_TRUE(weak.expired());
}

TEST(KeyValueObserving, ConcurrentRegistrationRemovalAndDelivery) {
  auto subject = std::make_shared<Subject>();
  auto stable = Recorder::watch(*subject, {"a"}, kOld | kNew);
  constexpr int kThreads = 4, kRounds = 200;
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      int tag = t;
      for (int i = 0; i < kRounds; ++i) {
        auto recorder = std::make_shared<Recorder>();
        subject->addObserver(recorder, "a", kInitial | kNew, &tag);
        subject->set("a", t * kRounds + i);
        // Half are removed; the other half die while registered.
        if (i % 2 == 0) subject->removeObserver(recorder.get(), "a", &tag);
        EXPECT_GE(recorder->count(), 2u);
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(stable->count(), std::size_t{kThreads * kRounds});
  subject->removeObserver(stable.get(), "a");
  subject->set("a", -1);  // forgets the dead registrations
  EXPECT_FALSE(subject->hasObservers("a"));
}

}  // namespace
}  // namespace kivi
