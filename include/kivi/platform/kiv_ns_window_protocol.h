// KivNSWindowProtocol: a top-level window that shows one view controller.
//
// Linux toolkits own windows, so the library has no default implementation:
// a host implements the interface over its toolkit (or uses MockKivNSWindow
// in tests).
//
//   window->setContentViewController(consentScreen);
//   window->center();
//   window->makeKeyAndOrderFront(nullptr);
//
// Thread contract: call on the main thread.
#pragma once

#include <memory>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

class KIVI_EXPORT KivNSWindowProtocol {
 public:
  virtual ~KivNSWindowProtocol() = default;

  // The controller whose view fills the window; null for none.
  virtual std::shared_ptr<NSViewController> contentViewController() const = 0;
  virtual void setContentViewController(std::shared_ptr<NSViewController> controller) = 0;
  // Moves the window to the centre of its screen.
  virtual void center() = 0;
  // Shows the window in front and gives it the keyboard; `sender` (null for
  // none) is who asked.
  virtual void makeKeyAndOrderFront(const ObjectPtr& sender) = 0;
  // Takes the window off the screen.
  virtual void close() = 0;
};

}  // namespace kivi
