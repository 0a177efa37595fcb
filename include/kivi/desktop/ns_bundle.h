// NSBundle: the running application seen as a bundle: where it is installed,
// its identifier and info dictionary (from its desktop entry) and the
// processor type of its executable.
//
//   auto bundle = kivi::NSBundle::mainBundle();
//   bundle->bundlePath();                                   // "/usr"
//   bundle->bundleIdentifier();                             // "org.example.Viewer"
//   bundle->objectForInfoDictionaryKey("CFBundleName");     // Value("Viewer")
//   bundle->executableArchitectures();                      // {0x01000007} on x86-64
//
// Where the facts come from:
//   - The executable is /proc/self/exe. The bundle path is the installation
//     prefix it lives under: for an executable in a directory named "bin" or
//     "sbin", that directory's parent (/usr/bin/viewer -> /usr,
//     /opt/viewer/bin/viewer -> /opt/viewer); for any other (a build
//     directory, /usr/lib/viewer/viewer) the executable's own directory.
//   - The desktop entry is, when GIO launched this process from one
//     (GIO_LAUNCHED_DESKTOP_FILE, with GIO_LAUNCHED_DESKTOP_FILE_PID our
//     pid), that entry; otherwise the first entry, in the order
//     $XDG_DATA_HOME/applications (default ~/.local/share/applications),
//     each $XDG_DATA_DIRS/applications (default /usr/local/share:/usr/share),
//     <bundle path>/share/applications, and by file name within a directory
//     (subdirectories after the files), whose TryExec, or else the program of
//     whose Exec, names this executable: by its absolute path, or by its file
//     name when the entry gives a bare name. Hidden entries do not count.
//   - bundleIdentifier is the entry's desktop-file id (its path below
//     "applications/" with "/" made "-", without ".desktop"); absent when
//     no entry names the executable.
//   - The info dictionary holds every key of the entry's [Desktop Entry]
//     group under its own name, as the text written there (of translated
//     keys such as "Name[de]", only those of the current locale), plus:
//       CFBundleIdentifier           the identifier
//       CFBundleName                 Name
//       CFBundleDisplayName          Name in the current locale
//       CFBundleExecutable           the executable's file name (always)
//       CFBundleShortVersionString   X-AppVersion
//       CFBundleVersion              X-AppVersion
//     (the entry's own Version key is the version of the file format, not
//     of the application, and is not used for these).
//   - executableArchitectures is read from the ELF header of the executable:
//     one processor-type number (NSBundleExecutableArchitecture…), absent for
//     a machine type without one.
//
// bundleWithPath(dir) makes the same for an installation prefix that is not
// this process's: its desktop entry is the first (by file name) in
// <dir>/share/applications, its executable the entry's TryExec or Exec
// program, absolute or found in <dir>/bin.
//
// Thread contract: immutable once made; share freely between threads.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/desktop/kiv_ns_bundle_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT NSBundle : public Object, public KivNSBundleProtocol {
 public:
  // The running application's bundle, read once.
  static std::shared_ptr<NSBundle> mainBundle();
  // The bundle installed under the directory `path`; null when `path` is not
  // a directory.
  static std::shared_ptr<NSBundle> bundleWithPath(const std::string& path);

  std::optional<std::string> bundleIdentifier() override;
  std::string bundlePath() override;
  std::optional<std::vector<std::int64_t>> executableArchitectures() override;
  Value objectForInfoDictionaryKey(const std::string& key) override;

  // The whole info dictionary.
  const Dictionary& infoDictionary() const { return info_; }
  // The executable's path; empty when the bundle has none.
  const std::string& executablePath() const { return executable_; }

  std::string className() const override { return "NSBundle"; }

  // Use mainBundle() or bundleWithPath().
  NSBundle(std::string path, std::string executable, std::optional<std::string> identifier,
           Dictionary info, std::optional<std::vector<std::int64_t>> architectures);

 private:
  const std::string path_;
  const std::string executable_;
  const std::optional<std::string> identifier_;
  const Dictionary info_;
  const std::optional<std::vector<std::int64_t>> architectures_;
};

}  // namespace kivi
