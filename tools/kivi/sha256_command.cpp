// kivi sha256: the SHA-256 digest of a text's UTF-8 bytes.
#include <ostream>

#include "command.h"
#include "kivi/utils/kiv_utils.h"

namespace kivi::tool {

namespace {

int runSha256(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  if (args.size() != 1) {
    err << "kivi sha256: expected exactly one TEXT (see kivi sha256 --help)\n";
    return 2;
  }
  const auto digest = KivUtils::sha256Hash(args[0]);
  if (!digest) {
    err << "kivi sha256: the text is not valid UTF-8\n";
    return 1;
  }
  out << *digest << "\n";
  return 0;
}

}  // namespace

Command sha256Command() {
  return {"sha256", "print the SHA-256 digest of a text",
          "usage: kivi sha256 TEXT\n\n"
          "Prints the SHA-256 digest of TEXT's UTF-8 bytes as 64 lowercase hexadecimal\n"
          "digits (KivUtils::sha256Hash). Text that is not valid UTF-8 has no digest:\n"
          "the exit code is then 1; it is 2 for bad arguments.\n",
          runSha256};
}

const CommandRegistration kRegistration{40, &sha256Command};

}  // namespace kivi::tool
