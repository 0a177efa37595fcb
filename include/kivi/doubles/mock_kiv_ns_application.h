// MockKivNSApplication: a scriptable KivNSApplicationProtocol.
//
// activateIgnoringOtherApps() and terminate() call their callbacks, if set,
// with the arguments unchanged; without them they do nothing, so no test
// ever ends its own process by accident.
//
//   auto app = std::make_shared<kivi::MockKivNSApplication>();
//   bool quit = false;
//   app->terminateAppBlock = [&](const kivi::ObjectPtr&) { quit = true; };
//   updater.setApplication(app);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_application_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSApplication : public Object, public KivNSApplicationProtocol {
 public:
  MockKivNSApplication() = default;

  // Called by activateIgnoringOtherApps(flag); without it nothing happens.
  std::function<void(bool)> activateIgnoringOtherAppsBlock;
  // Called by terminate(sender); without it nothing happens.
  std::function<void(const ObjectPtr&)> terminateAppBlock;

  void activateIgnoringOtherApps(bool flag) override {
    if (activateIgnoringOtherAppsBlock) activateIgnoringOtherAppsBlock(flag);
  }
  void terminate(const ObjectPtr& sender) override {
    if (terminateAppBlock) terminateAppBlock(sender);
  }
};

}  // namespace kivi
