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
// Thread contract: immutable; share freely between threads.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/object.h"

namespace kivi {

class URL;
using URLPtr = std::shared_ptr<const URL>;

class URL : public Object {
 public:
  static URLPtr URLWithString(std::string_view string, bool encodingInvalidCharacters = true);

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
  std::optional<std::string> path() const;
  std::optional<std::string> query() const;
  std::optional<std::string> fragment() const;

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
