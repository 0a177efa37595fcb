// Internal: a window on NSDistributedLock's attempts, for tests that count
// them or act between them.
#pragma once

#include <functional>
#include <string>

namespace kivi::detail {

// For tests: `observer(path, taken)` is called after every attempt to create
// a lock directory, by any NSDistributedLock in the process, on the attempting
// thread and outside the lock object's own state guard (so it may call into
// lock objects). An empty function removes the observer.
void setDistributedLockAttemptObserverForTesting(
    std::function<void(const std::string& path, bool taken)> observer);

}  // namespace kivi::detail
