// The kivi tool's own log: commands report their steps through logger(), and
// the global option --verbose (`kivi --verbose get URL`) makes those lines
// visible on standard error.
//
//   kivi::tool::logger().logInfo(nullptr, __FILE__, __func__, __LINE__,
//                                "fetching " + url);
//
// Without --verbose the logger has no delegate, so a log call costs a few
// loads and writes nothing. With it, each line reads
//
//   [info] kivi get_command.cpp:42 run: fetching https://example.com/
//
// (level, module, file name without its directories, line, function,
// message); aot lines are marked "aot-info", "aot-error" and so on.
//
// Thread contract: logger() may be used from any thread. Call
// enableVerboseLogging() once, before the command runs; lines from different
// threads are written whole, one at a time.
#pragma once

#include <iosfwd>

#include "kivi/logging/kiv_swift_sdk_logger.h"

namespace kivi::tool {

// The tool's logger; its default module is "kivi".
KivSwiftSdkLogger& logger();

// Whether enableVerboseLogging() was called: lets a command skip building
// log text that would be dropped.
bool verboseLoggingEnabled();

// Sends every line of logger() to `err` from now on. `err` must outlive all
// logging.
void enableVerboseLogging(std::ostream& err);

}  // namespace kivi::tool
