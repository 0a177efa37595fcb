// This library's REST path: every GET is a KivJSONAPIOperation run by a
// KivAsyncService on one URLSession, as an application would make it.
//
//   seq            a service of limit 1; each operation is added and waited
//                  for before the next
//   c64, tls64     a service that runs 64 operations at once, on a session
//                  whose HTTPMaximumConnectionsPerHost is 8; each round adds
//                  64 operations and waits until all have finished
//   h2_64          the same; the session offers HTTP/2 over TLS and waits
//                  for a connection being set up rather than open another
//                  (PIPEWAIT), so the 64 share one connection
//
// The session has no setting to refuse HTTP/2 over TLS: in tls64 it offers
// h2 like always, and talks HTTP/1.1 because the server offers nothing
// else. The server's certificate is trusted through SSL_CERT_FILE, which the
// session reads when it is made. See peer_common.h for the command line and
// the printed line.
#include <cstdlib>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "kivi/dispatch/operation_queue_protocol.h"
#include "kivi/net/url.h"
#include "kivi/net/url_session.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "peer_common.h"

namespace {

using namespace kivi::bench::peers;

const std::string kClient = "kivi";

// A GET that succeeds on a 200 whose body is exactly the expected answer.
class PeerGet : public kivi::KivJSONAPIOperation {
 public:
  using KivJSONAPIOperation::KivJSONAPIOperation;

  void processHTTPUrlResponse(kivi::HTTPURLResponsePtr response,
                              const std::optional<kivi::Data>& data) override {
    const std::string_view body =
        data ? std::string_view(reinterpret_cast<const char*>(data->data()), data->size())
             : std::string_view();
    const long status = response ? static_cast<long>(response->statusCode()) : 0;
    if (status == 200 && body == kAnswer) {
      completeOperationWithStatus(kivi::KivJSONAPIOperationCompletionStatusSuccess, nullptr);
      return;
    }
    {
      std::lock_guard lock(mutex_);
      answer_ = describeAnswer(status, body);
    }
    completeOperationWithStatus(kivi::KivJSONAPIOperationCompletionStatusInvalidServerResponse,
                                nullptr);
  }

  // Empty when the GET succeeded, else what went wrong. Call once finished.
  std::string verdict() const {
    const std::uint64_t status = completionStatus();
    if (status == kivi::KivJSONAPIOperationCompletionStatusSuccess) return {};
    std::string text = descriptionForCompletionStatus(status);
    if (const auto error = completionError()) text += ": " + error->localizedDescription();
    std::lock_guard lock(mutex_);
    if (!answer_.empty()) text += ": " + answer_;
    return text;
  }

 private:
  mutable std::mutex mutex_;
  std::string answer_;  // guarded by mutex_
};

int runSequential(const Options& options, const kivi::URLPtr& url,
                  const kivi::URLSessionPtr& session) {
  kivi::KivAsyncService service("peer_kivi", 1);
  const std::shared_ptr<kivi::OperationQueueProtocol> queue = service.operationQueue();
  auto get = [&] {
    auto operation = std::make_shared<PeerGet>(url, session);
    queue->addOperation(operation);
    operation->waitUntilFinished();
    return operation->verdict();
  };
  if (const std::string error = get(); !error.empty()) fail(kClient, "warm-up: " + error);

  Meter meter;
  int completed = 0;
  std::string error;
  meter.start();
  for (int i = 0; i < options.requests && error.empty(); ++i) {
    error = get();
    ++completed;
  }
  meter.stop();
  return finish(kClient, options, completed, meter, error.empty() ? 0 : 1, error);
}

int runConcurrent(const Options& options, const kivi::URLPtr& url,
                  const kivi::URLSessionPtr& session) {
  kivi::KivAsyncService service("peer_kivi", kConcurrent);
  const std::shared_ptr<kivi::OperationQueueProtocol> queue = service.operationQueue();
  std::vector<std::shared_ptr<PeerGet>> operations;
  operations.reserve(kConcurrent);
  std::string firstFailure;
  // Adds `count` operations at once, waits for all and returns how many
  // failed.
  auto round = [&](int count) {
    operations.clear();
    for (int i = 0; i < count; ++i) {
      operations.push_back(std::make_shared<PeerGet>(url, session));
      queue->addOperation(operations.back());
    }
    queue->waitUntilAllOperationsAreFinished();
    int failures = 0;
    for (const auto& operation : operations) {
      if (std::string error = operation->verdict(); !error.empty() && failures++ == 0) {
        firstFailure = std::move(error);
      }
    }
    return failures;
  };
  if (round(1) != 0) fail(kClient, "warm-up: " + firstFailure);

  Meter meter;
  int completed = 0;
  int failures = 0;
  meter.start();
  for (int r = 0; r < options.rounds && failures == 0; ++r) {
    failures = round(kConcurrent);
    completed += kConcurrent;
  }
  meter.stop();
  return finish(kClient, options, completed, meter, failures, firstFailure);
}

}  // namespace

int main(int argc, char** argv) {
  const Options options = parseOptions(kClient, argc, argv);
  // Read by the session when it is made.
  if (options.https()) setenv("SSL_CERT_FILE", options.cacert.c_str(), 1);
  const kivi::URLPtr url = kivi::URL::URLWithString(options.url());
  if (!url) fail(kClient, "not a URL: " + options.url());
  kivi::URLSessionConfiguration configuration =
      kivi::URLSessionConfiguration::defaultSessionConfiguration();
  if (isConcurrent(options.mode)) configuration.HTTPMaximumConnectionsPerHost = kConnections;
  const kivi::URLSessionPtr session = kivi::URLSession::sessionWithConfiguration(configuration);
  return isConcurrent(options.mode) ? runConcurrent(options, url, session)
                                    : runSequential(options, url, session);
}
