#include "kivi/system/process_info.h"

#include <unistd.h>

#include "kivi/system/system_root.h"
#include "proc_facts.h"

namespace kivi {

ProcessInfo& ProcessInfo::processInfo() {
  static ProcessInfo info;
  return info;
}

std::uint64_t ProcessInfo::physicalMemory() const {
  system::detail::MemInfo info;
  if (info.load()) return *info.get("MemTotal");
  if (!system::isRealRoot()) return 0;
  const long pages = ::sysconf(_SC_PHYS_PAGES);
  return pages > 0 ? static_cast<std::uint64_t>(pages) * system::detail::pageSize() : 0;
}

int ProcessInfo::processIdentifier() const { return static_cast<int>(::getpid()); }

std::uint64_t ProcessInfo::processorCount() const {
  const auto count = system::detail::configuredProcessors();
  return count && *count > 0 ? *count : 1;
}

std::uint64_t ProcessInfo::activeProcessorCount() const {
  const auto count = system::detail::activeProcessors();
  return count && *count > 0 ? *count : 1;
}

}  // namespace kivi
