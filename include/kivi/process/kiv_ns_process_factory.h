// Factories of child processes and pipes: code that starts programs holds a
// KivNSProcessFactoryProtocol (and a KivNSPipeFactoryProtocol for the
// streams) instead of creating NSTask and NSPipe itself, so that tests can
// hand it factories of doubles.
//
//   std::shared_ptr<kivi::KivNSProcessFactoryProtocol> processes =
//       std::make_shared<kivi::KivNSProcessFactory>();
//   std::shared_ptr<kivi::KivNSPipeFactoryProtocol> pipes =
//       std::make_shared<kivi::KivNSPipeFactory>();
//   auto task = processes->createProcess();
//   auto out = pipes->createPipe();
//   task->setLaunchPath("/bin/date");
//   task->setStandardOutput(out);
//   task->launch();
//   kivi::Data text = out->fileHandleForReading()->readDataToEndOfFile();
//
// Every call makes a new object: a new, unlaunched NSTask (no launch path,
// no arguments) or a new NSPipe. createPipe() answers null when the system
// has no descriptors left.
//
// Thread contract: the factories keep no state; call them from any thread.
#pragma once

#include <memory>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/process/kiv_ns_process_protocol.h"
#include "kivi/process/ns_pipe.h"

namespace kivi {

// Makes child processes.
class KIVI_EXPORT KivNSProcessFactoryProtocol {
 public:
  virtual ~KivNSProcessFactoryProtocol() = default;
  // A new process, not launched, with nothing set.
  virtual std::shared_ptr<KivNSProcessProtocol> createProcess() = 0;
};

// Makes pipes for the standard streams of child processes.
class KIVI_EXPORT KivNSPipeFactoryProtocol {
 public:
  virtual ~KivNSPipeFactoryProtocol() = default;
  // A new pipe; null when the system has no descriptors left.
  virtual std::shared_ptr<NSPipe> createPipe() = 0;
};

// The factory of real child processes: each is an NSTask.
class KIVI_EXPORT KivNSProcessFactory : public Object, public KivNSProcessFactoryProtocol {
 public:
  KivNSProcessFactory() = default;
  // A new NSTask.
  std::shared_ptr<KivNSProcessProtocol> createProcess() override;

  std::string className() const override { return "KivNSProcessFactory"; }
};

// The factory of real pipes: each is an NSPipe.
class KIVI_EXPORT KivNSPipeFactory : public Object, public KivNSPipeFactoryProtocol {
 public:
  KivNSPipeFactory() = default;
  // NSPipe::pipe().
  std::shared_ptr<NSPipe> createPipe() override;

  std::string className() const override { return "KivNSPipeFactory"; }
};

}  // namespace kivi
