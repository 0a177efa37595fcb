// URL: an immutable, parsed URL reference (RFC 3986).
//
//   auto url = kivi::URL::URLWithString("https://api.example.com/v1/items?a=1");
//   url->host();   // "api.example.com"
//
// URLWithString() percent-encodes, as UTF-8, characters that may not appear
// in a URL (space, non-ASCII, controls, "\"<>\\^`{|}", and "%" not followed
// by two hex digits) before parsing; with encodingInvalidCharacters false it
// refuses such text instead. Either way, text that is not a URL reference
// gives null.
//
// A file URL is made from a path with fileURLWithPath(); its bytes, whatever
// they are, come back from fileSystemRepresentation(). A bookmark
// (bookmarkDataWithOptions, KivNSURLProtocol) records a file so that it can
// be found again after it moved:
//
//   auto file = kivi::URL::fileURLWithPath("/home/ana/notes.txt");
//   kivi::ErrorPtr error;
//   auto bookmark = file->bookmarkDataWithOptions(0, std::nullopt, nullptr, &error);
//   // ... the file is renamed to /home/ana/old/notes.txt ...
//   bool stale = false;
//   auto found = kivi::URL::URLByResolvingBookmarkData(*bookmark, 0, nullptr, &stale, &error);
//   // found->path() == "/home/ana/old/notes.txt", stale == true
//
// A bookmark here is a small self-describing record (little-endian):
//   "KIVIBMK1"           8 bytes, the magic and format version
//   device               8 bytes, st_dev of the file when it was made
//   inode                8 bytes, st_ino
//   birth time           8 bytes, nanoseconds since 1970 (statx btime; 0
//                        where the file system keeps none)
//   path length          4 bytes
//   path                 the absolute path's bytes (any bytes but NUL)
// A file is the bookmarked one when its device, inode and (where both are
// known) birth time match: the birth time tells a new file that reuses the
// inode number from the original. Resolving tries the recorded path first.
// Otherwise it looks for the file, on the same device and without following
// symbolic links, breadth first under the parent of the directory the file
// was in (of the nearest such directory still there; never under "/"
// itself), at most five levels down and 20,000 entries; found there, the URL
// is the new place and the bookmark is stale. When the file is not found but
// another is at the recorded path (it was replaced), that one is the answer,
// also stale. Nothing found: NSCocoaErrorDomain FileReadNoSuchFileError.
// Bookmark options and resource keys are accepted and ignored.
//
// Thread contract: immutable; share freely between threads.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/net/kiv_ns_url_protocol.h"

namespace kivi {

class URL;
using URLPtr = std::shared_ptr<const URL>;

class KIVI_EXPORT URL : public Object, public KivNSURLProtocol {
 public:
  // Parses `string` as a URL reference, first percent-encoding the characters a URL cannot
  // hold unless encodingInvalidCharacters is false (see above); null when it is not one.
  static URLPtr URLWithString(std::string_view string, bool encodingInvalidCharacters = true);
  // "file://" plus `path` percent-encoded (every byte but unreserved
  // characters and "/" and a few sub-delimiters). A relative path is made
  // absolute against the working directory; an empty path or one holding a
  // NUL byte gives null.
  static URLPtr fileURLWithPath(std::string_view path);

  // The whole URL as text (after any encoding URLWithString did).
  const std::string& absoluteString() const noexcept { return string_; }

  // Components. Each is absent when the URL has none; user(), password(),
  // host() and path() are percent-decoded ("%c3%a9" and "%C3%A9" both give
  // "é"), and absent when the decoded bytes are not UTF-8 ("%E9" alone); an
  // IP-literal host comes without its brackets ("::1" for "[::1]"). path()
  // is "" for a URL without one. query() and fragment() are as written
  // (encoded).
  std::optional<std::string> scheme() const;
  std::optional<std::string> user() const;
  std::optional<std::string> password() const;
  std::optional<std::string> host() const;
  std::optional<std::int64_t> port() const;
  std::optional<std::string> path() const override;
  std::optional<std::string> query() const;
  std::optional<std::string> fragment() const;

  // Whether this is a "file" URL.
  bool isFileURL() const;
  // A file URL's path as the file system takes it: percent-decoded, any
  // bytes (also those that are not UTF-8). Nullopt for a URL that is not a
  // file URL or whose decoded path holds a NUL byte.
  std::optional<std::string> fileSystemRepresentation() const;

  // Bookmarks (see above). `relativeTo` is ignored; the URL must be a file
  // URL naming an existing file: otherwise nullopt with NSCocoaErrorDomain
  // FileReadNoSuchFileError (260) and the path under FilePathErrorKey.
  std::optional<Data> bookmarkDataWithOptions(std::uint64_t options,
                                              const std::optional<std::vector<std::string>>& keys,
                                              const URLPtr& relativeTo,
                                              ErrorPtr* error) const override;
  // Type-level. Writes `data` to the file that the file URL `url` names,
  // replacing it atomically (a temporary file in the same directory, then a
  // rename). False with NSCocoaErrorDomain FileWriteUnknownError (512) for
  // data that is not a bookmark, FileWriteInvalidFileNameError (514) for a
  // null or non-file URL, FileNoSuchFileError (4) when the directory is
  // missing, FileWriteNoPermissionError (513) when it is not writable, and
  // the errno in NSPOSIXErrorDomain otherwise. Options are ignored.
  bool writeBookmarkData(const Data& data, const URLPtr& url, std::int64_t options,
                         ErrorPtr* error) const override;
  // The same, as a static call.
  static bool writeBookmarkDataToURL(const Data& data, const URLPtr& url, std::int64_t options,
                                     ErrorPtr* error);
  // The file a bookmark records, found as described above; `*isStale`
  // (when non-null) tells whether it was found somewhere else than recorded
  // or replaced. Null with `*error` set when nothing is found
  // (FileReadNoSuchFileError) or `data` is not a bookmark
  // (FileReadCorruptFileError, 259). `relativeTo` is ignored.
  static URLPtr URLByResolvingBookmarkData(const Data& data, std::uint64_t options,
                                           const URLPtr& relativeTo, bool* isStale,
                                           ErrorPtr* error);
  // Reads a bookmark written by writeBookmarkData(); nullopt with `*error`
  // set (the file's read errors, FileReadCorruptFileError for a file that
  // holds no bookmark).
  static std::optional<Data> bookmarkDataWithContentsOfURL(const URLPtr& url, ErrorPtr* error);

  // An object to call the type-level operations on when no URL is at hand.
  static std::shared_ptr<KivNSURLProtocol> classObject();

  std::string className() const override { return "NSURL"; }
  std::string description() const override { return string_; }

  bool isEqual(const Object& other) const noexcept override {
    auto* url = dynamic_cast<const URL*>(&other);
    return url && url->string_ == string_;
  }
  // Same text.
  friend bool operator==(const URL& a, const URL& b) noexcept { return a.string_ == b.string_; }

 protected:
  // `string` must already be a valid URL reference.
  explicit URL(std::string string);

 private:
  friend class URLComponents;
  std::string string_;
};

}  // namespace kivi
