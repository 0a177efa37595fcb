// The workspace over the desktop portal, the file manager's D-Bus interface,
// xdg-open and GIO's desktop-entry launcher.
#include "kivi/desktop/ns_workspace.h"

#include <fcntl.h>
#include <gio/gdesktopappinfo.h>
#include <gio/gio.h>
#include <gio/gunixfdlist.h>
#include <unistd.h>

#include <filesystem>
#include <optional>
#include <string>
#include <system_error>
#include <utility>

#include "bounded_bus.h"
#include "desktop_entries.h"
#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/net/kiv_ns_url_protocol.h"
#include "kivi/process/ns_running_application.h"
#include "kivi/text/json_serialization.h"

namespace kivi {
namespace {

constexpr const char* kPortalService = "org.freedesktop.portal.Desktop";
constexpr const char* kPortalPath = "/org/freedesktop/portal/desktop";
constexpr const char* kOpenURIInterface = "org.freedesktop.portal.OpenURI";
constexpr const char* kFileManagerService = "org.freedesktop.FileManager1";
constexpr const char* kFileManagerPath = "/org/freedesktop/FileManager1";

ErrorPtr cocoaError(std::int64_t code, const std::string& reason, const std::string& debug = {},
                    const std::string& path = {}) {
  Dictionary userInfo{{LocalizedDescriptionKey, reason}};
  if (!debug.empty()) userInfo[DebugDescriptionErrorKey] = debug;
  if (!path.empty()) userInfo[FilePathErrorKey] = path;
  return Error::create(CocoaErrorDomain, code, std::move(userInfo));
}

// Takes and frees `error`, answering its message.
std::string consume(GError*& error) {
  std::string message = error ? error->message : "";
  g_clear_error(&error);
  return message;
}

// What a desktop service made of a request.
struct ServiceAnswer {
  enum Kind { Done, Missing, Failed } kind = Missing;
  ErrorPtr error;  // for Failed
};

// Calls `method` of a desktop service within the workspace's wait. Missing
// when there is no bus or nobody provides the method.
ServiceAnswer callService(const char* service, const char* path, const char* interface,
                          const char* method, GVariant* parameters, GUnixFDList* fds,
                          const std::string& what) {
  detail::BoundedBus bus(kNSWorkspaceTimeout);
  GError* error = nullptr;
  if (!bus.connect(&error)) {
    if (!bus.timedOut()) {
      g_clear_error(&error);
      if (parameters) g_variant_unref(g_variant_ref_sink(parameters));
      return {};
    }
    if (parameters) g_variant_unref(g_variant_ref_sink(parameters));
    return {ServiceAnswer::Failed,
            cocoaError(FeatureUnsupportedError, "The session bus did not answer in time.",
                       consume(error))};
  }
  GVariant* reply = bus.call(service, path, interface, method, parameters, "r", fds, &error);
  if (reply) {
    g_variant_unref(reply);
    return {ServiceAnswer::Done, nullptr};
  }
  if (!bus.timedOut() && detail::isServiceMissing(error)) {
    g_clear_error(&error);
    return {};
  }
  const std::string reason = bus.timedOut() ? "The " + what + " did not answer in time."
                                            : "The " + what + " refused the request.";
  return {ServiceAnswer::Failed, cocoaError(FeatureUnsupportedError, reason, consume(error))};
}

ServiceAnswer askPortal(const URL& url, const std::optional<std::string>& file) {
  GVariant* options = g_variant_new_array(G_VARIANT_TYPE("{sv}"), nullptr, 0);
  if (!file) {
    return callService(kPortalService, kPortalPath, kOpenURIInterface, "OpenURI",
                       g_variant_new("(ss@a{sv})", "", url.absoluteString().c_str(), options),
                       nullptr, "desktop portal");
  }
  const int fd = ::open(file->c_str(), O_PATH | O_CLOEXEC);
  if (fd < 0) {
    g_variant_unref(g_variant_ref_sink(options));
    return {ServiceAnswer::Failed,
            cocoaError(FileReadNoSuchFileError, "The file “" + *file + "” couldn’t be opened.", {},
                       *file)};
  }
  GUnixFDList* fds = g_unix_fd_list_new_from_array(&fd, 1);  // takes the descriptor
  ServiceAnswer answer =
      callService(kPortalService, kPortalPath, kOpenURIInterface, "OpenFile",
                  g_variant_new("(sh@a{sv})", "", 0, options), fds, "desktop portal");
  g_object_unref(fds);
  return answer;
}

void subprocessDone(GObject*, GAsyncResult* result, gpointer data) {
  *static_cast<GAsyncResult**>(data) = G_ASYNC_RESULT(g_object_ref(result));
}

gboolean subprocessTimeUp(gpointer data) {
  g_cancellable_cancel(static_cast<GCancellable*>(data));
  return G_SOURCE_REMOVE;
}

// Runs the first xdg-open on $PATH with `argument` and waits for its exit.
ErrorPtr runXdgOpen(const std::string& argument, const std::string& what) {
  gchar* program = g_find_program_in_path("xdg-open");
  if (!program) {
    return cocoaError(
        FeatureUnsupportedError,
        "No application can open “" + what + "”: there is neither a desktop portal nor xdg-open.");
  }
  const gchar* argv[] = {program, argument.c_str(), nullptr};
  GError* error = nullptr;
  GSubprocess* child =
      g_subprocess_newv(argv,
                        static_cast<GSubprocessFlags>(G_SUBPROCESS_FLAGS_STDOUT_SILENCE |
                                                      G_SUBPROCESS_FLAGS_STDERR_SILENCE),
                        &error);
  g_free(program);
  if (!child) {
    return cocoaError(FeatureUnsupportedError, "xdg-open could not be started.", consume(error));
  }
  GMainContext* context = g_main_context_new();
  g_main_context_push_thread_default(context);
  GCancellable* cancellable = g_cancellable_new();
  GSource* timer = g_timeout_source_new(static_cast<guint>(kNSWorkspaceTimeout.count()));
  g_source_set_callback(timer, &subprocessTimeUp, cancellable, nullptr);
  g_source_attach(timer, context);
  GAsyncResult* result = nullptr;
  g_subprocess_wait_async(child, cancellable, &subprocessDone, &result);
  while (!result) g_main_context_iteration(context, TRUE);
  const bool exited = g_subprocess_wait_finish(child, result, &error);
  g_object_unref(result);
  g_source_destroy(timer);
  g_source_unref(timer);
  while (g_main_context_iteration(context, FALSE)) {
  }
  g_main_context_pop_thread_default(context);
  g_object_unref(cancellable);
  g_main_context_unref(context);

  ErrorPtr failure;
  if (!exited) {
    // Left running; GIO reaps it when it ends.
    failure =
        cocoaError(FeatureUnsupportedError, "xdg-open did not finish in time.", consume(error));
  } else if (!g_subprocess_get_if_exited(child) || g_subprocess_get_exit_status(child) != 0) {
    const int status = g_subprocess_get_if_exited(child) ? g_subprocess_get_exit_status(child) : -1;
    // xdg-open's status 2 means that the file does not exist.
    failure = status == 2
                  ? cocoaError(FileReadNoSuchFileError,
                               "The file “" + what + "” couldn’t be opened.", {}, argument)
                  : cocoaError(FeatureUnsupportedError, "No application could open “" + what + "”.",
                               "xdg-open exited with status " + std::to_string(status));
  }
  g_object_unref(child);
  return failure;
}

// The path of an existing file that a file URL names, or the error.
std::optional<std::string> existingFile(const URL& url, ErrorPtr* error) {
  const std::optional<std::string> path = url.fileSystemRepresentation();
  std::error_code ignored;
  if (!path || !std::filesystem::exists(*path, ignored)) {
    const std::string shown = path ? *path : url.absoluteString();
    *error = cocoaError(
        FileReadNoSuchFileError,
        "The file “" + shown + "” couldn’t be opened because there is no such file.", {}, shown);
    return std::nullopt;
  }
  return path;
}

// Desktop-entry Exec quoting: a double-quoted argument with `"`, `` ` ``,
// `$` and `\` escaped, and every `%` doubled.
std::string execQuoted(const std::string& argument) {
  std::string quoted = "\"";
  for (char c : argument) {
    if (c == '"' || c == '`' || c == '$' || c == '\\') quoted += '\\';
    if (c == '%') quoted += '%';
    quoted += c;
  }
  return quoted + "\"";
}

struct LaunchResult {
  std::shared_ptr<NSRunningApplication> application;
  ErrorPtr error;
};

// The .desktop file an application URL names, or the error.
std::optional<std::string> entryPath(const URLPtr& applicationURL, ErrorPtr* error) {
  if (!applicationURL) {
    *error = cocoaError(FileNoSuchFileError, "No application was given.");
    return std::nullopt;
  }
  std::optional<std::string> path;
  if (applicationURL->isFileURL()) {
    path = applicationURL->fileSystemRepresentation();
  } else if (!applicationURL->scheme()) {
    const std::string text = applicationURL->path().value_or("");
    if (text.starts_with("/")) {
      path = text;
    } else if (auto found = detail::findDesktopEntry(text)) {
      return found;
    } else {
      *error = cocoaError(FileNoSuchFileError, "The application “" + text + "” can’t be found.");
      return std::nullopt;
    }
  }
  if (!path) {
    *error = cocoaError(FeatureUnsupportedError,
                        "“" + applicationURL->absoluteString() + "” does not name an application.");
    return std::nullopt;
  }
  std::error_code ignored;
  if (!std::filesystem::exists(*path, ignored)) {
    *error = cocoaError(FileReadNoSuchFileError, "The application “" + *path + "” can’t be found.",
                        {}, *path);
    return std::nullopt;
  }
  return path;
}

void launchedPid(GDesktopAppInfo*, GPid pid, gpointer data) { *static_cast<GPid*>(data) = pid; }

LaunchResult launch(const URLPtr& applicationURL, const std::vector<URLPtr>& urls,
                    const NSWorkspaceOpenConfiguration& configuration) {
  LaunchResult result;
  const std::optional<std::string> path = entryPath(applicationURL, &result.error);
  if (!path) return result;
  GDesktopAppInfo* info = nullptr;
  if (GKeyFile* entry = detail::loadDesktopEntry(*path)) {
    if (configuration.arguments.empty()) {
      info = g_desktop_app_info_new_from_filename(path->c_str());
    } else if (gchar* exec = g_key_file_get_string(entry, G_KEY_FILE_DESKTOP_GROUP,
                                                   G_KEY_FILE_DESKTOP_KEY_EXEC, nullptr)) {
      std::string command = exec;
      g_free(exec);
      for (const std::string& argument : configuration.arguments) {
        command += " " + execQuoted(argument);
      }
      g_key_file_set_string(entry, G_KEY_FILE_DESKTOP_GROUP, G_KEY_FILE_DESKTOP_KEY_EXEC,
                            command.c_str());
      info = g_desktop_app_info_new_from_keyfile(entry);
    }
    g_key_file_unref(entry);
  }
  if (!info) {
    result.error =
        cocoaError(FileReadCorruptFileError,
                   "“" + *path + "” is not an application that can be launched.", {}, *path);
    return result;
  }
  GAppLaunchContext* context = g_app_launch_context_new();
  for (const auto& [name, value] : configuration.environment) {
    g_app_launch_context_setenv(context, name.c_str(), value.c_str());
  }
  GList* uris = nullptr;
  for (const URLPtr& url : urls) {
    if (url) uris = g_list_append(uris, g_strdup(url->absoluteString().c_str()));
  }
  GPid pid = 0;
  GError* error = nullptr;
  const bool launched = g_desktop_app_info_launch_uris_as_manager(
      info, uris, context, G_SPAWN_SEARCH_PATH, nullptr, nullptr, &launchedPid, &pid, &error);
  g_list_free_full(uris, g_free);
  g_object_unref(context);
  g_object_unref(info);
  if (!launched) {
    result.error =
        cocoaError(FileReadUnknownError, "The application “" + *path + "” could not be launched.",
                   consume(error), *path);
    return result;
  }
  if (pid > 0)
    result.application = NSRunningApplication::runningApplicationWithProcessIdentifier(pid);
  return result;
}

void complete(NSWorkspaceCompletionHandler handler,
              std::function<std::pair<std::shared_ptr<NSRunningApplication>, ErrorPtr>()> work) {
  DispatchQueue::global()->async([handler = std::move(handler), work = std::move(work)] {
    auto [application, error] = work();
    if (handler) handler(application, error);
  });
}

}  // namespace

std::shared_ptr<NSWorkspace> NSWorkspace::sharedWorkspace() {
  static const std::shared_ptr<NSWorkspace> workspace(new NSWorkspace());
  return workspace;
}

ErrorPtr NSWorkspace::openURLReturningError(const URLPtr& url) {
  if (!url) return cocoaError(FeatureUnsupportedError, "No URL was given.");
  std::optional<std::string> file;
  if (url->isFileURL()) {
    ErrorPtr error;
    file = existingFile(*url, &error);
    if (!file) return error;
  }
  const ServiceAnswer answer = askPortal(*url, file);
  if (answer.kind == ServiceAnswer::Done) return nullptr;
  if (answer.kind == ServiceAnswer::Failed) return answer.error;
  return runXdgOpen(file ? *file : url->absoluteString(), file ? *file : url->absoluteString());
}

bool NSWorkspace::openURL(const URLPtr& url) { return openURLReturningError(url) == nullptr; }

void NSWorkspace::openURL(const URLPtr& url, const NSWorkspaceOpenConfiguration& configuration,
                          NSWorkspaceCompletionHandler completionHandler) {
  (void)configuration;
  auto self = std::static_pointer_cast<NSWorkspace>(shared_from_this());
  complete(std::move(completionHandler), [self, url] {
    return std::pair<std::shared_ptr<NSRunningApplication>, ErrorPtr>(
        nullptr, self->openURLReturningError(url));
  });
}

void NSWorkspace::openApplicationAtURL(const URLPtr& applicationURL,
                                       const NSWorkspaceOpenConfiguration& configuration,
                                       NSWorkspaceCompletionHandler completionHandler) {
  openURLs({}, applicationURL, configuration, std::move(completionHandler));
}

void NSWorkspace::noteFileSystemChanged(const std::string& path) { (void)path; }

URLPtr NSWorkspace::URLForApplicationWithBundleIdentifier(const std::string& bundleIdentifier) {
  const auto path = detail::findDesktopEntry(bundleIdentifier);
  return path ? URL::fileURLWithPath(*path) : nullptr;
}

void NSWorkspace::openURLs(const std::vector<URLPtr>& urls, const URLPtr& applicationURL,
                           const NSWorkspaceOpenConfiguration& configuration,
                           NSWorkspaceCompletionHandler completionHandler) {
  complete(std::move(completionHandler), [urls, applicationURL, configuration] {
    LaunchResult result = launch(applicationURL, urls, configuration);
    return std::pair(std::move(result.application), std::move(result.error));
  });
}

ErrorPtr NSWorkspace::activateFileViewerSelectingURLsReturningError(
    const std::vector<URLPtr>& fileURLs) {
  GVariantBuilder uris;
  g_variant_builder_init(&uris, G_VARIANT_TYPE("as"));
  URLPtr first;
  for (const URLPtr& url : fileURLs) {
    if (!url) continue;
    if (!first) first = url;
    g_variant_builder_add(&uris, "s", url->absoluteString().c_str());
  }
  if (!first) {
    g_variant_builder_clear(&uris);
    return nullptr;
  }
  const ServiceAnswer answer =
      callService(kFileManagerService, kFileManagerPath, "org.freedesktop.FileManager1",
                  "ShowItems", g_variant_new("(ass)", &uris, ""), nullptr, "file manager");
  if (answer.kind == ServiceAnswer::Done) return nullptr;
  if (answer.kind == ServiceAnswer::Failed) return answer.error;
  // No file manager: open the folder of the first item instead.
  const std::optional<std::string> path = first->fileSystemRepresentation();
  if (!path) return openURLReturningError(first);
  return openURLReturningError(
      URL::fileURLWithPath(std::filesystem::path(*path).parent_path().string()));
}

void NSWorkspace::activateFileViewerSelectingURLs(const std::vector<URLPtr>& fileURLs) {
  activateFileViewerSelectingURLsReturningError(fileURLs);
}

}  // namespace kivi
