#include "kivi/net/http_url_response.h"

#include <algorithm>
#include <charconv>

namespace kivi {

namespace {

std::string_view trim(std::string_view s) {
  while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) s.remove_prefix(1);
  while (!s.empty() && (s.back() == ' ' || s.back() == '\t')) s.remove_suffix(1);
  return s;
}

std::string lowered(std::string_view s) {
  std::string out(s);
  for (char& c : out) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return out;
}

}  // namespace

HTTPURLResponse::HTTPURLResponse(URLPtr url, std::int64_t statusCode, std::string HTTPVersion,
                                 const StringDictionary& headerFields)
    : url_(std::move(url)), statusCode_(statusCode), version_(std::move(HTTPVersion)) {
  for (const auto& field : headerFields) {
    auto it = std::find_if(fields_.begin(), fields_.end(), [&](const auto& f) {
      return headerFieldNamesEqual(f.first, field.first);
    });
    if (it == fields_.end()) {
      fields_.emplace(field);
    } else {
      it->second.append(", ").append(field.second);
    }
  }
}

HTTPURLResponsePtr HTTPURLResponse::create(URLPtr url, std::int64_t statusCode,
                                           std::string HTTPVersion,
                                           const StringDictionary& headerFields) {
  return std::make_shared<const HTTPURLResponse>(std::move(url), statusCode, std::move(HTTPVersion),
                                                 headerFields);
}

std::optional<std::string> HTTPURLResponse::valueForHTTPHeaderField(std::string_view field) const {
  auto exact = fields_.find(field);
  if (exact != fields_.end()) return exact->second;
  for (const auto& [name, value] : fields_) {
    if (headerFieldNamesEqual(name, field)) return value;
  }
  return std::nullopt;
}

std::optional<std::string> HTTPURLResponse::MIMEType() const {
  auto type = valueForHTTPHeaderField("Content-Type");
  if (!type) return std::nullopt;
  std::string_view view(*type);
  view = trim(view.substr(0, view.find(';')));
  if (view.empty()) return std::nullopt;
  return lowered(view);
}

std::optional<std::string> HTTPURLResponse::textEncodingName() const {
  auto type = valueForHTTPHeaderField("Content-Type");
  if (!type) return std::nullopt;
  std::string_view rest(*type);
  for (auto semicolon = rest.find(';'); semicolon != std::string_view::npos;
       semicolon = rest.find(';')) {
    rest.remove_prefix(semicolon + 1);
    std::string_view parameter = trim(rest.substr(0, rest.find(';')));
    const auto equals = parameter.find('=');
    if (equals == std::string_view::npos) continue;
    if (lowered(trim(parameter.substr(0, equals))) != "charset") continue;
    std::string_view value = trim(parameter.substr(equals + 1));
    if (value.size() >= 2 && value.front() == '"' && value.back() == '"') {
      value = value.substr(1, value.size() - 2);
    }
    if (!value.empty()) return lowered(value);
  }
  return std::nullopt;
}

std::int64_t HTTPURLResponse::expectedContentLength() const {
  auto length = valueForHTTPHeaderField("Content-Length");
  if (!length) return -1;
  std::string_view text = trim(*length);
  std::int64_t value = -1;
  auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (ec != std::errc() || end != text.data() + text.size() || value < 0) return -1;
  return value;
}

std::string HTTPURLResponse::localizedStringForStatusCode(std::int64_t statusCode) {
  switch (statusCode) {
    case 100:
      return "continue";
    case 101:
      return "switching protocols";
    case 200:
      return "no error";
    case 201:
      return "created";
    case 202:
      return "accepted";
    case 203:
      return "non-authoritative information";
    case 204:
      return "no content";
    case 205:
      return "reset content";
    case 206:
      return "partial content";
    case 300:
      return "multiple choices";
    case 301:
      return "moved permanently";
    case 302:
      return "found";
    case 303:
      return "see other";
    case 304:
      return "not modified";
    case 305:
      return "needs proxy";
    case 307:
      return "redirected";
    case 308:
      return "permanent redirect";
    case 400:
      return "bad request";
    case 401:
      return "unauthorized";
    case 402:
      return "payment required";
    case 403:
      return "forbidden";
    case 404:
      return "not found";
    case 405:
      return "method not allowed";
    case 406:
      return "unacceptable";
    case 407:
      return "proxy authentication required";
    case 408:
      return "request timed out";
    case 409:
      return "conflict";
    case 410:
      return "no longer exists";
    case 411:
      return "length required";
    case 412:
      return "precondition failed";
    case 413:
      return "request too large";
    case 414:
      return "requested URL too long";
    case 415:
      return "unsupported media type";
    case 416:
      return "requested range not satisfiable";
    case 417:
      return "expectation failed";
    case 429:
      return "too many requests";
    case 500:
      return "internal server error";
    case 501:
      return "unimplemented";
    case 502:
      return "bad gateway";
    case 503:
      return "service unavailable";
    case 504:
      return "gateway timed out";
    case 505:
      return "unsupported version";
    default:
      break;
  }
  if (statusCode >= 100 && statusCode < 200) return "informational";
  if (statusCode >= 200 && statusCode < 300) return "success";
  if (statusCode >= 300 && statusCode < 400) return "redirected";
  if (statusCode >= 400 && statusCode < 500) return "client error";
  if (statusCode >= 500 && statusCode < 600) return "server error";
  return "unknown";
}

std::string HTTPURLResponse::description() const {
  std::string text = Object::description();
  text.append(" { URL: ").append(url_ ? url_->absoluteString() : "(null)");
  text.append(" } { Status Code: ").append(std::to_string(statusCode_)).append(", Headers {");
  for (const auto& [name, value] : fields_)
    text.append("\n    ").append(name).append(": ").append(value);
  text.append(fields_.empty() ? "} }" : "\n} }");
  return text;
}

}  // namespace kivi
