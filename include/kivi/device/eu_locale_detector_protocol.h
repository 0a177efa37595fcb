// EULocaleDetectorProtocol: whether the device is to be taken as located in
// the European Union or one of its neighbours, behind an interface so that a
// host's components can be handed a scripted answer in tests.
//
//   std::shared_ptr<kivi::EULocaleDetectorProtocol> detector =
//       kivi::EULocaleDetector::createEULocaleDetector();
//   if (detector->doesDeviceAppearToBeLocatedInEU()) showConsent();
//
// Thread contract: that of the implementation; EULocaleDetector_Mac may be
// called from any thread.
#pragma once

#include <string>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT EULocaleDetectorProtocol {
 public:
  virtual ~EULocaleDetectorProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Whether the device is to be taken as located in the European Union or a neighbour.
  virtual bool doesDeviceAppearToBeLocatedInEU() = 0;
};

}  // namespace kivi
