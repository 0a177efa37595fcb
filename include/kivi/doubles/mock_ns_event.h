// MockNSEvent: a scriptable KivNSEventProtocol.
//
// Both operations are type-level, so their callbacks are class-level: one
// addLocalMonitorBlock and one removeMonitorBlock for the whole process,
// read by every MockNSEvent object. Without addLocalMonitorBlock no monitor
// is installed and the answer is null; without removeMonitorBlock removing
// does nothing.
//
//   kivi::NSEventMonitorHandler installed;
//   kivi::MockNSEvent::addLocalMonitorBlock = [&](kivi::NSEventMask,
//                                                 kivi::NSEventMonitorHandler h) {
//     installed = std::move(h);
//     return kivi::ObjectPtr(std::make_shared<kivi::NSObject>());
//   };
//   shortcuts.install(std::make_shared<kivi::MockNSEvent>());
//   installed(std::make_shared<kivi::NSEvent>(kivi::NSEventTypeKeyDown));  // "type a key"
//   kivi::MockNSEvent::addLocalMonitorBlock = nullptr;  // class-level: reset it
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the class-level callbacks before any object is handed out and reset
// them when the test ends.
#pragma once

#include <functional>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_event_protocol.h"

namespace kivi {

class KIVI_EXPORT MockNSEvent : public Object, public KivNSEventProtocol {
 public:
  MockNSEvent() = default;

  // Class-level: answers addLocalMonitorForEvents(mask, handler); without it, null (no monitor).
  static inline std::function<ObjectPtr(NSEventMask, NSEventMonitorHandler)> addLocalMonitorBlock;
  // Class-level: called by removeMonitor(monitor); without it nothing happens.
  static inline std::function<void(const ObjectPtr&)> removeMonitorBlock;

  ObjectPtr addLocalMonitorForEvents(NSEventMask mask, NSEventMonitorHandler handler) override {
    return addLocalMonitorBlock ? addLocalMonitorBlock(mask, std::move(handler)) : nullptr;
  }
  void removeMonitor(const ObjectPtr& monitor) override {
    if (removeMonitorBlock) removeMonitorBlock(monitor);
  }
};

}  // namespace kivi
