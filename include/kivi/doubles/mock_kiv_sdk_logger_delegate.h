// MockKivSDKLoggerDelegate: a scriptable KivSdkLoggerDelegate.
//
// Each of the six main-channel methods calls its callback (logVerboseBlock
// ... logCriticalBlock), if set, with the module, file name, function name,
// line number and message unchanged; without it the line is dropped. The
// double announces no optional method, so the aot channel never reaches it.
//
//   auto sink = std::make_shared<kivi::MockKivSDKLoggerDelegate>();
//   std::vector<std::string> errors;
//   sink->logErrorBlock = [&](std::string_view, std::string_view, std::string_view,
//                             std::uint64_t, std::string_view message) {
//     errors.emplace_back(message);  // the views die with the call: copy
//   };
//   auto logger = kivi::KivSdkLogger::create(sink);  // held weakly: keep `sink`
//
// Thread contract: none of its own; callbacks run synchronously on the
// logging thread. Loggers call from any thread, so callbacks that keep lines
// synchronise themselves. Set the callbacks before installing the double.
#pragma once

#include <cstdint>
#include <functional>
#include <string_view>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/logging/kiv_sdk_logger_delegate.h"

namespace kivi {

class KIVI_EXPORT MockKivSDKLoggerDelegate : public Object, public KivSdkLoggerDelegate {
 public:
  // Receives one line as the logger passed it; the views die with the call.
  using LogBlock = std::function<void(std::string_view module, std::string_view fileName,
                                      std::string_view functionName, std::uint64_t lineNumber,
                                      std::string_view message)>;

  MockKivSDKLoggerDelegate() = default;

  // One per level: logVerboseWithModule() calls logVerboseBlock,
  // logInfoWithModule() logInfoBlock, and so on; without its callback a
  // level's lines are dropped.
  LogBlock logVerboseBlock;
  LogBlock logInfoBlock;
  LogBlock logSupportBlock;
  LogBlock logWarnBlock;
  LogBlock logErrorBlock;
  LogBlock logCriticalBlock;

  void logCriticalWithModule(std::string_view module, std::string_view fileName,
                             std::string_view functionName, std::uint64_t lineNumber,
                             std::string_view message) override {
    if (logCriticalBlock) logCriticalBlock(module, fileName, functionName, lineNumber, message);
  }
  void logErrorWithModule(std::string_view module, std::string_view fileName,
                          std::string_view functionName, std::uint64_t lineNumber,
                          std::string_view message) override {
    if (logErrorBlock) logErrorBlock(module, fileName, functionName, lineNumber, message);
  }
  void logWarnWithModule(std::string_view module, std::string_view fileName,
                         std::string_view functionName, std::uint64_t lineNumber,
                         std::string_view message) override {
    if (logWarnBlock) logWarnBlock(module, fileName, functionName, lineNumber, message);
  }
  void logInfoWithModule(std::string_view module, std::string_view fileName,
                         std::string_view functionName, std::uint64_t lineNumber,
                         std::string_view message) override {
    if (logInfoBlock) logInfoBlock(module, fileName, functionName, lineNumber, message);
  }
  void logVerboseWithModule(std::string_view module, std::string_view fileName,
                            std::string_view functionName, std::uint64_t lineNumber,
                            std::string_view message) override {
    if (logVerboseBlock) logVerboseBlock(module, fileName, functionName, lineNumber, message);
  }
  void logSupportWithModule(std::string_view module, std::string_view fileName,
                            std::string_view functionName, std::uint64_t lineNumber,
                            std::string_view message) override {
    if (logSupportBlock) logSupportBlock(module, fileName, functionName, lineNumber, message);
  }
};

}  // namespace kivi
