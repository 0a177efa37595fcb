// Reading the 1 MB benchmark document (json_document.h) into a DOM and
// freeing it again, one JSON library per run:
//
//   kivi       JSONSerialization::JSONObjectWithData to a kivi::Value
//   rapidjson  rapidjson::Document::Parse, default allocator and default
//              flags (which check neither UTF-8 nor round doubles exactly,
//              both of which this library does)
//   nlohmann   nlohmann::json::parse, no exceptions
//   qt         QJsonDocument::fromJson (QByteArray::fromRawData, no copy)
//   simdjson   a new dom::parser per document (its buffers are the DOM),
//              parse of the text as a plain std::string holds it
//
//   peer_json --lib rapidjson --iterations 200
//   {"client":"rapidjson","mode":"json","bytes":1048756,"iterations":200,
//    "median_ms":2.71,"cpu_s":0.55}
//
// After one unmeasured read, each iteration (parse + free) is timed on its
// own with the steady clock; median_ms is the median of those, cpu_s the
// process's CPU time over all of them. A library that was not found at build
// time prints {"client":…,"mode":"json","skipped":…} and exits 0; a document
// that does not read ends the run with exit status 1.
#include <simdjson.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <functional>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <string_view>
#include <vector>

#include "json_document.h"
#include "kivi/text/json_serialization.h"
#include "peer_common.h"

#ifdef KIVI_PEER_HAVE_RAPIDJSON
#include <rapidjson/document.h>
#endif
#ifdef KIVI_PEER_HAVE_QT
#include <QByteArray>
#include <QJsonDocument>
#include <QJsonParseError>
#endif

namespace {

using namespace kivi::bench::peers;

const std::string kClient = "json";

// Reads the text into the library's DOM and frees it; false when the text
// did not read.
using Reader = std::function<bool(const std::string& text)>;

bool readKivi(const std::string& text) {
  return kivi::JSONSerialization::JSONObjectWithData(text, 0, nullptr).has_value();
}

bool readNlohmann(const std::string& text) {
  const nlohmann::json value = nlohmann::json::parse(text, nullptr, false);
  return !value.is_discarded();
}

bool readSimdjson(const std::string& text) {
  simdjson::dom::parser parser;
  simdjson::dom::element root;
  return parser.parse(text.data(), text.size()).get(root) == simdjson::SUCCESS;
}

#ifdef KIVI_PEER_HAVE_RAPIDJSON
bool readRapidjson(const std::string& text) {
  rapidjson::Document document;
  document.Parse(text.data(), text.size());
  return !document.HasParseError();
}
#endif

#ifdef KIVI_PEER_HAVE_QT
bool readQt(const std::string& text) {
  const QByteArray bytes =
      QByteArray::fromRawData(text.data(), static_cast<qsizetype>(text.size()));
  QJsonParseError error{};
  const QJsonDocument document = QJsonDocument::fromJson(bytes, &error);
  return error.error == QJsonParseError::NoError && !document.isNull();
}
#endif

// The libraries this binary knows, and why one is missing.
struct Library {
  Reader read;
  std::string missing;
};

std::map<std::string, Library> libraries() {
  std::map<std::string, Library> known;
  known["kivi"] = {readKivi, {}};
  known["nlohmann"] = {readNlohmann, {}};
  known["simdjson"] = {readSimdjson, {}};
#ifdef KIVI_PEER_HAVE_RAPIDJSON
  known["rapidjson"] = {readRapidjson, {}};
#else
  known["rapidjson"] = {nullptr, "RapidJSON was not found at build time"};
#endif
#ifdef KIVI_PEER_HAVE_QT
  known["qt"] = {readQt, {}};
#else
  known["qt"] = {nullptr, "Qt 6 was not found at build time"};
#endif
  return known;
}

}  // namespace

int main(int argc, char** argv) {
  const std::string usage =
      "usage: peer_json --lib kivi|rapidjson|nlohmann|qt|simdjson [--iterations N]";
  std::string name;
  int iterations = 200;
  for (int i = 1; i < argc; ++i) {
    const std::string_view flag = argv[i];
    if (i + 1 >= argc) fail(kClient, "missing value after " + std::string(flag) + "\n" + usage);
    const std::string_view value = argv[++i];
    if (flag == "--lib") {
      name = value;
    } else if (flag == "--iterations") {
      const auto n = positive(value);
      if (!n) fail(kClient, "--iterations needs a positive integer\n" + usage);
      iterations = *n;
    } else {
      fail(kClient, "unknown option " + std::string(flag) + "\n" + usage);
    }
  }
  const auto known = libraries();
  const auto found = known.find(name);
  if (found == known.end()) fail(kClient, usage);
  const Library& library = found->second;
  if (!library.read) {
    printSkip(name, "json", library.missing);
    return 0;
  }

  const std::string& text = kivi::bench::document();
  if (!library.read(text)) fail(kClient, name + " did not read the document");
  std::vector<double> times;
  times.reserve(static_cast<std::size_t>(iterations));
  Meter meter;
  meter.start();
  for (int i = 0; i < iterations; ++i) {
    const auto start = std::chrono::steady_clock::now();
    const bool read = library.read(text);
    const auto end = std::chrono::steady_clock::now();
    if (!read) fail(kClient, name + " did not read the document");
    times.push_back(std::chrono::duration<double, std::milli>(end - start).count());
  }
  meter.stop();
  const auto middle = times.begin() + static_cast<std::ptrdiff_t>(times.size() / 2);
  std::nth_element(times.begin(), middle, times.end());
  double median = *middle;
  if (times.size() % 2 == 0) median = (median + *std::max_element(times.begin(), middle)) / 2;
  std::printf(
      "{\"client\":\"%s\",\"mode\":\"json\",\"bytes\":%zu,\"iterations\":%d,\"median_ms\":%.4f,"
      "\"cpu_s\":%.6f}\n",
      name.c_str(), text.size(), iterations, median, meter.cpu());
  return 0;
}
