#include "kivi/timing/kiv_main_thread_runner.h"

#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/dispatch/thread.h"

namespace kivi {

void KivMainThreadRunner::runBlockOnMainThread(std::function<void()> block) {
  if (!block) return;
  if (Thread::isMainThread()) {
    block();
  } else {
    DispatchQueue::main()->async(std::move(block));
  }
}

void KivMainThreadRunner::syncRunBlockOnMainThread(const std::function<void()>& block) {
  if (!block) return;
  if (Thread::isMainThread()) {
    block();
  } else {
    DispatchQueue::main()->sync(block);
  }
}

}  // namespace kivi
