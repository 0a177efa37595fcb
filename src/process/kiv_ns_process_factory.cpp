#include "kivi/process/kiv_ns_process_factory.h"

#include "kivi/process/ns_task.h"

namespace kivi {

std::shared_ptr<KivNSProcessProtocol> KivNSProcessFactory::createProcess() {
  return NSTask::create();
}

std::shared_ptr<NSPipe> KivNSPipeFactory::createPipe() { return NSPipe::pipe(); }

}  // namespace kivi
