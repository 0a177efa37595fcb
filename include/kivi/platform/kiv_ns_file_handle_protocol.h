// KivNSFileHandleProtocol: the two operations of an open file that writers
// (log sinks, exporters) need: writing data and closing.
//
// The library declares no implementation: a host passes an object of its
// own (such as one over kivi::NSFileHandle) or MockKivNSFileHandle.
//
//   sink->writeData(kivi::Data(line.begin(), line.end()));
//   sink->closeFile();
//
// Thread contract: that of the implementation.
#pragma once

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivNSFileHandleProtocol {
 public:
  virtual ~KivNSFileHandleProtocol() = default;

  // Closes the file; nothing may be written after it.
  virtual void closeFile() = 0;
  // Writes all of `data` at the file's current position.
  virtual void writeData(const Data& data) = 0;
};

}  // namespace kivi
