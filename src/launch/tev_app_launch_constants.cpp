#include "kivi/launch/tev_app_launch_constants.h"

namespace kivi {

// Function-local statics: safe to read during other files' static
// initialisation, and built once under the language's own guard.
const std::string& TEVAppLaunchConstants::clientAddress() {
  static const std::string value = "127.0.0.1";
  return value;
}

const std::string& TEVAppLaunchConstants::zorvikTransactionIdHeaderName() {
  static const std::string value = "Zorvik-TransactionId";
  return value;
}

const std::string& TEVAppLaunchConstants::contentTypeHeader() {
  static const std::string value = "Content-Type";
  return value;
}

const std::string& TEVAppLaunchConstants::launchMimeType() {
  static const std::string value = "application/vnd.zorvik.launchparams+xml";
  return value;
}

}  // namespace kivi
