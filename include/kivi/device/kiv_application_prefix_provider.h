// KivApplicationPrefixProvider: the application identifier prefix of the
// running application, the first part of its keychain access group, read
// from a marker item the provider keeps in the keychain (generic password,
// account "appIdentifierPrefix", service ""; created on first use).
//
//   kivi::ErrorPtr error;
//   std::optional<std::string> prefix =
//       kivi::KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(&error);
//   if (!prefix && error) {
//     // error->domain() == NSOSStatusErrorDomain, error->code() the keychain's status
//   }
//
// On Linux the prefix is the <TEAM> part of the default access group (see
// kivi/security/keychain.h): the same for every run of one installed
// program, different for another program or another copy of it.
//
// Thread contract: applicationIdentifierPrefixWithError may be called from any
// thread and any number of processes at once; it blocks for keychain round
// trips. Concurrent first calls create one marker item, and all of them
// answer the same prefix.
#pragma once

#include <optional>
#include <string>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivApplicationPrefixProvider : public Object {
 public:
  // The application identifier prefix, or null (an empty optional). When
  // `error` is non-null it receives the keychain's failure as an error in
  // NSOSStatusErrorDomain whose code is the OSStatus (no user info), or null
  // on success. A marker item without an access group, or whose group starts
  // with ".", answers null without an error.
  static std::optional<std::string> applicationIdentifierPrefixWithError(ErrorPtr* error);

  std::string className() const override { return "KivApplicationPrefixProvider"; }
};

}  // namespace kivi
