// kivi run: runs a program as a child process, passing its output through as
// it comes, and reports how it ended.
#include <unistd.h>

#include <condition_variable>
#include <cstdlib>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include "command.h"
#include "kivi/process/kiv_ns_process_factory.h"
#include "kivi/process/ns_pipe.h"
#include "kivi/process/ns_task.h"

extern char** environ;

namespace kivi::tool {

namespace {

// COMMAND itself when it names a path, else the first executable of that
// name on PATH (or COMMAND unchanged, for the launch to report).
std::string resolveCommand(const std::string& command) {
  if (command.find('/') != std::string::npos) return command;
  const char* path = std::getenv("PATH");
  std::string directories = path ? path : "/usr/local/bin:/usr/bin:/bin";
  std::size_t start = 0;
  while (start <= directories.size()) {
    std::size_t end = directories.find(':', start);
    if (end == std::string::npos) end = directories.size();
    std::string directory = directories.substr(start, end - start);
    std::string candidate = (directory.empty() ? "." : directory) + "/" + command;
    if (::access(candidate.c_str(), X_OK) == 0) return candidate;
    start = end + 1;
  }
  return command;
}

// Copies what arrives on `pipe` to `stream`; `ended` hears of end of file.
void passThrough(const std::shared_ptr<NSPipe>& pipe, std::ostream& stream, std::mutex& mutex,
                 std::condition_variable& ended, int& open) {
  pipe->fileHandleForReading()->setReadabilityHandler(
      [&stream, &mutex, &ended, &open](const std::shared_ptr<NSFileHandle>& handle) {
        Data chunk = handle->availableData();
        std::lock_guard lock(mutex);
        if (chunk.empty()) {
          --open;
          ended.notify_all();
          return;
        }
        stream.write(reinterpret_cast<const char*>(chunk.data()),
                     static_cast<std::streamsize>(chunk.size()));
        stream.flush();
      });
}

int runRun(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  std::optional<std::string> directory;
  NSTaskEnvironment environment;
  for (char** entry = environ; *entry; ++entry) {
    std::string text = *entry;
    auto equals = text.find('=');
    if (equals != std::string::npos) environment[text.substr(0, equals)] = text.substr(equals + 1);
  }
  std::size_t at = 0;
  for (; at < args.size(); ++at) {
    const std::string& arg = args[at];
    if (arg == "--") {
      ++at;
      break;
    }
    if (arg == "--cwd" && at + 1 < args.size()) {
      directory = args[++at];
    } else if (arg == "--env" && at + 1 < args.size()) {
      const std::string& setting = args[++at];
      auto equals = setting.find('=');
      if (equals == 0 || equals == std::string::npos) {
        err << "kivi run: --env wants NAME=VALUE, not '" << setting << "'\n";
        return 2;
      }
      environment[setting.substr(0, equals)] = setting.substr(equals + 1);
    } else if (arg.starts_with("-")) {
      err << "kivi run: unexpected option '" << arg << "' (see kivi run --help)\n";
      return 2;
    } else {
      break;  // the command, without a "--" before it
    }
  }
  if (at >= args.size()) {
    err << "kivi run: no COMMAND given (see kivi run --help)\n";
    return 2;
  }

  KivNSProcessFactory processes;
  KivNSPipeFactory pipes;
  auto process = processes.createProcess();
  auto outPipe = pipes.createPipe();
  auto errPipe = pipes.createPipe();
  if (!outPipe || !errPipe) {
    err << "kivi run: no pipes left\n";
    return 1;
  }
  process->setLaunchPath(resolveCommand(args[at]));
  process->setArguments(std::vector<std::string>(args.begin() + at + 1, args.end()));
  process->setStandardOutput(outPipe);
  process->setStandardError(errPipe);
  if (auto task = std::dynamic_pointer_cast<NSTask>(process)) {
    task->setEnvironment(environment);
    if (directory) task->setCurrentDirectoryPath(*directory);
  }

  std::mutex mutex;
  std::condition_variable ended;
  int open = 2;
  passThrough(outPipe, out, mutex, ended, open);
  passThrough(errPipe, err, mutex, ended, open);
  ErrorPtr error;
  if (!process->launchAndReturnError(&error)) {
    outPipe->fileHandleForReading()->closeFile();
    errPipe->fileHandleForReading()->closeFile();
    err << "kivi run: cannot run '" << args[at] << "': " << error->localizedDescription() << " ("
        << error->domain() << " " << error->code() << ")\n";
    return process->terminationStatus();
  }
  process->waitUntilExit();
  {
    std::unique_lock lock(mutex);
    ended.wait(lock, [&] { return open == 0; });
  }
  outPipe->fileHandleForReading()->closeFile();
  errPipe->fileHandleForReading()->closeFile();

  const bool signalled = process->terminationReason() == NSTaskTerminationReasonUncaughtSignal;
  const int status = process->terminationStatus();
  err << "terminated: status " << status << ", reason " << (signalled ? "uncaught signal" : "exit")
      << "\n";
  return signalled ? 128 + status : status;
}

}  // namespace

Command runCommand() {
  return {"run", "run a program and report how it ended",
          "usage: kivi run [--cwd DIR] [--env NAME=VALUE]... [--] COMMAND [ARG...]\n\n"
          "Runs COMMAND (looked up on PATH when it holds no '/') with the ARGs as a\n"
          "child process, copying its standard output and standard error to this\n"
          "tool's as they arrive; its standard input is this tool's. --cwd runs it\n"
          "in DIR; each --env adds or replaces one variable of the inherited\n"
          "environment. When the child has ended, prints to standard error\n"
          "  terminated: status N, reason exit              (N: its exit code)\n"
          "  terminated: status N, reason uncaught signal   (N: the signal)\n"
          "and exits with the child's exit code, or 128 + the signal. A COMMAND that\n"
          "cannot be run exits with 127 (not found) or 126 (not executable) and the\n"
          "reason; bad arguments exit with 2.\n",
          runRun};
}

const CommandRegistration kRegistration{50, &runCommand};

}  // namespace kivi::tool
