// RunLoop: a thread's loop that waits for work and runs it, in the
// platform's NSRunLoop shape: blocks performed on it, timers added to it and,
// on the main thread, the main dispatch queue.
//
// Every thread has one (currentRunLoop()); it does something only while its
// thread runs it, in one mode at a time. A block or timer belongs to the
// modes it was added for: a run in mode "modal" never fires a timer added
// only for the default mode. NSRunLoopCommonModes stands for every common
// mode; the default mode is the one common mode. The main dispatch queue's
// work runs while the main run loop runs in a common mode.
//
//   auto loop = kivi::RunLoop::currentRunLoop();
//   loop->addTimer(kivi::Timer::create(0.1, true, tick), kivi::NSDefaultRunLoopMode);
//   loop->runUntilDate(kivi::Date::now().addingTimeInterval(2));
//
// A host whose toolkit owns the main thread's loop (GLib, Qt) never calls
// run(); it watches pollDescriptor() and calls runPendingWork() when the
// descriptor is readable:
//
//   auto loop = kivi::RunLoop::mainRunLoop();
//   g_unix_fd_add(loop->pollDescriptor(), G_IO_IN,
//                 [](int, GIOCondition, gpointer) -> gboolean {
//                   kivi::RunLoop::mainRunLoop()->runPendingWork();
//                   return G_SOURCE_CONTINUE;
//                 }, nullptr);
//
// How a run ends (as on the platform): run(mode, limit) returns false at once
// when the mode has nothing in it (no timer, no block, and for the main run
// loop not a common mode); otherwise it waits and returns true after it has
// run main-queue work, when the limit passes, or when the mode has emptied.
// Timers and performed blocks run without ending it. runUntilDate() repeats
// it until the limit, run() for good; both return at once when the default
// mode is empty. Runs nest: a block may run the loop again, in any mode.
//
// Thread contract: run(), runMode(), runUntilDate() and runPendingWork() only
// on the run loop's own thread; addTimer(), perform() and pollDescriptor()
// from any thread.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/dispatch/kiv_ns_run_loop_protocol.h"
#include "kivi/dispatch/timer.h"
#include "kivi/export.h"

namespace kivi {

class RunLoop;
// How run loops are held.
using RunLoopPtr = std::shared_ptr<RunLoop>;

class KIVI_EXPORT RunLoop : public Object, public KivNSRunLoopProtocol {
 public:
  // The calling thread's run loop, made on first use; it lives as long as
  // its thread.
  static RunLoopPtr currentRunLoop();
  // The main thread's run loop, from any thread.
  static RunLoopPtr mainRunLoop();

  ~RunLoop() override;

  // The mode of the innermost run under way, if any.
  std::optional<RunLoopMode> currentMode() const;

  // run(), runUntilDate:, runMode:beforeDate:.
  void run() override;
  void runUntilDate(Date limitDate) { run(limitDate); }
  bool runMode(const RunLoopMode& mode, Date limitDate) { return run(mode, limitDate); }
  void run(Date limitDate) override;
  bool run(const RunLoopMode& mode, Date limitDate) override;

  // performInModes:block:, performBlock: — the block runs once, on the run
  // loop's thread, in the first run in one of `modes` (performBlock: the
  // common modes), in the order blocks were given. An empty mode name in
  // `modes` is ignored; no usable mode, no block.
  void performInModes(const std::vector<RunLoopMode>& modes, std::function<void()> block) {
    perform(modes, std::move(block));
  }
  // performBlock() is performInModes() for the common modes; the perform() overloads are the
  // protocol's names for the two.
  void performBlock(std::function<void()> block) { perform(std::move(block)); }
  void perform(const std::vector<RunLoopMode>& modes, std::function<void()> block) override;
  void perform(std::function<void()> block) override;

  // addTimer:forMode: — the run loop holds the timer until it is
  // invalidated. Adding an invalid timer, or for an empty mode name, does
  // nothing.
  void addTimer(const TimerPtr& timer, const RunLoopMode& mode);

  // For a host loop: a descriptor that is readable while the run loop has
  // work that runPendingWork() would run (a block or main-queue work, or a
  // timer of a common mode that is due). It stays the same for the run
  // loop's life; the host must not read, write or close it.
  int pollDescriptor() const noexcept;
  // Runs, without waiting, what is due in the default mode: performed
  // blocks, main-queue work (on the main run loop) and due timers.
  void runPendingWork();

  std::string className() const override;

  struct Core;
  // Internal.
  explicit RunLoop(bool isMain);
  Core& core() const noexcept { return *core_; }

 private:
  std::shared_ptr<Core> core_;
};

}  // namespace kivi
