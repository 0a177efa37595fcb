// NSRunningApplication: a process of this machine seen as an application,
// read from the process table (/proc), with its bundle identifier when it
// has one.
//
//   auto editors = kivi::NSRunningApplication::classObject()
//                      ->runningApplicationsWithBundleIdentifier("org.gnome.TextEditor");
//   for (auto& app : editors) app->terminate();
//   auto me = kivi::NSRunningApplication::currentApplication();
//
// The bundle identifier of a Linux process is the id of the desktop entry
// it was launched from ("org.gnome.TextEditor" for
// org.gnome.TextEditor.desktop). It is known from, in this order:
//   1. the process's systemd user-session unit, the last line of
//      /proc/<pid>/cgroup that names one of:
//        app-<launcher>-<id>-<n>.scope   (e.g. app-gnome-org.gnome.TextEditor-4123.scope)
//        app-<launcher>-<id>@<n>.service (e.g. app-gnome-org.gnome.TextEditor@c3f0.service)
//        app-<id>-<n>.scope / app-<id>@<n>.service
//        app-flatpak-<id>-<n>.scope      (a sandboxed application)
//      where <n> is a decimal number or a hex string and systemd's escapes
//      ("\x2d" for "-") are undone; <launcher> is one of the known
//      launchers (gnome, kde, xfce, cinnamon, mate, lxqt, budgie, dbus,
//      flatpak, snap, org.gnome.Shell…: see src/process) and is dropped;
//   2. otherwise GIO_LAUNCHED_DESKTOP_FILE in /proc/<pid>/environ (readable
//      for this user's processes only): the file name without ".desktop".
// A process with neither has no bundle identifier (nullopt); it is still an
// application for runningApplicationWithProcessIdentifier but is never found
// by runningApplicationsWithBundleIdentifier. This process's own identifier
// comes from the same rules applied to itself.
//
// The process table is read under kivi::system::root() (tests point it at a
// fake /proc). An object is a snapshot taken when it was made, except
// isTerminated(), which looks again (the pid's start time in
// /proc/<pid>/stat must still match, so a reused pid reads as terminated).
// localizedName() is the bundle identifier's last dot-separated component
// when there is one, else the process's command name (/proc/<pid>/comm);
// executableURL() the target of /proc/<pid>/exe when readable; launchDate()
// the start time from /proc/<pid>/stat and the boot time in /proc/stat.
//
// Thread contract: every member may be called from any thread; objects are
// immutable apart from what isTerminated() reads.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/net/url.h"
#include "kivi/process/kiv_ns_running_application_protocol.h"

namespace kivi {

namespace detail {
struct RunningApplicationSnapshot;
}  // namespace detail

class KIVI_EXPORT NSRunningApplication : public Object, public KivNSRunningApplicationProtocol {
 public:
  // The object to hold for the type-level lookup.
  static std::shared_ptr<KivNSRunningApplicationProtocol> classObject();
  // This process.
  static std::shared_ptr<NSRunningApplication> currentApplication();
  // The process `pid`; null when there is no such process.
  static std::shared_ptr<NSRunningApplication> runningApplicationWithProcessIdentifier(
      std::int32_t pid);
  // The same lookup as the type-level operation, as a static call.
  static std::vector<std::shared_ptr<NSRunningApplication>> runningApplications(
      const std::string& bundleIdentifier);

  // Type-level (answered by any object): the processes whose bundle
  // identifier equals `bundleIdentifier` exactly; empty for an empty
  // identifier.
  std::vector<std::shared_ptr<NSRunningApplication>> runningApplicationsWithBundleIdentifier(
      const std::string& bundleIdentifier) override;

  // The process id.
  std::int32_t processIdentifier() const;
  // The desktop entry's id (see above); nullopt when the process has none.
  std::optional<std::string> bundleIdentifier() const;
  // The program file; null when /proc/<pid>/exe cannot be read.
  URLPtr executableURL() const;
  // The bundle identifier's last component, else the command name; nullopt when neither is
  // known.
  std::optional<std::string> localizedName() const;
  // When the process started; nullopt when that cannot be read.
  std::optional<Date> launchDate() const;
  // Looks again: true once the process has ended (or its pid belongs to another process).
  bool isTerminated() const;
  // SIGTERM / SIGKILL; false when the process is gone or may not be
  // signalled. Always false under a fake process table.
  bool terminate();
  bool forceTerminate();

  std::string className() const override { return "NSRunningApplication"; }
  std::string description() const override;

  // For the lookups above: an application from its snapshot; null gives one with no process.
  explicit NSRunningApplication(std::shared_ptr<const detail::RunningApplicationSnapshot> snapshot);

 private:
  std::shared_ptr<const detail::RunningApplicationSnapshot> snapshot_;
};

}  // namespace kivi
