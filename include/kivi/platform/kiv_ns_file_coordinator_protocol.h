// KivNSFileCoordinatorProtocol: reading and writing files in coordination
// with other readers and writers of the same files: the accessor runs when
// the file may be used, with the URL to use.
//
// The library implements it only by its double, MockKivNSFileCoordinator; a
// host implements it over its own file locking.
//
//   kivi::ErrorPtr error;
//   coordinator->coordinateWritingItemAtURL(store, 0, &error, [&](const kivi::URLPtr& url) {
//     writeSnapshot(url);
//   });
//   if (error) report(error);
//
// Thread contract: that of the implementation. The synchronous forms run
// the accessor on the calling thread before they return; the asynchronous
// form runs it on the queue given.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/export.h"

namespace kivi {

// Reading options (the platform's bits).
using NSFileCoordinatorReadingOptions = std::uint64_t;
inline constexpr NSFileCoordinatorReadingOptions NSFileCoordinatorReadingWithoutChanges = 1 << 0;
inline constexpr NSFileCoordinatorReadingOptions NSFileCoordinatorReadingResolvesSymbolicLink =
    1 << 1;
// Writing options (the platform's bits).
using NSFileCoordinatorWritingOptions = std::uint64_t;
inline constexpr NSFileCoordinatorWritingOptions NSFileCoordinatorWritingForDeleting = 1 << 0;
inline constexpr NSFileCoordinatorWritingOptions NSFileCoordinatorWritingForMoving = 1 << 1;
inline constexpr NSFileCoordinatorWritingOptions NSFileCoordinatorWritingForMerging = 1 << 2;
inline constexpr NSFileCoordinatorWritingOptions NSFileCoordinatorWritingForReplacing = 1 << 3;

// One file to read or write in coordinateAccessWithIntents().
struct KIVI_EXPORT NSFileAccessIntent {
  // The file to read or write.
  URLPtr url;
  // Whether the file is written (else read).
  bool writing = false;
  // NSFileCoordinatorWritingOptions when `writing`, else ...ReadingOptions.
  std::uint64_t options = 0;

  // An intent to read `url`.
  static NSFileAccessIntent readingIntentWithURL(URLPtr url,
                                                 NSFileCoordinatorReadingOptions options) {
    return {std::move(url), false, options};
  }
  // An intent to write `url`.
  static NSFileAccessIntent writingIntentWithURL(URLPtr url,
                                                 NSFileCoordinatorWritingOptions options) {
    return {std::move(url), true, options};
  }
};

class KIVI_EXPORT KivNSFileCoordinatorProtocol {
 public:
  virtual ~KivNSFileCoordinatorProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Runs `accessor` with the URL to read `url` through, once other writers
  // let it be read; when that cannot be, sets `*error` instead.
  virtual void coordinateReadingItemAtURL(const URLPtr& url,
                                          NSFileCoordinatorReadingOptions options, ErrorPtr* error,
                                          std::function<void(const URLPtr&)> accessor) = 0;
  // Runs `accessor` with the URL to write `url` through, once other readers
  // and writers let it be written; when that cannot be, sets `*error`
  // instead.
  virtual void coordinateWritingItemAtURL(const URLPtr& url,
                                          NSFileCoordinatorWritingOptions options, ErrorPtr* error,
                                          std::function<void(const URLPtr&)> accessor) = 0;
  // Reads `readingURL` and writes `writingURL` in one coordination: `accessor`
  // receives the URL to use for each, in that order.
  virtual void coordinateReadingItemAtURL(
      const URLPtr& readingURL, NSFileCoordinatorReadingOptions readingOptions,
      const URLPtr& writingURL, NSFileCoordinatorWritingOptions writingOptions, ErrorPtr* error,
      std::function<void(const URLPtr&, const URLPtr&)> accessor) = 0;
  // Writes two files in one coordination (moving one to the other, say):
  // `accessor` receives the URL to use for each, in that order.
  virtual void coordinateWritingItemAtURL(
      const URLPtr& url1, NSFileCoordinatorWritingOptions options1, const URLPtr& url2,
      NSFileCoordinatorWritingOptions options2, ErrorPtr* error,
      std::function<void(const URLPtr&, const URLPtr&)> accessor) = 0;
  // Asynchronous: `accessor` runs on `queue` with null, or with the error
  // that kept the files from being coordinated.
  virtual void coordinateAccessWithIntents(const std::vector<NSFileAccessIntent>& intents,
                                           const std::shared_ptr<OperationQueue>& queue,
                                           std::function<void(const ErrorPtr&)> accessor) = 0;
};

}  // namespace kivi
