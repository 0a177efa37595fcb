// HTTPS against a real nginx: connections shared by concurrent requests.
#include <gtest/gtest.h>

#include <cstdlib>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "kivi/net/url_session.h"
#include "nginx_server.h"

namespace kivi {
namespace {

using testing::Signal;

struct Answers {
  std::set<std::string> connections;  // nginx's connection numbers
  std::set<std::string> versions;
  int failures = 0;
};

// Resumes `count` requests at once and waits for them all.
Answers fetchAtOnce(const URLSessionPtr& session, const std::string& url, int count) {
  auto done = std::make_shared<Signal>();
  auto answers = std::make_shared<Answers>();
  auto mutex = std::make_shared<std::mutex>();
  std::vector<URLSessionDataTaskPtr> tasks;
  for (int i = 0; i < count; ++i) {
    tasks.push_back(session->dataTaskWithURL(
        URL::URLWithString(url),
        [=](std::optional<Data> data, HTTPURLResponsePtr response, ErrorPtr error) {
          std::lock_guard lock(*mutex);
          if (error || !data || !response) {
            ++answers->failures;
            ADD_FAILURE() << (error ? error->description() : "no answer");
          } else {
            const std::string body(data->begin(), data->end());
            answers->connections.insert(body);
            answers->versions.insert(response->HTTPVersion());
          }
          done->notify();
        }));
  }
  for (const auto& task : tasks) task->resume();
  EXPECT_TRUE(done->wait(count));
  std::lock_guard lock(*mutex);
  return *answers;
}

// Over HTTP/2 concurrent requests to one host share one connection; over
// HTTP/1.1 they use at most the per-host limit; either way a second round
// adds no connections beyond that.
TEST(URLSessionTLS, ConcurrentRequestsShareConnections) {
  if (!testing::NginxServer::available()) GTEST_SKIP() << "nginx or openssl is not installed";
  testing::NginxServer nginx;
  ASSERT_TRUE(nginx.started()) << "nginx did not start";
  // The session trusts what OpenSSL's SSL_CERT_FILE names, read when it is made.
  ::setenv("SSL_CERT_FILE", nginx.certificateFile().c_str(), 1);
  const auto configuration = URLSessionConfiguration::defaultSessionConfiguration();
  for (const bool http2 : {true, false}) {
    SCOPED_TRACE(http2 ? "HTTP/2" : "HTTP/1.1");
    auto session = URLSession::sessionWithConfiguration(configuration);
    const std::string url = http2 ? nginx.http2URL() : nginx.http1URL();
    const Answers first = fetchAtOnce(session, url, 64);
    EXPECT_EQ(first.versions, std::set<std::string>{http2 ? "HTTP/2" : "HTTP/1.1"});
    const std::size_t limit =
        http2 ? 1 : static_cast<std::size_t>(configuration.HTTPMaximumConnectionsPerHost);
    EXPECT_LE(first.connections.size(), limit);
    // The second round keeps to the same connections (or opens the rest of
    // what the limit allows).
    Answers second = fetchAtOnce(session, url, 64);
    second.connections.insert(first.connections.begin(), first.connections.end());
    EXPECT_LE(second.connections.size(), limit);
  }
  ::unsetenv("SSL_CERT_FILE");
}

}  // namespace
}  // namespace kivi
