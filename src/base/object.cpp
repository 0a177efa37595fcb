#include "kivi/base/object.h"

#include <cxxabi.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <optional>
#include <typeinfo>
#include <vector>

namespace kivi {

namespace {

struct Observation {
  std::weak_ptr<Object> observer;
  const Object* identity;
  std::string key;
  KeyValueObservingOptions options;
  void* context;
  std::atomic<bool> removed{false};
};

// Old values captured by willChangeValueForKey, waiting for the matching
// didChangeValueForKey on the same thread (latest first).
struct PendingChange {
  const Object* object;
  std::string key;
  Value oldValue;
};
thread_local std::vector<PendingChange> tPendingChanges;

Dictionary makeChange(bool prior) {
  Dictionary change;
  change.emplace(KeyValueChangeKindKey, Value(KeyValueChangeSetting));
  if (prior) change.emplace(KeyValueChangeNotificationIsPriorKey, Value(true));
  return change;
}

void deliver(const std::vector<std::shared_ptr<Observation>>& observations, Object* object,
             std::string_view key, bool prior, const Value* oldValue, const Value* newValue) {
  for (const auto& observation : observations) {
    if (observation->removed.load(std::memory_order_acquire)) continue;
    if (prior && !(observation->options & KeyValueObservingOptionPrior)) continue;
    auto observer = observation->observer.lock();
    if (!observer) continue;
    Dictionary change = makeChange(prior);
    if (oldValue && (observation->options & KeyValueObservingOptionOld)) {
      change.emplace(KeyValueChangeOldKey, *oldValue);
    }
    if (newValue && (observation->options & KeyValueObservingOptionNew)) {
      change.emplace(KeyValueChangeNewKey, *newValue);
    }
    observer->observeValueForKeyPath(key, object, change, observation->context);
  }
}

}  // namespace

struct Object::ObservationInfo {
  mutable std::mutex mutex;
  std::vector<std::shared_ptr<Observation>> observations;  // guarded by mutex
  std::atomic<std::size_t> count{0};                       // observations.size()

  // The live observations for `key`, in registration order; forgets those
  // whose observer has gone.
  std::vector<std::shared_ptr<Observation>> snapshot(std::string_view key) {
    std::vector<std::shared_ptr<Observation>> out;
    std::lock_guard lock(mutex);
    std::erase_if(observations, [](const auto& o) { return o->observer.expired(); });
    count.store(observations.size(), std::memory_order_release);
    for (const auto& o : observations) {
      if (o->key == key) out.push_back(o);
    }
    return out;
  }
};

Object::~Object() { delete observationInfo_.load(std::memory_order_acquire); }

std::string Object::className() const {
  const char* mangled = typeid(*this).name();
  int status = 0;
  char* demangled = abi::__cxa_demangle(mangled, nullptr, nullptr, &status);
  std::string name = status == 0 && demangled ? demangled : mangled;
  std::free(demangled);
  // Drop namespaces and template arguments' qualification at the front.
  const auto angle = name.find('<');
  const auto colon = name.rfind("::", angle);
  if (colon != std::string::npos) name.erase(0, colon + 2);
  return name;
}

std::string Object::description() const {
  char address[32];
  std::snprintf(address, sizeof address, "%p", static_cast<const void*>(this));
  std::string text = "<";
  text.append(className()).append(": ").append(address).append(">");
  return text;
}

Value Object::valueForKey(std::string_view) const { return Value(); }

Object::ObservationInfo* Object::observationInfo() const {
  return observationInfo_.load(std::memory_order_acquire);
}

Object::ObservationInfo* Object::ensureObservationInfo() {
  ObservationInfo* info = observationInfo();
  if (info) return info;
  auto* fresh = new ObservationInfo;
  if (observationInfo_.compare_exchange_strong(info, fresh, std::memory_order_acq_rel)) {
    return fresh;
  }
  delete fresh;
  return info;
}

bool Object::hasObservers(std::string_view key) const {
  ObservationInfo* info = observationInfo();
  if (!info) return false;
  std::lock_guard lock(info->mutex);
  return std::any_of(info->observations.begin(), info->observations.end(), [&](const auto& o) {
    return !o->observer.expired() && (key.empty() || o->key == key);
  });
}

void Object::willChangeValueForKey(std::string_view key) {
  ObservationInfo* info = observationInfo();
  if (!info || info->count.load(std::memory_order_acquire) == 0) return;
  auto observations = info->snapshot(key);
  if (observations.empty()) return;
  auto self = weak_from_this().lock();
  const bool wantsOld = std::any_of(observations.begin(), observations.end(), [](const auto& o) {
    return (o->options & KeyValueObservingOptionOld) != 0;
  });
  Value oldValue = wantsOld ? valueForKey(key) : Value();
  tPendingChanges.push_back(PendingChange{this, std::string(key), oldValue});
  deliver(observations, this, key, /*prior=*/true, wantsOld ? &oldValue : nullptr, nullptr);
}

void Object::didChangeValueForKey(std::string_view key) {
  // An observer may drop the last reference to this object while it is told;
  // stay alive until keyValueDidChange has run too.
  std::shared_ptr<Object> self;
  // Pair with the latest will-change of this object and key on this thread,
  // even when its observers have left since.
  std::optional<Value> oldValue;
  if (!tPendingChanges.empty()) {
    for (auto it = tPendingChanges.rbegin(); it != tPendingChanges.rend(); ++it) {
      if (it->object == this && it->key == key) {
        oldValue = std::move(it->oldValue);
        tPendingChanges.erase(std::next(it).base());
        break;
      }
    }
  }
  ObservationInfo* info = observationInfo();
  if (info && info->count.load(std::memory_order_acquire) != 0) {
    self = weak_from_this().lock();
    auto observations = info->snapshot(key);
    if (!observations.empty()) {
      const bool wantsNew =
          std::any_of(observations.begin(), observations.end(),
                      [](const auto& o) { return (o->options & KeyValueObservingOptionNew) != 0; });
      Value newValue = wantsNew ? valueForKey(key) : Value();
      deliver(observations, this, key, /*prior=*/false, oldValue ? &*oldValue : nullptr,
              wantsNew ? &newValue : nullptr);
    }
  }
  keyValueDidChange(key);
}

void Object::keyValueDidChange(std::string_view) {}

void Object::addObserver(const std::shared_ptr<Object>& observer, std::string_view keyPath,
                         KeyValueObservingOptions options, void* context) {
  if (!observer) return;
  auto observation = std::make_shared<Observation>();
  observation->observer = observer;
  observation->identity = observer.get();
  observation->key = std::string(keyPath);
  observation->options = options;
  observation->context = context;
  ObservationInfo* info = ensureObservationInfo();
  {
    std::lock_guard lock(info->mutex);
    info->observations.push_back(observation);
    info->count.store(info->observations.size(), std::memory_order_release);
  }
  if (options & KeyValueObservingOptionInitial) {
    auto self = weak_from_this().lock();
    const Value value = (options & KeyValueObservingOptionNew) ? valueForKey(keyPath) : Value();
    deliver({observation}, this, keyPath, /*prior=*/false, nullptr,
            (options & KeyValueObservingOptionNew) ? &value : nullptr);
  }
}

namespace {

template <class Match>
void removeLatest(std::mutex& mutex, std::vector<std::shared_ptr<Observation>>& observations,
                  std::atomic<std::size_t>& count, Match match) {
  std::lock_guard lock(mutex);
  for (auto it = observations.rbegin(); it != observations.rend(); ++it) {
    if (match(**it)) {
      (*it)->removed.store(true, std::memory_order_release);
      observations.erase(std::next(it).base());
      break;
    }
  }
  count.store(observations.size(), std::memory_order_release);
}

}  // namespace

void Object::removeObserver(const Object* observer, std::string_view keyPath) {
  ObservationInfo* info = observationInfo();
  if (!info || !observer) return;
  removeLatest(info->mutex, info->observations, info->count,
               [&](const Observation& o) { return o.identity == observer && o.key == keyPath; });
}

void Object::removeObserver(const Object* observer, std::string_view keyPath, void* context) {
  ObservationInfo* info = observationInfo();
  if (!info || !observer) return;
  removeLatest(info->mutex, info->observations, info->count, [&](const Observation& o) {
    return o.identity == observer && o.key == keyPath && o.context == context;
  });
}

void Object::observeValueForKeyPath(std::string_view, Object*, const Dictionary&, void*) {}

}  // namespace kivi
