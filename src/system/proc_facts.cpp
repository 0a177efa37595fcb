#include "proc_facts.h"

#include <unistd.h>

#include <limits>

#include "kivi/system/system_root.h"

namespace kivi::system::detail {

std::optional<std::uint64_t> parseUnsigned(std::string_view text) {
  if (text.empty()) return std::nullopt;
  std::uint64_t value = 0;
  for (const char c : text) {
    if (c < '0' || c > '9') return std::nullopt;
    const std::uint64_t digit = static_cast<std::uint64_t>(c - '0');
    if (value > (std::numeric_limits<std::uint64_t>::max() - digit) / 10) return std::nullopt;
    value = value * 10 + digit;
  }
  return value;
}

std::optional<std::int64_t> parseSigned(std::string_view text) {
  const bool negative = text.starts_with('-');
  if (negative) text.remove_prefix(1);
  const auto magnitude = parseUnsigned(text);
  if (!magnitude ||
      *magnitude > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()))
    return std::nullopt;
  const auto value = static_cast<std::int64_t>(*magnitude);
  return negative ? -value : value;
}

std::string withoutTrailingNewline(std::string text) {
  if (!text.empty() && text.back() == '\n') text.pop_back();
  return text;
}

std::uint64_t pageSize() {
  const long size = ::sysconf(_SC_PAGESIZE);
  return size > 0 ? static_cast<std::uint64_t>(size) : 4096;
}

namespace {

std::string_view trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(" \t");
  if (first == std::string_view::npos) return {};
  const auto last = text.find_last_not_of(" \t");
  return text.substr(first, last - first + 1);
}

}  // namespace

bool MemInfo::load() {
  entries_.clear();
  std::string text;
  if (!readFileUnderRoot("/proc/meminfo", text)) return false;
  std::string_view rest = text;
  while (!rest.empty()) {
    const auto end = rest.find('\n');
    std::string_view line = rest.substr(0, end);
    rest = end == std::string_view::npos ? std::string_view() : rest.substr(end + 1);
    const auto colon = line.find(':');
    if (colon == std::string_view::npos || colon == 0) continue;
    Entry entry{std::string(line.substr(0, colon)), std::nullopt};
    std::string_view value = trimmed(line.substr(colon + 1));
    std::uint64_t scale = 1;
    if (value.ends_with(" kB")) {
      value = trimmed(value.substr(0, value.size() - 3));
      scale = 1024;
    }
    if (const auto number = parseUnsigned(value);
        number && *number <= std::numeric_limits<std::uint64_t>::max() / scale) {
      entry.value = *number * scale;
    }
    entries_.push_back(std::move(entry));
  }
  return get("MemTotal").has_value();
}

const MemInfo::Entry* MemInfo::find(std::string_view name) const {
  for (const Entry& entry : entries_) {
    if (entry.name == name) return &entry;
  }
  return nullptr;
}

std::optional<std::uint64_t> MemInfo::get(std::string_view name) const {
  const Entry* entry = find(name);
  return entry ? entry->value : std::nullopt;
}

std::optional<std::uint64_t> MemInfo::getOrZero(std::string_view name) const {
  const Entry* entry = find(name);
  return entry ? entry->value : std::optional<std::uint64_t>(0);
}

std::optional<std::uint64_t> MemInfo::wired() const {
  std::uint64_t total = 0;
  for (const char* name : {"KernelStack", "PageTables", "SUnreclaim", "Unevictable"}) {
    const auto value = getOrZero(name);
    if (!value || *value > std::numeric_limits<std::uint64_t>::max() - total) return std::nullopt;
    total += *value;
  }
  return total;
}

std::optional<std::uint64_t> countProcessorList(std::string_view list) {
  if (list.ends_with('\n')) list.remove_suffix(1);
  if (list.empty()) return std::nullopt;
  std::uint64_t count = 0;
  while (true) {
    const auto comma = list.find(',');
    const std::string_view item = list.substr(0, comma);
    const auto dash = item.find('-');
    const auto first = parseUnsigned(item.substr(0, dash));
    const auto last = dash == std::string_view::npos ? first : parseUnsigned(item.substr(dash + 1));
    if (!first || !last || *last < *first || *last - *first >= (1ull << 32)) return std::nullopt;
    count += *last - *first + 1;
    if (comma == std::string_view::npos) break;
    list.remove_prefix(comma + 1);
  }
  return count;
}

namespace {

std::optional<std::uint64_t> processorsFrom(std::initializer_list<const char*> paths,
                                            int sysconfName) {
  std::string text;
  for (const char* path : paths) {
    if (readFileUnderRoot(path, text)) return countProcessorList(text);
  }
  if (isRealRoot()) {
    const long count = ::sysconf(sysconfName);
    if (count > 0) return static_cast<std::uint64_t>(count);
  }
  return std::nullopt;
}

}  // namespace

std::optional<std::uint64_t> configuredProcessors() {
  return processorsFrom({"/sys/devices/system/cpu/present", "/sys/devices/system/cpu/possible"},
                        _SC_NPROCESSORS_CONF);
}

std::optional<std::uint64_t> activeProcessors() {
  return processorsFrom({"/sys/devices/system/cpu/online"}, _SC_NPROCESSORS_ONLN);
}

std::vector<std::string_view> statFieldsAfterName(std::string_view line) {
  std::vector<std::string_view> fields;
  // The command name is in parentheses and may itself hold spaces and ')'.
  const auto close = line.rfind(')');
  if (close == std::string_view::npos || line.find('(') > close) return fields;
  std::string_view rest = line.substr(close + 1);
  while (true) {
    const auto start = rest.find_first_not_of(" \n");
    if (start == std::string_view::npos) break;
    rest.remove_prefix(start);
    const auto end = rest.find_first_of(" \n");
    fields.push_back(rest.substr(0, end));
    if (end == std::string_view::npos) break;
    rest.remove_prefix(end);
  }
  return fields;
}

}  // namespace kivi::system::detail
