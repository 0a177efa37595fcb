// kivi redact: the log redaction helpers on a URL, a token or header lines.
#include <iostream>
#include <ostream>

#include "command.h"
#include "kivi/logging/log_redaction.h"

namespace kivi::tool {

namespace {

// Reads "Name: value" lines from standard input, as an answer's header
// fields: blanks after the colon and a trailing CR are dropped, a name given
// again has its values joined with ", ", blank lines are skipped.
bool readHeaders(StringDictionary& headers, std::ostream& err) {
  std::string line;
  for (int number = 1; std::getline(std::cin, line); ++number) {
    if (!line.empty() && line.back() == '\r') line.pop_back();
    if (line.find_first_not_of(" \t") == std::string::npos) continue;
    const auto colon = line.find(':');
    if (colon == std::string::npos || colon == 0) {
      err << "kivi redact: input line " << number << " is not 'Name: value': '" << line << "'\n";
      return false;
    }
    const auto start = line.find_first_not_of(" \t", colon + 1);
    const std::string value = start == std::string::npos ? "" : line.substr(start);
    auto [field, added] = headers.emplace(line.substr(0, colon), value);
    if (!added) field->second += ", " + value;
  }
  return true;
}

void printHeaders(const StringDictionary& headers, std::ostream& out) {
  for (const auto& [name, value] : headers) out << name << ": " << value << "\n";
}

bool parseURL(const std::string& text, URLPtr& url, std::ostream& err) {
  url = URL::URLWithString(text);
  if (!url) err << "kivi redact: '" << text << "' is not a URL\n";
  return url != nullptr;
}

int runRedact(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  if (args.empty()) {
    err << "kivi redact: say what to redact: url, token, headers or keep (see kivi redact "
           "--help)\n";
    return 2;
  }
  const std::string& what = args[0];
  const std::vector<std::string> rest(args.begin() + 1, args.end());
  URLPtr url;
  if (what == "url") {
    if (rest.size() != 1) {
      err << "kivi redact url: give exactly one URL\n";
      return 2;
    }
    if (!parseURL(rest[0], url, err)) return 2;
    const auto text = KivSdkURLForLogging(url);
    if (!text) {
      err << "kivi redact url: the decoded URL is not UTF-8 text\n";
      return 1;
    }
    out << *text << "\n";
    return 0;
  }
  if (what == "token") {
    if (rest.size() > 1) {
      err << "kivi redact token: give at most one token\n";
      return 2;
    }
    out << KivSdkTokenForLogging(rest.empty() ? std::nullopt : std::optional(rest[0])) << "\n";
    return 0;
  }
  if (what == "headers") {
    if (!rest.empty() && (rest.size() != 2 || rest[0] != "--url")) {
      err << "kivi redact headers: the only option is --url URL\n";
      return 2;
    }
    if (!rest.empty() && !parseURL(rest[1], url, err)) return 2;
    StringDictionary headers;
    if (!readHeaders(headers, err)) return 2;
    const auto redacted =
        KivSdkResponseHeadersForLogging(std::make_shared<const StringDictionary>(headers), url);
    printHeaders(*redacted, out);
    return 0;
  }
  if (what == "keep") {
    StringDictionary headers;
    if (!readHeaders(headers, err)) return 2;
    printHeaders(
        KivSdkObfuscateHeadersForLogging(std::make_shared<const StringDictionary>(headers), rest),
        out);
    return 0;
  }
  err << "kivi redact: unknown kind '" << what << "': url, token, headers or keep\n";
  return 2;
}

}  // namespace

Command redactCommand() {
  return {"redact", "show a URL, token or header lines as they may be logged",
          "usage: kivi redact url URL\n"
          "       kivi redact token [TEXT]\n"
          "       kivi redact headers [--url URL] < lines\n"
          "       kivi redact keep [NAME]... < lines\n\n"
          "Prints the value as the log redaction helpers make it safe to log. A secret\n"
          "value becomes '***' when set and stays empty when empty; names are kept.\n\n"
          "  url      masks every query value and prints the URL percent-decoded\n"
          "  token    prints '***' for a token and 'nil' for an empty or missing one\n"
          "  headers  reads 'Name: value' lines from standard input and masks\n"
          "           Authorization; with --url, the Set-Cookie fields become the list\n"
          "           of cookies they set for that URL, their values masked\n"
          "  keep     reads the same lines and masks every value but those of the\n"
          "           NAMEs (exact names, letter case included)\n\n"
          "Header lines are printed sorted by name; a name given on several lines has\n"
          "its values joined with ', '. The exit code is 0, 1 when the URL cannot be\n"
          "shown (its decoded text is not UTF-8) and 2 for bad arguments or input.\n",
          runRedact};
}

const CommandRegistration kRegistration{50, &redactCommand};

}  // namespace kivi::tool
