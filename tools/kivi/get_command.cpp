// kivi get: one REST call through a KivJSONAPIOperation subclass.
#include <charconv>
#include <cstdlib>
#include <ostream>

#include "command.h"
#include "kivi/text/json_serialization.h"
#include "kivi/logging/log_redaction.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "verbose.h"

namespace kivi::tool {

namespace {

struct GetOptions {
  std::string url;
  std::string method = "GET";
  StringDictionary headers;
  StringDictionary query;
  std::optional<std::string> json;
  bool allowNonJSON = false;
  std::optional<double> timeout;
};

// Text typed by a person is taken as it is: characters that may not appear in
// a URL make it invalid rather than being escaped, and it must be absolute.
URLPtr parseURL(const std::string& text) {
  URLPtr url = URL::URLWithString(text, /*encodingInvalidCharacters=*/false);
  return url && url->scheme() ? url : nullptr;
}

// URLs reach the log with their query values masked.
std::string loggable(const URLPtr& url) {
  return KivSdkURLForLogging(url).value_or("(a URL that cannot be logged)");
}

// Accepts a 2xx answer whose body is empty or valid JSON.
class GetOperation : public KivJSONAPIOperation {
 public:
  GetOperation(const GetOptions& options, URLSessionPtr session)
      : KivJSONAPIOperation(parseURL(options.url), std::move(session)), options_(options) {
    setShouldAllowNonJSONContentTypeResponses(options.allowNonJSON);
  }

  std::string httpMethod() override { return options_.method; }
  std::optional<StringDictionary> additionalHttpHeaders() override { return options_.headers; }
  std::optional<StringDictionary> additionalQueryParameters() override { return options_.query; }

  std::optional<Value> httpJSONPostObject() override {
    if (!options_.json) return std::nullopt;
    // Text that is not JSON is handed on as a plain string, which the
    // operation refuses as a body.
    auto parsed =
        JSONSerialization::JSONObjectWithData(*options_.json, JSONReadingFragmentsAllowed, nullptr);
    return parsed ? *parsed : Value(*options_.json);
  }

  std::optional<URLRequest> createURLRequestWithError(ErrorPtr* error) override {
    auto request = KivJSONAPIOperation::createURLRequestWithError(error);
    if (request && options_.timeout) {
      MutableURLRequest changed(*request);
      changed.setTimeoutInterval(*options_.timeout);
      request = URLRequest(changed);
    }
    if (request && verboseLoggingEnabled()) {
      logger().logInfo(nullptr, __FILE__, __func__, __LINE__,
                       "sending " + request->HTTPMethod() + " " + loggable(request->URL()));
    }
    return request;
  }

  // Keeps the body for printing, whatever the operation decides.
  void didCompleteUrlRequest(const URLRequest& request, const std::optional<Data>& data,
                             HTTPURLResponsePtr response, ErrorPtr error) override {
    if (verboseLoggingEnabled()) logOutcome(request, response, error);
    body = data.value_or(Data{});
    KivJSONAPIOperation::didCompleteUrlRequest(request, data, std::move(response),
                                               std::move(error));
  }

  void processHTTPUrlResponse(HTTPURLResponsePtr response, const std::optional<Data>&) override {
    const std::int64_t code = response ? response->statusCode() : 0;
    bool ok = code >= 200 && code < 300;
    if (ok && !body.empty()) {
      ok = JSONSerialization::JSONObjectWithData(body, JSONReadingFragmentsAllowed, nullptr)
               .has_value();
    }
    completeOperationWithStatus(ok ? KivJSONAPIOperationCompletionStatusSuccess
                                   : KivJSONAPIOperationCompletionStatusInvalidServerResponse,
                                nullptr);
  }

  Data body;  // written before completion, read after it

 private:
  // The answer (or the failure) as the verbose log shows it, redacted.
  static void logOutcome(const URLRequest& request, const HTTPURLResponsePtr& response,
                         const ErrorPtr& error) {
    if (response) {
      // An answer whose redacted URL does not parse again comes back as it
      // was: then only its status code and the redacted URL text are logged.
      const HTTPURLResponsePtr redacted = KivSdkResponseForLogging(response);
      logger().logInfo(nullptr, __FILE__, __func__, __LINE__,
                       redacted != response
                           ? "answer: " + redacted->description()
                           : "answer: HTTP " + std::to_string(response->statusCode()) + " from " +
                                 loggable(response->URL()) + " (headers withheld)");
    } else if (error) {
      logger().logInfo(nullptr, __FILE__, __func__, __LINE__,
                       "no answer from " + loggable(request.URL()) + ": " + error->domain() + " " +
                           std::to_string(error->code()));
    }
  }

  const GetOptions options_;
};

bool splitPair(const std::string& text, char separator, std::string& name, std::string& value) {
  const auto at = text.find(separator);
  if (at == std::string::npos || at == 0) return false;
  name = text.substr(0, at);
  value = text.substr(at + 1);
  if (separator == ':') {
    const auto first = value.find_first_not_of(" \t");
    value = first == std::string::npos ? "" : value.substr(first);
  }
  return true;
}

int runGet(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  GetOptions options;
  bool haveURL = false;
  for (std::size_t i = 0; i < args.size(); ++i) {
    const std::string& arg = args[i];
    auto next = [&](std::string& into) {
      if (i + 1 >= args.size()) {
        err << "kivi get: " << arg << " needs a value\n";
        return false;
      }
      into = args[++i];
      return true;
    };
    std::string value, name, field;
    if (arg == "--method") {
      if (!next(options.method)) return 2;
    } else if (arg == "--header") {
      if (!next(value)) return 2;
      if (!splitPair(value, ':', name, field)) {
        err << "kivi get: --header wants 'Name: value', not '" << value << "'\n";
        return 2;
      }
      options.headers[name] = field;
    } else if (arg == "--query") {
      if (!next(value)) return 2;
      if (!splitPair(value, '=', name, field)) {
        err << "kivi get: --query wants name=value, not '" << value << "'\n";
        return 2;
      }
      options.query[name] = field;
    } else if (arg == "--json") {
      if (!next(value)) return 2;
      options.json = value;
    } else if (arg == "--allow-non-json") {
      options.allowNonJSON = true;
    } else if (arg == "--timeout") {
      if (!next(value)) return 2;
      char* end = nullptr;
      const double seconds = std::strtod(value.c_str(), &end);
      if (end == value.c_str() || *end != '\0' || !(seconds > 0)) {
        err << "kivi get: --timeout wants a positive number of seconds, not '" << value << "'\n";
        return 2;
      }
      options.timeout = seconds;
    } else if (!arg.empty() && arg[0] == '-' && arg != "-") {
      err << "kivi get: unknown option '" << arg << "'\n";
      return 2;
    } else if (!haveURL) {
      options.url = arg;
      haveURL = true;
    } else {
      err << "kivi get: unexpected argument '" << arg << "'\n";
      return 2;
    }
  }
  if (!haveURL) {
    err << "kivi get: no URL given (see kivi get --help)\n";
    return 2;
  }
  if (!parseURL(options.url)) {
    err << "kivi get: '" << options.url << "' is not a valid absolute URL\n";
  }

  KivAsyncService service("kivi.get", 1);
  auto operation = std::make_shared<GetOperation>(options, URLSession::sharedSession());
  service.operationQueue()->addOperation(operation);
  operation->waitUntilFinished();

  const std::uint64_t status = operation->completionStatus();
  out << "status: " << KivJSONAPIOperation::descriptionForCompletionStatus(status) << "\n";
  if (auto response = operation->urlResponse()) {
    out << "http: " << response->statusCode() << "\n";
    for (const auto& [name, value] : response->allHeaderFields()) {
      out << name << ": " << value << "\n";
    }
    out << "\n";
    out.write(reinterpret_cast<const char*>(operation->body.data()),
              static_cast<std::streamsize>(operation->body.size()));
    if (!operation->body.empty() && operation->body.back() != '\n') out << "\n";
  }
  if (auto error = operation->completionError()) {
    out << "error: " << error->domain() << " " << error->code() << ": "
        << error->localizedDescription() << "\n";
    if (auto detail = error->userInfo().find(DebugDescriptionErrorKey);
        detail != error->userInfo().end() && detail->second.asString()) {
      out << "detail: " << *detail->second.asString() << "\n";
    }
  }
  return static_cast<int>(status);
}

}  // namespace

Command getCommand() {
  return {"get", "run one REST call and print its status, answer and error",
          "usage: kivi get URL [--method M] [--header 'Name: value']... [--query name=value]...\n"
          "                [--json TEXT] [--allow-non-json] [--timeout SECONDS]\n\n"
          "Sends one request through a KivJSONAPIOperation on a KivAsyncService. The\n"
          "answer is accepted (Success) when it is a 2xx whose body is empty or valid\n"
          "JSON, and InvalidServerResponse otherwise; cancellation, transport errors,\n"
          "401, 403 and answers not declared as application/json are classified by the\n"
          "operation itself.\n\n"
          "  --method M          HTTP method (default GET)\n"
          "  --header 'N: v'     extra request header (repeatable)\n"
          "  --query name=value  query parameter appended to the URL (repeatable)\n"
          "  --json TEXT         request body; text that is not JSON is refused\n"
          "  --allow-non-json    accept answers of any Content-Type\n"
          "  --timeout SECONDS   the request's time-out (default 30)\n\n"
          "Prints 'status: <name>', then 'http: <code>', the response headers, a blank\n"
          "line and the body when there was an answer, and 'error: <domain> <code>:\n"
          "<description>' when there is an error. The exit code is the status value\n"
          "(0 Success ... 8 InvalidServerResponse); 2 also for bad arguments.\n\n"
          "With 'kivi --verbose get', the request and the answer are also logged to\n"
          "standard error, redacted: query values, the Authorization header and\n"
          "cookie values appear as ***.\n",
          runGet};
}

const CommandRegistration kRegistration{20, &getCommand};

}  // namespace kivi::tool
