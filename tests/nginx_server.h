// A real nginx on 127.0.0.1, started for a test and stopped with it: HTTPS
// with HTTP/2 on one port, HTTPS with HTTP/1.1 only on another, behind a
// self-signed certificate for 127.0.0.1 made for the run. Every answer is
// {"connection":N}, N being nginx's serial number of the connection it came
// on, so a client's use of connections can be counted from its answers.
#pragma once

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include "test_servers.h"

extern char** environ;

namespace kivi::testing {

class NginxServer {
 public:
  static constexpr const char* kNginx = "/usr/sbin/nginx";
  static constexpr const char* kOpenSSL = "/usr/bin/openssl";

  static bool available() { return ::access(kNginx, X_OK) == 0 && ::access(kOpenSSL, X_OK) == 0; }

  NginxServer() {
    char pattern[] = "/tmp/kivi-nginx-XXXXXX";
    dir_ = ::mkdtemp(pattern);
    std::filesystem::create_directory(dir_ + "/tmp");
    EXPECT_EQ(run({kOpenSSL, "req", "-x509", "-newkey", "ec", "-pkeyopt",
                   "ec_paramgen_curve:prime256v1", "-nodes", "-days", "1", "-subj", "/CN=127.0.0.1",
                   "-addext", "subjectAltName=IP:127.0.0.1", "-keyout", dir_ + "/key.pem", "-out",
                   certificateFile()}),
              0);
    http2Port_ = freePort();
    http1Port_ = freePort();
    const std::string answer =
        "location / { default_type application/json; return 200 '{\"connection\":$connection}'; }";
    std::ofstream(dir_ + "/nginx.conf")
        << "master_process off; daemon off; worker_processes 1;\n"
        << "error_log stderr error; pid " << dir_ << "/nginx.pid;\n"
        << "events { worker_connections 1024; }\n"
        << "http { access_log off; keepalive_requests 100000;\n"
        << "  client_body_temp_path " << dir_ << "/tmp; proxy_temp_path " << dir_ << "/tmp;\n"
        << "  fastcgi_temp_path " << dir_ << "/tmp; uwsgi_temp_path " << dir_ << "/tmp;\n"
        << "  scgi_temp_path " << dir_ << "/tmp;\n"
        << "  ssl_certificate " << certificateFile() << "; ssl_certificate_key " << dir_
        << "/key.pem;\n"
        << "  server { listen 127.0.0.1:" << http2Port_ << " ssl http2; " << answer << " }\n"
        << "  server { listen 127.0.0.1:" << http1Port_ << " ssl; " << answer << " }\n"
        << "}\n";
    const std::string prefix = dir_ + "/", conf = dir_ + "/nginx.conf";
    const char* argv[] = {kNginx, "-p", prefix.c_str(), "-c", conf.c_str(), nullptr};
    EXPECT_EQ(::posix_spawn(&pid_, kNginx, nullptr, nullptr, const_cast<char**>(argv), environ), 0);
    started_ = accepts(http2Port_) && accepts(http1Port_);
  }

  ~NginxServer() {
    if (pid_ > 0) {
      ::kill(pid_, SIGTERM);
      ::waitpid(pid_, nullptr, 0);
    }
    std::error_code ignored;
    std::filesystem::remove_all(dir_, ignored);
  }

  bool started() const { return started_; }
  std::string certificateFile() const { return dir_ + "/cert.pem"; }
  std::string http2URL(std::string_view path = "/") const { return url(http2Port_, path); }
  std::string http1URL(std::string_view path = "/") const { return url(http1Port_, path); }

 private:
  static std::string url(int port, std::string_view path) {
    return "https://127.0.0.1:" + std::to_string(port) + std::string(path);
  }
  static int freePort() {
    int port = 0;
    ::close(boundSocket(port));
    return port;
  }
  static bool accepts(int port) {
    const auto deadline = std::chrono::steady_clock::now() + kTimeout;
    while (std::chrono::steady_clock::now() < deadline) {
      const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
      sockaddr_in address{
          AF_INET, htons(static_cast<std::uint16_t>(port)), {htonl(INADDR_LOOPBACK)}, {}};
      const bool ok = ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
      ::close(fd);
      if (ok) return true;
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return false;
  }
  static int run(std::initializer_list<std::string> args) {
    std::vector<char*> argv;
    for (const std::string& arg : args) argv.push_back(const_cast<char*>(arg.c_str()));
    argv.push_back(nullptr);
    pid_t pid = 0;
    posix_spawn_file_actions_t quiet;  // openssl's chatter goes to /dev/null
    ::posix_spawn_file_actions_init(&quiet);
    ::posix_spawn_file_actions_addopen(&quiet, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
    const int spawned = ::posix_spawn(&pid, argv[0], &quiet, nullptr, argv.data(), environ);
    ::posix_spawn_file_actions_destroy(&quiet);
    if (spawned != 0) return -1;
    int status = 0;
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  std::string dir_;
  int http2Port_ = 0, http1Port_ = 0;
  pid_t pid_ = -1;
  bool started_ = false;
};

}  // namespace kivi::testing
