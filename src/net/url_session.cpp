#include "kivi/net/url_session.h"

#include <curl/curl.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <thread>
#include <unordered_map>
#include <vector>

#include "kivi/text/unicode_text.h"

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
  if (unicode::isValidUTF8(bytes)) return std::string(bytes);
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

// One request, from resume() until its completion is handed to the delegate
// queue. While the transfer is in the multi handle, libcurl's callbacks write
// to it under URLSessionCore::mutex.
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

// A transfer taken out of the multi handle: libcurl's result, or the session's
// own verdict (cancelled, timed out) when `code` is not 0.
struct Ended {
  std::unique_ptr<Transfer> transfer;
  CURLcode result = CURLE_OK;
  std::int64_t code = 0;
};

// The multi handle is driven by whichever thread has something to do: resume()
// adds the transfer and sends the request on the calling thread, cancel()
// takes it out on its thread, and the session's network thread sleeps in
// epoll_wait until a socket is ready or a deadline passes (a timerfd). No
// thread ever has to wake another to get a request sent.
struct URLSessionCore : std::enable_shared_from_this<URLSessionCore> {
  URLSessionCore(URLSessionConfiguration configuration, std::shared_ptr<OperationQueue> queue);
  ~URLSessionCore();

  const URLSessionConfiguration configuration;
  const std::shared_ptr<OperationQueue> delegateQueue;

  // Guards everything below. Every call into `multi` is made holding it, so
  // libcurl's callbacks run under it too.
  std::mutex mutex;
  CURLM* multi = nullptr;
  int epollFd = -1;  // the transfers' sockets, timerFd and wakeFd
  int timerFd = -1;  // fires at `armed`
  int wakeFd = -1;   // an eventfd: the network thread should see whether to stop
  std::unordered_map<std::uint64_t, std::unique_ptr<Transfer>> active;  // by task identifier
  std::vector<Ended> ended;  // completed once the lock is released
  bool invalidated = false;
  bool threadRunning = false;
  bool timeoutNow = false;  // libcurl asked to be driven again at once
  Clock::time_point curlDeadline = Clock::time_point::max();
  Clock::time_point idleCheck = Clock::time_point::max();  // no transfer goes idle before
  Clock::time_point armed = Clock::time_point::max();

  void submit(std::unique_ptr<Transfer> transfer);
  void requestCancel(std::uint64_t taskIdentifier);
  void invalidate(bool cancelRunning);
  void run();
  bool configure(Transfer& transfer);
  void complete(std::unique_ptr<Transfer> transfer, std::optional<Data> data,
                HTTPURLResponsePtr response, ErrorPtr error);
  void finish(Ended ended);

  // Runs `work` under the lock, then completes what it ended.
  template <class Work>
  void withLock(Work&& work);
  void driveLocked(curl_socket_t socket, int events);
  void endLocked(std::uint64_t taskIdentifier, CURLcode result, std::int64_t code);
  void expireIdleLocked(Clock::time_point now);
  void rearmLocked();
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

// libcurl tells which sockets to watch; `registered` (libcurl's per-socket
// pointer) is non-null once the socket is in the epoll set.
int onSocket(CURL*, curl_socket_t socket, int what, void* user, void* registered) {
  auto& core = *static_cast<URLSessionCore*>(user);
  if (what == CURL_POLL_REMOVE) {
    if (registered) {
      ::epoll_ctl(core.epollFd, EPOLL_CTL_DEL, socket, nullptr);
      curl_multi_assign(core.multi, socket, nullptr);
    }
    return 0;
  }
  epoll_event event{};
  event.events = ((what & CURL_POLL_IN) ? EPOLLIN : 0u) | ((what & CURL_POLL_OUT) ? EPOLLOUT : 0u);
  event.data.fd = socket;
  if (registered) {
    ::epoll_ctl(core.epollFd, EPOLL_CTL_MOD, socket, &event);
  } else {
    // A number reused after a close that epoll has not seen yet is there already.
    if (::epoll_ctl(core.epollFd, EPOLL_CTL_ADD, socket, &event) != 0 && errno == EEXIST) {
      ::epoll_ctl(core.epollFd, EPOLL_CTL_MOD, socket, &event);
    }
    curl_multi_assign(core.multi, socket, &core);
  }
  return 0;
}

int onTimer(CURLM*, long milliseconds, void* user) {
  auto& core = *static_cast<URLSessionCore*>(user);
  core.timeoutNow = milliseconds == 0;
  core.curlDeadline = milliseconds < 0 ? Clock::time_point::max()
                                       : Clock::now() + std::chrono::milliseconds(milliseconds);
  return 0;
}

int curlEvents(std::uint32_t events) {
  int flags = 0;
  if (events & (EPOLLIN | EPOLLHUP | EPOLLRDHUP)) flags |= CURL_CSELECT_IN;
  if (events & EPOLLOUT) flags |= CURL_CSELECT_OUT;
  if (events & EPOLLERR) flags |= CURL_CSELECT_ERR;
  return flags;
}

}  // namespace

URLSessionCore::URLSessionCore(URLSessionConfiguration configuration,
                               std::shared_ptr<OperationQueue> queue)
    : configuration(std::move(configuration)), delegateQueue(std::move(queue)) {
  initializeCurlOnce();
  epollFd = ::epoll_create1(EPOLL_CLOEXEC);
  timerFd = ::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
  wakeFd = ::eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
  for (int fd : {timerFd, wakeFd}) {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.fd = fd;
    ::epoll_ctl(epollFd, EPOLL_CTL_ADD, fd, &event);
  }
  multi = curl_multi_init();
  curl_multi_setopt(multi, CURLMOPT_PIPELINING, CURLPIPE_MULTIPLEX);
  curl_multi_setopt(multi, CURLMOPT_MAX_HOST_CONNECTIONS,
                    static_cast<long>(std::max<std::int64_t>(
                        0, this->configuration.HTTPMaximumConnectionsPerHost)));
  curl_multi_setopt(multi, CURLMOPT_SOCKETFUNCTION, onSocket);
  curl_multi_setopt(multi, CURLMOPT_SOCKETDATA, this);
  curl_multi_setopt(multi, CURLMOPT_TIMERFUNCTION, onTimer);
  curl_multi_setopt(multi, CURLMOPT_TIMERDATA, this);
}

URLSessionCore::~URLSessionCore() {
  // Transfers hold the core through their task, so none is left by now.
  curl_multi_cleanup(multi);  // closes the cached connections
  for (int fd : {epollFd, timerFd, wakeFd}) ::close(fd);
}

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

template <class Work>
void URLSessionCore::withLock(Work&& work) {
  std::vector<Ended> done;
  {
    std::lock_guard lock(mutex);
    work();
    // Taking a transfer out may let a queued one start.
    if (timeoutNow) driveLocked(CURL_SOCKET_TIMEOUT, 0);
    rearmLocked();
    done.swap(ended);
    if (invalidated && active.empty() && threadRunning) {
      const std::uint64_t one = 1;
      (void)!::write(wakeFd, &one, sizeof one);
    }
  }
  for (Ended& e : done) finish(std::move(e));
}

void URLSessionCore::driveLocked(curl_socket_t socket, int events) {
  int running = 0;
  // libcurl's timer is one-shot: running the time-outs consumes it, and
  // libcurl announces the next one, if any, through onTimer().
  auto runTimeouts = [&] {
    timeoutNow = false;
    curlDeadline = Clock::time_point::max();
    curl_multi_socket_action(multi, CURL_SOCKET_TIMEOUT, 0, &running);
  };
  if (socket == CURL_SOCKET_TIMEOUT) {
    runTimeouts();
  } else {
    curl_multi_socket_action(multi, socket, events, &running);
  }
  // A zero time-out asks for another call straight away; should libcurl keep
  // asking, rearmLocked() leaves it to the network thread.
  for (int round = 0; timeoutNow && round < 4; ++round) runTimeouts();
  int queued = 0;
  while (CURLMsg* message = curl_multi_info_read(multi, &queued)) {
    if (message->msg != CURLMSG_DONE) continue;
    Transfer* transfer = nullptr;
    curl_easy_getinfo(message->easy_handle, CURLINFO_PRIVATE, &transfer);
    const CURLcode result = message->data.result;  // the message goes with the handle
    endLocked(transfer->task->taskIdentifier(), result, 0);
  }
}

void URLSessionCore::endLocked(std::uint64_t taskIdentifier, CURLcode result, std::int64_t code) {
  const auto it = active.find(taskIdentifier);
  if (it == active.end()) return;
  std::unique_ptr<Transfer> transfer = std::move(it->second);
  active.erase(it);
  curl_multi_remove_handle(multi, transfer->easy);
  ended.push_back({std::move(transfer), result, code});
}

void URLSessionCore::expireIdleLocked(Clock::time_point now) {
  idleCheck = Clock::time_point::max();
  std::vector<std::uint64_t> idle;
  for (const auto& [identifier, transfer] : active) {
    const auto due = transfer->lastActivity + transfer->idleTimeout;
    if (due <= now) {
      idle.push_back(identifier);
    } else {
      idleCheck = std::min(idleCheck, due);
    }
  }
  for (std::uint64_t identifier : idle) endLocked(identifier, CURLE_OK, URLErrorTimedOut);
}

// The timer may fire early (a deadline moved out); it never fires late.
void URLSessionCore::rearmLocked() {
  if (timeoutNow) curlDeadline = Clock::now();
  const Clock::time_point due = std::min(curlDeadline, idleCheck);
  if (due >= armed) return;
  armed = due;
  const auto since = std::chrono::duration_cast<std::chrono::nanoseconds>(due.time_since_epoch());
  itimerspec spec{};
  spec.it_value.tv_sec = static_cast<time_t>(since.count() / 1'000'000'000);
  spec.it_value.tv_nsec = static_cast<long>(since.count() % 1'000'000'000);
  if (spec.it_value.tv_sec == 0 && spec.it_value.tv_nsec == 0) spec.it_value.tv_nsec = 1;
  ::timerfd_settime(timerFd, TFD_TIMER_ABSTIME, &spec, nullptr);
}

void URLSessionCore::submit(std::unique_ptr<Transfer> transfer) {
  const bool usable = multi && epollFd >= 0 && timerFd >= 0 && wakeFd >= 0;
  if (!usable || !configure(*transfer)) {
    const URLPtr url = transfer->request.URL();
    complete(std::move(transfer), std::nullopt, nullptr,
             makeURLError(URLErrorUnknown, "The request could not be prepared.", url));
    return;
  }
  bool startThread = false;
  withLock([&] {
    // A cancel() that came first has found nothing to take out.
    if (invalidated || transfer->task->state() == URLSessionTask::State::canceling) return;
    Transfer& t = *transfer;
    t.lastActivity = Clock::now();
    idleCheck = std::min(idleCheck, t.lastActivity + t.idleTimeout);
    curl_multi_add_handle(multi, t.easy);
    active.emplace(t.task->taskIdentifier(), std::move(transfer));
    if (!threadRunning) threadRunning = startThread = true;
    driveLocked(CURL_SOCKET_TIMEOUT, 0);  // sends the request if it can
  });
  if (startThread) std::thread([core = shared_from_this()] { core->run(); }).detach();
  if (transfer) {
    const URLPtr url = transfer->request.URL();
    complete(std::move(transfer), std::nullopt, nullptr, cancelledError(url));
  }
}

void URLSessionCore::requestCancel(std::uint64_t taskIdentifier) {
  withLock([&] { endLocked(taskIdentifier, CURLE_OK, URLErrorCancelled); });
}

void URLSessionCore::invalidate(bool cancelRunning) {
  withLock([&] {
    invalidated = true;
    if (!cancelRunning) return;
    std::vector<std::uint64_t> running;
    for (const auto& entry : active) running.push_back(entry.first);
    for (std::uint64_t identifier : running) endLocked(identifier, CURLE_OK, URLErrorCancelled);
  });
}

void URLSessionCore::complete(std::unique_ptr<Transfer> transfer, std::optional<Data> data,
                              HTTPURLResponsePtr response, ErrorPtr error) {
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

void URLSessionCore::finish(Ended e) {
  std::unique_ptr<Transfer>& t = e.transfer;
  const URLPtr url = t->request.URL();
  if (e.code == URLErrorCancelled) {
    complete(std::move(t), std::nullopt, nullptr, cancelledError(url));
    return;
  }
  if (e.code == URLErrorTimedOut) {
    complete(std::move(t), std::nullopt, nullptr,
             makeURLError(URLErrorTimedOut, "The request timed out.", url,
                          "No data moved for the request's time-out."));
    return;
  }
  const CURLcode result = e.result;
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
    // that.) A body whose chunked encoding is broken comes as a receive error.
    const bool answerBegun = t->headerBytes > 0;
    const bool httpZeroNine = detail.find("HTTP/0.9") != std::string::npos;
    if ((result == CURLE_OUT_OF_MEMORY && answerBegun) ||
        (result == CURLE_UNSUPPORTED_PROTOCOL && httpZeroNine)) {
      mapped = {URLErrorBadServerResponse,
                "The server returned a response that could not be read."};
    } else if (result == CURLE_RECV_ERROR && detail.find("chunked-encoding") != std::string::npos) {
      mapped = {URLErrorCannotParseResponse, "The server's response could not be parsed."};
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
  epoll_event events[32];
  for (;;) {
    const int count = ::epoll_wait(epollFd, events, 32, -1);
    bool stop = false;
    std::vector<Ended> done;
    {
      std::lock_guard lock(mutex);
      bool timerFired = false;
      for (int i = 0; i < count; ++i) {
        const int fd = events[i].data.fd;
        if (fd == timerFd || fd == wakeFd) {
          std::uint64_t ticks = 0;
          (void)!::read(fd, &ticks, sizeof ticks);
          if (fd == timerFd) {
            timerFired = true;
            armed = Clock::time_point::max();
          }
        } else {
          driveLocked(fd, curlEvents(events[i].events));
        }
      }
      if (timerFired) {
        const auto now = Clock::now();
        if (now >= curlDeadline) driveLocked(CURL_SOCKET_TIMEOUT, 0);
        if (now >= idleCheck) expireIdleLocked(now);
      }
      rearmLocked();
      done.swap(ended);
      if (invalidated && active.empty()) threadRunning = false, stop = true;
    }
    for (Ended& e : done) finish(std::move(e));
    if (stop) return;
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
