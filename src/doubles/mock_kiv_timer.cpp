#include "kivi/doubles/mock_kiv_timer.h"

namespace kivi {

void MockKivTimer::start() {
  if (startTimerBlock) startTimerBlock();
}

void MockKivTimer::cancel() {
  if (cancelTimerBlock) cancelTimerBlock();
}

}  // namespace kivi
