// TEVAppLaunchConstants: the fixed strings hosts use when they exchange launch
// parameters over HTTP, so that every host spells them the same way.
//
//   request.setValue(kivi::TEVAppLaunchConstants::launchMimeType(),
//                    kivi::TEVAppLaunchConstants::contentTypeHeader());
//   // "Content-Type: application/vnd.zorvik.launchparams+xml"
//
// Instances carry nothing; the class-level accessors are what callers use.
//
// Thread contract: the strings are immutable and may be read from any thread.
#pragma once

#include <string>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT TEVAppLaunchConstants {
 public:
  TEVAppLaunchConstants() = default;

  // "127.0.0.1": the loopback address of the launching client.
  static const std::string& clientAddress();
  // "Zorvik-TransactionId": the header that carries the launch's transaction id.
  static const std::string& zorvikTransactionIdHeaderName();
  // "Content-Type".
  static const std::string& contentTypeHeader();
  // "application/vnd.zorvik.launchparams+xml": a launch-parameters document.
  static const std::string& launchMimeType();
};

}  // namespace kivi
