// A double's operation answered by its callback, against calling the same
// std::function directly; the difference is what the double adds (the call
// through the interface and the callback's null check). Target: at most 3 ns.
//
//   BM_DoubleCall/feature_flag     KivFeatureFlagProviderProtocol →
//                                  MockKivFeatureFlagProvider → its callback
//   BM_DirectCall/feature_flag     the same callback called directly
//   BM_DoubleCall/timer_start      KivTimerProtocol::start → MockKivTimer
//   BM_DirectCall/timer_start      the same callback called directly
//
// Both sides go through an opaque pointer so that neither call is inlined
// away.
#include <benchmark/benchmark.h>

#include <functional>
#include <memory>
#include <string>

#include "kivi/doubles/mock_kiv_feature_flag_provider.h"
#include "kivi/doubles/mock_kiv_timer.h"

namespace kivi {
namespace {

template <class T>
T* opaque(T* pointer) {
  benchmark::DoNotOptimize(pointer);
  return pointer;
}

void BM_DoubleCallFeatureFlag(benchmark::State& state) {
  auto flags = std::make_shared<MockKivFeatureFlagProvider>();
  int calls = 0;
  flags->valueForFeatureFlagBlock = [&calls](const std::string&, const std::string&) {
    return ++calls % 2 == 0;
  };
  KivFeatureFlagProviderProtocol* seam = opaque<KivFeatureFlagProviderProtocol>(flags.get());
  const std::string service = "checkout", flag = "new-flow";
  for (auto _ : state)
    benchmark::DoNotOptimize(seam->valueForFeatureFlagWithServiceName(service, flag));
}

void BM_DirectCallFeatureFlag(benchmark::State& state) {
  int calls = 0;
  std::function<bool(const std::string&, const std::string&)> block =
      [&calls](const std::string&, const std::string&) { return ++calls % 2 == 0; };
  auto* callable = opaque(&block);
  const std::string service = "checkout", flag = "new-flow";
  for (auto _ : state) benchmark::DoNotOptimize((*callable)(service, flag));
}

void BM_DoubleCallTimerStart(benchmark::State& state) {
  auto timer = std::make_shared<MockKivTimer>();
  int starts = 0;
  timer->startTimerBlock = [&starts] { ++starts; };
  KivTimerProtocol* seam = opaque<KivTimerProtocol>(timer.get());
  for (auto _ : state) seam->start();
  benchmark::DoNotOptimize(starts);
}

void BM_DirectCallTimerStart(benchmark::State& state) {
  int starts = 0;
  std::function<void()> block = [&starts] { ++starts; };
  auto* callable = opaque(&block);
  for (auto _ : state) (*callable)();
  benchmark::DoNotOptimize(starts);
}

BENCHMARK(BM_DoubleCallFeatureFlag)->Name("BM_DoubleCall/feature_flag");
BENCHMARK(BM_DirectCallFeatureFlag)->Name("BM_DirectCall/feature_flag");
BENCHMARK(BM_DoubleCallTimerStart)->Name("BM_DoubleCall/timer_start");
BENCHMARK(BM_DirectCallTimerStart)->Name("BM_DirectCall/timer_start");

}  // namespace
}  // namespace kivi
