// URLSession: HTTP and HTTPS transfers on libcurl.
//
// A session owns one libcurl multi handle: connections are kept and reused
// between tasks (at most HTTPMaximumConnectionsPerHost to one host; an idle
// connection is closed after 90 seconds without use, or when the server
// closes it), HTTP/2 is used over TLS where the server offers it and
// concurrent requests to one host then share one connection, certificates are
// checked against the system's store (or the file and directory that
// OpenSSL's SSL_CERT_FILE and SSL_CERT_DIR name, read when the session is
// made), redirects are followed (at most 16),
// and gzip, deflate and brotli answers are decoded. resume() sends the
// request on the calling thread as far as the socket takes it; the library's
// event thread then waits for the answer and for deadlines. Each task's
// completion handler runs on the session's delegate queue (a serial
// OperationQueue unless one is given), never inline on the thread that
// resumed or cancelled the task.
//
//   auto session = kivi::URLSession::sessionWithConfiguration(
//       kivi::URLSessionConfiguration::defaultSessionConfiguration());
//   auto task = session->dataTaskWithRequest(request,
//       [](std::optional<kivi::Data> data, kivi::HTTPURLResponsePtr response,
//          kivi::ErrorPtr error) { ... });
//   task->resume();
//
// Failures complete the task with an error in URLErrorDomain: cancelled
// (-999), timed out (-1001: no byte moved for the request's time-out),
// cannot find host (-1003), cannot connect (-1004), connection lost (-1005),
// too many redirects (-1007), bad server response (-1011), cannot parse
// response (-1017), unsupported URL (-1002), data length exceeds maximum
// (-1103: a body larger than maximumResponseBodyBytes, declared or received),
// secure connection failed (-1200) and others; the user info holds a
// readable description and the failing URL (URLErrorFailingURLErrorKey,
// URLErrorFailingURLStringErrorKey). A request whose header names or values
// hold CR, LF or NUL is not sent: the task fails with URLErrorBadURL and a
// description naming the field.
//
// Resources: a session holds its connections while it is in use. A finished
// task keeps nothing of the session; releasing the last reference to a
// session (or invalidating it) lets its running tasks finish, then closes
// its connections; so does 90 seconds without a transfer.
//
// Thread contract: every member may be called from any thread. Releasing the
// last reference to a session lets its running tasks finish;
// invalidateAndCancel() cancels them instead.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/export.h"
#include "kivi/net/http_url_response.h"
#include "kivi/net/url_request.h"

namespace kivi {

struct URLSessionCore;

// The domain of the errors tasks complete with; the codes follow.
inline constexpr const char* URLErrorDomain = "NSURLErrorDomain";
// A failure no other code names, or a transfer that could not be prepared.
inline constexpr std::int64_t URLErrorUnknown = -1;
// cancel(), invalidateAndCancel(), or a task resumed after the session was invalidated.
inline constexpr std::int64_t URLErrorCancelled = -999;
// No URL, no host, or a header field name that is not a token or a name or value
// holding CR, LF or NUL: nothing was sent.
inline constexpr std::int64_t URLErrorBadURL = -1000;
// No byte moved for the request's time-out, or the transfer outlasted
// timeoutIntervalForResource.
inline constexpr std::int64_t URLErrorTimedOut = -1001;
// A scheme other than http and https.
inline constexpr std::int64_t URLErrorUnsupportedURL = -1002;
// The host's (or proxy's) name could not be resolved.
inline constexpr std::int64_t URLErrorCannotFindHost = -1003;
// No connection could be made.
inline constexpr std::int64_t URLErrorCannotConnectToHost = -1004;
// The connection failed while sending or receiving, or closed before the whole answer.
inline constexpr std::int64_t URLErrorNetworkConnectionLost = -1005;
// Not given by URLSession (a name that cannot be resolved is URLErrorCannotFindHost).
inline constexpr std::int64_t URLErrorDNSLookupFailed = -1006;
// More than 16 redirects.
inline constexpr std::int64_t URLErrorHTTPTooManyRedirects = -1007;
// Not given by URLSession; for code that reports these failures itself.
inline constexpr std::int64_t URLErrorResourceUnavailable = -1008;
inline constexpr std::int64_t URLErrorNotConnectedToInternet = -1009;
// An answer that cannot be read as HTTP, or whose header block exceeds
// maximumResponseHeaderBytes.
inline constexpr std::int64_t URLErrorBadServerResponse = -1011;
// Not given by URLSession; for code that reports these failures itself.
inline constexpr std::int64_t URLErrorZeroByteResource = -1014;
inline constexpr std::int64_t URLErrorCannotDecodeRawData = -1015;
// A body whose content encoding (gzip, deflate, brotli) cannot be decoded.
inline constexpr std::int64_t URLErrorCannotDecodeContentData = -1016;
// A body whose chunked transfer encoding is broken.
inline constexpr std::int64_t URLErrorCannotParseResponse = -1017;
// A body larger than maximumResponseBodyBytes, declared or received.
inline constexpr std::int64_t URLErrorDataLengthExceedsMaximum = -1103;
// TLS could not be set up.
inline constexpr std::int64_t URLErrorSecureConnectionFailed = -1200;
// The server's certificate did not pass verification.
inline constexpr std::int64_t URLErrorServerCertificateUntrusted = -1202;
// Not given by URLSession; for code that reports these failures itself.
inline constexpr std::int64_t URLErrorClientCertificateRejected = -1205;
inline constexpr std::int64_t URLErrorCannotLoadFromNetwork = -2000;

// The settings a session is made with.
struct KIVI_EXPORT URLSessionConfiguration {
  // The defaults below; the two are alike: a session keeps neither cookies nor a response cache.
  static URLSessionConfiguration defaultSessionConfiguration() { return {}; }
  static URLSessionConfiguration ephemeralSessionConfiguration() { return {}; }

  // Longest time with no byte moving, for requests whose own time-out is 0
  // or less (a request's time-out is 60 s unless set).
  double timeoutIntervalForRequest = 60;
  // Longest time for a whole transfer, in seconds; 0 or less: no limit.
  double timeoutIntervalForResource = 7 * 24 * 3600;
  // Sent with every request that does not set the same field itself.
  StringDictionary HTTPAdditionalHeaders;
  // The most connections open to one host at once; 0 or less: no limit.
  std::int64_t HTTPMaximumConnectionsPerHost = 6;
  // Answers whose header block exceeds this fail with
  // URLErrorBadServerResponse.
  std::size_t maximumResponseHeaderBytes = 256 * 1024;
  // Answers whose body (after content decoding) exceeds this fail with
  // URLErrorDataLengthExceedsMaximum, as soon as it is declared or received.
  std::size_t maximumResponseBodyBytes = 256 * 1024 * 1024;
};

// One transfer of a URLSession: made suspended, started by resume(); its completion handler
// runs once, on the session's delegate queue.
class KIVI_EXPORT URLSessionTask : public Object {
 public:
  // Where a task is: suspended until resume(), running, canceling after cancel(), completed
  // once its handler has been queued.
  enum class State : std::int64_t { running = 0, suspended = 1, canceling = 2, completed = 3 };

  // Unique among the process's tasks, counting up from 1.
  std::uint64_t taskIdentifier() const noexcept { return identifier_; }
  // The request the task was made with; none for a task of no session.
  const std::optional<URLRequest>& originalRequest() const noexcept { return original_; }
  // Where the task is (see State).
  State state() const noexcept { return state_; }
  // Set once the task has completed.
  HTTPURLResponsePtr response() const;
  ErrorPtr error() const;

  // Starts a suspended task; does nothing otherwise.
  virtual void resume();
  // Ends the task with URLErrorCancelled unless it has completed; the
  // completion handler runs once either way.
  virtual void cancel();

  Value valueForKey(std::string_view key) const override;

  ~URLSessionTask() override;

 protected:
  // For subclasses and test doubles: a task that belongs to no session.
  URLSessionTask();

 private:
  friend class URLSession;
  friend struct URLSessionCore;
  struct Impl;

  const std::uint64_t identifier_;
  std::optional<URLRequest> original_;
  std::atomic<State> state_{State::suspended};
  const std::unique_ptr<Impl> impl_;
};

// A task whose whole body comes to its completion handler as Data.
class KIVI_EXPORT URLSessionDataTask : public URLSessionTask {
 public:
  std::string className() const override { return "NSURLSessionDataTask"; }

 protected:
  URLSessionDataTask() = default;
  friend class URLSession;
};

// Tasks are shared: the session holds a running one until it completes.
using URLSessionTaskPtr = std::shared_ptr<URLSessionTask>;
using URLSessionDataTaskPtr = std::shared_ptr<URLSessionDataTask>;

class KIVI_EXPORT URLSession : public Object {
 public:
  // Data: the body received (possibly empty); none when the task failed.
  using DataTaskCompletionHandler =
      std::function<void(std::optional<Data> data, HTTPURLResponsePtr response, ErrorPtr error)>;

  // A process-wide session with the default configuration.
  static std::shared_ptr<URLSession> sharedSession();
  // `delegateQueue`: where completion handlers run; a new serial queue when
  // null.
  [[nodiscard]] static std::shared_ptr<URLSession> sessionWithConfiguration(
      URLSessionConfiguration configuration,
      std::shared_ptr<OperationQueue> delegateQueue = nullptr);
  // Running tasks finish; the connections close after them.
  ~URLSession() override;

  // A suspended task; resume() sends the request.
  [[nodiscard]] URLSessionDataTaskPtr dataTaskWithRequest(
      const URLRequest& request, DataTaskCompletionHandler completionHandler);
  [[nodiscard]] URLSessionDataTaskPtr dataTaskWithURL(URLPtr url,
                                                      DataTaskCompletionHandler completionHandler);

  // The configuration the session was made with.
  const URLSessionConfiguration& configuration() const noexcept { return configuration_; }
  // Where completion handlers run: the queue given, or the session's own serial queue.
  const std::shared_ptr<OperationQueue>& delegateQueue() const noexcept { return delegateQueue_; }

  // Running tasks finish (finishTasksAndInvalidate) or are cancelled (invalidateAndCancel).
  // New tasks fail at once with URLErrorCancelled after either call.
  void finishTasksAndInvalidate();
  void invalidateAndCancel();

  std::string className() const override { return "NSURLSession"; }

 private:
  URLSession(URLSessionConfiguration configuration, std::shared_ptr<OperationQueue> delegateQueue);

  const URLSessionConfiguration configuration_;
  const std::shared_ptr<OperationQueue> delegateQueue_;
  std::shared_ptr<URLSessionCore> core_;
};

// A shared session; releasing the last reference lets its running tasks finish.
using URLSessionPtr = std::shared_ptr<URLSession>;

}  // namespace kivi
