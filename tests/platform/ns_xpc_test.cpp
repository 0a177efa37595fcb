#include "kivi/platform/ns_xpc.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "kivi/doubles/mock_kiv_ns_xpc_listener.h"
#include "kivi/platform/platform_types.h"
#include "test_support.h"

namespace kivi {
namespace {

// A delegate that answers as told and exports `exported`.
class Delegate : public NSXPCListenerDelegate {
 public:
  std::atomic<bool> accept = true;
  const ObjectPtr exported = std::make_shared<NSObject>();
  std::vector<std::shared_ptr<NSXPCConnection>> seen;  // read only from one thread

  bool listener(const std::shared_ptr<NSXPCListener>&,
                const std::shared_ptr<NSXPCConnection>& connection) override {
    {
      std::lock_guard lock(mutex);
      seen.push_back(connection);
    }
    if (!accept) return false;
    connection->setExportedObject(exported);
    connection->resume();
    return true;
  }
  std::mutex mutex;
};

struct Client {
  std::shared_ptr<NSXPCConnection> connection;
  std::shared_ptr<int> invalidations = std::make_shared<int>(0);

  explicit Client(const std::shared_ptr<NSXPCListenerEndpoint>& endpoint)
      : connection(NSXPCConnection::create(endpoint)) {
    connection->setInvalidationHandler([n = invalidations] { ++*n; });
  }
};

TEST(NSXPC, AcceptedConnectionReachesTheExportedObjectBothWays) {
  auto delegate = std::make_shared<Delegate>();
  auto listener = NSXPCListener::anonymousListener();
  listener->setDelegate(delegate);
  listener->resume();
  EXPECT_EQ(listener->endpoint(), listener->endpoint());

  Client client(listener->endpoint());
  auto clientExport = std::make_shared<NSObject>();
  client.connection->setExportedObject(clientExport);
  EXPECT_EQ(client.connection->remoteObjectProxy(), nullptr) << "nothing before resume";
  client.connection->resume();
  EXPECT_EQ(client.connection->remoteObjectProxy(), delegate->exported);
  ASSERT_EQ(delegate->seen.size(), 1u);
  EXPECT_EQ(delegate->seen[0]->remoteObjectProxy(), clientExport);
  client.connection->resume();  // again: nothing
  EXPECT_EQ(delegate->seen.size(), 1u);
  EXPECT_EQ(*client.invalidations, 0);
}

// Refusal and invalidation: both ends end, each handler runs exactly once,
// the proxy is gone.
TEST(NSXPC, RefusalAndInvalidationEndBothSidesOnce) {
  auto delegate = std::make_shared<Delegate>();
  auto listener = NSXPCListener::anonymousListener();
  listener->setDelegate(delegate);
  listener->resume();

  delegate->accept = false;
  Client refused(listener->endpoint());
  refused.connection->resume();
  EXPECT_EQ(*refused.invalidations, 1);
  EXPECT_EQ(refused.connection->remoteObjectProxy(), nullptr);
  refused.connection->invalidate();
  EXPECT_EQ(*refused.invalidations, 1);

  delegate->accept = true;
  Client client(listener->endpoint());
  client.connection->resume();
  auto serverEnd = delegate->seen.back();
  int serverInvalidations = 0;
  serverEnd->setInvalidationHandler([&] { ++serverInvalidations; });
  serverEnd->invalidate();  // from the listener's side
  EXPECT_EQ(*client.invalidations, 1);
  EXPECT_EQ(serverInvalidations, 1);
  EXPECT_EQ(client.connection->remoteObjectProxy(), nullptr);
  client.connection->invalidate();
  serverEnd->invalidate();
  EXPECT_EQ(*client.invalidations, 1);
  EXPECT_EQ(serverInvalidations, 1);

  // Releasing a client ends the listener's side.
  auto released = std::make_unique<Client>(listener->endpoint());
  released->connection->resume();
  int releasedServerSide = 0;
  delegate->seen.back()->setInvalidationHandler([&] { ++releasedServerSide; });
  released.reset();
  EXPECT_EQ(releasedServerSide, 1);
}

// Connections wait for a listener that is not resumed yet; a listener that
// is invalidated, gone or without a delegate refuses.
TEST(NSXPC, ListenerStateDecidesTheOutcome) {
  auto delegate = std::make_shared<Delegate>();
  auto listener = NSXPCListener::anonymousListener();
  listener->setDelegate(delegate);
  Client early(listener->endpoint());
  early.connection->resume();
  EXPECT_TRUE(delegate->seen.empty());
  EXPECT_EQ(*early.invalidations, 0);
  listener->resume();
  EXPECT_EQ(early.connection->remoteObjectProxy(), delegate->exported);

  auto idle = NSXPCListener::anonymousListener();
  Client held(idle->endpoint());
  held.connection->resume();
  idle->invalidate();
  EXPECT_EQ(*held.invalidations, 1);
  Client late(idle->endpoint());
  late.connection->resume();
  EXPECT_EQ(*late.invalidations, 1);

  auto orphan = NSXPCListener::anonymousListener();
  orphan->resume();
  Client noDelegate(orphan->endpoint());
  noDelegate.connection->resume();
  EXPECT_EQ(*noDelegate.invalidations, 1);

  auto endpoint = orphan->endpoint();
  orphan.reset();
  Client gone(endpoint);
  gone.connection->resume();
  EXPECT_EQ(*gone.invalidations, 1);

  Client nowhere(nullptr);
  nowhere.connection->resume();
  EXPECT_EQ(*nowhere.invalidations, 1);

  auto forgotten = std::make_shared<Delegate>();
  auto weakly = NSXPCListener::anonymousListener();
  weakly->setDelegate(forgotten);
  forgotten.reset();
  EXPECT_EQ(weakly->delegate(), nullptr) << "the delegate is held weakly";
}

// Clients on several threads while the listener is resumed: every
// connection ends exactly once, accepted or not.
TEST(NSXPC, ConnectionsFromManyThreads) {
  auto listener = NSXPCListener::anonymousListener();
  auto endpoint = listener->endpoint();
  auto delegate = std::make_shared<Delegate>();
  listener->setDelegate(delegate);
  constexpr int kThreads = 4, kEach = 50;
  std::atomic<int> invalidations{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < kEach; ++i) {
        auto c = NSXPCConnection::create(endpoint);
        c->setInvalidationHandler([&] { ++invalidations; });
        c->resume();
        c->invalidate();
        c->invalidate();
      }
    });
  }
  listener->resume();
  for (auto& th : threads) th.join();
  EXPECT_EQ(invalidations.load(), kThreads * kEach);
}

// The listener double: a working listener that exports its object, or
// refuses when its callback says so.
TEST(MockKivNSXPCListener, ExportsItsObjectOrRefuses) {
  auto exported = std::make_shared<NSObject>();
  auto interface = NSXPCInterface::interfaceWithProtocol("Agent");
  auto service = std::make_shared<MockKivNSXPCListener>(interface, exported);
  EXPECT_EQ(service->listener()->delegate().get(),
            static_cast<NSXPCListenerDelegate*>(service.get()));
  EXPECT_EQ(service->endpoint(), service->listener()->endpoint());

  Client accepted(service->endpoint());
  accepted.connection->resume();
  EXPECT_EQ(accepted.connection->remoteObjectProxy(), exported);

  std::shared_ptr<NSXPCConnection> asked;
  service->shouldAcceptNewConnectionBlock = [&](const std::shared_ptr<NSXPCListener>& l,
                                                const std::shared_ptr<NSXPCConnection>& c) {
    EXPECT_EQ(l, service->listener());
    asked = c;
    return false;
  };
  Client refused(service->endpoint());
  refused.connection->resume();
  EXPECT_EQ(refused.connection->remoteObjectProxy(), nullptr);
  EXPECT_EQ(*refused.invalidations, 1);
  ASSERT_TRUE(asked);
  EXPECT_EQ(asked->exportedObject(), nullptr) << "a refused connection exports nothing";

  service->shouldAcceptNewConnectionBlock = [&](auto&&...) { return true; };
  Client again(service->endpoint());
  again.connection->resume();
  EXPECT_EQ(again.connection->remoteObjectProxy(), exported);

  auto endpoint = service->endpoint();
  service.reset();
  Client afterwards(endpoint);
  afterwards.connection->resume();
  EXPECT_EQ(*afterwards.invalidations, 1);
}

}  // namespace
}  // namespace kivi
