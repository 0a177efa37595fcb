#include "kivi/process/ns_file_handle.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <thread>

#include "kivi/net/kiv_ns_url_protocol.h"
#include "kivi/process/ns_pipe.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::Signal;

Data bytes(std::string_view text) { return Data(text.begin(), text.end()); }

TEST(NSFileHandle, ReadsWritesAndCloses) {
  auto pipe = NSPipe::pipe();
  ASSERT_NE(pipe, nullptr);
  auto reader = pipe->fileHandleForReading(), writer = pipe->fileHandleForWriting();
  EXPECT_TRUE(writer->writeData(bytes("hello, world"), nullptr));
  EXPECT_EQ(reader->readDataOfLength(5), bytes("hello"));
  EXPECT_EQ(reader->availableData(), bytes(", world"));
  writer->writeData(bytes("tail"));
  writer->closeFile();
  writer->closeFile();  // twice: nothing happens
  EXPECT_EQ(writer->fileDescriptor(), -1);
  EXPECT_EQ(reader->readDataOfLength(100), bytes("tail"));  // stops at end of file
  EXPECT_TRUE(reader->readDataToEndOfFile().empty());
  EXPECT_TRUE(reader->availableData().empty());

  ErrorPtr error;
  EXPECT_FALSE(writer->writeData(bytes("x"), &error));  // closed
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), EBADF);
  EXPECT_EQ(writer->lastError(), error);

  auto null = NSFileHandle::fileHandleWithNullDevice();
  ASSERT_NE(null, nullptr);
  EXPECT_TRUE(null->writeData(bytes("gone"), nullptr));
  EXPECT_TRUE(null->readDataToEndOfFile().empty());
  EXPECT_EQ(NSFileHandle::initWithFileDescriptor(-5)->fileDescriptor(), -1);
  EXPECT_EQ(NSFileHandle::fileHandleWithStandardError()->fileDescriptor(), 2);
}

TEST(NSFileHandle, WritingWithoutReaderGivesEPIPEAndNoSignal) {
  auto pipe = NSPipe::pipe();
  pipe->fileHandleForReading()->closeFile();
  ErrorPtr error;
  EXPECT_FALSE(pipe->fileHandleForWriting()->writeData(bytes("nobody listens"), &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), POSIXErrorDomain);
  EXPECT_EQ(error->code(), EPIPE);
}

TEST(NSFileHandle, ReadabilityHandlerDeliversEverythingThenEndOfFileOnce) {
  auto pipe = NSPipe::pipe();
  auto reader = pipe->fileHandleForReading();
  std::string received;
  int endings = 0;
  std::thread::id handlerThread;
  Signal ended;
  reader->setReadabilityHandler([&](const std::shared_ptr<NSFileHandle>& handle) {
    handlerThread = std::this_thread::get_id();
    Data chunk = handle->availableData();
    EXPECT_TRUE(handle->availableData().empty());  // the chunk is given once
    received.append(chunk.begin(), chunk.end());
    if (chunk.empty()) {
      ++endings;
      ended.notify();
    }
  });
  std::string sent;
  for (int i = 0; i < 2000; ++i) sent += std::to_string(i) + ",";
  EXPECT_TRUE(pipe->fileHandleForWriting()->writeData(bytes(sent), nullptr));
  pipe->fileHandleForWriting()->closeFile();
  ASSERT_TRUE(ended.wait());
  EXPECT_FALSE(ended.wait(2, testing::kQuiet));
  EXPECT_EQ(endings, 1);
  EXPECT_EQ(received, sent);
  EXPECT_NE(handlerThread, std::this_thread::get_id());
}

TEST(NSFileHandle, StoppingTheHandler) {
  // Cleared from inside the handler: no further call.
  auto pipe = NSPipe::pipe();
  std::atomic<int> calls{0};
  Signal first;
  pipe->fileHandleForReading()->setReadabilityHandler([&](const std::shared_ptr<NSFileHandle>& h) {
    ++calls;
    h->setReadabilityHandler(nullptr);
    first.notify();
  });
  pipe->fileHandleForWriting()->writeData(bytes("one"));
  ASSERT_TRUE(first.wait());
  pipe->fileHandleForWriting()->writeData(bytes("two"));
  std::this_thread::sleep_for(testing::kQuiet);
  EXPECT_EQ(calls.load(), 1);
  EXPECT_EQ(pipe->fileHandleForReading()->availableData(), bytes("two"));

  // closeFile() from another thread: when it returns, no call runs or starts.
  auto other = NSPipe::pipe();
  std::atomic<bool> closed{false}, lateCall{false};
  other->fileHandleForReading()->setReadabilityHandler([&](const std::shared_ptr<NSFileHandle>& h) {
    if (closed) lateCall = true;
    h->availableData();
  });
  other->fileHandleForWriting()->writeData(bytes("data"));
  other->fileHandleForReading()->closeFile();
  closed = true;
  other->fileHandleForWriting()->writeData(bytes("more"));
  std::this_thread::sleep_for(testing::kQuiet);
  EXPECT_FALSE(lateCall.load());
  EXPECT_EQ(other->fileHandleForReading()->readabilityHandler(), nullptr);
}

TEST(NSFileHandle, DroppingTheLastReferenceInsideTheHandler) {
  auto pipe = NSPipe::pipe();
  auto holder = std::make_shared<std::shared_ptr<NSFileHandle>>(pipe->fileHandleForReading());
  Signal done;
  (*holder)->setReadabilityHandler([holder, &done](const std::shared_ptr<NSFileHandle>&) {
    holder->reset();
    done.notify();
  });
  auto writer = pipe->fileHandleForWriting();
  pipe.reset();  // the handle now lives only in `holder`
  writer->writeData(bytes("x"));
  ASSERT_TRUE(done.wait());
}

}  // namespace
}  // namespace kivi
