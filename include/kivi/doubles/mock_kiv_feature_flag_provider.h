// MockKivFeatureFlagProvider: a scriptable KivFeatureFlagProviderProtocol.
//
// valueForFeatureFlagWithServiceName() answers valueForFeatureFlagBlock;
// without it every flag of every service is on (true).
//
//   auto flags = std::make_shared<kivi::MockKivFeatureFlagProvider>();
//   flags->valueForFeatureFlagBlock = [](const std::string&, const std::string& flag) {
//     return flag != "deltaUploads";
//   };
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_feature_flag_provider_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivFeatureFlagProvider : public Object,
                                               public KivFeatureFlagProviderProtocol {
 public:
  MockKivFeatureFlagProvider() = default;

  // Answers valueForFeatureFlagWithServiceName(serviceName, featureFlagName); without it, true.
  std::function<bool(const std::string&, const std::string&)> valueForFeatureFlagBlock;

  std::string description() const override { return Object::description(); }

  bool valueForFeatureFlagWithServiceName(const std::string& serviceName,
                                          const std::string& featureFlagName) override {
    return valueForFeatureFlagBlock ? valueForFeatureFlagBlock(serviceName, featureFlagName) : true;
  }
};

}  // namespace kivi
