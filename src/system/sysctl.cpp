#include "kivi/system/sysctl.h"

#include <sys/utsname.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "kivi/system/system_root.h"
#include "proc_facts.h"

namespace kivi {

namespace {

namespace sd = system::detail;

// A fact ready to copy out, or nothing when its source cannot be read.
using Fact = std::variant<std::monostate, std::int32_t, std::int64_t, std::string>;

std::int32_t clampToInt32(std::uint64_t value) {
  return static_cast<std::int32_t>(
      std::min<std::uint64_t>(value, std::numeric_limits<std::int32_t>::max()));
}

Fact kernelString(const char* file) {
  std::string text;
  if (!system::readFileUnderRoot(std::string("/proc/sys/kernel/") + file, text)) return {};
  return sd::withoutTrailingNewline(std::move(text));
}

Fact machine() {
  if (system::isRealRoot()) {
    struct utsname names {};
    if (::uname(&names) == 0) return std::string(names.machine);
  }
  return kernelString("arch");
}

Fact processors(std::optional<std::uint64_t> count) {
  if (!count) return {};
  return clampToInt32(*count);
}

enum class Memory { Physical, User, Size };

Fact memory(Memory which) {
  sd::MemInfo info;
  if (!info.load()) return {};
  const std::uint64_t total = *info.get("MemTotal");
  switch (which) {
    case Memory::Physical:
      return clampToInt32(total);
    case Memory::User: {
      const auto wired = info.wired();
      if (!wired) return {};
      return clampToInt32(total > *wired ? total - *wired : 0);
    }
    case Memory::Size:
      return static_cast<std::int64_t>(
          std::min<std::uint64_t>(total, std::numeric_limits<std::int64_t>::max()));
  }
  return {};
}

Fact pageSize() { return clampToInt32(sd::pageSize()); }

using Reader = Fact (*)();

struct Name {
  std::string_view name;
  int top;  // CTL_KERN or CTL_HW, or 0 when there is no numeric name
  int second;
  Reader read;
};

constexpr Name kNames[] = {
    {"hw.machine", CTL_HW, HW_MACHINE, machine},
    {"hw.ncpu", CTL_HW, HW_NCPU, [] { return processors(sd::configuredProcessors()); }},
    {"hw.activecpu", 0, 0, [] { return processors(sd::activeProcessors()); }},
    {"hw.logicalcpu", 0, 0, [] { return processors(sd::activeProcessors()); }},
    {"hw.physmem", CTL_HW, HW_PHYSMEM, [] { return memory(Memory::Physical); }},
    {"hw.usermem", CTL_HW, HW_USERMEM, [] { return memory(Memory::User); }},
    {"hw.memsize", CTL_HW, HW_MEMSIZE, [] { return memory(Memory::Size); }},
    {"hw.pagesize", CTL_HW, HW_PAGESIZE, pageSize},
    {"vm.pagesize", 0, 0, pageSize},
    {"kern.ostype", CTL_KERN, KERN_OSTYPE, [] { return kernelString("ostype"); }},
    {"kern.osrelease", CTL_KERN, KERN_OSRELEASE, [] { return kernelString("osrelease"); }},
    {"kern.version", CTL_KERN, KERN_VERSION, [] { return kernelString("version"); }},
    {"kern.hostname", CTL_KERN, KERN_HOSTNAME, [] { return kernelString("hostname"); }},
};

int fail(int error) {
  errno = error;
  return -1;
}

int copyOut(const void* bytes, std::size_t size, void* oldp, std::size_t* oldlenp) {
  if (!oldp) {
    if (oldlenp) *oldlenp = size;
    return 0;
  }
  const std::size_t room = *oldlenp;
  std::memcpy(oldp, bytes, std::min(room, size));
  *oldlenp = size;
  return room < size ? fail(ENOMEM) : 0;
}

int answer(const Name* entry, void* oldp, std::size_t* oldlenp, const void* newp) {
  if (!entry) return fail(ENOENT);
  if (newp) return fail(EPERM);
  if (oldp && !oldlenp) return fail(EINVAL);
  if (!oldp && !oldlenp) return 0;
  const Fact fact = entry->read();
  if (const auto* value = std::get_if<std::int32_t>(&fact)) {
    return copyOut(value, sizeof *value, oldp, oldlenp);
  }
  if (const auto* value = std::get_if<std::int64_t>(&fact)) {
    return copyOut(value, sizeof *value, oldp, oldlenp);
  }
  if (const auto* text = std::get_if<std::string>(&fact)) {
    return copyOut(text->c_str(), text->size() + 1, oldp, oldlenp);
  }
  return fail(EIO);
}

}  // namespace

int sysctlbyname(const char* name, void* oldp, std::size_t* oldlenp, const void* newp,
                 std::size_t /*newlen*/) {
  if (!name) return fail(EINVAL);
  const Name* entry = nullptr;
  for (const Name& candidate : kNames) {
    if (candidate.name == name) entry = &candidate;
  }
  return answer(entry, oldp, oldlenp, newp);
}

int sysctl(const int* name, unsigned int namelen, void* oldp, std::size_t* oldlenp,
           const void* newp, std::size_t /*newlen*/) {
  if (!name || namelen == 0 || namelen > CTL_MAXNAME) return fail(EINVAL);
  const Name* entry = nullptr;
  if (namelen == 2) {
    for (const Name& candidate : kNames) {
      if (candidate.top != 0 && candidate.top == name[0] && candidate.second == name[1])
        entry = &candidate;
    }
  }
  return answer(entry, oldp, oldlenp, newp);
}

}  // namespace kivi
