// KivSdkLoggerDelegate: the sink a host implements to receive the library's log
// lines, and the log levels.
//
// The loggers (KivSdkLogger, KivSwiftSdkLogger) never write anything
// themselves; each log call becomes one call on the delegate, which decides
// whether, where and how the line is recorded. Every call carries, in this
// order: module, file name, function name, line number and message.
//
// There are two channels. The main channel has six levels and six required
// methods. The aot channel has four levels (Critical, Error, Warn, Info) and
// four optional methods; a delegate announces the ones it implements in
// optionalMethods(), and one that does not implement an aot method never
// receives those lines. The channels never fall back on each other.
//
//   class StderrDelegate : public kivi::KivSdkLoggerDelegate {
//    public:
//     void logInfoWithModule(std::string_view module, std::string_view file,
//                            std::string_view function, std::uint64_t line,
//                            std::string_view message) override {
//       std::fprintf(stderr, "%.*s\n", int(message.size()), message.data());
//     }
//     ...  // the other five main-channel methods
//     // Optional: implement aotLogInfoWithModule and announce it.
//     void aotLogInfoWithModule(...) override {...}
//     std::uint32_t optionalMethods() const override {
//       return kivi::KivSdkLoggerDelegateAotLogInfo;
//     }
//   };
//
// The string arguments are views that are valid only for the length of the
// call; a delegate that keeps a line copies it.
//
// Thread contract: the loggers call the delegate synchronously on the logging
// thread, from any number of threads at once, so every method must be safe to
// call concurrently. optionalMethods() may be asked on every aot call and
// should be cheap and constant.
#pragma once

#include <cstdint>
#include <string_view>

#include "kivi/export.h"

namespace kivi {

// A log level. Only 1 to 6 have a meaning; every other value is accepted and
// ignored (the line is dropped).
using KivSdkLogLevel = std::uint64_t;
inline constexpr KivSdkLogLevel KivSdkLogLevelCritical = 1;
inline constexpr KivSdkLogLevel KivSdkLogLevelError = 2;
inline constexpr KivSdkLogLevel KivSdkLogLevelWarn = 3;
inline constexpr KivSdkLogLevel KivSdkLogLevelInfo = 4;
inline constexpr KivSdkLogLevel KivSdkLogLevelVerbose = 5;
inline constexpr KivSdkLogLevel KivSdkLogLevelSupport = 6;

// Bits of KivSdkLoggerDelegate::optionalMethods().
inline constexpr std::uint32_t KivSdkLoggerDelegateAotLogCritical = 1u << 0;
inline constexpr std::uint32_t KivSdkLoggerDelegateAotLogError = 1u << 1;
inline constexpr std::uint32_t KivSdkLoggerDelegateAotLogWarn = 1u << 2;
inline constexpr std::uint32_t KivSdkLoggerDelegateAotLogInfo = 1u << 3;
inline constexpr std::uint32_t KivSdkLoggerDelegateGetMaxLogLevel = 1u << 4;
inline constexpr std::uint32_t KivSdkLoggerDelegateAllAotLogs = 0x0f;

class KIVI_EXPORT KivSdkLoggerDelegate {
 public:
  virtual ~KivSdkLoggerDelegate() = default;

  // Main channel, required.
  virtual void logCriticalWithModule(std::string_view module, std::string_view fileName,
                                     std::string_view functionName, std::uint64_t lineNumber,
                                     std::string_view message) = 0;
  virtual void logErrorWithModule(std::string_view module, std::string_view fileName,
                                  std::string_view functionName, std::uint64_t lineNumber,
                                  std::string_view message) = 0;
  virtual void logWarnWithModule(std::string_view module, std::string_view fileName,
                                 std::string_view functionName, std::uint64_t lineNumber,
                                 std::string_view message) = 0;
  virtual void logInfoWithModule(std::string_view module, std::string_view fileName,
                                 std::string_view functionName, std::uint64_t lineNumber,
                                 std::string_view message) = 0;
  virtual void logVerboseWithModule(std::string_view module, std::string_view fileName,
                                    std::string_view functionName, std::uint64_t lineNumber,
                                    std::string_view message) = 0;
  virtual void logSupportWithModule(std::string_view module, std::string_view fileName,
                                    std::string_view functionName, std::uint64_t lineNumber,
                                    std::string_view message) = 0;

  // Aot channel, optional: called only when the matching bit is set in
  // optionalMethods(). The defaults do nothing.
  virtual void aotLogCriticalWithModule(std::string_view /*module*/, std::string_view /*fileName*/,
                                        std::string_view /*functionName*/,
                                        std::uint64_t /*lineNumber*/,
                                        std::string_view /*message*/) {}
  virtual void aotLogErrorWithModule(std::string_view /*module*/, std::string_view /*fileName*/,
                                     std::string_view /*functionName*/,
                                     std::uint64_t /*lineNumber*/, std::string_view /*message*/) {}
  virtual void aotLogWarnWithModule(std::string_view /*module*/, std::string_view /*fileName*/,
                                    std::string_view /*functionName*/, std::uint64_t /*lineNumber*/,
                                    std::string_view /*message*/) {}
  virtual void aotLogInfoWithModule(std::string_view /*module*/, std::string_view /*fileName*/,
                                    std::string_view /*functionName*/, std::uint64_t /*lineNumber*/,
                                    std::string_view /*message*/) {}

  // Optional: the delegate's maximum log level, meaningful when
  // KivSdkLoggerDelegateGetMaxLogLevel is announced. The loggers never call it
  // and never filter by level; it is there for the host's own use.
  virtual std::int32_t getMaxLogLevel() { return 0; }

  // The optional methods this delegate implements: a combination of the
  // KivSdkLoggerDelegate… bits above. None by default.
  virtual std::uint32_t optionalMethods() const { return 0; }

  // Whether the aot method of `level` is implemented (false for levels
  // outside 1 to 4).
  bool implementsAotLog(KivSdkLogLevel level) const {
    return level >= 1 && level <= 4 && (optionalMethods() & (1u << (level - 1))) != 0;
  }
};

}  // namespace kivi
