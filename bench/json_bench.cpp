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
#include <random>
#include <string>
#include <string_view>

#include "kivi/text/json_serialization.h"

namespace {

const std::string& document() {
  static const std::string text = [] {
    std::mt19937_64 random(42);
    auto below = [&](std::uint64_t n) { return random() % n; };
    static const char* const kWords[] = {"alpha", "beta",   "gamma", "Zoë",   "naïve", "café",
                                         "東京",  "Ελλάδα", "😀",     "delta", "omega", "x/y"};
    auto words = [&](int n) {
      std::string s;
      for (int i = 0; i < n; ++i) {
        if (i) s += ' ';
        s += kWords[below(std::size(kWords))];
      }
      return s;
    };
    std::string json = "[";
    for (int id = 0; json.size() < (1u << 20); ++id) {
      if (id) json += ',';
      json += "{\"id\":" + std::to_string(id);
      json += ",\"guid\":\"" + std::to_string(random()) + "-" + std::to_string(below(1000)) + "\"";
      json += ",\"name\":\"" + words(2) + "\"";
      json += ",\"active\":" + std::string(below(2) ? "true" : "false");
      json += ",\"balance\":" + std::to_string(below(1'000'000) / 100.0);
      json +=
          ",\"score\":" + std::to_string(static_cast<std::int64_t>(random() >> 20) - (1ll << 42));
      json += ",\"about\":\"" + words(12) + " \\\"quoted\\\"\\n\\tline \\u00e9\"";
      json += ",\"location\":{\"lat\":" + std::to_string(below(180'000'000) / 1e6 - 90) +
              ",\"lon\":" + std::to_string(below(360'000'000) / 1e6 - 180) + ",\"city\":null}";
      json += ",\"tags\":[";
      for (int t = 0, n = static_cast<int>(below(6)); t < n; ++t) {
        json += t ? ",\"" : "\"";
        json += words(1);
        json += '"';
      }
      json += "],\"history\":[";
      for (int h = 0, n = static_cast<int>(below(12)); h < n; ++h) {
        if (h) json += ',';
        json += std::to_string(below(100'000));
      }
      json += "],\"matrix\":[[1.5,2.25],[3,4e-3],[]]}";
    }
    json += "]";
    return json;
  }();
  return text;
}

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
