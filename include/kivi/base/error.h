// Error: the error object handed out through completion errors and error
// out-parameters: a domain, a signed code and a user-info dictionary.
//
//   auto e = kivi::Error::create("MyDomain", 7, {{kivi::LocalizedDescriptionKey, "Bad input"}});
//   e->localizedDescription();   // "Bad input"
//
// Errors are immutable once created and may be shared between threads.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// Error domains with the platform's names that several areas use; each area
// names its own codes.
inline constexpr const char* CocoaErrorDomain = "NSCocoaErrorDomain";
// errno values.
inline constexpr const char* POSIXErrorDomain = "NSPOSIXErrorDomain";

// User-info keys, with the platform's names.
inline constexpr const char* LocalizedDescriptionKey = "NSLocalizedDescription";
inline constexpr const char* LocalizedFailureReasonErrorKey = "NSLocalizedFailureReason";
inline constexpr const char* UnderlyingErrorKey = "NSUnderlyingError";
inline constexpr const char* URLErrorFailingURLErrorKey = "NSErrorFailingURLKey";
inline constexpr const char* URLErrorFailingURLStringErrorKey = "NSErrorFailingURLStringKey";
inline constexpr const char* DebugDescriptionErrorKey = "NSDebugDescription";

class KIVI_EXPORT Error final : public Object {
 public:
  // An error in `domain` with `code` and `userInfo`; create() hands it out shared.
  Error(std::string domain, std::int64_t code, Dictionary userInfo = {});
  static std::shared_ptr<const Error> create(std::string domain, std::int64_t code,
                                             Dictionary userInfo = {});

  // The domain, code and user info given at creation.
  const std::string& domain() const noexcept { return domain_; }
  std::int64_t code() const noexcept { return code_; }
  const Dictionary& userInfo() const noexcept { return userInfo_; }

  // The user info's LocalizedDescriptionKey when it is a string; otherwise
  // "The operation couldn’t be completed. (<domain> error <code>.)".
  std::string localizedDescription() const;

  std::string className() const override { return "NSError"; }
  // "Error Domain=<domain> Code=<code> \"<localized description>\" UserInfo={...}"
  std::string description() const override;

  // Same domain, code and user info.
  friend KIVI_EXPORT bool operator==(const Error& a, const Error& b) noexcept;

 private:
  const std::string domain_;
  const std::int64_t code_;
  const Dictionary userInfo_;
};

// How errors are passed around: shared and immutable; null means no error.
using ErrorPtr = std::shared_ptr<const Error>;

}  // namespace kivi
