// MockKivNSFileHandle: a scriptable KivNSFileHandleProtocol.
//
// closeFile() and writeData() call closeFileBlock and writeDataBlock, if
// set, and do nothing otherwise: nothing is written anywhere.
//
//   auto sink = std::make_shared<kivi::MockKivNSFileHandle>();
//   kivi::Data written;
//   sink->writeDataBlock = [&](const kivi::Data& d) {
//     written.insert(written.end(), d.begin(), d.end());
//   };
//   exporter.writeTo(sink);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_ns_file_handle_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSFileHandle : public Object, public KivNSFileHandleProtocol {
 public:
  MockKivNSFileHandle() = default;

  // Called by closeFile(); without it nothing happens.
  std::function<void()> closeFileBlock;
  // Called by writeData(data); without it the data goes nowhere.
  std::function<void(const Data&)> writeDataBlock;

  void closeFile() override {
    if (closeFileBlock) closeFileBlock();
  }
  void writeData(const Data& data) override {
    if (writeDataBlock) writeDataBlock(data);
  }
};

}  // namespace kivi
