// KivNSSavePanelProtocol: the dialog in which the user chooses where to save
// a file.
//
// Linux toolkits own file dialogs, so the library has no default
// implementation: a host implements the interface over its toolkit's file
// chooser (or uses MockKivNSSavePanel in tests).
//
//   panel->setTitle("Export log");
//   panel->setNameFieldStringValue("session.log");
//   panel->begin([panel](kivi::NSModalResponse r) {
//     if (r == kivi::NSModalResponseOK) exportTo(panel->url());
//   });
//
// Thread contract: call on the main thread; completions arrive there.
//
// The open panel's interface inherits this one virtually, so that one class
// can implement both (as MockKivNSOpenPanel does).
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

// Receives the panel's modal response (NSModalResponseOK or ...Cancel).
using NSModalCompletionHandler = std::function<void(NSModalResponse response)>;

class KIVI_EXPORT KivNSSavePanelProtocol {
 public:
  virtual ~KivNSSavePanelProtocol() = default;

  // The panel's title; nullopt for the default one.
  virtual std::optional<std::string> title() const = 0;
  virtual void setTitle(std::optional<std::string> title) = 0;
  // The label of the file-name field; nullopt for the default one.
  virtual std::optional<std::string> nameFieldLabel() const = 0;
  virtual void setNameFieldLabel(std::optional<std::string> label) = 0;
  // Decides which files may be chosen; null for none (all may).
  virtual std::shared_ptr<NSOpenSavePanelDelegate> delegate() const = 0;
  virtual void setDelegate(std::shared_ptr<NSOpenSavePanelDelegate> delegate) = 0;
  // Whether the panel lets the user make a new folder.
  virtual bool canCreateDirectories() const = 0;
  virtual void setCanCreateDirectories(bool flag) = 0;
  // The chosen file; null until the user chose one.
  virtual URLPtr url() const = 0;
  // The file name in the name field: the proposed one before the user
  // chose, the chosen one after.
  virtual std::string nameFieldStringValue() const = 0;
  virtual void setNameFieldStringValue(std::string value) = 0;
  // Shows the panel as a sheet of `window`.
  virtual void beginSheetModal(const std::shared_ptr<NSWindow>& window,
                               NSModalCompletionHandler completionHandler) = 0;
  // Shows the panel on its own.
  virtual void begin(NSModalCompletionHandler completionHandler) = 0;
};

}  // namespace kivi
