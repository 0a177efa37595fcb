// HTTPURLResponse: the head of an HTTP answer: the URL it answers, the
// status code and the header fields.
//
// Thread contract: immutable; share freely between threads.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/net/url.h"
#include "kivi/net/url_request.h"

namespace kivi {

class HTTPURLResponse;
// A response, shared and immutable.
using HTTPURLResponsePtr = std::shared_ptr<const HTTPURLResponse>;

class KIVI_EXPORT HTTPURLResponse : public Object {
 public:
  // `HTTPVersion` as sent on the status line ("HTTP/1.1", "HTTP/2"); header
  // fields whose names differ only in case are joined with ", ".
  HTTPURLResponse(URLPtr url, std::int64_t statusCode, std::string HTTPVersion,
                  const StringDictionary& headerFields);
  static HTTPURLResponsePtr create(URLPtr url, std::int64_t statusCode, std::string HTTPVersion,
                                   const StringDictionary& headerFields);

  // The URL answered (the last one when redirects were followed).
  const URLPtr& URL() const noexcept { return url_; }
  // The status code (200, 404).
  std::int64_t statusCode() const noexcept { return statusCode_; }
  // The version on the status line ("HTTP/1.1", "HTTP/2").
  const std::string& HTTPVersion() const noexcept { return version_; }
  // Every field, under the spelling the server used first.
  const StringDictionary& allHeaderFields() const noexcept { return fields_; }
  // Case-insensitive lookup.
  std::optional<std::string> valueForHTTPHeaderField(std::string_view field) const;
  // From "Content-Type": the media type in lower case ("application/json"),
  // and the charset parameter; none when absent.
  std::optional<std::string> MIMEType() const;
  std::optional<std::string> textEncodingName() const;
  // "Content-Length", or -1.
  std::int64_t expectedContentLength() const;

  // The platform's reason phrase for a status code ("not found"), or
  // "server error" / "client error" / … for codes it does not name.
  static std::string localizedStringForStatusCode(std::int64_t statusCode);

  std::string className() const override { return "NSHTTPURLResponse"; }
  std::string description() const override;

 private:
  URLPtr url_;
  std::int64_t statusCode_;
  std::string version_;
  StringDictionary fields_;
};

}  // namespace kivi
