// KivSwiftSdkLogger: a convenience facade over KivSdkLogger with one method per
// level, taking ready-made messages and filling in a default module.
//
//   kivi::KivSwiftSdkLogger log("sync", delegate);      // delegate held weakly
//   log.logInfo(nullptr, __FILE__, __func__, __LINE__, "started");      // module "sync"
//   log.logError("db", __FILE__, __func__, __LINE__, "write failed: " + reason);
//   log.aotLogWarn(std::nullopt, __FILE__, __func__, __LINE__, "slow start");
//
// A call reads the delegate once; without one it does nothing (the message is
// not looked at). The module is the one given, or defaultModule() when the
// caller passes none (nullptr, std::nullopt or a null C string); an empty
// module stays empty. The main-channel methods call the level's required
// delegate method directly, with the message as it is (no formatting). The
// aot methods call the delegate only when it announces that aot method.
//
// Each level has one method here where other bindings of this logger have two
// that differ only in the label of the message argument; C++ has no argument
// labels, so one overload covers both.
//
// Thread contract: the log methods and setLoggerDelegate may be called from
// any thread at once; the delegate runs on the calling thread and is kept
// alive for the call. defaultModule is not synchronised: set it before
// sharing the facade and do not change it while other threads log.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "kivi/export.h"
#include "kivi/logging/kiv_sdk_logger.h"
#include "kivi/logging/kiv_sdk_logger_delegate.h"

namespace kivi {

class KIVI_EXPORT KivSwiftSdkLogger {
 public:
  // Creates the inner logger with `delegate` (may be null), then stores the
  // default module.
  KivSwiftSdkLogger(std::string defaultModule,
                    const std::shared_ptr<KivSdkLoggerDelegate>& delegate);
  KivSwiftSdkLogger(const KivSwiftSdkLogger&) = delete;
  KivSwiftSdkLogger& operator=(const KivSwiftSdkLogger&) = delete;

  // The module of lines logged without one; not synchronised (see above).
  const std::string& defaultModule() const { return defaultModule_; }
  void setDefaultModule(std::string module) { defaultModule_ = std::move(module); }

  // Replaces the inner logger's delegate; null removes it.
  void setLoggerDelegate(const std::shared_ptr<KivSdkLoggerDelegate>& delegate);

  // Main channel.
  void logInfo(KivSdkNullableString module, std::string_view fileName,
               std::string_view functionName, std::uint64_t lineNumber,
               std::string_view message) const;
  void logWarn(KivSdkNullableString module, std::string_view fileName,
               std::string_view functionName, std::uint64_t lineNumber,
               std::string_view message) const;
  void logError(KivSdkNullableString module, std::string_view fileName,
                std::string_view functionName, std::uint64_t lineNumber,
                std::string_view message) const;
  void logCritical(KivSdkNullableString module, std::string_view fileName,
                   std::string_view functionName, std::uint64_t lineNumber,
                   std::string_view message) const;
  void logVerbose(KivSdkNullableString module, std::string_view fileName,
                  std::string_view functionName, std::uint64_t lineNumber,
                  std::string_view message) const;
  void logSupport(KivSdkNullableString module, std::string_view fileName,
                  std::string_view functionName, std::uint64_t lineNumber,
                  std::string_view message) const;

  // Aot channel.
  void aotLogInfo(KivSdkNullableString module, std::string_view fileName,
                  std::string_view functionName, std::uint64_t lineNumber,
                  std::string_view message) const;
  void aotLogWarn(KivSdkNullableString module, std::string_view fileName,
                  std::string_view functionName, std::uint64_t lineNumber,
                  std::string_view message) const;
  void aotLogError(KivSdkNullableString module, std::string_view fileName,
                   std::string_view functionName, std::uint64_t lineNumber,
                   std::string_view message) const;
  void aotLogCritical(KivSdkNullableString module, std::string_view fileName,
                      std::string_view functionName, std::uint64_t lineNumber,
                      std::string_view message) const;

 private:
  const std::shared_ptr<KivSdkLogger> logger_;
  std::string defaultModule_;
};

}  // namespace kivi
