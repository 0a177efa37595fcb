#include "kivi/net/url_session.h"

#include <gtest/gtest.h>

#include "test_servers.h"

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

// A suspended task and every completion it delivers.
struct Started {
  struct Log {
    std::mutex mutex;
    std::vector<Reply> replies;
    testing::Signal done;
  };
  std::shared_ptr<Log> log = std::make_shared<Log>();
  URLSessionDataTaskPtr task;

  Started(const URLSessionPtr& session, const URLRequest& request)
      : task(session->dataTaskWithRequest(request, [log = log](auto... reply) {
          std::lock_guard lock(log->mutex);
          log->replies.push_back({reply..., std::this_thread::get_id()});
          log->done.notify();
        })) {}
  // The first completion, checked not to have run on this (the resuming) thread.
  Reply first() const {
    EXPECT_TRUE(log->done.wait()) << "the task never completed";
    std::lock_guard lock(log->mutex);
    if (log->replies.empty()) return {};
    EXPECT_NE(log->replies[0].thread, std::this_thread::get_id());
    return log->replies[0];
  }
  std::size_t count() const {
    std::lock_guard lock(log->mutex);
    return log->replies.size();
  }
};

URLRequest get(const std::string& url) { return URLRequest(URL::URLWithString(url), 10); }
Reply send(const URLSessionPtr& session, const URLRequest& request) {
  const Started started(session, request);
  started.task->resume();
  return started.first();
}
// Waits until every completion handed to the session's delegate queue has run.
void drain(const URLSessionPtr& session) {
  EXPECT_TRUE(testing::returnsWithin(
      [queue = session->delegateQueue()] { queue->waitUntilAllOperationsAreFinished(); }));
}
void expectCancelled(const Reply& reply) {
  EXPECT_EQ(reply.error ? reply.error->code() : 0, URLErrorCancelled);
  EXPECT_EQ(reply.data, std::nullopt);
  EXPECT_EQ(reply.response, nullptr);
}

class URLSessionTest : public ::testing::Test {
 protected:
  HttpServer http;  // outlives the session, which closes its connections first
  URLSessionPtr session =
      URLSession::sessionWithConfiguration(URLSessionConfiguration::defaultSessionConfiguration());
};

TEST_F(URLSessionTest, SendsTheRequestAndDeliversTheAnswer) {
  const struct {
    const char *method, *path, *finalPath;
  } cases[] = {{"GET", "/status/200", "/status/200"},
               {"GET", "/redirect", "/status/200"},
               {"POST", "/post", "/post"},
               {"PUT", "/put", "/put"},
               // The session reuses libcurl handles: nothing of the PUT may stay.
               {"GET", "/status/200", "/status/200"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path);
    MutableURLRequest sent(URL::URLWithString(http.url(c.path)));
    sent.setHTTPMethod(c.method);
    const bool withBody = std::string_view(c.method) != "GET";
    if (withBody) sent.setHTTPBody(Data{'p', 'a', 'y'});
    sent.setValue("42", "X-Custom");
    const Reply reply = send(session, sent);
    ASSERT_NE(reply.response, nullptr) << reply.error->description();
    EXPECT_EQ(reply.body(), withBody ? "{\"ok\":true}" : "{\"status\":200}");
    EXPECT_EQ(reply.response->statusCode(), 200);
    EXPECT_EQ(reply.response->HTTPVersion(), "HTTP/1.1");
    EXPECT_EQ(reply.response->URL()->absoluteString(), http.url(c.finalPath));
    // Names as the platform presents them, whatever the server sent.
    EXPECT_EQ(reply.response->allHeaderFields().count("x-thing"), 0u);
    EXPECT_EQ(reply.response->allHeaderFields().at("X-Thing"), "yes");
    const auto received = http.requests().back();
    EXPECT_EQ(received.method, c.method);
    EXPECT_EQ(received.body, withBody ? "pay" : "");
    EXPECT_EQ(received.headers.count("X-Custom"), 1u);
    EXPECT_EQ(received.headers.find("X-Custom")->second, "42");
  }
}

TEST_F(URLSessionTest, ReusesOneConnectionAndReadsOtherHeaderBytesAsLatin1) {
  RawServer raw([](RawConnection& connection) {
    while (connection.readRequest()) {
      connection.write(
          "HTTP/1.1 200 OK\r\nContent-Length: 2\r\nX-Name: caf\xE9 \xFF\r\n"
          "X-Utf8: caf\xC3\xA9\r\n\r\nhi");
    }
  });
  for (int i = 0; i < 20; ++i) {
    const Reply reply = send(session, get(raw.url()));
    ASSERT_EQ(reply.body(), "hi") << i;
    EXPECT_EQ(reply.response->valueForHTTPHeaderField("X-Name"), "caf\xC3\xA9 \xC3\xBF");
    EXPECT_EQ(reply.response->valueForHTTPHeaderField("X-Utf8"), "caf\xC3\xA9");
  }
  EXPECT_EQ(raw.connections(), 1);
}

// Names come out capitalised word by word whatever their letter case on the
// wire; a field sent several times is one entry, its values joined by ", " in
// arrival order.
TEST_F(URLSessionTest, CanonicalisesHeaderNamesAndJoinsRepeatedFields) {
  RawServer raw([](RawConnection& connection) {
    while (connection.readRequest()) {
      connection.write(
          "HTTP/1.1 200 OK\r\nCONTENT-TYPE: application/json\r\nx-rEQUEST-iD: 7\r\n"
          "X-Multi: a\r\nx-multi: b\r\nX-MULTI: c d\r\nWWW-Authenticate: x\r\n"
          "Content-Length: 2\r\n\r\n{}");
    }
  });
  const Reply reply = send(session, get(raw.url()));
  ASSERT_NE(reply.response, nullptr) << reply.error->description();
  EXPECT_EQ(reply.response->allHeaderFields(),
            (StringDictionary{{"Content-Length", "2"},
                              {"Content-Type", "application/json"},
                              {"Www-Authenticate", "x"},
                              {"X-Multi", "a, b, c d"},
                              {"X-Request-Id", "7"}}));
}

// The limit counts every header line as received, the status line and each
// CRLF included, up to and including the blank line: a block of exactly the
// limit is read, one byte more fails.
TEST_F(URLSessionTest, ResponseHeaderLimitIsExact) {
  constexpr std::size_t kLimit = 200;
  const auto head = [](std::size_t size) {
    std::string text = "HTTP/1.1 200 OK\r\nContent-Length: 2\r\nX-Pad: ";
    text += std::string(size - text.size() - 4, 'p') + "\r\n\r\n";
    return text;
  };
  std::atomic<std::size_t> size{0};
  RawServer raw([&](RawConnection& connection) {
    while (connection.readRequest()) connection.write(head(size) + "hi");
  });
  URLSessionConfiguration configuration;
  configuration.maximumResponseHeaderBytes = kLimit;
  for (const std::size_t bytes : {kLimit - 1, kLimit, kLimit + 1, kLimit + 2}) {
    SCOPED_TRACE(std::to_string(bytes) + " bytes of header");
    ASSERT_EQ(head(bytes).size(), bytes);
    size = bytes;
    const Reply reply = send(URLSession::sessionWithConfiguration(configuration), get(raw.url()));
    if (bytes <= kLimit) {
      EXPECT_EQ(reply.error, nullptr) << reply.error->description();
      EXPECT_EQ(reply.body(), "hi");
    } else {
      EXPECT_EQ(reply.error ? reply.error->code() : 0, URLErrorBadServerResponse);
      EXPECT_EQ(reply.response, nullptr);
    }
  }
}

TEST_F(URLSessionTest, EndingATaskOrItsSessionCompletesEachTaskOnce) {
  using End = std::function<void(URLSessionPtr&, URLSessionTask&)>;
  const struct {
    const char* name;
    bool beforeResume;  // `end` comes before resume(), which is then called
    End end;
    bool cancelled;
  } cases[] = {
      {"cancel before resume", true, [](auto&, auto& task) { task.cancel(); }, true},
      {"cancel while running", false, [](auto&, auto& task) { task.cancel(), task.cancel(); },
       true},
      {"invalidate and cancel", false, [](auto& ending, auto&) { ending->invalidateAndCancel(); },
       true},
      {"release the session", false,  // last: the gate then opens for good
       [this](auto& ending, auto&) { ending.reset(), http.release(); }, false},
  };
  std::size_t arrived = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    auto ending = URLSession::sessionWithConfiguration(URLSessionConfiguration{});
    const auto delegateQueue = ending->delegateQueue();
    const Started started(ending, get(http.url("/gate")));
    if (c.beforeResume) c.end(ending, *started.task);
    started.task->resume();
    if (!c.beforeResume) {
      ASSERT_TRUE(http.arrived.wait(++arrived));
      c.end(ending, *started.task);
    }
    const Reply reply = started.first();
    EXPECT_EQ(reply.body(), c.cancelled ? "" : "{\"ok\":true}");
    if (c.cancelled) expectCancelled(reply);
    if (ending && c.cancelled) started.task->cancel();  // too late: nothing happens
    EXPECT_TRUE(
        testing::returnsWithin([&] { delegateQueue->waitUntilAllOperationsAreFinished(); }));
    EXPECT_EQ(started.count(), 1u);
    EXPECT_EQ(started.task->state(), URLSessionTask::State::completed);
  }
  // Nothing is sent for a task cancelled before it ran, or after invalidation.
  EXPECT_EQ(http.requests().size(), arrived);
  auto invalidated = URLSession::sessionWithConfiguration(URLSessionConfiguration{});
  invalidated->invalidateAndCancel();
  expectCancelled(send(invalidated, get(http.url("/json"))));
}

TEST_F(URLSessionTest, CancelRacingTheAnswerCompletesOnce) {
  std::vector<Started> all;
  RawServer raw([&all](RawConnection& connection) {
    while (const auto request = connection.readRequest()) {  // "GET /<index> HTTP/1.1..."
      connection.write("HTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nhi");
      all[std::stoul(request->substr(5))].task->cancel();
    }
  });
  for (int i = 0; i < 100; ++i) all.emplace_back(session, get(raw.url("/" + std::to_string(i))));
  for (const Started& started : all) {
    started.task->resume();
    const Reply reply = started.first();
    if (reply.error) expectCancelled(reply);
    EXPECT_EQ(reply.body(), reply.error ? "" : "hi");
  }
  drain(session);
  for (const Started& started : all) {
    EXPECT_EQ(started.count(), 1u);
    EXPECT_EQ(started.task->state(), URLSessionTask::State::completed);
  }
}

}  // namespace
}  // namespace kivi
