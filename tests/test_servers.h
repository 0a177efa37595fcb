// Servers for the network suites, on 127.0.0.1 with ephemeral ports:
// HttpServer (cpp-httplib) and RawServer (connections scripted byte by byte,
// for answers no sane server gives). Every wait on the servers' side ends
// after kServerWait at the latest.
#pragma once

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <httplib.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "test_support.h"

namespace kivi::testing {

inline constexpr std::chrono::milliseconds kServerWait = std::chrono::seconds(2);

// A socket bound to 127.0.0.1 (nobody listens yet) and its port.
inline int boundSocket(int& port) {
  const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in address{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
  socklen_t length = sizeof address;
  EXPECT_EQ(::bind(fd, reinterpret_cast<sockaddr*>(&address), length), 0);
  ::getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
  port = ntohs(address.sin_port);
  return fd;
}
inline std::string refusedURL() {
  int port = 0;
  ::close(boundSocket(port));
  return "http://127.0.0.1:" + std::to_string(port) + "/";
}

// Every answer carries "x-thing: yes". GET /status/<n>?type=<t>: status n,
// {"status":n} as t (JSON by default). /redirect: 302 to /status/200; /loop:
// 302 to itself. /gate: {"ok":true} once release() is called. Anything else
// (any method): {"ok":true}. A "set-cookie" query parameter comes back as
// the answer's Set-Cookie field.
class HttpServer {
 public:
  struct Received {
    std::string method, target, body;
    httplib::Headers headers;  // names compare ignoring case
  };

  HttpServer() {
    server_.set_tcp_nodelay(true).set_keep_alive_timeout(1);
    const auto handler = [this](const httplib::Request& req, httplib::Response& res) {
      {
        std::lock_guard lock(mutex_);
        requests_.push_back({req.method, req.target, req.body, req.headers});
      }
      arrived.notify();
      res.set_header("x-thing", "yes");
      if (req.has_param("set-cookie"))
        res.set_header("Set-Cookie", req.get_param_value("set-cookie"));
      if (req.path == "/redirect" || req.path == "/loop")
        return res.set_redirect(req.path == "/loop" ? "/loop" : "/status/200");
      if (req.path == "/gate") gate_.wait(1, kServerWait);
      const auto code = req.path.starts_with("/status/") ? req.path.substr(8) : "";
      const std::string type = req.get_param_value("type");
      res.status = code.empty() ? 200 : std::stoi(code);
      res.set_content(code.empty() ? "{\"ok\":true}" : "{\"status\":" + code + "}",
                      type.empty() ? "application/json" : type);
    };
    server_.Get(".*", handler).Post(".*", handler).Put(".*", handler);
    port_ = server_.bind_to_any_port("127.0.0.1");
    server_.new_task_queue = [this] {  // on the listening thread; stop() works from then on
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
  std::vector<Received> requests() const {
    std::lock_guard lock(mutex_);
    return requests_;
  }
  Signal arrived;  // once per request

 private:
  httplib::Server server_;
  int port_ = 0;
  Signal listening_, gate_;
  std::thread thread_;
  mutable std::mutex mutex_;
  std::vector<Received> requests_;
};

// One accepted connection, as the server's script sees it. Every wait ends
// when the server stops (`stop` becomes readable) or after kServerWait.
class RawConnection {
 public:
  RawConnection(int fd, int stop) : fd_(fd), stop_(stop) {}
  ~RawConnection() {
    if (fd_ >= 0) ::close(fd_);
  }
  // The next request as sent (head, then a Content-Length body); none when
  // the peer closed, the server is stopping or kServerWait passed.
  std::optional<std::string> readRequest() {
    const auto deadline = std::chrono::steady_clock::now() + kServerWait;
    std::size_t end = 0;
    while ((end = buffer_.find("\r\n\r\n")) == std::string::npos)
      if (!fill(deadline)) return std::nullopt;
    const auto field = buffer_.substr(0, end).find("Content-Length: ");
    end += 4 + (field == std::string::npos ? 0 : std::stoul(buffer_.substr(field + 16)));
    while (buffer_.size() < end)
      if (!fill(deadline)) return std::nullopt;
    std::string request = buffer_.substr(0, end);
    buffer_.erase(0, end);
    return request;
  }
  // False once the peer has gone (or kServerWait passed on a full socket).
  bool write(std::string_view bytes) {
    for (ssize_t n = 0; fd_ >= 0 && !bytes.empty(); bytes.remove_prefix(std::size_t(n)))
      if ((n = ::send(fd_, bytes.data(), bytes.size(), MSG_NOSIGNAL)) <= 0) return false;
    return fd_ >= 0;
  }
  void reset() {  // closes with RST instead of FIN
    const linger abort{1, 0};
    ::setsockopt(fd_, SOL_SOCKET, SO_LINGER, &abort, sizeof abort);
    ::close(std::exchange(fd_, -1));
  }

 private:
  bool fill(std::chrono::steady_clock::time_point deadline) {
    using namespace std::chrono;
    const auto left = duration_cast<milliseconds>(deadline - steady_clock::now()).count();
    pollfd fds[2] = {{fd_, POLLIN, 0}, {stop_, POLLIN, 0}};
    char chunk[16384];
    const bool ready = fd_ >= 0 && left > 0 && ::poll(fds, 2, int(left)) > 0 && !fds[1].revents;
    const ssize_t n = ready ? ::recv(fd_, chunk, sizeof chunk, 0) : 0;
    if (n > 0) buffer_.append(chunk, std::size_t(n));
    return n > 0;
  }
  int fd_;
  const int stop_;
  std::string buffer_;
};

// Runs `script` on a thread of its own for each connection it accepts.
class RawServer {
 public:
  explicit RawServer(std::function<void(RawConnection&)> script) : script_(std::move(script)) {
    listener_ = boundSocket(port_);
    EXPECT_TRUE(::pipe(stop_) == 0 && ::listen(listener_, 16) == 0);
    acceptor_ = std::thread([this] {
      pollfd fds[2] = {{listener_, POLLIN, 0}, {stop_[0], POLLIN, 0}};
      while (::poll(fds, 2, -1) > 0 && !fds[1].revents) {
        const int fd = ::accept(listener_, nullptr, nullptr), on = 1;
        const timeval sendLimit{kServerWait.count() / 1000, 0};
        ::setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
        ::setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &sendLimit, sizeof sendLimit);
        ++connections_;
        scripts_.emplace_back([this, fd] {
          RawConnection connection(fd, stop_[0]);
          script_(connection);
        });
      }
    });
  }
  ~RawServer() {
    ::close(stop_[1]);  // every poll on stop_[0] now returns
    acceptor_.join();
    for (auto& thread : scripts_) thread.join();
    for (int fd : {listener_, stop_[0]}) ::close(fd);
  }
  std::string url(std::string_view path = "/") const {
    return "http://127.0.0.1:" + std::to_string(port_) + std::string(path);
  }
  int connections() const { return connections_; }

 private:
  const std::function<void(RawConnection&)> script_;
  int listener_ = -1, port_ = 0, stop_[2] = {-1, -1};
  std::atomic<int> connections_{0};
  std::vector<std::thread> scripts_;  // the acceptor's, then the destructor's
  std::thread acceptor_;
};

}  // namespace kivi::testing
