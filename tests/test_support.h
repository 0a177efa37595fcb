// Helpers shared by the test suites. Every wait has a deadline; callers assert
// on its result, so that a hang becomes a failure rather than a stuck run.
#pragma once

#include <dirent.h>

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <initializer_list>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "kivi/base/object.h"

namespace kivi {

inline void PrintTo(const Value& value, std::ostream* os) { *os << value.description(); }

namespace testing {

inline constexpr std::chrono::milliseconds kTimeout = std::chrono::seconds(10);
// How long a test watches for something that must not happen.
inline constexpr std::chrono::milliseconds kQuiet{50};

// Descriptors this process holds open right now.
inline std::size_t openDescriptors() {
  std::size_t count = 0;
  if (DIR* dir = ::opendir("/proc/self/fd")) {
    while (::readdir(dir)) ++count;
    ::closedir(dir);
  }
  return count;
}

// Counts notify() calls from any thread; wait(n) waits until n have been made.
class Signal {
 public:
  void notify() {
    std::lock_guard lock(mutex_);
    ++count_;
    cv_.notify_all();
  }
  // False if fewer than `count` notifications arrived before the deadline.
  bool wait(int count = 1, std::chrono::milliseconds timeout = kTimeout) {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, timeout, [&] { return count_ >= count; });
  }

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  int count_ = 0;
};

// Runs a blocking call on its own thread; false if it has not returned by the
// deadline (the thread is then abandoned and the test fails).
inline bool returnsWithin(std::function<void()> call,
                          std::chrono::milliseconds timeout = kTimeout) {
  auto returned = std::make_shared<Signal>();
  std::thread([call = std::move(call), returned] {
    call();
    returned->notify();
  }).detach();
  return returned->wait(1, timeout);
}

struct Note {
  std::string key;
  Object* object;
  Dictionary change;
  void* context;
  bool prior;  // sent from willChangeValueForKey
};
using Event = std::pair<std::string, std::string>;  // ("will" | "did", key)

// An observer that records every notification it receives.
class Recorder : public Object {
 public:
  // A recorder registered on `object` for each of `keys`.
  static std::shared_ptr<Recorder> watch(Object& object, std::initializer_list<const char*> keys,
                                         KeyValueObservingOptions options) {
    auto recorder = std::make_shared<Recorder>();
    for (const char* key : keys) object.addObserver(recorder, key, options, nullptr);
    return recorder;
  }

  // Called after recording, on the delivering thread; set it before any delivery.
  std::function<void(const Note&)> onNote;

  void observeValueForKeyPath(std::string_view key, Object* object, const Dictionary& change,
                              void* context) override {
    const auto prior = change.find(KeyValueChangeNotificationIsPriorKey);
    Note note{std::string(key), object, change, context,
              prior != change.end() && prior->second == Value(true)};
    {
      std::lock_guard lock(mutex_);
      notes_.push_back(note);
    }
    if (onNote) onNote(note);
  }

  std::vector<Note> notes() const {
    std::lock_guard lock(mutex_);
    return notes_;
  }
  std::size_t count() const { return notes().size(); }
  // The (will/did, key) sequence recorded so far, which is then forgotten.
  std::vector<Event> takeEvents() {
    std::vector<Event> events;
    std::lock_guard lock(mutex_);
    for (const Note& note : notes_) events.emplace_back(note.prior ? "will" : "did", note.key);
    notes_.clear();
    return events;
  }
  // The (key, change) pairs in order.
  std::vector<std::pair<std::string, Dictionary>> changes() const {
    std::vector<std::pair<std::string, Dictionary>> out;
    for (const Note& note : notes()) out.emplace_back(note.key, note.change);
    return out;
  }
  // The "new" values delivered for `key`, in order (null when absent).
  std::vector<Value> newValues(std::string_view key) const {
    std::vector<Value> values;
    for (const Note& note : notes()) {
      const auto it = note.change.find(KeyValueChangeNewKey);
      if (note.key == key) values.push_back(it == note.change.end() ? Value() : it->second);
    }
    return values;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<Note> notes_;
};

}  // namespace testing
}  // namespace kivi
