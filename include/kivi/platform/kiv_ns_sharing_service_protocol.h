// KivNSSharingServiceProtocol: one way of sharing items with someone (mail,
// messages, ...), with its subject and recipients.
//
// Linux desktops own sharing, so the library has no default implementation:
// a host implements the interface over what its desktop offers (or uses
// MockKivNSSharingService in tests).
//
//   kivi::NSSharingItems items{kivi::Value("See attached"), kivi::Value(logURL)};
//   service->setSubject("Diagnostics");
//   if (service->canPerform(items)) service->perform(items);
//
// Thread contract: call on the main thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

class KIVI_EXPORT KivNSSharingServiceProtocol {
 public:
  virtual ~KivNSSharingServiceProtocol() = default;

  // The subject of what is sent (a mail's); nullopt for none.
  virtual std::optional<std::string> subject() const = 0;
  virtual void setSubject(std::optional<std::string> subject) = 0;
  // Whom it is sent to (addresses, handles); nullopt: the user chooses.
  virtual std::optional<std::vector<std::string>> recipients() const = 0;
  virtual void setRecipients(std::optional<std::vector<std::string>> recipients) = 0;
  // Shares `items` with the subject and recipients set.
  virtual void perform(const NSSharingItems& items) = 0;
  // Whether the service can share `items`; nullopt asks without items.
  virtual bool canPerform(const std::optional<NSSharingItems>& items) = 0;
};

}  // namespace kivi
