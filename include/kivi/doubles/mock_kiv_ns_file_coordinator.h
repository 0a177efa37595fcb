// MockKivNSFileCoordinator: a scriptable KivNSFileCoordinatorProtocol.
//
// Each operation hands its arguments, the error out-parameter and the
// accessor included, to its callback, which decides whether the accessor
// runs and what the error receives. Without a callback the accessor is not
// called and the error is left as it was.
//
//   auto coordinator = std::make_shared<kivi::MockKivNSFileCoordinator>();
//   coordinator->coordinateWritingItemAtURLBlock =
//       [](const kivi::URLPtr& url, std::uint64_t, kivi::ErrorPtr*,
//          std::function<void(const kivi::URLPtr&)> accessor) { accessor(url); };
//   store.setCoordinator(coordinator);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_file_coordinator_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSFileCoordinator : public Object, public KivNSFileCoordinatorProtocol {
 public:
  MockKivNSFileCoordinator() = default;

  // Called by coordinateReadingItemAtURL(url, options, error, accessor); without it the accessor
  // never runs.
  std::function<void(const URLPtr&, NSFileCoordinatorReadingOptions, ErrorPtr*,
                     std::function<void(const URLPtr&)>)>
      coordinateReadingItemAtURLImplementationBlock;
  // Called by coordinateWritingItemAtURL(url, options, error, accessor); without it the accessor
  // never runs.
  std::function<void(const URLPtr&, NSFileCoordinatorWritingOptions, ErrorPtr*,
                     std::function<void(const URLPtr&)>)>
      coordinateWritingItemAtURLBlock;
  // Called by coordinateReadingItemAtURL(readingURL, readingOptions, writingURL, writingOptions,
  // error, accessor); without it the accessor never runs.
  std::function<void(const URLPtr&, NSFileCoordinatorReadingOptions, const URLPtr&,
                     NSFileCoordinatorWritingOptions, ErrorPtr*,
                     std::function<void(const URLPtr&, const URLPtr&)>)>
      coordinateReadWriteItemAtURLBlock;
  // Called by coordinateWritingItemAtURL(url1, options1, url2, options2, error, accessor); without
  // it the accessor never runs.
  std::function<void(const URLPtr&, NSFileCoordinatorWritingOptions, const URLPtr&,
                     NSFileCoordinatorWritingOptions, ErrorPtr*,
                     std::function<void(const URLPtr&, const URLPtr&)>)>
      coordinateWriteItemsAtMultipleURLsBlock;
  // Called by coordinateAccessWithIntents(intents, queue, accessor); without it the accessor never
  // runs.
  std::function<void(const std::vector<NSFileAccessIntent>&, const std::shared_ptr<OperationQueue>&,
                     std::function<void(const ErrorPtr&)>)>
      coordinateAsynchronousFileOperationsBlock;

  std::string description() const override { return Object::description(); }

  void coordinateReadingItemAtURL(const URLPtr& url, NSFileCoordinatorReadingOptions options,
                                  ErrorPtr* error,
                                  std::function<void(const URLPtr&)> accessor) override {
    if (coordinateReadingItemAtURLImplementationBlock) {
      coordinateReadingItemAtURLImplementationBlock(url, options, error, std::move(accessor));
    }
  }
  void coordinateWritingItemAtURL(const URLPtr& url, NSFileCoordinatorWritingOptions options,
                                  ErrorPtr* error,
                                  std::function<void(const URLPtr&)> accessor) override {
    if (coordinateWritingItemAtURLBlock) {
      coordinateWritingItemAtURLBlock(url, options, error, std::move(accessor));
    }
  }
  void coordinateReadingItemAtURL(
      const URLPtr& readingURL, NSFileCoordinatorReadingOptions readingOptions,
      const URLPtr& writingURL, NSFileCoordinatorWritingOptions writingOptions, ErrorPtr* error,
      std::function<void(const URLPtr&, const URLPtr&)> accessor) override {
    if (coordinateReadWriteItemAtURLBlock) {
      coordinateReadWriteItemAtURLBlock(readingURL, readingOptions, writingURL, writingOptions,
                                        error, std::move(accessor));
    }
  }
  void coordinateWritingItemAtURL(
      const URLPtr& url1, NSFileCoordinatorWritingOptions options1, const URLPtr& url2,
      NSFileCoordinatorWritingOptions options2, ErrorPtr* error,
      std::function<void(const URLPtr&, const URLPtr&)> accessor) override {
    if (coordinateWriteItemsAtMultipleURLsBlock) {
      coordinateWriteItemsAtMultipleURLsBlock(url1, options1, url2, options2, error,
                                              std::move(accessor));
    }
  }
  void coordinateAccessWithIntents(const std::vector<NSFileAccessIntent>& intents,
                                   const std::shared_ptr<OperationQueue>& queue,
                                   std::function<void(const ErrorPtr&)> accessor) override {
    if (coordinateAsynchronousFileOperationsBlock) {
      coordinateAsynchronousFileOperationsBlock(intents, queue, std::move(accessor));
    }
  }
};

}  // namespace kivi
