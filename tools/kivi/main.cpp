// kivi: the sample command-line host of the library.
#include <algorithm>
#include <iostream>
#include <string>
#include <vector>

#include "command.h"
#include "kivi/version.h"
#include "verbose.h"

namespace kivi::tool {

namespace {

struct Registered {
  int order;
  Command (*factory)();
};

// A function-local static: registrations run during static initialisation of
// the other files, in no fixed order.
std::vector<Registered>& registry() {
  static std::vector<Registered> entries;
  return entries;
}

}  // namespace

CommandRegistration::CommandRegistration(int order, Command (*factory)()) {
  registry().push_back({order, factory});
}

std::vector<Command> allCommands() {
  auto entries = registry();
  std::stable_sort(entries.begin(), entries.end(),
                   [](const Registered& a, const Registered& b) { return a.order < b.order; });
  std::vector<Command> commands;
  commands.reserve(entries.size());
  for (const auto& entry : entries) commands.push_back(entry.factory());
  return commands;
}

bool wantsHelp(const std::vector<std::string>& args) {
  for (const auto& a : args) {
    if (a == "--") break;  // what follows belongs to another program
    if (a == "-h" || a == "--help") return true;
  }
  return false;
}

namespace {

void printHelp(std::ostream& out) {
  out << "usage: kivi [--verbose] <command> [arguments]\n\n"
         "The sample host of the KiviOSSDK library "
      << KiviOSSDKVersionString
      << ".\n\n"
         "Commands:\n";
  for (const auto& command : allCommands()) {
    out << "  " << command.name
        << std::string(command.name.size() < 12 ? 12 - command.name.size() : 1, ' ')
        << command.summary << "\n";
  }
  out << "\nOptions:\n"
         "  --verbose   log the tool's steps to standard error\n"
         "\nRun 'kivi <command> --help' for a command's own options.\n";
}

}  // namespace

int main(int argc, char** argv) {
  std::vector<std::string> args(argv + 1, argv + argc);
  // Global options come before the command name.
  while (!args.empty() && args[0] == "--verbose") {
    enableVerboseLogging(std::cerr);
    args.erase(args.begin());
  }
  if (args.empty() || args[0] == "-h" || args[0] == "--help" || args[0] == "help") {
    printHelp(args.empty() ? std::cerr : std::cout);
    return args.empty() ? 2 : 0;
  }
  if (args[0] == "--version") {
    std::cout << KiviOSSDKVersionString << "\n";
    return 0;
  }
  for (const auto& command : allCommands()) {
    if (command.name != args[0]) continue;
    std::vector<std::string> rest(args.begin() + 1, args.end());
    if (wantsHelp(rest)) {
      std::cout << command.usage;
      return 0;
    }
    logger().logInfo(nullptr, __FILE__, __func__, __LINE__, "running command " + command.name);
    return command.run(rest, std::cout, std::cerr);
  }
  std::cerr << "kivi: unknown command '" << args[0] << "'\n\n";
  printHelp(std::cerr);
  return 2;
}

}  // namespace kivi::tool

int main(int argc, char** argv) { return kivi::tool::main(argc, argv); }
