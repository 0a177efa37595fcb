// Launching a child process through the seam against doing it by hand. Each
// row runs /bin/true 1,000 times; the rows are interleaved (seam, by hand,
// seam, ...) so that a machine busy for a while slows both alike.
//
//   BM_LaunchThroughSeam    KivNSProcessFactory -> createProcess -> launch,
//                           then wait for the termination handler   ≤ 1.3x
//   BM_SpawnAndWaitpid      floor: posix_spawn + waitpid
#include <benchmark/benchmark.h>
#include <spawn.h>
#include <sys/wait.h>

#include <condition_variable>
#include <memory>
#include <mutex>

#include "kivi/process/kiv_ns_process_factory.h"
#include "kivi/process/ns_task.h"

extern char** environ;

namespace kivi {
namespace {

constexpr int kLaunches = 1000;
constexpr int kRounds = 3;

void BM_LaunchThroughSeam(benchmark::State& state) {
  std::shared_ptr<KivNSProcessFactoryProtocol> factory = std::make_shared<KivNSProcessFactory>();
  std::mutex mutex;
  std::condition_variable finished;
  for (auto _ : state) {
    bool done = false;
    auto process = factory->createProcess();
    process->setLaunchPath("/bin/true");
    process->setTerminationHandler([&](const std::shared_ptr<NSTask>&) {
      std::lock_guard lock(mutex);
      done = true;
      finished.notify_one();
    });
    process->launch();
    std::unique_lock lock(mutex);
    finished.wait(lock, [&] { return done; });
    if (process->terminationStatus() != 0) state.SkipWithError("/bin/true failed");
  }
}

void BM_SpawnAndWaitpid(benchmark::State& state) {
  char program[] = "/bin/true";
  char* argv[] = {program, nullptr};
  for (auto _ : state) {
    pid_t pid = 0;
    if (::posix_spawn(&pid, program, nullptr, nullptr, argv, environ) != 0) {
      state.SkipWithError("posix_spawn failed");
      break;
    }
    int status = 0;
    ::waitpid(pid, &status, 0);
    benchmark::DoNotOptimize(status);
  }
}

const bool kRegistered = [] {
  for (int round = 0; round < kRounds; ++round) {
    benchmark::RegisterBenchmark("BM_LaunchThroughSeam", BM_LaunchThroughSeam)
        ->Iterations(kLaunches)
        ->Unit(benchmark::kMicrosecond)
        ->UseRealTime();
    benchmark::RegisterBenchmark("BM_SpawnAndWaitpid", BM_SpawnAndWaitpid)
        ->Iterations(kLaunches)
        ->Unit(benchmark::kMicrosecond)
        ->UseRealTime();
  }
  return true;
}();

}  // namespace
}  // namespace kivi
