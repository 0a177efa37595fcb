// kivi notify: show a desktop notification as this application.
#include <chrono>
#include <future>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "command.h"
#include "kivi/desktop/un_user_notification_center.h"

namespace kivi::tool {

namespace {

int runNotify(const std::vector<std::string>& args, std::ostream&, std::ostream& err) {
  UNNotificationRequest request;
  std::vector<std::string> words;
  for (std::size_t i = 0; i < args.size(); ++i) {
    if (args[i] == "--sound") {
      request.content.sound = true;
    } else if (args[i] == "--id" && i + 1 < args.size()) {
      request.identifier = args[++i];
    } else if (args[i] == "--subtitle" && i + 1 < args.size()) {
      request.content.subtitle = args[++i];
    } else if (args[i].starts_with("--")) {
      err << "kivi notify: unknown option '" << args[i] << "' (see kivi notify --help)\n";
      return 2;
    } else {
      words.push_back(args[i]);
    }
  }
  if (words.empty() || words.size() > 2) {
    err << "kivi notify: expected TITLE [BODY] (see kivi notify --help)\n";
    return 2;
  }
  request.content.title = words[0];
  if (words.size() == 2) request.content.body = words[1];
  if (request.identifier.empty()) request.identifier = "kivi-notify";

  auto sent = std::make_shared<std::promise<ErrorPtr>>();
  auto outcome = sent->get_future();
  UNUserNotificationCenter::currentNotificationCenter()->add(
      request, [sent](const ErrorPtr& error) { sent->set_value(error); });
  // The center bounds its own waits; this is only a backstop.
  if (outcome.wait_for(kUNNotificationCenterTimeout * 3) != std::future_status::ready) {
    err << "kivi notify: the notification center did not answer\n";
    return 1;
  }
  if (ErrorPtr error = outcome.get()) {
    err << "kivi notify: " << error->localizedDescription() << " (" << error->domain() << " "
        << error->code() << ")\n";
    return 1;
  }
  return 0;
}

}  // namespace

Command notifyCommand() {
  return {"notify", "show a desktop notification",
          "usage: kivi notify [--id ID] [--subtitle TEXT] [--sound] TITLE [BODY]\n\n"
          "Shows a notification through the desktop's notification server\n"
          "(org.freedesktop.Notifications on the session bus). A later notification\n"
          "with the same ID (default \"kivi-notify\") from the same process replaces\n"
          "it. Exits with 1 and the reason when no server answers, 2 on bad\n"
          "arguments.\n",
          runNotify};
}

const CommandRegistration kRegistration{57, &notifyCommand};

}  // namespace kivi::tool
