// kivi ulo: read one setting out of a ULO launch file.
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>
#include <ostream>

#include "command.h"
#include "kivi/launch/kiv_ulo_file_parser.h"
#include "kivi/text/unicode_text.h"

namespace kivi::tool {

namespace {

// The whole of `path` ("-" for standard input), or absent with a message on
// `err` when it cannot be read or is not UTF-8 text.
std::optional<std::string> readLaunchFile(const std::string& path, std::ostream& err) {
  const bool standardInput = path == "-";
  const std::string shown = standardInput ? "standard input" : "'" + path + "'";
  std::FILE* file = standardInput ? stdin : std::fopen(path.c_str(), "rb");
  if (!file) {
    err << "kivi ulo: cannot open " << shown << ": " << std::strerror(errno) << "\n";
    return std::nullopt;
  }
  std::string text;
  char buffer[1 << 16];
  std::size_t got;
  while ((got = std::fread(buffer, 1, sizeof buffer, file)) > 0) text.append(buffer, got);
  const int readError = std::ferror(file) ? errno : 0;
  if (!standardInput) std::fclose(file);
  if (readError) {
    err << "kivi ulo: cannot read " << shown << ": " << std::strerror(readError) << "\n";
    return std::nullopt;
  }
  if (!unicode::isValidUTF8(text)) {
    err << "kivi ulo: " << shown << " is not valid UTF-8 text\n";
    return std::nullopt;
  }
  return text;
}

int runUlo(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  const bool get = !args.empty() && args[0] == "get";
  const bool boolean = !args.empty() && args[0] == "bool";
  if (!get && !boolean) {
    err << (args.empty() ? "kivi ulo: no action given"
                         : "kivi ulo: unknown action '" + args[0] + "'")
        << " (see kivi ulo --help)\n";
    return 2;
  }
  if (args.size() < 3 || (get && args.size() > 3)) {
    err << "kivi ulo " << args[0] << ": "
        << (args.size() < 3 ? "needs FILE and KEY" : "too many arguments")
        << " (see kivi ulo --help)\n";
    return 2;
  }
  const auto text = readLaunchFile(args[1], err);
  if (!text) return 2;
  const KivUloFileParser parser(*text);
  ErrorPtr undecided;
  // A search that ran out of its budget has no answer: say so, do not guess.
  const auto noAnswer = [&] {
    err << "kivi ulo " << args[0] << ": the search for '" << args[2]
        << "' stopped before it could decide ("
        << undecided->userInfo().find(DebugDescriptionErrorKey)->second.description() << ")\n";
    return 3;
  };
  if (get) {
    const auto value = parser.getValue(args[2], &undecided);
    if (undecided) return noAnswer();
    if (!value) return 1;
    out << *value << "\n";
    return 0;
  }
  const std::vector<std::string> trueValues(args.begin() + 3, args.end());
  const bool yes = parser.getBooleanValue(args[2], trueValues, &undecided);
  if (undecided) return noAnswer();
  out << (yes ? "true" : "false") << "\n";
  return 0;
}

}  // namespace

Command uloCommand() {
  return {"ulo", "read a setting out of a ULO launch file",
          "usage: kivi ulo get FILE KEY\n"
          "       kivi ulo bool FILE KEY [TRUE_VALUE]...\n\n"
          "Looks KEY up in the launch file FILE ('-' reads standard input) with a\n"
          "KivUloFileParser. The file must be UTF-8 text.\n\n"
          "KEY is the setting's name and is read as a regular expression (ICU syntax):\n"
          "the first place where it is followed by '=' on a line ending in CR or LF\n"
          "wins, and the rest of that line, less trailing white space, is the value.\n\n"
          "  get   prints the value and a newline; prints nothing and exits 1 when the\n"
          "        setting is absent\n"
          "  bool  prints 'true' when the value, lower-cased, equals one of the\n"
          "        TRUE_VALUEs (taken as given), and 'false' otherwise, also when the\n"
          "        setting is absent or no TRUE_VALUE is given\n\n"
          "Exit code: 0 when a value or answer was printed, 1 when get finds no\n"
          "setting, 2 for bad arguments and for a file that cannot be read or is not\n"
          "valid UTF-8, 3 when a KEY with regular-expression syntax made the search\n"
          "too costly to finish (no answer either way).\n",
          runUlo};
}

const CommandRegistration kRegistration{30, &uloCommand};

}  // namespace kivi::tool
