#include "kivi/net/url_request.h"

#include <algorithm>

namespace kivi {

namespace {

char asciiLower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

}  // namespace

bool headerFieldNamesEqual(std::string_view a, std::string_view b) noexcept {
  return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) {
           return asciiLower(x) == asciiLower(y);
         });
}

std::optional<std::string> URLRequest::valueForHTTPHeaderField(std::string_view field) const {
  for (const auto& [name, value] : fields_) {
    if (headerFieldNamesEqual(name, field)) return value;
  }
  return std::nullopt;
}

StringDictionary URLRequest::allHTTPHeaderFields() const {
  return StringDictionary(fields_.begin(), fields_.end());
}

bool operator==(const URLRequest& a, const URLRequest& b) noexcept {
  const bool sameURL = a.url_ == b.url_ || (a.url_ && b.url_ && *a.url_ == *b.url_);
  return sameURL && a.method_ == b.method_ && a.timeoutInterval_ == b.timeoutInterval_ &&
         a.body_ == b.body_ && a.fields_ == b.fields_;
}

void MutableURLRequest::setHTTPMethod(std::string method) {
  method_ = method.empty() ? "GET" : std::move(method);
}

void MutableURLRequest::setValue(std::optional<std::string> value, std::string_view field) {
  auto it = std::find_if(fields_.begin(), fields_.end(),
                         [&](const auto& f) { return headerFieldNamesEqual(f.first, field); });
  if (it != fields_.end()) {
    if (value) {
      it->second = std::move(*value);
    } else {
      fields_.erase(it);
    }
  } else if (value) {
    fields_.emplace_back(std::string(field), std::move(*value));
  }
}

void MutableURLRequest::addValue(std::string_view value, std::string_view field) {
  auto it = std::find_if(fields_.begin(), fields_.end(),
                         [&](const auto& f) { return headerFieldNamesEqual(f.first, field); });
  if (it != fields_.end()) {
    it->second.append(",").append(value);
  } else {
    fields_.emplace_back(std::string(field), std::string(value));
  }
}

void MutableURLRequest::setAllHTTPHeaderFields(const std::optional<StringDictionary>& fields) {
  fields_.clear();
  if (fields) fields_.assign(fields->begin(), fields->end());
}

}  // namespace kivi
