#include "kivi/base/recursive_lock.h"

namespace kivi {

std::string RecursiveLock::name() const {
  std::lock_guard lock(nameMutex_);
  return name_;
}

void RecursiveLock::setName(std::string name) {
  std::lock_guard lock(nameMutex_);
  name_ = std::move(name);
}

}  // namespace kivi
