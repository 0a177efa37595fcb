#include "kivi/process/ns_pipe.h"

#include <fcntl.h>
#include <unistd.h>

#include <utility>

namespace kivi {

NSPipe::NSPipe(std::shared_ptr<NSFileHandle> reading, std::shared_ptr<NSFileHandle> writing)
    : reading_(std::move(reading)), writing_(std::move(writing)) {}

std::shared_ptr<NSPipe> NSPipe::pipe() {
  int fds[2];
  if (::pipe2(fds, O_CLOEXEC) != 0) return nullptr;
  return std::shared_ptr<NSPipe>(new NSPipe(NSFileHandle::initWithFileDescriptor(fds[0], true),
                                            NSFileHandle::initWithFileDescriptor(fds[1], true)));
}

}  // namespace kivi
