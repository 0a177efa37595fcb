// Device facts, each asked with 100 extra threads alive in the process (they
// sleep on a condition variable; percentCpuUsage reads every thread).
//
//   BM_PercentCpuUsage          KivDevice::percentCpuUsage            ≤ 2 ms
//   BM_ReadEveryTaskStat        floor: open, read and close
//                               /proc/self/task/<tid>/stat of every thread
//   BM_Memory/<figure>          each memory figure of KivDevice       ≤ 50 µs
//   BM_ReadProcFile/<file>      floor: one read of the file the figures
//                               above come from
//   BM_PlatformName             KivDevice::platformName after the first call
//                                                                     ≤ 2 µs
#include <benchmark/benchmark.h>
#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "kivi/device/kiv_device.h"

namespace kivi {
namespace {

class SleepingThreads {
 public:
  explicit SleepingThreads(int count) {
    for (int i = 0; i < count; ++i) {
      threads_.emplace_back([this] {
        std::unique_lock lock(mutex_);
        wake_.wait(lock, [this] { return stop_; });
      });
    }
  }
  ~SleepingThreads() {
    {
      std::lock_guard lock(mutex_);
      stop_ = true;
    }
    wake_.notify_all();
    for (auto& thread : threads_) thread.join();
  }

 private:
  std::mutex mutex_;
  std::condition_variable wake_;
  bool stop_ = false;
  std::vector<std::thread> threads_;
};

void ensureHundredThreads() { static SleepingThreads threads(100); }

std::size_t readWhole(const char* path) {
  char buffer[4096];
  const int fd = ::open(path, O_RDONLY | O_CLOEXEC);
  if (fd < 0) return 0;
  std::size_t total = 0;
  for (ssize_t n; (n = ::read(fd, buffer, sizeof buffer)) > 0;)
    total += static_cast<std::size_t>(n);
  ::close(fd);
  return total;
}

void BM_PercentCpuUsage(benchmark::State& state) {
  ensureHundredThreads();
  for (auto _ : state) benchmark::DoNotOptimize(KivDevice::percentCpuUsage());
  state.SetLabel("threads alive: 101+");
}

void BM_ReadEveryTaskStat(benchmark::State& state) {
  ensureHundredThreads();
  for (auto _ : state) {
    DIR* dir = ::opendir("/proc/self/task");
    std::size_t bytes = 0;
    while (const dirent* entry = ::readdir(dir)) {
      if (entry->d_name[0] == '.') continue;
      const std::string path = std::string("/proc/self/task/") + entry->d_name + "/stat";
      bytes += readWhole(path.c_str());
    }
    ::closedir(dir);
    benchmark::DoNotOptimize(bytes);
  }
}

template <typename Figure>
void BM_Memory(benchmark::State& state, Figure figure) {
  ensureHundredThreads();
  for (auto _ : state) benchmark::DoNotOptimize(figure());
}

void BM_ReadProcFile(benchmark::State& state, const char* path) {
  ensureHundredThreads();
  for (auto _ : state) benchmark::DoNotOptimize(readWhole(path));
}

void BM_PlatformName(benchmark::State& state) {
  ensureHundredThreads();
  benchmark::DoNotOptimize(KivDevice::platformName());
  for (auto _ : state) benchmark::DoNotOptimize(KivDevice::platformName());
}

BENCHMARK(BM_PercentCpuUsage)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_ReadEveryTaskStat)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, processResidentSize, &KivDevice::processResidentSize)
    ->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, processPhysicalFootprint, &KivDevice::processPhysicalFootprint)
    ->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, physicalMemory, &KivDevice::physicalMemory)
    ->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, processFreeMemory, &KivDevice::processFreeMemory)
    ->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, totalMemory, &KivDevice::totalMemory)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, userMemory, &KivDevice::userMemory)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, applicationMemory, &KivDevice::applicationMemory)
    ->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Memory, freeMemory, &KivDevice::freeMemory)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_ReadProcFile, self_stat, "/proc/self/stat")->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_ReadProcFile, self_status, "/proc/self/status")->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_ReadProcFile, smaps_rollup, "/proc/self/smaps_rollup")
    ->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_ReadProcFile, meminfo, "/proc/meminfo")->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_ReadProcFile, vmstat, "/proc/vmstat")->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_PlatformName)->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace kivi
