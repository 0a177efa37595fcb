// kivi obfuscate and kivi unobfuscate: KivObfuscator on a text.
#include <ostream>

#include "command.h"
#include "kivi/logging/kiv_obfuscator.h"

namespace kivi::tool {

namespace {

int transform(const char* name, std::uint64_t transformation, const std::vector<std::string>& args,
              std::ostream& out, std::ostream& err) {
  if (args.size() != 1) {
    err << "kivi " << name << ": give exactly one TEXT (quote it if it has blanks)\n";
    return 2;
  }
  const auto result = KivObfuscator::transformString(args[0], transformation);
  if (!result) {
    err << "kivi " << name << ": no result: the text holds a NUL or the result is not UTF-8\n";
    return 1;
  }
  out << *result << "\n";
  return 0;
}

const char* const kNotes =
    "The shift at each byte depends on the text's byte length and the position.\n"
    "Texts of the characters '\"' to '}' come back unchanged after obfuscate and\n"
    "unobfuscate; '~' comes back as '\"', a space as '|', '!' as '}'. This is a\n"
    "scrambling without a key, not encryption.\n\n"
    "Exit code 0, 1 when there is no result (a text that holds U+0000, or a\n"
    "result that is not UTF-8, possible for non-ASCII text), 2 for bad arguments.\n";

}  // namespace

Command obfuscateCommand() {
  return {"obfuscate", "scramble a text with KivObfuscator",
          std::string("usage: kivi obfuscate TEXT\n\nPrints TEXT obfuscated, as long as TEXT.\n") +
              kNotes,
          [](const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
            return transform("obfuscate", KivObfuscator::kObfuscate, args, out, err);
          }};
}

Command unobfuscateCommand() {
  return {"unobfuscate", "unscramble a text made by kivi obfuscate",
          std::string("usage: kivi unobfuscate TEXT\n\nPrints TEXT unobfuscated.\n") + kNotes,
          [](const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
            return transform("unobfuscate", KivObfuscator::kUnobfuscate, args, out, err);
          }};
}

const CommandRegistration kObfuscateRegistration{51, &obfuscateCommand};
const CommandRegistration kUnobfuscateRegistration{52, &unobfuscateCommand};

}  // namespace kivi::tool
