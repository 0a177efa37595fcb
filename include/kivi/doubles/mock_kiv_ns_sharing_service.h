// MockKivNSSharingService: a scriptable KivNSSharingServiceProtocol.
//
// perform() and canPerform() call sharingServicePerformBlock and
// canPerformServiceBlock; without them nothing is shared and canPerform()
// answers false. subject and recipients are plain stored values.
//
//   auto mail = std::make_shared<kivi::MockKivNSSharingService>();
//   mail->canPerformServiceBlock = [](const std::optional<kivi::NSSharingItems>&) { return true; };
//   mail->sharingServicePerformBlock = [&](const kivi::NSSharingItems& items) { sent = items; };
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_sharing_service_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSSharingService : public Object, public KivNSSharingServiceProtocol {
 public:
  MockKivNSSharingService() = default;

  // Called by perform(items); without it nothing is shared.
  std::function<void(const NSSharingItems&)> sharingServicePerformBlock;
  // Answers canPerform(items); without it, false.
  std::function<bool(const std::optional<NSSharingItems>&)> canPerformServiceBlock;

  std::optional<std::string> subject() const override { return subject_; }
  void setSubject(std::optional<std::string> subject) override { subject_ = std::move(subject); }
  std::optional<std::vector<std::string>> recipients() const override { return recipients_; }
  void setRecipients(std::optional<std::vector<std::string>> recipients) override {
    recipients_ = std::move(recipients);
  }
  void perform(const NSSharingItems& items) override {
    if (sharingServicePerformBlock) sharingServicePerformBlock(items);
  }
  bool canPerform(const std::optional<NSSharingItems>& items) override {
    return canPerformServiceBlock ? canPerformServiceBlock(items) : false;
  }

 private:
  std::optional<std::string> subject_;
  std::optional<std::vector<std::string>> recipients_;
};

}  // namespace kivi
