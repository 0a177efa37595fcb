// The loggers against doing the same work by hand, side by side.
//
//   BM_LogCall/direct          a virtual call of logInfoWithModule on a delegate
//                              that does nothing
//   BM_LogCall/lockAndCall     the same after upgrading a weak_ptr to it: the
//                              least a weakly held delegate can cost
//   BM_LogCall/facade          KivSwiftSdkLogger::logInfo to that delegate
//   BM_LogCall/noDelegate      KivSdkLogger::logWithModule with a format and
//                              arguments but no delegate (a disabled logger)
//   BM_FormatLine/snprintf     snprintf of "%s %d %s" into a stack buffer, then
//                              the delegate call
//   BM_FormatLine/logWithModule
//                              KivSdkLogger::logWithModule with "%@ %d %s" (a
//                              string Value, an int, a C string)
//   BM_FormatLine/format       kivi::format of that line alone (a new string)
//
// The ratios of interest are facade / direct and logWithModule / snprintf.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <string_view>

#include "kivi/text/format.h"
#include "kivi/logging/kiv_sdk_logger.h"
#include "kivi/logging/kiv_swift_sdk_logger.h"

namespace {

using kivi::KivSdkLoggerDelegate;

// Out of line and opaque (an empty asm), so that no row can inline or drop
// the call.
class NullDelegate : public KivSdkLoggerDelegate {
 public:
  void logCriticalWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                             std::string_view) override;
  void logErrorWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                          std::string_view) override;
  void logWarnWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                         std::string_view) override;
  void logInfoWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                         std::string_view) override;
  void logVerboseWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                            std::string_view) override;
  void logSupportWithModule(std::string_view, std::string_view, std::string_view, std::uint64_t,
                            std::string_view) override;
};

#define KIVI_NULL_METHOD(name)                                                                 \
  __attribute__((noinline)) void NullDelegate::name(                                           \
      std::string_view, std::string_view, std::string_view, std::uint64_t, std::string_view) { \
    asm volatile("");                                                                          \
  }
KIVI_NULL_METHOD(logCriticalWithModule)
KIVI_NULL_METHOD(logErrorWithModule)
KIVI_NULL_METHOD(logWarnWithModule)
KIVI_NULL_METHOD(logInfoWithModule)
KIVI_NULL_METHOD(logVerboseWithModule)
KIVI_NULL_METHOD(logSupportWithModule)
#undef KIVI_NULL_METHOD

constexpr std::string_view kModule = "bench";
constexpr std::string_view kMessage = "request finished";

void BM_LogCall_direct(benchmark::State& state) {
  const std::shared_ptr<KivSdkLoggerDelegate> owner = std::make_shared<NullDelegate>();
  KivSdkLoggerDelegate* delegate = owner.get();
  benchmark::DoNotOptimize(delegate);  // hide the dynamic type
  for (auto _ : state) delegate->logInfoWithModule(kModule, __FILE__, __func__, 42, kMessage);
}
BENCHMARK(BM_LogCall_direct)->Name("BM_LogCall/direct");

void BM_LogCall_lockAndCall(benchmark::State& state) {
  const std::shared_ptr<KivSdkLoggerDelegate> owner = std::make_shared<NullDelegate>();
  const std::weak_ptr<KivSdkLoggerDelegate> weak = owner;
  for (auto _ : state) {
    if (auto delegate = weak.lock()) {
      delegate->logInfoWithModule(kModule, __FILE__, __func__, 42, kMessage);
    }
  }
}
BENCHMARK(BM_LogCall_lockAndCall)->Name("BM_LogCall/lockAndCall");

void BM_LogCall_facade(benchmark::State& state) {
  const std::shared_ptr<KivSdkLoggerDelegate> owner = std::make_shared<NullDelegate>();
  const kivi::KivSwiftSdkLogger log("bench", owner);
  for (auto _ : state) log.logInfo(kModule, __FILE__, __func__, 42, kMessage);
}
BENCHMARK(BM_LogCall_facade)->Name("BM_LogCall/facade");

void BM_LogCall_noDelegate(benchmark::State& state) {
  const auto logger = kivi::KivSdkLogger::create();
  const kivi::Value name("alpha");
  for (auto _ : state) {
    logger->logWithModule("bench", 4, __FILE__, __func__, 42, "%@ %d %s", name, 42, "done");
  }
}
BENCHMARK(BM_LogCall_noDelegate)->Name("BM_LogCall/noDelegate");

void BM_FormatLine_snprintf(benchmark::State& state) {
  const std::shared_ptr<KivSdkLoggerDelegate> owner = std::make_shared<NullDelegate>();
  KivSdkLoggerDelegate* delegate = owner.get();
  benchmark::DoNotOptimize(delegate);
  const kivi::Value name("alpha");
  int number = 42;
  for (auto _ : state) {
    benchmark::DoNotOptimize(number);
    char line[256];
    const int n =
        std::snprintf(line, sizeof line, "%.*s %d %s", static_cast<int>(name.asString()->size()),
                      name.asString()->data(), number, "done");
    delegate->logInfoWithModule(kModule, __FILE__, __func__, 42,
                                std::string_view(line, static_cast<std::size_t>(n)));
  }
}
BENCHMARK(BM_FormatLine_snprintf)->Name("BM_FormatLine/snprintf");

void BM_FormatLine_logWithModule(benchmark::State& state) {
  const std::shared_ptr<KivSdkLoggerDelegate> owner = std::make_shared<NullDelegate>();
  const auto logger = kivi::KivSdkLogger::create(owner);
  const kivi::Value name("alpha");
  int number = 42;
  for (auto _ : state) {
    benchmark::DoNotOptimize(number);
    logger->logWithModule("bench", 4, __FILE__, __func__, 42, "%@ %d %s", name, number, "done");
  }
}
BENCHMARK(BM_FormatLine_logWithModule)->Name("BM_FormatLine/logWithModule");

void BM_FormatLine_format(benchmark::State& state) {
  const kivi::Value name("alpha");
  int number = 42;
  for (auto _ : state) {
    benchmark::DoNotOptimize(number);
    benchmark::DoNotOptimize(kivi::format("%@ %d %s", name, number, "done"));
  }
}
BENCHMARK(BM_FormatLine_format)->Name("BM_FormatLine/format");

}  // namespace
