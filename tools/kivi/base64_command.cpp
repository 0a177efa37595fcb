// kivi base64: the three base64 forms of the string utilities.
#include <optional>
#include <ostream>
#include <string_view>

#include "command.h"
#include "kivi/utils/kiv_utils.h"

namespace kivi::tool {

namespace {

struct Mode {
  std::string_view name;
  std::optional<std::string> (*apply)(std::string_view);
  const char* failure;  // why a null result came about
};

std::optional<std::string> urlToStandard(std::string_view text) {
  return KivUtils::base64FromBase64URLEncodedString(text);
}

constexpr Mode kModes[] = {
    {"encode", &KivUtils::encodeIntoBase64String, "the text is not valid UTF-8"},
    {"decode", &KivUtils::decodeFromBase64String,
     "not strict standard base64, or the bytes are not UTF-8 text"},
    {"url-encode", &KivUtils::base64URLEncodedStringFromString, "the text is not valid UTF-8"},
    {"url-to-standard", &urlToStandard, ""},
    {"vrel-encode", &KivUtils::vrelBase64URLEncodedStringFromString, "the text is not valid UTF-8"},
    {"vrel-decode", &KivUtils::decodeFromVrelBase64URLEncodedString,
     "not vrel base64, or the bytes are not UTF-8 text"},
};

int runBase64(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  if (args.size() != 2) {
    err << "kivi base64: expected MODE and TEXT (see kivi base64 --help)\n";
    return 2;
  }
  for (const Mode& mode : kModes) {
    if (mode.name != args[0]) continue;
    const auto result = mode.apply(args[1]);
    if (!result) {
      err << "kivi base64 " << mode.name << ": " << mode.failure << "\n";
      return 1;
    }
    out << *result << "\n";
    return 0;
  }
  err << "kivi base64: unknown mode '" << args[0] << "' (see kivi base64 --help)\n";
  return 2;
}

}  // namespace

Command base64Command() {
  return {"base64", "convert text to and from standard, URL-safe and vrel base64",
          "usage: kivi base64 MODE TEXT\n\n"
          "Applies one of the KivUtils base64 operations to TEXT and prints the result.\n\n"
          "  encode           standard base64 of TEXT's UTF-8 bytes (encodeIntoBase64String)\n"
          "  decode           the text that standard base64 TEXT encodes; strict: no\n"
          "                   blanks, line breaks or missing padding (decodeFromBase64String)\n"
          "  url-encode       URL-safe base64, '-' and '_', no padding\n"
          "                   (base64URLEncodedStringFromString)\n"
          "  url-to-standard  URL-safe base64 TEXT rewritten as standard base64, padded,\n"
          "                   not decoded (base64FromBase64URLEncodedString)\n"
          "  vrel-encode      vrel base64: '_', '!' and '-' in place of '+', '/' and '='\n"
          "                   (vrelBase64URLEncodedStringFromString)\n"
          "  vrel-decode      the text that vrel base64 TEXT encodes\n"
          "                   (decodeFromVrelBase64URLEncodedString)\n\n"
          "  kivi base64 vrel-encode a      prints YQ--\n"
          "  kivi base64 url-to-standard YQ prints YQ==\n\n"
          "When the operation has no result (TEXT is not valid UTF-8, not valid base64,\n"
          "or decodes to bytes that are not UTF-8 text) a message goes to standard error\n"
          "and the exit code is 1; it is 2 for bad arguments.\n",
          runBase64};
}

const CommandRegistration kRegistration{41, &base64Command};

}  // namespace kivi::tool
