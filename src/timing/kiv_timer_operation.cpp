#include "kivi/timing/kiv_timer_operation.h"

#include "kivi/dispatch/thread.h"

namespace kivi {

void KivTimerOperation::main() { Thread::sleepForTimeInterval(timerInterval()); }

}  // namespace kivi
