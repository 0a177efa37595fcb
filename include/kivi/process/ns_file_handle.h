// NSFileHandle: an open file descriptor (a pipe's end, a file, a standard
// stream) with blocking reads, writes that report failure in-band, and a
// readability handler that delivers what arrives on a worker thread.
//
//   auto pipe = kivi::NSPipe::pipe();
//   pipe->fileHandleForReading()->setReadabilityHandler(
//       [](const std::shared_ptr<kivi::NSFileHandle>& handle) {
//         kivi::Data chunk = handle->availableData();
//         if (chunk.empty()) handle->setReadabilityHandler(nullptr);  // end of file
//         else consume(chunk);
//       });
//
// Reads. readDataToEndOfFile() reads until end of file; readDataOfLength(n)
// until n bytes or end of file; availableData() waits for some data and
// returns what one read gives (at most 64 KiB), empty at end of file. A read
// error ends the read: what was read so far is returned (readDataToEndOfFile
// and readDataOfLength also record the error, see lastError()). Reading a
// closed handle returns empty data at once.
//
// Writes. writeData(data, error) writes all of `data` and answers false with
// the error (NSPOSIXErrorDomain, errno) when it cannot: a pipe whose reader
// has gone gives EPIPE, and never a SIGPIPE for this process (the signal is
// held back for the writing thread and discarded). writeData(data) does the
// same and leaves the failure to lastError().
//
// The readability handler is called on a thread of its own, one call at a
// time, each time data arrives: the handle has already read it (up to
// 64 KiB) and availableData() called inside the handler returns exactly
// that chunk (a chunk the handler does not take is dropped). At end of file
// (or on a read error) the handler is called once more with availableData()
// empty, and then no more. Setting a null handler stops the calls; setting
// one while another is installed replaces it. A handler must not call the
// blocking reads.
//
// closeFile() closes the descriptor (once; later calls do nothing) and
// stops the readability handler: when it returns from any thread but the
// handler's own, no handler call is running or will start. A handle made
// with closeOnDealloc closes its descriptor when it is destroyed.
// fileDescriptor() is -1 once closed.
//
// Thread contract: a handle may be used from several threads; reads on one
// handle from two threads at once each get some of the bytes, in no
// particular split.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class NSFileHandle;
namespace detail {
struct FileHandleState;
}  // namespace detail
// Called with the handle when data has arrived on it, or at end of file.
using NSFileHandleReadabilityHandler = std::function<void(const std::shared_ptr<NSFileHandle>&)>;

class KIVI_EXPORT NSFileHandle : public Object {
 public:
  // A handle on `fd`; with closeOnDealloc the handle owns the descriptor and
  // closes it when destroyed. A negative descriptor gives a handle that is
  // already closed.
  static std::shared_ptr<NSFileHandle> initWithFileDescriptor(int fd, bool closeOnDealloc = false);
  // Handles on this process's standard streams (never closed by the handle
  // unless closeFile() is called on it).
  static std::shared_ptr<NSFileHandle> fileHandleWithStandardInput();
  static std::shared_ptr<NSFileHandle> fileHandleWithStandardOutput();
  static std::shared_ptr<NSFileHandle> fileHandleWithStandardError();
  // A handle on /dev/null, opened for reading and writing (null when it
  // cannot be opened).
  static std::shared_ptr<NSFileHandle> fileHandleWithNullDevice();

  ~NSFileHandle() override;

  // The descriptor; -1 once closed.
  int fileDescriptor() const;

  // Block until end of file, until some data, or until `length` bytes or end of file (see
  // Reads above).
  Data readDataToEndOfFile();
  Data availableData();
  Data readDataOfLength(std::size_t length);
  // Write all of `data`; a failure goes to lastError(), or is answered as false with *error.
  void writeData(const Data& data);
  [[nodiscard]] bool writeData(const Data& data, ErrorPtr* error);
  // Closes the descriptor and stops the readability handler (see above).
  void closeFile();

  // The error of the last read or write that failed on this handle, or
  // null.
  ErrorPtr lastError() const;

  // The handler called as data arrives (see above); null for none.
  NSFileHandleReadabilityHandler readabilityHandler() const;
  void setReadabilityHandler(NSFileHandleReadabilityHandler handler);

  std::string className() const override { return "NSFileHandle"; }

 private:
  NSFileHandle(int fd, bool closeOnDealloc);
  std::shared_ptr<detail::FileHandleState> state_;
};

}  // namespace kivi
