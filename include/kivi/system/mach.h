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

// A call's result: KERN_SUCCESS or one of the KERN_ failures.
using kern_return_t = int;
// The unsigned and signed 32-bit words the information structures are made of.
using natural_t = unsigned int;
using integer_t = int;
// A name for a task, a thread or the host.
using mach_port_t = natural_t;
// The calling process: its process id (mach_task_self()).
using task_t = mach_port_t;
// A thread of the calling process: its Linux thread id.
using thread_act_t = mach_port_t;
// This machine (mach_host_self()).
using host_t = mach_port_t;
// A size in natural_t words: what an information call's *count holds.
using mach_msg_type_number_t = natural_t;
// A size in bytes and an address, as wide as a pointer.
using vm_size_t = std::uintptr_t;
using vm_address_t = std::uintptr_t;
// A size in bytes, 64 bits wide everywhere.
using mach_vm_size_t = std::uint64_t;
// A scheduling policy: POLICY_TIMESHARE, POLICY_RR or POLICY_FIFO.
using policy_t = int;

// What the calls answer: KERN_SUCCESS; KERN_INVALID_ADDRESS, a list vm_deallocate did not
// hand out; KERN_INVALID_ARGUMENT, an argument refused (see above); KERN_FAILURE, facts that
// could not be read; KERN_RESOURCE_SHORTAGE, memory ran out. KERN_NO_SPACE is never answered.
inline constexpr kern_return_t KERN_SUCCESS = 0, KERN_INVALID_ADDRESS = 1, KERN_NO_SPACE = 3,
                               KERN_INVALID_ARGUMENT = 4, KERN_FAILURE = 5,
                               KERN_RESOURCE_SHORTAGE = 6;

// Scheduling policies as task and thread information reports them.
inline constexpr policy_t POLICY_TIMESHARE = 1, POLICY_RR = 2, POLICY_FIFO = 4;

// The calling process (its process id; a forked child gets its own).
KIVI_EXPORT task_t mach_task_self();
// This machine.
KIVI_EXPORT host_t mach_host_self();

// A duration: whole seconds and the microseconds after them.
struct KIVI_EXPORT time_value_t {
  integer_t seconds;       // whole seconds
  integer_t microseconds;  // 0…999999
};

// A kind of task information: TASK_BASIC_INFO_64 or TASK_VM_INFO.
using task_flavor_t = natural_t;
// The structure task_info fills, seen as words.
using task_info_t = integer_t*;
#if defined(__aarch64__)
// task_info's flavor for task_basic_info_64_data_t (its number differs between architectures).
inline constexpr task_flavor_t TASK_BASIC_INFO_64 = 18;
#else
// task_info's flavor for task_basic_info_64_data_t (its number differs between architectures).
inline constexpr task_flavor_t TASK_BASIC_INFO_64 = 5;
#endif

// Laid out on 4-byte boundaries, so that a count of natural_t words covers
// each structure exactly. The 64-bit members of task_basic_info_64_data_t are
// then misaligned: copy them out (std::uint64_t size = info.virtual_size)
// rather than bind a reference or pointer to them.
#pragma pack(push, 4)
// The calling process's sizes, times and policy (task_info's TASK_BASIC_INFO_64).
struct KIVI_EXPORT task_basic_info_64_data_t {
  integer_t suspend_count;       // always 0
  mach_vm_size_t virtual_size;   // bytes
  mach_vm_size_t resident_size;  // bytes
  time_value_t user_time;        // of all threads, live and ended
  time_value_t system_time;      // spent in the kernel, of all threads
  policy_t policy;               // the main thread's
};

// The calling process's memory (task_info's TASK_VM_INFO); sizes in bytes.
struct KIVI_EXPORT task_vm_info_data_t {
  mach_vm_size_t virtual_size;                 // address space mapped (VmSize)
  integer_t region_count;                      // always 0
  integer_t page_size;                         // bytes in a page
  mach_vm_size_t resident_size;                // in RAM now (VmRSS)
  mach_vm_size_t resident_size_peak;           // the most ever in RAM (VmHWM)
  mach_vm_size_t device;                       // always 0
  mach_vm_size_t device_peak;                  // always 0
  mach_vm_size_t internal;                     // anonymous memory in RAM (RssAnon)
  mach_vm_size_t internal_peak;                // always 0
  mach_vm_size_t external;                     // always 0
  mach_vm_size_t external_peak;                // always 0
  mach_vm_size_t reusable;                     // always 0
  mach_vm_size_t reusable_peak;                // always 0
  mach_vm_size_t purgeable_volatile_pmap;      // always 0
  mach_vm_size_t purgeable_volatile_resident;  // always 0
  mach_vm_size_t purgeable_volatile_virtual;   // always 0
  mach_vm_size_t compressed;                   // swapped out (VmSwap)
  mach_vm_size_t compressed_peak;              // always 0
  mach_vm_size_t compressed_lifetime;          // always 0
  mach_vm_size_t phys_footprint;               // the process's own: internal + compressed
  integer_t reserved[55];                      // room the platform's later fields take; zero
};
#pragma pack(pop)

// The size of task_basic_info_64_data_t in words: the *count task_info needs for it.
inline constexpr mach_msg_type_number_t TASK_BASIC_INFO_64_COUNT =
    sizeof(task_basic_info_64_data_t) / sizeof(natural_t);
// task_info's flavor for task_vm_info_data_t.
inline constexpr task_flavor_t TASK_VM_INFO = 22;
// The size of task_vm_info_data_t in words: the *count task_info needs for it.
inline constexpr mach_msg_type_number_t TASK_VM_INFO_COUNT = 93;
static_assert(TASK_BASIC_INFO_64_COUNT == 10);
static_assert(sizeof(task_vm_info_data_t) == TASK_VM_INFO_COUNT * sizeof(natural_t));

// Fills `info`, which has room for *count words, with the flavor's structure about the calling
// process; `task` must be mach_task_self().
KIVI_EXPORT kern_return_t task_info(task_t task, task_flavor_t flavor, task_info_t info,
                                    mach_msg_type_number_t* count);

// A list of thread ids that task_threads hands out.
using thread_act_array_t = thread_act_t*;
// The calling process's thread ids, ascending, in a new list of *count ids; free it with
// vm_deallocate.
KIVI_EXPORT kern_return_t task_threads(task_t task, thread_act_array_t* threads,
                                       mach_msg_type_number_t* count);
// Frees a list task_threads handed out, given its address and size in bytes exactly.
KIVI_EXPORT kern_return_t vm_deallocate(task_t task, vm_address_t address, vm_size_t size);

// A kind of thread information: THREAD_BASIC_INFO.
using thread_flavor_t = natural_t;
// The structure thread_info fills, seen as words.
using thread_info_t = integer_t*;
// thread_info's flavor for thread_basic_info_data_t.
inline constexpr thread_flavor_t THREAD_BASIC_INFO = 3;
// A thread's times, recent processor use and state (thread_info's THREAD_BASIC_INFO).
struct KIVI_EXPORT thread_basic_info_data_t {
  time_value_t user_time;    // run in user mode
  time_value_t system_time;  // run in the kernel
  integer_t cpu_usage;       // 0…TH_USAGE_SCALE
  policy_t policy;           // POLICY_…
  integer_t run_state;       // TH_STATE_…
  integer_t flags;           // TH_FLAGS_…
  integer_t suspend_count;   // always 0
  integer_t sleep_time;      // always 0
};
// The size of thread_basic_info_data_t in words: the *count thread_info needs.
inline constexpr mach_msg_type_number_t THREAD_BASIC_INFO_COUNT = 10;
static_assert(sizeof(thread_basic_info_data_t) == THREAD_BASIC_INFO_COUNT * sizeof(natural_t));
// TH_USAGE_SCALE is the cpu_usage of a thread that keeps one processor busy. Flags:
// TH_FLAGS_IDLE marks a thread of the idle scheduling class; TH_FLAGS_SWAPPED is never set.
inline constexpr integer_t TH_USAGE_SCALE = 1000, TH_FLAGS_SWAPPED = 1, TH_FLAGS_IDLE = 2;
// A thread's run_state: TH_STATE_RUNNING (running or runnable), TH_STATE_STOPPED,
// TH_STATE_WAITING (sleeping), TH_STATE_UNINTERRUPTIBLE (in an uninterruptible wait) or
// TH_STATE_HALTED (ended).
inline constexpr integer_t TH_STATE_RUNNING = 1, TH_STATE_STOPPED = 2, TH_STATE_WAITING = 3,
                           TH_STATE_UNINTERRUPTIBLE = 4, TH_STATE_HALTED = 5;
// Fills `info`, which has room for *count words, with the flavor's structure about the calling
// process's thread whose Linux thread id is `thread`.
KIVI_EXPORT kern_return_t thread_info(thread_act_t thread, thread_flavor_t flavor,
                                      thread_info_t info, mach_msg_type_number_t* count);

// The machine's page size in bytes; `host` must be mach_host_self().
KIVI_EXPORT kern_return_t host_page_size(host_t host, vm_size_t* size);

// A kind of host information: HOST_VM_INFO.
using host_flavor_t = integer_t;
// The structure host_statistics fills, seen as words.
using host_info_t = integer_t*;
// host_statistics's flavor for vm_statistics_data_t.
inline constexpr host_flavor_t HOST_VM_INFO = 2;
// The machine's memory in pages and its paging counts (host_statistics's HOST_VM_INFO).
struct KIVI_EXPORT vm_statistics_data_t {
  // Counts as the list above gives them; those Linux has no counterpart for are 0.
  natural_t free_count, active_count, inactive_count, wire_count, zero_fill_count, reactivations,
      pageins, pageouts, faults, cow_faults, lookups, hits, purgeable_count, purges,
      speculative_count;
};
// The size of vm_statistics_data_t in words: the *count host_statistics needs.
inline constexpr mach_msg_type_number_t HOST_VM_INFO_COUNT = 15;
static_assert(sizeof(vm_statistics_data_t) == HOST_VM_INFO_COUNT * sizeof(natural_t));
// Fills `info`, which has room for *count words, with the flavor's structure about this
// machine; `host` must be mach_host_self().
KIVI_EXPORT kern_return_t host_statistics(host_t host, host_flavor_t flavor, host_info_t info,
                                          mach_msg_type_number_t* count);

}  // namespace kivi
