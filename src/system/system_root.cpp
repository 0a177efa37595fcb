#include "kivi/system/system_root.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <mutex>

namespace kivi::system {

namespace {

std::mutex gMutex;
std::shared_ptr<const std::string> gRoot;  // guarded by gMutex; null is "/"

std::shared_ptr<const std::string> currentRoot() {
  std::lock_guard lock(gMutex);
  return gRoot;
}

}  // namespace

std::string root() {
  const auto current = currentRoot();
  return current ? *current : "/";
}

void setRoot(std::string directory) {
  while (directory.size() > 1 && directory.back() == '/') directory.pop_back();
  std::shared_ptr<const std::string> next;
  if (!directory.empty() && directory != "/") {
    next = std::make_shared<const std::string>(std::move(directory));
  }
  std::lock_guard lock(gMutex);
  gRoot = std::move(next);
}

bool isRealRoot() { return currentRoot() == nullptr; }

std::string pathUnderRoot(std::string_view absolutePath) {
  const auto current = currentRoot();
  if (!current) return std::string(absolutePath);
  std::string path = *current;
  if (!absolutePath.starts_with('/')) path += '/';
  path += absolutePath;
  return path;
}

bool readFileUnderRoot(std::string_view absolutePath, std::string& contents) {
  contents.clear();
  const std::string path = pathUnderRoot(absolutePath);
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  // Files under /proc and /sys report no size: read until the end.
  char buffer[4096];
  for (;;) {
    const ssize_t got = ::read(fd, buffer, sizeof buffer);
    if (got > 0) {
      contents.append(buffer, static_cast<std::size_t>(got));
      continue;
    }
    if (got < 0 && errno == EINTR) continue;
    ::close(fd);
    if (got < 0) contents.clear();
    return got == 0;
  }
}

}  // namespace kivi::system
