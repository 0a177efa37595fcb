#include "kivi/system/locale_info.h"

#include <unicode/locid.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <string_view>

#include "kivi/system/system_root.h"

namespace kivi {

namespace {

constexpr std::string_view kZoneinfo = "/usr/share/zoneinfo/";

// A name made of the characters IANA names use, with no way out of the
// zoneinfo directory.
bool isPlausibleZoneName(std::string_view name) {
  if (name.empty() || name.front() == '/' || name.find("..") != std::string_view::npos) {
    return false;
  }
  for (const char c : name) {
    const bool ok = (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') ||
                    c == '/' || c == '_' || c == '-' || c == '+';
    if (!ok) return false;
  }
  return true;
}

bool zoneExists(std::string_view name) {
  if (name == "UTC" || name == "GMT") return true;
  if (!isPlausibleZoneName(name)) return false;
  std::error_code ignored;
  return std::filesystem::is_regular_file(
      system::pathUnderRoot(std::string(kZoneinfo) + std::string(name)), ignored);
}

// The zone name in a path that goes through a zoneinfo directory.
std::optional<std::string> zoneFromPath(std::string_view path) {
  const auto at = path.rfind("zoneinfo/");
  if (at == std::string_view::npos) return std::nullopt;
  std::string_view name = path.substr(at + 9);
  for (std::string_view tree : {"posix/", "right/"}) {
    if (name.starts_with(tree)) name.remove_prefix(tree.size());
  }
  if (!isPlausibleZoneName(name)) return std::nullopt;
  return std::string(name);
}

std::optional<std::string> zoneFromEnvironment() {
  const char* tz = std::getenv("TZ");
  if (!tz) return std::nullopt;
  std::string_view value(tz);
  if (value.empty()) return "UTC";
  if (value.front() == ':') value.remove_prefix(1);
  if (value.starts_with('/')) return zoneFromPath(value);
  if (zoneExists(value)) return std::string(value);
  return std::nullopt;
}

std::optional<std::string> zoneFromLocaltimeLink() {
  std::error_code error;
  const auto target = std::filesystem::read_symlink(system::pathUnderRoot("/etc/localtime"), error);
  if (error) return std::nullopt;
  return zoneFromPath(target.string());
}

std::optional<std::string> zoneFromTimezoneFile() {
  std::string contents;
  if (!system::readFileUnderRoot("/etc/timezone", contents)) return std::nullopt;
  const auto end = contents.find_first_of(" \t\r\n");
  std::string name = contents.substr(0, end);
  if (!zoneExists(name)) return std::nullopt;
  return name;
}

}  // namespace

std::shared_ptr<const Locale> Locale::currentLocale() {
  return std::make_shared<const Locale>(icu::Locale::getDefault().getName());
}

std::shared_ptr<const Locale> Locale::localeWithLocaleIdentifier(std::string identifier) {
  return std::make_shared<const Locale>(std::move(identifier));
}

std::optional<std::string> Locale::countryCode() const {
  const icu::Locale locale(identifier_.c_str());
  if (locale.isBogus()) return std::nullopt;
  // ICU's name for the C and POSIX locales: no region chosen.
  if (std::string_view(locale.getVariant()) == "POSIX") return std::nullopt;
  const char* country = locale.getCountry();
  if (!country || !*country) return std::nullopt;
  return std::string(country);
}

std::shared_ptr<const TimeZone> TimeZone::localTimeZone() {
  auto name = zoneFromEnvironment();
  if (!name) name = zoneFromLocaltimeLink();
  if (!name) name = zoneFromTimezoneFile();
  return std::make_shared<const TimeZone>(name ? std::move(*name) : "UTC");
}

std::shared_ptr<const TimeZone> TimeZone::timeZoneWithName(const std::string& name) {
  if (!zoneExists(name)) return nullptr;
  return std::make_shared<const TimeZone>(name);
}

}  // namespace kivi
