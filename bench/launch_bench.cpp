// Launch-file lookups: the parser against compiling a pattern and searching
// with it on every lookup, side by side on the same text.
//
// The text (about 4 KB, the same on every run) is a launch file of several
// sections of name=value lines ending in CRLF. Each iteration looks up the
// same ten names: early, late, a name that is the tail of a longer one, one
// set twice and one that is missing.
//
//   BM_UloLookup/parser          KivUloFileParser::getValue (plain names take
//                                the plain search)
//   BM_UloLookup/regexPerLookup  compile name + "=.*[\r\n]+" with ICU and take
//                                its first match, every lookup
//
// items_per_second counts lookups; the speed-up is
//
//   Time(BM_UloLookup/regexPerLookup) / Time(BM_UloLookup/parser)
#include <benchmark/benchmark.h>

#include <string>
#include <string_view>
#include <vector>

#include "kivi/launch/kiv_ulo_file_parser.h"

namespace {

const std::string& launchFile() {
  static const std::string text = [] {
    std::string t = "[Launch]\r\nVersion=3\r\nClientAddress=127.0.0.1\r\nFullScreen=Yes\r\n";
    for (int section = 0; t.size() < 4000; ++section) {
      t += "\r\n[Display" + std::to_string(section) + "]\r\n";
      for (int i = 0; i < 12 && t.size() < 4000; ++i) {
        t += "Setting" + std::to_string(section) + "_" + std::to_string(i) + "=value " +
             std::to_string(i * 7919 % 1000) + " caf\u00e9\r\n";
      }
    }
    return t + "[Session]\r\nTransactionId=7f3e-11aa\r\nAddress=10.0.0.7\r\nVersion=4\r\n";
  }();
  return text;
}

const std::vector<std::string> kNames = {"Version",     "FullScreen",   "TransactionId", "Address",
                                         "Setting0_3",  "Setting3_11",  "Setting5_0",    "Missing",
                                         "Setting7_2x", "ClientAddress"};

void BM_UloLookupParser(benchmark::State& state) {
  const kivi::KivUloFileParser parser(launchFile());
  std::size_t found = 0;
  for (auto _ : state) {
    for (const auto& name : kNames) found += parser.getValue(name).has_value();
    benchmark::DoNotOptimize(found);
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kNames.size()));
  state.counters["bytes"] = static_cast<double>(launchFile().size());
}

void BM_UloLookupRegexPerLookup(benchmark::State& state) {
  const std::string& text = launchFile();
  std::size_t found = 0;
  for (auto _ : state) {
    for (const auto& name : kNames)
      found += kivi::detail::uloValueByPattern(text, name).has_value();
    benchmark::DoNotOptimize(found);
  }
  state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * kNames.size()));
}

BENCHMARK(BM_UloLookupParser)->Name("BM_UloLookup/parser");
BENCHMARK(BM_UloLookupRegexPerLookup)->Name("BM_UloLookup/regexPerLookup");

}  // namespace
