// MockKivNSOpenPanel: a scriptable KivNSOpenPanelProtocol. It is a
// MockKivNSSavePanel (the same callbacks, mockUrl and stored values for all
// that the two panels share) with the open panel's choices as stored
// values (all false at first), the chosen files set with setUrls(), and
// close() calling panelCloseBlock.
//
//   auto panel = std::make_shared<kivi::MockKivNSOpenPanel>();
//   panel->setUrls({kivi::URL::fileURLWithPath("/tmp/a.crt")});
//   panel->beginBlock = [](kivi::NSModalCompletionHandler done) { done(kivi::NSModalResponseOK); };
//   importer.run(panel);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <vector>

#include "kivi/doubles/mock_kiv_ns_save_panel.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_ns_open_panel_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSOpenPanel : public MockKivNSSavePanel, public KivNSOpenPanelProtocol {
 public:
  MockKivNSOpenPanel() = default;

  // Called by close(); without it nothing happens.
  std::function<void()> panelCloseBlock;

  bool canChooseFiles() const override { return canChooseFiles_; }
  void setCanChooseFiles(bool flag) override { canChooseFiles_ = flag; }
  bool allowsMultipleSelection() const override { return allowsMultipleSelection_; }
  void setAllowsMultipleSelection(bool flag) override { allowsMultipleSelection_ = flag; }
  bool canChooseDirectories() const override { return canChooseDirectories_; }
  void setCanChooseDirectories(bool flag) override { canChooseDirectories_ = flag; }
  std::vector<URLPtr> urls() const override { return urls_; }
  // What urls() answers.
  void setUrls(std::vector<URLPtr> urls) { urls_ = std::move(urls); }

  void close() override {
    if (panelCloseBlock) panelCloseBlock();
  }

 private:
  bool canChooseFiles_ = false;
  bool allowsMultipleSelection_ = false;
  bool canChooseDirectories_ = false;
  std::vector<URLPtr> urls_;
};

}  // namespace kivi
