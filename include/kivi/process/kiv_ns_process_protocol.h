// KivNSProcessProtocol: the interface of a child process that is configured,
// launched, watched and waited for. kivi::NSTask implements it; a host stores
// the interface (usually made by a KivNSProcessFactoryProtocol) so that tests
// can hand it a scripted double instead of starting real programs.
//
//   std::shared_ptr<kivi::KivNSProcessProtocol> task = factory->createProcess();
//   task->setExecutableURL(kivi::URL::fileURLWithPath("/usr/bin/env"));
//   task->setArguments(std::vector<std::string>{"true"});
//   task->setTerminationHandler([](const std::shared_ptr<kivi::NSTask>& done) {
//     log(done->terminationStatus());
//   });
//   kivi::ErrorPtr error;
//   if (!task->launchAndReturnError(&error)) report(error);
//
// Life cycle: configured (launch path or executable URL, arguments, standard
// streams, termination handler) -> launched -> running (isRunning() true) ->
// exited (terminationStatus() and terminationReason() valid, the
// termination handler called).
//
// Thread contract: that of the implementation; NSTask may be used from any
// thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/net/url.h"

namespace kivi {

class NSTask;

// terminationReason(): how a process ended.
inline constexpr std::int64_t NSTaskTerminationReasonExit = 1;
inline constexpr std::int64_t NSTaskTerminationReasonUncaughtSignal = 2;

// Called with the task whose process has ended.
using NSTaskTerminationHandler = std::function<void(const std::shared_ptr<NSTask>&)>;

class KIVI_EXPORT KivNSProcessProtocol {
 public:
  virtual ~KivNSProcessProtocol() = default;

  // The program to run; null when unset.
  virtual URLPtr executableURL() const = 0;
  virtual void setExecutableURL(URLPtr url) = 0;
  // NSTaskTerminationReasonExit or ...UncaughtSignal once the process has
  // ended.
  virtual std::int64_t terminationReason() const = 0;
  // The program to run, as a path; nullopt when unset.
  virtual std::optional<std::string> launchPath() const = 0;
  virtual void setLaunchPath(std::optional<std::string> path) = 0;
  // The arguments after the program name; nullopt when unset (none).
  virtual std::optional<std::vector<std::string>> arguments() const = 0;
  virtual void setArguments(std::optional<std::vector<std::string>> arguments) = 0;
  // Each standard stream: an NSPipe, an NSFileHandle, or null (inherited
  // from this process).
  virtual ObjectPtr standardOutput() const = 0;
  virtual void setStandardOutput(ObjectPtr stream) = 0;
  virtual ObjectPtr standardInput() const = 0;
  virtual void setStandardInput(ObjectPtr stream) = 0;
  virtual ObjectPtr standardError() const = 0;
  virtual void setStandardError(ObjectPtr stream) = 0;
  // True from a successful launch until the process has ended.
  virtual bool isRunning() const = 0;
  // The exit code, or the number of the signal that ended the process.
  virtual std::int32_t terminationStatus() const = 0;
  // Called once, with the finished task, when the process has ended; null
  // for none.
  virtual NSTaskTerminationHandler terminationHandler() const = 0;
  virtual void setTerminationHandler(NSTaskTerminationHandler handler) = 0;
  // Launches; a failure shows only in the task's state afterwards.
  virtual void launch() = 0;
  // Blocks until the process has ended.
  virtual void waitUntilExit() = 0;
  // Launches; false with `*error` set when the process could not start.
  virtual bool launchAndReturnError(ErrorPtr* error) = 0;
};

}  // namespace kivi
