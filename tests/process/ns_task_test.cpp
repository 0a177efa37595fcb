#include "kivi/process/ns_task.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <thread>

#include "kivi/process/kiv_ns_process_factory.h"
#include "kivi/process/ns_pipe.h"
#include "kivi/text/json_serialization.h"
#include "test_support.h"

namespace kivi {
namespace {

using testing::kTimeout;
using testing::returnsWithin;
using testing::Signal;

std::shared_ptr<NSTask> shell(const std::string& script) {
  auto task = NSTask::create();
  task->setLaunchPath("/bin/sh");
  task->setArguments(std::vector<std::string>{"-c", script});
  return task;
}

std::string text(const Data& data) { return std::string(data.begin(), data.end()); }

// Runs `task` with its standard output in a pipe; what it printed.
std::string output(const std::shared_ptr<NSTask>& task) {
  auto out = NSPipe::pipe();
  task->setStandardOutput(out);
  ErrorPtr error;
  if (!task->launchAndReturnError(&error)) return "launch failed: " + error->description();
  std::string printed = text(out->fileHandleForReading()->readDataToEndOfFile());
  task->waitUntilExit();
  return printed;
}

class TempDirectory {
 public:
  TempDirectory() {
    char pattern[] = "/tmp/kivi-task-XXXXXX";
    if (::mkdtemp(pattern)) path_ = pattern;
  }
  ~TempDirectory() { std::filesystem::remove_all(path_); }
  const std::string& path() const { return path_; }
  std::string file(const std::string& name, const std::string& contents, mode_t mode) const {
    std::string file = path_ + "/" + name;
    std::ofstream(file, std::ios::binary) << contents;
    ::chmod(file.c_str(), mode);
    return file;
  }

 private:
  std::string path_;
};

TEST(NSTask, ExitStatusAndReason) {
  auto task = shell("exit 3");
  EXPECT_FALSE(task->isRunning());
  EXPECT_EQ(task->terminationStatus(), 0);
  EXPECT_EQ(task->terminationReason(), 0);
  EXPECT_EQ(task->processIdentifier(), 0);
  ASSERT_TRUE(returnsWithin([&] { task->waitUntilExit(); }));  // not launched: at once

  ErrorPtr error = Error::create("stale", 1);
  ASSERT_TRUE(task->launchAndReturnError(&error));
  EXPECT_EQ(error, nullptr);
  EXPECT_GT(task->processIdentifier(), 0);
  ASSERT_TRUE(returnsWithin([&] { task->waitUntilExit(); }));
  EXPECT_FALSE(task->isRunning());
  EXPECT_EQ(task->terminationStatus(), 3);
  EXPECT_EQ(task->terminationReason(), NSTaskTerminationReasonExit);

  // A second launch is refused and changes nothing.
  EXPECT_FALSE(task->launchAndReturnError(&error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), POSIXErrorDomain);
  EXPECT_EQ(error->code(), EALREADY);
  EXPECT_EQ(task->terminationStatus(), 3);
}

TEST(NSTask, SignalsEndTheChildWithTheirNumber) {
  auto killed = shell("kill -9 $$");
  killed->launch();
  ASSERT_TRUE(returnsWithin([&] { killed->waitUntilExit(); }));
  EXPECT_EQ(killed->terminationReason(), NSTaskTerminationReasonUncaughtSignal);
  EXPECT_EQ(killed->terminationStatus(), 9);

  // A child that never exits by itself, stopped by terminate(): while it runs
  // the status reads 0.
  auto forever = shell("exec sleep 600");
  forever->launch();
  EXPECT_TRUE(forever->isRunning());
  EXPECT_EQ(forever->terminationStatus(), 0);
  forever->terminate();
  ASSERT_TRUE(returnsWithin([&] { forever->waitUntilExit(); }));
  EXPECT_EQ(forever->terminationReason(), NSTaskTerminationReasonUncaughtSignal);
  EXPECT_EQ(forever->terminationStatus(), 15);
  forever->terminate();  // after exit: nothing happens

  auto interrupted = shell("exec sleep 600");
  interrupted->launch();
  interrupted->interrupt();
  ASSERT_TRUE(returnsWithin([&] { interrupted->waitUntilExit(); }));
  EXPECT_EQ(interrupted->terminationStatus(), 2);
}

TEST(NSTask, TerminationHandlerRunsOnceOnAWorkerThread) {
  auto task = shell("exit 0");
  Signal called;
  std::atomic<int> calls{0};
  std::thread::id handlerThread;
  std::shared_ptr<NSTask> given;
  bool runningInHandler = true;
  task->setTerminationHandler([&](const std::shared_ptr<NSTask>& finished) {
    handlerThread = std::this_thread::get_id();
    given = finished;
    runningInHandler = finished->isRunning();
    ++calls;
    called.notify();
  });
  task->launch();
  ASSERT_TRUE(called.wait());
  EXPECT_FALSE(called.wait(2, testing::kQuiet));
  EXPECT_EQ(calls.load(), 1);
  EXPECT_NE(handlerThread, std::this_thread::get_id());
  EXPECT_EQ(given, task);
  EXPECT_FALSE(runningInHandler);
}

TEST(NSTask, WaitUntilExitFromSeveralThreads) {
  auto task = shell("read line; exit 4");
  auto input = NSPipe::pipe();
  task->setStandardInput(input);
  task->launch();
  std::atomic<int> returned{0};
  std::vector<std::thread> waiters;
  for (int i = 0; i < 4; ++i)
    waiters.emplace_back([&] {
      task->waitUntilExit();
      ++returned;
    });
  std::this_thread::sleep_for(testing::kQuiet);  // the child waits for input meanwhile
  EXPECT_EQ(returned.load(), 0);
  EXPECT_TRUE(input->fileHandleForWriting()->writeData(Data{'x', '\n'}, nullptr));
  for (auto& waiter : waiters) waiter.join();
  EXPECT_EQ(returned.load(), 4);
  EXPECT_EQ(task->terminationStatus(), 4);
}

TEST(NSTask, ReadsFiftyMegabytesFromBothStreams) {
  constexpr std::size_t kSize = 50 * 1024 * 1024;
  auto task = shell("head -c 52428800 /dev/zero >&2 & head -c 52428800 /dev/zero; wait");
  auto out = NSPipe::pipe();
  auto err = NSPipe::pipe();
  task->setStandardOutput(out);
  task->setStandardError(err);
  std::atomic<std::size_t> outBytes{0}, errBytes{0};
  Signal ends;
  auto counter = [&](std::atomic<std::size_t>& total) {
    return [&](const std::shared_ptr<NSFileHandle>& handle) {
      Data chunk = handle->availableData();
      total += chunk.size();
      if (chunk.empty()) ends.notify();
    };
  };
  out->fileHandleForReading()->setReadabilityHandler(counter(outBytes));
  err->fileHandleForReading()->setReadabilityHandler(counter(errBytes));
  task->launch();
  ASSERT_TRUE(ends.wait(2, std::chrono::seconds(120)));
  ASSERT_TRUE(returnsWithin([&] { task->waitUntilExit(); }));
  EXPECT_EQ(outBytes.load(), kSize);
  EXPECT_EQ(errBytes.load(), kSize);
  EXPECT_EQ(task->terminationStatus(), 0);
}

TEST(NSTask, WritingToAChildThatClosedItsInputFailsInBand) {
  auto task = shell("exec 0<&-; exit 0");
  auto input = NSPipe::pipe();
  task->setStandardInput(input);
  task->launch();
  task->waitUntilExit();
  ErrorPtr error;
  EXPECT_FALSE(input->fileHandleForWriting()->writeData(Data(1 << 20, 'a'), &error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), POSIXErrorDomain);
  EXPECT_EQ(error->code(), EPIPE);
}

TEST(NSTask, LaunchFailuresAreReportedInBand) {
  TempDirectory dir;
  const std::string plain = dir.file("plain", "#!/bin/sh\nexit 0\n", 0644);
  struct Case {
    std::optional<std::string> path;
    std::int64_t code;
    std::int32_t status;
  } cases[] = {
      {dir.path() + "/missing", FileNoSuchFileError, 127},
      {plain, FileReadNoPermissionError, 126},
      {dir.path(), FileReadNoPermissionError, 126},
      {std::nullopt, FileNoSuchFileError, 127},
      {std::string("/bin/t\0rue", 10), FileNoSuchFileError, 127},
  };
  for (const auto& c : cases) {
    auto task = NSTask::create();
    task->setLaunchPath(c.path);
    bool handled = false;
    task->setTerminationHandler([&](const std::shared_ptr<NSTask>&) { handled = true; });
    ErrorPtr error;
    EXPECT_FALSE(task->launchAndReturnError(&error));
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->domain(), CocoaErrorDomain);
    EXPECT_EQ(error->code(), c.code);
    if (c.path && c.path->find('\0') == std::string::npos) {
      const String* path = error->userInfo().at(FilePathErrorKey).asString();
      ASSERT_NE(path, nullptr);
      EXPECT_EQ(std::string_view(*path), *c.path);
    }
    EXPECT_FALSE(task->isRunning());
    EXPECT_EQ(task->processIdentifier(), 0);
    EXPECT_EQ(task->terminationStatus(), c.status);
    EXPECT_EQ(task->terminationReason(), NSTaskTerminationReasonExit);
    EXPECT_TRUE(returnsWithin([&] { task->waitUntilExit(); }));
    EXPECT_FALSE(task->launchAndReturnError(nullptr));
    std::this_thread::sleep_for(testing::kQuiet);
    EXPECT_FALSE(handled);
  }

  // Bad arguments, environments and directories.
  auto withNul = shell("exit 0");
  withNul->setArguments(std::vector<std::string>{std::string("a\0b", 3)});
  auto badName = shell("exit 0");
  badName->setEnvironment(NSTaskEnvironment{{"A=B", "1"}});
  auto noDirectory = shell("exit 0");
  noDirectory->setCurrentDirectoryPath(dir.path() + "/nowhere");
  for (auto& task : {withNul, badName, noDirectory}) {
    ErrorPtr error;
    EXPECT_FALSE(task->launchAndReturnError(&error));
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->domain(), POSIXErrorDomain);
  }
}

TEST(NSTask, WorkingDirectoryEnvironmentAndOddNames) {
  TempDirectory dir;
  auto pwd = shell("pwd -P");
  pwd->setCurrentDirectoryPath(dir.path());
  EXPECT_EQ(output(pwd), std::filesystem::canonical(dir.path()).string() + "\n");

  auto env = NSTask::create();
  env->setLaunchPath("/usr/bin/env");
  env->setEnvironment(NSTaskEnvironment{{"A", "1"}, {"B", "two words"}});
  EXPECT_EQ(output(env), "A=1\nB=two words\n");

  if (const char* path = std::getenv("PATH")) {
    auto inherited = shell("printf %s \"$PATH\"");
    EXPECT_EQ(output(inherited), path);
  }

  // A program whose name is not UTF-8, given as a URL, with a relative
  // launch path resolved against this process's directory.
  const std::string odd = dir.file("\xff\xfe prog", "#!/bin/sh\nprintf %s \"$1\"\nexit 7\n", 0755);
  auto byURL = NSTask::create();
  byURL->setExecutableURL(URL::fileURLWithPath(odd));
  EXPECT_EQ(byURL->launchPath(), odd);
  byURL->setArguments(std::vector<std::string>{"\xc3\x28 arg"});
  EXPECT_EQ(output(byURL), "\xc3\x28 arg");
  EXPECT_EQ(byURL->terminationStatus(), 7);
}

TEST(NSTask, NoDescriptorLeaksIntoTheChildOrThisProcess) {
  const std::size_t before = testing::openDescriptors();
  int inheritable = ::open("/dev/null", O_RDONLY);  // no close-on-exec
  ASSERT_GE(inheritable, 3);
  EXPECT_EQ(output(shell("test -e /proc/self/fd/" + std::to_string(inheritable) +
                         " && echo leaked || echo clean")),
            "clean\n");
  ::close(inheritable);

  for (int i = 0; i < 10; ++i) {
    auto task = shell("echo out; echo err >&2; exit 0");
    auto out = NSPipe::pipe(), err = NSPipe::pipe(), in = NSPipe::pipe();
    task->setStandardOutput(out);
    task->setStandardError(err);
    task->setStandardInput(in);
    Signal done;
    task->setTerminationHandler([&](const std::shared_ptr<NSTask>&) { done.notify(); });
    task->launch();
    EXPECT_EQ(text(out->fileHandleForReading()->readDataToEndOfFile()), "out\n");
    ASSERT_TRUE(done.wait());
    auto failed = NSTask::create();
    failed->setLaunchPath("/nonexistent/program");
    failed->setStandardOutput(NSPipe::pipe());
    failed->launch();
  }
  // The handlers' last references go away on the pool shortly after.
  const auto deadline = std::chrono::steady_clock::now() + kTimeout;
  while (testing::openDescriptors() != before && std::chrono::steady_clock::now() < deadline)
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  EXPECT_EQ(testing::openDescriptors(), before);
}

TEST(NSTask, FactoriesMakeNewObjects) {
  KivNSProcessFactory processes;
  KivNSPipeFactory pipes;
  auto a = processes.createProcess(), b = processes.createProcess();
  ASSERT_NE(a, nullptr);
  EXPECT_NE(a, b);
  EXPECT_FALSE(a->isRunning());
  EXPECT_EQ(a->launchPath(), std::nullopt);
  EXPECT_EQ(a->arguments(), std::nullopt);
  auto p = pipes.createPipe(), q = pipes.createPipe();
  ASSERT_NE(p, nullptr);
  EXPECT_NE(p, q);
  EXPECT_NE(p->fileHandleForReading()->fileDescriptor(),
            q->fileHandleForReading()->fileDescriptor());
}

}  // namespace
}  // namespace kivi
