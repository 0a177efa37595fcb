#include "kivi/logging/kiv_swift_sdk_logger.h"

#include <utility>

namespace kivi {
namespace {

using Method = void (KivSdkLoggerDelegate::*)(std::string_view, std::string_view, std::string_view,
                                              std::uint64_t, std::string_view);

// Calls `method` on the logger's delegate, if there is one and, for an aot
// method (`aotBit` not 0), it announces that method.
inline void deliver(const KivSdkLogger& logger, std::uint32_t aotBit, Method method,
                    std::string_view module, std::string_view fileName,
                    std::string_view functionName, std::uint64_t lineNumber,
                    std::string_view message) {
  const std::shared_ptr<KivSdkLoggerDelegate> delegate = logger.delegate();
  if (!delegate || (aotBit != 0 && (delegate->optionalMethods() & aotBit) == 0)) return;
  ((*delegate).*method)(module, fileName, functionName, lineNumber, message);
}

}  // namespace

KivSwiftSdkLogger::KivSwiftSdkLogger(std::string defaultModule,
                                     const std::shared_ptr<KivSdkLoggerDelegate>& delegate)
    : logger_(KivSdkLogger::create(delegate)), defaultModule_(std::move(defaultModule)) {}

void KivSwiftSdkLogger::setLoggerDelegate(const std::shared_ptr<KivSdkLoggerDelegate>& delegate) {
  logger_->setDelegate(delegate);
}

void KivSwiftSdkLogger::logInfo(KivSdkNullableString module, std::string_view fileName,
                                std::string_view functionName, std::uint64_t lineNumber,
                                std::string_view message) const {
  deliver(*logger_, 0, &KivSdkLoggerDelegate::logInfoWithModule, module.valueOr(defaultModule_),
          fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::logWarn(KivSdkNullableString module, std::string_view fileName,
                                std::string_view functionName, std::uint64_t lineNumber,
                                std::string_view message) const {
  deliver(*logger_, 0, &KivSdkLoggerDelegate::logWarnWithModule, module.valueOr(defaultModule_),
          fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::logError(KivSdkNullableString module, std::string_view fileName,
                                 std::string_view functionName, std::uint64_t lineNumber,
                                 std::string_view message) const {
  deliver(*logger_, 0, &KivSdkLoggerDelegate::logErrorWithModule, module.valueOr(defaultModule_),
          fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::logCritical(KivSdkNullableString module, std::string_view fileName,
                                    std::string_view functionName, std::uint64_t lineNumber,
                                    std::string_view message) const {
  deliver(*logger_, 0, &KivSdkLoggerDelegate::logCriticalWithModule, module.valueOr(defaultModule_),
          fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::logVerbose(KivSdkNullableString module, std::string_view fileName,
                                   std::string_view functionName, std::uint64_t lineNumber,
                                   std::string_view message) const {
  deliver(*logger_, 0, &KivSdkLoggerDelegate::logVerboseWithModule, module.valueOr(defaultModule_),
          fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::logSupport(KivSdkNullableString module, std::string_view fileName,
                                   std::string_view functionName, std::uint64_t lineNumber,
                                   std::string_view message) const {
  deliver(*logger_, 0, &KivSdkLoggerDelegate::logSupportWithModule, module.valueOr(defaultModule_),
          fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::aotLogInfo(KivSdkNullableString module, std::string_view fileName,
                                   std::string_view functionName, std::uint64_t lineNumber,
                                   std::string_view message) const {
  deliver(*logger_, KivSdkLoggerDelegateAotLogInfo, &KivSdkLoggerDelegate::aotLogInfoWithModule,
          module.valueOr(defaultModule_), fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::aotLogWarn(KivSdkNullableString module, std::string_view fileName,
                                   std::string_view functionName, std::uint64_t lineNumber,
                                   std::string_view message) const {
  deliver(*logger_, KivSdkLoggerDelegateAotLogWarn, &KivSdkLoggerDelegate::aotLogWarnWithModule,
          module.valueOr(defaultModule_), fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::aotLogError(KivSdkNullableString module, std::string_view fileName,
                                    std::string_view functionName, std::uint64_t lineNumber,
                                    std::string_view message) const {
  deliver(*logger_, KivSdkLoggerDelegateAotLogError, &KivSdkLoggerDelegate::aotLogErrorWithModule,
          module.valueOr(defaultModule_), fileName, functionName, lineNumber, message);
}

void KivSwiftSdkLogger::aotLogCritical(KivSdkNullableString module, std::string_view fileName,
                                       std::string_view functionName, std::uint64_t lineNumber,
                                       std::string_view message) const {
  deliver(*logger_, KivSdkLoggerDelegateAotLogCritical,
          &KivSdkLoggerDelegate::aotLogCriticalWithModule, module.valueOr(defaultModule_), fileName,
          functionName, lineNumber, message);
}

}  // namespace kivi
