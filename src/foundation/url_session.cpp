#include "kivi/foundation/url_session.h"

#include <curl/curl.h>
#include <simdjson.h>

#include <algorithm>
#include <chrono>
#include <deque>
#include <thread>
#include <unordered_map>
#include <vector>

namespace kivi {

namespace {

using Clock = std::chrono::steady_clock;

std::atomic<std::uint64_t> gNextTaskIdentifier{1};

void initializeCurlOnce() {
  static std::once_flag once;
  std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
}

// Header values are bytes; keep valid UTF-8 as it is and read anything else as
// ISO-8859-1, so every string handed out is valid UTF-8.
std::string headerText(std::string_view bytes) {
  if (simdjson::validate_utf8(bytes.data(), bytes.size())) return std::string(bytes);
  std::string out;
  out.reserve(bytes.size() * 2);
  for (unsigned char c : bytes) {
    if (c < 0x80) {
      out += static_cast<char>(c);
    } else {
      out += static_cast<char>(0xC0 | (c >> 6));
      out += static_cast<char>(0x80 | (c & 0x3F));
    }
  }
  return out;
}

std::string_view trimmed(std::string_view s) {
  while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) s.remove_prefix(1);
  while (!s.empty() &&
         (s.back() == ' ' || s.back() == '\t' || s.back() == '\r' || s.back() == '\n'))
    s.remove_suffix(1);
  return s;
}

// "content-type" -> "Content-Type": each dash-separated word capitalised, as
// the platform presents header names whatever the server (or HTTP/2) sent.
std::string canonicalHeaderName(std::string_view name) {
  std::string out(name);
  bool wordStart = true;
  for (char& c : out) {
    if (wordStart && c >= 'a' && c <= 'z') c = static_cast<char>(c - 'a' + 'A');
    if (!wordStart && c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
    wordStart = c == '-';
  }
  return out;
}

bool isToken(std::string_view name) {
  if (name.empty()) return false;
  for (unsigned char c : name) {
    const bool ok =
        (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
        std::string_view("!#$%&'*+-.^_`|~").find(static_cast<char>(c)) != std::string_view::npos;
    if (!ok) return false;
  }
  return true;
}

bool hasLineBreakOrNul(std::string_view text) {
  return text.find_first_of(std::string_view("\r\n\0", 3)) != std::string_view::npos;
}

ErrorPtr makeURLError(std::int64_t code, const std::string& description, const URLPtr& url,
                      const std::string& detail = {}) {
  Dictionary info;
  info.emplace(LocalizedDescriptionKey, Value(description));
  if (url) {
    info.emplace(URLErrorFailingURLErrorKey, Value(url));
    info.emplace(URLErrorFailingURLStringErrorKey, Value(url->absoluteString()));
  }
  if (!detail.empty()) info.emplace(DebugDescriptionErrorKey, Value(detail));
  return Error::create(URLErrorDomain, code, std::move(info));
}

ErrorPtr cancelledError(const URLPtr& url) {
  return makeURLError(URLErrorCancelled, "cancelled", url);
}

struct Mapped {
  std::int64_t code;
  const char* description;
};

Mapped mapCurlCode(CURLcode code) {
  switch (code) {
    case CURLE_OPERATION_TIMEDOUT:
      return {URLErrorTimedOut, "The request timed out."};
    case CURLE_COULDNT_RESOLVE_HOST:
    case CURLE_COULDNT_RESOLVE_PROXY:
      return {URLErrorCannotFindHost, "A server with the specified hostname could not be found."};
    case CURLE_COULDNT_CONNECT:
      return {URLErrorCannotConnectToHost, "Could not connect to the server."};
    case CURLE_RECV_ERROR:
    case CURLE_SEND_ERROR:
    case CURLE_GOT_NOTHING:
    case CURLE_PARTIAL_FILE:
    case CURLE_HTTP2:
    case CURLE_HTTP2_STREAM:
      return {URLErrorNetworkConnectionLost, "The network connection was lost."};
    case CURLE_TOO_MANY_REDIRECTS:
      return {URLErrorHTTPTooManyRedirects, "Too many HTTP redirects."};
    case CURLE_WEIRD_SERVER_REPLY:
      return {URLErrorBadServerResponse, "The server returned a response that could not be read."};
    case CURLE_BAD_CONTENT_ENCODING:
      return {URLErrorCannotDecodeContentData,
              "The response's content encoding could not be decoded."};
    case CURLE_UNSUPPORTED_PROTOCOL:
      return {URLErrorUnsupportedURL, "unsupported URL"};
    case CURLE_URL_MALFORMAT:
      return {URLErrorBadURL, "bad URL"};
    case CURLE_PEER_FAILED_VERIFICATION:
      return {URLErrorServerCertificateUntrusted, "The certificate for this server is invalid."};
    case CURLE_SSL_CONNECT_ERROR:
    case CURLE_SSL_ENGINE_NOTFOUND:
    case CURLE_SSL_ENGINE_SETFAILED:
    case CURLE_SSL_CERTPROBLEM:
    case CURLE_SSL_CIPHER:
    case CURLE_SSL_CACERT_BADFILE:
    case CURLE_SSL_SHUTDOWN_FAILED:
    case CURLE_SSL_CRL_BADFILE:
    case CURLE_SSL_ISSUER_ERROR:
    case CURLE_USE_SSL_FAILED:
      return {URLErrorSecureConnectionFailed,
              "An SSL error has occurred and a secure connection to the server cannot be made."};
    case CURLE_FILESIZE_EXCEEDED:
      return {URLErrorDataLengthExceedsMaximum, "The resource exceeds the maximum size."};
    default:
      return {URLErrorUnknown, "An unknown network error occurred."};
  }
}

std::string versionText(long version) {
  switch (version) {
    case CURL_HTTP_VERSION_1_0:
      return "HTTP/1.0";
    case CURL_HTTP_VERSION_2_0:
      return "HTTP/2";
    case CURL_HTTP_VERSION_3:
      return "HTTP/3";
    default:
      return "HTTP/1.1";
  }
}

}  // namespace

// One running request.
struct Transfer {
  URLSessionTaskPtr task;
  URLSession::DataTaskCompletionHandler completion;
  URLRequest request;
  CURL* easy = nullptr;
  curl_slist* headerList = nullptr;
  std::string body;  // the request body, kept alive for libcurl
  Data received;
  std::vector<std::pair<std::string, std::string>> headers;  // of the latest response
  std::size_t headerBytes = 0;
  std::size_t headerLimit = 0;
  bool headersTooLarge = false;
  Clock::time_point lastActivity;
  Clock::duration idleTimeout{};
  curl_off_t lastUp = 0, lastDown = 0;
  char errorBuffer[CURL_ERROR_SIZE] = {};

  ~Transfer() {
    if (easy) curl_easy_cleanup(easy);
    curl_slist_free_all(headerList);
  }
};

struct URLSessionCore : std::enable_shared_from_this<URLSessionCore> {
  URLSessionCore(URLSessionConfiguration configuration, std::shared_ptr<OperationQueue> queue)
      : configuration(std::move(configuration)), delegateQueue(std::move(queue)) {
    initializeCurlOnce();
    multi = curl_multi_init();
    curl_multi_setopt(multi, CURLMOPT_PIPELINING, CURLPIPE_MULTIPLEX);
    curl_multi_setopt(multi, CURLMOPT_MAX_HOST_CONNECTIONS,
                      static_cast<long>(std::max<std::int64_t>(
                          0, this->configuration.HTTPMaximumConnectionsPerHost)));
  }
  ~URLSessionCore() {
    for (auto& [easy, transfer] : active) curl_multi_remove_handle(multi, easy);
    active.clear();
    curl_multi_cleanup(multi);
  }

  const URLSessionConfiguration configuration;
  const std::shared_ptr<OperationQueue> delegateQueue;
  CURLM* multi = nullptr;

  std::mutex mutex;
  std::deque<std::unique_ptr<Transfer>> incoming;  // guarded by mutex
  std::vector<std::uint64_t> cancelRequests;       // guarded by mutex
  bool invalidated = false;                        // guarded by mutex
  bool cancelEverything = false;                   // guarded by mutex
  bool threadRunning = false;                      // guarded by mutex

  // Owned by the network thread.
  std::unordered_map<CURL*, std::unique_ptr<Transfer>> active;

  void submit(std::unique_ptr<Transfer> transfer);
  void requestCancel(std::uint64_t taskIdentifier);
  void invalidate(bool cancelRunning);
  void run();
  bool configure(Transfer& transfer);
  void complete(std::unique_ptr<Transfer> transfer, std::optional<Data> data,
                HTTPURLResponsePtr response, ErrorPtr error);
  void finish(std::unique_ptr<Transfer> transfer, CURLcode result);
};

namespace {

std::size_t onHeader(char* buffer, std::size_t size, std::size_t count, void* user) {
  auto& t = *static_cast<Transfer*>(user);
  const std::size_t length = size * count;
  t.lastActivity = Clock::now();
  t.headerBytes += length;
  if (t.headerBytes > t.headerLimit) {
    t.headersTooLarge = true;
    return 0;  // aborts the transfer
  }
  std::string_view line(buffer, length);
  if (line.starts_with("HTTP/")) {
    // A new response (after a redirect or an interim 1xx answer).
    t.headers.clear();
    t.headerBytes = length;
    return length;
  }
  const auto colon = line.find(':');
  if (colon == std::string_view::npos) return length;  // blank line or malformed
  std::string_view name = trimmed(line.substr(0, colon));
  if (name.empty()) return length;
  t.headers.emplace_back(canonicalHeaderName(headerText(name)),
                         headerText(trimmed(line.substr(colon + 1))));
  return length;
}

std::size_t onBody(char* buffer, std::size_t size, std::size_t count, void* user) {
  auto& t = *static_cast<Transfer*>(user);
  const std::size_t length = size * count;
  t.lastActivity = Clock::now();
  t.received.insert(t.received.end(), reinterpret_cast<std::uint8_t*>(buffer),
                    reinterpret_cast<std::uint8_t*>(buffer) + length);
  return length;
}

int onProgress(void* user, curl_off_t, curl_off_t downloaded, curl_off_t, curl_off_t uploaded) {
  auto& t = *static_cast<Transfer*>(user);
  if (downloaded != t.lastDown || uploaded != t.lastUp) {
    t.lastDown = downloaded;
    t.lastUp = uploaded;
    t.lastActivity = Clock::now();
  }
  return 0;
}

}  // namespace

bool URLSessionCore::configure(Transfer& t) {
  const URLRequest& request = t.request;
  CURL* easy = curl_easy_init();
  if (!easy) return false;
  t.easy = easy;
  curl_easy_setopt(easy, CURLOPT_PRIVATE, &t);
  curl_easy_setopt(easy, CURLOPT_URL, request.URL()->absoluteString().c_str());
  curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
  curl_easy_setopt(easy, CURLOPT_TCP_NODELAY, 1L);
  curl_easy_setopt(easy, CURLOPT_ERRORBUFFER, t.errorBuffer);
  curl_easy_setopt(easy, CURLOPT_FOLLOWLOCATION, 1L);
  curl_easy_setopt(easy, CURLOPT_MAXREDIRS, 16L);
  curl_easy_setopt(easy, CURLOPT_PROTOCOLS_STR, "http,https");
  curl_easy_setopt(easy, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
  curl_easy_setopt(easy, CURLOPT_HTTP_VERSION, CURL_HTTP_VERSION_2TLS);
  curl_easy_setopt(easy, CURLOPT_ACCEPT_ENCODING, "");
  curl_easy_setopt(easy, CURLOPT_HEADERFUNCTION, onHeader);
  curl_easy_setopt(easy, CURLOPT_HEADERDATA, &t);
  curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, onBody);
  curl_easy_setopt(easy, CURLOPT_WRITEDATA, &t);
  curl_easy_setopt(easy, CURLOPT_NOPROGRESS, 0L);
  curl_easy_setopt(easy, CURLOPT_XFERINFOFUNCTION, onProgress);
  curl_easy_setopt(easy, CURLOPT_XFERINFODATA, &t);

  const double idle = request.timeoutInterval() > 0 ? request.timeoutInterval()
                                                    : configuration.timeoutIntervalForRequest;
  t.idleTimeout = std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(idle));
  const auto idleMs = static_cast<long>(std::max(1.0, idle * 1000));
  curl_easy_setopt(easy, CURLOPT_CONNECTTIMEOUT_MS, idleMs);
  if (configuration.timeoutIntervalForResource > 0) {
    curl_easy_setopt(
        easy, CURLOPT_TIMEOUT_MS,
        static_cast<long>(std::min(2e9, configuration.timeoutIntervalForResource * 1000)));
  }
  t.headerLimit = configuration.maximumResponseHeaderBytes;

  // Method and body.
  const std::string& method = request.HTTPMethod();
  const auto& body = request.HTTPBody();
  if (body) {
    t.body.assign(body->begin(), body->end());
    curl_easy_setopt(easy, CURLOPT_POSTFIELDS, t.body.data());
    curl_easy_setopt(easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(t.body.size()));
    if (method != "POST") curl_easy_setopt(easy, CURLOPT_CUSTOMREQUEST, method.c_str());
  } else if (method == "GET") {
    curl_easy_setopt(easy, CURLOPT_HTTPGET, 1L);
  } else if (method == "HEAD") {
    curl_easy_setopt(easy, CURLOPT_NOBODY, 1L);
  } else if (method == "POST") {
    curl_easy_setopt(easy, CURLOPT_POSTFIELDS, "");
    curl_easy_setopt(easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(0));
  } else {
    curl_easy_setopt(easy, CURLOPT_CUSTOMREQUEST, method.c_str());
  }

  // Header fields: the request's own, then the session's extra ones.
  bool hasUserAgent = false;
  auto add = [&](const std::string& name, const std::string& value) {
    const std::string line = value.empty() ? name + ";" : name + ": " + value;
    t.headerList = curl_slist_append(t.headerList, line.c_str());
    if (headerFieldNamesEqual(name, "User-Agent")) hasUserAgent = true;
  };
  for (const auto& [name, value] : request.headerFields()) add(name, value);
  for (const auto& [name, value] : configuration.HTTPAdditionalHeaders) {
    if (!request.valueForHTTPHeaderField(name)) add(name, value);
  }
  t.headerList = curl_slist_append(t.headerList, "Expect:");
  curl_easy_setopt(easy, CURLOPT_HTTPHEADER, t.headerList);
  if (!hasUserAgent) curl_easy_setopt(easy, CURLOPT_USERAGENT, "KiviOSSDK/1.0");
  return true;
}

void URLSessionCore::submit(std::unique_ptr<Transfer> transfer) {
  bool startThread = false;
  {
    std::lock_guard lock(mutex);
    if (!invalidated) {
      incoming.push_back(std::move(transfer));
      if (!threadRunning) threadRunning = startThread = true;
    }
  }
  if (transfer) {  // the session was invalidated
    const URLPtr url = transfer->request.URL();
    complete(std::move(transfer), std::nullopt, nullptr, cancelledError(url));
  } else if (startThread) {
    std::thread([core = shared_from_this()] { core->run(); }).detach();
  } else {
    curl_multi_wakeup(multi);
  }
}

void URLSessionCore::requestCancel(std::uint64_t taskIdentifier) {
  {
    std::lock_guard lock(mutex);
    cancelRequests.push_back(taskIdentifier);
  }
  curl_multi_wakeup(multi);
}

void URLSessionCore::invalidate(bool cancelRunning) {
  {
    std::lock_guard lock(mutex);
    invalidated = true;
    if (cancelRunning) cancelEverything = true;
  }
  curl_multi_wakeup(multi);
}

void URLSessionCore::complete(std::unique_ptr<Transfer> transfer, std::optional<Data> data,
                              HTTPURLResponsePtr response, ErrorPtr error) {
  if (transfer->easy) {
    curl_multi_remove_handle(multi, transfer->easy);
  }
  URLSessionTaskPtr task = std::move(transfer->task);
  auto completion = std::move(transfer->completion);
  transfer.reset();  // frees the easy handle on this thread
  {
    // Under the task's lock, so that a cancel() deciding on the state cannot
    // overwrite "completed" with "canceling".
    std::lock_guard lock(task->mutex_);
    task->response_ = response;
    task->error_ = error;
    task->state_ = URLSessionTask::State::completed;
  }
  delegateQueue->addOperationWithBlock([task, completion = std::move(completion),
                                        data = std::move(data), response = std::move(response),
                                        error = std::move(error)]() mutable {
    if (completion) completion(std::move(data), std::move(response), std::move(error));
  });
}

void URLSessionCore::finish(std::unique_ptr<Transfer> t, CURLcode result) {
  const URLPtr& url = t->request.URL();
  if (result != CURLE_OK) {
    if (t->headersTooLarge) {
      auto error = makeURLError(
          URLErrorBadServerResponse, "The server's response headers are too large.", url,
          "More than " + std::to_string(t->headerLimit) + " bytes of response headers.");
      complete(std::move(t), std::nullopt, nullptr, std::move(error));
      return;
    }
    Mapped mapped = mapCurlCode(result);
    std::string detail =
        t->errorBuffer[0] ? std::string(t->errorBuffer) : curl_easy_strerror(result);
    // libcurl reports a header line over its own limit as running out of
    // memory, and an answer without a status line as an unsupported protocol.
    // (A header line over libcurl's limit leaves no text in the error
    // buffer: running out of memory once the answer has begun is taken as
    // that.)
    const bool answerBegun = t->headerBytes > 0;
    const bool httpZeroNine = detail.find("HTTP/0.9") != std::string::npos;
    if ((result == CURLE_OUT_OF_MEMORY && answerBegun) ||
        (result == CURLE_UNSUPPORTED_PROTOCOL && httpZeroNine)) {
      mapped = {URLErrorBadServerResponse,
                "The server returned a response that could not be read."};
    }
    complete(std::move(t), std::nullopt, nullptr,
             makeURLError(mapped.code, mapped.description, url, headerText(detail)));
    return;
  }
  long status = 0;
  long version = 0;
  char* effective = nullptr;
  curl_easy_getinfo(t->easy, CURLINFO_RESPONSE_CODE, &status);
  curl_easy_getinfo(t->easy, CURLINFO_HTTP_VERSION, &version);
  curl_easy_getinfo(t->easy, CURLINFO_EFFECTIVE_URL, &effective);
  // The request's URL unless a redirect moved it.
  URLPtr responseURL = url;
  if (effective && url->absoluteString() != effective) {
    if (auto moved = URL::URLWithString(effective)) responseURL = std::move(moved);
  }
  StringDictionary fields;
  // Names are canonical already, so a repeated field has the identical key.
  for (auto& header : t->headers) {
    auto [it, inserted] = fields.try_emplace(std::move(header.first), header.second);
    if (!inserted) it->second.append(", ").append(header.second);
  }
  auto response = HTTPURLResponse::create(responseURL, status, versionText(version), fields);
  Data body = std::move(t->received);
  complete(std::move(t), std::move(body), std::move(response), nullptr);
}

void URLSessionCore::run() {
  for (;;) {
    std::deque<std::unique_ptr<Transfer>> arrived;
    std::vector<std::uint64_t> cancels;
    bool cancelAll = false;
    {
      std::lock_guard lock(mutex);
      arrived.swap(incoming);
      cancels.swap(cancelRequests);
      cancelAll = cancelEverything;
      if (invalidated && active.empty() && arrived.empty()) {
        threadRunning = false;
        break;
      }
    }
    for (auto& transfer : arrived) {
      Transfer& t = *transfer;
      if (cancelAll || t.task->state() == URLSessionTask::State::canceling) {
        complete(std::move(transfer), std::nullopt, nullptr, cancelledError(t.request.URL()));
        continue;
      }
      if (!configure(t)) {
        complete(
            std::move(transfer), std::nullopt, nullptr,
            makeURLError(URLErrorUnknown, "The request could not be prepared.", t.request.URL()));
        continue;
      }
      t.lastActivity = Clock::now();
      curl_multi_add_handle(multi, t.easy);
      active.emplace(t.easy, std::move(transfer));
    }
    // Cancellations.
    for (auto it = active.begin(); it != active.end();) {
      const bool cancel =
          cancelAll || std::find(cancels.begin(), cancels.end(),
                                 it->second->task->taskIdentifier()) != cancels.end();
      if (!cancel) {
        ++it;
        continue;
      }
      auto transfer = std::move(it->second);
      it = active.erase(it);
      const URLPtr url = transfer->request.URL();
      complete(std::move(transfer), std::nullopt, nullptr, cancelledError(url));
    }

    int running = 0;
    curl_multi_perform(multi, &running);
    while (CURLMsg* message = curl_multi_info_read(multi, &running)) {
      if (message->msg != CURLMSG_DONE) continue;
      auto it = active.find(message->easy_handle);
      if (it == active.end()) continue;
      const CURLcode result = message->data.result;
      auto transfer = std::move(it->second);
      active.erase(it);
      finish(std::move(transfer), result);
    }

    // Idle time-outs, and how long to wait for the next event.
    const auto now = Clock::now();
    auto wait = std::chrono::milliseconds(1000);
    for (auto it = active.begin(); it != active.end();) {
      Transfer& t = *it->second;
      const auto idleFor = now - t.lastActivity;
      if (idleFor >= t.idleTimeout) {
        auto transfer = std::move(it->second);
        it = active.erase(it);
        const URLPtr url = transfer->request.URL();
        complete(std::move(transfer), std::nullopt, nullptr,
                 makeURLError(URLErrorTimedOut, "The request timed out.", url,
                              "No data moved for the request's time-out."));
        continue;
      }
      wait = std::min(
          wait, std::chrono::duration_cast<std::chrono::milliseconds>(t.idleTimeout - idleFor) +
                    std::chrono::milliseconds(1));
      ++it;
    }
    curl_multi_poll(multi, nullptr, 0, static_cast<int>(wait.count()), nullptr);
  }
}

namespace {

// Why a request cannot be sent, or an empty string.
std::string requestProblem(const URLRequest& request, std::int64_t& code) {
  const URLPtr& url = request.URL();
  code = URLErrorBadURL;
  if (!url) return "bad URL";
  auto scheme = url->scheme();
  std::string lowered = scheme.value_or("");
  for (char& c : lowered) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  if (lowered != "http" && lowered != "https") {
    code = URLErrorUnsupportedURL;
    return "unsupported URL";
  }
  if (!url->host() || url->host()->empty()) return "bad URL";
  for (const auto& [name, value] : request.headerFields()) {
    if (!isToken(name) || hasLineBreakOrNul(value)) {
      return "The request's header field \"" + headerText(name) +
             "\" is not a valid field (its name must be a token and neither name nor value may "
             "hold CR, LF or NUL); the request was not sent.";
    }
  }
  return {};
}

}  // namespace

// URLSessionTask

URLSessionTask::URLSessionTask() : identifier_(gNextTaskIdentifier++) {}

URLSessionTask::~URLSessionTask() = default;

HTTPURLResponsePtr URLSessionTask::response() const {
  std::lock_guard lock(mutex_);
  return response_;
}

ErrorPtr URLSessionTask::error() const {
  std::lock_guard lock(mutex_);
  return error_;
}

void URLSessionTask::resume() {
  std::unique_ptr<Transfer> transfer;
  {
    std::lock_guard lock(mutex_);
    if (state_ != State::suspended || !pending_ || !core_) return;
    transfer = std::move(pending_);
    state_ = State::running;
  }
  transfer->task = std::static_pointer_cast<URLSessionTask>(shared_from_this());
  std::int64_t code = 0;
  const std::string problem = requestProblem(transfer->request, code);
  if (!problem.empty()) {
    const URLPtr url = transfer->request.URL();
    core_->complete(std::move(transfer), std::nullopt, nullptr, makeURLError(code, problem, url));
    return;
  }
  core_->submit(std::move(transfer));
}

void URLSessionTask::cancel() {
  std::unique_ptr<Transfer> suspended;
  {
    std::lock_guard lock(mutex_);
    if (state_ != State::suspended && state_ != State::running) return;
    if (!core_) return;
    if (state_ == State::suspended) suspended = std::move(pending_);
    state_ = State::canceling;
  }
  if (suspended) {
    suspended->task = std::static_pointer_cast<URLSessionTask>(shared_from_this());
    const URLPtr url = suspended->request.URL();
    core_->complete(std::move(suspended), std::nullopt, nullptr, cancelledError(url));
  } else {
    core_->requestCancel(identifier_);
  }
}

Value URLSessionTask::valueForKey(std::string_view key) const {
  if (key == "state") return Value(static_cast<std::int64_t>(state()));
  if (key == "taskIdentifier") return Value(taskIdentifier());
  return Object::valueForKey(key);
}

// URLSession

URLSession::URLSession(URLSessionConfiguration configuration,
                       std::shared_ptr<OperationQueue> delegateQueue)
    : configuration_(std::move(configuration)),
      delegateQueue_(delegateQueue ? std::move(delegateQueue) : [] {
        auto queue = std::make_shared<OperationQueue>();
        queue->setMaxConcurrentOperationCount(1);
        queue->setName("kivi.URLSession.delegateQueue");
        return queue;
      }()),
      core_(std::make_shared<URLSessionCore>(configuration_, delegateQueue_)) {}

URLSession::~URLSession() { core_->invalidate(/*cancelRunning=*/false); }

std::shared_ptr<URLSession> URLSession::sharedSession() {
  static std::shared_ptr<URLSession>* shared = new std::shared_ptr<URLSession>(
      sessionWithConfiguration(URLSessionConfiguration::defaultSessionConfiguration()));
  return *shared;
}

std::shared_ptr<URLSession> URLSession::sessionWithConfiguration(
    URLSessionConfiguration configuration, std::shared_ptr<OperationQueue> delegateQueue) {
  return std::shared_ptr<URLSession>(
      new URLSession(std::move(configuration), std::move(delegateQueue)));
}

URLSessionDataTaskPtr URLSession::dataTaskWithRequest(const URLRequest& request,
                                                      DataTaskCompletionHandler completionHandler) {
  auto task = std::shared_ptr<URLSessionDataTask>(new URLSessionDataTask());
  task->original_ = request;
  task->core_ = core_;
  auto transfer = std::make_unique<Transfer>();
  transfer->request = request;
  transfer->completion = std::move(completionHandler);
  task->pending_ = std::move(transfer);
  return task;
}

URLSessionDataTaskPtr URLSession::dataTaskWithURL(URLPtr url,
                                                  DataTaskCompletionHandler completionHandler) {
  return dataTaskWithRequest(URLRequest(std::move(url)), std::move(completionHandler));
}

void URLSession::finishTasksAndInvalidate() { core_->invalidate(false); }

void URLSession::invalidateAndCancel() { core_->invalidate(true); }

}  // namespace kivi
