// What a session holds on to: descriptors, connections, memory for a body.
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <thread>
#include <vector>

#include "kivi/net/url_session.h"
#include "test_servers.h"

namespace kivi {
namespace {

using testing::openDescriptors;
using testing::RawConnection;
using testing::RawServer;
using testing::Signal;

// The count once it has stopped changing.
std::size_t settledDescriptors() {
  std::size_t count = openDescriptors();
  for (int round = 0; round < 100; ++round) {
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    const std::size_t now = openDescriptors();
    if (now == count) break;
    count = now;
  }
  return count;
}

// Waits until no more descriptors are open than `limit`; the count at the end.
std::size_t descriptorsSettleTo(std::size_t limit) {
  const auto deadline = std::chrono::steady_clock::now() + testing::kTimeout;
  std::size_t count = openDescriptors();
  while (count > limit && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
    count = openDescriptors();
  }
  return count;
}

// Answers every request on a connection with {} until the client goes.
void keepAlive(RawConnection& connection) {
  while (connection.readRequest()) {
    if (!connection.write("HTTP/1.1 200 OK\r\nContent-Type: application/json\r\n"
                          "Content-Length: 2\r\n\r\n{}"))
      return;
  }
}

struct Outcome {
  std::optional<Data> data;
  HTTPURLResponsePtr response;
  ErrorPtr error;
};

// Runs one request to its end.
Outcome fetch(const URLSessionPtr& session, const std::string& url,
              URLSessionTaskPtr* kept = nullptr) {
  auto outcome = std::make_shared<Outcome>();
  auto done = std::make_shared<Signal>();
  auto task = session->dataTaskWithURL(
      URL::URLWithString(url), [outcome, done](auto data, auto response, auto error) {
        *outcome = {std::move(data), std::move(response), std::move(error)};
        done->notify();
      });
  task->resume();
  EXPECT_TRUE(done->wait()) << url;
  if (kept) *kept = task;
  return *outcome;
}

URLSessionPtr newSession(URLSessionConfiguration configuration = {}) {
  return URLSession::sessionWithConfiguration(std::move(configuration));
}

// Finished tasks, kept as operations keep theirs, hold nothing of their
// released sessions: no connection, no descriptor.
TEST(URLSessionResources, ReleasedSessionsLeaveNoDescriptorsBehind) {
  RawServer server(keepAlive);
  fetch(newSession(), server.url());  // the library's own threads and tables now exist
  const std::size_t before = settledDescriptors();
  std::vector<URLSessionTaskPtr> kept(100);
  for (auto& task : kept) {
    const Outcome outcome = fetch(newSession(), server.url(), &task);
    EXPECT_EQ(outcome.response ? outcome.response->statusCode() : 0, 200);
  }
  EXPECT_LE(descriptorsSettleTo(before), before);
  // An invalidated session lets go once its last task is done.
  auto session = newSession();
  fetch(session, server.url());
  session->finishTasksAndInvalidate();
  EXPECT_LE(descriptorsSettleTo(before), before);
}

// Connections stay open between requests and are reused: requests that run a
// few at a time, as a service limited to 8 sends them, open no more
// connections than ran at once.
TEST(URLSessionResources, KeepsAndReusesConnections) {
  RawServer server(keepAlive);
  auto session = newSession();
  constexpr int kWorkers = 4, kEach = 16;
  std::vector<std::thread> workers;
  std::atomic<int> ok{0};
  for (int w = 0; w < kWorkers; ++w) {
    workers.emplace_back([&] {
      for (int i = 0; i < kEach; ++i) {
        const Outcome outcome = fetch(session, server.url());
        if (outcome.response && outcome.response->statusCode() == 200) ++ok;
        // A pause with fewer transfers running than connections open.
        if (i % 4 == 0) std::this_thread::sleep_for(std::chrono::milliseconds(2));
      }
    });
  }
  for (auto& worker : workers) worker.join();
  EXPECT_EQ(ok, kWorkers * kEach);
  EXPECT_LE(server.connections(), kWorkers);
}

// A body over the session's maximum ends the task with "data length exceeds
// maximum", whether its length is declared or it keeps coming; one of exactly
// the maximum is delivered whole.
TEST(URLSessionResources, BodiesOverTheMaximumFail) {
  constexpr std::size_t kMaximum = 1 << 20;
  const std::string chunk = "10000\r\n" + std::string(0x10000, 'x') + "\r\n";
  RawServer server([&](RawConnection& connection) {
    const auto request = connection.readRequest();
    if (!request) return;
    const std::string head = "HTTP/1.1 200 OK\r\nContent-Type: text/plain\r\n";
    if (request->starts_with("GET /declared ")) {
      connection.write(head + "Content-Length: " + std::to_string(kMaximum + 1) + "\r\n\r\n");
      connection.readRequest();  // holds the connection until the client goes
    } else if (request->starts_with("GET /exact ")) {
      connection.write(head + "Content-Length: " + std::to_string(kMaximum) + "\r\n\r\n" +
                       std::string(kMaximum, 'x'));
    } else {  // chunks without end, until the client goes
      if (!connection.write(head + "Transfer-Encoding: chunked\r\n\r\n")) return;
      while (connection.write(chunk)) {
      }
    }
  });
  URLSessionConfiguration configuration;
  configuration.maximumResponseBodyBytes = kMaximum;
  auto session = newSession(configuration);
  for (const char* path : {"/declared", "/endless"}) {
    SCOPED_TRACE(path);
    const Outcome outcome = fetch(session, server.url(path));
    ASSERT_NE(outcome.error, nullptr);
    EXPECT_EQ(outcome.error->code(), URLErrorDataLengthExceedsMaximum);
    EXPECT_FALSE(outcome.data);
  }
  const Outcome exact = fetch(session, server.url("/exact"));
  EXPECT_EQ(exact.error, nullptr);
  EXPECT_EQ(exact.data ? exact.data->size() : 0, kMaximum);
}

}  // namespace
}  // namespace kivi
