// The directory that stands for "/" when the system layer reads the
// machine's facts: /proc, /sys and /etc files, the firmware's serial number,
// the local time zone. Tests point it at a directory of their own to give the
// layer any answer, including broken ones; hosts never need to.
//
//   kivi::system::setRoot("/tmp/fake-machine");   // reads /tmp/fake-machine/proc/meminfo
//   std::string meminfo = kivi::system::pathUnderRoot("/proc/meminfo");
//   kivi::system::setRoot("");                    // back to the real machine
//
// Where a fact comes from a system call rather than a file (the machine name
// from uname, the process's own threads), the real machine answers only
// while the root is "/"; under another root the layer reads the file that
// Linux offers for the same fact (each reader says which).
//
// Thread contract: every function may be called from any thread; a reader
// that runs while the root changes reads wholly under the old or the new one.
#pragma once

#include <string>
#include <string_view>

#include "kivi/export.h"

namespace kivi::system {

// "/" unless a test has set another directory.
KIVI_EXPORT std::string root();
// An empty string or "/" restores the real machine.
KIVI_EXPORT void setRoot(std::string directory);
// True while no other root is set: facts come from the real machine.
KIVI_EXPORT bool isRealRoot();
// `absolutePath` (starting with "/") under the current root.
KIVI_EXPORT std::string pathUnderRoot(std::string_view absolutePath);
// The whole file under the root, or false when it cannot be read.
KIVI_EXPORT bool readFileUnderRoot(std::string_view absolutePath, std::string& contents);

}  // namespace kivi::system
