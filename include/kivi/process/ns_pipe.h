// NSPipe: a one-way channel between processes, or between threads, with a
// handle on each end. Handed to an NSTask as a standard stream, the child
// gets the matching end (the writing end for its output, the reading end for
// its input) and this process closes its copy of that end at launch, so a
// reader sees end of file when the child exits.
//
//   auto out = kivi::NSPipe::pipe();
//   task->setStandardOutput(out);
//   task->launch();
//   kivi::Data all = out->fileHandleForReading()->readDataToEndOfFile();
//
// pipe() answers null when the system has no descriptors left. Both
// descriptors are close-on-exec: no child inherits them except through a
// task's standard streams.
//
// Thread contract: the pipe is immutable; its handles follow NSFileHandle's
// contract.
#pragma once

#include <memory>
#include <string>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/process/ns_file_handle.h"

namespace kivi {

class KIVI_EXPORT NSPipe : public Object {
 public:
  // A new pipe; null when the system has no descriptors left.
  static std::shared_ptr<NSPipe> pipe();

  // The ends; each closes its descriptor when destroyed or closed.
  std::shared_ptr<NSFileHandle> fileHandleForReading() const { return reading_; }
  std::shared_ptr<NSFileHandle> fileHandleForWriting() const { return writing_; }

  std::string className() const override { return "NSPipe"; }

 private:
  NSPipe(std::shared_ptr<NSFileHandle> reading, std::shared_ptr<NSFileHandle> writing);
  std::shared_ptr<NSFileHandle> reading_;
  std::shared_ptr<NSFileHandle> writing_;
};

}  // namespace kivi
