// Internal: how the main dispatch queue and the main run loop meet. The queue
// keeps its work; the main run loop runs it when it turns in a common mode
// (or when a host loop asks it to run what is pending).
#pragma once

namespace kivi::detail {

// Called by the main queue whenever it goes from empty to holding work: the
// main run loop wakes (and its descriptor becomes readable).
void mainQueueHasWork();

// Called by the main run loop on the main thread: runs the work the main
// queue held when the call began, in order. Work added meanwhile waits for
// the next call (mainQueueHasWork() is called for it again). Returns whether
// anything ran.
bool drainMainQueue();

}  // namespace kivi::detail
