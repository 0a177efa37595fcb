// KivNSTaskProtocol: a child process as the older callers see it: a launch
// path, arguments and working directory, launch, wait, and the exit status.
// (KivNSProcessProtocol is the fuller interface that kivi::NSTask
// implements.)
//
// The library implements it only by its double, MockNSTask; a host passes
// an object of its own over kivi::NSTask.
//
//   task->setLaunchPath("/usr/bin/env");
//   task->setArguments({"true"});
//   task->launch();
//   task->waitUntilExit();
//   bool ok = task->terminationStatus() == 0;
//
// Thread contract: that of the implementation.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivNSTaskProtocol {
 public:
  virtual ~KivNSTaskProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Starts the program with the arguments, directory and streams set.
  virtual void launch() = 0;
  // Blocks until the process has ended.
  virtual void waitUntilExit() = 0;
  // The exit code, or the number of the signal that ended the process;
  // valid once it has ended.
  virtual std::int32_t terminationStatus() const = 0;
  // The path of the program to run.
  virtual std::string launchPath() const = 0;
  virtual void setLaunchPath(std::string path) = 0;
  // The directory the process starts in; by default this process's.
  virtual std::string currentDirectoryPath() const = 0;
  virtual void setCurrentDirectoryPath(std::string path) = 0;
  // The arguments after the program name.
  virtual std::vector<std::string> arguments() const = 0;
  virtual void setArguments(std::vector<std::string> arguments) = 0;
  // Each standard stream: an NSPipe, an NSFileHandle, or null (inherited
  // from this process).
  virtual ObjectPtr standardOutput() const = 0;
  virtual void setStandardOutput(ObjectPtr stream) = 0;
  virtual ObjectPtr standardError() const = 0;
  virtual void setStandardError(ObjectPtr stream) = 0;
};

}  // namespace kivi
