// MockKivNSSavePanel: a scriptable KivNSSavePanelProtocol.
//
// beginSheetModal() and begin() hand their arguments, completion included,
// to beginSheetModalBlock and beginBlock; the callback decides whether and
// with what response the completion runs. Without them no completion is
// called. The panel's properties are plain stored values (nullopt, null,
// false or "" at first; the delegate held strongly); url() answers mockUrl.
//
//   auto panel = std::make_shared<kivi::MockKivNSSavePanel>();
//   panel->mockUrl = kivi::URL::fileURLWithPath("/tmp/export.log");
//   panel->beginBlock = [](kivi::NSModalCompletionHandler done) { done(kivi::NSModalResponseOK); };
//   exporter.run(panel);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_save_panel_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSSavePanel : public Object, public virtual KivNSSavePanelProtocol {
 public:
  MockKivNSSavePanel() = default;

  // Called by beginSheetModal(window, completionHandler); without it the completion is never
  // called.
  std::function<void(const std::shared_ptr<NSWindow>&, NSModalCompletionHandler)>
      beginSheetModalBlock;
  // Called by begin(completionHandler); without it the completion is never called.
  std::function<void(NSModalCompletionHandler)> beginBlock;
  // What url() answers.
  URLPtr mockUrl;

  std::optional<std::string> title() const override { return title_; }
  void setTitle(std::optional<std::string> title) override { title_ = std::move(title); }
  std::optional<std::string> nameFieldLabel() const override { return nameFieldLabel_; }
  void setNameFieldLabel(std::optional<std::string> label) override {
    nameFieldLabel_ = std::move(label);
  }
  std::shared_ptr<NSOpenSavePanelDelegate> delegate() const override { return delegate_; }
  void setDelegate(std::shared_ptr<NSOpenSavePanelDelegate> delegate) override {
    delegate_ = std::move(delegate);
  }
  bool canCreateDirectories() const override { return canCreateDirectories_; }
  void setCanCreateDirectories(bool flag) override { canCreateDirectories_ = flag; }
  URLPtr url() const override { return mockUrl; }
  std::string nameFieldStringValue() const override { return nameFieldStringValue_; }
  void setNameFieldStringValue(std::string value) override {
    nameFieldStringValue_ = std::move(value);
  }
  void beginSheetModal(const std::shared_ptr<NSWindow>& window,
                       NSModalCompletionHandler completionHandler) override {
    if (beginSheetModalBlock) beginSheetModalBlock(window, std::move(completionHandler));
  }
  void begin(NSModalCompletionHandler completionHandler) override {
    if (beginBlock) beginBlock(std::move(completionHandler));
  }

 private:
  std::optional<std::string> title_;
  std::optional<std::string> nameFieldLabel_;
  std::shared_ptr<NSOpenSavePanelDelegate> delegate_;
  bool canCreateDirectories_ = false;
  std::string nameFieldStringValue_;
};

}  // namespace kivi
