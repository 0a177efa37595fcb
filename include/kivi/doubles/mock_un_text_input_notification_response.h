// MockUNTextInputNotificationResponse: a
// KivUNTextInputNotificationResponseProtocol. It is a
// MockUNNotificationResponse (the same stored notification and action
// identifier) with the typed text as one more stored value ("" at first).
//
//   auto r = std::make_shared<kivi::MockUNTextInputNotificationResponse>();
//   r->setActionIdentifier("reply");
//   r->setUserText("on my way");
//   handler.onResponse(*r);
//
// Thread contract: none; set the values before handing the double out.
#pragma once

#include <string>

#include "kivi/doubles/mock_un_notification_response.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_un_text_input_notification_response_protocol.h"

namespace kivi {

class KIVI_EXPORT MockUNTextInputNotificationResponse
    : public MockUNNotificationResponse,
      public KivUNTextInputNotificationResponseProtocol {
 public:
  MockUNTextInputNotificationResponse() = default;

  std::string userText() const override { return userText_; }
  void setUserText(std::string text) override { userText_ = std::move(text); }

 private:
  std::string userText_;
};

}  // namespace kivi
