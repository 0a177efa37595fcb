// MockKivNSWorkspace: a scriptable KivNSWorkspaceProtocol.
//
// Every operation hands its arguments, completion included, to its callback
// and answers what it answers; the callback decides whether and how the
// completion runs. Without callbacks nothing is opened: openURL(url)
// answers false, URLForApplicationWithBundleIdentifier() null, and no
// completion is called.
//
//   auto workspace = std::make_shared<kivi::MockKivNSWorkspace>();
//   std::vector<kivi::URLPtr> opened;
//   workspace->openURLBlock = [&](const kivi::URLPtr& url) {
//     opened.push_back(url);
//     return true;
//   };
//   help.setWorkspace(workspace);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/desktop/kiv_ns_workspace_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivNSWorkspace : public Object, public KivNSWorkspaceProtocol {
 public:
  MockKivNSWorkspace() = default;

  // Answers openURL(url); without it, false.
  std::function<bool(const URLPtr&)> openURLBlock;
  // Called by openApplicationAtURL(applicationURL, configuration, completionHandler); without it
  // the completion is never called.
  std::function<void(const URLPtr&, const NSWorkspaceOpenConfiguration&,
                     NSWorkspaceCompletionHandler)>
      openApplicationURLBlock;
  // Called by openURL(url, configuration, completionHandler); without it the completion is never
  // called.
  std::function<void(const URLPtr&, const NSWorkspaceOpenConfiguration&,
                     NSWorkspaceCompletionHandler)>
      openURLConfigurationBlock;
  // Called by noteFileSystemChanged(path); without it nothing happens.
  std::function<void(const std::string&)> noteFileSystemChangedBlock;
  // Answers URLForApplicationWithBundleIdentifier(bundleIdentifier); without it, null.
  std::function<URLPtr(const std::string&)> urlForApplicationWithBundleIdentifierBlock;
  // Called by openURLs(urls, applicationURL, configuration, completionHandler); without it the
  // completion is never called.
  std::function<void(const std::vector<URLPtr>&, const URLPtr&, const NSWorkspaceOpenConfiguration&,
                     NSWorkspaceCompletionHandler)>
      openURLsWithAppAtConfigurationBlock;
  // Called by activateFileViewerSelectingURLs(fileURLs); without it nothing happens.
  std::function<void(const std::vector<URLPtr>&)> activateFileViewerSelectingBlock;

  bool openURL(const URLPtr& url) override { return openURLBlock ? openURLBlock(url) : false; }
  void openURL(const URLPtr& url, const NSWorkspaceOpenConfiguration& configuration,
               NSWorkspaceCompletionHandler completionHandler) override {
    if (openURLConfigurationBlock) {
      openURLConfigurationBlock(url, configuration, std::move(completionHandler));
    }
  }
  void openApplicationAtURL(const URLPtr& applicationURL,
                            const NSWorkspaceOpenConfiguration& configuration,
                            NSWorkspaceCompletionHandler completionHandler) override {
    if (openApplicationURLBlock) {
      openApplicationURLBlock(applicationURL, configuration, std::move(completionHandler));
    }
  }
  void noteFileSystemChanged(const std::string& path) override {
    if (noteFileSystemChangedBlock) noteFileSystemChangedBlock(path);
  }
  URLPtr URLForApplicationWithBundleIdentifier(const std::string& bundleIdentifier) override {
    return urlForApplicationWithBundleIdentifierBlock
               ? urlForApplicationWithBundleIdentifierBlock(bundleIdentifier)
               : nullptr;
  }
  void openURLs(const std::vector<URLPtr>& urls, const URLPtr& applicationURL,
                const NSWorkspaceOpenConfiguration& configuration,
                NSWorkspaceCompletionHandler completionHandler) override {
    if (openURLsWithAppAtConfigurationBlock) {
      openURLsWithAppAtConfigurationBlock(urls, applicationURL, configuration,
                                          std::move(completionHandler));
    }
  }
  void activateFileViewerSelectingURLs(const std::vector<URLPtr>& fileURLs) override {
    if (activateFileViewerSelectingBlock) activateFileViewerSelectingBlock(fileURLs);
  }
};

}  // namespace kivi
