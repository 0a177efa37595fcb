// MockKivNSRunningApplication: a scriptable KivNSRunningApplicationProtocol.
//
// The lookup is type-level, so its callback is class-level: one
// runningApplicationsBlock for the whole process, read by every
// MockKivNSRunningApplication object. Without it no application is running
// (an empty list).
//
//   using Apps = std::vector<std::shared_ptr<kivi::NSRunningApplication>>;
//   kivi::MockKivNSRunningApplication::runningApplicationsBlock = [&](const std::string& id) {
//     return id == "org.example.Agent" ? agents : Apps{};
//   };
//   watchdog.setApplications(std::make_shared<kivi::MockKivNSRunningApplication>());
//   kivi::MockKivNSRunningApplication::runningApplicationsBlock = nullptr;  // reset
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the class-level callback before any object is handed out and reset it
// when the test ends.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/process/kiv_ns_running_application_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSRunningApplication : public Object,
                                                public KivNSRunningApplicationProtocol {
 public:
  MockKivNSRunningApplication() = default;

  // Class-level: answers runningApplicationsWithBundleIdentifier(bundleIdentifier) for every
  // object; without it, an empty list.
  static inline std::function<std::vector<std::shared_ptr<NSRunningApplication>>(
      const std::string&)>
      runningApplicationsBlock;

  std::vector<std::shared_ptr<NSRunningApplication>> runningApplicationsWithBundleIdentifier(
      const std::string& bundleIdentifier) override {
    if (runningApplicationsBlock) return runningApplicationsBlock(bundleIdentifier);
    return {};
  }
};

}  // namespace kivi
