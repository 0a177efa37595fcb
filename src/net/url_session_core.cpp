// The URL session's core: one libcurl multi handle per session, driven by
// whichever thread has something to do (see URLSessionCore), and the
// transfers in it.
#include <sys/epoll.h>

#include <algorithm>
#include <cstdlib>

#include "kivi/dispatch/detail/event_loop.h"
#include "url_session_internals.h"

namespace kivi {

namespace {

// How long a connection is kept without being used.
constexpr auto kIdleConnectionLifetime = std::chrono::seconds(90);
// How many connections a session keeps open at most, over all hosts, as a
// multiple of the per-host limit.
constexpr long kHostsKeptPerSession = 16;

void initializeCurlOnce() {
  static std::once_flag once;
  std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
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
  if (length > t.bodyLimit - t.received.size()) {
    t.bodyTooLarge = true;
    return 0;  // aborts the transfer
  }
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

std::uint32_t epollEvents(int what) {
  return ((what & CURL_POLL_IN) ? EPOLLIN : 0u) | ((what & CURL_POLL_OUT) ? EPOLLOUT : 0u);
}

// libcurl tells which sockets to watch; its per-socket pointer holds the
// event thread's identifier of the watch.
int onSocket(CURL*, curl_socket_t socket, int what, void* user, void* assigned) {
  auto& core = *static_cast<URLSessionCore*>(user);
  auto& loop = detail::EventLoop::shared();
  const auto watch = reinterpret_cast<std::uintptr_t>(assigned);
  if (what == CURL_POLL_REMOVE) {
    if (watch) {
      loop.unwatch(watch);
      curl_multi_assign(core.multi, socket, nullptr);
    }
    return 0;
  }
  if (watch) {
    loop.modify(watch, epollEvents(what));
    return 0;
  }
  const auto added = loop.watch(socket, epollEvents(what),
                                [weak = core.weak_from_this(), socket](std::uint32_t events) {
                                  if (auto c = weak.lock()) c->socketReady(socket, events);
                                });
  if (!added) return -1;  // no event thread: libcurl ends the transfer with an error
  curl_multi_assign(core.multi, socket,
                    reinterpret_cast<void*>(static_cast<std::uintptr_t>(added)));
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
}

void URLSessionCore::makeTimers() {
  const auto& clock = DispatchClock::system();
  curlTimer = clock->makeTimer([weak = weak_from_this()] {
    if (auto core = weak.lock()) {
      core->withLock([&] {
        if (core->multi && Clock::now() >= core->curlDeadline) {
          core->driveLocked(CURL_SOCKET_TIMEOUT, 0);
        }
      });
    }
  });
  sessionTimer = clock->makeTimer([weak = weak_from_this()] {
    if (auto core = weak.lock()) {
      core->withLock([&] {
        const auto now = Clock::now();
        if (now >= core->idleCheck) core->expireIdleLocked(now);
        if (core->active.empty() && now >= core->connectionsExpire) core->releaseMultiLocked();
      });
    }
  });
}

URLSessionCore::~URLSessionCore() {
  // Transfers hold the core through their task, so none is left by now.
  std::lock_guard lock(mutex);
  releaseMultiLocked();
  for (CURL* easy : spareEasy) curl_easy_cleanup(easy);
}

CURL* URLSessionCore::takeEasy() {
  {
    std::lock_guard lock(spareMutex);
    if (!spareEasy.empty()) {
      CURL* easy = spareEasy.back();
      spareEasy.pop_back();
      return easy;
    }
  }
  return curl_easy_init();
}

void URLSessionCore::recycleEasy(CURL* easy) {
  if (!easy) return;
  curl_easy_reset(easy);  // every option back to its default; caches stay with the multi handle
  {
    std::lock_guard lock(spareMutex);
    const auto kept = static_cast<std::size_t>(
        std::max<std::int64_t>(1, configuration.HTTPMaximumConnectionsPerHost) * 2);
    if (spareEasy.size() < kept) {
      spareEasy.push_back(easy);
      return;
    }
  }
  curl_easy_cleanup(easy);
}

bool URLSessionCore::makeMultiLocked() {
  multi = curl_multi_init();
  if (!multi) return false;
  const long perHost =
      static_cast<long>(std::max<std::int64_t>(0, configuration.HTTPMaximumConnectionsPerHost));
  curl_multi_setopt(multi, CURLMOPT_PIPELINING, CURLPIPE_MULTIPLEX);
  curl_multi_setopt(multi, CURLMOPT_MAX_HOST_CONNECTIONS, perHost);
  // libcurl's default keeps only four connections per running transfer, so
  // connections would be closed whenever fewer transfers run than are open.
  curl_multi_setopt(multi, CURLMOPT_MAXCONNECTS, std::max(perHost, 1L) * kHostsKeptPerSession);
  curl_multi_setopt(multi, CURLMOPT_SOCKETFUNCTION, onSocket);
  curl_multi_setopt(multi, CURLMOPT_SOCKETDATA, this);
  curl_multi_setopt(multi, CURLMOPT_TIMERFUNCTION, onTimer);
  curl_multi_setopt(multi, CURLMOPT_TIMERDATA, this);
  return true;
}

void URLSessionCore::releaseMultiLocked() {
  if (!multi || !active.empty()) return;
  curl_multi_cleanup(multi);  // closes the kept connections
  multi = nullptr;
  timeoutNow = false;
  curlDeadline = connectionsExpire = Clock::time_point::max();
}

bool URLSessionCore::configure(Transfer& t) {
  const URLRequest& request = t.request;
  CURL* easy = takeEasy();
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
  if (!trustedFile.empty()) curl_easy_setopt(easy, CURLOPT_CAINFO, trustedFile.c_str());
  if (!trustedDirectory.empty()) curl_easy_setopt(easy, CURLOPT_CAPATH, trustedDirectory.c_str());
  // Wait for a connection that is being set up, in case it turns out to
  // multiplex, rather than open another one to the same host.
  curl_easy_setopt(easy, CURLOPT_PIPEWAIT, 1L);
  curl_easy_setopt(easy, CURLOPT_MAXAGE_CONN,
                   static_cast<long>(std::chrono::seconds(kIdleConnectionLifetime).count()));
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
  t.bodyLimit = configuration.maximumResponseBodyBytes;
  // A declared length over the limit ends the transfer before the body comes.
  curl_easy_setopt(easy, CURLOPT_MAXFILESIZE_LARGE,
                   static_cast<curl_off_t>(std::min<std::size_t>(t.bodyLimit, INT64_MAX)));

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
  std::unique_lock lock(mutex);
  work();
  unlockAndFinish(lock);
}

void URLSessionCore::unlockAndFinish(std::unique_lock<std::mutex>& lock) {
  std::vector<Ended> done;
  for (;;) {
    addWaitingLocked();
    // Taking a transfer out may let a queued one start.
    if (timeoutNow && multi) driveLocked(CURL_SOCKET_TIMEOUT, 0);
    if (active.empty() && multi) {
      if (invalidated) {
        releaseMultiLocked();
      } else if (connectionsExpire == Clock::time_point::max()) {
        connectionsExpire = Clock::now() + kIdleConnectionLifetime;
      }
    }
    rearmLocked();
    done.swap(ended);
    lock.unlock();
    for (Ended& e : done) finish(std::move(e));
    done.clear();
    // A transfer that came while the lock was held, after the last look,
    // is ours to add: its thread found the lock taken and left it to us.
    {
      std::lock_guard waitingLock(waitingMutex);
      if (waiting.empty()) return;
    }
    if (!lock.try_lock()) return;  // the holder adds it
  }
}

void URLSessionCore::addWaitingLocked() {
  std::vector<std::unique_ptr<Transfer>> arrived;
  {
    std::lock_guard waitingLock(waitingMutex);
    arrived.swap(waiting);
  }
  if (arrived.empty()) return;
  bool added = false;
  for (auto& transfer : arrived) {
    // A cancel() that came first has found nothing to take out.
    if (invalidated || transfer->task->state() == URLSessionTask::State::canceling) {
      ended.push_back({std::move(transfer), CURLE_OK, URLErrorCancelled});
      continue;
    }
    if (!multi && !makeMultiLocked()) {
      ended.push_back({std::move(transfer), CURLE_OK, URLErrorUnknown});
      continue;
    }
    Transfer& t = *transfer;
    t.lastActivity = Clock::now();
    idleCheck = std::min(idleCheck, t.lastActivity + t.idleTimeout);
    connectionsExpire = Clock::time_point::max();
    curl_multi_add_handle(multi, t.easy);
    active.emplace(t.task->taskIdentifier(), std::move(transfer));
    added = true;
  }
  if (added) driveLocked(CURL_SOCKET_TIMEOUT, 0);  // sends the requests if it can
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
  // asking, rearmLocked() leaves it to the event thread.
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

void URLSessionCore::socketReady(curl_socket_t socket, std::uint32_t events) {
  withLock([&] {
    if (multi) driveLocked(socket, curlEvents(events));
  });
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

// The timers may fire early (a deadline moved out); they never fire late.
void URLSessionCore::rearmLocked() {
  if (timeoutNow) curlDeadline = Clock::now();
  if (curlDeadline != curlArmed && curlTimer) {
    curlArmed = curlDeadline;
    if (curlDeadline == Clock::time_point::max()) {
      curlTimer->cancel();
    } else {
      curlTimer->schedule(curlDeadline);
    }
  }
  const auto due = std::min(idleCheck, connectionsExpire);
  if (due != sessionArmed && sessionTimer) {
    sessionArmed = due;
    if (due == Clock::time_point::max()) {
      sessionTimer->cancel();
    } else {
      sessionTimer->schedule(due);
    }
  }
}

void URLSessionCore::submit(std::unique_ptr<Transfer> transfer) {
  if (!configure(*transfer)) {
    finish({std::move(transfer), CURLE_OK, URLErrorUnknown});
    return;
  }
  {
    std::lock_guard waitingLock(waitingMutex);
    waiting.push_back(std::move(transfer));
  }
  // Whoever holds the lock adds the transfer before letting go of it, so a
  // thread that finds it taken goes on with its own work instead of waiting.
  std::unique_lock lock(mutex, std::try_to_lock);
  if (lock.owns_lock()) unlockAndFinish(lock);
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
  recycleEasy(std::exchange(transfer->easy, nullptr));  // out of the multi handle by now
  transfer.reset();
  std::shared_ptr<URLSessionCore> released;  // dropped after the task's lock
  {
    // Under the task's lock, so that a cancel() deciding on the state cannot
    // overwrite "completed" with "canceling".
    URLSessionTask::Impl& impl = *task->impl_;
    std::lock_guard lock(impl.mutex);
    impl.response = response;
    impl.error = error;
    released = std::move(impl.core);  // a finished task keeps nothing of the session
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
  if (e.code == URLErrorUnknown) {
    complete(std::move(t), std::nullopt, nullptr,
             makeURLError(URLErrorUnknown, "The request could not be prepared.", url));
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
    if (t->bodyTooLarge || result == CURLE_FILESIZE_EXCEEDED) {
      auto error = makeURLError(
          URLErrorDataLengthExceedsMaximum, "The resource exceeds the maximum size.", url,
          "More than " + std::to_string(t->bodyLimit) + " bytes of response body.");
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

}  // namespace kivi
