// The process-information object: facts about this process and the machine
// it runs on, read afresh from Linux on each call.
//
//   const auto& info = kivi::ProcessInfo::processInfo();
//   std::uint64_t bytes = info.physicalMemory();
//   std::uint64_t workers = info.activeProcessorCount();
//
// Sources (paths under kivi::system::root()): physicalMemory is MemTotal of
// /proc/meminfo (at the real root, sysconf(_SC_PHYS_PAGES) × page size when
// that cannot be read; 0 under another root); processorCount is the count in
// /sys/devices/system/cpu/present (else .../possible) and
// activeProcessorCount the count in /sys/devices/system/cpu/online (at the
// real root sysconf answers when those cannot be read; 1 under another root).
//
// Thread contract: the object is shared and immutable; every member may be
// called from any thread at once.
#pragma once

#include <cstdint>

#include "kivi/export.h"

namespace kivi {

// Facts about this process and the machine; reached through processInfo().
class KIVI_EXPORT ProcessInfo {
 public:
  // The one object of the process.
  static ProcessInfo& processInfo();

  ProcessInfo(const ProcessInfo&) = delete;
  ProcessInfo& operator=(const ProcessInfo&) = delete;

  // Bytes of memory installed.
  std::uint64_t physicalMemory() const;
  // This process's id (getpid()).
  int processIdentifier() const;
  // Processors the machine has, and those online now.
  std::uint64_t processorCount() const;
  std::uint64_t activeProcessorCount() const;

 private:
  ProcessInfo() = default;
};

}  // namespace kivi
