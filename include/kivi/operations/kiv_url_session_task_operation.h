// URL-session task operations: asynchronous operations whose work is one
// task of a URLSession. This layer holds the session, the request, the task
// while it runs and the HTTP response, and ties cancellation to the task:
// cancel() sets the operation's cancelled flag, then cancels the stored task.
// It creates, starts and completes nothing itself; a subclass does that
// (KivJSONAPIOperation is the model):
//   1. in start(), create the task from urlSession(), store it
//      (setSessionTaskOperationHandle / setUrlSessionTask), then resume it;
//   2. in the task's completion, store the response (setUrlResponse), set
//      completionError, call coreCompleteOperation().
//
// Two variants: KivUrlSessionTaskOperationObjC (on KivAsyncOperationObjC) and
// KivUrlSessionTaskOperation (on KivAsyncOperation, session fixed at
// creation).
//
// Thread contract: cancel() may come from any thread; it reads the stored
// task once, after the cancelled flag is set. A cancel that arrives after
// start() checked isCancelled() but before it stored the task reaches no
// task, so start() looks at isCancelled() again once the task is stored and
// cancels it itself (KivJSONAPIOperation does). The fields are read and
// written under a small lock; nothing else is synchronised.
#pragma once

#include <mutex>
#include <optional>

#include "kivi/export.h"
#include "kivi/net/http_url_response.h"
#include "kivi/net/url_request.h"
#include "kivi/net/url_session.h"
#include "kivi/operations/kiv_async_operation.h"

namespace kivi {

namespace detail {
// The request, response and task both variants keep, under one lock.
class KIVI_EXPORT UrlSessionTaskFields {
 public:
  std::optional<URLRequest> request() const;
  void setRequest(std::optional<URLRequest> request);
  HTTPURLResponsePtr response() const;
  void setResponse(HTTPURLResponsePtr response);
  URLSessionTaskPtr task() const;
  void setTask(URLSessionTaskPtr task);

 private:
  mutable std::mutex mutex_;
  std::optional<URLRequest> request_;  // guarded by mutex_
  HTTPURLResponsePtr response_;        // guarded by mutex_
  URLSessionTaskPtr task_;             // guarded by mutex_
};
}  // namespace detail

// A task operation on KivAsyncOperationObjC; its session can be replaced.
class KIVI_EXPORT KivUrlSessionTaskOperationObjC : public KivAsyncOperationObjC {
 public:
  // An operation without a session.
  KivUrlSessionTaskOperationObjC() = default;
  // initWithUrlSession:
  explicit KivUrlSessionTaskOperationObjC(URLSessionPtr urlSession)
      : urlSession_(std::move(urlSession)) {}

  // Cancels the operation, then the stored task, if any.
  void cancel() override;

  // The session the task is made from; null when there is none.
  virtual URLSessionPtr urlSession() const;
  virtual void setUrlSession(URLSessionPtr urlSession);
  // The request, for a subclass that records it; none until set.
  virtual std::optional<URLRequest> urlRequest() const;
  virtual void setUrlRequest(std::optional<URLRequest> urlRequest);
  // The HTTP response, stored when the task completes; null until then.
  virtual HTTPURLResponsePtr urlResponse() const;
  virtual void setUrlResponse(HTTPURLResponsePtr urlResponse);
  // The task, which cancel() cancels; null until stored.
  virtual URLSessionTaskPtr sessionTaskOperationHandle() const;
  virtual void setSessionTaskOperationHandle(URLSessionTaskPtr task);

 private:
  mutable std::mutex sessionMutex_;
  URLSessionPtr urlSession_;  // guarded by sessionMutex_
  detail::UrlSessionTaskFields fields_;
};

// A task operation on KivAsyncOperation; its session is fixed at creation.
class KIVI_EXPORT KivUrlSessionTaskOperation : public KivAsyncOperation {
 public:
  // init(urlSession:)
  explicit KivUrlSessionTaskOperation(URLSessionPtr urlSession)
      : urlSession_(std::move(urlSession)) {}

  // Cancels the operation, then the stored task, if any.
  void cancel() override;

  // The session given at creation.
  const URLSessionPtr& urlSession() const noexcept { return urlSession_; }
  // The task, which cancel() cancels; null until stored.
  virtual URLSessionTaskPtr urlSessionTask() const;
  virtual void setUrlSessionTask(URLSessionTaskPtr task);
  // The request, for a subclass that records it; none until set.
  virtual std::optional<URLRequest> urlRequest() const;
  virtual void setUrlRequest(std::optional<URLRequest> urlRequest);
  // The HTTP response, stored when the task completes; null until then.
  virtual HTTPURLResponsePtr urlResponse() const;
  virtual void setUrlResponse(HTTPURLResponsePtr urlResponse);

 private:
  const URLSessionPtr urlSession_;
  detail::UrlSessionTaskFields fields_;
};

}  // namespace kivi
