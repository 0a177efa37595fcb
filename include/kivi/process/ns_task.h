// NSTask: a child process. Configure it (the program by launch path or
// executable URL, arguments, environment, working directory, standard
// streams, termination handler), launch it once, then watch it: isRunning(),
// waitUntilExit(), the termination handler, terminationStatus() and
// terminationReason().
//
//   auto task = kivi::NSTask::create();
//   auto out = kivi::NSPipe::pipe();
//   task->setLaunchPath("/usr/bin/uname");
//   task->setArguments(std::vector<std::string>{"-r"});
//   task->setStandardOutput(out);
//   kivi::ErrorPtr error;
//   if (!task->launchAndReturnError(&error)) return report(error);
//   kivi::Data release = out->fileHandleForReading()->readDataToEndOfFile();
//   task->waitUntilExit();
//   bool ok = task->terminationReason() == kivi::NSTaskTerminationReasonExit &&
//             task->terminationStatus() == 0;
//
// The program. The executable URL (a file URL) wins over the launch path;
// setting either sets the other. The path is used as given, with no search
// of PATH; a relative path is taken from the working directory of this
// process (not the child's). The child's argv[0] is the path.
//
// Environment: unset, the child inherits this process's environment at
// launch; set, it gets exactly these variables. Working directory: unset,
// this process's; currentDirectoryPath() then reads this process's.
//
// Standard streams: an NSPipe (the child gets the end that fits: the pipe's
// writing end for output and error, its reading end for input; this process
// closes its own copy of that end at launch), an NSFileHandle (the child gets
// a duplicate of its descriptor) or null (the child inherits this process's
// stream). No other descriptor of this process reaches the child.
//
// Launching. launchAndReturnError() starts the child and answers true, or
// answers false with `*error` set and the task ended as not launched:
//   - no launch path and no executable URL, an empty path, one holding a NUL
//     byte: NSCocoaErrorDomain FileNoSuchFileError (4), the path (if any)
//     under FilePathErrorKey;
//   - a program that does not exist: FileNoSuchFileError (4) with the path;
//   - a program that may not be executed (no execute permission, a
//     directory): FileReadNoPermissionError (257) with the path and the
//     errno as the underlying NSPOSIXErrorDomain error;
//   - any other failure (not an executable format, a missing working
//     directory, no descriptors or processes left): NSPOSIXErrorDomain with
//     the errno, and the path.
// A task that failed to launch is not running, its processIdentifier() is 0,
// its terminationReason() is NSTaskTerminationReasonExit and its
// terminationStatus() is 127 (126 when the program exists but cannot be
// executed), as a shell reports a command it could not run; its termination
// handler is never called and waitUntilExit() returns at once.
// launch() is launchAndReturnError(nullptr): a failure is reported only
// through that state, so check processIdentifier() != 0 after launch().
// A task launches at most once: launching again (after success or failure)
// answers false with NSPOSIXErrorDomain EALREADY and changes nothing.
//
// Termination. When the child ends, the task records terminationStatus()
// (the exit code, or the number of the signal that ended it) and
// terminationReason(), isRunning() turns false, every waitUntilExit() returns
// and then the termination handler is called exactly once, on a thread of
// the global dispatch queue, with the task. The handler that is set when the
// child ends is the one called. Before the child has ended (and before
// launch), terminationStatus() and terminationReason() answer 0.
// The library reaps only the children it started, with one waiter per child
// (a thread blocked in waitid on its pid); it never installs a SIGCHLD
// handler and never waits for other processes.
//
// A task keeps itself alive while its child runs: dropping every reference
// to a launched task neither kills nor leaks the child.
//
// Thread contract: every member may be called from any thread; configure a
// task before launching it (changes after launch are stored but have no
// effect on the running child).
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/net/url.h"
#include "kivi/process/kiv_ns_process_protocol.h"

namespace kivi {

// A child's environment: each variable's name and value.
using NSTaskEnvironment = std::map<std::string, std::string>;

class KIVI_EXPORT NSTask : public Object, public KivNSProcessProtocol {
 public:
  // A new, unlaunched task with nothing set.
  static std::shared_ptr<NSTask> create();

  ~NSTask() override;

  URLPtr executableURL() const override;
  // Also sets the launch path to the URL's file system path; a URL that is
  // not a file URL is kept but makes launching fail (FileNoSuchFileError).
  void setExecutableURL(URLPtr url) override;

  std::int64_t terminationReason() const override;
  std::optional<std::string> launchPath() const override;
  // Also sets the executable URL (null when `path` cannot be one).
  void setLaunchPath(std::optional<std::string> path) override;

  std::optional<std::vector<std::string>> arguments() const override;
  void setArguments(std::optional<std::vector<std::string>> arguments) override;
  ObjectPtr standardOutput() const override;
  // An object that is neither an NSPipe nor an NSFileHandle is treated as
  // null, for each of the three streams.
  void setStandardOutput(ObjectPtr stream) override;

  ObjectPtr standardInput() const override;
  void setStandardInput(ObjectPtr stream) override;
  ObjectPtr standardError() const override;
  void setStandardError(ObjectPtr stream) override;
  bool isRunning() const override;
  std::int32_t terminationStatus() const override;
  NSTaskTerminationHandler terminationHandler() const override;
  void setTerminationHandler(NSTaskTerminationHandler handler) override;
  void launch() override;
  // Returns at once before launch and after a failed launch. Must not be
  // called from the termination handler of a task whose child has not
  // ended (it is never called before, so this cannot happen).
  void waitUntilExit() override;

  bool launchAndReturnError(ErrorPtr* error) override;

  // Environment and working directory (see above).
  std::optional<NSTaskEnvironment> environment() const;
  void setEnvironment(std::optional<NSTaskEnvironment> environment);
  URLPtr currentDirectoryURL() const;
  void setCurrentDirectoryURL(URLPtr url);
  std::string currentDirectoryPath() const;
  void setCurrentDirectoryPath(std::string path);

  // The child's process id; 0 before a successful launch.
  std::int32_t processIdentifier() const;
  // Sends SIGTERM / SIGINT to a running child; does nothing otherwise.
  void terminate();
  void interrupt();

  std::string className() const override { return "NSTask"; }

 private:
  NSTask();
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace kivi
