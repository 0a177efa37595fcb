// NSWorkspace: the desktop's side of opening things. URLs and files open in
// the user's preferred handlers through the desktop portal, applications
// launch from their desktop entries, and files are shown selected in the
// file manager.
//
//   auto workspace = kivi::NSWorkspace::sharedWorkspace();
//   workspace->openURL(kivi::URL::URLWithString("https://example.com"));     // true when handed
//   over
//   workspace->activateFileViewerSelectingURLs({kivi::URL::fileURLWithPath("/tmp/report.pdf")});
//   auto app = workspace->URLForApplicationWithBundleIdentifier("org.example.Viewer");
//   workspace->openURLs({file}, app, {}, [](auto running, const kivi::ErrorPtr& error) {...});
//
// How each operation reaches the desktop (the session bus is
// $DBUS_SESSION_BUS_ADDRESS, read on every call):
//   - openURL: a file URL goes to the portal's
//     org.freedesktop.portal.OpenURI.OpenFile (with a descriptor of the
//     file), any other URL to OpenURI, on org.freedesktop.portal.Desktop.
//     When no portal is there (no bus, or nobody owns the name), the URL
//     (a file URL as its path) is given to the first xdg-open on $PATH,
//     which must exit with status 0 within the wait. Handing the URL over is
//     success: whatever the chosen handler then does is not seen here.
//   - activateFileViewerSelectingURLs: org.freedesktop.FileManager1.ShowItems
//     with the URLs; with no file manager there, the folder of the first URL
//     is opened as openURL opens it.
//   - openApplicationAtURL and openURLs with an application: the application
//     URL names a desktop entry, as a file URL or path of a .desktop file, or
//     by its desktop-file id ("org.example.Viewer" or
//     "org.example.Viewer.desktop", looked up as
//     URLForApplicationWithBundleIdentifier does). It is launched with GIO
//     (with the URLs, each as a file path where the entry takes files), with
//     the configuration's arguments appended to its command line and its
//     environment added. The completion gets the NSRunningApplication of the
//     launched process, or null when the desktop started it by D-Bus
//     activation and no process id is known.
//   - URLForApplicationWithBundleIdentifier: the file URL of
//     "<id>.desktop" in $XDG_DATA_HOME/applications, then in each
//     $XDG_DATA_DIRS/applications (the XDG defaults when unset), if it is a
//     readable desktop entry that is not Hidden; null otherwise.
//   - noteFileSystemChanged: does nothing; file managers watch the file
//     system themselves (inotify).
//
// Every wait for the desktop is bounded (kNSWorkspaceTimeout): a service or
// xdg-open that does not answer in time is a failure, never a hang.
// Failures, in NSCocoaErrorDomain with a LocalizedDescriptionKey and, when
// the bus or GIO gave one, a DebugDescriptionErrorKey:
//   FileReadNoSuchFileError (260)  a file URL, or an application's .desktop
//                                  path, that names no file (or that
//                                  xdg-open says is missing: status 2)
//   FileNoSuchFileError (4)        an application id with no desktop entry,
//                                  or no application URL
//   FileReadCorruptFileError (259) a file that is not a launchable entry
//                                  (not a desktop entry, not of type
//                                  Application, or its program is not
//                                  installed)
//   FileReadUnknownError (256)     the launch itself failed
//   FeatureUnsupportedError (3328) a null URL or one that names no
//                                  application; nothing could open it: no
//                                  portal and no xdg-open, xdg-open failed,
//                                  the portal refused it or did not answer
//                                  in time
// openURL(url) answers false where the others give an error.
//
// Thread contract: every member may be called from any thread. The
// synchronous calls (openURL(url), activateFileViewerSelectingURLs) block
// for at most the wait; completion handlers run once, on a worker thread,
// after the call returned.
#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/desktop/kiv_ns_workspace_protocol.h"
#include "kivi/export.h"

namespace kivi {

// How long the workspace waits for the desktop's services and for xdg-open.
inline constexpr std::chrono::milliseconds kNSWorkspaceTimeout{3000};

class KIVI_EXPORT NSWorkspace : public Object, public KivNSWorkspaceProtocol {
 public:
  // The process's one workspace.
  static std::shared_ptr<NSWorkspace> sharedWorkspace();

  bool openURL(const URLPtr& url) override;
  void openURL(const URLPtr& url, const NSWorkspaceOpenConfiguration& configuration,
               NSWorkspaceCompletionHandler completionHandler) override;
  void openApplicationAtURL(const URLPtr& applicationURL,
                            const NSWorkspaceOpenConfiguration& configuration,
                            NSWorkspaceCompletionHandler completionHandler) override;
  void noteFileSystemChanged(const std::string& path) override;
  URLPtr URLForApplicationWithBundleIdentifier(const std::string& bundleIdentifier) override;
  void openURLs(const std::vector<URLPtr>& urls, const URLPtr& applicationURL,
                const NSWorkspaceOpenConfiguration& configuration,
                NSWorkspaceCompletionHandler completionHandler) override;
  void activateFileViewerSelectingURLs(const std::vector<URLPtr>& fileURLs) override;

  // openURL(url) with the error it failed with (null on success).
  ErrorPtr openURLReturningError(const URLPtr& url);
  // activateFileViewerSelectingURLs with the error it failed with.
  ErrorPtr activateFileViewerSelectingURLsReturningError(const std::vector<URLPtr>& fileURLs);

  std::string className() const override { return "NSWorkspace"; }

 private:
  NSWorkspace() = default;
};

}  // namespace kivi
