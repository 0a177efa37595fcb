// Object: the base of every library object with identity, and its key-value
// change notifications.
//
// An object announces a change of one of its properties with
// willChangeValueForKey() before and didChangeValueForKey() after the change.
// Observers registered with addObserver() receive observeValueForKeyPath()
// with a change dictionary:
//
//   "kind"                 1 (a value was set)
//   "new"                  the value after the change   (option New)
//   "old"                  the value before the change  (option Old)
//   "notificationIsPrior"  true, on the prior notification sent from
//                          willChangeValueForKey        (option Prior)
//
// Option Initial sends one notification from inside addObserver(). Values
// come from valueForKey(), which subclasses override for their observable
// properties; an unknown key reads as the null marker.
//
//   class Watcher : public kivi::Object {
//     void observeValueForKeyPath(std::string_view key, kivi::Object* object,
//                                 const kivi::Dictionary& change, void* ctx) override {...}
//   };
//   auto watcher = std::make_shared<Watcher>();
//   operation->addObserver(watcher, "isFinished", kivi::KeyValueObservingOptionNew, nullptr);
//
// A key path here is one key: it is matched as a whole string.
//
// Thread contract: notifications are delivered synchronously, on the thread
// that calls didChangeValueForKey (or willChangeValueForKey for prior
// notifications), to the observers registered for that key at that moment, in
// registration order. addObserver and removeObserver may be called from any
// thread, including from inside a delivery; an observation removed during a
// delivery is not called after its removal. Observers are held weakly: an
// observer that has been destroyed is skipped and forgotten. The object is
// kept alive for the length of a delivery when it is owned by a shared_ptr.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// What an observation asks for, as a bitwise OR of the options below (0: only the kind).
using KeyValueObservingOptions = std::uint64_t;
// The change dictionary carries "new", the value after the change.
inline constexpr KeyValueObservingOptions KeyValueObservingOptionNew = 0x01;
// The change dictionary carries "old", the value before the change.
inline constexpr KeyValueObservingOptions KeyValueObservingOptionOld = 0x02;
// addObserver() sends one notification at once (with "new" when New is set too).
inline constexpr KeyValueObservingOptions KeyValueObservingOptionInitial = 0x04;
// willChangeValueForKey() sends a prior notification too (with "old" when Old is set).
inline constexpr KeyValueObservingOptions KeyValueObservingOptionPrior = 0x08;

// Keys of a change dictionary.
inline constexpr const char* KeyValueChangeKindKey = "kind";
inline constexpr const char* KeyValueChangeNewKey = "new";
inline constexpr const char* KeyValueChangeOldKey = "old";
inline constexpr const char* KeyValueChangeIndexesKey = "indexes";
inline constexpr const char* KeyValueChangeNotificationIsPriorKey = "notificationIsPrior";
// The only change kind this object model produces.
inline constexpr std::int64_t KeyValueChangeSetting = 1;

class KIVI_EXPORT Object : public std::enable_shared_from_this<Object> {
 public:
  virtual ~Object();
  Object(const Object&) = delete;
  Object& operator=(const Object&) = delete;

  // The unqualified class name, e.g. "KivAsyncOperation".
  virtual std::string className() const;
  // "<ClassName: 0x7f...>".
  virtual std::string description() const;
  // The platform's isEqual: identity unless a subclass compares by value.
  virtual bool isEqual(const Object& other) const noexcept { return this == &other; }

  // The value of an observable property; the null marker for unknown keys.
  virtual Value valueForKey(std::string_view key) const;

  // Announce a change of `key`: will before it, did after it, paired on the same thread.
  // The observers of `key` are told as described above; did then calls keyValueDidChange().
  void willChangeValueForKey(std::string_view key);
  void didChangeValueForKey(std::string_view key);

  // Registers `observer` (held weakly) for `keyPath`. The same observer may be
  // registered several times; each registration is notified.
  virtual void addObserver(const std::shared_ptr<Object>& observer, std::string_view keyPath,
                           KeyValueObservingOptions options, void* context);
  // Removes the most recent registration of `observer` for `keyPath`
  // (with `context`, only one made with that context). Unknown pairs are
  // ignored.
  virtual void removeObserver(const Object* observer, std::string_view keyPath);
  virtual void removeObserver(const Object* observer, std::string_view keyPath, void* context);

  // Called on an observer for each change it registered for. Does nothing by
  // default.
  virtual void observeValueForKeyPath(std::string_view keyPath, Object* object,
                                      const Dictionary& change, void* context);

  // Whether any observation is registered for `key` (any key when empty).
  bool hasObservers(std::string_view key = {}) const;

 protected:
  Object() noexcept = default;

  // Called at the end of every didChangeValueForKey, after the observers, on
  // the same thread. Subclasses that react to their own announcements (the
  // operation reacts to "isFinished" and "isReady") override it.
  virtual void keyValueDidChange(std::string_view key);

 private:
  struct ObservationInfo;
  ObservationInfo* observationInfo() const;
  ObservationInfo* ensureObservationInfo();

  // Created on first addObserver, freed with the object.
  mutable std::atomic<ObservationInfo*> observationInfo_{nullptr};
};

// How objects with identity are held.
using ObjectPtr = std::shared_ptr<Object>;

}  // namespace kivi
