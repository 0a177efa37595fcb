// MockKivNSProcess: a scriptable KivNSProcessProtocol. Nothing is ever
// started.
//
// launch(), waitUntilExit() and launchAndReturnError() call launchBlock,
// waitUntilExitBlock and runBlock, if set (runBlock also decides the answer
// and what the error out-parameter receives); without them they do nothing,
// and launchAndReturnError() answers true (a launch that cannot fail).
// isRunning() answers isRunningBlock, else false. terminationStatus()
// answers mockTerminationStatus, else 1; terminationReason() answers
// mockTerminationReason, else 1 (NSTaskTerminationReasonExit). mockRunning is
// a flag the host may set and read back; isRunning() does not consult it.
// The program, arguments, streams and termination handler are plain stored
// values; the double never calls the handler.
//
//   auto process = std::make_shared<kivi::MockKivNSProcess>();
//   process->mockTerminationStatus = 0;
//   process->launchBlock = [&] { launched = true; };
//   auto factory = std::make_shared<kivi::MockKivProcessFactory>();
//   factory->createMockProcessBlock = [&] { return process; };
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/process/kiv_ns_process_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSProcess : public Object, public KivNSProcessProtocol {
 public:
  MockKivNSProcess() = default;

  // Called by launch(); without it nothing starts.
  std::function<void()> launchBlock;
  // Called by waitUntilExit(); without it the call returns at once.
  std::function<void()> waitUntilExitBlock;
  // Answers launchAndReturnError(error) and decides what the error receives; without it, true.
  std::function<bool(ErrorPtr*)> runBlock;
  // Answers isRunning(); without it, false.
  std::function<bool()> isRunningBlock;
  // What terminationStatus() answers; nullopt: 1.
  std::optional<std::int32_t> mockTerminationStatus;
  // What terminationReason() answers; nullopt: NSTaskTerminationReasonExit.
  std::optional<std::int64_t> mockTerminationReason;
  // A flag for the test's own use; isRunning() does not read it.
  bool mockRunning = false;

  URLPtr executableURL() const override { return executableURL_; }
  void setExecutableURL(URLPtr url) override { executableURL_ = std::move(url); }
  std::int64_t terminationReason() const override {
    return mockTerminationReason.value_or(NSTaskTerminationReasonExit);
  }
  std::optional<std::string> launchPath() const override { return launchPath_; }
  void setLaunchPath(std::optional<std::string> path) override { launchPath_ = std::move(path); }
  std::optional<std::vector<std::string>> arguments() const override { return arguments_; }
  void setArguments(std::optional<std::vector<std::string>> arguments) override {
    arguments_ = std::move(arguments);
  }
  ObjectPtr standardOutput() const override { return standardOutput_; }
  void setStandardOutput(ObjectPtr stream) override { standardOutput_ = std::move(stream); }
  ObjectPtr standardInput() const override { return standardInput_; }
  void setStandardInput(ObjectPtr stream) override { standardInput_ = std::move(stream); }
  ObjectPtr standardError() const override { return standardError_; }
  void setStandardError(ObjectPtr stream) override { standardError_ = std::move(stream); }
  bool isRunning() const override { return isRunningBlock ? isRunningBlock() : false; }
  std::int32_t terminationStatus() const override { return mockTerminationStatus.value_or(1); }
  NSTaskTerminationHandler terminationHandler() const override { return terminationHandler_; }
  void setTerminationHandler(NSTaskTerminationHandler handler) override {
    terminationHandler_ = std::move(handler);
  }
  void launch() override {
    if (launchBlock) launchBlock();
  }
  void waitUntilExit() override {
    if (waitUntilExitBlock) waitUntilExitBlock();
  }
  bool launchAndReturnError(ErrorPtr* error) override { return runBlock ? runBlock(error) : true; }

 private:
  URLPtr executableURL_;
  std::optional<std::string> launchPath_;
  std::optional<std::vector<std::string>> arguments_;
  ObjectPtr standardOutput_;
  ObjectPtr standardInput_;
  ObjectPtr standardError_;
  NSTaskTerminationHandler terminationHandler_;
};

}  // namespace kivi
