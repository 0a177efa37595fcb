// MockKivProcessFactory: a scriptable KivNSProcessFactoryProtocol.
//
// createProcess() answers createMockProcessBlock; without it, a new
// MockKivNSProcess on every call, so that code under test never starts a
// real process.
//
//   auto factory = std::make_shared<kivi::MockKivProcessFactory>();
//   auto process = std::make_shared<kivi::MockKivNSProcess>();
//   factory->createMockProcessBlock = [process] { return process; };
//   updater.setProcessFactory(factory);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>

#include "kivi/doubles/mock_kiv_ns_process.h"
#include "kivi/export.h"
#include "kivi/process/kiv_ns_process_factory.h"

namespace kivi {

class KIVI_EXPORT MockKivProcessFactory : public Object, public KivNSProcessFactoryProtocol {
 public:
  MockKivProcessFactory() = default;

  // Answers createProcess(); without it, a new MockKivNSProcess.
  std::function<std::shared_ptr<KivNSProcessProtocol>()> createMockProcessBlock;

  std::shared_ptr<KivNSProcessProtocol> createProcess() override {
    if (createMockProcessBlock) return createMockProcessBlock();
    return std::make_shared<MockKivNSProcess>();
  }
};

}  // namespace kivi
