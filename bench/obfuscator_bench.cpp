// KivObfuscator's buffer form on 1 MiB of printable text, in place: one pass,
// no allocation. Each pass maps '#'...'}' into the printable range again, so
// repeated passes see input like the first one.
//
//   BM_ObfuscatorObfuscateBuffer     obfuscateString(buffer, length)
//   BM_ObfuscatorUnobfuscateBuffer   unobfuscateString(buffer, length)
//   BM_ObfuscatorObfuscateString     obfuscateString(text): copy, pass, UTF-8 check
//
// bytes_per_second counts the buffer's bytes.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <optional>
#include <random>
#include <string>

#include "kivi/logging/kiv_obfuscator.h"

namespace {

constexpr std::size_t kLength = 1 << 20;

std::string printableText() {
  std::mt19937_64 random(91);
  std::string text(kLength, ' ');
  for (char& c : text) c = static_cast<char>(35 + random() % 91);
  return text;
}

void BM_ObfuscatorObfuscateBuffer(benchmark::State& state) {
  std::string text = printableText();
  for (auto _ : state) {
    kivi::KivObfuscator::obfuscateString(text.data(), text.size());
    benchmark::DoNotOptimize(text.data());
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * kLength));
}
BENCHMARK(BM_ObfuscatorObfuscateBuffer);

void BM_ObfuscatorUnobfuscateBuffer(benchmark::State& state) {
  std::string text = printableText();
  for (auto _ : state) {
    kivi::KivObfuscator::unobfuscateString(text.data(), text.size());
    benchmark::DoNotOptimize(text.data());
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * kLength));
}
BENCHMARK(BM_ObfuscatorUnobfuscateBuffer);

void BM_ObfuscatorObfuscateString(benchmark::State& state) {
  const std::optional<std::string> text = printableText();
  for (auto _ : state) {
    auto result = kivi::KivObfuscator::obfuscateString(text);
    benchmark::DoNotOptimize(result);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * kLength));
}
BENCHMARK(BM_ObfuscatorObfuscateString);

}  // namespace
