// MockKivNSWindow: a scriptable KivNSWindowProtocol.
//
// center(), makeKeyAndOrderFront() and close() call centerBlock,
// makeKeyAndOrderFrontBlock and windowCloseBlock, if set, and do nothing
// otherwise. contentViewController is a stored value, and so is title (the
// empty string until set), which the double keeps for hosts that name their
// windows.
//
//   auto window = std::make_shared<kivi::MockKivNSWindow>();
//   bool shown = false;
//   window->makeKeyAndOrderFrontBlock = [&](const kivi::ObjectPtr&) { shown = true; };
//   onboarding.present(window);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_window_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSWindow : public Object, public KivNSWindowProtocol {
 public:
  MockKivNSWindow() = default;

  // Called by center(); without it nothing happens.
  std::function<void()> centerBlock;
  // Called by makeKeyAndOrderFront(sender); without it nothing happens.
  std::function<void(const ObjectPtr&)> makeKeyAndOrderFrontBlock;
  // Called by close(); without it nothing happens.
  std::function<void()> windowCloseBlock;
  // The window's title ("" at first); no operation reads it.
  std::string title;

  std::shared_ptr<NSViewController> contentViewController() const override {
    return contentViewController_;
  }
  void setContentViewController(std::shared_ptr<NSViewController> controller) override {
    contentViewController_ = std::move(controller);
  }
  void center() override {
    if (centerBlock) centerBlock();
  }
  void makeKeyAndOrderFront(const ObjectPtr& sender) override {
    if (makeKeyAndOrderFrontBlock) makeKeyAndOrderFrontBlock(sender);
  }
  void close() override {
    if (windowCloseBlock) windowCloseBlock();
  }

 private:
  std::shared_ptr<NSViewController> contentViewController_;
};

}  // namespace kivi
