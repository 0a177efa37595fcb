// Kernel and hardware facts read the BSD way: by dotted name or by a numeric
// name, into a caller's buffer. The answers come from the running Linux
// system; nothing can be set.
//
//   std::int64_t memory = 0;
//   std::size_t size = sizeof memory;
//   if (kivi::sysctlbyname("hw.memsize", &memory, &size, nullptr, 0) == 0) ...
//
//   char release[256];
//   std::size_t length = sizeof release;
//   const int name[] = {kivi::CTL_KERN, kivi::KERN_OSRELEASE};
//   kivi::sysctl(name, 2, release, &length, nullptr, 0);  // "6.8.0-45-generic"
//
// Both calls return 0 on success and -1 with errno set on failure:
//   EINVAL  a null name, a numeric name of no or more than 12 parts, or a
//           buffer without a size (oldp given, oldlenp null)
//   ENOENT  a name this system does not answer
//   EPERM   newp given: every value is read-only
//   ENOMEM  the buffer is too small: what fits is copied and *oldlenp is set
//           to the size needed
//   EIO     the file that holds the fact cannot be read or makes no sense
// With oldp null, *oldlenp receives the size needed. Strings end with a NUL,
// counted in the size. A 32-bit value read into a larger buffer fills 4 bytes
// and sets *oldlenp to 4; a 64-bit value needs 8 bytes.
//
// The names and where each answer comes from (paths under
// kivi::system::root(), see system_root.h):
//   hw.machine    (CTL_HW, HW_MACHINE)   string: uname()'s machine at the
//                 real root, else /proc/sys/kernel/arch
//   hw.ncpu       (CTL_HW, HW_NCPU)      int32: processors the machine has,
//                 /sys/devices/system/cpu/present (else .../possible)
//   hw.activecpu, hw.logicalcpu          int32: processors online,
//                 /sys/devices/system/cpu/online
//   hw.physmem    (CTL_HW, HW_PHYSMEM)   int32: MemTotal of /proc/meminfo
//   hw.usermem    (CTL_HW, HW_USERMEM)   int32: MemTotal less the memory the
//                 kernel keeps wired (KernelStack + PageTables + SUnreclaim +
//                 Unevictable of /proc/meminfo)
//                 Both are 32-bit and clamp at 2147483647: a machine with more
//                 than 2 GiB reads 2147483647. Use hw.memsize.
//   hw.memsize    (CTL_HW, HW_MEMSIZE)   int64: MemTotal in bytes
//   hw.pagesize   (CTL_HW, HW_PAGESIZE), vm.pagesize
//                                        int32: sysconf(_SC_PAGESIZE)
//   kern.ostype   (CTL_KERN, KERN_OSTYPE)     string: /proc/sys/kernel/ostype
//   kern.osrelease (CTL_KERN, KERN_OSRELEASE) string: .../osrelease
//   kern.version  (CTL_KERN, KERN_VERSION)    string: .../version
//   kern.hostname (CTL_KERN, KERN_HOSTNAME)   string: .../hostname
// (the kernel files' trailing newline removed). Each call reads afresh.
//
// Thread contract: both functions may be called from any thread at once.
#pragma once

#include <cstddef>

#include "kivi/export.h"

namespace kivi {

// The first number of a numeric name: the kernel's facts or the hardware's.
inline constexpr int CTL_KERN = 1, CTL_HW = 6;
// Second numbers under CTL_KERN: kern.ostype, kern.osrelease, kern.version, kern.hostname.
inline constexpr int KERN_OSTYPE = 1, KERN_OSRELEASE = 2, KERN_VERSION = 4, KERN_HOSTNAME = 10;
// Second numbers under CTL_HW: hw.machine, hw.ncpu, hw.physmem, hw.usermem, hw.pagesize,
// hw.memsize.
inline constexpr int HW_MACHINE = 1, HW_NCPU = 3, HW_PHYSMEM = 5, HW_USERMEM = 6, HW_PAGESIZE = 7,
                     HW_MEMSIZE = 24;
// The most parts a numeric name may have.
inline constexpr unsigned int CTL_MAXNAME = 12;

// Reads the fact with dotted name `name` ("hw.memsize") into oldp, which holds *oldlenp bytes;
// 0, or -1 with errno set. newp must be null.
KIVI_EXPORT int sysctlbyname(const char* name, void* oldp, std::size_t* oldlenp, const void* newp,
                             std::size_t newlen);
// As sysctlbyname, for the numeric name of `namelen` numbers at `name` ({CTL_HW, HW_MEMSIZE}).
KIVI_EXPORT int sysctl(const int* name, unsigned int namelen, void* oldp, std::size_t* oldlenp,
                       const void* newp, std::size_t newlen);

}  // namespace kivi
