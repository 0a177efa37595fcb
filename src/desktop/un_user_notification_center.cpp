// The notification center over org.freedesktop.Notifications. Requests are
// sent one at a time from a serial queue with bounded synchronous calls; the
// server's signals arrive on a listener thread that owns the connection's
// main context and calls the delegate.
#include "kivi/desktop/un_user_notification_center.h"

#include <gio/gio.h>

#include <condition_variable>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <utility>

#include "bounded_bus.h"
#include "kivi/desktop/ns_bundle.h"
#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/dispatch/dispatch_queue.h"

namespace kivi {
namespace {

constexpr const char* kService = "org.freedesktop.Notifications";
constexpr const char* kPath = "/org/freedesktop/Notifications";
constexpr const char* kInterface = "org.freedesktop.Notifications";
constexpr guint32 kDismissedByUser = 2;

ErrorPtr notAllowed(const std::string& reason, const std::string& debug = {}) {
  Dictionary userInfo{{LocalizedDescriptionKey, reason}};
  if (!debug.empty()) userInfo[DebugDescriptionErrorKey] = debug;
  return Error::create(UNErrorDomain, UNErrorCodeNotificationsNotAllowed, std::move(userInfo));
}

std::string text(const Value& value) {
  const String* s = value.asString();
  return s ? s->str() : std::string();
}

}  // namespace

struct UNUserNotificationCenter::Impl {
  // One connection to the notification server and the thread that hears its
  // signals.
  class Listener {
   public:
    Listener(Impl* owner, std::string address)
        : owner_(owner),
          address_(std::move(address)),
          context_(g_main_context_new()),
          loop_(g_main_loop_new(context_, FALSE)) {
      thread_ = std::thread([this] { run(); });
    }

    ~Listener() {
      g_main_context_invoke(
          context_,
          [](gpointer loop) {
            g_main_loop_quit(static_cast<GMainLoop*>(loop));
            return G_SOURCE_REMOVE;
          },
          loop_);
      thread_.join();
      g_main_loop_unref(loop_);
      g_main_context_unref(context_);
    }

    Listener(const Listener&) = delete;
    Listener& operator=(const Listener&) = delete;

    // Waits until connected or failed; the connection, or null with the
    // reason.
    GDBusConnection* connection(std::string* reason, std::string* debug) {
      std::unique_lock lock(mutex_);
      if (!ready_.wait_for(lock, kUNNotificationCenterTimeout + std::chrono::seconds(1),
                           [&] { return done_; })) {
        *reason = "The session bus did not answer in time.";
        return nullptr;
      }
      if (!connection_) {
        *reason = failure_;
        *debug = debug_;
      }
      return connection_;
    }

    bool usable(const std::string& address) {
      std::lock_guard lock(mutex_);
      return done_ && connection_ && address == address_ &&
             !g_dbus_connection_is_closed(connection_);
    }

   private:
    void run() {
      g_main_context_push_thread_default(context_);
      GCancellable* cancellable = g_cancellable_new();
      GSource* timer =
          g_timeout_source_new(static_cast<guint>(kUNNotificationCenterTimeout.count()));
      g_source_set_callback(
          timer,
          [](gpointer data) {
            g_cancellable_cancel(static_cast<GCancellable*>(data));
            return G_SOURCE_REMOVE;
          },
          cancellable, nullptr);
      g_source_attach(timer, context_);
      g_dbus_connection_new_for_address(
          address_.c_str(),
          static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                            G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION),
          nullptr, cancellable, &Listener::connected, this);
      g_main_loop_run(loop_);

      g_source_destroy(timer);
      g_source_unref(timer);
      // Told to stop while still connecting: give up, and wait for the
      // attempt to end (connected() runs on this thread).
      g_cancellable_cancel(cancellable);
      while (!done_) g_main_context_iteration(context_, TRUE);
      GDBusConnection* connection = nullptr;
      {
        std::lock_guard lock(mutex_);
        std::swap(connection, connection_);
      }
      if (connection) {
        for (guint id : subscriptions_) g_dbus_connection_signal_unsubscribe(connection, id);
        g_dbus_connection_close_sync(connection, nullptr, nullptr);
        g_object_unref(connection);
      }
      while (g_main_context_iteration(context_, FALSE)) {
      }
      g_object_unref(cancellable);
      g_main_context_pop_thread_default(context_);
    }

    static void connected(GObject*, GAsyncResult* result, gpointer data) {
      auto* self = static_cast<Listener*>(data);
      GError* error = nullptr;
      GDBusConnection* connection = g_dbus_connection_new_for_address_finish(result, &error);
      if (connection) {
        for (const char* member : {"ActionInvoked", "NotificationClosed", "NotificationReplied"}) {
          self->subscriptions_.push_back(g_dbus_connection_signal_subscribe(
              connection, nullptr, kInterface, member, kPath, nullptr, G_DBUS_SIGNAL_FLAGS_NONE,
              &Listener::signal, self, nullptr));
        }
      }
      {
        std::lock_guard lock(self->mutex_);
        self->done_ = true;
        self->connection_ = connection;
        if (!connection) {
          self->failure_ = g_error_matches(error, G_IO_ERROR, G_IO_ERROR_CANCELLED)
                               ? "The session bus did not answer in time."
                               : "The session bus cannot be reached.";
          self->debug_ = error ? error->message : "";
        }
      }
      g_clear_error(&error);
      self->ready_.notify_all();
      if (!connection) g_main_loop_quit(self->loop_);
    }

    static void signal(GDBusConnection*, const gchar*, const gchar*, const gchar*,
                       const gchar* member, GVariant* parameters, gpointer data) {
      static_cast<Listener*>(data)->owner_->heard(member, parameters);
    }

    Impl* const owner_;
    const std::string address_;
    GMainContext* const context_;
    GMainLoop* const loop_;
    std::thread thread_;
    std::vector<guint> subscriptions_;  // listener thread only
    std::mutex mutex_;
    std::condition_variable ready_;
    bool done_ = false;
    GDBusConnection* connection_ = nullptr;
    std::string failure_, debug_;
  };

  struct Shown {
    std::shared_ptr<UNNotification> notification;
    UNNotificationCategoryOptions options = 0;
    bool answered = false;
  };

  std::shared_ptr<DispatchQueue> queue = DispatchQueue::create("kivi.notifications");

  std::mutex mutex;  // guards the members below
  std::weak_ptr<UNUserNotificationCenterDelegate> delegate;
  std::set<UNNotificationCategory> categories;
  std::map<std::string, guint32> idsByIdentifier;
  std::map<guint32, Shown> shown;

  // Serial queue only.
  std::unique_ptr<Listener> listener;

  // The connection to the server on the current session bus, made when
  // needed; null with the error.
  GDBusConnection* connect(ErrorPtr* error) {
    const std::string address = detail::sessionBusAddress();
    if (address.empty()) {
      *error = notAllowed("There is no session bus.");
      return nullptr;
    }
    if (!listener || !listener->usable(address)) {
      listener.reset();
      {
        // The server's ids mean nothing on another connection.
        std::lock_guard lock(mutex);
        idsByIdentifier.clear();
        shown.clear();
      }
      listener = std::make_unique<Listener>(this, address);
    }
    std::string reason, debug;
    GDBusConnection* connection = listener->connection(&reason, &debug);
    if (!connection) {
      *error = notAllowed(reason, debug);
      // Its thread has nothing left to hear: join it now rather than at the
      // next attempt, which may never come.
      listener.reset();
    }
    return connection;
  }

  ErrorPtr failedCall(GError* error) {
    const bool missing = detail::isServiceMissing(error);
    const bool late = g_error_matches(error, G_IO_ERROR, G_IO_ERROR_TIMED_OUT);
    ErrorPtr failure = notAllowed(missing ? "No notification server is running."
                                  : late  ? "The notification server did not answer in time."
                                          : "The notification server refused the request.",
                                  error ? error->message : "");
    g_clear_error(&error);
    return failure;
  }

  ErrorPtr authorize() {
    ErrorPtr failure;
    GDBusConnection* connection = connect(&failure);
    if (!connection) return failure;
    GError* error = nullptr;
    GVariant* reply = g_dbus_connection_call_sync(
        connection, kService, kPath, kInterface, "GetCapabilities", nullptr, G_VARIANT_TYPE("(as)"),
        G_DBUS_CALL_FLAGS_NONE, static_cast<gint>(kUNNotificationCenterTimeout.count()), nullptr,
        &error);
    if (!reply) return failedCall(error);
    g_variant_unref(reply);
    return nullptr;
  }

  ErrorPtr send(const UNNotificationRequest& request) {
    ErrorPtr failure;
    GDBusConnection* connection = connect(&failure);
    if (!connection) return failure;

    guint32 replaces = 0;
    UNNotificationCategoryOptions options = 0;
    GVariantBuilder actions;
    g_variant_builder_init(&actions, G_VARIANT_TYPE("as"));
    g_variant_builder_add(&actions, "s", "default");
    g_variant_builder_add(&actions, "s", "");
    {
      std::lock_guard lock(mutex);
      if (auto it = idsByIdentifier.find(request.identifier); it != idsByIdentifier.end()) {
        replaces = it->second;
      }
      for (const UNNotificationCategory& category : categories) {
        if (request.content.categoryIdentifier.empty() ||
            category.identifier != request.content.categoryIdentifier) {
          continue;
        }
        options = category.options;
        for (const UNNotificationAction& action : category.actions) {
          g_variant_builder_add(&actions, "s", action.identifier.c_str());
          g_variant_builder_add(&actions, "s", action.title.c_str());
        }
        break;
      }
    }

    const auto bundle = NSBundle::mainBundle();
    std::string appName = text(bundle->objectForInfoDictionaryKey("CFBundleDisplayName"));
    if (appName.empty()) appName = text(bundle->objectForInfoDictionaryKey("CFBundleExecutable"));
    const std::string icon = text(bundle->objectForInfoDictionaryKey("Icon"));
    GVariantBuilder hints;
    g_variant_builder_init(&hints, G_VARIANT_TYPE("a{sv}"));
    if (auto id = bundle->bundleIdentifier()) {
      g_variant_builder_add(&hints, "{sv}", "desktop-entry", g_variant_new_string(id->c_str()));
    }
    if (request.content.sound) {
      g_variant_builder_add(&hints, "{sv}", "sound-name",
                            g_variant_new_string("message-new-instant"));
    } else {
      g_variant_builder_add(&hints, "{sv}", "suppress-sound", g_variant_new_boolean(TRUE));
    }
    std::string body = request.content.subtitle;
    if (!body.empty() && !request.content.body.empty()) body += "\n";
    body += request.content.body;

    GError* error = nullptr;
    GVariant* reply = g_dbus_connection_call_sync(
        connection, kService, kPath, kInterface, "Notify",
        g_variant_new("(susssasa{sv}i)", appName.c_str(), replaces, icon.c_str(),
                      request.content.title.c_str(), body.c_str(), &actions, &hints, -1),
        G_VARIANT_TYPE("(u)"), G_DBUS_CALL_FLAGS_NONE,
        static_cast<gint>(kUNNotificationCenterTimeout.count()), nullptr, &error);
    if (!reply) return failedCall(error);
    guint32 id = 0;
    g_variant_get(reply, "(u)", &id);
    g_variant_unref(reply);

    std::lock_guard lock(mutex);
    if (replaces != 0 && replaces != id) shown.erase(replaces);
    idsByIdentifier[request.identifier] = id;
    shown[id] = {std::make_shared<UNNotification>(Date::now(), request), options, false};
    return nullptr;
  }

  // A signal of the server, on the listener thread.
  void heard(const char* member, GVariant* parameters) {
    std::shared_ptr<UNNotificationResponse> response;
    const std::string name = member;
    {
      std::lock_guard lock(mutex);
      guint32 id = 0;
      if (name == "ActionInvoked" && g_variant_is_of_type(parameters, G_VARIANT_TYPE("(us)"))) {
        const gchar* action = nullptr;
        g_variant_get(parameters, "(u&s)", &id, &action);
        auto it = shown.find(id);
        if (it == shown.end()) return;
        it->second.answered = true;
        const std::string identifier = action;
        response = std::make_shared<UNNotificationResponse>(
            it->second.notification,
            identifier == "default" ? UNNotificationDefaultActionIdentifier : identifier);
      } else if (name == "NotificationReplied" &&
                 g_variant_is_of_type(parameters, G_VARIANT_TYPE("(us)"))) {
        const gchar* reply = nullptr;
        g_variant_get(parameters, "(u&s)", &id, &reply);
        auto it = shown.find(id);
        if (it == shown.end()) return;
        it->second.answered = true;
        response = std::make_shared<UNTextInputNotificationResponse>(it->second.notification,
                                                                     "inline-reply", reply);
      } else if (name == "NotificationClosed" &&
                 g_variant_is_of_type(parameters, G_VARIANT_TYPE("(uu)"))) {
        guint32 reason = 0;
        g_variant_get(parameters, "(uu)", &id, &reason);
        auto it = shown.find(id);
        if (it == shown.end()) return;
        if (reason == kDismissedByUser && !it->second.answered &&
            (it->second.options & UNNotificationCategoryOptionCustomDismissAction)) {
          response = std::make_shared<UNNotificationResponse>(
              it->second.notification, UNNotificationDismissActionIdentifier);
        }
        auto byIdentifier = idsByIdentifier.find(it->second.notification->request().identifier);
        if (byIdentifier != idsByIdentifier.end() && byIdentifier->second == id) {
          idsByIdentifier.erase(byIdentifier);
        }
        shown.erase(it);
      }
    }
    if (!response) return;
    auto receiver = delegateNow();
    if (receiver) {
      receiver->didReceiveNotificationResponse(
          UNUserNotificationCenter::currentNotificationCenter(), response, [] {});
    }
  }

  std::shared_ptr<UNUserNotificationCenterDelegate> delegateNow() {
    std::lock_guard lock(mutex);
    return delegate.lock();
  }
};

UNUserNotificationCenter::UNUserNotificationCenter() : impl_(std::make_unique<Impl>()) {}

UNUserNotificationCenter::~UNUserNotificationCenter() = default;

std::shared_ptr<UNUserNotificationCenter> UNUserNotificationCenter::currentNotificationCenter() {
  // Made once and kept for the life of the process: its listener thread may
  // be delivering a response while static objects are destroyed.
  static const auto* center =
      new std::shared_ptr<UNUserNotificationCenter>(new UNUserNotificationCenter());
  return *center;
}

std::shared_ptr<UNUserNotificationCenterDelegate> UNUserNotificationCenter::delegate() {
  return impl_->delegateNow();
}

void UNUserNotificationCenter::setDelegate(
    const std::shared_ptr<UNUserNotificationCenterDelegate>& delegate) {
  std::lock_guard lock(impl_->mutex);
  impl_->delegate = delegate;
}

void UNUserNotificationCenter::add(const UNNotificationRequest& request,
                                   std::function<void(const ErrorPtr& error)> completionHandler) {
  Impl* impl = impl_.get();
  if (request.trigger && !(request.trigger->timeInterval > 0)) {
    impl->queue->async([completionHandler = std::move(completionHandler)] {
      if (!completionHandler) return;
      completionHandler(Error::create(
          UNErrorDomain, UNErrorCodeNotificationInvalidNoDate,
          {{LocalizedDescriptionKey, "The trigger's time interval must be positive."}}));
    });
    return;
  }
  auto work = [impl, request, completionHandler = std::move(completionHandler)] {
    ErrorPtr error = impl->send(request);
    if (completionHandler) completionHandler(error);
  };
  if (!request.trigger) {
    impl->queue->async(std::move(work));
    return;
  }
  const auto delay = std::chrono::duration_cast<std::chrono::nanoseconds>(
      std::chrono::duration<double>(std::min(request.trigger->timeInterval, 1e9)));
  impl->queue->asyncAfter(DispatchClock::system()->now() + delay, std::move(work));
}

void UNUserNotificationCenter::requestAuthorization(
    UNAuthorizationOptions options,
    std::function<void(bool granted, const ErrorPtr& error)> completionHandler) {
  (void)options;
  Impl* impl = impl_.get();
  impl->queue->async([impl, completionHandler = std::move(completionHandler)] {
    ErrorPtr error = impl->authorize();
    if (completionHandler) completionHandler(error == nullptr, error);
  });
}

void UNUserNotificationCenter::getNotificationCategories(
    std::function<void(const std::set<UNNotificationCategory>& categories)> completionHandler) {
  if (!completionHandler) return;
  std::set<UNNotificationCategory> categories;
  {
    std::lock_guard lock(impl_->mutex);
    categories = impl_->categories;
  }
  impl_->queue->async(
      [categories = std::move(categories), completionHandler = std::move(completionHandler)] {
        completionHandler(categories);
      });
}

void UNUserNotificationCenter::setNotificationCategories(
    const std::set<UNNotificationCategory>& categories) {
  std::lock_guard lock(impl_->mutex);
  impl_->categories = categories;
}

}  // namespace kivi
