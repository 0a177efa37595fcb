// LAContext: whether the device owner can be authenticated right now, by
// fingerprint or by the account password, answered from the fingerprint
// service on the system D-Bus (net.reactivated.Fprint).
//
//   auto context = std::make_shared<kivi::LAContext>();
//   kivi::ErrorPtr error;
//   auto policy = kivi::LAPolicyDeviceOwnerAuthenticationWithBiometrics;
//   if (context->canEvaluatePolicy(policy, &error)) {
//     // a reader exists and the current user has an enrolled finger
//   } else if (error->code() == kivi::LAErrorBiometryNotEnrolled) {
//     // context->biometryType() == kivi::LABiometryTypeTouchID: a reader, no finger
//   }
//
// Each canEvaluatePolicy() opens its own connection to the system bus (or
// the address set with LASetSystemBusAddressForTesting), asks the service for
// its readers and for the fingers the current user enrolled on each, and
// closes the connection again. The whole probe gives up after two seconds:
// a bus or service that does not answer in that time counts as no reader.
// Failures are errors in LAErrorDomain whose user info holds a short reason
// (LocalizedDescriptionKey) and, when the bus gave one, its error message
// (DebugDescriptionErrorKey).
//
// Thread contract: every member may be called from any thread, on one
// context or on many at once; calls are independent of each other.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

// What canEvaluatePolicy is asked about.
enum LAPolicy : std::int64_t {
  // A reader with at least one finger enrolled by the current user.
  LAPolicyDeviceOwnerAuthenticationWithBiometrics = 1,
  // A fingerprint or the account password; a local account always has one.
  LAPolicyDeviceOwnerAuthentication = 2,
};

// The kind of reader biometryType() reports.
enum LABiometryType : std::int64_t {
  LABiometryTypeNone = 0,
  LABiometryTypeTouchID = 1,  // a fingerprint reader
  LABiometryTypeFaceID = 2,   // never reported here
};

// The domain of LAContext's errors; the codes are LAError's.
inline constexpr const char* LAErrorDomain = "LAErrorDomain";

// Codes in LAErrorDomain. canEvaluatePolicy gives LAErrorBiometryNotEnrolled,
// LAErrorBiometryNotAvailable and LAErrorInvalidContext (see there); the others are for code
// that reports those failures itself.
enum LAError : std::int64_t {
  LAErrorAuthenticationFailed = -1,
  LAErrorUserCancel = -2,
  LAErrorUserFallback = -3,
  LAErrorSystemCancel = -4,
  LAErrorPasscodeNotSet = -5,
  LAErrorBiometryNotAvailable = -6,
  LAErrorBiometryNotEnrolled = -7,
  LAErrorBiometryLockout = -8,
  LAErrorAppCancel = -9,
  LAErrorInvalidContext = -10,
  LAErrorNotInteractive = -1004,
};

class KIVI_EXPORT LAContext : public Object {
 public:
  LAContext();
  virtual ~LAContext();

  // Whether `policy` can be evaluated now. When `error` is not null it is
  // always written: null on true, an LAErrorDomain error on false:
  //   LAErrorBiometryNotEnrolled   readers, but no finger of this user
  //   LAErrorBiometryNotAvailable  no reader, no service, no bus, or an
  //                                answer that makes no sense
  //   LAErrorInvalidContext        a policy value other than the two above
  // LAPolicyDeviceOwnerAuthentication is always true; it still probes the
  // readers so that biometryType() is up to date. An unknown policy probes
  // nothing and leaves biometryType() as it was.
  virtual bool canEvaluatePolicy(LAPolicy policy, ErrorPtr* error);

  // What the last canEvaluatePolicy found: TouchID when a fingerprint reader
  // exists (with or without an enrolled finger), None otherwise and before
  // the first call.
  virtual LABiometryType biometryType() const;

  std::string className() const override { return "LAContext"; }

 private:
  std::atomic<LABiometryType> biometryType_{LABiometryTypeNone};
};

// Where the fingerprint service is looked for: `address` (a D-Bus address)
// when not empty, else $DBUS_SYSTEM_BUS_ADDRESS, else
// "unix:path=/run/dbus/system_bus_socket". An empty string restores that
// default. Affects calls that start afterwards.
KIVI_EXPORT void LASetSystemBusAddressForTesting(std::string address);

}  // namespace kivi
