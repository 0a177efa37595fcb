// KivUNTextInputNotificationResponseProtocol: the answer to a notification
// whose chosen action asked for text (a reply field): everything a response
// has, and the text typed.
//
// The library implements it only by its double,
// MockUNTextInputNotificationResponse.
//
//   if (response.actionIdentifier() == "reply") send(response.userText());
//
// Thread contract: that of the implementation; the double is a plain value
// holder.
#pragma once

#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_un_notification_response_protocol.h"

namespace kivi {

class KIVI_EXPORT KivUNTextInputNotificationResponseProtocol
    : public virtual KivUNNotificationResponseProtocol {
 public:
  // The text the user typed.
  virtual std::string userText() const = 0;
  virtual void setUserText(std::string text) = 0;
};

}  // namespace kivi
