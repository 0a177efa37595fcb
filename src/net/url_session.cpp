#include "kivi/net/url_session.h"

#include "kivi/text/unicode_text.h"
#include "url_session_internals.h"

namespace kivi {

namespace url_session_detail {

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
                      const std::string& detail) {
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

}  // namespace url_session_detail

namespace {
std::atomic<std::uint64_t> gNextTaskIdentifier{1};
}  // namespace

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

URLSessionTask::URLSessionTask()
    : identifier_(gNextTaskIdentifier++), impl_(std::make_unique<Impl>()) {}

URLSessionTask::~URLSessionTask() = default;

HTTPURLResponsePtr URLSessionTask::response() const {
  std::lock_guard lock(impl_->mutex);
  return impl_->response;
}

ErrorPtr URLSessionTask::error() const {
  std::lock_guard lock(impl_->mutex);
  return impl_->error;
}

void URLSessionTask::resume() {
  std::unique_ptr<Transfer> transfer;
  std::shared_ptr<URLSessionCore> core;  // held for the call: completing releases the task's
  {
    std::lock_guard lock(impl_->mutex);
    if (state_ != State::suspended || !impl_->pending || !impl_->core) return;
    transfer = std::move(impl_->pending);
    core = impl_->core;
    state_ = State::running;
  }
  transfer->task = std::static_pointer_cast<URLSessionTask>(shared_from_this());
  std::int64_t code = 0;
  const std::string problem = requestProblem(transfer->request, code);
  if (!problem.empty()) {
    const URLPtr url = transfer->request.URL();
    core->complete(std::move(transfer), std::nullopt, nullptr, makeURLError(code, problem, url));
    return;
  }
  core->submit(std::move(transfer));
}

void URLSessionTask::cancel() {
  std::unique_ptr<Transfer> suspended;
  std::shared_ptr<URLSessionCore> core;
  {
    std::lock_guard lock(impl_->mutex);
    if (state_ != State::suspended && state_ != State::running) return;
    if (!impl_->core) return;
    core = impl_->core;
    if (state_ == State::suspended) suspended = std::move(impl_->pending);
    state_ = State::canceling;
  }
  if (suspended) {
    suspended->task = std::static_pointer_cast<URLSessionTask>(shared_from_this());
    const URLPtr url = suspended->request.URL();
    core->complete(std::move(suspended), std::nullopt, nullptr, cancelledError(url));
  } else {
    core->requestCancel(identifier_);
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
      core_(std::make_shared<URLSessionCore>(configuration_, delegateQueue_)) {
  core_->makeTimers();
}

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
  auto transfer = std::make_unique<Transfer>();
  transfer->request = request;
  transfer->completion = std::move(completionHandler);
  std::lock_guard lock(task->impl_->mutex);
  task->impl_->core = core_;
  task->impl_->pending = std::move(transfer);
  return task;
}

URLSessionDataTaskPtr URLSession::dataTaskWithURL(URLPtr url,
                                                  DataTaskCompletionHandler completionHandler) {
  return dataTaskWithRequest(URLRequest(std::move(url)), std::move(completionHandler));
}

void URLSession::finishTasksAndInvalidate() { core_->invalidate(false); }

void URLSession::invalidateAndCancel() { core_->invalidate(true); }

}  // namespace kivi
