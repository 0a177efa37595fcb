// MockKivNSAlert: a scriptable KivNSAlertProtocol.
//
// runModal(), addButtonWithTitle() and beginSheetModalForWindow() answer
// runModalCallback, addButtonCallback and beginSheetModalCallback. Without
// them runModal() answers NSModalResponseContinue (-1002), no button is made
// (null) and the sheet's completion is not called. The alert's properties
// are plain stored values; the delegate is held weakly.
//
//   auto alert = std::make_shared<kivi::MockKivNSAlert>();
//   alert->runModalCallback = [] { return kivi::NSAlertFirstButtonReturn; };  // "OK" pressed
//   signOutFlow.confirm(alert);
//   EXPECT_EQ(alert->messageText(), "Sign out?");
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_alert_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSAlert : public Object, public KivNSAlertProtocol {
 public:
  MockKivNSAlert() = default;

  // Answers runModal(); without it, NSModalResponseContinue.
  std::function<NSModalResponse()> runModalCallback;
  // Answers addButtonWithTitle(title); without it, null.
  std::function<std::shared_ptr<NSButton>(const std::string&)> addButtonCallback;
  // Called by beginSheetModalForWindow(window, completionHandler); without it the completion is
  // never called.
  std::function<void(const std::shared_ptr<NSWindow>&, std::function<void(NSModalResponse)>)>
      beginSheetModalCallback;

  std::string description() const override { return Object::description(); }

  NSModalResponse runModal() override {
    return runModalCallback ? runModalCallback() : NSModalResponseContinue;
  }
  std::shared_ptr<NSButton> addButtonWithTitle(const std::string& title) override {
    return addButtonCallback ? addButtonCallback(title) : nullptr;
  }
  void beginSheetModalForWindow(const std::shared_ptr<NSWindow>& window,
                                std::function<void(NSModalResponse)> completionHandler) override {
    if (beginSheetModalCallback) beginSheetModalCallback(window, std::move(completionHandler));
  }
  std::string messageText() const override { return messageText_; }
  void setMessageText(std::string text) override { messageText_ = std::move(text); }
  std::string informativeText() const override { return informativeText_; }
  void setInformativeText(std::string text) override { informativeText_ = std::move(text); }
  std::shared_ptr<NSView> accessoryView() const override { return accessoryView_; }
  void setAccessoryView(std::shared_ptr<NSView> view) override { accessoryView_ = std::move(view); }
  NSAlertStyle alertStyle() const override { return alertStyle_; }
  void setAlertStyle(NSAlertStyle style) override { alertStyle_ = style; }
  std::shared_ptr<NSImage> icon() const override { return icon_; }
  void setIcon(std::shared_ptr<NSImage> icon) override { icon_ = std::move(icon); }
  bool showsHelp() const override { return showsHelp_; }
  void setShowsHelp(bool flag) override { showsHelp_ = flag; }
  std::shared_ptr<NSAlertDelegate> delegate() const override { return delegate_.lock(); }
  void setDelegate(const std::shared_ptr<NSAlertDelegate>& delegate) override {
    delegate_ = delegate;
  }

 private:
  std::string messageText_;
  std::string informativeText_;
  std::shared_ptr<NSView> accessoryView_;
  NSAlertStyle alertStyle_ = NSAlertStyleWarning;
  std::shared_ptr<NSImage> icon_;
  bool showsHelp_ = false;
  std::weak_ptr<NSAlertDelegate> delegate_;
};

}  // namespace kivi
