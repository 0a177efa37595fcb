// Readers of the Linux files the system layer answers from, shared by its
// sources. Every path is read under kivi::system::root().
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kivi::system::detail {

// A decimal number that fills the whole text (no sign, no spaces).
std::optional<std::uint64_t> parseUnsigned(std::string_view text);
// A decimal number that may start with '-'.
std::optional<std::int64_t> parseSigned(std::string_view text);

// The text without one trailing newline (the framing that /proc and /sys add).
std::string withoutTrailingNewline(std::string text);

// The system's page size in bytes.
std::uint64_t pageSize();

// /proc/meminfo: each "Name:  <number> [kB]" line, in bytes for kB lines.
class MemInfo {
 public:
  // False when the file cannot be read or has no well-formed MemTotal line.
  bool load();
  // The value of `name`, or nullopt when the line is missing or garbled.
  std::optional<std::uint64_t> get(std::string_view name) const;
  // Like get(), but a missing line reads as 0; a garbled one is still nullopt.
  std::optional<std::uint64_t> getOrZero(std::string_view name) const;
  // Memory the kernel holds for itself and cannot reclaim or page out:
  // KernelStack + PageTables + SUnreclaim + Unevictable.
  std::optional<std::uint64_t> wired() const;

 private:
  struct Entry {
    std::string name;
    std::optional<std::uint64_t> value;
  };
  const Entry* find(std::string_view name) const;
  std::vector<Entry> entries_;
};

// How many processors a list such as "0-3,5\n" names; nullopt when garbled.
std::optional<std::uint64_t> countProcessorList(std::string_view list);
// Processors the machine has (/sys/devices/system/cpu/present, else
// /sys/devices/system/cpu/possible) and those online now
// (/sys/devices/system/cpu/online). At the real root, sysconf answers when
// the file cannot be read.
std::optional<std::uint64_t> configuredProcessors();
std::optional<std::uint64_t> activeProcessors();

// The fields of a /proc/<pid>/stat line after the command name: element 0 is
// field 3 (the state). Empty when the line is garbled.
std::vector<std::string_view> statFieldsAfterName(std::string_view line);

}  // namespace kivi::system::detail
