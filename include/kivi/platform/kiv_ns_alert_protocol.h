// KivNSAlertProtocol: a message box with buttons, shown on its own (modal)
// or as a sheet of a window.
//
// The library implements it only by its double, MockKivNSAlert; a host
// implements it over its toolkit's dialogs.
//
//   alert->setMessageText("Sign out?");
//   alert->addButtonWithTitle("Sign out");
//   alert->addButtonWithTitle("Cancel");
//   if (alert->runModal() == kivi::NSAlertFirstButtonReturn) signOut();
//
// Thread contract: call on the main thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

class KIVI_EXPORT KivNSAlertProtocol {
 public:
  virtual ~KivNSAlertProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Shows the alert and waits; answers the chosen button
  // (NSAlertFirstButtonReturn + its index) or another modal response.
  virtual NSModalResponse runModal() = 0;
  // Adds a button after those added before; answers it (null when none was
  // made).
  virtual std::shared_ptr<NSButton> addButtonWithTitle(const std::string& title) = 0;
  // Shows the alert as a sheet of `window` and returns at once;
  // `completionHandler` receives what runModal() would have answered.
  virtual void beginSheetModalForWindow(const std::shared_ptr<NSWindow>& window,
                                        std::function<void(NSModalResponse)> completionHandler) = 0;
  // The message, shown prominently at the top.
  virtual std::string messageText() const = 0;
  virtual void setMessageText(std::string text) = 0;
  // The explanation shown under the message.
  virtual std::string informativeText() const = 0;
  virtual void setInformativeText(std::string text) = 0;
  // A view shown under the text (a checkbox, a field); null for none.
  virtual std::shared_ptr<NSView> accessoryView() const = 0;
  virtual void setAccessoryView(std::shared_ptr<NSView> view) = 0;
  // How the alert presents itself (an NSAlertStyle value).
  virtual NSAlertStyle alertStyle() const = 0;
  virtual void setAlertStyle(NSAlertStyle style) = 0;
  // The image shown in the alert; null for the default one.
  virtual std::shared_ptr<NSImage> icon() const = 0;
  virtual void setIcon(std::shared_ptr<NSImage> icon) = 0;
  // Whether the alert has a help button, which calls the delegate's
  // alertShowHelp().
  virtual bool showsHelp() const = 0;
  virtual void setShowsHelp(bool flag) = 0;
  // Held weakly: null once the delegate is gone.
  virtual std::shared_ptr<NSAlertDelegate> delegate() const = 0;
  virtual void setDelegate(const std::shared_ptr<NSAlertDelegate>& delegate) = 0;
};

}  // namespace kivi
