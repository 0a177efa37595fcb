#include "verbose.h"

#include <memory>
#include <mutex>
#include <ostream>
#include <string_view>

namespace kivi::tool {
namespace {

class StreamDelegate : public KivSdkLoggerDelegate {
 public:
  explicit StreamDelegate(std::ostream& out) : out_(out) {}

  void logCriticalWithModule(std::string_view module, std::string_view file,
                             std::string_view function, std::uint64_t line,
                             std::string_view message) override {
    write("critical", module, file, function, line, message);
  }
  void logErrorWithModule(std::string_view module, std::string_view file, std::string_view function,
                          std::uint64_t line, std::string_view message) override {
    write("error", module, file, function, line, message);
  }
  void logWarnWithModule(std::string_view module, std::string_view file, std::string_view function,
                         std::uint64_t line, std::string_view message) override {
    write("warn", module, file, function, line, message);
  }
  void logInfoWithModule(std::string_view module, std::string_view file, std::string_view function,
                         std::uint64_t line, std::string_view message) override {
    write("info", module, file, function, line, message);
  }
  void logVerboseWithModule(std::string_view module, std::string_view file,
                            std::string_view function, std::uint64_t line,
                            std::string_view message) override {
    write("verbose", module, file, function, line, message);
  }
  void logSupportWithModule(std::string_view module, std::string_view file,
                            std::string_view function, std::uint64_t line,
                            std::string_view message) override {
    write("support", module, file, function, line, message);
  }
  void aotLogCriticalWithModule(std::string_view module, std::string_view file,
                                std::string_view function, std::uint64_t line,
                                std::string_view message) override {
    write("aot-critical", module, file, function, line, message);
  }
  void aotLogErrorWithModule(std::string_view module, std::string_view file,
                             std::string_view function, std::uint64_t line,
                             std::string_view message) override {
    write("aot-error", module, file, function, line, message);
  }
  void aotLogWarnWithModule(std::string_view module, std::string_view file,
                            std::string_view function, std::uint64_t line,
                            std::string_view message) override {
    write("aot-warn", module, file, function, line, message);
  }
  void aotLogInfoWithModule(std::string_view module, std::string_view file,
                            std::string_view function, std::uint64_t line,
                            std::string_view message) override {
    write("aot-info", module, file, function, line, message);
  }
  std::uint32_t optionalMethods() const override { return KivSdkLoggerDelegateAllAotLogs; }

 private:
  void write(std::string_view level, std::string_view module, std::string_view file,
             std::string_view function, std::uint64_t line, std::string_view message) {
    const std::size_t slash = file.find_last_of('/');
    if (slash != std::string_view::npos) file.remove_prefix(slash + 1);
    std::lock_guard lock(mutex_);
    out_ << '[' << level << "] " << module << ' ' << file << ':' << line << ' ' << function << ": "
         << message << '\n'
         << std::flush;
  }

  std::mutex mutex_;
  std::ostream& out_;
};

// The logger holds its delegate weakly; this keeps it alive.
std::shared_ptr<StreamDelegate>& verboseDelegate() {
  static std::shared_ptr<StreamDelegate> delegate;
  return delegate;
}

}  // namespace

KivSwiftSdkLogger& logger() {
  static KivSwiftSdkLogger instance("kivi", nullptr);
  return instance;
}

bool verboseLoggingEnabled() { return verboseDelegate() != nullptr; }

void enableVerboseLogging(std::ostream& err) {
  verboseDelegate() = std::make_shared<StreamDelegate>(err);
  logger().setLoggerDelegate(verboseDelegate());
}

}  // namespace kivi::tool
