// The baseline: bare libcurl, driven the way a careful C++ program drives it.
//
//   seq            one easy handle, curl_easy_perform for each GET, so the
//                  connection is kept and reused
//   c64, tls64     one multi handle with CURLMOPT_MAX_HOST_CONNECTIONS 8
//                  (and a connection cache of 8); 64 reused easy handles
//                  added at once each round, HTTP/1.1
//   h2_64          the same with CURLPIPE_MULTIPLEX and CURLOPT_PIPEWAIT,
//                  HTTP/2 over TLS: the 64 share one connection
//
// The multi handle is driven on the calling thread: curl_multi_perform, then
// curl_multi_poll, except right after a transfer has ended (see round()).
// The server's certificate is checked against --cacert (CURLOPT_CAINFO).
// Each request carries the headers the library's REST operation sends
// (Content-Type and Accept application/json) and offers the same content
// encodings. See peer_common.h for the command line and the printed line.
#include <curl/curl.h>

#include <string>
#include <vector>

#include "peer_common.h"

namespace {

using namespace kivi::bench::peers;

const std::string kClient = "curl";

struct Transfer {
  CURL* easy = nullptr;
  std::string body;
};

std::size_t appendBody(char* buffer, std::size_t size, std::size_t count, void* user) {
  static_cast<Transfer*>(user)->body.append(buffer, size * count);
  return size * count;
}

// Empty when the transfer succeeded, else what went wrong.
std::string verdict(CURLcode result, Transfer& transfer) {
  if (result != CURLE_OK) return curl_easy_strerror(result);
  long status = 0;
  curl_easy_getinfo(transfer.easy, CURLINFO_RESPONSE_CODE, &status);
  if (status == 200 && transfer.body == kAnswer) return {};
  return describeAnswer(status, transfer.body);
}

void configure(Transfer& transfer, const Options& options, curl_slist* headers) {
  CURL* easy = transfer.easy;
  curl_easy_setopt(easy, CURLOPT_URL, options.url().c_str());
  curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
  curl_easy_setopt(easy, CURLOPT_TCP_NODELAY, 1L);
  curl_easy_setopt(easy, CURLOPT_HTTPGET, 1L);
  curl_easy_setopt(easy, CURLOPT_ACCEPT_ENCODING, "");
  curl_easy_setopt(easy, CURLOPT_HTTPHEADER, headers);
  curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, appendBody);
  curl_easy_setopt(easy, CURLOPT_WRITEDATA, &transfer);
  curl_easy_setopt(easy, CURLOPT_PRIVATE, &transfer);
  if (options.https()) curl_easy_setopt(easy, CURLOPT_CAINFO, options.cacert.c_str());
  if (options.mode == Mode::h2_64) {
    curl_easy_setopt(easy, CURLOPT_HTTP_VERSION, CURL_HTTP_VERSION_2TLS);
    curl_easy_setopt(easy, CURLOPT_PIPEWAIT, 1L);
  } else {
    curl_easy_setopt(easy, CURLOPT_HTTP_VERSION, CURL_HTTP_VERSION_1_1);
  }
}

int runSequential(const Options& options, curl_slist* headers) {
  Transfer transfer;
  transfer.easy = curl_easy_init();
  configure(transfer, options, headers);
  auto get = [&] {
    transfer.body.clear();
    return verdict(curl_easy_perform(transfer.easy), transfer);
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
  curl_easy_cleanup(transfer.easy);
  return finish(kClient, options, completed, meter, error.empty() ? 0 : 1, error);
}

class MultiRunner {
 public:
  MultiRunner(const Options& options, curl_slist* headers) : transfers_(kConcurrent) {
    multi_ = curl_multi_init();
    curl_multi_setopt(multi_, CURLMOPT_MAX_HOST_CONNECTIONS, static_cast<long>(kConnections));
    // Without it the connection cache holds four connections per transfer
    // in the handle, so connections are closed as a round's last transfers
    // end and opened again in the next round.
    curl_multi_setopt(multi_, CURLMOPT_MAXCONNECTS, static_cast<long>(kConnections));
    curl_multi_setopt(multi_, CURLMOPT_PIPELINING,
                      options.mode == Mode::h2_64 ? CURLPIPE_MULTIPLEX : CURLPIPE_NOTHING);
    for (Transfer& transfer : transfers_) {
      transfer.easy = curl_easy_init();
      configure(transfer, options, headers);
    }
  }
  ~MultiRunner() {
    for (Transfer& transfer : transfers_) curl_easy_cleanup(transfer.easy);
    curl_multi_cleanup(multi_);
  }
  MultiRunner(const MultiRunner&) = delete;
  MultiRunner& operator=(const MultiRunner&) = delete;

  // Runs the first `count` transfers at once until all have ended; returns
  // the number that failed and keeps the first failure's description.
  int round(int count, std::string* firstFailure) {
    for (int i = 0; i < count; ++i) {
      transfers_[i].body.clear();
      curl_multi_add_handle(multi_, transfers_[i].easy);
    }
    int failures = 0;
    for (int ended = 0; ended < count;) {
      int running = 0;
      if (const CURLMcode code = curl_multi_perform(multi_, &running); code != CURLM_OK) {
        fail(kClient, curl_multi_strerror(code));
      }
      int endedNow = 0;
      int queued = 0;
      while (CURLMsg* message = curl_multi_info_read(multi_, &queued)) {
        if (message->msg != CURLMSG_DONE) continue;
        Transfer* transfer = nullptr;
        curl_easy_getinfo(message->easy_handle, CURLINFO_PRIVATE, &transfer);
        const std::string error = verdict(message->data.result, *transfer);
        curl_multi_remove_handle(multi_, transfer->easy);
        ++endedNow;
        if (!error.empty() && failures++ == 0) *firstFailure = error;
      }
      ended += endedNow;
      // A transfer that ended may leave work that no socket and no timer
      // announces: answers of other HTTP/2 streams already read and
      // buffered, or a transfer waiting for the connection just freed.
      // libcurl 7.88 then sleeps in curl_multi_poll for its whole time-out
      // (seen here as one-second stalls), so run it again at once.
      if (ended < count && endedNow == 0) curl_multi_poll(multi_, nullptr, 0, 1000, nullptr);
    }
    return failures;
  }

 private:
  CURLM* multi_ = nullptr;
  std::vector<Transfer> transfers_;
};

int runConcurrent(const Options& options, curl_slist* headers) {
  MultiRunner runner(options, headers);
  std::string error;
  if (runner.round(1, &error) != 0) fail(kClient, "warm-up: " + error);

  Meter meter;
  int completed = 0;
  int failures = 0;
  meter.start();
  for (int r = 0; r < options.rounds && failures == 0; ++r) {
    failures = runner.round(kConcurrent, &error);
    completed += kConcurrent;
  }
  meter.stop();
  return finish(kClient, options, completed, meter, failures, error);
}

}  // namespace

int main(int argc, char** argv) {
  const Options options = parseOptions(kClient, argc, argv);
  if (curl_global_init(CURL_GLOBAL_DEFAULT) != CURLE_OK) fail(kClient, "curl_global_init failed");
  curl_slist* headers =
      curl_slist_append(nullptr, (std::string("Content-Type: ") + kContentType).c_str());
  headers = curl_slist_append(headers, (std::string("Accept: ") + kAccept).c_str());
  const int status = isConcurrent(options.mode) ? runConcurrent(options, headers)
                                                : runSequential(options, headers);
  curl_slist_free_all(headers);
  curl_global_cleanup();
  return status;
}
