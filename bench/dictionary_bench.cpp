// Dictionary and JSON utilities:
//
//   BM_ToJSONObject/kivi           KivUtils::toJSONObject of a ~1 MB document
//   BM_ToJSONObject/nlohmann       nlohmann::json::parse of the same text
//   BM_CaseInsensitiveLookup/hit   valueForCaseInsensitiveKey in 20 headers,
//                                  a key in other letter case
//   BM_CaseInsensitiveLookup/miss  the same for a key that is not there
//   BM_CaseInsensitiveLookup/trim  the defaultValue form, which trims the key
//
// The parsed documents are freed with the timer paused; bytes_per_second
// counts the source text, so the parsing ratio is
//
//   bytes_per_second(BM_ToJSONObject/kivi) / bytes_per_second(BM_ToJSONObject/nlohmann)
#include <benchmark/benchmark.h>

#include <cstdint>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <random>
#include <string>

#include "kivi/utils/dictionary_utils.h"

namespace {

// An array of records of every JSON kind, with escapes and non-ASCII text,
// the same on every run.
const std::string& document() {
  static const std::string text = [] {
    std::mt19937_64 random(7);
    auto below = [&](std::uint64_t n) { return random() % n; };
    static const char* const kWords[] = {"alpha",  "beta", "Zoë",   "naïve", "東京",
                                         "Ελλάδα", "😀",    "delta", "omega", "x/y"};
    auto words = [&](int n) {
      std::string s;
      for (int i = 0; i < n; ++i) s += std::string(i ? " " : "") + kWords[below(std::size(kWords))];
      return s;
    };
    std::string json = "[";
    for (int id = 0; json.size() < (1u << 20); ++id) {
      json += id ? ",{\"id\":" : "{\"id\":";
      json += std::to_string(id) + ",\"name\":\"" + words(2) + "\"";
      json += ",\"active\":" + std::string(below(2) ? "true" : "false");
      json += ",\"balance\":" + std::to_string(below(1'000'000) / 100.0);
      json += ",\"about\":\"" + words(10) + " \\\"quoted\\\"\\n\\u00e9\"";
      json += ",\"when\":\"2021-03-04T05:06:07.089+0000\",\"parent\":null";
      json += ",\"location\":{\"lat\":" + std::to_string(below(180'000'000) / 1e6 - 90) +
              ",\"lon\":" + std::to_string(below(360'000'000) / 1e6 - 180) + "}";
      json += ",\"history\":[";
      for (int h = 0, n = static_cast<int>(below(10)); h < n; ++h) {
        if (h) json += ',';
        json += std::to_string(below(100'000));
      }
      json += "]}";
    }
    return json + "]";
  }();
  return text;
}

template <class Parse>
void parseDocument(benchmark::State& state, Parse parse) {
  const std::string& text = document();
  for (auto _ : state) {
    auto value = parse(text);
    if (!value) state.SkipWithError("the document did not parse");
    benchmark::DoNotOptimize(value);
    state.PauseTiming();
    value.reset();
    state.ResumeTiming();
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}

void BM_ToJSONObjectKivi(benchmark::State& state) {
  parseDocument(state, [](const std::string& text) { return kivi::KivUtils::toJSONObject(text); });
}

// Held by pointer: GCC 12 misreads std::optional<nlohmann::json> as possibly
// uninitialised inside nlohmann's header.
void BM_ToJSONObjectNlohmann(benchmark::State& state) {
  parseDocument(state, [](const std::string& text) {
    auto value = std::make_unique<nlohmann::json>(nlohmann::json::parse(text, nullptr, false));
    if (value->is_discarded()) value.reset();
    return value;
  });
}

// Response headers as a typical server sends them.
const kivi::Dictionary& headers() {
  static const kivi::Dictionary kHeaders = {
      {"Accept-Ranges", "bytes"},
      {"Age", "0"},
      {"Cache-Control", "no-cache"},
      {"Connection", "keep-alive"},
      {"Content-Encoding", "gzip"},
      {"Content-Length", "5120"},
      {"Content-Type", "application/json; charset=utf-8"},
      {"Date", "Thu, 04 Mar 2021 05:06:07 GMT"},
      {"ETag", "\"33a64df5\""},
      {"Expires", "0"},
      {"Last-Modified", "Wed, 03 Mar 2021 05:06:07 GMT"},
      {"Pragma", "no-cache"},
      {"Server", "nginx"},
      {"Set-Cookie", "id=a3fWa; Secure; HttpOnly"},
      {"Strict-Transport-Security", "max-age=63072000"},
      {"Vary", "Accept-Encoding"},
      {"Via", "1.1 proxy"},
      {"X-Content-Type-Options", "nosniff"},
      {"X-Frame-Options", "DENY"},
      {"X-Request-Id", "f058ebd6-02f7-4d3f"},
  };
  return kHeaders;
}

void BM_CaseInsensitiveLookupHit(benchmark::State& state) {
  for (auto _ : state) {
    auto value = kivi::CaseInsensitive::valueForCaseInsensitiveKey(headers(), "content-type");
    benchmark::DoNotOptimize(value);
  }
}

void BM_CaseInsensitiveLookupMiss(benchmark::State& state) {
  for (auto _ : state) {
    auto value = kivi::CaseInsensitive::valueForCaseInsensitiveKey(headers(), "x-missing-header");
    benchmark::DoNotOptimize(value);
  }
}

void BM_CaseInsensitiveLookupTrim(benchmark::State& state) {
  for (auto _ : state) {
    auto value = kivi::CaseInsensitive::valueForCaseInsensitiveKey(headers(), " x-request-id ",
                                                                   std::nullopt);
    benchmark::DoNotOptimize(value);
  }
}

BENCHMARK(BM_ToJSONObjectKivi)->Name("BM_ToJSONObject/kivi")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ToJSONObjectNlohmann)->Name("BM_ToJSONObject/nlohmann")->Unit(benchmark::kMillisecond);
BENCHMARK(BM_CaseInsensitiveLookupHit)->Name("BM_CaseInsensitiveLookup/hit");
BENCHMARK(BM_CaseInsensitiveLookupMiss)->Name("BM_CaseInsensitiveLookup/miss");
BENCHMARK(BM_CaseInsensitiveLookupTrim)->Name("BM_CaseInsensitiveLookup/trim");

}  // namespace
