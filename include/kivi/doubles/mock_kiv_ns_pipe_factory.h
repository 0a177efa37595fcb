// MockKivNSPipeFactory: a scriptable KivNSPipeFactoryProtocol.
//
// createPipe() answers createMockPipeBlock; without it, a new real pipe
// (NSPipe::pipe(), null when the system has no descriptors left).
//
//   auto pipes = std::make_shared<kivi::MockKivNSPipeFactory>();
//   pipes->createMockPipeBlock = [] { return std::shared_ptr<kivi::NSPipe>(); };  // "no pipe"
//   runner.setPipeFactory(pipes);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>

#include "kivi/export.h"
#include "kivi/process/kiv_ns_process_factory.h"

namespace kivi {

class KIVI_EXPORT MockKivNSPipeFactory : public Object, public KivNSPipeFactoryProtocol {
 public:
  MockKivNSPipeFactory() = default;

  // Answers createPipe(); without it, a new real pipe (NSPipe::pipe()).
  std::function<std::shared_ptr<NSPipe>()> createMockPipeBlock;

  std::shared_ptr<NSPipe> createPipe() override {
    return createMockPipeBlock ? createMockPipeBlock() : NSPipe::pipe();
  }
};

}  // namespace kivi
