// JSON reading and writing against nlohmann::json, side by side on the same
// document.
//
// The document (about 1 MB, generated the same way on every run) is an array
// of records: strings with escapes and non-ASCII text, integers, doubles,
// booleans, nulls, a nested object and nested arrays of numbers and strings.
//
//   BM_JSONRead/kivi        JSONSerialization::JSONObjectWithData to a Value
//   BM_JSONRead/nlohmann    nlohmann::json::parse to its own DOM
//   BM_JSONRead/kiviCareful the document with an integer beyond 64 bits
//                           added at its end, which simdjson refuses: the
//                           careful reader (nlohmann's SAX parser) reads it
//   BM_JSONReadAndFree/...  the same, plus freeing the result (the reads
//                           above free it with the timer paused)
//   BM_JSONWrite/kivi       dataWithJSONObject of that Value, compact
//   BM_JSONWrite/nlohmann   nlohmann::json::dump of its DOM, compact
//
// bytes_per_second counts the source document's bytes in every row, so the
// rows compare directly; the reading ratio is
//
//   bytes_per_second(BM_JSONRead/kivi) / bytes_per_second(BM_JSONRead/nlohmann)
#include <benchmark/benchmark.h>

#include <cstdint>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>

#include "json_document.h"
#include "kivi/text/json_serialization.h"

namespace {

using kivi::bench::document;

// The document with an integer beyond 64 bits as its last element.
const std::string& documentBeyond64Bits() {
  static const std::string text =
      document().substr(0, document().size() - 1) + ",18446744073709551616]";
  return text;
}

// Reads the text, freeing the result with the timer running only when
// kTimeFree.
template <bool kTimeFree, class Read>
void readDocument(benchmark::State& state, Read read, const std::string& text = document()) {
  for (auto _ : state) {
    auto value = read(text);
    if (!value) state.SkipWithError("the document did not read");
    benchmark::DoNotOptimize(value);
    if (!kTimeFree) state.PauseTiming();
    value.reset();
    if (!kTimeFree) state.ResumeTiming();
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

std::optional<kivi::Value> readKivi(const std::string& text) {
  return kivi::JSONSerialization::JSONObjectWithData(text, 0, nullptr);
}

// Held by pointer: GCC 12 misreads std::optional<nlohmann::json> as possibly
// uninitialised inside nlohmann's header.
std::unique_ptr<nlohmann::json> readNlohmann(const std::string& text) {
  auto value = std::make_unique<nlohmann::json>(nlohmann::json::parse(text, nullptr, false));
  if (value->is_discarded()) value.reset();
  return value;
}

void BM_JSONReadKivi(benchmark::State& state) { readDocument<false>(state, readKivi); }
void BM_JSONReadNlohmann(benchmark::State& state) { readDocument<false>(state, readNlohmann); }
void BM_JSONReadKiviCareful(benchmark::State& state) {
  readDocument<false>(state, readKivi, documentBeyond64Bits());
}
void BM_JSONReadAndFreeKivi(benchmark::State& state) { readDocument<true>(state, readKivi); }
void BM_JSONReadAndFreeNlohmann(benchmark::State& state) {
  readDocument<true>(state, readNlohmann);
}

void BM_JSONWriteKivi(benchmark::State& state) {
  const std::string& text = document();
  const auto value = kivi::JSONSerialization::JSONObjectWithData(text, 0, nullptr);
  if (!value) return state.SkipWithError("the document did not read");
  for (auto _ : state) {
    auto data = kivi::JSONSerialization::dataWithJSONObject(*value, 0, nullptr);
    benchmark::DoNotOptimize(data);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

void BM_JSONWriteNlohmann(benchmark::State& state) {
  const std::string& text = document();
  const auto value = nlohmann::json::parse(text);
  for (auto _ : state) {
    auto dumped = value.dump();
    benchmark::DoNotOptimize(dumped);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

BENCHMARK(BM_JSONReadKivi)->Name("BM_JSONRead/kivi")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_JSONReadNlohmann)->Name("BM_JSONRead/nlohmann")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_JSONReadKiviCareful)->Name("BM_JSONRead/kiviCareful")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_JSONReadAndFreeKivi)->Name("BM_JSONReadAndFree/kivi")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_JSONReadAndFreeNlohmann)
    ->Name("BM_JSONReadAndFree/nlohmann")
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_JSONWriteKivi)->Name("BM_JSONWrite/kivi")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_JSONWriteNlohmann)->Name("BM_JSONWrite/nlohmann")->Unit(benchmark::kMillisecond);

}  // namespace
