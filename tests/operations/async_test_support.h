// Shared pieces of the operations suites: a counting signal with deadlines, a
// change recorder and a scriptable asynchronous operation.
#pragma once

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "kivi/foundation/object.h"
#include "kivi/foundation/worker_pool.h"
#include "kivi/operations/kiv_async_operation.h"

namespace kivi::optest {

// Counts notify() calls; waitFor(n) waits, up to a deadline, for the n-th.
class Signal {
 public:
  void notify() {
    std::lock_guard lock(mutex_);
    ++count_;
    cv_.notify_all();
  }
  bool waitFor(int total, std::chrono::seconds limit = std::chrono::seconds(10)) {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, limit, [&] { return count_ >= total; });
  }

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  int count_ = 0;
};

// Runs `work` on its own thread; false if it has not returned within 10 s
// (the thread is then abandoned and the test fails).
inline bool finishesWithin10s(std::function<void()> work) {
  auto done = std::make_shared<Signal>();
  std::thread([work = std::move(work), done] {
    work();
    done->notify();
  }).detach();
  return done->waitFor(1);
}

class OrderLog {
 public:
  void add(std::string entry) {
    std::lock_guard lock(mutex_);
    entries_.push_back(std::move(entry));
  }
  std::vector<std::string> snapshot() {
    std::lock_guard lock(mutex_);
    return entries_;
  }

 private:
  std::mutex mutex_;
  std::vector<std::string> entries_;
};

// ("will" | "did", key), in delivery order.
using Event = std::pair<std::string, std::string>;

class Recorder : public Object {
 public:
  static std::shared_ptr<Recorder> watch(
      Object& object, const std::vector<std::string>& keys,
      KeyValueObservingOptions options = KeyValueObservingOptionPrior) {
    auto recorder = std::make_shared<Recorder>();
    for (const auto& key : keys) object.addObserver(recorder, key, options, nullptr);
    return recorder;
  }

  std::function<void(const Event&, Object*, const Dictionary&)> hook;

  void observeValueForKeyPath(std::string_view key, Object* object, const Dictionary& change,
                              void*) override {
    auto prior = change.find(KeyValueChangeNotificationIsPriorKey);
    const bool isPrior = prior != change.end() && prior->second == Value(true);
    Event event{isPrior ? "will" : "did", std::string(key)};
    {
      std::lock_guard lock(mutex_);
      events_.push_back(event);
    }
    if (hook) hook(event, object, change);
  }
  std::vector<Event> take() {
    std::lock_guard lock(mutex_);
    return std::exchange(events_, {});
  }

 private:
  std::mutex mutex_;
  std::vector<Event> events_;
};

// How a probe ends the work it began in start().
enum class Finish { manual, inlineOnce, inlineTwice, onWorker };

// An asynchronous operation written the way subclasses are told to: cancelled
// → complete at once; else executing, then complete as scripted.
template <class Base>
class AsyncProbe : public Base {
 public:
  explicit AsyncProbe(Finish finish = Finish::manual, std::string tag = "") : finish_(finish) {
    this->setName(std::move(tag));
  }

  std::atomic<int> starts{0}, executions{0};
  Signal startReturned;
  std::function<void(AsyncProbe&)> onStart, onCancel;  // set before handing the probe out

  void start() override {
    ++starts;
    if (onStart) onStart(*this);
    if (this->isCancelled()) {
      this->coreCompleteOperation();
    } else {
      this->moveToExecutingState();
      ++executions;
      if (finish_ == Finish::inlineTwice) this->coreCompleteOperation();
      if (finish_ == Finish::inlineOnce || finish_ == Finish::inlineTwice)
        this->coreCompleteOperation();
      if (finish_ == Finish::onWorker)
        WorkerPool::shared().submit(
            [self = std::static_pointer_cast<AsyncProbe>(this->shared_from_this())] {
              self->coreCompleteOperation();
            });
    }
    startReturned.notify();
  }
  void cancel() override {
    if (onCancel) onCancel(*this);
    Base::cancel();
  }

 private:
  Finish finish_;
};

using FlagsProbe = AsyncProbe<KivAsyncOperationObjC>;
using EnumProbe = AsyncProbe<KivAsyncOperation>;

// Runs `test.template operator()<Probe>()` for both variants.
template <class Test>
void forBothVariants(Test&& test) {
  {
    SCOPED_TRACE("KivAsyncOperationObjC");
    test.template operator()<FlagsProbe>();
  }
  {
    SCOPED_TRACE("KivAsyncOperation");
    test.template operator()<EnumProbe>();
  }
}

}  // namespace kivi::optest
