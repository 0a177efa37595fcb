// KivNSOpenPanelProtocol: the dialog in which the user chooses files or
// folders to open; everything the save panel has, and the choice of what may
// be chosen.
//
// Linux toolkits own file dialogs, so the library has no default
// implementation: a host implements the interface over its toolkit's file
// chooser (or uses MockKivNSOpenPanel in tests).
//
//   panel->setCanChooseDirectories(true);
//   panel->setAllowsMultipleSelection(true);
//   panel->begin([panel](kivi::NSModalResponse r) {
//     if (r == kivi::NSModalResponseOK) importAll(panel->urls());
//   });
//
// Thread contract: call on the main thread; completions arrive there.
#pragma once

#include <vector>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_save_panel_protocol.h"

namespace kivi {

class KIVI_EXPORT KivNSOpenPanelProtocol : public virtual KivNSSavePanelProtocol {
 public:
  // Whether the user may choose files.
  virtual bool canChooseFiles() const = 0;
  virtual void setCanChooseFiles(bool flag) = 0;
  // Whether the user may choose more than one item.
  virtual bool allowsMultipleSelection() const = 0;
  virtual void setAllowsMultipleSelection(bool flag) = 0;
  // Whether the user may choose folders.
  virtual bool canChooseDirectories() const = 0;
  virtual void setCanChooseDirectories(bool flag) = 0;
  // The chosen files and folders; empty until the user chose.
  virtual std::vector<URLPtr> urls() const = 0;
  // Takes the panel off the screen.
  virtual void close() = 0;
};

}  // namespace kivi
