// KivNSWorkspaceProtocol: opening URLs and files with the desktop's handlers,
// launching applications and showing files in the file manager, behind an
// interface so that a host can hand it the real workspace
// (NSWorkspace::sharedWorkspace()) or a scriptable double.
//
//   std::shared_ptr<kivi::KivNSWorkspaceProtocol> workspace = kivi::NSWorkspace::sharedWorkspace();
//   workspace->openURL(kivi::URL::URLWithString("https://example.com/help"),
//                      kivi::NSWorkspaceOpenConfiguration::configuration(),
//                      [](const std::shared_ptr<kivi::NSRunningApplication>& app,
//                         const kivi::ErrorPtr& error) {
//                        if (error) report(error->localizedDescription());
//                      });
//
// Completion handlers may be null (no callback). Errors are in
// NSCocoaErrorDomain (kivi::CocoaErrorDomain).
//
// Thread contract: that of the implementation; NSWorkspace may be called
// from any thread and calls completion handlers on a worker thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/desktop/ns_workspace_open_configuration.h"
#include "kivi/export.h"
#include "kivi/net/url.h"

namespace kivi {

class NSRunningApplication;

// NSCocoaErrorDomain codes of the workspace (the file codes are in
// kivi/net/kiv_ns_url_protocol.h).
inline constexpr std::int64_t UserCancelledError = 3072;
inline constexpr std::int64_t FeatureUnsupportedError = 3328;

// The running application (null when unknown) or the error (null on success).
using NSWorkspaceCompletionHandler =
    std::function<void(const std::shared_ptr<NSRunningApplication>& app, const ErrorPtr& error)>;

class KIVI_EXPORT KivNSWorkspaceProtocol {
 public:
  virtual ~KivNSWorkspaceProtocol() = default;

  // openURL:
  virtual bool openURL(const URLPtr& url) = 0;
  // openURL:configuration:completionHandler:
  virtual void openURL(const URLPtr& url, const NSWorkspaceOpenConfiguration& configuration,
                       NSWorkspaceCompletionHandler completionHandler) = 0;
  // openApplicationAtURL:configuration:completionHandler:
  virtual void openApplicationAtURL(const URLPtr& applicationURL,
                                    const NSWorkspaceOpenConfiguration& configuration,
                                    NSWorkspaceCompletionHandler completionHandler) = 0;
  // noteFileSystemChanged:
  virtual void noteFileSystemChanged(const std::string& path) = 0;
  // URLForApplicationWithBundleIdentifier: — null when there is none.
  virtual URLPtr URLForApplicationWithBundleIdentifier(const std::string& bundleIdentifier) = 0;
  // openURLs:withApplicationAtURL:configuration:completionHandler:
  virtual void openURLs(const std::vector<URLPtr>& urls, const URLPtr& applicationURL,
                        const NSWorkspaceOpenConfiguration& configuration,
                        NSWorkspaceCompletionHandler completionHandler) = 0;
  // activateFileViewerSelectingURLs:
  virtual void activateFileViewerSelectingURLs(const std::vector<URLPtr>& fileURLs) = 0;
};

}  // namespace kivi
