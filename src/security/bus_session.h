// Internal to the security layer: a bounded conversation with a D-Bus
// service over a private connection, so that a bus or service that never
// answers costs at most the session's time and nothing is shared with the
// process-wide bus connections.
#pragma once

#include <gio/gio.h>

namespace kivi::security::detail {

// One private connection to a bus and the calls made on it, each waited for
// on a main context of its own, pushed as the calling thread's default while
// the session lives. A timer on that context cancels whatever is under way
// once the session's time is up; every later step then fails at once.
class BusSession {
 public:
  explicit BusSession(guint timeoutMs)
      : context_(g_main_context_new()), cancellable_(g_cancellable_new()), timeoutMs_(timeoutMs) {
    g_main_context_push_thread_default(context_);
    timer_ = g_timeout_source_new(timeoutMs_);
    g_source_set_callback(timer_, &BusSession::expire, this, nullptr);
    g_source_attach(timer_, context_);
  }

  ~BusSession() {
    if (connection_) {
      g_dbus_connection_close_sync(connection_, nullptr, nullptr);
      g_object_unref(connection_);
    }
    g_source_destroy(timer_);
    g_source_unref(timer_);
    // Let the context release what the connection left queued on it (its
    // "closed" notification holds a reference to the connection).
    while (g_main_context_iteration(context_, FALSE)) {
    }
    g_main_context_pop_thread_default(context_);
    g_object_unref(cancellable_);
    g_main_context_unref(context_);
  }

  BusSession(const BusSession&) = delete;
  BusSession& operator=(const BusSession&) = delete;

  bool timedOut() const { return timedOut_; }

  bool connect(const std::string& address, GError** error) {
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

  // The reply (to be unreffed), or null with *error set. A reply of another
  // type than `replyType` is an error too.
  GVariant* call(const char* service, const char* path, const char* interface, const char* method,
                 GVariant* parameters, const char* replyType, GError** error) {
    GAsyncResult* result = wait([&](GAsyncReadyCallback done, gpointer data) {
      g_dbus_connection_call(connection_, service, path, interface, method, parameters,
                             G_VARIANT_TYPE(replyType), G_DBUS_CALL_FLAGS_NONE,
                             static_cast<gint>(timeoutMs_), cancellable_, done, data);
    });
    GVariant* reply = g_dbus_connection_call_finish(connection_, result, error);
    g_object_unref(result);
    return reply;
  }

 private:
  template <class Start>
  GAsyncResult* wait(Start start) {
    GAsyncResult* result = nullptr;
    start(&BusSession::finished, &result);
    while (!result) g_main_context_iteration(context_, TRUE);
    return result;
  }

  static void finished(GObject*, GAsyncResult* result, gpointer data) {
    *static_cast<GAsyncResult**>(data) = G_ASYNC_RESULT(g_object_ref(result));
  }

  static gboolean expire(gpointer data) {
    auto* self = static_cast<BusSession*>(data);
    self->timedOut_ = true;
    g_cancellable_cancel(self->cancellable_);
    return G_SOURCE_REMOVE;
  }

  GMainContext* context_;
  GCancellable* cancellable_;
  guint timeoutMs_;
  GSource* timer_ = nullptr;
  GDBusConnection* connection_ = nullptr;
  bool timedOut_ = false;
};

}  // namespace kivi::security::detail
