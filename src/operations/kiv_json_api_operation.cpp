#include "kivi/operations/kiv_json_api_operation.h"

#include <algorithm>

#include "kivi/net/url_components.h"
#include "kivi/utils/url_utils.h"

namespace kivi {

namespace {

constexpr const char* kStatusNames[] = {
    "KivJSONAPIOperationCompletionStatusSuccess",
    "KivJSONAPIOperationCompletionStatusCancelled",
    "KivJSONAPIOperationCompletionStatusInvalidInput",
    "KivJSONAPIOperationCompletionStatusFailedToBuildRequest",
    "KivJSONAPIOperationCompletionStatusRequestFailed",
    "KivJSONAPIOperationCompletionStatusInvalidContentType",
    "KivJSONAPIOperationCompletionStatusAccessDenied",
    "KivJSONAPIOperationCompletionStatusUnauthorized",
    "KivJSONAPIOperationCompletionStatusInvalidServerResponse",
};

bool equalsIgnoringASCIICase(std::string_view a, std::string_view b) {
  return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) {
           auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c; };
           return lower(x) == lower(y);
         });
}

void writeSlot(ErrorPtr* slot, ErrorPtr error) {
  if (slot) *slot = std::move(error);
}

}  // namespace

KivJSONAPIOperation::KivJSONAPIOperation(URLPtr restApiURL, URLSessionPtr urlSession)
    : KivUrlSessionTaskOperationObjC(std::move(urlSession)), restApiURL_(std::move(restApiURL)) {}

bool KivJSONAPIOperation::responseHeadersIndicateJsonContentType(const StringDictionary& headers) {
  auto it = headers.find("Content-Type");
  if (it == headers.end()) return false;
  std::string_view rest = it->second;
  for (;;) {
    const auto semicolon = rest.find(';');
    if (equalsIgnoringASCIICase(rest.substr(0, semicolon), "application/json")) return true;
    if (semicolon == std::string_view::npos) return false;
    rest.remove_prefix(semicolon + 1);
  }
}

std::string KivJSONAPIOperation::descriptionForCompletionStatus(std::uint64_t status) {
  if (status < std::size(kStatusNames)) return kStatusNames[status];
  return "Unknown " + std::to_string(static_cast<long>(status));
}

void KivJSONAPIOperation::start() {
  if (isCancelled()) {
    completeOperationWithStatus(KivJSONAPIOperationCompletionStatusCancelled, nullptr);
    return;
  }
  KivUrlSessionTaskOperationObjC::start();
  moveToExecutingState();
  if (!restApiURL() || !performPreFlightChecks()) {
    completeOperationWithStatus(KivJSONAPIOperationCompletionStatusInvalidInput, nullptr);
    return;
  }
  startNetworkRequest();
}

bool KivJSONAPIOperation::performPreFlightChecks() { return restApiURL() != nullptr; }

void KivJSONAPIOperation::startNetworkRequest() {
  ErrorPtr error;
  std::optional<URLRequest> request = createURLRequestWithError(&error);
  if (!request) {
    completeOperationWithStatus(KivJSONAPIOperationCompletionStatusFailedToBuildRequest, error);
    return;
  }
  URLSessionPtr session = urlSession();
  if (!session) {
    completeOperationWithStatus(
        KivJSONAPIOperationCompletionStatusRequestFailed,
        Error::create(URLErrorDomain, URLErrorUnknown,
                      {{LocalizedDescriptionKey,
                        Value("The operation has no URL session to send its request with.")}}));
    return;
  }
  std::weak_ptr<Object> weakSelf = weak_from_this();
  auto task = session->dataTaskWithRequest(
      *request, [weakSelf, request = *request](std::optional<Data> data,
                                               HTTPURLResponsePtr response, ErrorPtr error) {
        auto self = std::dynamic_pointer_cast<KivJSONAPIOperation>(weakSelf.lock());
        if (!self) return;  // released by the host: the result is dropped
        self->didCompleteUrlRequest(request, data, std::move(response), std::move(error));
      });
  setSessionTaskOperationHandle(task);
  // A cancel() that came after start() looked at the flag found no task to
  // cancel; it set the flag before looking, so the flag shows it here.
  if (isCancelled()) task->cancel();
  if (auto stored = sessionTaskOperationHandle()) stored->resume();
}

void KivJSONAPIOperation::didCompleteUrlRequest(const URLRequest&, const std::optional<Data>& data,
                                                HTTPURLResponsePtr response, ErrorPtr error) {
  setUrlResponse(response);
  if (error) {
    const bool cancelled = error->code() == URLErrorCancelled && error->domain() == URLErrorDomain;
    completeOperationWithStatus(cancelled ? KivJSONAPIOperationCompletionStatusCancelled
                                          : KivJSONAPIOperationCompletionStatusRequestFailed,
                                error);
    return;
  }
  const std::int64_t status = response ? response->statusCode() : 0;
  if (status == 401) {
    completeOperationWithStatus(KivJSONAPIOperationCompletionStatusUnauthorized, nullptr);
    return;
  }
  if (status == 403) {
    completeOperationWithStatus(KivJSONAPIOperationCompletionStatusAccessDenied, nullptr);
    return;
  }
  const StringDictionary headers = response ? response->allHeaderFields() : StringDictionary{};
  if (!shouldAllowNonJSONContentTypeResponses() &&
      !responseHeadersIndicateJsonContentType(headers)) {
    Dictionary info;
    info.emplace(LocalizedDescriptionKey,
                 Value("application/json was required but was not returned as the Content-Type"));
    if (!headers.empty()) {
      Dictionary headerValues;
      for (const auto& [name, value] : headers) headerValues.emplace(name, Value(value));
      info.emplace(ResponseHeadersKeyName, Value(std::move(headerValues)));
    }
    completeOperationWithStatus(KivJSONAPIOperationCompletionStatusInvalidContentType,
                                Error::create(KivJSONAPIOperationErrorDomain,
                                              KivJSONAPIInvalidContentTypeError, std::move(info)));
    return;
  }
  processHTTPUrlResponse(std::move(response), data);
}

std::optional<URLRequest> KivJSONAPIOperation::createURLRequestWithError(ErrorPtr* error) {
  writeSlot(error, nullptr);
  if (!restApiURL()) return std::nullopt;
  URLPtr url = restApiURL();
  // Only added query items take the URL apart and put it together again.
  if (auto parameters = additionalQueryParameters(); parameters && !parameters->empty()) {
    URLComponents components = URLComponents::fromURL(*url);
    std::vector<URLQueryItem> items;
    items.reserve(parameters->size());
    for (const auto& [name, value] : *parameters) items.push_back({name, value});
    KiviOSSdkUtils::addQueryItems(components, items);
    url = components.url();
  }
  if (!url) return std::nullopt;
  MutableURLRequest request(std::move(url), DefaultJSONAPITimeout);
  request.setHTTPMethod(httpMethod());
  request.setAllHTTPHeaderFields(httpHeaders());
  ErrorPtr bodyError;
  std::optional<Data> body = httpPostBodyWithError(&bodyError);
  if (bodyError) {
    writeSlot(error, std::move(bodyError));
    return std::nullopt;
  }
  request.setHTTPBody(std::move(body));
  return URLRequest(request);
}

StringDictionary KivJSONAPIOperation::httpHeaders() {
  StringDictionary headers{{"Content-Type", "application/json"}, {"Accept", "application/json"}};
  if (auto additional = additionalHttpHeaders(); additional && !additional->empty()) {
    for (const auto& [name, value] : *additional) headers[name] = value;
  }
  return headers;
}

std::optional<StringDictionary> KivJSONAPIOperation::additionalHttpHeaders() {
  return std::nullopt;
}

std::optional<StringDictionary> KivJSONAPIOperation::additionalQueryParameters() {
  return std::nullopt;
}

std::optional<Data> KivJSONAPIOperation::httpPostBodyWithError(ErrorPtr* error) {
  writeSlot(error, nullptr);
  std::optional<Value> object = httpJSONPostObject();
  if (!object) return std::nullopt;
  if (!JSONSerialization::isValidJSONObject(*object)) {
    writeSlot(error,
              Error::create(KivJSONAPIOperationErrorDomain, KivJSONAPIJSONConversionErrorCode,
                            {{LocalizedDescriptionKey,
                              Value("The object returned from the derived class was not "
                                    "valid JSON")}}));
    return std::nullopt;
  }
  ErrorPtr writeError;
  std::optional<Data> data =
      JSONSerialization::dataWithJSONObject(*object, jsonWritingOptions(), &writeError);
  writeSlot(error, std::move(writeError));
  return data;
}

std::optional<Value> KivJSONAPIOperation::httpJSONPostObject() { return std::nullopt; }

std::string KivJSONAPIOperation::httpMethod() { return "GET"; }

void KivJSONAPIOperation::processHTTPUrlResponse(HTTPURLResponsePtr, const std::optional<Data>&) {}

void KivJSONAPIOperation::completeOperationWithStatus(std::uint64_t status,
                                                      ErrorPtr completionError) {
  setCompletionStatus(status);
  setCompletionError(std::move(completionError));
  coreCompleteOperation();
}

bool KivJSONAPIOperation::shouldAllowNonJSONContentTypeResponses() const { return allowNonJSON_; }
void KivJSONAPIOperation::setShouldAllowNonJSONContentTypeResponses(bool allow) {
  allowNonJSON_ = allow;
}
JSONWritingOptions KivJSONAPIOperation::jsonWritingOptions() const { return jsonWritingOptions_; }
void KivJSONAPIOperation::setJsonWritingOptions(JSONWritingOptions options) {
  jsonWritingOptions_ = options;
}
std::uint64_t KivJSONAPIOperation::completionStatus() const { return completionStatus_; }
void KivJSONAPIOperation::setCompletionStatus(std::uint64_t status) { completionStatus_ = status; }

Value KivJSONAPIOperation::valueForKey(std::string_view key) const {
  if (key == "completionStatus") return Value(completionStatus());
  if (key == "restApiURL") return restApiURL() ? Value(restApiURL()) : Value();
  return KivUrlSessionTaskOperationObjC::valueForKey(key);
}

}  // namespace kivi
