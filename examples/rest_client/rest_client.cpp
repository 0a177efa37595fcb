// rest_client: fetches one JSON document over HTTP with a KivJSONAPIOperation
// and prints how the call ended.
//
//   rest_client URL [FIELD]
//
//   $ rest_client 'http://127.0.0.1:8000/items.json?token=secret' items
//   status: KivJSONAPIOperationCompletionStatusSuccess
//   http: 200
//   items: [{"id":1,"name":"pen"},{"id":2,"name":"ink"}]
//
// Without FIELD it prints the document's top-level field names (or, for an
// array, its length). When REST_CLIENT_TOKEN is set, its value is sent as
// "Authorization: Bearer <token>".
//
// What it shows:
//   - a KivJSONAPIOperation subclass: the base class builds the request and
//     classifies cancellation, transport errors, 401, 403 and answers that
//     are not application/json; the subclass decides what an accepted answer
//     means and completes the operation;
//   - running it on a KivAsyncService and waiting for it;
//   - a KivSdkLoggerDelegate that writes the log to standard error, and a
//     log that carries URLs and headers only through the redaction helpers,
//     so that query values, tokens and cookies never reach it.
//
// The exit code is 0 when the operation ends in Success, 1 when it ends in any
// other status, 2 for bad arguments.
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/logging/kiv_sdk_logger.h"
#include "kivi/logging/kiv_sdk_logger_delegate.h"
#include "kivi/logging/log_redaction.h"
#include "kivi/net/url.h"
#include "kivi/net/url_session.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "kivi/text/json_serialization.h"

namespace {

// Writes every log line to standard error as
//   [info] rest_client rest_client.cpp:140 createURLRequestWithError: GET http://h/items?token=***
// The loggers call a delegate on whatever thread logs, several at once, so the
// lines are written under a lock.
class StderrLogDelegate final : public kivi::KivSdkLoggerDelegate {
 public:
  void logCriticalWithModule(std::string_view module, std::string_view file,
                             std::string_view function, std::uint64_t line,
                             std::string_view message) override {
    write("critical", module, file, function, line, message);
  }
  void logErrorWithModule(std::string_view module, std::string_view file, std::string_view function,
                          std::uint64_t line, std::string_view message) override {
    write("error", module, file, function, line, message);
  }
  void logWarnWithModule(std::string_view module, std::string_view file, std::string_view function,
                         std::uint64_t line, std::string_view message) override {
    write("warn", module, file, function, line, message);
  }
  void logInfoWithModule(std::string_view module, std::string_view file, std::string_view function,
                         std::uint64_t line, std::string_view message) override {
    write("info", module, file, function, line, message);
  }
  void logVerboseWithModule(std::string_view module, std::string_view file,
                            std::string_view function, std::uint64_t line,
                            std::string_view message) override {
    write("verbose", module, file, function, line, message);
  }
  void logSupportWithModule(std::string_view module, std::string_view file,
                            std::string_view function, std::uint64_t line,
                            std::string_view message) override {
    write("support", module, file, function, line, message);
  }

 private:
  void write(std::string_view level, std::string_view module, std::string_view file,
             std::string_view function, std::uint64_t line, std::string_view message) {
    if (const auto slash = file.find_last_of('/'); slash != std::string_view::npos) {
      file.remove_prefix(slash + 1);
    }
    std::lock_guard lock(mutex_);
    std::cerr << '[' << level << "] " << module << ' ' << file << ':' << line << ' ' << function
              << ": " << message << std::endl;
  }

  std::mutex mutex_;
};

// A URL as the log may show it: every query value masked.
std::string loggable(const kivi::URLPtr& url) {
  return kivi::KivSdkURLForLogging(url).value_or("(a URL that cannot be logged)");
}

// "Name: value, Name: value" of a dictionary that has already been redacted.
std::string joined(const kivi::StringDictionary& headers) {
  std::string text;
  for (const auto& [name, value] : headers) {
    if (!text.empty()) text += ", ";
    text += name + ": " + value;
  }
  return text.empty() ? "(none)" : text;
}

// GET of one JSON document. An accepted answer (one the base class did not
// classify already) is Success when it is a 200 whose body is JSON, and
// InvalidServerResponse otherwise.
class FetchJSONDocument final : public kivi::KivJSONAPIOperation {
 public:
  FetchJSONDocument(kivi::URLPtr url, kivi::URLSessionPtr session,
                    std::shared_ptr<kivi::KivSdkLogger> logger,
                    std::optional<std::string> bearerToken)
      : KivJSONAPIOperation(std::move(url), std::move(session)),
        logger_(std::move(logger)),
        bearerToken_(std::move(bearerToken)) {}

  // The parsed body of a successful answer. Written before the operation
  // finishes: read it once waitUntilFinished() has returned.
  std::optional<kivi::Value> document;

  std::optional<kivi::StringDictionary> additionalHttpHeaders() override {
    if (!bearerToken_) return std::nullopt;
    return kivi::StringDictionary{{"Authorization", "Bearer " + *bearerToken_}};
  }

  // The base class builds the request; this logs it on the way out. The
  // header list is an allow-list: names not given keep their name but show
  // "***" for the value, so a header added later cannot leak by mistake.
  std::optional<kivi::URLRequest> createURLRequestWithError(kivi::ErrorPtr* error) override {
    auto request = KivJSONAPIOperation::createURLRequestWithError(error);
    if (request) {
      const auto headers =
          std::make_shared<const kivi::StringDictionary>(request->allHTTPHeaderFields());
      logger_->logWithModule(
          kModule, kivi::KivSdkLogLevelInfo, __FILE__, __func__, __LINE__, "%s %s (headers: %s)",
          request->HTTPMethod(), loggable(request->URL()),
          joined(kivi::KivSdkObfuscateHeadersForLogging(headers, {"Accept", "Content-Type"})));
    }
    return request;
  }

  // Every answer and every transport failure passes through here before the
  // base class classifies it.
  void didCompleteUrlRequest(const kivi::URLRequest& request, const std::optional<kivi::Data>& data,
                             kivi::HTTPURLResponsePtr response, kivi::ErrorPtr error) override {
    if (response) {
      // Answers from the URL session spell header names canonically, so the
      // response form masks "Authorization" and "Set-Cookie" values.
      const auto headers =
          std::make_shared<const kivi::StringDictionary>(response->allHeaderFields());
      logger_->logWithModule(
          kModule, kivi::KivSdkLogLevelInfo, __FILE__, __func__, __LINE__,
          "HTTP %d from %s (headers: %s)", response->statusCode(), loggable(response->URL()),
          joined(*kivi::KivSdkResponseHeadersForLogging(headers, response->URL())));
    } else if (error) {
      // The error's user info holds the failing URL unredacted: log only
      // its domain and code.
      logger_->logWithModule(kModule, kivi::KivSdkLogLevelError, __FILE__, __func__, __LINE__,
                             "no answer from %s: %s %d", loggable(request.URL()), error->domain(),
                             error->code());
    }
    KivJSONAPIOperation::didCompleteUrlRequest(request, data, std::move(response),
                                               std::move(error));
  }

  // Runs on the URL session's delegate queue. It must complete the
  // operation on every path, or the operation stays Executing.
  void processHTTPUrlResponse(kivi::HTTPURLResponsePtr response,
                              const std::optional<kivi::Data>& data) override {
    kivi::ErrorPtr error;
    auto json = kivi::JSONSerialization::JSONObjectWithData(data.value_or(kivi::Data{}), 0, &error);
    const bool ok = response && response->statusCode() == 200 && json;
    if (ok) document = std::move(json);
    completeOperationWithStatus(ok ? kivi::KivJSONAPIOperationCompletionStatusSuccess
                                   : kivi::KivJSONAPIOperationCompletionStatusInvalidServerResponse,
                                error);
  }

 private:
  static constexpr const char* kModule = "rest_client";

  const std::shared_ptr<kivi::KivSdkLogger> logger_;
  const std::optional<std::string> bearerToken_;
};

// A JSON value as one line: strings as their text, everything else as
// compact JSON with sorted keys.
std::string text(const kivi::Value& value) {
  if (const kivi::String* string = value.asString()) return string->str();
  const auto data = kivi::JSONSerialization::dataWithJSONObject(
      value,
      kivi::JSONWritingSortedKeys | kivi::JSONWritingFragmentsAllowed |
          kivi::JSONWritingWithoutEscapingSlashes,
      nullptr);
  return data ? std::string(data->begin(), data->end()) : value.description();
}

void printDocument(const kivi::Value& document, const char* field) {
  if (field) {
    const kivi::Value* value = document.find(field);
    std::cout << field << ": " << (value ? text(*value) : "(absent)") << '\n';
  } else if (const kivi::Dictionary* fields = document.asDictionary()) {
    std::cout << "fields:";
    for (const auto& entry : *fields) std::cout << ' ' << entry.first;
    std::cout << '\n';
  } else if (const kivi::Array* elements = document.asArray()) {
    std::cout << "elements: " << elements->size() << '\n';
  }
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2 || argc > 3) {
    std::cerr << "usage: rest_client URL [FIELD]\n";
    return 2;
  }
  // Text typed by a person is taken as it is: it must be an absolute URL,
  // with nothing in it that would need escaping.
  const kivi::URLPtr url = kivi::URL::URLWithString(argv[1], /*encodingInvalidCharacters=*/false);
  if (!url || !url->scheme()) {
    std::cerr << "rest_client: not an absolute URL: " << argv[1] << '\n';
    return 2;
  }

  // The logger holds its delegate weakly: keep the delegate alive here for as
  // long as anything may log.
  const auto delegate = std::make_shared<StderrLogDelegate>();
  const auto logger = kivi::KivSdkLogger::create(delegate);

  std::optional<std::string> token;
  if (const char* value = std::getenv("REST_CLIENT_TOKEN"); value && *value) token = value;

  // A service owns the queue its operations run on; here one at a time.
  kivi::KivAsyncService service("rest_client", 1);
  auto operation = std::make_shared<FetchJSONDocument>(url, kivi::URLSession::sharedSession(),
                                                       logger, std::move(token));
  service.operationQueue()->addOperation(operation);
  operation->waitUntilFinished();

  const std::uint64_t status = operation->completionStatus();
  std::cout << "status: " << kivi::KivJSONAPIOperation::descriptionForCompletionStatus(status)
            << '\n';
  if (const auto response = operation->urlResponse()) {
    std::cout << "http: " << response->statusCode() << '\n';
  }
  if (operation->document) printDocument(*operation->document, argc == 3 ? argv[2] : nullptr);
  // Not error->description(): it would print the user info, failing URL and all.
  if (const auto error = operation->completionError()) {
    std::cout << "error: " << error->domain() << ' ' << error->code() << ": "
              << error->localizedDescription() << '\n';
  }
  return status == kivi::KivJSONAPIOperationCompletionStatusSuccess ? 0 : 1;
}
