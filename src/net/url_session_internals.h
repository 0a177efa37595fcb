// What the URL session's two halves share: the transfer of one request, the
// session core that drives libcurl, and the helpers both use.
#pragma once

#include <curl/curl.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "kivi/dispatch/dispatch_clock.h"
#include "kivi/net/url_session.h"

namespace kivi {
namespace url_session_detail {

using Clock = std::chrono::steady_clock;

// Header bytes as UTF-8: valid UTF-8 as it is, anything else read as
// ISO-8859-1.
std::string headerText(std::string_view bytes);
// An RFC 9110 token (a valid header field name).
bool isToken(std::string_view name);
bool hasLineBreakOrNul(std::string_view text);
ErrorPtr makeURLError(std::int64_t code, const std::string& description, const URLPtr& url,
                      const std::string& detail = {});
ErrorPtr cancelledError(const URLPtr& url);
// The variable's value, or an empty string.
inline std::string environment(const char* name) {
  const char* value = std::getenv(name);
  return value ? value : "";
}

}  // namespace url_session_detail

using url_session_detail::cancelledError;
using url_session_detail::Clock;
using url_session_detail::environment;
using url_session_detail::hasLineBreakOrNul;
using url_session_detail::headerText;
using url_session_detail::isToken;
using url_session_detail::makeURLError;

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
  std::size_t bodyLimit = 0;
  bool bodyTooLarge = false;
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

struct URLSessionTask::Impl {
  std::mutex mutex;
  // The session's state, until the task has completed. Guarded by mutex.
  std::shared_ptr<URLSessionCore> core;
  std::unique_ptr<Transfer> pending;  // guarded by mutex: the request until resume()
  HTTPURLResponsePtr response;        // guarded by mutex
  ErrorPtr error;                     // guarded by mutex
};

// The multi handle is driven by whichever thread has something to do: resume()
// adds the transfer and sends the request on the calling thread (or, when
// another thread holds the lock, leaves it to that thread), cancel() takes it
// out on its thread, and the library's event thread runs it when a socket is
// ready or a deadline passes. No thread has to wake another to get a request
// sent, and no thread waits for the lock to hand one over.
struct URLSessionCore : std::enable_shared_from_this<URLSessionCore> {
  URLSessionCore(URLSessionConfiguration configuration, std::shared_ptr<OperationQueue> queue);
  ~URLSessionCore();
  // Makes the timers, which hold the core weakly.
  void makeTimers();

  const URLSessionConfiguration configuration;
  const std::shared_ptr<OperationQueue> delegateQueue;
  // Where OpenSSL's own variables put the trusted certificates, if they do.
  const std::string trustedFile = environment("SSL_CERT_FILE");
  const std::string trustedDirectory = environment("SSL_CERT_DIR");

  // Guards everything below up to the waiting transfers. Every call into `multi` is made holding
  // it, so libcurl's callbacks run under it too.
  std::mutex mutex;
  // Made with the first transfer; dropped, with the connections it keeps,
  // once the session has been unused for a while or is invalidated.
  CURLM* multi = nullptr;
  std::unordered_map<std::uint64_t, std::unique_ptr<Transfer>> active;  // by task identifier
  std::vector<Ended> ended;  // completed once the lock is released
  bool invalidated = false;
  bool timeoutNow = false;  // libcurl asked to be driven again at once
  Clock::time_point curlDeadline = Clock::time_point::max();
  Clock::time_point idleCheck = Clock::time_point::max();  // no transfer goes idle before
  Clock::time_point connectionsExpire = Clock::time_point::max();
  // Transfers resumed while another thread held the lock; the holder adds
  // them to the multi handle before it lets go.
  std::mutex waitingMutex;
  std::vector<std::unique_ptr<Transfer>> waiting;  // guarded by waitingMutex
  // Easy handles of ended transfers, reset and kept for the next ones: making
  // one is a large zeroed allocation and a dozen more.
  std::mutex spareMutex;
  std::vector<CURL*> spareEasy;                 // guarded by spareMutex
  std::unique_ptr<DispatchTimer> curlTimer;     // fires at curlDeadline
  std::unique_ptr<DispatchTimer> sessionTimer;  // fires at idleCheck or connectionsExpire
  Clock::time_point curlArmed = Clock::time_point::max();
  Clock::time_point sessionArmed = Clock::time_point::max();

  void submit(std::unique_ptr<Transfer> transfer);
  void requestCancel(std::uint64_t taskIdentifier);
  void invalidate(bool cancelRunning);
  bool configure(Transfer& transfer);
  CURL* takeEasy();
  void recycleEasy(CURL* easy);
  void complete(std::unique_ptr<Transfer> transfer, std::optional<Data> data,
                HTTPURLResponsePtr response, ErrorPtr error);
  void finish(Ended ended);
  void socketReady(curl_socket_t socket, std::uint32_t events);

  // Runs `work` under the lock, then completes what it ended.
  template <class Work>
  void withLock(Work&& work);
  // Adds the waiting transfers, completes what ended, and lets go of the
  // lock; takes it again while transfers keep arriving meanwhile.
  void unlockAndFinish(std::unique_lock<std::mutex>& lock);
  void addWaitingLocked();
  bool makeMultiLocked();
  void releaseMultiLocked();
  void driveLocked(curl_socket_t socket, int events);
  void endLocked(std::uint64_t taskIdentifier, CURLcode result, std::int64_t code);
  void expireIdleLocked(Clock::time_point now);
  void rearmLocked();
};

}  // namespace kivi
