#include "kivi/foundation/url_session.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "network/test_servers.h"

namespace kivi {
namespace {

using testing::HttpServer;
using testing::RawConnection;
using testing::RawServer;

struct Reply {
  std::optional<Data> data;
  HTTPURLResponsePtr response;
  ErrorPtr error;
  std::thread::id thread;
  std::string body() const { return data ? std::string(data->begin(), data->end()) : ""; }
};

// A task and every completion it delivered.
struct Started {
  struct Replies {
    std::mutex mutex;
    std::vector<Reply> list;
    testing::Signal done;
    std::size_t count() {
      std::lock_guard lock(mutex);
      return list.size();
    }
  };
  URLSessionDataTaskPtr task;
  std::shared_ptr<Replies> replies = std::make_shared<Replies>();

  // The first completion, checked not to run on this (the resuming) thread.
  Reply first() const {
    EXPECT_TRUE(replies->done.wait()) << "the task never completed";
    std::lock_guard lock(replies->mutex);
    if (replies->list.empty()) return {};
    EXPECT_NE(replies->list[0].thread, std::this_thread::get_id());
    return replies->list[0];
  }
};

URLRequest request(const std::string& url, double timeout = 10) {
  return MutableURLRequest(URL::URLWithString(url), timeout);
}
Started create(const URLSessionPtr& session, const URLRequest& request) {
  Started started;
  started.task = session->dataTaskWithRequest(
      request, [replies = started.replies](std::optional<Data> data, HTTPURLResponsePtr response,
                                           ErrorPtr error) {
        {
          std::lock_guard lock(replies->mutex);
          replies->list.push_back({data, response, error, std::this_thread::get_id()});
        }
        replies->done.notify();
      });
  return started;
}
Started begin(const URLSessionPtr& session, const URLRequest& request) {
  Started started = create(session, request);
  started.task->resume();
  return started;
}
Reply send(const URLSessionPtr& session, const URLRequest& request) {
  return begin(session, request).first();
}
// Waits until every completion handed to the session's delegate queue has run.
void drain(const URLSessionPtr& session) {
  EXPECT_TRUE(testing::returnsWithin(
      [queue = session->delegateQueue()] { queue->waitUntilAllOperationsAreFinished(); }));
}

void expectURLError(const Reply& reply, const std::vector<std::int64_t>& codes,
                    const std::string& url) {
  ASSERT_NE(reply.error, nullptr);
  EXPECT_EQ(reply.error->domain(), URLErrorDomain);
  if (!codes.empty()) {
    EXPECT_THAT(reply.error->code(), ::testing::AnyOfArray(codes)) << reply.error->description();
  }
  EXPECT_FALSE(reply.error->localizedDescription().empty());
  EXPECT_EQ(reply.error->userInfo().count(URLErrorFailingURLErrorKey), 1u);
  const auto failing = reply.error->userInfo().find(URLErrorFailingURLStringErrorKey);
  ASSERT_NE(failing, reply.error->userInfo().end());
  EXPECT_EQ(failing->second, Value(url));
  EXPECT_EQ(reply.data, std::nullopt);
  EXPECT_EQ(reply.response, nullptr);
}

std::string answer(const std::string& body, const std::string& extraHeaders = "") {
  return "HTTP/1.1 200 OK\r\nContent-Type: text/plain\r\nContent-Length: " +
         std::to_string(body.size()) + "\r\n" + extraHeaders + "\r\n" + body;
}

class URLSessionTest : public ::testing::Test {
 protected:
  HttpServer http;  // outlives the session, which closes its connections first
  URLSessionPtr session =
      URLSession::sessionWithConfiguration(URLSessionConfiguration::defaultSessionConfiguration());
};

TEST_F(URLSessionTest, GetDeliversBodyStatusAndCanonicalHeaderNames) {
  const Reply reply = send(session, request(http.url("/hello")));
  ASSERT_EQ(reply.error, nullptr);
  EXPECT_EQ(reply.body(), "hello");
  EXPECT_EQ(reply.response->statusCode(), 200);
  EXPECT_EQ(reply.response->HTTPVersion(), "HTTP/1.1");
  EXPECT_EQ(reply.response->URL()->absoluteString(), http.url("/hello"));
  EXPECT_EQ(reply.response->MIMEType(), "text/plain");
  EXPECT_EQ(reply.response->allHeaderFields().count("x-thing"), 0u);
  EXPECT_EQ(reply.response->allHeaderFields().at("X-Thing"), "yes");
}

TEST_F(URLSessionTest, SendsMethodBodyAndCustomHeaders) {
  for (const char* method : {"POST", "PUT"}) {
    MutableURLRequest sent(URL::URLWithString(http.url("/echo")));
    sent.setHTTPMethod(method);
    sent.setHTTPBody(Data{'p', 'a', 'y'});
    sent.setValue("42", "X-Custom");
    EXPECT_EQ(send(session, sent).body(), std::string(method) + " pay");
    EXPECT_EQ(http.log.requests().back().values("X-Custom"), std::vector<std::string>{"42"});
  }
}

TEST_F(URLSessionTest, ReusesOneConnectionForSequentialRequestsAndFollowsRedirects) {
  RawServer raw([](RawConnection& connection) {
    for (int i = 0; i < 25 && connection.readRequest(); ++i) connection.write(answer("hi"));
  });
  for (int i = 0; i < 20; ++i) ASSERT_EQ(send(session, request(raw.url())).body(), "hi") << i;
  EXPECT_EQ(raw.log.count(), 20u);
  EXPECT_EQ(raw.connections(), 1);

  const Reply redirected = send(session, request(http.url("/redirect")));
  EXPECT_EQ(redirected.body(), "hello");
  ASSERT_NE(redirected.response, nullptr);
  EXPECT_EQ(redirected.response->URL()->absoluteString(), http.url("/hello"));
}

TEST_F(URLSessionTest, TransportFailuresMapToTheirURLErrors) {
  const std::pair<std::string, std::int64_t> cases[] = {
      {http.url("/loop"), URLErrorHTTPTooManyRedirects},
      {"http://127.0.0.1:" + std::to_string(testing::unusedPort()) + "/",
       URLErrorCannotConnectToHost},
      {"ftp://127.0.0.1/file", URLErrorUnsupportedURL},
  };
  for (const auto& [url, code] : cases) {
    SCOPED_TRACE(url);
    expectURLError(send(session, request(url)), {code}, url);
  }
}

TEST_F(URLSessionTest, MisbehavingServersFailTheTaskInTime) {
  enum class Then { close, reset, waitForClose };
  std::string lines;  // 10 MB of header lines
  for (int i = 0; lines.size() < (10 << 20); ++i)
    lines += "X-Filler-" + std::to_string(i) + ": " + std::string(1000, 'a') + "\r\n";
  const struct {
    const char* name;
    std::string bytes;  // written after reading the request
    Then then;
    double timeout;
    std::vector<std::int64_t> codes;  // empty: any URL error
  } cases[] = {
      {"no answer", "", Then::waitForClose, 0.3, {URLErrorTimedOut}},
      {"reset mid-body",
       "HTTP/1.1 200 OK\r\nContent-Length: 1000\r\n\r\n0123456789",
       Then::reset,
       10,
       {URLErrorNetworkConnectionLost}},
      {"10 MB of header lines",
       "HTTP/1.1 200 OK\r\n" + lines + "\r\n",
       Then::close,
       10,
       {URLErrorBadServerResponse}},
      {"one 1 MB header line",
       "HTTP/1.1 200 OK\r\nX-Big: " + std::string(1 << 20, 'a') + "\r\n\r\n",
       Then::close,
       10,
       {URLErrorBadServerResponse}},
      {"broken chunked encoding",
       "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\nhello\r\n0\r\n\r\n",
       Then::waitForClose,
       10,
       {}},
      {"not an HTTP answer",
       "hello there\r\n\r\n",
       Then::close,
       10,
       {URLErrorBadServerResponse, URLErrorCannotParseResponse}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    RawServer raw([&c](RawConnection& connection) {
      connection.readRequest();
      connection.write(c.bytes);
      if (c.then == Then::reset) connection.reset();
      if (c.then == Then::waitForClose) connection.waitForPeerClose();
    });
    const auto began = std::chrono::steady_clock::now();
    const Started started = begin(session, request(raw.url(), c.timeout));
    expectURLError(started.first(), c.codes, raw.url());
    const auto elapsed = std::chrono::steady_clock::now() - began;
    EXPECT_LT(elapsed, std::chrono::seconds(3));
    EXPECT_GE(elapsed, std::chrono::milliseconds(c.timeout < 1 ? 290 : 0));
    drain(session);
    EXPECT_EQ(started.replies->count(), 1u);
  }
}

TEST_F(URLSessionTest, ReadsNonUTF8HeaderBytesAsLatin1) {
  RawServer raw([](RawConnection& connection) {
    connection.readRequest();
    connection.write(answer("x", "X-Name: caf\xE9 \xFF\r\nX-Utf8: caf\xC3\xA9\r\n"));
  });
  const Reply reply = send(session, request(raw.url()));
  ASSERT_EQ(reply.error, nullptr);
  EXPECT_EQ(reply.response->valueForHTTPHeaderField("X-Name"), "caf\xC3\xA9 \xC3\xBF");
  EXPECT_EQ(reply.response->valueForHTTPHeaderField("X-Utf8"), "caf\xC3\xA9");
}

TEST_F(URLSessionTest, HeaderFieldsWithLineBreaksOrNulAreNeverSent) {
  RawServer raw([](RawConnection& connection) {
    if (connection.readRequest()) connection.write(answer("ok"));
  });
  const std::pair<std::string, std::string> fields[] = {{"X-Bad", "a\r\nInjected: 1"},
                                                        {"X-Bad", "a\nInjected: 1"},
                                                        {"X-Bad", std::string("a\0b", 3)},
                                                        {"X-Bad\r\nInjected", "1"}};
  for (const auto& [name, value] : fields) {
    MutableURLRequest bad(URL::URLWithString(raw.url()));
    bad.setValue(value, name);
    const Reply reply = send(session, bad);
    expectURLError(reply, {URLErrorBadURL}, raw.url());
    EXPECT_THAT(reply.error ? reply.error->localizedDescription() : "", ::testing::HasSubstr(name));
  }
  // Anything sent above would have reached the server before this request.
  EXPECT_EQ(send(session, request(raw.url())).body(), "ok");
  EXPECT_EQ(raw.log.count(), 1u);
  EXPECT_EQ(raw.connections(), 1);
}

TEST_F(URLSessionTest, CancelCompletesOnceWithCancelledBeforeResumeAndWhileRunning) {
  const Started early = create(session, request(http.url("/hello")));
  early.task->cancel();
  early.task->resume();
  early.task->cancel();
  expectURLError(early.first(), {URLErrorCancelled}, http.url("/hello"));

  const Started running = begin(session, request(http.url("/gate")));
  ASSERT_TRUE(http.log.arrived.wait());
  running.task->cancel();
  running.task->cancel();
  expectURLError(running.first(), {URLErrorCancelled}, http.url("/gate"));
  http.release();
  drain(session);
  for (const Started* started : {&early, &running}) {
    EXPECT_EQ(started->replies->count(), 1u);
    EXPECT_EQ(started->task->state(), URLSessionTask::State::completed);
    EXPECT_EQ(started->task->error() ? started->task->error()->code() : 0, URLErrorCancelled);
  }
  EXPECT_EQ(http.log.count(), 1u);  // only /gate
}

TEST_F(URLSessionTest, CancelRacingTheAnswerStillCompletesOnce) {
  constexpr int kTasks = 100;
  std::vector<Started> all;
  RawServer raw([&all](RawConnection& connection) {
    for (int i = 0; i < kTasks; ++i) {
      const auto received = connection.readRequest();
      if (!received) return;
      connection.write(answer("hi"));
      all[std::stoul(received->target.substr(1))].task->cancel();
    }
  });
  for (int i = 0; i < kTasks; ++i)
    all.push_back(create(session, request(raw.url("/" + std::to_string(i)))));
  for (const Started& started : all) {
    started.task->resume();
    const Reply reply = started.first();
    EXPECT_EQ(reply.error ? reply.error->code() : 0, reply.error ? URLErrorCancelled : 0);
    EXPECT_EQ(reply.body(), reply.error ? "" : "hi");
  }
  drain(session);
  for (const Started& started : all) {
    EXPECT_EQ(started.replies->count(), 1u);
    EXPECT_EQ(started.task->state(), URLSessionTask::State::completed);
  }
}

TEST_F(URLSessionTest, ReleasingTheSessionLetsRunningTasksFinish) {
  const Started started = begin(session, request(http.url("/gate")));
  ASSERT_TRUE(http.log.arrived.wait());
  session.reset();
  http.release();
  const Reply reply = started.first();
  ASSERT_EQ(reply.error, nullptr);
  EXPECT_EQ(reply.body(), "{\"ok\":true}");
}

TEST_F(URLSessionTest, InvalidateAndCancelCancelsRunningAndNewTasks) {
  const Started started = begin(session, request(http.url("/gate")));
  ASSERT_TRUE(http.log.arrived.wait());
  session->invalidateAndCancel();
  expectURLError(started.first(), {URLErrorCancelled}, http.url("/gate"));
  expectURLError(send(session, request(http.url("/hello"))), {URLErrorCancelled},
                 http.url("/hello"));
  EXPECT_EQ(http.log.count(), 1u);
}

}  // namespace
}  // namespace kivi
