// kivi open: open a URL or file with the desktop's preferred application, or
// show files in the file manager.
#include <ostream>
#include <string>
#include <vector>

#include "command.h"
#include "kivi/desktop/ns_workspace.h"

namespace kivi::tool {

namespace {

// A URL as given, or a path (anything without a scheme) as a file URL.
URLPtr target(const std::string& argument) {
  const URLPtr url = URL::URLWithString(argument);
  if (url && url->scheme() && url->scheme()->size() > 1) return url;
  return URL::fileURLWithPath(argument);
}

int fail(std::ostream& err, const ErrorPtr& error) {
  err << "kivi open: " << error->localizedDescription() << " (" << error->domain() << " "
      << error->code() << ")\n";
  return 1;
}

int runOpen(const std::vector<std::string>& args, std::ostream&, std::ostream& err) {
  const bool reveal = !args.empty() && args[0] == "--reveal";
  const std::vector<std::string> items(args.begin() + (reveal ? 1 : 0), args.end());
  if (items.empty() || (!reveal && items.size() != 1) ||
      (!reveal && items[0].starts_with("-") && items[0] != "-")) {
    err << "kivi open: expected " << (reveal ? "one or more paths" : "one URL or path")
        << " (see kivi open --help)\n";
    return 2;
  }
  auto workspace = NSWorkspace::sharedWorkspace();
  if (!reveal) {
    const URLPtr url = target(items[0]);
    if (!url) {
      err << "kivi open: '" << items[0] << "' is neither a URL nor a path\n";
      return 2;
    }
    if (ErrorPtr error = workspace->openURLReturningError(url)) return fail(err, error);
    return 0;
  }
  std::vector<URLPtr> urls;
  for (const std::string& item : items) {
    const URLPtr url = URL::fileURLWithPath(item);
    if (!url) {
      err << "kivi open: '" << item << "' is not a path\n";
      return 2;
    }
    urls.push_back(url);
  }
  if (ErrorPtr error = workspace->activateFileViewerSelectingURLsReturningError(urls)) {
    return fail(err, error);
  }
  return 0;
}

}  // namespace

Command openCommand() {
  return {"open", "open a URL or file, or show files in the file manager",
          "usage: kivi open URL|PATH\n"
          "       kivi open --reveal PATH...\n\n"
          "Opens the URL, or the file at PATH, with the desktop's preferred\n"
          "application: through the desktop portal on the session bus, or xdg-open\n"
          "when there is no portal. With --reveal, shows the files selected in the\n"
          "file manager (org.freedesktop.FileManager1), or opens the folder of the\n"
          "first when there is no file manager. Text with a scheme (https:, mailto:)\n"
          "is a URL; anything else is a path. Exits with 1 and the reason when\n"
          "nothing could open it, 2 on bad arguments.\n",
          runOpen};
}

const CommandRegistration kRegistration{55, &openCommand};

}  // namespace kivi::tool
