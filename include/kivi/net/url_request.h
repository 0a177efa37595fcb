// URLRequest and MutableURLRequest: an HTTP request to be sent by a
// URLSession: URL, method, header fields, body and time-out.
//
// Header field names are matched without regard to ASCII case: setting
// "content-type" replaces a "Content-Type" set earlier (the first spelling is
// kept). setAllHTTPHeaderFields() is the exception: it takes the dictionary as
// it is, so "Accept" and "accept" given together are two fields, both sent.
//
//   kivi::MutableURLRequest request(url);
//   request.setHTTPMethod("POST");
//   request.setValue("application/json", "Content-Type");
//   request.setHTTPBody(body);
//   kivi::URLRequest frozen = request;   // an immutable copy
//
// A URLSession refuses to send a request whose header names or values hold a
// CR, LF or NUL character (the task fails with an error; nothing is sent).
//
// Thread contract: value types; not synchronised.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/net/url.h"

namespace kivi {

// Header fields as a plain dictionary (exact-key lookup).
using StringDictionary = std::map<std::string, std::string, std::less<>>;

// A request's time-out unless set: seconds with no byte moving before the task fails.
inline constexpr double URLRequestDefaultTimeoutInterval = 60.0;

// Compares two header field names ignoring ASCII case.
KIVI_EXPORT bool headerFieldNamesEqual(std::string_view a, std::string_view b) noexcept;

class KIVI_EXPORT URLRequest {
 public:
  // A GET request for `url` (none by default) with no header fields and no body;
  // `timeoutInterval` in seconds (0 or less: the session's timeoutIntervalForRequest).
  URLRequest() = default;
  explicit URLRequest(URLPtr url, double timeoutInterval = URLRequestDefaultTimeoutInterval)
      : url_(std::move(url)), timeoutInterval_(timeoutInterval) {}

  // The URL to send to; null when none was given.
  const URLPtr& URL() const noexcept { return url_; }
  // "GET" unless set.
  const std::string& HTTPMethod() const noexcept { return method_; }
  // Seconds with no byte moving before the task fails with URLErrorTimedOut.
  double timeoutInterval() const noexcept { return timeoutInterval_; }
  // The body to send; none for a request without one.
  const std::optional<Data>& HTTPBody() const noexcept { return body_; }

  // The value of the field named `field` in any case; none when absent.
  std::optional<std::string> valueForHTTPHeaderField(std::string_view field) const;
  // Every field, under its first spelling.
  StringDictionary allHTTPHeaderFields() const;
  // The fields in the order they were first set, with their first spelling.
  const std::vector<std::pair<std::string, std::string>>& headerFields() const noexcept {
    return fields_;
  }

  friend KIVI_EXPORT bool operator==(const URLRequest&, const URLRequest&) noexcept;

 protected:
  // What the accessors above answer; MutableURLRequest's setters change them.
  URLPtr url_;
  std::string method_ = "GET";
  double timeoutInterval_ = URLRequestDefaultTimeoutInterval;
  std::optional<Data> body_;
  std::vector<std::pair<std::string, std::string>> fields_;
};

// A URLRequest whose URL, method, time-out, body and header fields can be changed.
class KIVI_EXPORT MutableURLRequest : public URLRequest {
 public:
  // Made as a URLRequest is, or as a copy of one.
  using URLRequest::URLRequest;
  MutableURLRequest(const URLRequest& request) : URLRequest(request) {}

  // Null leaves the request without a URL: a session fails it with URLErrorBadURL.
  void setURL(URLPtr url) { url_ = std::move(url); }
  // An empty method means "GET".
  void setHTTPMethod(std::string method);
  // In seconds; 0 or less: the session's timeoutIntervalForRequest.
  void setTimeoutInterval(double seconds) { timeoutInterval_ = seconds; }
  // None sends no body.
  void setHTTPBody(std::optional<Data> body) { body_ = std::move(body); }

  // Sets the field, replacing its value; none removes it.
  void setValue(std::optional<std::string> value, std::string_view field);
  // Appends to the field's value, comma-separated, or sets it.
  void addValue(std::string_view value, std::string_view field);
  // Replaces every field with the entries of `fields`, each its own field
  // (keys that differ only in case included); none removes them all.
  void setAllHTTPHeaderFields(const std::optional<StringDictionary>& fields);
};

}  // namespace kivi
