#include "kivi/system/mach.h"

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "kivi/system/system_root.h"
#include "proc_facts.h"

namespace kivi {

namespace {

namespace sd = system::detail;

// Above any process id Linux hands out (at most 2^22), so never a task.
constexpr host_t kHostPort = 0x7fff0001;

// Linux's scheduling policies (sched.h).
constexpr int kSchedFifo = 1, kSchedRR = 2, kSchedIdle = 5, kSchedDeadline = 6;

std::int64_t ticksPerSecond() {
  const long hz = ::sysconf(_SC_CLK_TCK);
  return hz > 0 ? hz : 100;
}

time_value_t timeFromTicks(std::uint64_t ticks) {
  const auto hz = static_cast<std::uint64_t>(ticksPerSecond());
  const std::uint64_t seconds = ticks / hz;
  return time_value_t{static_cast<integer_t>(
                          std::min<std::uint64_t>(seconds, std::numeric_limits<integer_t>::max())),
                      static_cast<integer_t>((ticks % hz) * 1000000 / hz)};
}

policy_t policyFromLinux(std::uint64_t policy) {
  switch (policy) {
    case kSchedRR:
      return POLICY_RR;
    case kSchedFifo:
    case kSchedDeadline:
      return POLICY_FIFO;
    default:
      return POLICY_TIMESHARE;
  }
}

natural_t clampToNatural(std::uint64_t value) {
  return static_cast<natural_t>(
      std::min<std::uint64_t>(value, std::numeric_limits<natural_t>::max()));
}

// The stat line's fields from field 3 on; index = field number - 3.
constexpr std::size_t kState = 0, kUtime = 11, kStime = 12, kStartTime = 19, kVsize = 20, kRss = 21,
                      kPolicy = 38;

struct StatLine {
  std::string text;
  std::vector<std::string_view> fields;

  bool read(const std::string& path) {
    if (!system::readFileUnderRoot(path, text)) return false;
    fields = sd::statFieldsAfterName(text);
    return fields.size() > kPolicy;
  }
  std::optional<std::uint64_t> number(std::size_t index) const {
    return sd::parseUnsigned(fields[index]);
  }
};

kern_return_t basicTaskInfo(task_basic_info_64_data_t& out) {
  StatLine stat;
  if (!stat.read("/proc/self/stat")) return KERN_FAILURE;
  const auto utime = stat.number(kUtime), stime = stat.number(kStime), vsize = stat.number(kVsize),
             policy = stat.number(kPolicy);
  const auto rss = sd::parseSigned(stat.fields[kRss]);
  if (!utime || !stime || !vsize || !rss || !policy) return KERN_FAILURE;
  out.suspend_count = 0;
  out.virtual_size = *vsize;
  out.resident_size = static_cast<std::uint64_t>(std::max<std::int64_t>(*rss, 0)) * sd::pageSize();
  out.user_time = timeFromTicks(*utime);
  out.system_time = timeFromTicks(*stime);
  out.policy = policyFromLinux(*policy);
  return KERN_SUCCESS;
}

// "Name:  <number> kB" lines of a /proc status-like file, in bytes.
std::optional<std::uint64_t> kilobytesField(std::string_view text, std::string_view name) {
  std::size_t at = 0;
  while (at < text.size()) {
    const auto end = std::min(text.find('\n', at), text.size());
    std::string_view line = text.substr(at, end - at);
    at = end + 1;
    if (!line.starts_with(name) || line.size() <= name.size() || line[name.size()] != ':') continue;
    line.remove_prefix(name.size() + 1);
    const auto first = line.find_first_not_of(" \t");
    if (first == std::string_view::npos || !line.ends_with(" kB")) return std::nullopt;
    line = line.substr(first, line.size() - 3 - first);
    const auto value = sd::parseUnsigned(line);
    if (!value || *value > std::numeric_limits<std::uint64_t>::max() / 1024) return std::nullopt;
    return *value * 1024;
  }
  return std::nullopt;
}

kern_return_t vmTaskInfo(task_vm_info_data_t& out) {
  std::string status;
  if (!system::readFileUnderRoot("/proc/self/status", status)) return KERN_FAILURE;
  const auto size = kilobytesField(status, "VmSize"), rss = kilobytesField(status, "VmRSS"),
             peak = kilobytesField(status, "VmHWM"), dirty = kilobytesField(status, "RssAnon"),
             swap = kilobytesField(status, "VmSwap");
  if (!size || !rss || !peak || !dirty || !swap) return KERN_FAILURE;
  std::memset(&out, 0, sizeof out);
  out.virtual_size = *size;
  out.page_size = static_cast<integer_t>(sd::pageSize());
  out.resident_size = *rss;
  out.resident_size_peak = std::max(*peak, *rss);
  out.internal = *dirty;
  out.compressed = *swap;
  out.phys_footprint = *dirty + *swap;
  return KERN_SUCCESS;
}

// Thread lists handed out by task_threads and not yet given back.
std::mutex gListsMutex;
std::map<vm_address_t, vm_size_t> gLists;

bool isDirectory(const std::string& absolutePath) {
  struct stat info {};
  return ::stat(system::pathUnderRoot(absolutePath).c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

// ---- thread cpu_usage

std::optional<std::uint64_t> utilisation(const std::string& dir) {
  std::string text;
  if (!system::readFileUnderRoot(dir + "/sched", text)) return std::nullopt;
  constexpr std::string_view kName = "se.avg.util_avg";
  for (std::size_t at = 0; at < text.size();) {
    const auto end = std::min(text.find('\n', at), text.size());
    std::string_view line = std::string_view(text).substr(at, end - at);
    at = end + 1;
    if (!line.starts_with(kName)) continue;
    line.remove_prefix(kName.size());
    const auto colon = line.find(':');
    if (line.find_first_not_of(' ') != colon) return std::nullopt;
    line.remove_prefix(colon + 1);
    line.remove_prefix(std::min(line.find_first_not_of(' '), line.size()));
    return sd::parseUnsigned(line);
  }
  return std::nullopt;
}

// The thread's run time in nanoseconds: schedstat, else the stat line's ticks.
std::optional<std::uint64_t> runTime(const std::string& dir, const StatLine& stat) {
  std::string text;
  if (system::readFileUnderRoot(dir + "/schedstat", text)) {
    if (const auto ns = sd::parseUnsigned(std::string_view(text).substr(0, text.find(' '))))
      return ns;
  }
  const auto utime = stat.number(kUtime), stime = stat.number(kStime);
  if (!utime || !stime) return std::nullopt;
  return (*utime + *stime) * (1000000000 / static_cast<std::uint64_t>(ticksPerSecond()));
}

// Seconds the thread has existed: /proc/uptime less its start time.
std::optional<double> lifetime(const StatLine& stat) {
  std::string text;
  const auto start = stat.number(kStartTime);
  if (!start || !system::readFileUnderRoot("/proc/uptime", text)) return std::nullopt;
  char* end = nullptr;
  const double uptime = std::strtod(text.c_str(), &end);
  if (end == text.c_str()) return std::nullopt;
  return uptime - static_cast<double>(*start) / static_cast<double>(ticksPerSecond());
}

integer_t usageOf(double busy, double elapsed) {
  if (!(elapsed > 0)) return 0;
  const double usage = busy / elapsed * TH_USAGE_SCALE;
  return static_cast<integer_t>(std::clamp(usage, 0.0, double(TH_USAGE_SCALE)));
}

struct Sample {
  std::uint64_t runTime;
  std::chrono::steady_clock::time_point at;
};
std::mutex gSamplesMutex;
std::map<std::pair<std::string, thread_act_t>, Sample> gSamples;  // by (root, tid)
constexpr std::size_t kMostSamples = 4096;

integer_t usageFromUtilisation(std::uint64_t utilisation) {
  return static_cast<integer_t>(
      std::min<std::uint64_t>(utilisation * TH_USAGE_SCALE / 1024, TH_USAGE_SCALE));
}

integer_t usageFromRunTime(thread_act_t thread, const std::string& dir, const StatLine& stat) {
  const auto run = runTime(dir, stat);
  if (!run) {
    // No run time at all: the kernel's last utilisation, however stale.
    const auto stale = utilisation(dir);
    return stale ? usageFromUtilisation(*stale) : 0;
  }
  const auto now = std::chrono::steady_clock::now();
  std::optional<Sample> previous;
  {
    std::lock_guard lock(gSamplesMutex);
    if (gSamples.size() >= kMostSamples) gSamples.clear();
    auto& slot = gSamples[{system::root(), thread}];
    if (slot.at != std::chrono::steady_clock::time_point{}) previous = slot;
    slot = Sample{*run, now};
  }
  if (previous && previous->runTime <= *run && previous->at < now) {
    const double elapsed = std::chrono::duration<double>(now - previous->at).count();
    return usageOf(static_cast<double>(*run - previous->runTime) / 1e9, elapsed);
  }
  const auto life = lifetime(stat);
  return life ? usageOf(static_cast<double>(*run) / 1e9, *life) : 0;
}

integer_t runStateFromLinux(char state) {
  switch (state) {
    case 'R':
    case 'W':
      return TH_STATE_RUNNING;
    case 'D':
      return TH_STATE_UNINTERRUPTIBLE;
    case 'T':
    case 't':
      return TH_STATE_STOPPED;
    case 'Z':
    case 'X':
    case 'x':
      return TH_STATE_HALTED;
    default:  // S, I (idle kernel thread), P (parked) and letters yet to come
      return TH_STATE_WAITING;
  }
}

kern_return_t basicThreadInfo(thread_act_t thread, thread_basic_info_data_t& out) {
  if (thread == 0 || thread > static_cast<thread_act_t>(std::numeric_limits<int>::max()))
    return KERN_INVALID_ARGUMENT;
  const std::string dir = "/proc/self/task/" + std::to_string(thread);
  StatLine stat;
  if (!stat.read(dir + "/stat")) {
    return isDirectory(dir) ? KERN_FAILURE : KERN_INVALID_ARGUMENT;
  }
  const auto utime = stat.number(kUtime), stime = stat.number(kStime),
             policy = stat.number(kPolicy);
  if (!utime || !stime || !policy || stat.fields[kState].size() != 1) return KERN_FAILURE;
  std::memset(&out, 0, sizeof out);
  out.user_time = timeFromTicks(*utime);
  out.system_time = timeFromTicks(*stime);
  out.policy = policyFromLinux(*policy);
  out.run_state = runStateFromLinux(stat.fields[kState][0]);
  out.flags = *policy == kSchedIdle ? TH_FLAGS_IDLE : 0;
  // The kernel's utilisation is current only while the thread runs (and
  // the sched file costs several times the stat line, so a sleeping thread
  // does without it).
  const auto util = out.run_state == TH_STATE_RUNNING ? utilisation(dir) : std::nullopt;
  out.cpu_usage = util ? usageFromUtilisation(*util) : usageFromRunTime(thread, dir, stat);
  return KERN_SUCCESS;
}

std::optional<std::uint64_t> vmstatField(std::string_view text, std::string_view name) {
  for (std::size_t at = 0; at < text.size();) {
    const auto end = std::min(text.find('\n', at), text.size());
    std::string_view line = text.substr(at, end - at);
    at = end + 1;
    if (line.size() > name.size() && line.starts_with(name) && line[name.size()] == ' ')
      return sd::parseUnsigned(line.substr(name.size() + 1));
  }
  return std::nullopt;
}

kern_return_t vmStatistics(vm_statistics_data_t& out) {
  sd::MemInfo info;
  std::string vmstat;
  if (!info.load() || !system::readFileUnderRoot("/proc/vmstat", vmstat)) return KERN_FAILURE;
  const auto free = info.get("MemFree"), active = info.get("Active"),
             inactive = info.get("Inactive"), wired = info.wired();
  const auto pagesIn = vmstatField(vmstat, "pgpgin"), pagesOut = vmstatField(vmstat, "pgpgout"),
             faults = vmstatField(vmstat, "pgfault");
  if (!free || !active || !inactive || !wired || !pagesIn || !pagesOut || !faults)
    return KERN_FAILURE;
  const std::uint64_t page = sd::pageSize();
  std::memset(&out, 0, sizeof out);
  out.free_count = clampToNatural(*free / page);
  out.active_count = clampToNatural(*active / page);
  out.inactive_count = clampToNatural(*inactive / page);
  out.wire_count = clampToNatural(*wired / page);
  // pgpgin and pgpgout count KiB.
  out.pageins = clampToNatural(*pagesIn / std::max<std::uint64_t>(page / 1024, 1));
  out.pageouts = clampToNatural(*pagesOut / std::max<std::uint64_t>(page / 1024, 1));
  out.faults = clampToNatural(*faults);
  return KERN_SUCCESS;
}

// Copies `data` out as a flavor of `wanted` words.
template <class T>
kern_return_t deliver(kern_return_t result, const T& data, integer_t* info,
                      mach_msg_type_number_t* count, mach_msg_type_number_t wanted) {
  if (result != KERN_SUCCESS) return result;
  std::memcpy(info, &data, sizeof data);
  *count = wanted;
  return KERN_SUCCESS;
}

}  // namespace

task_t mach_task_self() { return static_cast<task_t>(::getpid()); }

host_t mach_host_self() { return kHostPort; }

kern_return_t task_info(task_t task, task_flavor_t flavor, task_info_t info,
                        mach_msg_type_number_t* count) {
  if (task != mach_task_self() || !info || !count) return KERN_INVALID_ARGUMENT;
  if (flavor == TASK_BASIC_INFO_64) {
    if (*count < TASK_BASIC_INFO_64_COUNT) return KERN_INVALID_ARGUMENT;
    task_basic_info_64_data_t data{};
    return deliver(basicTaskInfo(data), data, info, count, TASK_BASIC_INFO_64_COUNT);
  }
  if (flavor == TASK_VM_INFO) {
    if (*count < TASK_VM_INFO_COUNT) return KERN_INVALID_ARGUMENT;
    task_vm_info_data_t data{};
    return deliver(vmTaskInfo(data), data, info, count, TASK_VM_INFO_COUNT);
  }
  return KERN_INVALID_ARGUMENT;
}

kern_return_t task_threads(task_t task, thread_act_array_t* threads,
                           mach_msg_type_number_t* count) {
  if (task != mach_task_self() || !threads || !count) return KERN_INVALID_ARGUMENT;
  DIR* dir = ::opendir(system::pathUnderRoot("/proc/self/task").c_str());
  if (!dir) return KERN_FAILURE;
  std::vector<thread_act_t> ids;
  while (const dirent* entry = ::readdir(dir)) {
    const auto id = sd::parseUnsigned(entry->d_name);
    if (id && *id > 0 && *id <= std::numeric_limits<int>::max())
      ids.push_back(static_cast<thread_act_t>(*id));
  }
  ::closedir(dir);
  if (ids.empty()) return KERN_FAILURE;  // a process has at least the calling thread
  std::sort(ids.begin(), ids.end());
  const vm_size_t bytes = ids.size() * sizeof(thread_act_t);
  auto* list = static_cast<thread_act_t*>(std::malloc(bytes));
  if (!list) return KERN_RESOURCE_SHORTAGE;
  std::memcpy(list, ids.data(), bytes);
  {
    std::lock_guard lock(gListsMutex);
    gLists[reinterpret_cast<vm_address_t>(list)] = bytes;
  }
  *threads = list;
  *count = static_cast<mach_msg_type_number_t>(ids.size());
  return KERN_SUCCESS;
}

kern_return_t vm_deallocate(task_t task, vm_address_t address, vm_size_t size) {
  if (task != mach_task_self()) return KERN_INVALID_ARGUMENT;
  if (size == 0) return KERN_SUCCESS;
  {
    std::lock_guard lock(gListsMutex);
    const auto it = gLists.find(address);
    if (it == gLists.end() || it->second != size) return KERN_INVALID_ADDRESS;
    gLists.erase(it);
  }
  std::free(reinterpret_cast<void*>(address));
  return KERN_SUCCESS;
}

kern_return_t thread_info(thread_act_t thread, thread_flavor_t flavor, thread_info_t info,
                          mach_msg_type_number_t* count) {
  if (flavor != THREAD_BASIC_INFO || !info || !count || *count < THREAD_BASIC_INFO_COUNT)
    return KERN_INVALID_ARGUMENT;
  thread_basic_info_data_t data{};
  return deliver(basicThreadInfo(thread, data), data, info, count, THREAD_BASIC_INFO_COUNT);
}

kern_return_t host_page_size(host_t host, vm_size_t* size) {
  if (host != mach_host_self() || !size) return KERN_INVALID_ARGUMENT;
  *size = static_cast<vm_size_t>(sd::pageSize());
  return KERN_SUCCESS;
}

kern_return_t host_statistics(host_t host, host_flavor_t flavor, host_info_t info,
                              mach_msg_type_number_t* count) {
  if (host != mach_host_self() || flavor != HOST_VM_INFO || !info || !count ||
      *count < HOST_VM_INFO_COUNT)
    return KERN_INVALID_ARGUMENT;
  vm_statistics_data_t data{};
  return deliver(vmStatistics(data), data, info, count, HOST_VM_INFO_COUNT);
}

}  // namespace kivi
