// KivFeatureFlagProviderProtocol: the host's answer to "is this feature on
// for this service?". The library has no implementation: what a flag means
// and where its value comes from is the host's (MockKivFeatureFlagProvider
// answers every flag with true, or with what its callback says).
//
//   if (flags->valueForFeatureFlagWithServiceName("sync", "deltaUploads")) useDeltas();
//
// Thread contract: that of the host's implementation; the library may ask
// from any thread.
#pragma once

#include <string>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivFeatureFlagProviderProtocol {
 public:
  virtual ~KivFeatureFlagProviderProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Whether the flag `featureFlagName` of the service `serviceName` is on.
  virtual bool valueForFeatureFlagWithServiceName(const std::string& serviceName,
                                                  const std::string& featureFlagName) = 0;
};

}  // namespace kivi
