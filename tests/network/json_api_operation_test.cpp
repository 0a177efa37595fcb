#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <memory>
#include <optional>
#include <string>

#include "kivi/foundation/operation_queue.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "network/test_servers.h"

namespace kivi {
namespace {

using testing::RawConnection;
using testing::RawServer;
using testing::Signal;

std::string describe(std::uint64_t status) {
  return KivJSONAPIOperation::descriptionForCompletionStatus(status);
}
std::string text(const std::optional<Data>& data) {
  return data ? std::string(data->begin(), data->end()) : "<none>";
}
const std::string kNotJSONType =
    "application/json was required but was not returned as the Content-Type";

// A REST call written as subclasses write one; hooks scripted, calls counted.
class Call : public KivJSONAPIOperation {
 public:
  using KivJSONAPIOperation::KivJSONAPIOperation;
  std::optional<StringDictionary> query, headers;  // set before queueing
  std::optional<Value> body;
  std::optional<bool> preFlight;  // none: the base class decides
  std::atomic<int> preFlightCalls{0}, processCalls{0};
  std::atomic<bool> cancelledWhenTaskCompleted{false};

  bool performPreFlightChecks() override {
    ++preFlightCalls;
    return preFlight.value_or(KivJSONAPIOperation::performPreFlightChecks());
  }
  std::optional<StringDictionary> additionalQueryParameters() override { return query; }
  std::optional<StringDictionary> additionalHttpHeaders() override { return headers; }
  std::optional<Value> httpJSONPostObject() override { return body; }
  void didCompleteUrlRequest(const URLRequest& request, const std::optional<Data>& data,
                             HTTPURLResponsePtr response, ErrorPtr error) override {
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
    completeOperationWithStatus(ok ? KivJSONAPIOperationCompletionStatusSuccess
                                   : KivJSONAPIOperationCompletionStatusInvalidServerResponse,
                                error);
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
  Signal added;
};

class JSONAPIOperationTest : public ::testing::Test {
 protected:
  std::shared_ptr<Call> call(const std::string& url) {
    return std::make_shared<Call>(url.empty() ? nullptr : URL::URLWithString(url), session);
  }
  // Queues the operation; `finished` is notified once it has finished.
  std::shared_ptr<Signal> queue(const std::shared_ptr<KivJSONAPIOperation>& operation) {
    auto finished = std::make_shared<Signal>();
    operation->setCompletionBlock([finished] { finished->notify(); });
    service.operationQueue()->addOperation(operation);
    return finished;
  }
  void run(const std::shared_ptr<KivJSONAPIOperation>& operation) {
    ASSERT_TRUE(queue(operation)->wait()) << "the operation never finished";
  }
  void expectError(const ErrorPtr& error, const char* domain, std::int64_t code) {
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->domain(), domain);
    EXPECT_EQ(error->code(), code);
  }

  testing::HttpServer http;
  std::shared_ptr<WatchedQueue> delegate = std::make_shared<WatchedQueue>();
  URLSessionPtr session = URLSession::sessionWithConfiguration(
      URLSessionConfiguration::defaultSessionConfiguration(), delegate);
  KivAsyncService service{"kivi.tests.api", 4};
};

TEST_F(JSONAPIOperationTest, AnswersEndAsTheOutcomeTableSays) {
  const struct {
    std::string path;
    bool allowNonJSON;
    KivJSONAPIOperationCompletionStatus status;
    bool processed;
  } cases[] = {
      {"/json", false, KivJSONAPIOperationCompletionStatusSuccess, true},
      {"/status/401", false, KivJSONAPIOperationCompletionStatusUnauthorized, false},
      {"/status/403", false, KivJSONAPIOperationCompletionStatusAccessDenied, false},
      {"/status/403?type=text/plain", false, KivJSONAPIOperationCompletionStatusAccessDenied,
       false},
      {"/status/200?type=text/plain", false, KivJSONAPIOperationCompletionStatusInvalidContentType,
       false},
      {"/status/200?type=text/plain", true, KivJSONAPIOperationCompletionStatusSuccess, true},
      {"/status/500?type=application/json%3B%20charset%3Dutf-8", false,
       KivJSONAPIOperationCompletionStatusInvalidServerResponse, true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path + (c.allowNonJSON ? " (non-JSON allowed)" : ""));
    auto op = call(http.url(c.path));
    op->setShouldAllowNonJSONContentTypeResponses(c.allowNonJSON);
    run(op);
    EXPECT_EQ(describe(op->completionStatus()), describe(c.status));
    EXPECT_EQ(op->processCalls, c.processed ? 1 : 0);
    ASSERT_NE(op->urlResponse(), nullptr);
    if (c.status != KivJSONAPIOperationCompletionStatusInvalidContentType) {
      EXPECT_EQ(op->completionError(), nullptr) << op->completionError()->description();
      continue;
    }
    expectError(op->completionError(), KivJSONAPIOperationErrorDomain,
                KivJSONAPIInvalidContentTypeError);
    Dictionary headers;
    for (const auto& [name, value] : op->urlResponse()->allHeaderFields())
      headers.emplace(name, Value(value));
    EXPECT_EQ(op->completionError()->userInfo(),
              (Dictionary{{LocalizedDescriptionKey, Value(kNotJSONType)},
                          {ResponseHeadersKeyName, Value(headers)}}));
  }

  RawServer raw([](RawConnection& c) {
    if (c.readRequest()) c.write("HTTP/1.1 200 OK\r\n\r\n{}");  // no header fields at all
  });
  auto bare = call(raw.url());
  run(bare);
  EXPECT_EQ(describe(bare->completionStatus()),
            describe(KivJSONAPIOperationCompletionStatusInvalidContentType));
  expectError(bare->completionError(), KivJSONAPIOperationErrorDomain,
              KivJSONAPIInvalidContentTypeError);
  EXPECT_EQ(bare->completionError()->userInfo(),
            (Dictionary{{LocalizedDescriptionKey, Value(kNotJSONType)}}));
}

TEST_F(JSONAPIOperationTest, ProblemsBeforeTheRequestEndWithoutReachingTheServer) {
  const struct {
    const char* name;
    std::string url;
    std::function<void(Call&)> setUp;
    KivJSONAPIOperationCompletionStatus status;
    int preFlightCalls;
  } cases[] = {
      {"cancelled before start", http.url("/json"), [](Call& op) { op.cancel(); },
       KivJSONAPIOperationCompletionStatusCancelled, 0},
      {"no URL", "", [](Call&) {}, KivJSONAPIOperationCompletionStatusInvalidInput, 0},
      {"pre-flight refused", http.url("/json"), [](Call& op) { op.preFlight = false; },
       KivJSONAPIOperationCompletionStatusInvalidInput, 1},
      {"body not JSON", http.url("/json"),
       [](Call& op) {
         op.body = Value(Dictionary{{"n", Value(std::nan(""))}});
       },
       KivJSONAPIOperationCompletionStatusFailedToBuildRequest, 1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    auto op = call(c.url);
    c.setUp(*op);
    auto recorder =
        testing::Recorder::watch(*op, {"isExecuting", "isFinished"}, KeyValueObservingOptionNew);
    run(op);
    EXPECT_EQ(describe(op->completionStatus()), describe(c.status));
    EXPECT_EQ(op->preFlightCalls, c.preFlightCalls);
    // All but the cancelled call go through Executing. The completion block
    // may run before the trailing "isExecuting" note: compare up to Finished.
    std::vector<std::pair<std::string, Value>> seen, expected{{"isFinished", true}};
    for (const auto& note : recorder->notes())
      seen.emplace_back(note.key, note.change.at(KeyValueChangeNewKey));
    if (c.status != KivJSONAPIOperationCompletionStatusCancelled)
      expected = {{"isFinished", false}, {"isExecuting", true}, {"isFinished", true}};
    seen.resize(std::min(seen.size(), expected.size()));
    EXPECT_EQ(seen, expected);
    if (c.status != KivJSONAPIOperationCompletionStatusFailedToBuildRequest) {
      EXPECT_EQ(op->completionError(), nullptr);
      continue;
    }
    expectError(op->completionError(), KivJSONAPIOperationErrorDomain,
                KivJSONAPIJSONConversionErrorCode);
    EXPECT_EQ(op->completionError()->localizedDescription(),
              "The object returned from the derived class was not valid JSON");
  }
  EXPECT_EQ(http.log.count(), 0u);
}

TEST_F(JSONAPIOperationTest, TransportErrorsEndAsRequestFailedOrCancelled) {
  auto refused = call("http://127.0.0.1:" + std::to_string(testing::unusedPort()) + "/");
  run(refused);
  EXPECT_EQ(describe(refused->completionStatus()),
            describe(KivJSONAPIOperationCompletionStatusRequestFailed));
  expectError(refused->completionError(), URLErrorDomain, URLErrorCannotConnectToHost);

  auto cancelled = call(http.url("/gate"));
  const auto finished = queue(cancelled);
  ASSERT_TRUE(http.log.arrived.wait());
  cancelled->cancel();
  ASSERT_TRUE(finished->wait());
  EXPECT_EQ(describe(cancelled->completionStatus()),
            describe(KivJSONAPIOperationCompletionStatusCancelled));
  expectError(cancelled->completionError(), URLErrorDomain, URLErrorCancelled);
  EXPECT_TRUE(cancelled->cancelledWhenTaskCompleted);
}

TEST_F(JSONAPIOperationTest, SendsQueryHeadersAndBodyAsTheHooksSay) {
  const std::string awkward = "a&b=c+d e/\xC3\xA9#f";
  const struct {
    StringDictionary query;
    std::optional<StringDictionary> headers;
    const char* target;  // none: any encoding will do
    std::multimap<std::string, std::string> params;
    const char* accept;
  } cases[] = {
      {{{"a", "1"}}, std::nullopt, "/json?x=2&a=1", {{"a", "1"}, {"x", "2"}}, "application/json"},
      {{{"v", awkward}},
       StringDictionary{{"Accept", "text/plain"}},
       nullptr,
       {{"v", awkward}, {"x", "2"}},
       "text/plain"},
  };
  for (const auto& c : cases) {
    auto op = call(http.url("/json?x=2"));
    op->query = c.query;
    op->headers = c.headers;
    run(op);
    ASSERT_GT(http.log.count(), 0u);
    const auto received = http.log.requests().back();
    if (c.target) {
      EXPECT_EQ(received.target, c.target);
    }
    EXPECT_EQ(received.params, c.params) << received.target;
    EXPECT_EQ(received.method, "GET");
    EXPECT_EQ(received.values("Content-Type"), std::vector<std::string>{"application/json"});
    EXPECT_EQ(received.values("Accept"), std::vector<std::string>{c.accept});
    EXPECT_EQ(received.body, "");
  }

  // A body object goes out even with GET, pretty-printed.
  RawServer raw([](RawConnection& c) {
    if (c.readRequest())
      c.write("HTTP/1.1 200 OK\r\nContent-Type: application/json\r\nContent-Length: 2\r\n\r\n{}");
  });
  auto op = call(raw.url());
  op->body = Value(Dictionary{{"k", Value("v")}, {"n", Value(Array{1, 2})}});
  run(op);
  EXPECT_EQ(describe(op->completionStatus()), describe(KivJSONAPIOperationCompletionStatusSuccess));
  const auto pretty =
      JSONSerialization::dataWithJSONObject(*op->body, JSONWritingPrettyPrinted, nullptr);
  ASSERT_EQ(raw.log.count(), 1u);
  EXPECT_EQ(raw.log.requests()[0].method, "GET");
  EXPECT_EQ(raw.log.requests()[0].body, text(pretty));
  EXPECT_THAT(text(pretty), ::testing::HasSubstr("\n"));
}

TEST_F(JSONAPIOperationTest, BuildsTheRequestFromTheHooks) {
  auto op = call(http.url("/json"));
  op->headers = StringDictionary{{"accept", "text/plain"}};
  op->body = Value(Array{Value("x")});
  // Merged by exact key: both spellings are kept.
  EXPECT_EQ(op->httpHeaders(), (StringDictionary{{"Accept", "application/json"},
                                                 {"Content-Type", "application/json"},
                                                 {"accept", "text/plain"}}));
  ErrorPtr error = Error::create("stale", 1);
  const auto request = op->createURLRequestWithError(&error);
  EXPECT_EQ(error, nullptr);
  ASSERT_TRUE(request);
  EXPECT_EQ(request->URL()->absoluteString(), http.url("/json"));
  EXPECT_EQ(request->HTTPMethod(), "GET");
  EXPECT_EQ(request->timeoutInterval(), DefaultJSONAPITimeout);
  EXPECT_EQ(request->valueForHTTPHeaderField("Content-Type"), "application/json");
  // A request holds a field once whatever its case: one of the two values wins.
  EXPECT_THAT(request->valueForHTTPHeaderField("Accept"),
              ::testing::AnyOf(std::string("application/json"), std::string("text/plain")));
  EXPECT_EQ(request->headerFields().size(), 2u);
  EXPECT_EQ(text(request->HTTPBody()), "[\n  \"x\"\n]");
}

TEST(JSONAPIOperationStatics, DescribeStatusesAndRecogniseJSONContentTypes) {
  EXPECT_EQ(describe(5), "KivJSONAPIOperationCompletionStatusInvalidContentType");
  EXPECT_EQ(describe(8), "KivJSONAPIOperationCompletionStatusInvalidServerResponse");
  EXPECT_EQ(describe(9), "Unknown 9");
  EXPECT_EQ(describe(42), "Unknown 42");
  const std::pair<StringDictionary, bool> cases[] = {
      {{{"Content-Type", "Application/JSON"}}, true},
      {{{"Content-Type", "application/json;charset=utf-8"}}, true},
      {{{"Content-Type", "application/json; charset=utf-8"}}, true},
      {{{"Content-Type", "text/plain;application/json"}}, true},
      {{{"Content-Type", "text/plain; application/json"}}, false},
      {{{"Content-Type", "application/jsonp"}}, false},
      {{{"Content-Type", " application/json"}}, false},
      {{{"Content-Type", ""}}, false},
      {{}, false},
      {{{"content-type", "application/json"}}, false},
  };
  for (const auto& [headers, json] : cases) {
    SCOPED_TRACE(headers.empty() ? "<none>"
                                 : headers.begin()->first + ": " + headers.begin()->second);
    EXPECT_EQ(KivJSONAPIOperation::responseHeadersIndicateJsonContentType(headers), json);
  }
}

TEST_F(JSONAPIOperationTest, ReleasedWhileRunningDropsTheResult) {
  auto op = call(http.url("/gate"));
  op->start();  // not queued: the test holds the only reference
  ASSERT_TRUE(http.log.arrived.wait());
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

TEST_F(JSONAPIOperationTest, WithoutProcessHTTPUrlResponseStaysExecuting) {
  auto op = std::make_shared<KivJSONAPIOperation>(URL::URLWithString(http.url("/json")), session);
  service.operationQueue()->addOperation(op);
  ASSERT_TRUE(delegate->added.wait());
  ASSERT_TRUE(testing::returnsWithin([q = delegate] { q->waitUntilAllOperationsAreFinished(); }));
  EXPECT_EQ(op->urlResponse() ? op->urlResponse()->statusCode() : 0, 200);
  EXPECT_TRUE(op->isExecuting());
  EXPECT_FALSE(op->isFinished());
  op->completeOperationWithStatus(KivJSONAPIOperationCompletionStatusSuccess,
                                  nullptr);  // frees the queue
}

}  // namespace
}  // namespace kivi
