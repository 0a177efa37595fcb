// MockKivTimer: a scriptable KivTimerProtocol.
//
// start() calls startTimerBlock and cancel() calls cancelTimerBlock, if set;
// without them both do nothing. The double counts nothing down and calls
// nothing by itself: a test fires "its timer" by calling the component's own
// callback when it chooses.
//
//   auto timer = std::make_shared<kivi::MockKivTimer>();
//   int starts = 0;
//   timer->startTimerBlock = [&] { ++starts; };
//   poller.setTimer(timer);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/timing/kiv_timer_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivTimer : public Object, public KivTimerProtocol {
 public:
  MockKivTimer() = default;

  // Called by start(); without it nothing happens.
  std::function<void()> startTimerBlock;
  // Called by cancel(); without it nothing happens.
  std::function<void()> cancelTimerBlock;

  void start() override;
  void cancel() override;

  std::string description() const override { return Object::description(); }
};

}  // namespace kivi
