#include "kivi/device/kiv_application_prefix_provider.h"

#include "kivi/security/keychain.h"
#include "kivi/security/os_status.h"

namespace kivi {

namespace {
constexpr const char* kMarkerAccount = "appIdentifierPrefix";
}  // namespace

std::optional<std::string> KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(
    ErrorPtr* error) {
  Dictionary query{{kSecClass, kSecClassGenericPassword},
                   {kSecAttrAccount, kMarkerAccount},
                   {kSecAttrService, ""},
                   {kSecReturnAttributes, true}};
  Value result;
  OSStatus status;
  {
    // Search and create as one step, so that a process starting at the same
    // time finds this one's marker instead of failing to add its own.
    SecItemTransaction transaction;
    status = SecItemCopyMatching(query, &result);
    if (status == errSecItemNotFound) {
      Dictionary attributes = query;
      attributes[kSecAttrAccessible] = Value(kSecAttrAccessibleAfterFirstUnlock);
      status = SecItemAdd(attributes, &result);
    }
  }

  ErrorPtr failure;
  std::optional<std::string> prefix;
  if (status != errSecSuccess) {
    failure = Error::create(NSOSStatusErrorDomain, status, {});
  } else if (const Value* group = result.find(kSecAttrAccessGroup)) {
    if (const String* text = group->asString()) {
      std::string_view whole = *text;
      std::string_view first = whole.substr(0, whole.find('.'));
      if (!first.empty()) prefix = std::string(first);
    }
  }
  if (error) *error = failure;
  return prefix;
}

}  // namespace kivi
