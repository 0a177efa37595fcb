// KivNSEventProtocol: watching the application's own input events before
// they are delivered (a local event monitor).
//
// Both operations belong to the event type rather than to one event: a host
// holds the type's "class object" through this interface. Linux toolkits own
// the event stream, so the library has no default implementation: a host
// implements the interface over its toolkit (or uses MockNSEvent in tests).
//
//   auto monitor = events->addLocalMonitorForEvents(
//       kivi::NSEventMaskKeyDown, [](const kivi::NSEventPtr& e) -> kivi::NSEventPtr {
//         return isShortcut(e) ? nullptr : e;  // swallow shortcuts
//       });
//   ...
//   events->removeMonitor(monitor);
//
// Thread contract: call on the main thread; the handler runs there too.
#pragma once

#include <functional>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

// Receives each matching local event and answers the event to deliver (the
// same one, another, or null to swallow it).
using NSEventMonitorHandler = std::function<NSEventPtr(const NSEventPtr& event)>;

class KIVI_EXPORT KivNSEventProtocol {
 public:
  virtual ~KivNSEventProtocol() = default;

  // Type-level: installs `handler` for the events whose type is in `mask`;
  // answers an opaque monitor (null when none was installed) to hand back to
  // removeMonitor() unchanged.
  virtual ObjectPtr addLocalMonitorForEvents(NSEventMask mask, NSEventMonitorHandler handler) = 0;
  // Type-level: removes a monitor; its handler is not called afterwards.
  virtual void removeMonitor(const ObjectPtr& monitor) = 0;
};

}  // namespace kivi
