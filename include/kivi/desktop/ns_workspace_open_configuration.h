// NSWorkspaceOpenConfiguration: how NSWorkspace opens a URL or launches an
// application; a plain value, copied wherever it goes.
//
//   kivi::NSWorkspaceOpenConfiguration configuration;
//   configuration.arguments = {"--new-window"};
//   configuration.environment["LANG"] = "C.UTF-8";
//   workspace->openApplicationAtURL(appURL, configuration, nullptr);
//
// What the desktop implementation honours: `arguments` and `environment`, for
// the application it launches from a desktop entry (openApplicationAtURL,
// openURLs with an application). Everything else is accepted and ignored,
// because the desktop leaves it to the launched application or the window
// manager: `activates` (applications raise their own window), `hides`,
// `createsNewApplicationInstance` (a single-instance application forwards to
// its running copy whatever we do), `promptsUserIfNeeded` (the desktop portal
// decides when to ask) and `addsToRecentItems`. Opening a URL with the
// desktop's default handler ignores the whole configuration.
//
// Thread contract: a value type; distinct copies are independent.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "kivi/export.h"

namespace kivi {

struct KIVI_EXPORT NSWorkspaceOpenConfiguration {
  // Whether the application comes to the front; ignored (see above).
  bool activates = true;
  // Extra command-line arguments, after those the desktop entry names.
  std::vector<std::string> arguments;
  // Variables added to (or replacing those of) the launched application's
  // environment, which is otherwise this process's.
  std::map<std::string, std::string> environment;
  // Whether another copy of a running application starts; ignored.
  bool createsNewApplicationInstance = false;
  // Whether the user may be asked (to choose an application, to allow the launch); ignored.
  bool promptsUserIfNeeded = true;
  // Whether the URL joins the recent items; ignored.
  bool addsToRecentItems = true;
  // Whether the application starts hidden; ignored.
  bool hides = false;

  // The platform's +configuration: the defaults above.
  static NSWorkspaceOpenConfiguration configuration() { return {}; }

  friend bool operator==(const NSWorkspaceOpenConfiguration&,
                         const NSWorkspaceOpenConfiguration&) = default;
};

}  // namespace kivi
