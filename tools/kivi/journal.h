// The demo's output: timestamped lines and headings from any thread.
#pragma once

#include <chrono>
#include <cstdio>
#include <iomanip>
#include <mutex>
#include <ostream>
#include <string>

namespace kivi::tool {

// Thread-safe, timestamped output.
class Journal {
 public:
  explicit Journal(std::ostream& out) : out_(out), start_(std::chrono::steady_clock::now()) {}

  void line(const std::string& who, const std::string& what) {
    std::lock_guard lock(mutex_);
    const double ms =
        std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start_)
            .count();
    char stamp[32];
    std::snprintf(stamp, sizeof stamp, "%8.2f ms", ms);
    out_ << "[" << stamp << "] " << std::left << std::setw(13) << who << what << "\n";
  }

  void heading(const std::string& text) {
    std::lock_guard lock(mutex_);
    out_ << "\n== " << text << " ==\n";
  }

 private:
  std::mutex mutex_;
  std::ostream& out_;
  const std::chrono::steady_clock::time_point start_;
};

}  // namespace kivi::tool
