#include "desktop_entries.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace kivi::detail {
namespace {

constexpr const char* kGroup = G_KEY_FILE_DESKTOP_GROUP;
constexpr std::string_view kSuffix = ".desktop";

std::string environment(const char* name) {
  const char* value = std::getenv(name);
  return value ? value : "";
}

}  // namespace

std::vector<std::string> applicationDirectories() {
  std::vector<std::string> dirs;
  std::string home = environment("XDG_DATA_HOME");
  if (home.empty() || home[0] != '/') {
    const std::string user = environment("HOME");
    home = user.empty() ? "" : user + "/.local/share";
  }
  if (!home.empty()) dirs.push_back(home + "/applications");
  std::string data = environment("XDG_DATA_DIRS");
  if (data.empty()) data = "/usr/local/share:/usr/share";
  std::size_t start = 0;
  while (start <= data.size()) {
    const std::size_t end = std::min(data.find(':', start), data.size());
    const std::string dir = data.substr(start, end - start);
    // Relative entries are invalid and ignored.
    if (!dir.empty() && dir[0] == '/') dirs.push_back(dir + "/applications");
    start = end + 1;
  }
  return dirs;
}

std::string desktopFileId(const std::string& root, const std::string& path) {
  std::string relative = path.substr(std::min(path.size(), root.size()));
  while (!relative.empty() && relative[0] == '/') relative.erase(0, 1);
  if (relative.ends_with(kSuffix)) relative.resize(relative.size() - kSuffix.size());
  std::replace(relative.begin(), relative.end(), '/', '-');
  return relative;
}

GKeyFile* loadDesktopEntry(const std::string& path) {
  GKeyFile* entry = g_key_file_new();
  if (!g_key_file_load_from_file(entry, path.c_str(), G_KEY_FILE_NONE, nullptr) ||
      !g_key_file_has_group(entry, kGroup) ||
      g_key_file_get_boolean(entry, kGroup, G_KEY_FILE_DESKTOP_KEY_HIDDEN, nullptr)) {
    g_key_file_unref(entry);
    return nullptr;
  }
  return entry;
}

std::optional<std::string> findDesktopEntry(std::string id) {
  if (id.ends_with(kSuffix)) id.resize(id.size() - kSuffix.size());
  if (id.empty() || id.find('/') != std::string::npos || id == "." || id == "..") {
    return std::nullopt;
  }
  for (const std::string& dir : applicationDirectories()) {
    // "a-b-c" may live in applications/a/b-c.desktop and so on: try the
    // file name itself first, then each "-" as a directory.
    std::string candidate = id + std::string(kSuffix);
    for (std::size_t pos = 0;;) {
      const std::string path = dir + "/" + candidate;
      if (GKeyFile* entry = loadDesktopEntry(path)) {
        g_key_file_unref(entry);
        return path;
      }
      pos = candidate.find('-', pos);
      if (pos == std::string::npos) break;
      candidate[pos] = '/';
    }
  }
  return std::nullopt;
}

std::vector<std::string> desktopFilesUnder(const std::string& root) {
  std::vector<std::string> files, subdirs;
  std::error_code error;
  for (std::filesystem::directory_iterator it(root, error), end; !error && it != end;
       it.increment(error)) {
    const std::string path = it->path().string();
    if (it->is_directory(error)) {
      subdirs.push_back(path);
    } else if (path.ends_with(kSuffix)) {
      files.push_back(path);
    }
  }
  std::sort(files.begin(), files.end());
  std::sort(subdirs.begin(), subdirs.end());
  for (const std::string& dir : subdirs) {
    for (std::string& file : desktopFilesUnder(dir)) files.push_back(std::move(file));
  }
  return files;
}

std::string entryProgram(GKeyFile* entry) {
  std::string program;
  if (gchar* tryExec = g_key_file_get_string(entry, kGroup, "TryExec", nullptr)) {
    program = tryExec;
    g_free(tryExec);
    if (!program.empty()) return program;
  }
  gchar* exec = g_key_file_get_string(entry, kGroup, G_KEY_FILE_DESKTOP_KEY_EXEC, nullptr);
  if (!exec) return {};
  gint argc = 0;
  gchar** argv = nullptr;
  if (g_shell_parse_argv(exec, &argc, &argv, nullptr) && argc > 0) program = argv[0];
  g_strfreev(argv);
  g_free(exec);
  return program;
}

}  // namespace kivi::detail
