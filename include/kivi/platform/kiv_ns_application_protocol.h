// KivNSApplicationProtocol: the running application as a user-interface
// service: bringing it to the front and ending it.
//
// Linux toolkits own this service, so the library has no default
// implementation: a host implements the interface over its toolkit (or
// passes MockKivNSApplication in tests).
//
//   void quit(kivi::KivNSApplicationProtocol& app) { app.terminate(nullptr); }
//
// Thread contract: call on the main thread, like every user-interface
// service.
#pragma once

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivNSApplicationProtocol {
 public:
  virtual ~KivNSApplicationProtocol() = default;

  // Brings the application to the front, even over the active one when
  // `flag` is true.
  virtual void activateIgnoringOtherApps(bool flag) = 0;
  // Ends the application; `sender` (null for none) is who asked.
  virtual void terminate(const ObjectPtr& sender) = 0;
};

}  // namespace kivi
