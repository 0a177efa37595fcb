// MockNSTask: a scriptable KivNSTaskProtocol.
//
// launch() and waitUntilExit() call kivLaunchBlock and kivWaitUntilExitBlock,
// if set; without them nothing runs. The launch path, working directory,
// arguments and streams are plain stored values. terminationStatus is fixed
// when the double is made (0 with the plain constructor).
//
//   auto task = std::make_shared<kivi::MockNSTask>(1);  // "exits with 1"
//   bool launched = false;
//   task->kivLaunchBlock = [&] { launched = true; };
//   helper.run(task);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_task_protocol.h"

namespace kivi {

class KIVI_EXPORT MockNSTask : public Object, public KivNSTaskProtocol {
 public:
  // A task whose terminationStatus() is always `terminationStatus` (0 by default).
  MockNSTask() = default;
  explicit MockNSTask(std::int32_t terminationStatus) : terminationStatus_(terminationStatus) {}

  // Called by launch(); without it nothing runs.
  std::function<void()> kivLaunchBlock;
  // Called by waitUntilExit(); without it the call returns at once.
  std::function<void()> kivWaitUntilExitBlock;

  std::string description() const override { return Object::description(); }

  void launch() override {
    if (kivLaunchBlock) kivLaunchBlock();
  }
  void waitUntilExit() override {
    if (kivWaitUntilExitBlock) kivWaitUntilExitBlock();
  }
  std::int32_t terminationStatus() const override { return terminationStatus_; }
  std::string launchPath() const override { return launchPath_; }
  void setLaunchPath(std::string path) override { launchPath_ = std::move(path); }
  std::string currentDirectoryPath() const override { return currentDirectoryPath_; }
  void setCurrentDirectoryPath(std::string path) override {
    currentDirectoryPath_ = std::move(path);
  }
  std::vector<std::string> arguments() const override { return arguments_; }
  void setArguments(std::vector<std::string> arguments) override {
    arguments_ = std::move(arguments);
  }
  ObjectPtr standardOutput() const override { return standardOutput_; }
  void setStandardOutput(ObjectPtr stream) override { standardOutput_ = std::move(stream); }
  ObjectPtr standardError() const override { return standardError_; }
  void setStandardError(ObjectPtr stream) override { standardError_ = std::move(stream); }

 private:
  const std::int32_t terminationStatus_ = 0;
  std::string launchPath_;
  std::string currentDirectoryPath_;
  std::vector<std::string> arguments_;
  ObjectPtr standardOutput_;
  ObjectPtr standardError_;
};

}  // namespace kivi
