// The JSON document the reading benchmarks parse: about 1 MB, generated the
// same way on every run (a fixed seed), so every reader and every run sees
// the same bytes.
//
// It is an array of records: strings with escapes and non-ASCII text
// (accented Latin, Greek, CJK, an emoji), integers (some beyond 32 bits,
// negative ones too), doubles, booleans, nulls, a nested object and nested
// arrays of numbers and strings.
//
//   const std::string& text = kivi::bench::document();
//
// Thread contract: document() may be called from any thread; the text is
// built once, on first use.
#pragma once

#include <cstdint>
#include <iterator>
#include <random>
#include <string>

namespace kivi::bench {

inline const std::string& document() {
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

}  // namespace kivi::bench
