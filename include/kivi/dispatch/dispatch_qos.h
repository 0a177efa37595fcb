// Values that go with dispatched work: its quality of service (DispatchQoS),
// how a work item is to be treated (DispatchWorkItemFlags) and the outcome of
// a wait with a time-out (DispatchTimeoutResult).
//
//   queue->async(nullptr, kivi::DispatchQoS::utility, {}, [] { index(); });
//   queue->async(kivi::DispatchWorkItemFlags::barrier, [] { compact(); });
//   if (group->wait(kivi::DispatchClock::system()->now() + 2s) ==
//       kivi::DispatchTimeoutResult::timedOut) { ... }
//
// The quality of service is recorded and reported (a global queue answers its
// class from qos()), but the worker pool runs all work at one priority: it
// does not order work by class.
//
// Thread contract: plain values.
#pragma once

#include <algorithm>
#include <cstdint>

#include "kivi/export.h"

namespace kivi {

struct KIVI_EXPORT DispatchQoS {
  // The classes, with the platform's numeric values.
  enum class QoSClass : std::uint32_t {
    userInteractive = 0x21,
    userInitiated = 0x19,
    default_ = 0x15,  // the platform's "default"
    utility = 0x11,
    background = 0x09,
    unspecified = 0,
  };
  // Relative priorities run from -15 (lowest) to 0 within a class.
  static constexpr int kMinRelativePriority = -15;

  constexpr DispatchQoS() noexcept = default;
  // Implicit, so that a class stands for its quality of service. A relative
  // priority outside -15…0 is clamped into it.
  constexpr DispatchQoS(QoSClass cls, int priority = 0) noexcept
      : qosClass(cls), relativePriority(std::clamp(priority, kMinRelativePriority, 0)) {}

  // The class, and the relative priority within it (-15…0); unspecified and 0 by default.
  QoSClass qosClass = QoSClass::unspecified;
  int relativePriority = 0;

  friend constexpr bool operator==(const DispatchQoS&, const DispatchQoS&) = default;

  // Each class at relative priority 0.
  static const DispatchQoS userInteractive;
  static const DispatchQoS userInitiated;
  static const DispatchQoS default_;
  static const DispatchQoS utility;
  static const DispatchQoS background;
  static const DispatchQoS unspecified;
};

inline constexpr DispatchQoS DispatchQoS::userInteractive{QoSClass::userInteractive};
inline constexpr DispatchQoS DispatchQoS::userInitiated{QoSClass::userInitiated};
inline constexpr DispatchQoS DispatchQoS::default_{QoSClass::default_};
inline constexpr DispatchQoS DispatchQoS::utility{QoSClass::utility};
inline constexpr DispatchQoS DispatchQoS::background{QoSClass::background};
inline constexpr DispatchQoS DispatchQoS::unspecified{QoSClass::unspecified};

// A bit set, with the platform's bit values. Only `barrier` changes what a
// queue does (see DispatchQueue); the others are accepted and kept with the
// work item, since the pool has neither priorities nor per-thread contexts.
struct KIVI_EXPORT DispatchWorkItemFlags {
  // The bits; 0 (the default) is no flag.
  std::uint64_t rawValue = 0;

  // Whether every flag of `other` is set.
  constexpr bool contains(DispatchWorkItemFlags other) const noexcept {
    return (rawValue & other.rawValue) == other.rawValue;
  }
  // Whether no flag is set; `|` combines flags.
  constexpr bool empty() const noexcept { return rawValue == 0; }
  friend constexpr DispatchWorkItemFlags operator|(DispatchWorkItemFlags a,
                                                   DispatchWorkItemFlags b) noexcept {
    return {a.rawValue | b.rawValue};
  }
  friend constexpr bool operator==(DispatchWorkItemFlags, DispatchWorkItemFlags) = default;

  // The flags. On a private concurrent queue barrier work runs alone, after the work given
  // before it and before the work given after it (see DispatchQueue); the others change
  // nothing here.
  static const DispatchWorkItemFlags barrier;
  static const DispatchWorkItemFlags detached;
  static const DispatchWorkItemFlags assignCurrentContext;
  static const DispatchWorkItemFlags noQoS;
  static const DispatchWorkItemFlags inheritQoS;
  static const DispatchWorkItemFlags enforceQoS;
};

inline constexpr DispatchWorkItemFlags DispatchWorkItemFlags::barrier{0x01};
inline constexpr DispatchWorkItemFlags DispatchWorkItemFlags::detached{0x02};
inline constexpr DispatchWorkItemFlags DispatchWorkItemFlags::assignCurrentContext{0x04};
inline constexpr DispatchWorkItemFlags DispatchWorkItemFlags::noQoS{0x08};
inline constexpr DispatchWorkItemFlags DispatchWorkItemFlags::inheritQoS{0x10};
inline constexpr DispatchWorkItemFlags DispatchWorkItemFlags::enforceQoS{0x20};

// How a wait with a time-out ended: success, or timedOut when the deadline came first.
enum class DispatchTimeoutResult : std::uint8_t { success, timedOut };

}  // namespace kivi
