// KivNSURLProtocol: the interface of a file URL's bookmark operations and its
// path, so that code which keeps references to files (and writes them out)
// can be handed a scripted URL in tests. kivi::URL implements it; the
// scriptable double is MockKivNSURL.
//
//   void remember(const kivi::KivNSURLProtocol& url, const kivi::URLPtr& store) {
//     kivi::ErrorPtr error;
//     auto data = url.bookmarkDataWithOptions(0, std::nullopt, nullptr, &error);
//     if (!data || !url.writeBookmarkData(*data, store, 0, &error)) report(error);
//   }
//
// writeBookmarkData() belongs to the type rather than to one URL: any URL
// object answers it, and URL::classObject() hands out an object to call it
// on when no URL is at hand.
//
// The file error codes and keys below are the platform's (NSCocoaErrorDomain
// and NSPOSIXErrorDomain); the file-handling layers above use them too.
//
// Thread contract: that of the implementation; kivi::URL is immutable and may
// be called from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// User-info key: the path of the file an error is about.
inline constexpr const char* FilePathErrorKey = "NSFilePath";
// User-info key: the URL of the file an error is about.
inline constexpr const char* URLErrorKey = "NSURL";

// NSCocoaErrorDomain codes of file operations.
inline constexpr std::int64_t FileNoSuchFileError = 4;
inline constexpr std::int64_t FileReadUnknownError = 256;
inline constexpr std::int64_t FileReadNoPermissionError = 257;
inline constexpr std::int64_t FileReadInvalidFileNameError = 258;
inline constexpr std::int64_t FileReadCorruptFileError = 259;
inline constexpr std::int64_t FileReadNoSuchFileError = 260;
inline constexpr std::int64_t FileWriteUnknownError = 512;
inline constexpr std::int64_t FileWriteNoPermissionError = 513;
inline constexpr std::int64_t FileWriteInvalidFileNameError = 514;
inline constexpr std::int64_t FileWriteOutOfSpaceError = 640;
inline constexpr std::int64_t FileWriteVolumeReadOnlyError = 642;

// Bookmark creation options (bookmarkDataWithOptions), the platform's bits.
// They are accepted and ignored here: every bookmark has the same form.
inline constexpr std::uint64_t URLBookmarkCreationMinimalBookmark = 1ULL << 9;
inline constexpr std::uint64_t URLBookmarkCreationSuitableForBookmarkFile = 1ULL << 10;
inline constexpr std::uint64_t URLBookmarkCreationWithSecurityScope = 1ULL << 11;
// Bookmark resolution options (URL::URLByResolvingBookmarkData).
inline constexpr std::uint64_t URLBookmarkResolutionWithoutUI = 1ULL << 8;
inline constexpr std::uint64_t URLBookmarkResolutionWithoutMounting = 1ULL << 9;

class KIVI_EXPORT KivNSURLProtocol {
 public:
  virtual ~KivNSURLProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // A bookmark of the file this URL names: data, or nullopt with `*error`
  // set. `keys` (resource keys to keep in the bookmark) may be absent;
  // `relativeTo` may be null.
  virtual std::optional<Data> bookmarkDataWithOptions(
      std::uint64_t options, const std::optional<std::vector<std::string>>& keys,
      const URLPtr& relativeTo, ErrorPtr* error) const = 0;
  // The URL's path (percent-decoded); nullopt when it has none that reads
  // as UTF-8.
  virtual std::optional<std::string> path() const = 0;
  // Type-level: writes `data` (a bookmark) to the file `url` names; false
  // with `*error` set on failure.
  virtual bool writeBookmarkData(const Data& data, const URLPtr& url, std::int64_t options,
                                 ErrorPtr* error) const = 0;
};

}  // namespace kivi
