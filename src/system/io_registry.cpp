#include "kivi/system/io_registry.h"

#include <sys/stat.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "kivi/system/system_root.h"

namespace kivi {

namespace {

constexpr std::string_view kPlatformClass = "IOPlatformExpertDevice";
constexpr const char* kDmi = "/sys/class/dmi/id";
constexpr const char* kDeviceTrees[] = {"/proc/device-tree", "/sys/firmware/devicetree/base"};

std::mutex gMutex;
std::set<io_object_t> gHandles;  // live handles, guarded by gMutex
io_object_t gNextHandle = 1;

bool isDirectory(const char* absolutePath) {
  struct stat info {};
  return ::stat(system::pathUnderRoot(absolutePath).c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

bool firmwareDescribesMachine() {
  if (isDirectory(kDmi)) return true;
  return std::any_of(std::begin(kDeviceTrees), std::end(kDeviceTrees),
                     [](const char* path) { return isDirectory(path); });
}

bool isUTF8(std::string_view text) {
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
  const auto length = static_cast<std::int32_t>(text.size());
  for (std::int32_t at = 0; at < length;) {
    UChar32 c = 0;
    U8_NEXT(bytes, at, length, c);
    if (c < 0) return false;
  }
  return true;
}

// A DMI value without the newline sysfs adds; nullopt when unreadable, empty
// or not text.
std::optional<std::string> dmiValue(std::string_view name) {
  std::string text;
  if (!system::readFileUnderRoot(std::string(kDmi) + "/" + std::string(name), text))
    return std::nullopt;
  if (!text.empty() && text.back() == '\n') text.pop_back();
  if (text.empty() || !isUTF8(text)) return std::nullopt;
  return text;
}

// A device-tree string property without its NUL terminator.
std::optional<std::string> deviceTreeValue(std::string_view name) {
  for (const char* base : kDeviceTrees) {
    std::string text;
    if (!system::readFileUnderRoot(std::string(base) + "/" + std::string(name), text)) continue;
    while (!text.empty() && text.back() == '\0') text.pop_back();
    if (!text.empty() && isUTF8(text)) return text;
  }
  return std::nullopt;
}

bool isPlaceholder(std::string_view text) {
  constexpr std::string_view kSpace = " \t\r\n";
  const auto first = text.find_first_not_of(kSpace);
  if (first == std::string_view::npos) return true;
  text = text.substr(first, text.find_last_not_of(kSpace) - first + 1);
  constexpr std::string_view kPlaceholders[] = {"To Be Filled By O.E.M.",
                                                "Not Specified",
                                                "System Serial Number",
                                                "Default string",
                                                "0",
                                                "None"};
  return std::any_of(std::begin(kPlaceholders), std::end(kPlaceholders), [&](std::string_view p) {
    return p.size() == text.size() &&
           std::equal(p.begin(), p.end(), text.begin(), [](char a, char b) {
             return std::tolower(static_cast<unsigned char>(a)) ==
                    std::tolower(static_cast<unsigned char>(b));
           });
  });
}

Value stringOrNull(std::optional<std::string> text) {
  return text ? Value(std::move(*text)) : Value();
}

Value platformProperty(std::string_view key) {
  if (key == "IOPlatformSerialNumber") {
    for (auto candidate : {dmiValue("product_serial"), deviceTreeValue("serial-number")}) {
      if (candidate && !isPlaceholder(*candidate)) return Value(std::move(*candidate));
    }
    return Value();
  }
  if (key == "model") {
    auto model = dmiValue("product_name");
    return stringOrNull(model ? std::move(model) : deviceTreeValue("model"));
  }
  if (key == "manufacturer") return stringOrNull(dmiValue("sys_vendor"));
  return Value();
}

}  // namespace

Dictionary IOServiceMatching(const char* name) {
  if (!name) return Dictionary();
  return Dictionary{{"IOProviderClass", Value(name)}};
}

io_service_t IOServiceGetMatchingService(mach_port_t mainPort, Dictionary matching) {
  if (mainPort != kIOMainPortDefault) return 0;
  const auto wanted = matching.find("IOProviderClass");
  if (wanted == matching.end()) return 0;
  const String* name = wanted->second.asString();
  if (!name || *name != kPlatformClass || !firmwareDescribesMachine()) return 0;
  std::lock_guard lock(gMutex);
  // Skip 0 and any number still live after the counter wraps.
  while (gNextHandle == 0 || gHandles.count(gNextHandle)) ++gNextHandle;
  const io_object_t handle = gNextHandle++;
  gHandles.insert(handle);
  return handle;
}

Value IORegistryEntryCreateCFProperty(io_registry_entry_t entry, const String& key,
                                      const void* /*allocator*/, IOOptionBits /*options*/) {
  {
    std::lock_guard lock(gMutex);
    if (!gHandles.count(entry)) return Value();
  }
  return platformProperty(key);
}

kern_return_t IOObjectRelease(io_object_t object) {
  std::lock_guard lock(gMutex);
  return gHandles.erase(object) ? KERN_SUCCESS : KERN_INVALID_ARGUMENT;
}

}  // namespace kivi
