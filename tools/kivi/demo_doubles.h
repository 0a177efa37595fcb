// The seams part of `kivi demo`: a host component handed doubles instead of
// the real process and workspace services.
#pragma once

#include <iosfwd>

namespace kivi::tool {

// Runs the component against MockKivProcessFactory and MockKivNSWorkspace and
// prints what their callbacks saw and answered. Nothing is started or opened.
// Returns 0, or 1 after telling `err` what went wrong.
int runDoublesDemo(std::ostream& out, std::ostream& err);

}  // namespace kivi::tool
