// The kivi tool's commands. Each command has a name, a one-line summary, a
// usage text printed by `kivi <command> --help`, and a run function that gets
// the arguments after the command name.
#pragma once

#include <functional>
#include <iosfwd>
#include <string>
#include <vector>

namespace kivi::tool {

struct Command {
  std::string name;
  std::string summary;
  std::string usage;  // full help text, starting with the usage line
  std::function<int(const std::vector<std::string>& args, std::ostream& out, std::ostream& err)>
      run;
};

// Every registered command, in the order `kivi --help` lists them.
std::vector<Command> allCommands();

// Each command file registers its factory at start-up:
//
//   Command fooCommand() { ... }
//   const CommandRegistration kRegistration{30, &fooCommand};
//
// `order` places the command in `kivi --help`; lower comes first.
struct CommandRegistration {
  CommandRegistration(int order, Command (*factory)());
};

// Whether `args` asks for help ("-h" or "--help" anywhere before a "--").
bool wantsHelp(const std::vector<std::string>& args);

}  // namespace kivi::tool
