// The timing part of `kivi demo`.
#pragma once

#include <iosfwd>

namespace kivi::tool {

// Runs the timers, the main run loop, a main-thread semaphore wait, a
// key-value observer and two `kivi lock` children taking turns. Must be
// called on the main thread. Returns 0, or 1 after telling `err` what did not
// happen in time.
int runTimingDemo(std::ostream& out, std::ostream& err);

}  // namespace kivi::tool
