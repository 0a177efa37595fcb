// The application's bundle, from /proc/self/exe and its desktop entry.
#include "kivi/desktop/ns_bundle.h"

#include <elf.h>
#include <fcntl.h>
#include <glib.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <string>
#include <system_error>

#include "desktop_entries.h"

namespace kivi {
namespace {

constexpr const char* kGroup = G_KEY_FILE_DESKTOP_GROUP;

std::string fileName(const std::string& path) {
  return std::filesystem::path(path).filename().string();
}

std::string directoryOf(const std::string& path) {
  return std::filesystem::path(path).parent_path().string();
}

// The installation prefix of an executable (see the header).
std::string prefixOf(const std::string& executable) {
  const std::filesystem::path dir = std::filesystem::path(executable).parent_path();
  const std::string name = dir.filename().string();
  if ((name == "bin" || name == "sbin") && dir.has_parent_path() && dir != dir.root_path()) {
    return dir.parent_path().string();
  }
  return dir.string();
}

// The processor type of the ELF file at `path`, in the platform's numbers.
std::optional<std::vector<std::int64_t>> architecturesOf(const std::string& path) {
  if (path.empty()) return std::nullopt;
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return std::nullopt;
  unsigned char header[EI_NIDENT + 4] = {};
  const ssize_t got = ::pread(fd, header, sizeof header, 0);
  ::close(fd);
  if (got != static_cast<ssize_t>(sizeof header) || header[EI_MAG0] != ELFMAG0 ||
      header[EI_MAG1] != ELFMAG1 || header[EI_MAG2] != ELFMAG2 || header[EI_MAG3] != ELFMAG3) {
    return std::nullopt;
  }
  // e_machine follows e_ident and e_type, in the file's byte order.
  const unsigned char* m = header + EI_NIDENT + 2;
  const unsigned machine = header[EI_DATA] == ELFDATA2MSB ? (m[0] << 8 | m[1]) : (m[1] << 8 | m[0]);
  switch (machine) {
    case EM_X86_64:
      return std::vector<std::int64_t>{NSBundleExecutableArchitectureX86_64};
    case EM_AARCH64:
      return std::vector<std::int64_t>{NSBundleExecutableArchitectureARM64};
    case EM_386:
      return std::vector<std::int64_t>{NSBundleExecutableArchitectureI386};
    case EM_ARM:
      return std::vector<std::int64_t>{NSBundleExecutableArchitectureARM};
    case EM_PPC:
      return std::vector<std::int64_t>{NSBundleExecutableArchitecturePPC};
    case EM_PPC64:
      return std::vector<std::int64_t>{NSBundleExecutableArchitecturePPC64};
    default:
      return std::nullopt;
  }
}

struct Entry {
  GKeyFile* file = nullptr;
  std::string id;
};

// Whether `entry` runs `executable`: its program is that absolute path, or a
// bare name equal to the executable's file name.
bool runs(GKeyFile* entry, const std::string& executable) {
  const std::string program = detail::entryProgram(entry);
  if (program.empty()) return false;
  if (program.find('/') != std::string::npos) {
    std::error_code error;
    return program == executable || std::filesystem::equivalent(program, executable, error);
  }
  return program == fileName(executable);
}

// The first entry under `roots` that runs `executable`.
Entry entryRunning(const std::vector<std::string>& roots, const std::string& executable) {
  for (const std::string& root : roots) {
    for (const std::string& path : detail::desktopFilesUnder(root)) {
      GKeyFile* file = detail::loadDesktopEntry(path);
      if (!file) continue;
      if (runs(file, executable)) return {file, detail::desktopFileId(root, path)};
      g_key_file_unref(file);
    }
  }
  return {};
}

// The entry GIO launched this process from, when it names this process.
Entry launchingEntry() {
  const char* path = std::getenv("GIO_LAUNCHED_DESKTOP_FILE");
  const char* pid = std::getenv("GIO_LAUNCHED_DESKTOP_FILE_PID");
  if (!path || !*path || !pid || std::to_string(::getpid()) != pid) return {};
  GKeyFile* file = detail::loadDesktopEntry(path);
  if (!file) return {};
  // Its id is relative to the applications directory it is in.
  for (const std::string& root : detail::applicationDirectories()) {
    if (std::string(path).starts_with(root + "/")) {
      return {file, detail::desktopFileId(root, path)};
    }
  }
  return {file, detail::desktopFileId(directoryOf(path), path)};
}

Dictionary infoFrom(const Entry& entry, const std::string& executable) {
  Dictionary info;
  if (!executable.empty()) info["CFBundleExecutable"] = Value(fileName(executable));
  if (!entry.file) return info;
  gsize count = 0;
  gchar** keys = g_key_file_get_keys(entry.file, kGroup, &count, nullptr);
  for (gsize i = 0; i < count; ++i) {
    if (gchar* raw = g_key_file_get_value(entry.file, kGroup, keys[i], nullptr)) {
      info[keys[i]] = Value(std::string(raw));
      g_free(raw);
    }
  }
  g_strfreev(keys);
  info["CFBundleIdentifier"] = Value(entry.id);
  if (gchar* name = g_key_file_get_string(entry.file, kGroup, "Name", nullptr)) {
    info["CFBundleName"] = Value(std::string(name));
    g_free(name);
  }
  if (gchar* name = g_key_file_get_locale_string(entry.file, kGroup, "Name", nullptr, nullptr)) {
    info["CFBundleDisplayName"] = Value(std::string(name));
    g_free(name);
  }
  if (gchar* version = g_key_file_get_string(entry.file, kGroup, "X-AppVersion", nullptr)) {
    info["CFBundleShortVersionString"] = Value(std::string(version));
    info["CFBundleVersion"] = Value(std::string(version));
    g_free(version);
  }
  return info;
}

std::shared_ptr<NSBundle> makeBundle(std::string path, std::string executable, Entry entry) {
  Dictionary info = infoFrom(entry, executable);
  std::optional<std::string> id;
  if (entry.file) {
    id = entry.id;
    g_key_file_unref(entry.file);
  }
  auto architectures = architecturesOf(executable);
  return std::make_shared<NSBundle>(std::move(path), std::move(executable), std::move(id),
                                    std::move(info), std::move(architectures));
}

std::shared_ptr<NSBundle> readMainBundle() {
  std::error_code error;
  std::string executable = std::filesystem::read_symlink("/proc/self/exe", error).string();
  if (error) executable.clear();
  const std::string prefix = executable.empty() ? std::string("/") : prefixOf(executable);
  Entry entry = launchingEntry();
  if (!entry.file && !executable.empty()) {
    std::vector<std::string> roots = detail::applicationDirectories();
    roots.push_back(prefix + "/share/applications");
    entry = entryRunning(roots, executable);
  }
  return makeBundle(prefix, std::move(executable), entry);
}

}  // namespace

NSBundle::NSBundle(std::string path, std::string executable, std::optional<std::string> identifier,
                   Dictionary info, std::optional<std::vector<std::int64_t>> architectures)
    : path_(std::move(path)),
      executable_(std::move(executable)),
      identifier_(std::move(identifier)),
      info_(std::move(info)),
      architectures_(std::move(architectures)) {}

std::shared_ptr<NSBundle> NSBundle::mainBundle() {
  static const std::shared_ptr<NSBundle> bundle = readMainBundle();
  return bundle;
}

std::shared_ptr<NSBundle> NSBundle::bundleWithPath(const std::string& path) {
  std::error_code error;
  if (path.empty() || !std::filesystem::is_directory(path, error)) return nullptr;
  std::string dir = std::filesystem::absolute(path, error).lexically_normal().string();
  while (dir.size() > 1 && dir.ends_with('/')) dir.pop_back();
  const std::string root = dir + "/share/applications";
  Entry entry;
  for (const std::string& file : detail::desktopFilesUnder(root)) {
    if ((entry.file = detail::loadDesktopEntry(file))) {
      entry.id = detail::desktopFileId(root, file);
      break;
    }
  }
  std::string executable;
  if (entry.file) {
    const std::string program = detail::entryProgram(entry.file);
    const std::string candidate = program.find('/') != std::string::npos || program.empty()
                                      ? program
                                      : dir + "/bin/" + program;
    if (!candidate.empty() && std::filesystem::is_regular_file(candidate, error)) {
      executable = candidate;
    }
  }
  return makeBundle(std::move(dir), std::move(executable), entry);
}

std::optional<std::string> NSBundle::bundleIdentifier() { return identifier_; }

std::string NSBundle::bundlePath() { return path_; }

std::optional<std::vector<std::int64_t>> NSBundle::executableArchitectures() {
  return architectures_;
}

Value NSBundle::objectForInfoDictionaryKey(const std::string& key) {
  const auto it = info_.find(key);
  return it == info_.end() ? Value() : it->second;
}

}  // namespace kivi
