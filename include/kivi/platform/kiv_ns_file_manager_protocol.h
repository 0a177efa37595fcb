// KivNSFileManagerProtocol: the file-system operations the library's hosts
// use: existence checks, moving, copying, removing, listing, creating,
// well-known directories and attributes.
//
// The library implements it only by its double, MockKivNSFileManager; a
// host implements it over the file system (or over a fake one in tests).
//
//   kivi::ErrorPtr error;
//   if (!files->fileExistsAtPath(dir) &&
//       !files->createDirectoryAtPath(dir, true, {}, &error)) {
//     report(error);
//   }
//
// Failures are answered in the platform's form: false, null or empty, with
// the error out-parameter set (NSCocoaErrorDomain file codes).
//
// Thread contract: that of the implementation; file-system operations may
// be called from any thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// Well-known directories (URLsForDirectory, URLForDirectory).
using NSSearchPathDirectory = std::uint64_t;
inline constexpr NSSearchPathDirectory NSApplicationDirectory = 1;
inline constexpr NSSearchPathDirectory NSLibraryDirectory = 5;
inline constexpr NSSearchPathDirectory NSDocumentDirectory = 9;
inline constexpr NSSearchPathDirectory NSCachesDirectory = 13;
inline constexpr NSSearchPathDirectory NSApplicationSupportDirectory = 14;
inline constexpr NSSearchPathDirectory NSDownloadsDirectory = 15;
inline constexpr NSSearchPathDirectory NSItemReplacementDirectory = 99;
// Where to look for them.
using NSSearchPathDomainMask = std::uint64_t;
inline constexpr NSSearchPathDomainMask NSUserDomainMask = 1;
inline constexpr NSSearchPathDomainMask NSLocalDomainMask = 2;
inline constexpr NSSearchPathDomainMask NSNetworkDomainMask = 4;
inline constexpr NSSearchPathDomainMask NSSystemDomainMask = 8;
inline constexpr NSSearchPathDomainMask NSAllDomainsMask = 0x0ffff;
// Options of contentsOfDirectoryAtURL.
using NSDirectoryEnumerationOptions = std::uint64_t;
inline constexpr NSDirectoryEnumerationOptions NSDirectoryEnumerationSkipsSubdirectoryDescendants =
    1 << 0;
inline constexpr NSDirectoryEnumerationOptions NSDirectoryEnumerationSkipsHiddenFiles = 1 << 2;

class KIVI_EXPORT KivNSFileManagerProtocol {
 public:
  virtual ~KivNSFileManagerProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Whether a file or directory exists at `path` (symbolic links followed).
  virtual bool fileExistsAtPath(const std::string& path) = 0;
  // Also tells through `isDirectory` (when not null) whether it is a
  // directory.
  virtual bool fileExistsAtPath(const std::string& path, bool* isDirectory) = 0;
  // Moves the item to the destination, which must not exist yet.
  virtual bool moveItemAtURL(const URLPtr& srcURL, const URLPtr& dstURL, ErrorPtr* error) = 0;
  virtual bool moveItemAtPath(const std::string& srcPath, const std::string& dstPath,
                              ErrorPtr* error) = 0;
  // Copies the item, a directory with its contents, to the destination,
  // which must not exist yet.
  virtual bool copyItemAtURL(const URLPtr& srcURL, const URLPtr& dstURL, ErrorPtr* error) = 0;
  virtual bool copyItemAtPath(const std::string& srcPath, const std::string& dstPath,
                              ErrorPtr* error) = 0;
  // Removes the item, a directory with its contents.
  virtual bool removeItemAtURL(const URLPtr& url, ErrorPtr* error) = 0;
  virtual bool removeItemAtPath(const std::string& path, ErrorPtr* error) = 0;
  // The names of the directory's entries (not of their contents).
  virtual std::vector<std::string> contentsOfDirectoryAtPath(const std::string& path,
                                                             ErrorPtr* error) = 0;
  // The file's contents; empty when it cannot be read.
  virtual Data contentsAtPath(const std::string& path) = 0;
  // The URLs of the directory's entries; `keys` names the resource values to
  // fetch with them.
  virtual std::vector<URLPtr> contentsOfDirectoryAtURL(const URLPtr& url,
                                                       const std::vector<std::string>& keys,
                                                       NSDirectoryEnumerationOptions options,
                                                       ErrorPtr* error) = 0;
  // Creates the directory with `attributes`; with `createIntermediates`, its
  // missing parents too, and an existing directory is no failure.
  virtual bool createDirectoryAtURL(const URLPtr& url, bool createIntermediates,
                                    const Dictionary& attributes, ErrorPtr* error) = 0;
  virtual bool createDirectoryAtPath(const std::string& path, bool createIntermediates,
                                     const Dictionary& attributes, ErrorPtr* error) = 0;
  // Creates the file, or replaces it, with `contents` and `attributes`; false
  // on failure, which has no error out-parameter to explain it.
  virtual bool createFileAtPath(const std::string& path, const Data& contents,
                                const Dictionary& attributes) = 0;
  // The well-known `directory` in each of the `domains`.
  virtual std::vector<URLPtr> URLsForDirectory(NSSearchPathDirectory directory,
                                               NSSearchPathDomainMask domains) = 0;
  // The well-known `directory` in one `domain`, made first when `create`.
  // NSItemReplacementDirectory answers a new temporary directory on the
  // volume of `appropriateForURL`.
  virtual URLPtr URLForDirectory(NSSearchPathDirectory directory, NSSearchPathDomainMask domain,
                                 const URLPtr& appropriateForURL, bool create, ErrorPtr* error) = 0;
  // The item's attributes (type, size, dates, owner, permissions) by
  // attribute key.
  virtual Dictionary attributesOfItemAtPath(const std::string& path, ErrorPtr* error) = 0;
  // The directory the applications of the group `groupIdentifier` share;
  // null when there is none.
  virtual URLPtr containerURLForSecurityApplicationGroupIdentifier(
      const std::string& groupIdentifier) = 0;
  // The home directory of the user `userName`; null when there is no such
  // user.
  virtual URLPtr homeDirectoryForUser(const std::string& userName) = 0;
  // Makes `dstPath` a hard link to the item at `srcPath`.
  virtual bool linkItemAtPath(const std::string& srcPath, const std::string& dstPath,
                              ErrorPtr* error) = 0;
  // The item's name as the user sees it.
  virtual std::string displayNameAtPath(const std::string& path) = 0;
  // The path the symbolic link at `path` holds, unresolved; "" when it is
  // not a symbolic link or cannot be read.
  virtual std::string destinationOfSymbolicLinkAtPath(const std::string& path) = 0;
  // The user's directory for temporary files, as a directory URL.
  virtual URLPtr temporaryDirectory() const = 0;
};

}  // namespace kivi
