// POCO's synchronous HTTP client: HTTPClientSession, and HTTPSClientSession
// over TLS, each a keep-alive connection used by one thread.
//
//   seq            one session; each GET sent when the previous answer has
//                  been read
//   c64, tls64     8 threads, each with its own session (so 8 connections);
//                  a round is 64 GETs, 8 one after the other on each thread,
//                  and all threads wait for each other before the next round
//   h2_64          not run: the library has no HTTP/2 client
//
// The server's certificate is checked against --cacert (the Context's
// caLocation, the system's CAs not loaded), host name included. See
// peer_common.h for the command line and the printed line.
#include <Poco/Exception.h>
#include <Poco/Net/Context.h>
#include <Poco/Net/HTTPClientSession.h>
#include <Poco/Net/HTTPRequest.h>
#include <Poco/Net/HTTPResponse.h>
#include <Poco/Net/HTTPSClientSession.h>
#include <Poco/Net/RejectCertificateHandler.h>
#include <Poco/Net/SSLManager.h>
#include <Poco/StreamCopier.h>
#include <Poco/Timespan.h>

#include <atomic>
#include <barrier>
#include <istream>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "peer_common.h"

namespace {

using namespace kivi::bench::peers;

const std::string kClient = "poco";

class Client {
 public:
  Client(const Endpoint& endpoint, const Poco::Net::Context::Ptr& context)
      : request_(Poco::Net::HTTPRequest::HTTP_GET, std::string(kPath),
                 Poco::Net::HTTPMessage::HTTP_1_1) {
    if (context) {
      session_ =
          std::make_unique<Poco::Net::HTTPSClientSession>(endpoint.host, endpoint.port, context);
    } else {
      session_ = std::make_unique<Poco::Net::HTTPClientSession>(endpoint.host, endpoint.port);
    }
    session_->setKeepAlive(true);
    session_->setTimeout(Poco::Timespan(30, 0));
    request_.setHost(endpoint.host, endpoint.port);
    request_.setKeepAlive(true);
    request_.set("Content-Type", kContentType);
    request_.set("Accept", kAccept);
  }

  // Empty when the GET succeeded, else what went wrong.
  std::string get() {
    try {
      session_->sendRequest(request_);
      Poco::Net::HTTPResponse response;
      std::istream& in = session_->receiveResponse(response);
      body_.clear();
      Poco::StreamCopier::copyToString(in, body_);
      const long status = static_cast<long>(response.getStatus());
      if (status == 200 && body_ == kAnswer) return {};
      return describeAnswer(status, body_);
    } catch (const Poco::Exception& error) {
      return error.displayText();
    } catch (const std::exception& error) {
      return error.what();
    }
  }

 private:
  std::unique_ptr<Poco::Net::HTTPClientSession> session_;
  Poco::Net::HTTPRequest request_;
  std::string body_;
};

int runSequential(const Options& options, Client& client) {
  if (const std::string error = client.get(); !error.empty()) fail(kClient, "warm-up: " + error);
  Meter meter;
  int completed = 0;
  std::string error;
  meter.start();
  for (int i = 0; i < options.requests && error.empty(); ++i) {
    error = client.get();
    ++completed;
  }
  meter.stop();
  return finish(kClient, options, completed, meter, error.empty() ? 0 : 1, error);
}

int runConcurrent(const Options& options, std::vector<std::unique_ptr<Client>>& clients) {
  if (const std::string error = clients[0]->get(); !error.empty()) {
    fail(kClient, "warm-up: " + error);
  }
  constexpr int kPerThread = kConcurrent / kConnections;
  std::atomic<int> completed{0};
  std::atomic<int> failures{0};
  std::mutex mutex;
  std::string firstFailure;  // guarded by mutex
  // Start and end of the measured part: the workers and this thread.
  std::barrier edges(kConnections + 1);
  // End of a round: the workers.
  std::barrier roundEnd(kConnections);
  std::vector<std::thread> workers;
  for (auto& client : clients) {
    workers.emplace_back([&, client = client.get()] {
      edges.arrive_and_wait();
      for (int r = 0; r < options.rounds; ++r) {
        for (int i = 0; i < kPerThread; ++i) {
          std::string error = client->get();
          completed.fetch_add(1);
          if (!error.empty()) {
            std::lock_guard lock(mutex);
            if (failures.fetch_add(1) == 0) firstFailure = std::move(error);
          }
        }
        roundEnd.arrive_and_wait();
        // Every worker sees the same count here, so all stop together.
        if (failures.load() != 0) break;
      }
      edges.arrive_and_wait();
    });
  }

  Meter meter;
  meter.start();
  edges.arrive_and_wait();
  edges.arrive_and_wait();
  meter.stop();
  for (auto& worker : workers) worker.join();
  return finish(kClient, options, completed.load(), meter, failures.load(), firstFailure);
}

}  // namespace

int main(int argc, char** argv) {
  const Options options = parseOptions(kClient, argc, argv);
  if (options.mode == Mode::h2_64) {
    printSkip(kClient, modeName(options.mode), "no HTTP/2 client in POCO");
    return 0;
  }
  const Endpoint endpoint = kivi::bench::peers::endpoint(kClient, options);
  Poco::Net::Context::Ptr context;
  if (options.https()) {
    Poco::Net::initializeSSL();
    context = new Poco::Net::Context(Poco::Net::Context::CLIENT_USE, "", "", options.cacert,
                                     Poco::Net::Context::VERIFY_RELAXED, 9, false);
    // A certificate that does not verify ends the handshake with an error.
    Poco::Net::SSLManager::instance().initializeClient(
        nullptr, new Poco::Net::RejectCertificateHandler(false), context);
  }
  std::vector<std::unique_ptr<Client>> clients;
  const int count = isConcurrent(options.mode) ? kConnections : 1;
  for (int i = 0; i < count; ++i) {
    clients.push_back(std::make_unique<Client>(endpoint, context));
  }
  const int status = isConcurrent(options.mode) ? runConcurrent(options, clients)
                                                : runSequential(options, *clients[0]);
  clients.clear();
  if (options.https()) Poco::Net::uninitializeSSL();
  return status;
}
