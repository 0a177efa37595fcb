// kivi lock: run a command while holding an NSDistributedLock, so that
// scripts in several processes take turns.
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sysexits.h>
#include <unistd.h>

#include <atomic>
#include <charconv>
#include <cmath>
#include <cstring>
#include <iostream>
#include <optional>
#include <ostream>

#include "command.h"
#include "kivi/dispatch/distributed_lock.h"

extern char** environ;

namespace kivi::tool {

namespace {

constexpr int kSignals[] = {SIGINT, SIGTERM, SIGHUP};

// Set by the handler: the first termination signal received, and the child
// it is passed on to (0 while none runs).
std::atomic<int> gSignal{0};
std::atomic<pid_t> gChild{0};

void onSignal(int signo, siginfo_t* info, void*) {
  int none = 0;
  gSignal.compare_exchange_strong(none, signo);
  // A signal from the terminal already reached the child, which shares our
  // process group; one sent to us alone is passed on.
  const pid_t child = gChild.load();
  if (child > 0 && info && info->si_code <= 0) ::kill(child, signo);
}

int usageError(std::ostream& err, const std::string& message) {
  err << "kivi lock: " << message << " (see kivi lock --help)\n";
  return EX_USAGE;
}

std::optional<double> parseSeconds(const std::string& text) {
  double value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return value;
}

// The reason a lock directory cannot be made at `path`, checked before
// waiting, or empty when its parent looks usable.
std::string parentProblem(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  const auto slash = path.rfind('/');
  const std::string parent =
      slash == std::string::npos ? "." : (slash == 0 ? "/" : path.substr(0, slash));
  struct stat info;
  if (::stat(parent.c_str(), &info) != 0) return std::strerror(errno);
  if (!S_ISDIR(info.st_mode)) return std::strerror(ENOTDIR);
  if (::access(parent.c_str(), W_OK | X_OK) != 0) return std::strerror(errno);
  return {};
}

// Runs `argv` with our standard streams and waits for it; its exit status,
// 128 + the signal number when a signal ended it, or 127 when it could not be
// started.
int runChild(const std::vector<std::string>& command, std::ostream& err) {
  std::vector<char*> argv;
  for (const auto& arg : command) argv.push_back(const_cast<char*>(arg.c_str()));
  argv.push_back(nullptr);
  std::cout.flush();
  std::cerr.flush();
  pid_t pid = 0;
  const int failure = ::posix_spawnp(&pid, argv[0], nullptr, nullptr, argv.data(), environ);
  if (failure != 0) {
    err << "kivi lock: cannot run '" << command[0] << "': " << std::strerror(failure) << "\n";
    return 127;
  }
  gChild.store(pid);
  // A signal that came between the spawn and the store.
  if (const int signo = gSignal.load()) ::kill(pid, signo);
  int status = 0;
  while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  gChild.store(0);
  if (WIFSIGNALED(status)) return 128 + WTERMSIG(status);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 1;
}

int runLock(const std::vector<std::string>& args, std::ostream&, std::ostream& err) {
  if (!args.empty() && args[0] == "--break") {
    if (args.size() != 2) return usageError(err, "--break takes exactly one PATH");
    const auto lock = NSDistributedLock::lockWithPath(args[1]);
    if (!lock) return usageError(err, "PATH is empty or longer than PATH_MAX");
    lock->breakLock();
    if (lock->lockDate()) {
      err << "kivi lock: '" << args[1] << "' is not a lock directory; left in place\n";
      return EX_CANTCREAT;
    }
    return 0;
  }

  std::optional<std::string> path;
  double timeout = 10, resolution = 0.1;
  std::size_t i = 0;
  for (; i < args.size() && args[i] != "--"; ++i) {
    const std::string& arg = args[i];
    if (arg == "--timeout" || arg == "--resolution") {
      std::optional<double> value;
      if (i + 1 < args.size()) value = parseSeconds(args[++i]);
      const double seconds = value.value_or(-1);
      if (arg == "--timeout" && seconds >= 0) {
        timeout = seconds;
      } else if (arg == "--resolution" && seconds > 0 && std::isfinite(seconds)) {
        resolution = seconds;
      } else {
        return usageError(err, arg + (arg == "--timeout" ? " needs a number of seconds >= 0"
                                                         : " needs a positive number of seconds"));
      }
    } else if (arg.starts_with("-") && arg != "-") {
      return usageError(err, "unknown option '" + arg + "'");
    } else if (path) {
      return usageError(err, "more than one PATH (put the command after '--')");
    } else {
      path = arg;
    }
  }
  if (!path) return usageError(err, "no PATH given");
  if (i + 1 >= args.size()) return usageError(err, "no COMMAND given after '--'");
  const std::vector<std::string> command(args.begin() + static_cast<std::ptrdiff_t>(i) + 1,
                                         args.end());

  const auto lock = NSDistributedLock::lockWithPath(*path);
  if (!lock) return usageError(err, "PATH is empty or longer than PATH_MAX");
  if (const auto problem = parentProblem(*path); !problem.empty()) {
    err << "kivi lock: cannot create the lock '" << *path << "': " << problem << "\n";
    return EX_CANTCREAT;
  }

  // From here a termination signal is noted (and passed on to the command)
  // rather than ending the tool, so the lock is never left behind.
  struct sigaction action {};
  action.sa_sigaction = onSignal;
  action.sa_flags = SA_SIGINFO;
  sigemptyset(&action.sa_mask);
  for (const int signo : kSignals) ::sigaction(signo, &action, nullptr);

  const bool taken = lock->tryLock(timeout, resolution);
  if (!taken && !gSignal.load()) {
    err << "kivi lock: '" << *path << "' was not free within " << timeout << " seconds";
    if (const auto since = lock->lockDate()) {
      err << " (held for " << static_cast<long long>(-since->timeIntervalSinceNow())
          << " s; 'kivi lock --break' removes a stale lock)";
    }
    err << "\n";
    return EX_TEMPFAIL;
  }
  const int status = gSignal.load() ? 128 + gSignal.load() : runChild(command, err);
  if (taken) lock->unlock();
  return status;
}

}  // namespace

Command lockCommand() {
  return {"lock", "run a command while holding an inter-process lock",
          "usage: kivi lock PATH [--timeout S] [--resolution S] -- COMMAND [ARG]...\n"
          "       kivi lock --break PATH\n\n"
          "Takes the lock PATH, runs COMMAND with the tool's standard streams, waits\n"
          "for it, then releases the lock. The lock is the directory PATH: the tool\n"
          "that creates it holds it, every other waits. Its parent directory must\n"
          "exist and be writable.\n\n"
          "  --timeout S     give up after S seconds (default 10; 0 tries once; 'inf'\n"
          "                  waits for good)\n"
          "  --resolution S  try again every S seconds while waiting (default 0.1)\n"
          "  --break PATH    remove the lock whoever holds it, e.g. one left by a\n"
          "                  holder that crashed\n\n"
          "SIGINT, SIGTERM and SIGHUP are passed on to COMMAND; the lock is released\n"
          "once it has ended. One that comes while the tool still waits for the lock\n"
          "ends the tool when the wait does, without running COMMAND.\n\n"
          "Exit code: COMMAND's own, or 128 + the signal number when a signal ended\n"
          "it; 127 when COMMAND cannot be run; 75 when the lock was not free in time;\n"
          "73 when the lock cannot be created (or --break found something at PATH\n"
          "that is not a lock); 64 for bad arguments.\n",
          runLock};
}

const CommandRegistration kRegistration{60, &lockCommand};

}  // namespace kivi::tool
