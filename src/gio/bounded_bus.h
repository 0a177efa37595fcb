// Internal to the layers that talk to D-Bus services (security, desktop): a
// conversation with a service on a connection of its own, whose every step is
// waited for on a private main context pushed as the calling thread's default
// while the BoundedBus lives, so that one deadline bounds the whole exchange
// (a bus or service that never answers costs at most the timeout) and nothing
// is shared with GIO's process-wide connections (or with a bus address that
// changed since).
#pragma once

#include <gio/gio.h>
#include <gio/gunixfdlist.h>

#include <chrono>
#include <string>

namespace kivi::detail {

// The session bus address: $DBUS_SESSION_BUS_ADDRESS, else the user
// session's $XDG_RUNTIME_DIR/bus if it exists; empty when there is none.
std::string sessionBusAddress();

// Whether `error` says that nobody provides the service or the method.
bool isServiceMissing(const GError* error);

class BoundedBus {
 public:
  explicit BoundedBus(std::chrono::milliseconds timeout);
  ~BoundedBus();
  BoundedBus(const BoundedBus&) = delete;
  BoundedBus& operator=(const BoundedBus&) = delete;

  // True once the deadline passed (every later step then fails at once).
  bool timedOut() const { return timedOut_; }

  // Connects to the bus at `address`; false with *error set.
  bool connect(const std::string& address, GError** error);
  // Connects to the session bus (sessionBusAddress()); false with *error set.
  bool connect(GError** error);

  // The reply (to be unreffed), or null with *error set. `parameters` is
  // consumed when floating; `fds` (may be null) travels with the call.
  GVariant* call(const char* service, const char* path, const char* interface, const char* method,
                 GVariant* parameters, const char* replyType, GUnixFDList* fds, GError** error);

 private:
  template <class Start>
  GAsyncResult* wait(Start start);
  static void finished(GObject*, GAsyncResult* result, gpointer data);
  static gboolean expire(gpointer data);

  std::chrono::milliseconds timeout_;
  GMainContext* context_;
  GCancellable* cancellable_;
  GSource* timer_ = nullptr;
  GDBusConnection* connection_ = nullptr;
  bool timedOut_ = false;
};

}  // namespace kivi::detail
