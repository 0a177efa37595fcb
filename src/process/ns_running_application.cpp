#include "kivi/process/ns_running_application.h"

#include <dirent.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <string_view>
#include <utility>

#include "kivi/system/system_root.h"

namespace kivi {

namespace detail {

struct RunningApplicationSnapshot {
  std::int32_t pid = 0;
  std::optional<std::string> bundleIdentifier;
  std::optional<std::string> executablePath;
  std::optional<std::string> command;
  // Clock ticks after boot, from /proc/<pid>/stat; nullopt when unknown.
  std::optional<unsigned long long> startTicks;
  std::optional<Date> launchDate;
};

namespace {

// Launchers that name themselves in a unit before the application id.
constexpr std::array<std::string_view, 16> kLaunchers = {
    "gnome", "kde",     "xfce", "cinnamon",        "mate",   "lxqt", "budgie", "dbus", "flatpak",
    "snap",  "systemd", "sway", "org.gnome.Shell", "plasma", "lxde", "unity"};

bool isLauncher(std::string_view name) {
  for (auto launcher : kLaunchers)
    if (name == launcher) return true;
  return false;
}

bool isAlphanumeric(std::string_view text) {
  if (text.empty()) return false;
  for (char c : text)
    if (!((c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'))) return false;
  return true;
}

// The pieces of a unit name between unescaped "-", each with systemd's
// "\xNN" escapes undone.
std::vector<std::string> unitPieces(std::string_view text) {
  std::vector<std::string> pieces(1);
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '-') {
      pieces.emplace_back();
    } else if (text[i] == '\\' && i + 3 < text.size() && text[i + 1] == 'x') {
      unsigned value = 0;
      if (std::sscanf(std::string(text.substr(i + 2, 2)).c_str(), "%2x", &value) == 1) {
        pieces.back() += static_cast<char>(value);
        i += 3;
      } else {
        pieces.back() += text[i];
      }
    } else {
      pieces.back() += text[i];
    }
  }
  return pieces;
}

std::string joined(const std::vector<std::string>& pieces, std::size_t from, std::size_t to) {
  std::string out;
  for (std::size_t i = from; i < to; ++i) {
    if (i > from) out += '-';
    out += pieces[i];
  }
  return out;
}

// The application id a systemd unit name carries, if it is an application's
// unit: app[-<launcher>]-<id>-<random>.scope, app[-<launcher>]-<id>[@<random>].service,
// or a D-Bus activated dbus-:<address>-<id>@<n>.service.
std::optional<std::string> bundleIdentifierFromUnit(std::string_view unit) {
  bool scope = false;
  if (unit.ends_with(".scope")) {
    scope = true;
    unit.remove_suffix(6);
  } else if (unit.ends_with(".service")) {
    unit.remove_suffix(8);
  } else {
    return std::nullopt;
  }
  const bool dbus = unit.starts_with("dbus-:");
  if (!unit.starts_with("app-") && !dbus) return std::nullopt;
  unit.remove_prefix(dbus ? 6 : 4);
  if (!scope) {
    if (auto at = unit.find('@'); at != std::string_view::npos) unit = unit.substr(0, at);
  }
  auto pieces = unitPieces(unit);
  std::size_t first = 0, last = pieces.size();
  if (dbus) {
    if (pieces.size() < 2) return std::nullopt;
    first = 1;  // the bus address
  }
  if (scope && last - first >= 2 && isAlphanumeric(pieces[last - 1])) --last;
  if (last - first >= 2 && isLauncher(pieces[first])) ++first;
  std::string id = joined(pieces, first, last);
  if (id.empty()) return std::nullopt;
  return id;
}

// The application id from a /proc/<pid>/cgroup file: the last line whose
// innermost application unit names one.
std::optional<std::string> bundleIdentifierFromCgroup(std::string_view contents) {
  std::optional<std::string> found;
  std::size_t start = 0;
  while (start < contents.size()) {
    std::size_t end = contents.find('\n', start);
    if (end == std::string_view::npos) end = contents.size();
    std::string_view line = contents.substr(start, end - start);
    start = end + 1;
    auto colon = line.find(':');
    if (colon == std::string_view::npos) continue;
    colon = line.find(':', colon + 1);
    if (colon == std::string_view::npos) continue;
    std::string_view path = line.substr(colon + 1);
    std::optional<std::string> inLine;
    std::size_t from = 0;
    while (from <= path.size()) {
      std::size_t slash = path.find('/', from);
      if (slash == std::string_view::npos) slash = path.size();
      if (auto id = bundleIdentifierFromUnit(path.substr(from, slash - from))) inLine = id;
      from = slash + 1;
    }
    if (inLine) found = inLine;
  }
  return found;
}

// The application id from a /proc/<pid>/environ file.
std::optional<std::string> bundleIdentifierFromEnviron(std::string_view contents) {
  constexpr std::string_view kKey = "GIO_LAUNCHED_DESKTOP_FILE=";
  std::size_t start = 0;
  while (start < contents.size()) {
    std::size_t end = contents.find('\0', start);
    if (end == std::string_view::npos) end = contents.size();
    std::string_view entry = contents.substr(start, end - start);
    start = end + 1;
    if (!entry.starts_with(kKey)) continue;
    entry.remove_prefix(kKey.size());
    if (auto slash = entry.rfind('/'); slash != std::string_view::npos)
      entry.remove_prefix(slash + 1);
    if (!entry.ends_with(".desktop")) return std::nullopt;
    entry.remove_suffix(8);
    if (entry.empty()) return std::nullopt;
    return std::string(entry);
  }
  return std::nullopt;
}

std::string procPath(std::int32_t pid, std::string_view file) {
  return "/proc/" + std::to_string(pid) + "/" + std::string(file);
}

// The command name and start time from /proc/<pid>/stat.
bool readStat(std::int32_t pid, std::optional<std::string>& command,
              std::optional<unsigned long long>& startTicks) {
  std::string stat;
  if (!system::readFileUnderRoot(procPath(pid, "stat"), stat)) return false;
  const auto open = stat.find('(');
  const auto close = stat.rfind(')');
  if (open == std::string::npos || close == std::string::npos || close < open) return false;
  command = stat.substr(open + 1, close - open - 1);
  // After the command: state (field 3) ... starttime (field 22).
  std::size_t at = close + 1;
  for (int field = 3; field <= 22; ++field) {
    while (at < stat.size() && stat[at] == ' ') ++at;
    std::size_t end = stat.find(' ', at);
    if (end == std::string::npos) end = stat.size();
    if (field == 3 && stat.substr(at, end - at) == "Z") return false;  // already ended
    if (field == 22) {
      try {
        startTicks = std::stoull(stat.substr(at, end - at));
      } catch (...) {
        startTicks.reset();
      }
    }
    at = end;
  }
  return true;
}

std::optional<double> bootTime() {
  std::string stat;
  if (!system::readFileUnderRoot("/proc/stat", stat)) return std::nullopt;
  auto at = stat.find("\nbtime ");
  if (at == std::string::npos) return std::nullopt;
  try {
    return std::stod(stat.substr(at + 7));
  } catch (...) {
    return std::nullopt;
  }
}

std::optional<std::string> readLink(const std::string& path) {
  std::string buffer(4096, '\0');
  ssize_t n = ::readlink(path.c_str(), buffer.data(), buffer.size());
  if (n <= 0) return std::nullopt;
  buffer.resize(static_cast<std::size_t>(n));
  return buffer;
}

std::shared_ptr<RunningApplicationSnapshot> snapshotOf(std::int32_t pid) {
  if (pid <= 0) return nullptr;
  auto snapshot = std::make_shared<RunningApplicationSnapshot>();
  snapshot->pid = pid;
  if (!readStat(pid, snapshot->command, snapshot->startTicks)) return nullptr;
  std::string text;
  if (system::readFileUnderRoot(procPath(pid, "cgroup"), text))
    snapshot->bundleIdentifier = bundleIdentifierFromCgroup(text);
  if (!snapshot->bundleIdentifier && system::readFileUnderRoot(procPath(pid, "environ"), text))
    snapshot->bundleIdentifier = bundleIdentifierFromEnviron(text);
  snapshot->executablePath = readLink(system::pathUnderRoot(procPath(pid, "exe")));
  if (snapshot->startTicks) {
    if (auto boot = bootTime()) {
      const long ticks = ::sysconf(_SC_CLK_TCK);
      snapshot->launchDate =
          Date{*boot + static_cast<double>(*snapshot->startTicks) / (ticks > 0 ? ticks : 100)};
    }
  }
  return snapshot;
}

bool sendSignal(const RunningApplicationSnapshot& snapshot, const NSRunningApplication& app,
                int signal) {
  if (!system::isRealRoot() || app.isTerminated()) return false;
  return ::kill(snapshot.pid, signal) == 0;
}

}  // namespace

}  // namespace detail

using detail::RunningApplicationSnapshot;

NSRunningApplication::NSRunningApplication(
    std::shared_ptr<const RunningApplicationSnapshot> snapshot)
    : snapshot_(snapshot ? std::move(snapshot) : std::make_shared<RunningApplicationSnapshot>()) {}

std::shared_ptr<KivNSRunningApplicationProtocol> NSRunningApplication::classObject() {
  return std::make_shared<NSRunningApplication>(nullptr);
}

std::shared_ptr<NSRunningApplication> NSRunningApplication::currentApplication() {
  const auto pid = static_cast<std::int32_t>(::getpid());
  auto snapshot = detail::snapshotOf(pid);
  if (!snapshot) {
    snapshot = std::make_shared<RunningApplicationSnapshot>();
    snapshot->pid = pid;
  }
  return std::make_shared<NSRunningApplication>(std::move(snapshot));
}

std::shared_ptr<NSRunningApplication> NSRunningApplication::runningApplicationWithProcessIdentifier(
    std::int32_t pid) {
  auto snapshot = detail::snapshotOf(pid);
  if (!snapshot) return nullptr;
  return std::make_shared<NSRunningApplication>(std::move(snapshot));
}

std::vector<std::shared_ptr<NSRunningApplication>> NSRunningApplication::runningApplications(
    const std::string& bundleIdentifier) {
  std::vector<std::shared_ptr<NSRunningApplication>> found;
  if (bundleIdentifier.empty()) return found;
  DIR* proc = ::opendir(system::pathUnderRoot("/proc").c_str());
  if (!proc) return found;
  while (dirent* entry = ::readdir(proc)) {
    std::string_view name = entry->d_name;
    if (name.empty() || name.size() > 9 ||
        !std::all_of(name.begin(), name.end(), [](char c) { return c >= '0' && c <= '9'; }))
      continue;
    const auto pid = static_cast<std::int32_t>(std::stol(std::string(name)));
    auto snapshot = detail::snapshotOf(pid);
    if (snapshot && snapshot->bundleIdentifier == bundleIdentifier)
      found.push_back(std::make_shared<NSRunningApplication>(std::move(snapshot)));
  }
  ::closedir(proc);
  return found;
}

std::vector<std::shared_ptr<NSRunningApplication>>
NSRunningApplication::runningApplicationsWithBundleIdentifier(const std::string& bundleIdentifier) {
  return runningApplications(bundleIdentifier);
}

std::int32_t NSRunningApplication::processIdentifier() const { return snapshot_->pid; }

std::optional<std::string> NSRunningApplication::bundleIdentifier() const {
  return snapshot_->bundleIdentifier;
}

URLPtr NSRunningApplication::executableURL() const {
  return snapshot_->executablePath ? URL::fileURLWithPath(*snapshot_->executablePath) : nullptr;
}

std::optional<std::string> NSRunningApplication::localizedName() const {
  if (const auto& id = snapshot_->bundleIdentifier) {
    auto dot = id->rfind('.');
    std::string last = dot == std::string::npos ? *id : id->substr(dot + 1);
    if (!last.empty()) return last;
  }
  return snapshot_->command;
}

std::optional<Date> NSRunningApplication::launchDate() const { return snapshot_->launchDate; }

bool NSRunningApplication::isTerminated() const {
  if (snapshot_->pid <= 0) return true;
  std::optional<std::string> command;
  std::optional<unsigned long long> startTicks;
  if (!detail::readStat(snapshot_->pid, command, startTicks)) return true;
  return snapshot_->startTicks && startTicks != snapshot_->startTicks;
}

bool NSRunningApplication::terminate() { return detail::sendSignal(*snapshot_, *this, SIGTERM); }

bool NSRunningApplication::forceTerminate() {
  return detail::sendSignal(*snapshot_, *this, SIGKILL);
}

std::string NSRunningApplication::description() const {
  return Object::description() + " pid " + std::to_string(snapshot_->pid) + " " +
         snapshot_->bundleIdentifier.value_or("(no bundle identifier)");
}

}  // namespace kivi
