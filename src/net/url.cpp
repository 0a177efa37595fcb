#include "kivi/net/url.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <deque>
#include <random>
#include <utility>

#include "kivi/net/url_components.h"
#include "kivi/text/json_serialization.h"

namespace kivi {

namespace {

bool isHexDigit(char c) noexcept {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'F') || (c >= 'a' && c <= 'f');
}

// Bytes that no part of a URL may hold literally.
bool neverAllowed(unsigned char c) noexcept {
  if (c <= 0x20 || c >= 0x7F) return true;
  switch (c) {
    case '"':
    case '<':
    case '>':
    case '\\':
    case '^':
    case '`':
    case '{':
    case '|':
    case '}':
      return true;
    default:
      return false;
  }
}

// Percent-encodes the bytes of `text` that could never be valid in a URL,
// leaving its structure ("/", "?", the first "#", ...) alone. A "#" after the
// first belongs to the fragment's text, so it is encoded too.
std::string encodeInvalidCharacters(std::string_view text) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string out;
  out.reserve(text.size());
  bool inFragment = false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const auto c = static_cast<unsigned char>(text[i]);
    const bool strayPercent =
        c == '%' && !(i + 2 < text.size() && isHexDigit(text[i + 1]) && isHexDigit(text[i + 2]));
    const bool secondHash = c == '#' && std::exchange(inFragment, true);
    if (strayPercent || secondHash || neverAllowed(c)) {
      out += '%';
      out += kHex[c >> 4];
      out += kHex[c & 15];
    } else {
      out += static_cast<char>(c);
    }
  }
  return out;
}

// A component decoded; none when there is none or its bytes are not UTF-8.
std::optional<std::string> decoded(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return percent_encoding::decode(*text);
}

// The components of a URL's text, which always parses: the constructor is
// only given text that did.
URLComponents parts(const std::string& text) {
  if (auto components = URLComponents::fromString(text)) return std::move(*components);
  return URLComponents();
}

}  // namespace

URL::URL(std::string string) : string_(std::move(string)) {}

URLPtr URL::URLWithString(std::string_view string, bool encodingInvalidCharacters) {
  if (string.empty()) return nullptr;
  std::string text =
      encodingInvalidCharacters ? encodeInvalidCharacters(string) : std::string(string);
  if (!URLComponents::fromString(text)) return nullptr;
  return URLPtr(new URL(std::move(text)));
}

std::optional<std::string> URL::scheme() const { return parts(string_).scheme(); }

std::optional<std::string> URL::user() const {
  return decoded(parts(string_).percentEncodedUser());
}

std::optional<std::string> URL::password() const {
  return decoded(parts(string_).percentEncodedPassword());
}

std::optional<std::string> URL::host() const {
  auto host = parts(string_).percentEncodedHost();
  if (host && host->size() >= 2 && host->front() == '[') return host->substr(1, host->size() - 2);
  return decoded(host);
}

std::optional<std::int64_t> URL::port() const { return parts(string_).port(); }

std::optional<std::string> URL::path() const {
  return percent_encoding::decode(parts(string_).percentEncodedPath());
}

std::optional<std::string> URL::query() const { return parts(string_).percentEncodedQuery(); }

std::optional<std::string> URL::fragment() const { return parts(string_).percentEncodedFragment(); }

}  // namespace kivi

namespace kivi {

// File URLs and bookmarks.

namespace {

// Bytes a file URL's path keeps literally.
bool pathByteAllowed(unsigned char c) noexcept {
  if ((c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9')) return true;
  return std::strchr("-._~/!$&'()*+,;=:@", c) != nullptr && c != '\0';
}

std::string currentDirectory() {
  std::string buffer(PATH_MAX, '\0');
  if (!::getcwd(buffer.data(), buffer.size())) return "/";
  buffer.resize(std::strlen(buffer.c_str()));
  return buffer;
}

ErrorPtr cocoaFileError(std::int64_t code, const std::string& path, int posixError = 0) {
  Dictionary info;
  if (!path.empty()) info[FilePathErrorKey] = Value(path);
  if (posixError != 0) {
    info[UnderlyingErrorKey] = Value(std::const_pointer_cast<Error>(
        Error::create(POSIXErrorDomain, posixError,
                      {{LocalizedDescriptionKey, Value(std::strerror(posixError))}})));
  }
  return Error::create(CocoaErrorDomain, code, std::move(info));
}

void setError(ErrorPtr* out, ErrorPtr error) {
  if (out) *out = std::move(error);
}

constexpr char kBookmarkMagic[8] = {'K', 'I', 'V', 'I', 'B', 'M', 'K', '1'};
constexpr std::size_t kBookmarkHeader = 8 + 8 + 8 + 8 + 4;

// What identifies a file: its device and inode, and its birth time (in
// nanoseconds; 0 where the file system keeps none), which tells a reused
// inode number from the file that had it.
struct FileIdentity {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t birth = 0;
  bool isDirectory = false;

  bool sameFile(const FileIdentity& other) const {
    return device == other.device && inode == other.inode &&
           (birth == 0 || other.birth == 0 || birth == other.birth);
  }
};

// The identity of what is at `path` (of the link itself with
// !followLinks); none with errno set when nothing is there.
std::optional<FileIdentity> identityOf(const std::string& path, bool followLinks) {
  struct statx info {};
  if (::statx(AT_FDCWD, path.c_str(), followLinks ? 0 : AT_SYMLINK_NOFOLLOW,
              STATX_TYPE | STATX_INO | STATX_BTIME, &info) != 0)
    return std::nullopt;
  FileIdentity identity;
  identity.device = makedev(info.stx_dev_major, info.stx_dev_minor);
  identity.inode = info.stx_ino;
  if (info.stx_mask & STATX_BTIME)
    identity.birth =
        static_cast<std::uint64_t>(info.stx_btime.tv_sec) * 1000000000u + info.stx_btime.tv_nsec;
  identity.isDirectory = S_ISDIR(info.stx_mode);
  return identity;
}

struct Bookmark {
  FileIdentity file;
  std::string path;
};

void putLittleEndian(Data& out, std::uint64_t value, int bytes) {
  for (int i = 0; i < bytes; ++i) out.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
}

std::uint64_t getLittleEndian(const Data& in, std::size_t at, int bytes) {
  std::uint64_t value = 0;
  for (int i = 0; i < bytes; ++i) value |= std::uint64_t{in[at + i]} << (8 * i);
  return value;
}

Data encodeBookmark(const Bookmark& bookmark) {
  Data out(kBookmarkMagic, kBookmarkMagic + 8);
  putLittleEndian(out, bookmark.file.device, 8);
  putLittleEndian(out, bookmark.file.inode, 8);
  putLittleEndian(out, bookmark.file.birth, 8);
  putLittleEndian(out, bookmark.path.size(), 4);
  out.insert(out.end(), bookmark.path.begin(), bookmark.path.end());
  return out;
}

std::optional<Bookmark> decodeBookmark(const Data& data) {
  if (data.size() < kBookmarkHeader ||
      !std::equal(kBookmarkMagic, kBookmarkMagic + 8, data.begin()))
    return std::nullopt;
  Bookmark bookmark;
  bookmark.file.device = getLittleEndian(data, 8, 8);
  bookmark.file.inode = getLittleEndian(data, 16, 8);
  bookmark.file.birth = getLittleEndian(data, 24, 8);
  const std::uint64_t length = getLittleEndian(data, 32, 4);
  if (length == 0 || length != data.size() - kBookmarkHeader) return std::nullopt;
  bookmark.path.assign(data.begin() + kBookmarkHeader, data.end());
  if (bookmark.path.front() != '/' || bookmark.path.find('\0') != std::string::npos)
    return std::nullopt;
  return bookmark;
}

std::string parentOf(const std::string& path) {
  auto slash = path.find_last_of('/');
  if (slash == std::string::npos || slash == 0) return "/";
  return path.substr(0, slash);
}

// Breadth first under `top`, on `device` only, never through symbolic links.
std::optional<std::string> findInode(const std::string& top, const Bookmark& bookmark) {
  constexpr int kMaxDepth = 5;
  constexpr std::size_t kMaxEntries = 20000;
  std::size_t seen = 0;
  std::deque<std::pair<std::string, int>> pending{{top, 0}};
  while (!pending.empty() && seen < kMaxEntries) {
    auto [directory, depth] = std::move(pending.front());
    pending.pop_front();
    int fd = ::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0) continue;
    DIR* dir = ::fdopendir(fd);
    if (!dir) {
      ::close(fd);
      continue;
    }
    while (dirent* entry = ::readdir(dir)) {
      if (++seen > kMaxEntries) break;
      std::string_view name = entry->d_name;
      if (name == "." || name == "..") continue;
      std::string child =
          directory == "/" ? "/" + std::string(name) : directory + "/" + std::string(name);
      auto identity = identityOf(child, false);
      if (!identity || identity->device != bookmark.file.device) continue;
      if (identity->sameFile(bookmark.file)) {
        ::closedir(dir);
        return child;
      }
      if (identity->isDirectory && depth + 1 < kMaxDepth) pending.emplace_back(child, depth + 1);
    }
    ::closedir(dir);
  }
  return std::nullopt;
}

}  // namespace

URLPtr URL::fileURLWithPath(std::string_view path) {
  if (path.empty() || path.find('\0') != std::string_view::npos) return nullptr;
  std::string absolute(path);
  if (absolute.front() != '/') {
    std::string cwd = currentDirectory();
    absolute = (cwd == "/" ? "" : cwd) + "/" + absolute;
  }
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string text = "file://";
  for (unsigned char c : absolute) {
    if (pathByteAllowed(c)) {
      text += static_cast<char>(c);
    } else {
      text += '%';
      text += kHex[c >> 4];
      text += kHex[c & 15];
    }
  }
  if (!URLComponents::fromString(text)) return nullptr;
  return URLPtr(new URL(std::move(text)));
}

bool URL::isFileURL() const {
  auto scheme = this->scheme();
  if (!scheme || scheme->size() != 4) return false;
  std::string lower = *scheme;
  for (char& c : lower) c = static_cast<char>(c | 0x20);
  return lower == "file";
}

std::optional<std::string> URL::fileSystemRepresentation() const {
  if (!isFileURL()) return std::nullopt;
  auto bytes = percent_encoding::decodeBytes(parts(string_).percentEncodedPath());
  if (!bytes || bytes->empty() || bytes->find('\0') != std::string::npos) return std::nullopt;
  return bytes;
}

std::optional<Data> URL::bookmarkDataWithOptions(std::uint64_t,
                                                 const std::optional<std::vector<std::string>>&,
                                                 const URLPtr&, ErrorPtr* error) const {
  auto path = fileSystemRepresentation();
  if (!path) {
    setError(error, cocoaFileError(FileReadNoSuchFileError, path ? *path : std::string()));
    return std::nullopt;
  }
  if (path->front() != '/') *path = currentDirectory() + "/" + *path;
  auto identity = identityOf(*path, true);
  if (!identity) {
    const int code = errno;
    setError(error,
             cocoaFileError(code == EACCES ? FileReadNoPermissionError : FileReadNoSuchFileError,
                            *path, code));
    return std::nullopt;
  }
  setError(error, nullptr);
  return encodeBookmark(Bookmark{*identity, *path});
}

bool URL::writeBookmarkData(const Data& data, const URLPtr& url, std::int64_t options,
                            ErrorPtr* error) const {
  return writeBookmarkDataToURL(data, url, options, error);
}

bool URL::writeBookmarkDataToURL(const Data& data, const URLPtr& url, std::int64_t,
                                 ErrorPtr* error) {
  auto path = url ? url->fileSystemRepresentation() : std::nullopt;
  if (!path) {
    setError(error, cocoaFileError(FileWriteInvalidFileNameError, {}));
    return false;
  }
  if (!decodeBookmark(data)) {
    setError(error, cocoaFileError(FileWriteUnknownError, *path));
    return false;
  }
  auto fail = [&](int code) {
    std::int64_t cocoa = 0;
    switch (code) {
      case ENOENT:
      case ENOTDIR:
        cocoa = FileNoSuchFileError;
        break;
      case EACCES:
      case EPERM:
        cocoa = FileWriteNoPermissionError;
        break;
      case ENOSPC:
      case EDQUOT:
        cocoa = FileWriteOutOfSpaceError;
        break;
      case EROFS:
        cocoa = FileWriteVolumeReadOnlyError;
        break;
      default:
        break;
    }
    setError(error,
             cocoa ? cocoaFileError(cocoa, *path, code)
                   : Error::create(POSIXErrorDomain, code, {{FilePathErrorKey, Value(*path)}}));
    return false;
  };
  std::random_device random;
  std::string temporary;
  int fd = -1;
  for (int attempt = 0; attempt < 16 && fd < 0; ++attempt) {
    temporary = parentOf(*path) + "/.bookmark-" + std::to_string(random()) + ".tmp";
    fd = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
    if (fd < 0 && errno != EEXIST) return fail(errno);
  }
  if (fd < 0) return fail(EEXIST);
  std::size_t written = 0;
  while (written < data.size()) {
    ssize_t n = ::write(fd, data.data() + written, data.size() - written);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      const int code = n < 0 ? errno : EIO;
      ::close(fd);
      ::unlink(temporary.c_str());
      return fail(code);
    }
    written += static_cast<std::size_t>(n);
  }
  if (::close(fd) != 0 || ::rename(temporary.c_str(), path->c_str()) != 0) {
    const int code = errno;
    ::unlink(temporary.c_str());
    return fail(code);
  }
  setError(error, nullptr);
  return true;
}

std::optional<Data> URL::bookmarkDataWithContentsOfURL(const URLPtr& url, ErrorPtr* error) {
  auto path = url ? url->fileSystemRepresentation() : std::nullopt;
  if (!path) {
    setError(error, cocoaFileError(FileReadNoSuchFileError, {}));
    return std::nullopt;
  }
  int fd = ::open(path->c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) {
    const int code = errno;
    setError(error, cocoaFileError(code == EACCES   ? FileReadNoPermissionError
                                   : code == ENOENT ? FileReadNoSuchFileError
                                                    : FileReadUnknownError,
                                   *path, code));
    return std::nullopt;
  }
  Data data;
  std::uint8_t buffer[4096];
  for (;;) {
    ssize_t n = ::read(fd, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0 || data.size() > (1u << 20)) break;
    data.insert(data.end(), buffer, buffer + n);
  }
  ::close(fd);
  if (!decodeBookmark(data)) {
    setError(error, cocoaFileError(FileReadCorruptFileError, *path));
    return std::nullopt;
  }
  setError(error, nullptr);
  return data;
}

URLPtr URL::URLByResolvingBookmarkData(const Data& data, std::uint64_t, const URLPtr&,
                                       bool* isStale, ErrorPtr* error) {
  auto bookmark = decodeBookmark(data);
  if (!bookmark) {
    setError(error, cocoaFileError(FileReadCorruptFileError, {}));
    return nullptr;
  }
  auto answer = [&](const std::string& path, bool stale) {
    if (isStale) *isStale = stale;
    setError(error, nullptr);
    return fileURLWithPath(path);
  };
  auto atPath = identityOf(bookmark->path, true);
  const bool present = atPath.has_value();
  if (present && atPath->sameFile(bookmark->file)) return answer(bookmark->path, false);
  // The nearest directory of the recorded path that still exists, then its
  // parent: the file most often moved next to where it was.
  std::string directory = parentOf(bookmark->path);
  while (directory != "/" && !identityOf(directory, true)) directory = parentOf(directory);
  const std::string top = parentOf(directory) == "/" ? directory : parentOf(directory);
  if (top != "/") {
    if (auto found = findInode(top, *bookmark)) return answer(*found, true);
  }
  if (present) return answer(bookmark->path, true);
  setError(error, cocoaFileError(FileReadNoSuchFileError, bookmark->path));
  return nullptr;
}

std::shared_ptr<KivNSURLProtocol> URL::classObject() {
  return std::shared_ptr<URL>(new URL("file:///"));
}

}  // namespace kivi
