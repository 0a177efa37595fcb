// Around the whole network suite: every descriptor its tests open (sessions,
// connections, servers) is closed again by the end.
#include <gtest/gtest.h>

#include <chrono>
#include <thread>

#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/net/url_session.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::openDescriptors;

class DescriptorCheck : public ::testing::Environment {
 public:
  void SetUp() override {
    // What lives as long as the process is made first: the event thread's
    // descriptors and the shared session.
    auto timer = DispatchClock::system()->makeTimer([] {});
    timer->schedule(DispatchClock::system()->now());
    (void)URLSession::sharedSession();
    before_ = openDescriptors();
  }
  void TearDown() override {
    // Servers' threads and peers close their ends a moment later.
    std::size_t now = openDescriptors();
    for (int i = 0; i < 500 && now > before_; ++i) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
      now = openDescriptors();
    }
    EXPECT_LE(now, before_) << "descriptors left open by the network suite";
  }

 private:
  std::size_t before_ = 0;
};

const auto* const kCheck = ::testing::AddGlobalTestEnvironment(new DescriptorCheck);

}  // namespace
}  // namespace kivi
