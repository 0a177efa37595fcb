#include "bounded_bus.h"

#include <cstdlib>
#include <cstring>

namespace kivi::detail {

std::string sessionBusAddress() {
  const char* address = std::getenv("DBUS_SESSION_BUS_ADDRESS");
  if (address && *address) return address;
  // The systemd user session's bus; never an autolaunched one.
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  if (!runtime || !*runtime) return {};
  const std::string socket = std::string(runtime) + "/bus";
  if (!g_file_test(socket.c_str(), G_FILE_TEST_EXISTS)) return {};
  gchar* escaped = g_dbus_address_escape_value(socket.c_str());
  std::string result = std::string("unix:path=") + escaped;
  g_free(escaped);
  return result;
}

bool isServiceMissing(const GError* error) {
  if (!error || !g_dbus_error_is_remote_error(error)) return false;
  gchar* remote = g_dbus_error_get_remote_error(error);
  bool missing = false;
  for (const char* name :
       {"org.freedesktop.DBus.Error.ServiceUnknown", "org.freedesktop.DBus.Error.NameHasNoOwner",
        "org.freedesktop.DBus.Error.UnknownMethod", "org.freedesktop.DBus.Error.UnknownObject",
        "org.freedesktop.DBus.Error.UnknownInterface"}) {
    missing = missing || (remote && std::strcmp(remote, name) == 0);
  }
  g_free(remote);
  return missing;
}

BoundedBus::BoundedBus(std::chrono::milliseconds timeout)
    : timeout_(timeout), context_(g_main_context_new()), cancellable_(g_cancellable_new()) {
  g_main_context_push_thread_default(context_);
  timer_ = g_timeout_source_new(static_cast<guint>(timeout.count()));
  g_source_set_callback(timer_, &BoundedBus::expire, this, nullptr);
  g_source_attach(timer_, context_);
}

BoundedBus::~BoundedBus() {
  if (connection_) {
    g_dbus_connection_close_sync(connection_, nullptr, nullptr);
    g_object_unref(connection_);
  }
  g_source_destroy(timer_);
  g_source_unref(timer_);
  // Let the context release what the connection left queued on it.
  while (g_main_context_iteration(context_, FALSE)) {
  }
  g_main_context_pop_thread_default(context_);
  g_object_unref(cancellable_);
  g_main_context_unref(context_);
}

bool BoundedBus::connect(GError** error) {
  const std::string address = sessionBusAddress();
  if (address.empty()) {
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_NOT_FOUND, "No session bus address.");
    return false;
  }
  return connect(address, error);
}

bool BoundedBus::connect(const std::string& address, GError** error) {
  GAsyncResult* result = wait([&](GAsyncReadyCallback done, gpointer data) {
    g_dbus_connection_new_for_address(
        address.c_str(),
        static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                          G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION),
        nullptr, cancellable_, done, data);
  });
  connection_ = g_dbus_connection_new_for_address_finish(result, error);
  g_object_unref(result);
  return connection_ != nullptr;
}

GVariant* BoundedBus::call(const char* service, const char* path, const char* interface,
                           const char* method, GVariant* parameters, const char* replyType,
                           GUnixFDList* fds, GError** error) {
  GAsyncResult* result = wait([&](GAsyncReadyCallback done, gpointer data) {
    g_dbus_connection_call_with_unix_fd_list(
        connection_, service, path, interface, method, parameters, G_VARIANT_TYPE(replyType),
        G_DBUS_CALL_FLAGS_NONE, static_cast<gint>(timeout_.count()), fds, cancellable_, done, data);
  });
  GUnixFDList* returned = nullptr;
  GVariant* reply =
      g_dbus_connection_call_with_unix_fd_list_finish(connection_, &returned, result, error);
  if (returned) g_object_unref(returned);
  g_object_unref(result);
  return reply;
}

template <class Start>
GAsyncResult* BoundedBus::wait(Start start) {
  GAsyncResult* result = nullptr;
  start(&BoundedBus::finished, &result);
  while (!result) g_main_context_iteration(context_, TRUE);
  return result;
}

void BoundedBus::finished(GObject*, GAsyncResult* result, gpointer data) {
  *static_cast<GAsyncResult**>(data) = G_ASYNC_RESULT(g_object_ref(result));
}

gboolean BoundedBus::expire(gpointer data) {
  auto* self = static_cast<BoundedBus*>(data);
  self->timedOut_ = true;
  g_cancellable_cancel(self->cancellable_);
  return G_SOURCE_REMOVE;
}

}  // namespace kivi::detail
