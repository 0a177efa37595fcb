#include "kivi/base/error.h"

namespace kivi {

Error::Error(std::string domain, std::int64_t code, Dictionary userInfo)
    : domain_(std::move(domain)), code_(code), userInfo_(std::move(userInfo)) {}

ErrorPtr Error::create(std::string domain, std::int64_t code, Dictionary userInfo) {
  return std::make_shared<const Error>(std::move(domain), code, std::move(userInfo));
}

std::string Error::localizedDescription() const {
  auto it = userInfo_.find(LocalizedDescriptionKey);
  if (it != userInfo_.end()) {
    if (const String* text = it->second.asString()) return *text;
  }
  return "The operation couldn\u2019t be completed. (" + domain_ + " error " +
         std::to_string(code_) + ".)";
}

std::string Error::description() const {
  return "Error Domain=" + domain_ + " Code=" + std::to_string(code_) + " \"" +
         localizedDescription() + "\" UserInfo=" + Value(Dictionary(userInfo_)).description();
}

bool operator==(const Error& a, const Error& b) noexcept {
  return a.code_ == b.code_ && a.domain_ == b.domain_ && a.userInfo_ == b.userInfo_;
}

}  // namespace kivi
