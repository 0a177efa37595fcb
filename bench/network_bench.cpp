// Cost of a REST call through KivJSONAPIOperation against bare libcurl.
//
// Every benchmark talks to the same local HTTP/1.1 server (cpp-httplib on
// 127.0.0.1, an ephemeral port, TCP_NODELAY, keep-alive), started once for
// the whole binary. It has two routes, both answering {"ok":true,"n":42} as
// application/json (uncompressed, see kContentType):
//
//   /json          at once
//   /json-delayed  after 2 ms, a stand-in for server work, so that requests
//                  running in parallel show up as a shorter wall time
//
// Both clients send the same request bytes (Content-Type and Accept
// application/json, the same User-Agent, Accept-Encoding as libcurl offers
// it), so what differs is only the client side.
//
//   BM_JSONAPIOperationSequentialGets   10,000 GETs one after the other, each
//                                       a KivJSONAPIOperation on a serial
//                                       KivAsyncService, waited for before the
//                                       next; one URLSession for all
//   BM_BareCurlSequentialGets           the same 10,000 GETs on one reused
//                                       libcurl easy handle, curl_easy_perform
//                                       on the benchmark thread
//   BM_ThreadWakeRoundTrip              10,000 round trips of a token between
//                                       two threads that sleep on a condition
//                                       variable:
//                                       the price of the hand-offs
//   BM_JSONAPIOperationConcurrent64     64 GETs of /json-delayed added at once
//                                       to a KivAsyncService limited to 8; the
//                                       argument is the session's
//                                       HTTPMaximumConnectionsPerHost (6 is
//                                       the default configuration)
//   BM_BareCurlMultiConcurrent64        the same 64 through one libcurl multi
//                                       handle with 8 easy handles in flight
//
// Reading the results: the overhead of the operation path is
//
//   Time(BM_JSONAPIOperationSequentialGets) / Time(BM_BareCurlSequentialGets)
//
// Time is wall-clock milliseconds per iteration (10,000 or 64 requests); CPU
// is the whole process's CPU time over the same span (client threads and the
// in-process server alike), which stays comparable when the machine is busy
// with other work; items_per_second is requests completed per wall-clock
// second.
#include <benchmark/benchmark.h>
#include <curl/curl.h>
#include <httplib.h>

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "kivi/dispatch/operation_queue.h"
#include "kivi/net/url.h"
#include "kivi/net/url_session.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "kivi/dispatch/operation_queue_protocol.h"

namespace kivi {
namespace {

constexpr std::int64_t kSequentialRequests = 10'000;
constexpr std::int64_t kConcurrentRequests = 64;
constexpr long kConcurrentLimit = 8;
constexpr const char* kAnswer = R"({"ok":true,"n":42})";
// cpp-httplib compresses an answer whose type is exactly "application/json"
// whenever the client accepts it, and the session always does: brotli on an
// 18-byte body then takes about half the process's CPU time and swamps what
// is measured. With a parameter the body goes out as it is.
constexpr const char* kContentType = "application/json; charset=utf-8";
constexpr const char* kUserAgent = "KiviOSSDK/1.0";

// The local server, shared by every benchmark and stopped at exit.
class LocalServer {
 public:
  LocalServer() {
    server_.set_tcp_nodelay(true);
    server_.set_keep_alive_max_count(1'000'000);
    server_.set_keep_alive_timeout(60);
    // One worker per open connection: the sessions of finished benchmarks
    // keep theirs open, and a connection waiting for a free worker would
    // add its wait to the client's time.
    server_.new_task_queue = [] { return new httplib::ThreadPool(64); };
    server_.Get("/json", [](const httplib::Request&, httplib::Response& response) {
      response.set_content(kAnswer, kContentType);
    });
    server_.Get("/json-delayed", [](const httplib::Request&, httplib::Response& response) {
      std::this_thread::sleep_for(std::chrono::milliseconds(2));
      response.set_content(kAnswer, kContentType);
    });
    port_ = server_.bind_to_any_port("127.0.0.1");
    if (port_ <= 0) throw std::runtime_error("cannot bind the benchmark server");
    // The socket is listening already; connections made before the thread
    // gets going wait in the backlog.
    thread_ = std::thread([this] { server_.listen_after_bind(); });
  }
  ~LocalServer() {
    server_.stop();
    thread_.join();
  }
  LocalServer(const LocalServer&) = delete;
  LocalServer& operator=(const LocalServer&) = delete;

  std::string url(const std::string& path) const {
    return "http://127.0.0.1:" + std::to_string(port_) + path;
  }

 private:
  httplib::Server server_;
  int port_ = 0;
  std::thread thread_;
};

LocalServer& localServer() {
  static LocalServer server;
  return server;
}

// A GET whose accepted answer is a 200 with a body.
class BenchGet : public KivJSONAPIOperation {
 public:
  using KivJSONAPIOperation::KivJSONAPIOperation;

  void processHTTPUrlResponse(HTTPURLResponsePtr response,
                              const std::optional<Data>& data) override {
    const bool ok = response && response->statusCode() == 200 && data && !data->empty();
    completeOperationWithStatus(ok ? KivJSONAPIOperationCompletionStatusSuccess
                                   : KivJSONAPIOperationCompletionStatusInvalidServerResponse,
                                nullptr);
  }
};

void reportRequests(benchmark::State& state, std::int64_t requestsPerIteration) {
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()) * requestsPerIteration);
}

// Appends what libcurl received to the std::string given as user data.
std::size_t appendToString(char* buffer, std::size_t size, std::size_t count, void* user) {
  static_cast<std::string*>(user)->append(buffer, size * count);
  return size * count;
}

// The request headers the operation sends, for the bare clients.
curl_slist* requestHeaders() {
  curl_slist* headers = curl_slist_append(nullptr, "Content-Type: application/json");
  headers = curl_slist_append(headers, "Accept: application/json");
  return curl_slist_append(headers, "Expect:");
}

// Configures a reusable easy handle for `url`, with the body going to `body`.
void configureEasy(CURL* easy, const std::string& url, curl_slist* headers, std::string* body) {
  curl_easy_setopt(easy, CURLOPT_URL, url.c_str());
  curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
  curl_easy_setopt(easy, CURLOPT_TCP_NODELAY, 1L);
  curl_easy_setopt(easy, CURLOPT_HTTPGET, 1L);
  curl_easy_setopt(easy, CURLOPT_ACCEPT_ENCODING, "");
  curl_easy_setopt(easy, CURLOPT_USERAGENT, kUserAgent);
  curl_easy_setopt(easy, CURLOPT_HTTPHEADER, headers);
  curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, appendToString);
  curl_easy_setopt(easy, CURLOPT_WRITEDATA, body);
}

bool answeredOk(CURL* easy, const std::string& body) {
  long status = 0;
  curl_easy_getinfo(easy, CURLINFO_RESPONSE_CODE, &status);
  return status == 200 && !body.empty();
}

// Marks the benchmark failed unless the request succeeded.
bool succeeded(benchmark::State& state, const KivJSONAPIOperation& operation) {
  if (operation.completionStatus() == KivJSONAPIOperationCompletionStatusSuccess) return true;
  state.SkipWithError(("request failed: " + KivJSONAPIOperation::descriptionForCompletionStatus(
                                                operation.completionStatus()))
                          .c_str());
  return false;
}

void BM_JSONAPIOperationSequentialGets(benchmark::State& state) {
  const URLPtr url = URL::URLWithString(localServer().url("/json"));
  const URLSessionPtr session =
      URLSession::sessionWithConfiguration(URLSessionConfiguration::defaultSessionConfiguration());
  KivAsyncService service("bench", 1);
  const std::shared_ptr<OperationQueueProtocol> queue = service.operationQueue();
  for (auto _ : state) {
    for (std::int64_t i = 0; i < kSequentialRequests; ++i) {
      auto operation = std::make_shared<BenchGet>(url, session);
      queue->addOperation(operation);
      operation->waitUntilFinished();
      if (!succeeded(state, *operation)) return;
    }
  }
  reportRequests(state, kSequentialRequests);
}
BENCHMARK(BM_JSONAPIOperationSequentialGets)
    ->Iterations(1)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_BareCurlSequentialGets(benchmark::State& state) {
  const std::string url = localServer().url("/json");
  curl_global_init(CURL_GLOBAL_DEFAULT);
  CURL* easy = curl_easy_init();
  curl_slist* headers = requestHeaders();
  std::string body;
  configureEasy(easy, url, headers, &body);
  for (auto _ : state) {
    for (std::int64_t i = 0; i < kSequentialRequests; ++i) {
      body.clear();
      const CURLcode result = curl_easy_perform(easy);
      if (result != CURLE_OK || !answeredOk(easy, body)) {
        state.SkipWithError(result != CURLE_OK ? curl_easy_strerror(result) : "bad answer");
        break;
      }
    }
  }
  curl_easy_cleanup(easy);
  curl_slist_free_all(headers);
  reportRequests(state, kSequentialRequests);
}
BENCHMARK(BM_BareCurlSequentialGets)
    ->Iterations(1)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// What one thread waking another costs on this machine: 10,000 round trips
// of a token between two threads that sleep on a condition variable (two
// wake-ups each, as in the worker pool). An operation's request puts three
// threads to sleep and wakes them more than curl_easy_perform does (the
// worker that starts it, the network thread, the delegate queue's worker),
// so 1.5 of these round trips per request is the least that path adds.
void BM_ThreadWakeRoundTrip(benchmark::State& state) {
  std::mutex mutex;
  std::condition_variable changed;
  std::int64_t token = 0;  // guarded by mutex; odd: the partner's turn
  std::thread partner([&] {
    std::unique_lock lock(mutex);
    for (;;) {
      changed.wait(lock, [&] { return token < 0 || token % 2 == 1; });
      if (token < 0) return;
      ++token;
      changed.notify_one();
    }
  });
  std::int64_t sent = 0;
  for (auto _ : state) {
    for (std::int64_t i = 0; i < kSequentialRequests; ++i) {
      std::unique_lock lock(mutex);
      token = ++sent;
      changed.notify_one();
      changed.wait(lock, [&] { return token != sent; });
      ++sent;
    }
  }
  {
    std::lock_guard lock(mutex);
    token = -1;
  }
  changed.notify_one();
  partner.join();
  reportRequests(state, kSequentialRequests);
}
BENCHMARK(BM_ThreadWakeRoundTrip)
    ->Iterations(1)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_JSONAPIOperationConcurrent64(benchmark::State& state) {
  const URLPtr url = URL::URLWithString(localServer().url("/json-delayed"));
  URLSessionConfiguration configuration = URLSessionConfiguration::defaultSessionConfiguration();
  configuration.HTTPMaximumConnectionsPerHost = state.range(0);
  const URLSessionPtr session = URLSession::sessionWithConfiguration(configuration);
  KivAsyncService service("bench", kConcurrentLimit);
  const std::shared_ptr<OperationQueueProtocol> queue = service.operationQueue();
  std::vector<std::shared_ptr<BenchGet>> operations;
  operations.reserve(kConcurrentRequests);
  for (auto _ : state) {
    operations.clear();
    for (std::int64_t i = 0; i < kConcurrentRequests; ++i) {
      operations.push_back(std::make_shared<BenchGet>(url, session));
      queue->addOperation(operations.back());
    }
    queue->waitUntilAllOperationsAreFinished();
    for (const auto& operation : operations) {
      if (!succeeded(state, *operation)) return;
    }
  }
  reportRequests(state, kConcurrentRequests);
}
BENCHMARK(BM_JSONAPIOperationConcurrent64)
    ->ArgName("maxConnectionsPerHost")
    ->Arg(6)
    ->Arg(8)
    ->Iterations(20)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_BareCurlMultiConcurrent64(benchmark::State& state) {
  const std::string url = localServer().url("/json-delayed");
  curl_global_init(CURL_GLOBAL_DEFAULT);
  CURLM* multi = curl_multi_init();
  curl_multi_setopt(multi, CURLMOPT_MAX_HOST_CONNECTIONS, kConcurrentLimit);
  curl_slist* headers = requestHeaders();
  std::vector<CURL*> handles(kConcurrentLimit);
  std::vector<std::string> bodies(kConcurrentLimit);
  for (std::size_t i = 0; i < handles.size(); ++i) {
    handles[i] = curl_easy_init();
    configureEasy(handles[i], url, headers, &bodies[i]);
    curl_easy_setopt(handles[i], CURLOPT_PRIVATE, &bodies[i]);
  }
  bool failed = false;
  for (auto _ : state) {
    std::int64_t started = 0;
    std::int64_t finished = 0;
    for (std::size_t i = 0; i < handles.size(); ++i) {
      bodies[i].clear();
      curl_multi_add_handle(multi, handles[i]);
      ++started;
    }
    while (finished < kConcurrentRequests && !failed) {
      int running = 0;
      curl_multi_perform(multi, &running);
      int queued = 0;
      while (CURLMsg* message = curl_multi_info_read(multi, &queued)) {
        if (message->msg != CURLMSG_DONE) continue;
        CURL* easy = message->easy_handle;
        std::string* body = nullptr;
        curl_easy_getinfo(easy, CURLINFO_PRIVATE, &body);
        if (message->data.result != CURLE_OK || !answeredOk(easy, *body)) {
          state.SkipWithError(message->data.result != CURLE_OK
                                  ? curl_easy_strerror(message->data.result)
                                  : "bad answer");
          failed = true;
        }
        curl_multi_remove_handle(multi, easy);
        ++finished;
        if (started < kConcurrentRequests && !failed) {
          body->clear();
          curl_multi_add_handle(multi, easy);
          ++started;
        }
      }
      if (finished < kConcurrentRequests && !failed) {
        curl_multi_poll(multi, nullptr, 0, 1000, nullptr);
      }
    }
    if (failed) break;
  }
  for (CURL* easy : handles) {
    curl_multi_remove_handle(multi, easy);
    curl_easy_cleanup(easy);
  }
  curl_multi_cleanup(multi);
  curl_slist_free_all(headers);
  reportRequests(state, kConcurrentRequests);
}
BENCHMARK(BM_BareCurlMultiConcurrent64)
    ->Iterations(20)
    ->MeasureProcessCPUTime()
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace kivi
