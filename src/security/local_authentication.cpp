// The local-authentication context over the fingerprint service. Each probe
// runs GDBus's asynchronous calls on a main context of its own, pushed as the
// calling thread's default for the length of the probe, so that nothing is
// shared between calls or with the process-wide bus connections, and one
// timer bounds the whole probe.
#include "kivi/security/local_authentication.h"

#include <gio/gio.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <vector>

#include "bounded_bus.h"

namespace kivi {
namespace {

using detail::BoundedBus;

constexpr const char* kService = "net.reactivated.Fprint";
constexpr const char* kManagerPath = "/net/reactivated/Fprint/Manager";
constexpr const char* kManagerInterface = "net.reactivated.Fprint.Manager";
constexpr const char* kDeviceInterface = "net.reactivated.Fprint.Device";
constexpr const char* kNoEnrolledPrints = "net.reactivated.Fprint.Error.NoEnrolledPrints";
constexpr const char* kDefaultAddress = "unix:path=/run/dbus/system_bus_socket";
constexpr guint kProbeTimeoutMs = 2000;

std::mutex gAddressMutex;
std::string gAddressForTesting;

std::string systemBusAddress() {
  {
    std::lock_guard lock(gAddressMutex);
    if (!gAddressForTesting.empty()) return gAddressForTesting;
  }
  const char* address = std::getenv("DBUS_SYSTEM_BUS_ADDRESS");
  return address && *address ? address : kDefaultAddress;
}

// The effective user's login name; empty (which the service reads as "the
// caller") when the account has no entry.
std::string currentUserName() {
  std::vector<char> buffer(1024);
  passwd entry{};
  passwd* found = nullptr;
  while (::getpwuid_r(::geteuid(), &entry, buffer.data(), buffer.size(), &found) == ERANGE &&
         buffer.size() < (1u << 20)) {
    buffer.resize(buffer.size() * 2);
  }
  return found && found->pw_name ? found->pw_name : "";
}

struct Probe {
  enum Outcome { Enrolled, NotEnrolled, NoReader, Unavailable };
  Outcome outcome = Unavailable;
  std::string reason;      // a short readable reason, for failures
  std::string busMessage;  // the bus's own error message, when there was one
};

bool isRemoteError(const GError* error, const char* name) {
  if (!g_dbus_error_is_remote_error(error)) return false;
  gchar* remote = g_dbus_error_get_remote_error(error);
  const bool same = remote && std::strcmp(remote, name) == 0;
  g_free(remote);
  return same;
}

Probe failed(const BoundedBus& session, GError* error, const char* reason) {
  Probe probe;
  probe.reason = session.timedOut() ? "The fingerprint service did not answer in time." : reason;
  if (error) probe.busMessage = error->message;
  g_clear_error(&error);
  return probe;
}

// Asks the service for its readers and for the user's fingers on each.
Probe probeFingerprints() {
  BoundedBus session{std::chrono::milliseconds(kProbeTimeoutMs)};
  GError* error = nullptr;
  if (!session.connect(systemBusAddress(), &error)) {
    return failed(session, error, "The system bus cannot be reached.");
  }
  GVariant* reply = session.call(kService, kManagerPath, kManagerInterface, "GetDevices", nullptr,
                                 "(ao)", nullptr, &error);
  if (!reply) {
    const bool notRunning = isRemoteError(error, "org.freedesktop.DBus.Error.ServiceUnknown") ||
                            isRemoteError(error, "org.freedesktop.DBus.Error.NameHasNoOwner");
    return failed(session, error,
                  notRunning ? "The fingerprint service is not running."
                             : "The fingerprint service gave an unexpected answer.");
  }
  std::vector<std::string> devices;
  {
    GVariantIter* iter = nullptr;
    const gchar* path = nullptr;
    g_variant_get(reply, "(ao)", &iter);
    while (g_variant_iter_next(iter, "&o", &path)) devices.emplace_back(path);
    g_variant_iter_free(iter);
    g_variant_unref(reply);
  }
  if (devices.empty()) {
    Probe probe;
    probe.outcome = Probe::NoReader;
    probe.reason = "No fingerprint reader is available.";
    return probe;
  }
  const std::string user = currentUserName();
  for (const std::string& device : devices) {
    GVariant* fingers =
        session.call(kService, device.c_str(), kDeviceInterface, "ListEnrolledFingers",
                     g_variant_new("(s)", user.c_str()), "(as)", nullptr, &error);
    if (!fingers && isRemoteError(error, kNoEnrolledPrints)) {
      g_clear_error(&error);
      continue;
    }
    if (!fingers) {
      return failed(session, error, "The fingerprint service gave an unexpected answer.");
    }
    GVariant* names = g_variant_get_child_value(fingers, 0);
    const bool any = g_variant_n_children(names) > 0;
    g_variant_unref(names);
    g_variant_unref(fingers);
    if (any) return Probe{Probe::Enrolled, {}, {}};
  }
  return Probe{Probe::NotEnrolled, "No fingerprint is enrolled.", {}};
}

ErrorPtr makeError(LAError code, const std::string& reason, const std::string& busMessage) {
  Dictionary userInfo{{LocalizedDescriptionKey, reason}};
  if (!busMessage.empty()) userInfo[DebugDescriptionErrorKey] = busMessage;
  return Error::create(LAErrorDomain, code, std::move(userInfo));
}

}  // namespace

LAContext::LAContext() = default;
LAContext::~LAContext() = default;

bool LAContext::canEvaluatePolicy(LAPolicy policy, ErrorPtr* error) {
  if (policy != LAPolicyDeviceOwnerAuthenticationWithBiometrics &&
      policy != LAPolicyDeviceOwnerAuthentication) {
    if (error) *error = makeError(LAErrorInvalidContext, "Unknown policy.", {});
    return false;
  }
  const Probe probe = probeFingerprints();
  const bool reader = probe.outcome == Probe::Enrolled || probe.outcome == Probe::NotEnrolled;
  biometryType_.store(reader ? LABiometryTypeTouchID : LABiometryTypeNone);

  if (policy == LAPolicyDeviceOwnerAuthentication || probe.outcome == Probe::Enrolled) {
    if (error) *error = nullptr;
    return true;
  }
  if (error) {
    *error = makeError(reader ? LAErrorBiometryNotEnrolled : LAErrorBiometryNotAvailable,
                       probe.reason, probe.busMessage);
  }
  return false;
}

LABiometryType LAContext::biometryType() const { return biometryType_.load(); }

void LASetSystemBusAddressForTesting(std::string address) {
  std::lock_guard lock(gAddressMutex);
  gAddressForTesting = std::move(address);
}

}  // namespace kivi
