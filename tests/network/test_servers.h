// Servers for the network suites, on 127.0.0.1 with ephemeral ports:
// HttpServer (cpp-httplib, the suites' routes) and RawServer (connections
// scripted byte by byte, for answers no sane server gives). Every wait on the
// servers' side is bounded by kServerWait.
#pragma once

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <httplib.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "kivi/foundation/url_request.h"
#include "test_support.h"

namespace kivi::testing {

inline constexpr std::chrono::milliseconds kServerWait = std::chrono::seconds(2);

struct ReceivedRequest {
  std::string method, target, body;
  std::vector<std::pair<std::string, std::string>> headers;  // as sent
  std::multimap<std::string, std::string> params;            // as httplib decoded the query
  std::vector<std::string> values(std::string_view name) const {
    std::vector<std::string> out;
    for (const auto& [key, value] : headers)
      if (headerFieldNamesEqual(key, name)) out.push_back(value);
    return out;
  }
};

// The requests a server has read; `arrived` is notified once per request.
class RequestLog {
 public:
  void add(ReceivedRequest request) {
    {
      std::lock_guard lock(mutex_);
      requests_.push_back(std::move(request));
    }
    arrived.notify();
  }
  std::vector<ReceivedRequest> requests() const {
    std::lock_guard lock(mutex_);
    return requests_;
  }
  std::size_t count() const { return requests().size(); }
  Signal arrived;

 private:
  mutable std::mutex mutex_;
  std::vector<ReceivedRequest> requests_;
};

inline sockaddr_in loopback() {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  return address;
}

// A 127.0.0.1 port that nobody listens on: bound without listening, then freed.
inline int unusedPort() {
  const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in address = loopback();
  socklen_t length = sizeof address;
  ::bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address);
  ::getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
  ::close(fd);
  return ntohs(address.sin_port);
}

// GET /hello: "hello" as text/plain, with a header sent as "x-thing: yes".
// GET /redirect: 302 to /hello. GET /loop: 302 to itself.
// GET /status/<n>?type=<t>: status n, {"status":n}, Content-Type t (JSON by default).
// GET /gate: answers {"ok":true} once release() is called (or kServerWait passed).
// Any other GET: {"ok":true} as application/json. POST, PUT: "<method> <body>".
class HttpServer {
 public:
  HttpServer() {
    server_.set_tcp_nodelay(true).set_keep_alive_timeout(1);
    const auto handler = [this](const httplib::Request& req, httplib::Response& res) {
      ReceivedRequest received{req.method, req.target, req.body, {}, {}};
      received.headers.assign(req.headers.begin(), req.headers.end());
      received.params.insert(req.params.begin(), req.params.end());
      log.add(std::move(received));
      answer(req, res);
    };
    server_.Get(".*", handler).Post(".*", handler).Put(".*", handler);
    port_ = server_.bind_to_any_port("127.0.0.1");
    // Called on the listening thread once it accepts; stop() works from then on.
    server_.new_task_queue = [this] {
      listening_.notify();
      return new httplib::ThreadPool(8);
    };
    thread_ = std::thread([this] { server_.listen_after_bind(); });
    EXPECT_TRUE(listening_.wait()) << "the HTTP server did not start";
  }
  ~HttpServer() {
    release();
    server_.stop();
    thread_.join();
  }

  std::string url(std::string_view path) const {
    return "http://127.0.0.1:" + std::to_string(port_) + std::string(path);
  }
  void release() { gate_.notify(); }
  RequestLog log;

 private:
  void answer(const httplib::Request& req, httplib::Response& res) {
    const std::string json = "application/json";
    if (req.method != "GET") {
      res.set_content(req.method + " " + req.body, "text/plain");
    } else if (req.path == "/hello") {
      res.set_header("x-thing", "yes");
      res.set_content("hello", "text/plain");
    } else if (req.path == "/redirect" || req.path == "/loop") {
      res.set_redirect(req.path == "/loop" ? "/loop" : "/hello");
    } else if (req.path.starts_with("/status/")) {
      res.status = std::stoi(req.path.substr(8));
      res.set_content("{\"status\":" + req.path.substr(8) + "}",
                      req.has_param("type") ? req.get_param_value("type") : json);
    } else {
      if (req.path == "/gate") gate_.wait(1, kServerWait);
      res.set_content("{\"ok\":true}", json);
    }
  }

  httplib::Server server_;
  int port_ = 0;
  Signal listening_, gate_;
  std::thread thread_;
};

// Waits for `fd` to become readable; false once `stop` is readable (the
// server is stopping) or the deadline passed.
inline bool readable(int fd, int stop, std::chrono::steady_clock::time_point deadline) {
  using namespace std::chrono;
  const auto left = duration_cast<milliseconds>(deadline - steady_clock::now()).count();
  pollfd fds[2] = {{fd, POLLIN, 0}, {stop, POLLIN, 0}};
  return left > 0 && ::poll(fds, 2, static_cast<int>(left)) > 0 && fds[1].revents == 0;
}

// One accepted connection, as the server's script sees it.
class RawConnection {
 public:
  RawConnection(int fd, int stop, RequestLog& log) : fd_(fd), stop_(stop), log_(log) {}
  ~RawConnection() {
    if (fd_ >= 0) ::close(fd_);
  }
  // The next request (head, then Content-Length bytes of body); none when the
  // peer closed, the server is stopping or `timeout` passed.
  std::optional<ReceivedRequest> readRequest(std::chrono::milliseconds timeout = kServerWait);
  // False once the peer is gone (no SIGPIPE; a send gives up after kServerWait).
  bool write(std::string_view bytes) {
    for (ssize_t n = 0; fd_ >= 0 && !bytes.empty(); bytes.remove_prefix(std::size_t(n)))
      if ((n = ::send(fd_, bytes.data(), bytes.size(), MSG_NOSIGNAL)) <= 0) return false;
    return bytes.empty();
  }
  void waitForPeerClose() {
    const auto deadline = std::chrono::steady_clock::now() + kServerWait;
    while (fill(deadline)) buffer_.clear();
  }
  // Closes with RST instead of FIN.
  void reset() {
    const linger abort{1, 0};
    ::setsockopt(fd_, SOL_SOCKET, SO_LINGER, &abort, sizeof abort);
    ::close(std::exchange(fd_, -1));
  }

 private:
  bool fill(std::chrono::steady_clock::time_point deadline) {
    char chunk[16384];
    ssize_t n = 0;
    if (fd_ >= 0 && readable(fd_, stop_, deadline)) n = ::recv(fd_, chunk, sizeof chunk, 0);
    if (n > 0) buffer_.append(chunk, std::size_t(n));
    return n > 0;
  }
  int fd_;
  const int stop_;
  RequestLog& log_;
  std::string buffer_;
};

inline std::optional<ReceivedRequest> RawConnection::readRequest(
    std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  std::size_t end;
  while ((end = buffer_.find("\r\n\r\n")) == std::string::npos)
    if (buffer_.size() > (1 << 20) || !fill(deadline)) return std::nullopt;
  ReceivedRequest request;
  std::string_view head(buffer_.data(), end + 2);
  auto line = [&] {
    const auto eol = head.find("\r\n");
    const std::string_view text = head.substr(0, eol);
    head.remove_prefix(eol + 2);
    return text;
  };
  const std::string_view requestLine = line();
  const auto space = requestLine.find(' ');
  request.method = requestLine.substr(0, space);
  request.target = requestLine.substr(space + 1, requestLine.rfind(' ') - space - 1);
  std::size_t length = 0;
  while (!head.empty()) {
    const std::string_view field = line();
    const auto colon = field.find(':');
    const auto value =
        field.substr(std::min(field.find_first_not_of(' ', colon + 1), field.size()));
    request.headers.emplace_back(field.substr(0, colon), value);
    if (headerFieldNamesEqual(field.substr(0, colon), "Content-Length"))
      length = std::stoul(std::string(value));
  }
  buffer_.erase(0, end + 4);
  while (buffer_.size() < length)
    if (!fill(deadline)) return std::nullopt;
  request.body = buffer_.substr(0, length);
  buffer_.erase(0, length);
  log_.add(request);
  return request;
}

// Runs `script` on a thread of its own for each connection it accepts (at
// most kMaxConnections). The destructor wakes every wait through a pipe.
class RawServer {
 public:
  using Script = std::function<void(RawConnection&)>;
  static constexpr std::size_t kMaxConnections = 256;

  explicit RawServer(Script script) : script_(std::move(script)) {
    listener_ = ::socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in address = loopback();
    socklen_t length = sizeof address;
    EXPECT_TRUE(::pipe(stop_) == 0 &&
                ::bind(listener_, reinterpret_cast<sockaddr*>(&address), length) == 0 &&
                ::listen(listener_, 16) == 0 &&
                ::getsockname(listener_, reinterpret_cast<sockaddr*>(&address), &length) == 0);
    port_ = ntohs(address.sin_port);
    acceptor_ = std::thread([this] {
      const auto forever = std::chrono::steady_clock::time_point::max();
      while (scripts_.size() < kMaxConnections && readable(listener_, stop_[0], forever)) {
        const int fd = ::accept(listener_, nullptr, nullptr);
        const int on = 1;
        const timeval sendLimit{kServerWait.count() / 1000, 0};
        ::setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
        ::setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &sendLimit, sizeof sendLimit);
        ++accepted_;
        scripts_.emplace_back([this, fd] {
          RawConnection connection(fd, stop_[0], log);
          script_(connection);
        });
      }
    });
  }
  ~RawServer() {
    ::close(stop_[1]);  // every poll on stop_[0] now returns
    acceptor_.join();
    for (auto& thread : scripts_) thread.join();
    ::shutdown(listener_, SHUT_RDWR);
    for (int fd : {listener_, stop_[0]}) ::close(fd);
  }

  std::string url(std::string_view path = "/") const {
    return "http://127.0.0.1:" + std::to_string(port_) + std::string(path);
  }
  int connections() const { return accepted_; }
  RequestLog log;

 private:
  const Script script_;
  int listener_ = -1, port_ = 0, stop_[2] = {-1, -1};
  std::atomic<int> accepted_{0};
  std::vector<std::thread> scripts_;  // the acceptor's, then the destructor's
  std::thread acceptor_;
};

}  // namespace kivi::testing
