// MockKivNSRunLoop: a scriptable KivNSRunLoopProtocol.
//
// Every operation calls the matching callback property, if set, with its
// arguments unchanged and answers what it answers. Without a callback nothing
// runs (a performed block is dropped) and run(mode, date) answers false.
//
//   auto loop = std::make_shared<kivi::MockKivNSRunLoop>();
//   loop->performWithBlock = [](std::function<void()> block) { block(); };
//   component.setRunLoop(loop);  // its performed work now runs inline
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <vector>

#include "kivi/dispatch/kiv_ns_run_loop_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivNSRunLoop : public KivNSRunLoopProtocol {
 public:
  // Called by run(); without it the call returns at once.
  std::function<void()> runBlock;
  // Called by run(limitDate); without it the call returns at once.
  std::function<void(Date)> runUntilLimitDateBlock;
  // Answers run(mode, limitDate); without it, false.
  std::function<bool(const RunLoopMode&, Date)> runInModeBeforeLimitDateBlock;
  // Called by perform(modes, block); without it the block is dropped.
  std::function<void(const std::vector<RunLoopMode>&, std::function<void()>)>
      performInModesWithBlock;
  // Called by perform(block); without it the block is dropped.
  std::function<void(std::function<void()>)> performWithBlock;

  void run() override {
    if (runBlock) runBlock();
  }
  void run(Date limitDate) override {
    if (runUntilLimitDateBlock) runUntilLimitDateBlock(limitDate);
  }
  bool run(const RunLoopMode& mode, Date limitDate) override {
    return runInModeBeforeLimitDateBlock ? runInModeBeforeLimitDateBlock(mode, limitDate) : false;
  }
  void perform(const std::vector<RunLoopMode>& modes, std::function<void()> block) override {
    if (performInModesWithBlock) performInModesWithBlock(modes, std::move(block));
  }
  void perform(std::function<void()> block) override {
    if (performWithBlock) performWithBlock(std::move(block));
  }
};

}  // namespace kivi
