#include "kivi/system/mach.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "fake_root.h"

namespace kivi {
namespace {

// Each test reads from a fresh fake root.
class MachTest : public ::testing::Test {
 protected:
  testing::FakeRoot root;
};

const long kHz = ::sysconf(_SC_CLK_TCK);
const long kPage = ::sysconf(_SC_PAGESIZE);

kern_return_t basicTaskInfo(task_basic_info_64_data_t& info) {
  mach_msg_type_number_t count = TASK_BASIC_INFO_64_COUNT;
  const kern_return_t result =
      task_info(mach_task_self(), TASK_BASIC_INFO_64, reinterpret_cast<task_info_t>(&info), &count);
  if (result == KERN_SUCCESS) {
    EXPECT_EQ(count, TASK_BASIC_INFO_64_COUNT);
  }
  return result;
}

kern_return_t vmInfo(task_vm_info_data_t& info) {
  mach_msg_type_number_t count = TASK_VM_INFO_COUNT;
  return task_info(mach_task_self(), TASK_VM_INFO, reinterpret_cast<task_info_t>(&info), &count);
}

kern_return_t threadInfo(thread_act_t thread, thread_basic_info_data_t& info) {
  mach_msg_type_number_t count = THREAD_BASIC_INFO_COUNT;
  return thread_info(thread, THREAD_BASIC_INFO, reinterpret_cast<thread_info_t>(&info), &count);
}

TEST_F(MachTest, TaskBasicInfo) {
  root.write(
      "/proc/self/stat",
      testing::procStatLine(
          {.utime = kHz * 3 + kHz / 2, .stime = kHz, .vsize = 1 << 30, .rss = 100, .policy = 2}));
  task_basic_info_64_data_t info{};
  ASSERT_EQ(basicTaskInfo(info), KERN_SUCCESS);
  // 64-bit members of the packed structure are read by value, not by reference.
  EXPECT_EQ(std::uint64_t{info.virtual_size}, 1u << 30);
  EXPECT_EQ(std::uint64_t{info.resident_size}, 100u * kPage);
  EXPECT_EQ(info.user_time.seconds, 3);
  EXPECT_EQ(info.user_time.microseconds, 500000);
  EXPECT_EQ(info.system_time.seconds, 1);
  EXPECT_EQ(info.policy, POLICY_RR);

  mach_msg_type_number_t count = TASK_BASIC_INFO_64_COUNT - 1;
  const auto out = reinterpret_cast<task_info_t>(&info);
  EXPECT_EQ(task_info(mach_task_self(), TASK_BASIC_INFO_64, out, &count), KERN_INVALID_ARGUMENT);
  count = TASK_BASIC_INFO_64_COUNT;
  EXPECT_EQ(task_info(mach_task_self() + 1, TASK_BASIC_INFO_64, out, &count),
            KERN_INVALID_ARGUMENT);
  EXPECT_EQ(task_info(mach_task_self(), 4242, out, &count), KERN_INVALID_ARGUMENT);

  for (const char* garbled : {"", "4242 (prog S 1 2 3\n", "4242 (prog) S 1 2 3\n"}) {
    root.write("/proc/self/stat", garbled);
    EXPECT_EQ(basicTaskInfo(info), KERN_FAILURE) << garbled;
  }
}

TEST_F(MachTest, TaskVmInfoFootprint) {
  const std::string status =
      "Name:\tprog\nVmPeak:\t  9000 kB\nVmSize:\t  8000 kB\nVmHWM:\t  600 kB\nVmRSS:\t  500 kB\n"
      "RssAnon:\t  300 kB\nRssFile:\t  200 kB\n";
  root.write("/proc/self/status", status);
  task_vm_info_data_t info{};
  EXPECT_EQ(vmInfo(info), KERN_FAILURE);  // no VmSwap line
  root.write("/proc/self/status", status + "VmSwap:\t  20 kB\n");
  ASSERT_EQ(vmInfo(info), KERN_SUCCESS);
  EXPECT_EQ(info.virtual_size, 8000u * 1024);
  EXPECT_EQ(info.resident_size, 500u * 1024);
  EXPECT_EQ(info.resident_size_peak, 600u * 1024);
  EXPECT_EQ(info.phys_footprint, 320u * 1024);
  EXPECT_EQ(info.page_size, kPage);

  mach_msg_type_number_t count = TASK_VM_INFO_COUNT - 1;
  EXPECT_EQ(task_info(mach_task_self(), TASK_VM_INFO, reinterpret_cast<task_info_t>(&info), &count),
            KERN_INVALID_ARGUMENT);
  root.write("/proc/self/status", status + "VmSwap:\t  2x kB\n");
  EXPECT_EQ(vmInfo(info), KERN_FAILURE);
}

TEST_F(MachTest, ThreadStateFlagsAndUtilisation) {
  root.write("/proc/self/task/77/stat",
             testing::procStatLine({.state = 'R', .utime = kHz * 2, .policy = 5}));
  root.write("/proc/self/task/77/sched",
             "prog (77, #threads: 2)\n---\nse.avg.util_avg   :   512\n");
  thread_basic_info_data_t info{};
  ASSERT_EQ(threadInfo(77, info), KERN_SUCCESS);
  EXPECT_EQ(info.run_state, TH_STATE_RUNNING);
  EXPECT_EQ(info.flags, TH_FLAGS_IDLE);
  EXPECT_EQ(info.cpu_usage, 500);
  EXPECT_EQ(info.user_time.seconds, 2);

  root.write("/proc/self/task/77/stat", testing::procStatLine({.state = 'D', .policy = 0}));
  root.write("/proc/self/task/77/sched", "se.avg.util_avg   :   2048\n");
  ASSERT_EQ(threadInfo(77, info), KERN_SUCCESS);
  EXPECT_EQ(info.run_state, TH_STATE_UNINTERRUPTIBLE);
  EXPECT_EQ(info.flags, 0);
  EXPECT_EQ(info.policy, POLICY_TIMESHARE);

  EXPECT_EQ(threadInfo(78, info), KERN_INVALID_ARGUMENT);  // no such thread
  std::filesystem::create_directories(root.path("/proc/self/task/79"));
  EXPECT_EQ(threadInfo(79, info), KERN_FAILURE);  // a thread whose stat is unreadable
  root.write("/proc/self/task/77/stat", "77 (prog) R 1 2\n");
  EXPECT_EQ(threadInfo(77, info), KERN_FAILURE);
}

TEST_F(MachTest, SleepingThreadUsesRunTimeChange) {
  // Started 50 s after boot, now 100 s: 25 s of run time is half a processor.
  root.write("/proc/uptime", "100.00 180.00\n");
  root.write("/proc/self/task/91/stat", testing::procStatLine({.state = 'S', .start = 50 * kHz}));
  root.write("/proc/self/task/91/sched", "se.avg.util_avg   :   1000\n");  // stale while asleep
  root.write("/proc/self/task/91/schedstat", "25000000000 0 0\n");
  thread_basic_info_data_t info{};
  ASSERT_EQ(threadInfo(91, info), KERN_SUCCESS);
  EXPECT_EQ(info.run_state, TH_STATE_WAITING);
  EXPECT_EQ(info.cpu_usage, 500);
  ASSERT_EQ(threadInfo(91, info), KERN_SUCCESS);
  EXPECT_EQ(info.cpu_usage, 0);  // no run time since the last call
  root.write("/proc/self/task/91/schedstat", "125000000000 0 0\n");
  ASSERT_EQ(threadInfo(91, info), KERN_SUCCESS);
  EXPECT_EQ(info.cpu_usage, TH_USAGE_SCALE);  // more than the time passed: one processor
}

TEST_F(MachTest, HostStatistics) {
  root.write("/proc/meminfo",
             "MemTotal: 8388608 kB\nMemFree: 4096 kB\nActive: 8192 kB\nInactive: 12288 kB\n"
             "KernelStack: 4096 kB\nPageTables: 4096 kB\nSUnreclaim: 0 kB\nUnevictable: 8192 kB\n");
  vm_statistics_data_t stats{};
  mach_msg_type_number_t count = HOST_VM_INFO_COUNT;
  const auto out = reinterpret_cast<host_info_t>(&stats);
  EXPECT_EQ(host_statistics(mach_host_self(), HOST_VM_INFO, out, &count), KERN_FAILURE);
  root.write("/proc/vmstat", "nr_free_pages 1\npgpgin 8192\npgpgout 4096\npgfault 123456\n");
  ASSERT_EQ(host_statistics(mach_host_self(), HOST_VM_INFO, out, &count), KERN_SUCCESS);
  EXPECT_EQ(count, HOST_VM_INFO_COUNT);
  const unsigned kib = static_cast<unsigned>(kPage / 1024);
  EXPECT_EQ(stats.free_count, 4096 / kib);
  EXPECT_EQ(stats.active_count, 8192 / kib);
  EXPECT_EQ(stats.inactive_count, 12288 / kib);
  EXPECT_EQ(stats.wire_count, 16384 / kib);
  EXPECT_EQ(stats.pageins, 8192 / kib);
  EXPECT_EQ(stats.pageouts, 4096 / kib);
  EXPECT_EQ(stats.faults, 123456u);

  root.write("/proc/vmstat", "pgpgin 1\npgpgout 1\npgfault 99999999999\n");
  ASSERT_EQ(host_statistics(mach_host_self(), HOST_VM_INFO, out, &count), KERN_SUCCESS);
  EXPECT_EQ(stats.faults, UINT32_MAX);
  root.write("/proc/vmstat", "pgpgin 1\npgpgout x\npgfault 1\n");
  EXPECT_EQ(host_statistics(mach_host_self(), HOST_VM_INFO, out, &count), KERN_FAILURE);
  EXPECT_EQ(host_statistics(mach_task_self(), HOST_VM_INFO, out, &count), KERN_INVALID_ARGUMENT);
  EXPECT_EQ(host_statistics(mach_host_self(), 3, out, &count), KERN_INVALID_ARGUMENT);
  vm_size_t page = 0;
  ASSERT_EQ(host_page_size(mach_host_self(), &page), KERN_SUCCESS);
  EXPECT_EQ(page, static_cast<vm_size_t>(kPage));
}

TEST_F(MachTest, ThreadListIsSortedAndFreedOnce) {
  for (const char* id : {"30", "7", "12", "not-a-thread"}) {
    std::filesystem::create_directories(root.path(std::string("/proc/self/task/") + id));
  }
  thread_act_array_t threads = nullptr;
  mach_msg_type_number_t count = 0;
  ASSERT_EQ(task_threads(mach_task_self(), &threads, &count), KERN_SUCCESS);
  ASSERT_EQ(count, 3u);
  EXPECT_EQ(std::vector<thread_act_t>(threads, threads + count),
            (std::vector<thread_act_t>{7, 12, 30}));
  const auto address = reinterpret_cast<vm_address_t>(threads);
  EXPECT_EQ(vm_deallocate(mach_task_self(), address, sizeof(thread_act_t)), KERN_INVALID_ADDRESS);
  EXPECT_EQ(vm_deallocate(mach_task_self(), address, count * sizeof(thread_act_t)), KERN_SUCCESS);
  EXPECT_EQ(vm_deallocate(mach_task_self(), address, count * sizeof(thread_act_t)),
            KERN_INVALID_ADDRESS);
}

// ---- the real machine

TEST(MachRealMachine, ThreadListHoldsTheCallerAndBogusFreesAreRefused) {
  thread_act_array_t threads = nullptr;
  mach_msg_type_number_t count = 0;
  ASSERT_EQ(task_threads(mach_task_self(), &threads, &count), KERN_SUCCESS);
  const auto self = static_cast<thread_act_t>(::gettid());
  EXPECT_TRUE(std::binary_search(threads, threads + count, self));
  int local = 0;
  EXPECT_EQ(vm_deallocate(mach_task_self(), reinterpret_cast<vm_address_t>(&local), 4),
            KERN_INVALID_ADDRESS);
  EXPECT_EQ(vm_deallocate(mach_task_self(), 0x1000, 4096), KERN_INVALID_ADDRESS);
  EXPECT_EQ(vm_deallocate(mach_task_self(), reinterpret_cast<vm_address_t>(threads),
                          count * sizeof(thread_act_t)),
            KERN_SUCCESS);
}

// Processor time the calling thread has used.
std::chrono::nanoseconds threadTime() {
  timespec used{};
  ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &used);
  return std::chrono::seconds(used.tv_sec) + std::chrono::nanoseconds(used.tv_nsec);
}

TEST(MachRealMachine, AThreadBusyHalfTheTimeUsesAboutHalfAProcessor) {
  std::atomic<bool> stop{false};
  std::atomic<pid_t> halfId{0}, idleId{0};
  std::atomic<int> periods{0};
  std::mutex mutex;
  std::condition_variable wake;
  std::thread idle([&] {
    idleId = ::gettid();
    std::unique_lock lock(mutex);
    wake.wait(lock, [&] { return stop.load(); });
  });
  // 4 ms of its own processor time, then 4 ms asleep, over and over.
  std::thread half([&] {
    halfId = ::gettid();
    while (!stop.load(std::memory_order_relaxed)) {
      const auto start = threadTime();
      while (threadTime() - start < std::chrono::milliseconds(4)) {
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(4));
      ++periods;
    }
  });
  // 60 periods: long past the few tens of milliseconds the figure covers.
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  while (periods < 60) {
    ASSERT_LT(std::chrono::steady_clock::now(), deadline);
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  std::vector<integer_t> samples;
  thread_basic_info_data_t halfInfo{}, idleInfo{};
  for (int i = 0; i < 9; ++i) {
    std::this_thread::sleep_for(std::chrono::milliseconds(37));
    if (threadInfo(halfId, halfInfo) == KERN_SUCCESS) samples.push_back(halfInfo.cpu_usage);
  }
  const auto idleResult = threadInfo(idleId, idleInfo);
  {
    std::lock_guard lock(mutex);
    stop = true;
  }
  wake.notify_all();
  half.join();
  idle.join();
  ASSERT_EQ(idleResult, KERN_SUCCESS);
  EXPECT_EQ(idleInfo.run_state, TH_STATE_WAITING);
  EXPECT_LE(idleInfo.cpu_usage, 50);
  ASSERT_EQ(samples.size(), 9u);
  // The median of samples taken while it sleeps and while it runs; the margin
  // is for a loaded machine, on which the thread waits to run.
  std::sort(samples.begin(), samples.end());
  EXPECT_GE(samples[4], 250);
  EXPECT_LE(samples[4], 750);
}

TEST(MachRealMachine, FootprintGrowsWithDirtiedMemory) {
  constexpr std::size_t kSize = 64 << 20;
  task_vm_info_data_t before{}, after{};
  ASSERT_EQ(vmInfo(before), KERN_SUCCESS);
  void* block = ::mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  ASSERT_NE(block, MAP_FAILED);
  std::memset(block, 0x5a, kSize);
  ASSERT_EQ(vmInfo(after), KERN_SUCCESS);
  ::munmap(block, kSize);
  EXPECT_GE(after.phys_footprint, before.phys_footprint + (48u << 20));
  EXPECT_GE(after.resident_size_peak, after.resident_size);
  EXPECT_GT(after.virtual_size, after.resident_size);
}

}  // namespace
}  // namespace kivi
