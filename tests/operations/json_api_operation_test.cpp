#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>

#include "kivi/dispatch/operation_queue.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "test_servers.h"

namespace kivi {
namespace {

using testing::RawConnection;
using testing::RawServer;
using Status = KivJSONAPIOperationCompletionStatus;
constexpr Status kSuccess = KivJSONAPIOperationCompletionStatusSuccess;
constexpr Status kCancelled = KivJSONAPIOperationCompletionStatusCancelled;
constexpr Status kInvalidInput = KivJSONAPIOperationCompletionStatusInvalidInput;
constexpr Status kFailedToBuild = KivJSONAPIOperationCompletionStatusFailedToBuildRequest;
constexpr Status kFailed = KivJSONAPIOperationCompletionStatusRequestFailed;
constexpr Status kContentType = KivJSONAPIOperationCompletionStatusInvalidContentType;
constexpr Status kAccessDenied = KivJSONAPIOperationCompletionStatusAccessDenied;
constexpr Status kUnauthorized = KivJSONAPIOperationCompletionStatusUnauthorized;
constexpr Status kInvalidResponse = KivJSONAPIOperationCompletionStatusInvalidServerResponse;

std::string describe(std::uint64_t status) {
  return KivJSONAPIOperation::descriptionForCompletionStatus(status);
}

// A REST call written as subclasses write one; hooks scripted, calls counted.
class Call : public KivJSONAPIOperation {
 public:
  using KivJSONAPIOperation::KivJSONAPIOperation;
  std::optional<StringDictionary> query, headers;  // set before queueing
  std::optional<Value> body;
  std::optional<bool> preFlight;   // none: the base class decides
  bool cancelInPreFlight = false;  // a cancel() that lands inside start()
  double timeout = 0;              // 0: as the base class builds it
  std::atomic<int> processCalls{0}, completions{0};
  std::atomic<bool> cancelledWhenTaskCompleted{false};

  bool performPreFlightChecks() override {
    if (cancelInPreFlight) cancel();
    return preFlight.value_or(KivJSONAPIOperation::performPreFlightChecks());
  }
  std::optional<StringDictionary> additionalQueryParameters() override { return query; }
  std::optional<StringDictionary> additionalHttpHeaders() override { return headers; }
  std::optional<Value> httpJSONPostObject() override { return body; }
  std::optional<URLRequest> createURLRequestWithError(ErrorPtr* error) override {
    auto request = KivJSONAPIOperation::createURLRequestWithError(error);
    if (!request || timeout == 0) return request;
    MutableURLRequest shorter(*request);
    shorter.setTimeoutInterval(timeout);
    return shorter;
  }
  void didCompleteUrlRequest(const URLRequest& request, const std::optional<Data>& data,
                             HTTPURLResponsePtr response, ErrorPtr error) override {
    ++completions;
    cancelledWhenTaskCompleted = isCancelled();
    KivJSONAPIOperation::didCompleteUrlRequest(request, data, response, error);
  }
  // Success for a 2xx JSON answer, InvalidServerResponse otherwise.
  void processHTTPUrlResponse(HTTPURLResponsePtr response,
                              const std::optional<Data>& data) override {
    ++processCalls;
    ErrorPtr error;
    const bool ok = JSONSerialization::JSONObjectWithData(data.value_or(Data{}), 0, &error) &&
                    response->statusCode() / 100 == 2;
    completeOperationWithStatus(ok ? kSuccess : kInvalidResponse, error);
  }
};

// A delegate queue that tells when the session hands it a completion.
class WatchedQueue : public OperationQueue {
 public:
  WatchedQueue() { setMaxConcurrentOperationCount(1); }
  void addOperation(const OperationPtr& operation) override {
    OperationQueue::addOperation(operation);
    added.notify();
  }
  testing::Signal added;
};

class JSONAPIOperationTest : public ::testing::Test {
 protected:
  std::shared_ptr<Call> call(const std::string& url) {
    return std::make_shared<Call>(URL::URLWithString(url), session);
  }
  // Waits until the operation has finished and its task's completion has run.
  void finish(const std::shared_ptr<Call>& op) {
    ASSERT_TRUE(testing::returnsWithin([op] { op->waitUntilFinished(); }));
    ASSERT_TRUE(testing::returnsWithin([q = delegate] { q->waitUntilAllOperationsAreFinished(); }));
  }

  testing::HttpServer http;
  std::shared_ptr<WatchedQueue> delegate = std::make_shared<WatchedQueue>();
  URLSessionPtr session = URLSession::sessionWithConfiguration(
      URLSessionConfiguration::defaultSessionConfiguration(), delegate);
  KivAsyncService service{"kivi.tests.api", 4};
};

TEST_F(JSONAPIOperationTest, EveryEndingFollowsTheFailureTable) {
  enum class Then { close, reset, hold };  // what the raw server does after answering
  using Hook = std::function<void(Call&)>;
  const Hook none, allowText = [](Call&op) { op.setShouldAllowNonJSONContentTypeResponses(true); };
  const Hook shortTimeout = [](Call& op) { op.timeout = 0.3; };
  const Hook noPreFlight = [](Call& op) { op.preFlight = false; };
  const Hook nanBody = [](Call& op) { op.body = Value(Dictionary{{"n", Value(std::nan(""))}}); };
  const Hook cancel = [](Call& op) { op.cancel(); };
  const Hook cancelInStart = [](Call& op) { op.cancelInPreFlight = true; };
  const auto header = [](std::string value) {
    return [value](Call& op) { op.headers = StringDictionary{{"X-Bad", value}}; };
  };
  std::string lines;  // 10 MB of header lines
  for (int i = 0; lines.size() < (10 << 20); ++i)
    lines += "X-Filler-" + std::to_string(i) + ": " + std::string(1000, 'a') + "\r\n";
  const std::string ok = "HTTP/1.1 200 OK\r\n";
  // target: a path on `http` (nothing may reach "/never"), "raw" (a raw server
  // writes `answer`, then does `then`) or URL text. code: of the completion
  // error, in URLErrorDomain when negative, the operation's domain when
  // positive; 0: no error.
  const struct {
    const char* name;
    std::string target;
    Status status;
    std::int64_t code;
    Hook setUp = {};
    std::string answer = {};
    Then then = Then::close;
  } cases[] = {
      {"200 JSON", "/json", kSuccess, 0},
      {"401 with a JSON body", "/status/401", kUnauthorized, 0},
      {"403 with a JSON body", "/status/403", kAccessDenied, 0},
      {"403 as text/plain", "/status/403?type=text/plain", kAccessDenied, 0},
      {"200 as text/plain", "/status/200?type=text/plain", kContentType, 2},
      {"text/plain allowed", "/status/200?type=text/plain", kSuccess, 0, allowText},
      {"500 as JSON", "/status/500?type=application/json%3B%20charset%3Dutf-8", kInvalidResponse,
       0},
      {"no header fields", "raw", kContentType, 2, none, ok + "\r\n{}"},
      {"invalid UTF-8 in headers", "raw", kContentType, 2, none,
       ok + "Content-Type: text/html; charset=caf\xE9\r\nX-Name: \xFF\r\n\r\n{}"},
      {"redirect loop", "/loop", kFailed, URLErrorHTTPTooManyRedirects},
      {"refused connection", testing::refusedURL(), kFailed, URLErrorCannotConnectToHost},
      {"answer that never comes", "raw", kFailed, URLErrorTimedOut, shortTimeout, "", Then::hold},
      {"connection reset mid-answer", "raw", kFailed, URLErrorNetworkConnectionLost, none,
       ok + "Content-Length: 1000\r\n\r\n{\"a\":", Then::reset},
      {"10 MB of header lines", "raw", kFailed, URLErrorBadServerResponse, none,
       ok + lines + "\r\n"},
      {"a 1 MB header line", "raw", kFailed, URLErrorBadServerResponse, none,
       ok + "X-Big: " + std::string(1 << 20, 'a') + "\r\n\r\n"},
      {"broken chunked encoding", "raw", kFailed, URLErrorCannotParseResponse, none,
       ok + "Content-Type: application/json\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\n{}\r\n",
       Then::hold},
      {"no status line", "raw", kFailed, URLErrorBadServerResponse, none, "hello there\r\n\r\n"},
      {"CR/LF in a header value", "/never", kFailed, URLErrorBadURL, header("a\r\nX-Injected: 1")},
      {"LF in a header value", "/never", kFailed, URLErrorBadURL, header("a\nX-Injected: 1")},
      {"URL without a host", "http:///never", kFailed, URLErrorBadURL},
      {"not an HTTP URL", "ftp://127.0.0.1/never", kFailed, URLErrorUnsupportedURL},
      {"malformed URL text", "http://[::1/never", kInvalidInput, 0},
      {"null URL", "", kInvalidInput, 0},
      {"pre-flight check refused", "/never", kInvalidInput, 0, noPreFlight},
      {"body object not JSON", "/never", kFailedToBuild, 1, nanBody},
      {"cancelled before start", "/never", kCancelled, 0, cancel},
      {"cancelled inside start, before the task exists", "/never", kCancelled, URLErrorCancelled,
       cancelInStart},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::optional<RawServer> raw;
    if (c.target == "raw") {
      raw.emplace([&c](RawConnection& connection) {
        if (!connection.readRequest()) return;
        connection.write(c.answer);
        if (c.then == Then::reset) connection.reset();
        if (c.then == Then::hold) connection.readRequest();  // until the client gives up
      });
    }
    const std::string url = raw                         ? raw->url()
                            : c.target.starts_with("/") ? http.url(c.target)
                                                        : c.target;
    auto op = call(url);
    if (c.setUp) c.setUp(*op);
    const auto began = std::chrono::steady_clock::now();
    service.operationQueue()->addOperation(op);
    finish(op);
    const auto took = std::chrono::steady_clock::now() - began;
    EXPECT_LT(took, std::chrono::seconds(3));
    EXPECT_GE(took, std::chrono::milliseconds(op->timeout > 0 ? 290 : 0));

    EXPECT_EQ(describe(op->completionStatus()), describe(c.status));
    const ErrorPtr error = op->completionError();
    ASSERT_EQ(error != nullptr, c.code != 0) << (error ? error->description() : "");
    if (error) {
      EXPECT_EQ(error->domain(), c.code < 0 ? URLErrorDomain : KivJSONAPIOperationErrorDomain);
      EXPECT_EQ(error->code(), c.code) << error->description();
      EXPECT_FALSE(error->localizedDescription().empty());
    }
    EXPECT_EQ(op->processCalls, c.status == kSuccess || c.status == kInvalidResponse ? 1 : 0);
    // Exactly once for every request handed to the session.
    EXPECT_EQ(op->completions, op->sessionTaskOperationHandle() ? 1 : 0);
    if (c.code < 0) {
      EXPECT_EQ(error->userInfo().at(URLErrorFailingURLStringErrorKey), Value(url));
    } else if (c.status == kContentType) {
      Dictionary expected{{LocalizedDescriptionKey, Value("application/json was required but "
                                                          "was not returned as the Content-Type")}};
      Dictionary headers;
      for (const auto& [name, value] : op->urlResponse()->allHeaderFields())
        headers.emplace(name, Value(value));
      if (!headers.empty()) expected.emplace(ResponseHeadersKeyName, Value(headers));
      EXPECT_EQ(error->userInfo(), expected);
    }
  }
  for (const auto& request : http.requests()) EXPECT_NE(request.target, "/never");
}

TEST_F(JSONAPIOperationTest, CancelWhileTheServerHoldsTheRequest) {
  auto op = call(http.url("/gate"));
  service.operationQueue()->addOperation(op);
  ASSERT_TRUE(http.arrived.wait());
  op->cancel();
  finish(op);
  EXPECT_EQ(describe(op->completionStatus()), describe(kCancelled));
  EXPECT_EQ(op->completionError() ? op->completionError()->code() : 0, URLErrorCancelled);
  EXPECT_TRUE(op->cancelledWhenTaskCompleted);
}

TEST_F(JSONAPIOperationTest, SendsQueryHeadersAndBodyAsTheHooksSay) {
  std::mutex mutex;
  std::string received;  // the last request as sent
  RawServer raw([&](RawConnection& connection) {
    while (const auto request = connection.readRequest()) {
      std::lock_guard lock(mutex);
      received = *request;
      connection.write(
          "HTTP/1.1 200 OK\r\nContent-Type: application/json\r\nContent-Length: 2\r\n\r\n{}");
    }
  });
  // Extra fields: none; one that replaces the default of the same name; one
  // whose name differs only in case, sent beside the default.
  const std::optional<StringDictionary> extras[] = {
      std::nullopt, StringDictionary{{"Accept", "text/plain"}, {"X-Extra", "1"}},
      StringDictionary{{"accept", "text/plain"}}};
  const char* accepts[] = {"\r\nAccept: application/json\r\n", "\r\nAccept: text/plain\r\n",
                           "\r\nAccept: application/json\r\n"};
  for (int row = 0; row < 3; ++row) {
    SCOPED_TRACE(row);
    const bool hooks = row == 1;
    auto op = call(raw.url("/json?x=2"));
    op->query = StringDictionary{{"v", hooks ? "a&b=c+d e/\xC3\xA9#f" : "1"}};
    op->headers = extras[row];
    // A body goes out even with GET, pretty-printed.
    if (hooks) op->body = Value(Dictionary{{"k", Value("v")}, {"n", Value(Array{1, 2})}});
    service.operationQueue()->addOperation(op);
    finish(op);
    EXPECT_EQ(describe(op->completionStatus()), describe(kSuccess));
    std::lock_guard lock(mutex);
    const auto head = received.substr(0, received.find("\r\n\r\n") + 2);
    const std::string query = hooks ? "v=a%26b%3Dc%2Bd%20e/%C3%A9%23f" : "v=1";
    EXPECT_TRUE(head.starts_with("GET /json?x=2&" + query + " ")) << head;
    EXPECT_THAT(head, ::testing::HasSubstr("\r\nContent-Type: application/json\r\n"));
    EXPECT_THAT(head, ::testing::HasSubstr(accepts[row]));
    EXPECT_EQ(head.find("Accept:"), head.rfind("Accept:"));
    EXPECT_EQ(head.find("\r\naccept: text/plain\r\n") != std::string::npos, row == 2);
    EXPECT_EQ(head.find("\r\nX-Extra: 1\r\n") != std::string::npos, hooks);
    std::string body;
    if (hooks) {
      const auto data =
          JSONSerialization::dataWithJSONObject(*op->body, JSONWritingPrettyPrinted, nullptr);
      body.assign(data->begin(), data->end());
    }
    EXPECT_EQ(received.substr(head.size() + 2), body);
  }
}

// Host operations that block waiting for REST calls, as many as the pool has
// threads and more: the calls' completions still run.
TEST_F(JSONAPIOperationTest, OperationsWaitingOnCallsDoNotStarveTheirCompletions) {
  auto hosts = std::make_shared<OperationQueue>();
  std::atomic<int> succeeded{0};
  for (int i = 0; i < 64; ++i) {
    hosts->addOperation(std::make_shared<BlockOperation>([&] {
      auto op = call(http.url("/json"));
      service.operationQueue()->addOperation(op);
      op->waitUntilFinished();
      if (op->completionStatus() == kSuccess) ++succeeded;
    }));
  }
  ASSERT_TRUE(testing::returnsWithin([hosts] { hosts->waitUntilAllOperationsAreFinished(); }));
  EXPECT_EQ(succeeded, 64);
}

TEST_F(JSONAPIOperationTest, ReleasedWhileRunningDropsTheResult) {
  auto op = call(http.url("/gate"));
  op->start();  // not queued: the test holds the only reference
  ASSERT_TRUE(http.arrived.wait());
  const URLSessionTaskPtr task = op->sessionTaskOperationHandle();
  ASSERT_NE(task, nullptr);
  const std::weak_ptr<Call> weak = op;
  op.reset();
  EXPECT_TRUE(weak.expired());
  http.release();
  ASSERT_TRUE(delegate->added.wait());
  ASSERT_TRUE(testing::returnsWithin([q = delegate] { q->waitUntilAllOperationsAreFinished(); }));
  EXPECT_EQ(task->state(), URLSessionTask::State::completed);
  EXPECT_EQ(task->response() ? task->response()->statusCode() : 0, 200);
}

TEST(JSONAPIOperationStatics, DescribeStatusesAndRecogniseJSONContentTypes) {
  EXPECT_EQ(describe(8), "KivJSONAPIOperationCompletionStatusInvalidServerResponse");
  EXPECT_EQ(describe(9), "Unknown 9");
  const std::pair<std::string, bool> cases[] = {{"Application/JSON", true},
                                                {"text/plain;application/json;charset=utf-8", true},
                                                {"application/jsonp", false},
                                                {"text/plain; application/json", false},
                                                {"", false}};
  for (const auto& [type, json] : cases) {
    SCOPED_TRACE(type);
    EXPECT_EQ(KivJSONAPIOperation::responseHeadersIndicateJsonContentType({{"Content-Type", type}}),
              json);
  }
  EXPECT_FALSE(KivJSONAPIOperation::responseHeadersIndicateJsonContentType(
      {{"content-type", "application/json"}}));
}

}  // namespace
}  // namespace kivi
