// An observer that records every change notification it receives.
#pragma once

#include <functional>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include "kivi/foundation/object.h"

namespace kivi {

inline void PrintTo(const Value& value, std::ostream* os) { *os << value.description(); }

namespace testing {

struct Note {
  std::string key;
  Object* object;
  Dictionary change;
  void* context;
};

class Recorder : public Object {
 public:
  // Called after recording; set it before registering the recorder.
  std::function<void(const Note&)> onNote;

  void observeValueForKeyPath(std::string_view key, Object* object, const Dictionary& change,
                              void* context) override {
    Note note{std::string(key), object, change, context};
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
  std::size_t count() const {
    std::lock_guard lock(mutex_);
    return notes_.size();
  }
  // The "new" values delivered for `key`, in order (null when absent).
  std::vector<Value> newValues(std::string_view key) const {
    std::vector<Value> values;
    for (const Note& note : notes()) {
      if (note.key != key) continue;
      const auto it = note.change.find("new");
      values.push_back(it == note.change.end() ? Value() : it->second);
    }
    return values;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<Note> notes_;
};

}  // namespace testing
}  // namespace kivi
