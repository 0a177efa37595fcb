// What the peer clients share: the command line, the work they do, how they
// measure it and the one line each prints.
//
// Every HTTP client runs one of four kinds of work against the server that
// scripts/peer_bench.py starts in its own process, so only the client's CPU
// time is in what is measured:
//
//   seq    N GETs of /json one after the other (default 10,000)
//   c64    R rounds (default 100) of 64 GETs started at once and all
//          awaited, HTTP/1.1, at most 8 connections
//   tls64  the same over HTTPS, HTTP/1.1
//   h2_64  the same over HTTPS, HTTP/2, all 64 on one connection
//
//   peer_curl --mode c64 --url-base http://127.0.0.1:8080 --cacert cert.pem
//
// Set-up and one warm-up request (which opens the first connection) come
// before the measured part. Every answer must be a 200 whose body is exactly
// kAnswer. The client then prints one JSON line on stdout:
//
//   {"client":"curl","mode":"c64","requests":6400,"wall_s":0.41,"cpu_s":0.38,"failures":0}
//
// wall_s is steady-clock time, cpu_s the process's user + system time
// (getrusage), both over the measured part only. A client that cannot do a
// kind of work prints {"client":…,"mode":…,"skipped":"why"} and exits 0; a
// failed request ends the run (after the round it belongs to) with a message
// on stderr and exit status 1.
//
// Thread contract: Meter and the helpers are for one thread at a time.
#pragma once

#include <sys/resource.h>

#include <charconv>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string>
#include <string_view>

namespace kivi::bench::peers {

enum class Mode { seq, c64, tls64, h2_64 };

inline constexpr std::string_view kAnswer = R"({"ok":true,"n":42})";
inline constexpr std::string_view kPath = "/json";
// Requests per round in the concurrent kinds of work, and the connections
// they may use.
inline constexpr int kConcurrent = 64;
inline constexpr int kConnections = 8;
// The request headers every client sends besides its own, as the library's
// REST operation does.
inline constexpr const char* kAccept = "application/json";
inline constexpr const char* kContentType = "application/json";

inline const char* modeName(Mode mode) {
  switch (mode) {
    case Mode::seq:
      return "seq";
    case Mode::c64:
      return "c64";
    case Mode::tls64:
      return "tls64";
    case Mode::h2_64:
      return "h2_64";
  }
  return "?";
}

inline bool isConcurrent(Mode mode) { return mode != Mode::seq; }

struct Options {
  Mode mode = Mode::seq;
  std::string urlBase;  // scheme://host:port, no trailing slash
  std::string cacert;   // the server's certificate, PEM; empty for plain HTTP
  int requests = 10'000;
  int rounds = 100;

  std::string url() const { return urlBase + std::string(kPath); }
  bool https() const { return urlBase.starts_with("https://"); }
  // The number of requests in the measured part.
  int total() const { return isConcurrent(mode) ? rounds * kConcurrent : requests; }
};

// The host and port of an http:// or https:// base URL, for clients that
// take them apart.
struct Endpoint {
  std::string host;
  std::uint16_t port = 0;
};

[[noreturn]] inline void fail(const std::string& client, const std::string& message) {
  std::fprintf(stderr, "peer_%s: %s\n", client.c_str(), message.c_str());
  std::exit(1);
}

inline std::optional<int> positive(std::string_view text) {
  int value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc() || end != text.data() + text.size() || value <= 0) return std::nullopt;
  return value;
}

// Reads the common command line; a bad one ends the process with a usage
// message.
inline Options parseOptions(const std::string& client, int argc, char** argv) {
  const std::string usage = "usage: peer_" + client +
                            " --mode seq|c64|tls64|h2_64 --url-base http://127.0.0.1:PORT"
                            " --cacert FILE [--requests N] [--rounds R]";
  Options options;
  bool haveMode = false;
  for (int i = 1; i < argc; ++i) {
    const std::string_view flag = argv[i];
    if (i + 1 >= argc) fail(client, "missing value after " + std::string(flag) + "\n" + usage);
    const std::string_view value = argv[++i];
    if (flag == "--mode") {
      haveMode = true;
      if (value == "seq") {
        options.mode = Mode::seq;
      } else if (value == "c64") {
        options.mode = Mode::c64;
      } else if (value == "tls64") {
        options.mode = Mode::tls64;
      } else if (value == "h2_64") {
        options.mode = Mode::h2_64;
      } else {
        fail(client, "unknown mode " + std::string(value) + "\n" + usage);
      }
    } else if (flag == "--url-base") {
      options.urlBase = value;
      while (options.urlBase.ends_with('/')) options.urlBase.pop_back();
    } else if (flag == "--cacert") {
      options.cacert = value;
    } else if (flag == "--requests" || flag == "--rounds") {
      const auto n = positive(value);
      if (!n) fail(client, std::string(flag) + " needs a positive integer\n" + usage);
      (flag == "--requests" ? options.requests : options.rounds) = *n;
    } else {
      fail(client, "unknown option " + std::string(flag) + "\n" + usage);
    }
  }
  if (!haveMode || options.urlBase.empty()) fail(client, usage);
  if (!options.urlBase.starts_with("http://") && !options.https()) {
    fail(client, "--url-base must start with http:// or https://");
  }
  if ((options.mode == Mode::tls64 || options.mode == Mode::h2_64) && !options.https()) {
    fail(client, std::string(modeName(options.mode)) + " needs an https:// --url-base");
  }
  if (options.https() && options.cacert.empty()) fail(client, "https needs --cacert");
  return options;
}

inline Endpoint endpoint(const std::string& client, const Options& options) {
  std::string_view rest = options.urlBase;
  rest.remove_prefix(rest.find("://") + 3);
  const auto colon = rest.rfind(':');
  Endpoint result;
  int port = 0;
  if (colon == std::string_view::npos) {
    port = options.https() ? 443 : 80;
  } else {
    const auto parsed = positive(rest.substr(colon + 1));
    if (!parsed || *parsed > 65535) fail(client, "bad port in " + options.urlBase);
    port = *parsed;
    rest = rest.substr(0, colon);
  }
  result.host = rest;
  result.port = static_cast<std::uint16_t>(port);
  return result;
}

inline std::string describeAnswer(long status, std::string_view body) {
  std::string text = "HTTP " + std::to_string(status) + ", body \"";
  text += body.substr(0, 64);
  text += body.size() > 64 ? "…\"" : "\"";
  return text;
}

// Wall and CPU time over the measured part.
class Meter {
 public:
  void start() {
    cpuStart_ = cpuSeconds();
    wallStart_ = std::chrono::steady_clock::now();
  }
  void stop() {
    wall_ = std::chrono::duration<double>(std::chrono::steady_clock::now() - wallStart_).count();
    cpu_ = cpuSeconds() - cpuStart_;
  }
  double wallSeconds() const { return wall_; }
  double cpu() const { return cpu_; }

  // The process's user + system time so far, every thread included.
  static double cpuSeconds() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    auto seconds = [](const timeval& t) { return t.tv_sec + t.tv_usec / 1e6; };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
  }

 private:
  std::chrono::steady_clock::time_point wallStart_;
  double cpuStart_ = 0;
  double wall_ = 0;
  double cpu_ = 0;
};

inline void printResult(const std::string& client, Mode mode, int requests, const Meter& meter,
                        int failures) {
  std::printf(
      "{\"client\":\"%s\",\"mode\":\"%s\",\"requests\":%d,\"wall_s\":%.6f,\"cpu_s\":%.6f,"
      "\"failures\":%d}\n",
      client.c_str(), modeName(mode), requests, meter.wallSeconds(), meter.cpu(), failures);
  std::fflush(stdout);
}

inline void printSkip(const std::string& client, const char* mode, const std::string& why) {
  std::printf("{\"client\":\"%s\",\"mode\":\"%s\",\"skipped\":\"%s\"}\n", client.c_str(), mode,
              why.c_str());
  std::fflush(stdout);
}

// Ends a run: prints the result line, and on failures the first one's
// description on stderr with exit status 1.
inline int finish(const std::string& client, const Options& options, int completed,
                  const Meter& meter, int failures, const std::string& firstFailure) {
  printResult(client, options.mode, completed, meter, failures);
  if (failures == 0) return 0;
  std::fprintf(stderr, "peer_%s: %d failed request(s); first: %s\n", client.c_str(), failures,
               firstFailure.c_str());
  return 1;
}

}  // namespace kivi::bench::peers
