// Internal: how the dispatch layer starts its threads. The system may refuse
// a thread (EAGAIN); callers undo their bookkeeping and try again later
// instead of letting the error escape.
#pragma once

#include <functional>

namespace kivi::detail {

// Starts a detached thread running `body`; false when the system refused.
bool startDetachedThread(std::function<void()> body) noexcept;

// For tests: the next `count` starts fail as if the system had refused them.
void failThreadStartsForTesting(int count) noexcept;

}  // namespace kivi::detail
