// MockKivNSURL: a scriptable KivNSURLProtocol.
//
// The bookmark operations answer class-level callbacks, shared by every
// MockKivNSURL in the process: bookmarkDataBlock answers
// bookmarkDataWithOptions() (empty data without it) and
// writeBookmarkDataBlock answers writeBookmarkData() (false without it).
// Either callback decides what the error out-parameter receives; without
// them it is left as it was. path() answers the stored path (set with
// setPath(); nullopt at first).
//
//   kivi::MockKivNSURL::writeBookmarkDataBlock =
//       [&](const kivi::Data& d, const kivi::URLPtr&, std::int64_t, kivi::ErrorPtr*) {
//         saved = d;
//         return true;
//       };
//   auto url = std::make_shared<kivi::MockKivNSURL>();
//   url->setPath("/home/ana/notes.txt");
//   recents.remember(*url);
//   kivi::MockKivNSURL::writeBookmarkDataBlock = nullptr;  // class-level: reset it
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the class-level callbacks before any object is handed out and reset
// them when the test ends.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/net/kiv_ns_url_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSURL : public Object, public KivNSURLProtocol {
 public:
  MockKivNSURL() = default;

  // Class-level: answers bookmarkDataWithOptions(options, keys, relativeTo, error); without it,
  // empty data.
  static inline std::function<std::optional<Data>(
      std::uint64_t, const std::optional<std::vector<std::string>>&, const URLPtr&, ErrorPtr*)>
      bookmarkDataBlock;
  // Class-level: answers writeBookmarkData(data, url, options, error); without it, false.
  static inline std::function<bool(const Data&, const URLPtr&, std::int64_t, ErrorPtr*)>
      writeBookmarkDataBlock;

  std::string description() const override { return Object::description(); }

  std::optional<Data> bookmarkDataWithOptions(std::uint64_t options,
                                              const std::optional<std::vector<std::string>>& keys,
                                              const URLPtr& relativeTo,
                                              ErrorPtr* error) const override {
    if (bookmarkDataBlock) return bookmarkDataBlock(options, keys, relativeTo, error);
    return Data{};
  }
  std::optional<std::string> path() const override { return path_; }
  // What path() answers.
  void setPath(std::optional<std::string> path) { path_ = std::move(path); }

  bool writeBookmarkData(const Data& data, const URLPtr& url, std::int64_t options,
                         ErrorPtr* error) const override {
    return writeBookmarkDataBlock ? writeBookmarkDataBlock(data, url, options, error) : false;
  }

 private:
  std::optional<std::string> path_;
};

}  // namespace kivi
