// Task, thread and host facts in the shapes of the platform's Mach calls,
// answered from Linux's /proc. The "task" is always the calling process and
// the "host" this machine; a thread is named by its Linux thread id (tid).
//
//   kivi::task_vm_info_data_t vm{};
//   kivi::mach_msg_type_number_t count = kivi::TASK_VM_INFO_COUNT;
//   if (kivi::task_info(kivi::mach_task_self(), kivi::TASK_VM_INFO,
//                       reinterpret_cast<kivi::task_info_t>(&vm), &count) == kivi::KERN_SUCCESS)
//     use(vm.phys_footprint);
//
//   kivi::thread_act_array_t threads = nullptr;
//   kivi::mach_msg_type_number_t threadCount = 0;
//   if (kivi::task_threads(kivi::mach_task_self(), &threads, &threadCount) == kivi::KERN_SUCCESS) {
//     ... kivi::thread_info(threads[i], kivi::THREAD_BASIC_INFO, ...) ...
//     kivi::vm_deallocate(kivi::mach_task_self(), reinterpret_cast<kivi::vm_address_t>(threads),
//                         threadCount * sizeof(kivi::thread_act_t));
//   }
//
// Failures: a task or host other than mach_task_self() / mach_host_self(), an
// unknown flavor, a null pointer or a *count smaller than the flavor's count
// answer KERN_INVALID_ARGUMENT; a file that holds the facts and cannot be read
// or makes no sense answers KERN_FAILURE. On success *count is set to the
// flavor's count. Paths below are under kivi::system::root().
//
// Where each answer comes from:
//   task_info(TASK_BASIC_INFO_64)  /proc/self/stat: vsize, rss × page size,
//       utime and stime (clock ticks), the scheduling policy (SCHED_OTHER,
//       SCHED_BATCH and SCHED_IDLE read as POLICY_TIMESHARE, SCHED_RR as
//       POLICY_RR, SCHED_FIFO and SCHED_DEADLINE as POLICY_FIFO);
//       suspend_count is 0.
//   task_info(TASK_VM_INFO)  virtual_size, resident_size and
//       resident_size_peak from VmSize, VmRSS and VmHWM of /proc/self/status;
//       page_size from sysconf; also from /proc/self/status: internal =
//       RssAnon (the anonymous memory in RAM: what the process has written
//       and that no file backs), compressed = VmSwap (its pages moved out of
//       RAM) and phys_footprint = RssAnon + VmSwap, the memory that is this
//       process's own, in RAM or swapped out. RssAnon equals smaps_rollup's
//       Private_Dirty except for anonymous pages still shared with a parent
//       or child after fork(); smaps_rollup is not read because the kernel
//       walks every mapping for it (300 µs with 100 threads' stacks, against
//       10 µs for status). Linux has no counterpart for the other fields:
//       they are 0.
//   task_threads  the ids in /proc/self/task, ascending, in a list the caller
//       frees with vm_deallocate(mach_task_self(), address, count *
//       sizeof(thread_act_t)). vm_deallocate frees only such lists, given
//       with exactly their address and size; anything else answers
//       KERN_INVALID_ADDRESS (a size of 0 is a successful no-op).
//   thread_info(THREAD_BASIC_INFO)  /proc/self/task/<tid>/stat: the state
//       (R running, S sleeping, D uninterruptible, T/t stopped, Z/X halted),
//       utime and stime, the policy; SCHED_IDLE sets TH_FLAGS_IDLE. cpu_usage
//       (TH_USAGE_SCALE = one whole processor) covers the last few tens of
//       milliseconds: for a running or runnable thread it is the kernel's
//       decayed utilisation (se.avg.util_avg of /proc/self/task/<tid>/sched,
//       half-life about 32 ms, 1024 = one processor, scaled to 1000). The
//       kernel refreshes that figure only while the thread runs, so for a
//       sleeping thread, or where the line is missing, cpu_usage is the
//       change in the thread's run time (first field of
//       /proc/self/task/<tid>/schedstat, in ns) since this process last asked
//       about that thread, over the time passed; the first time, its run time
//       over its lifetime (start time in the stat line, /proc/uptime). A tid
//       that is not in /proc/self/task answers KERN_INVALID_ARGUMENT.
//   host_page_size  sysconf(_SC_PAGESIZE).
//   host_statistics(HOST_VM_INFO)  in pages, from /proc/meminfo: free_count =
//       MemFree, active_count = Active, inactive_count = Inactive, wire_count
//       = KernelStack + PageTables + SUnreclaim + Unevictable; from
//       /proc/vmstat: pageins = pgpgin and pageouts = pgpgout (kept in KiB by
//       the kernel, converted to pages), faults = pgfault. The others are 0.
//       Counts clamp at UINT32_MAX.
//
// Thread contract: every function may be called from any thread at once.
#pragma once

#include <cstdint>

#include "kivi/export.h"

namespace kivi {

using kern_return_t = int;
using natural_t = unsigned int;
using integer_t = int;
using mach_port_t = natural_t;
using task_t = mach_port_t;
using thread_act_t = mach_port_t;
using host_t = mach_port_t;
using mach_msg_type_number_t = natural_t;
using vm_size_t = std::uintptr_t;
using vm_address_t = std::uintptr_t;
using mach_vm_size_t = std::uint64_t;
using policy_t = int;

inline constexpr kern_return_t KERN_SUCCESS = 0, KERN_INVALID_ADDRESS = 1, KERN_NO_SPACE = 3,
                               KERN_INVALID_ARGUMENT = 4, KERN_FAILURE = 5,
                               KERN_RESOURCE_SHORTAGE = 6;

// Scheduling policies as task and thread information reports them.
inline constexpr policy_t POLICY_TIMESHARE = 1, POLICY_RR = 2, POLICY_FIFO = 4;

// The calling process (its process id; a forked child gets its own).
KIVI_EXPORT task_t mach_task_self();
// This machine.
KIVI_EXPORT host_t mach_host_self();

struct KIVI_EXPORT time_value_t {
  integer_t seconds;
  integer_t microseconds;
};

using task_flavor_t = natural_t;
using task_info_t = integer_t*;
#if defined(__aarch64__)
inline constexpr task_flavor_t TASK_BASIC_INFO_64 = 18;
#else
inline constexpr task_flavor_t TASK_BASIC_INFO_64 = 5;
#endif

// Laid out on 4-byte boundaries, so that a count of natural_t words covers
// each structure exactly. The 64-bit members of task_basic_info_64_data_t are
// then misaligned: copy them out (std::uint64_t size = info.virtual_size)
// rather than bind a reference or pointer to them.
#pragma pack(push, 4)
struct KIVI_EXPORT task_basic_info_64_data_t {
  integer_t suspend_count;
  mach_vm_size_t virtual_size;   // bytes
  mach_vm_size_t resident_size;  // bytes
  time_value_t user_time;        // of all threads, live and ended
  time_value_t system_time;
  policy_t policy;
};

struct KIVI_EXPORT task_vm_info_data_t {
  mach_vm_size_t virtual_size;
  integer_t region_count;
  integer_t page_size;
  mach_vm_size_t resident_size;
  mach_vm_size_t resident_size_peak;
  mach_vm_size_t device;
  mach_vm_size_t device_peak;
  mach_vm_size_t internal;
  mach_vm_size_t internal_peak;
  mach_vm_size_t external;
  mach_vm_size_t external_peak;
  mach_vm_size_t reusable;
  mach_vm_size_t reusable_peak;
  mach_vm_size_t purgeable_volatile_pmap;
  mach_vm_size_t purgeable_volatile_resident;
  mach_vm_size_t purgeable_volatile_virtual;
  mach_vm_size_t compressed;
  mach_vm_size_t compressed_peak;
  mach_vm_size_t compressed_lifetime;
  mach_vm_size_t phys_footprint;
  integer_t reserved[55];  // room the platform's later fields take; zero
};
#pragma pack(pop)

inline constexpr mach_msg_type_number_t TASK_BASIC_INFO_64_COUNT =
    sizeof(task_basic_info_64_data_t) / sizeof(natural_t);
inline constexpr task_flavor_t TASK_VM_INFO = 22;
inline constexpr mach_msg_type_number_t TASK_VM_INFO_COUNT = 93;
static_assert(TASK_BASIC_INFO_64_COUNT == 10);
static_assert(sizeof(task_vm_info_data_t) == TASK_VM_INFO_COUNT * sizeof(natural_t));

KIVI_EXPORT kern_return_t task_info(task_t task, task_flavor_t flavor, task_info_t info,
                                    mach_msg_type_number_t* count);

using thread_act_array_t = thread_act_t*;
KIVI_EXPORT kern_return_t task_threads(task_t task, thread_act_array_t* threads,
                                       mach_msg_type_number_t* count);
KIVI_EXPORT kern_return_t vm_deallocate(task_t task, vm_address_t address, vm_size_t size);

using thread_flavor_t = natural_t;
using thread_info_t = integer_t*;
inline constexpr thread_flavor_t THREAD_BASIC_INFO = 3;
struct KIVI_EXPORT thread_basic_info_data_t {
  time_value_t user_time;
  time_value_t system_time;
  integer_t cpu_usage;  // 0…TH_USAGE_SCALE
  policy_t policy;
  integer_t run_state;  // TH_STATE_…
  integer_t flags;      // TH_FLAGS_…
  integer_t suspend_count;
  integer_t sleep_time;
};
inline constexpr mach_msg_type_number_t THREAD_BASIC_INFO_COUNT = 10;
static_assert(sizeof(thread_basic_info_data_t) == THREAD_BASIC_INFO_COUNT * sizeof(natural_t));
inline constexpr integer_t TH_USAGE_SCALE = 1000, TH_FLAGS_SWAPPED = 1, TH_FLAGS_IDLE = 2;
inline constexpr integer_t TH_STATE_RUNNING = 1, TH_STATE_STOPPED = 2, TH_STATE_WAITING = 3,
                           TH_STATE_UNINTERRUPTIBLE = 4, TH_STATE_HALTED = 5;
KIVI_EXPORT kern_return_t thread_info(thread_act_t thread, thread_flavor_t flavor,
                                      thread_info_t info, mach_msg_type_number_t* count);

KIVI_EXPORT kern_return_t host_page_size(host_t host, vm_size_t* size);

using host_flavor_t = integer_t;
using host_info_t = integer_t*;
inline constexpr host_flavor_t HOST_VM_INFO = 2;
struct KIVI_EXPORT vm_statistics_data_t {
  natural_t free_count, active_count, inactive_count, wire_count, zero_fill_count, reactivations,
      pageins, pageouts, faults, cow_faults, lookups, hits, purgeable_count, purges,
      speculative_count;
};
inline constexpr mach_msg_type_number_t HOST_VM_INFO_COUNT = 15;
static_assert(sizeof(vm_statistics_data_t) == HOST_VM_INFO_COUNT * sizeof(natural_t));
KIVI_EXPORT kern_return_t host_statistics(host_t host, host_flavor_t flavor, host_info_t info,
                                          mach_msg_type_number_t* count);

}  // namespace kivi
