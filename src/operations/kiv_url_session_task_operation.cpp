#include "kivi/operations/kiv_url_session_task_operation.h"

namespace kivi {

namespace detail {

std::optional<URLRequest> UrlSessionTaskFields::request() const {
  std::lock_guard lock(mutex_);
  return request_;
}
void UrlSessionTaskFields::setRequest(std::optional<URLRequest> request) {
  std::lock_guard lock(mutex_);
  request_ = std::move(request);
}
HTTPURLResponsePtr UrlSessionTaskFields::response() const {
  std::lock_guard lock(mutex_);
  return response_;
}
void UrlSessionTaskFields::setResponse(HTTPURLResponsePtr response) {
  std::lock_guard lock(mutex_);
  response_ = std::move(response);
}
URLSessionTaskPtr UrlSessionTaskFields::task() const {
  std::lock_guard lock(mutex_);
  return task_;
}
void UrlSessionTaskFields::setTask(URLSessionTaskPtr task) {
  std::lock_guard lock(mutex_);
  task_ = std::move(task);
}

}  // namespace detail

// Both variants: the operation's own cancel first, so that isCancelled()
// reads true by the time the task's completion runs; then the stored task.

void KivUrlSessionTaskOperationObjC::cancel() {
  KivAsyncOperationObjC::cancel();
  if (auto task = sessionTaskOperationHandle()) task->cancel();
}

URLSessionPtr KivUrlSessionTaskOperationObjC::urlSession() const {
  std::lock_guard lock(sessionMutex_);
  return urlSession_;
}
void KivUrlSessionTaskOperationObjC::setUrlSession(URLSessionPtr urlSession) {
  std::lock_guard lock(sessionMutex_);
  urlSession_ = std::move(urlSession);
}
std::optional<URLRequest> KivUrlSessionTaskOperationObjC::urlRequest() const {
  return fields_.request();
}
void KivUrlSessionTaskOperationObjC::setUrlRequest(std::optional<URLRequest> urlRequest) {
  fields_.setRequest(std::move(urlRequest));
}
HTTPURLResponsePtr KivUrlSessionTaskOperationObjC::urlResponse() const {
  return fields_.response();
}
void KivUrlSessionTaskOperationObjC::setUrlResponse(HTTPURLResponsePtr urlResponse) {
  fields_.setResponse(std::move(urlResponse));
}
URLSessionTaskPtr KivUrlSessionTaskOperationObjC::sessionTaskOperationHandle() const {
  return fields_.task();
}
void KivUrlSessionTaskOperationObjC::setSessionTaskOperationHandle(URLSessionTaskPtr task) {
  fields_.setTask(std::move(task));
}

void KivUrlSessionTaskOperation::cancel() {
  KivAsyncOperation::cancel();
  if (auto task = urlSessionTask()) task->cancel();
}

URLSessionTaskPtr KivUrlSessionTaskOperation::urlSessionTask() const { return fields_.task(); }
void KivUrlSessionTaskOperation::setUrlSessionTask(URLSessionTaskPtr task) {
  fields_.setTask(std::move(task));
}
std::optional<URLRequest> KivUrlSessionTaskOperation::urlRequest() const {
  return fields_.request();
}
void KivUrlSessionTaskOperation::setUrlRequest(std::optional<URLRequest> urlRequest) {
  fields_.setRequest(std::move(urlRequest));
}
HTTPURLResponsePtr KivUrlSessionTaskOperation::urlResponse() const { return fields_.response(); }
void KivUrlSessionTaskOperation::setUrlResponse(HTTPURLResponsePtr urlResponse) {
  fields_.setResponse(std::move(urlResponse));
}

}  // namespace kivi
