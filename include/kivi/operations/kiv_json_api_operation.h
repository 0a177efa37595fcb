// KivJSONAPIOperation: the base of every REST call: one HTTP request to one
// endpoint, JSON out, JSON back, finished with a numeric completion status.
//
// The class builds the request (query parameters, "Content-Type" and "Accept"
// "application/json" plus extra headers, a 30-second time-out, the JSON
// body), runs it as a data task of the given URL session, and classifies
// cancellation, transport errors, HTTP 401 and 403 and answers not declared
// as JSON. Every other answer goes to processHTTPUrlResponse(), which a
// subclass overrides to interpret it and complete the operation:
//
//   class GetProfile : public kivi::KivJSONAPIOperation {
//    public:
//     using KivJSONAPIOperation::KivJSONAPIOperation;
//     std::optional<kivi::StringDictionary> additionalQueryParameters() override {
//       return kivi::StringDictionary{{"fields", "name,email"}};
//     }
//     void processHTTPUrlResponse(kivi::HTTPURLResponsePtr response,
//                                 const std::optional<kivi::Data>& data) override {
//       kivi::ErrorPtr error;
//       auto json = kivi::JSONSerialization::JSONObjectWithData(
//           data.value_or(kivi::Data{}), 0, &error);
//       if (response->statusCode() == 200 && json) profile = *json;
//       completeOperationWithStatus(
//           json ? kivi::KivJSONAPIOperationCompletionStatusSuccess
//                : kivi::KivJSONAPIOperationCompletionStatusInvalidServerResponse,
//           error);
//     }
//     kivi::Value profile;
//   };
//
//   auto op = std::make_shared<GetProfile>(kivi::URL::URLWithString(endpoint), session);
//   service.operationQueue()->addOperation(op);
//
// Outcomes (completionStatus, completionError), set before the Finished
// transition:
//   cancelled before start                     Cancelled, none
//   no restApiURL / pre-flight check refused   InvalidInput, none
//   the components give no URL                 FailedToBuildRequest, none
//   body object not valid JSON                 FailedToBuildRequest, domain error 1
//   JSON writing failed                        FailedToBuildRequest, the writer's error
//   transport error -999 in URLErrorDomain     Cancelled, the transport error
//   any other transport error                  RequestFailed, the transport error
//   no URL session                             RequestFailed, URLErrorUnknown
//   HTTP 401 / 403                             Unauthorized / AccessDenied, none
//   answer not declared as JSON (not allowed)  InvalidContentType, domain error 2
// The transport error wins over 401/403, which win over the content type.
// A subclass that does not override processHTTPUrlResponse() leaves an
// accepted operation Executing for ever.
//
// The class writes nothing to any log.
//
// Thread contract: start() runs on a worker of the queue; the task's
// completion, didCompleteUrlRequest() and processHTTPUrlResponse() run on
// the URL session's delegate queue. The task callback holds the operation
// weakly: a host that drops every reference to a running operation drops its
// result. cancel() may come from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "kivi/export.h"
#include "kivi/operations/kiv_url_session_task_operation.h"
#include "kivi/text/json_serialization.h"

namespace kivi {

// How a KivJSONAPIOperation ended (see the outcomes above); InvalidServerResponse is for a
// subclass that cannot use an accepted answer.
enum KivJSONAPIOperationCompletionStatus : std::uint64_t {
  KivJSONAPIOperationCompletionStatusSuccess = 0,
  KivJSONAPIOperationCompletionStatusCancelled = 1,
  KivJSONAPIOperationCompletionStatusInvalidInput = 2,
  KivJSONAPIOperationCompletionStatusFailedToBuildRequest = 3,
  KivJSONAPIOperationCompletionStatusRequestFailed = 4,
  KivJSONAPIOperationCompletionStatusInvalidContentType = 5,
  KivJSONAPIOperationCompletionStatusAccessDenied = 6,
  KivJSONAPIOperationCompletionStatusUnauthorized = 7,
  KivJSONAPIOperationCompletionStatusInvalidServerResponse = 8,
};

// The domain of the errors the operation makes itself.
inline constexpr const char* KivJSONAPIOperationErrorDomain =
    "com.zorvik.kiviossdk.KivJSONAPIOperation.errorDomain";
// httpJSONPostObject() gave a value that is not valid JSON.
inline constexpr std::int64_t KivJSONAPIJSONConversionErrorCode = 1;
// The answer was not declared as JSON; the user info holds its header fields under
// ResponseHeadersKeyName.
inline constexpr std::int64_t KivJSONAPIInvalidContentTypeError = 2;
// The requests' time-out in seconds.
inline constexpr double DefaultJSONAPITimeout = 30.0;
// The user-info key of an InvalidContentType error's response header fields (a Dictionary;
// absent when the answer had none).
inline constexpr const char* ResponseHeadersKeyName = "Response headers";

class KIVI_EXPORT KivJSONAPIOperation : public KivUrlSessionTaskOperationObjC {
 public:
  // initWithRestApiURL:urlSession:. The URL is not checked here: a null URL
  // ends in InvalidInput when the operation starts.
  KivJSONAPIOperation(URLPtr restApiURL, URLSessionPtr urlSession);

  // Whether "Content-Type" (exact key) holds, between ";"s, a part equal to
  // "application/json" ignoring case but not white space.
  static bool responseHeadersIndicateJsonContentType(const StringDictionary& headers);
  // "KivJSONAPIOperationCompletionStatusSuccess", …; "Unknown <n>" otherwise.
  static std::string descriptionForCompletionStatus(std::uint64_t status);

  void start() override;

  // Hooks: start() calls performPreFlightChecks(), then startNetworkRequest(), which builds the
  // request from the hooks after it. A subclass overrides those it needs.

  // Checks before anything is sent; false completes with InvalidInput. By default, true
  // exactly when restApiURL() is set.
  virtual bool performPreFlightChecks();
  // Builds the request, then makes, stores and resumes the data task; completes with
  // FailedToBuildRequest when there is no request, RequestFailed when there is no session.
  virtual void startNetworkRequest();
  // The task's completion: stores the response, completes as the outcomes above say, and
  // hands an accepted answer to processHTTPUrlResponse().
  virtual void didCompleteUrlRequest(const URLRequest& request, const std::optional<Data>& data,
                                     HTTPURLResponsePtr response, ErrorPtr error);
  // restApiURL() with additionalQueryParameters() added, httpMethod(), httpHeaders(), the body
  // and DefaultJSONAPITimeout; none when it cannot be built. Writes *error on every call (null
  // on success).
  virtual std::optional<URLRequest> createURLRequestWithError(ErrorPtr* error);
  // {"Content-Type": "application/json", "Accept": "application/json"} merged
  // with additionalHttpHeaders() (exact keys: an additional entry replaces a
  // default with the identical key).
  virtual StringDictionary httpHeaders();
  // Header fields to add; none by default.
  virtual std::optional<StringDictionary> additionalHttpHeaders();
  // Query items to add to restApiURL(); none by default.
  virtual std::optional<StringDictionary> additionalQueryParameters();
  // httpJSONPostObject() written with jsonWritingOptions(); none when there is no object or
  // on an error (KivJSONAPIJSONConversionErrorCode for an object that is not valid JSON).
  // Writes *error on every call (null on success).
  virtual std::optional<Data> httpPostBodyWithError(ErrorPtr* error);
  // The object to send as the body; none (no body) by default.
  virtual std::optional<Value> httpJSONPostObject();
  // "GET" by default.
  virtual std::string httpMethod();
  // Interpret an accepted answer and complete. Does nothing by default.
  virtual void processHTTPUrlResponse(HTTPURLResponsePtr response, const std::optional<Data>& data);
  // Sets completionStatus, then completionError, then completes.
  virtual void completeOperationWithStatus(std::uint64_t status, ErrorPtr completionError);

  // Whether an answer not declared as JSON goes to processHTTPUrlResponse(); false by default.
  virtual bool shouldAllowNonJSONContentTypeResponses() const;
  virtual void setShouldAllowNonJSONContentTypeResponses(bool allow);
  // The endpoint the operation was made with.
  const URLPtr& restApiURL() const noexcept { return restApiURL_; }
  // How the body is written; JSONWritingPrettyPrinted by default.
  virtual JSONWritingOptions jsonWritingOptions() const;
  virtual void setJsonWritingOptions(JSONWritingOptions options);
  // How the operation ended, a KivJSONAPIOperationCompletionStatus; Success until set.
  virtual std::uint64_t completionStatus() const;
  virtual void setCompletionStatus(std::uint64_t status);

  Value valueForKey(std::string_view key) const override;

 private:
  const URLPtr restApiURL_;
  std::atomic<bool> allowNonJSON_{false};
  std::atomic<JSONWritingOptions> jsonWritingOptions_{JSONWritingPrettyPrinted};
  std::atomic<std::uint64_t> completionStatus_{KivJSONAPIOperationCompletionStatusSuccess};
};

}  // namespace kivi
