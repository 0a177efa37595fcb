#include "kivi/process/ns_task.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <system_error>
#include <thread>
#include <utility>
#include <variant>
#include <vector>

#include "kivi/dispatch/dispatch_queue.h"
#include "kivi/process/ns_file_handle.h"
#include "kivi/process/ns_pipe.h"
#include "process_errors.h"

extern char** environ;

namespace kivi {

namespace {

// What a shell reports for a command it could not run.
constexpr std::int32_t kCannotExecute = 126;
constexpr std::int32_t kNotFound = 127;

bool holdsNul(const std::string& text) { return text.find('\0') != std::string::npos; }

std::string workingDirectory() {
  std::string buffer(PATH_MAX, '\0');
  if (!::getcwd(buffer.data(), buffer.size())) return {};
  buffer.resize(std::strlen(buffer.c_str()));
  return buffer;
}

struct Configuration {
  std::optional<std::string> path;
  std::optional<std::vector<std::string>> arguments;
  std::optional<NSTaskEnvironment> environment;
  std::optional<std::string> directory;
  ObjectPtr streams[3];
};

struct LaunchFailure {
  ErrorPtr error;
  std::int32_t status = kNotFound;
};

// Owns what posix_spawn needs and frees it on every path.
class SpawnSetup {
 public:
  SpawnSetup() {
    ::posix_spawn_file_actions_init(&actions_);
    ::posix_spawnattr_init(&attributes_);
  }
  ~SpawnSetup() {
    ::posix_spawn_file_actions_destroy(&actions_);
    ::posix_spawnattr_destroy(&attributes_);
    for (int fd : temporaries_) ::close(fd);
  }
  SpawnSetup(const SpawnSetup&) = delete;
  SpawnSetup& operator=(const SpawnSetup&) = delete;

  posix_spawn_file_actions_t* actions() { return &actions_; }
  posix_spawnattr_t* attributes() { return &attributes_; }
  // A descriptor at 3 or above for `fd`, so that the dup2 of one standard
  // stream never overwrites the source of another.
  int highDescriptor(int fd) {
    if (fd > STDERR_FILENO) return fd;
    int copy = ::fcntl(fd, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
    if (copy >= 0) temporaries_.push_back(copy);
    return copy;
  }

 private:
  posix_spawn_file_actions_t actions_;
  posix_spawnattr_t attributes_;
  std::vector<int> temporaries_;
};

// The descriptor the child gets as standard stream `index` from `stream`;
// -1 to inherit, -2 for a closed handle.
int streamDescriptor(const ObjectPtr& stream, int index) {
  if (!stream) return -1;
  std::shared_ptr<NSFileHandle> handle;
  if (auto pipe = std::dynamic_pointer_cast<NSPipe>(stream))
    handle = index == STDIN_FILENO ? pipe->fileHandleForReading() : pipe->fileHandleForWriting();
  else
    handle = std::dynamic_pointer_cast<NSFileHandle>(stream);
  if (!handle) return -1;
  int fd = handle->fileDescriptor();
  return fd < 0 ? -2 : fd;
}

// Starts the child; the pid, or the failure.
std::variant<pid_t, LaunchFailure> spawn(const Configuration& config) {
  const std::string given = config.path.value_or(std::string());
  if (given.empty() || holdsNul(given))
    return LaunchFailure{detail::fileError(FileNoSuchFileError, holdsNul(given) ? "" : given)};
  std::string program = given;
  if (program.front() != '/') {
    std::string cwd = workingDirectory();
    if (cwd.empty()) return LaunchFailure{detail::posixError(errno, given)};
    program = (cwd == "/" ? "" : cwd) + "/" + program;
  }

  std::vector<std::string> argumentStrings{given};
  if (config.arguments) {
    for (const auto& argument : *config.arguments) {
      if (holdsNul(argument)) return LaunchFailure{detail::posixError(EINVAL, given)};
      argumentStrings.push_back(argument);
    }
  }
  std::vector<char*> argv;
  for (auto& argument : argumentStrings) argv.push_back(argument.data());
  argv.push_back(nullptr);

  std::vector<std::string> environmentStrings;
  std::vector<char*> envp;
  if (config.environment) {
    for (const auto& [name, value] : *config.environment) {
      if (name.empty() || name.find('=') != std::string::npos || holdsNul(name) || holdsNul(value))
        return LaunchFailure{detail::posixError(EINVAL, given)};
      environmentStrings.push_back(name + "=" + value);
    }
    for (auto& entry : environmentStrings) envp.push_back(entry.data());
    envp.push_back(nullptr);
  }

  SpawnSetup setup;
  if (config.directory) {
    const std::string& directory = *config.directory;
    struct stat info {};
    if (directory.empty() || holdsNul(directory))
      return LaunchFailure{detail::posixError(ENOENT, holdsNul(directory) ? "" : directory)};
    if (::stat(directory.c_str(), &info) != 0)
      return LaunchFailure{detail::posixError(errno, directory)};
    if (!S_ISDIR(info.st_mode)) return LaunchFailure{detail::posixError(ENOTDIR, directory)};
    ::posix_spawn_file_actions_addchdir_np(setup.actions(), directory.c_str());
  }
  for (int index = 0; index < 3; ++index) {
    int fd = streamDescriptor(config.streams[index], index);
    if (fd == -1) continue;
    if (fd == -2) return LaunchFailure{detail::posixError(EBADF, given)};
    fd = setup.highDescriptor(fd);
    if (fd < 0) return LaunchFailure{detail::posixError(errno, given)};
    ::posix_spawn_file_actions_adddup2(setup.actions(), fd, index);
  }
  // Whatever the host left open without close-on-exec stays with the host.
  ::posix_spawn_file_actions_addclosefrom_np(setup.actions(), STDERR_FILENO + 1);

  sigset_t none, defaults;
  sigemptyset(&none);
  sigemptyset(&defaults);
  for (int signal : {SIGHUP, SIGINT, SIGQUIT, SIGPIPE, SIGALRM, SIGTERM, SIGUSR1, SIGUSR2, SIGCHLD,
                     SIGTSTP, SIGTTIN, SIGTTOU, SIGURG, SIGXCPU, SIGXFSZ, SIGWINCH})
    sigaddset(&defaults, signal);
  ::posix_spawnattr_setsigmask(setup.attributes(), &none);
  ::posix_spawnattr_setsigdefault(setup.attributes(), &defaults);
  ::posix_spawnattr_setflags(setup.attributes(), POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);

  pid_t pid = 0;
  const int result = ::posix_spawn(&pid, program.c_str(), setup.actions(), setup.attributes(),
                                   argv.data(), config.environment ? envp.data() : environ);
  if (result == 0) return pid;
  switch (result) {
    case ENOENT:
      return LaunchFailure{detail::fileError(FileNoSuchFileError, given), kNotFound};
    case EACCES:
    case EISDIR:
    case EPERM:
      return LaunchFailure{detail::fileError(FileReadNoPermissionError, given, result),
                           kCannotExecute};
    case ENOEXEC:
    case ETXTBSY:
      return LaunchFailure{detail::posixError(result, given), kCannotExecute};
    default:
      return LaunchFailure{detail::posixError(result, given), kNotFound};
  }
}

}  // namespace

struct NSTask::State {
  enum class Phase { Configured, Launching, Running, Exited, Failed };

  mutable std::mutex mutex;
  std::condition_variable ended;
  URLPtr executableURL;
  std::optional<std::string> launchPath;
  std::optional<std::vector<std::string>> arguments;
  std::optional<NSTaskEnvironment> environment;
  URLPtr directoryURL;
  std::optional<std::string> directory;
  ObjectPtr streams[3];
  NSTaskTerminationHandler handler;

  Phase phase = Phase::Configured;
  pid_t pid = 0;
  std::int32_t status = 0;
  std::int64_t reason = 0;

  bool finished() const { return phase == Phase::Exited || phase == Phase::Failed; }
};

NSTask::NSTask() : state_(std::make_shared<State>()) {}
NSTask::~NSTask() = default;

std::shared_ptr<NSTask> NSTask::create() { return std::shared_ptr<NSTask>(new NSTask()); }

URLPtr NSTask::executableURL() const {
  std::lock_guard lock(state_->mutex);
  return state_->executableURL;
}

void NSTask::setExecutableURL(URLPtr url) {
  std::lock_guard lock(state_->mutex);
  state_->launchPath = url ? url->fileSystemRepresentation() : std::nullopt;
  state_->executableURL = std::move(url);
}

std::int64_t NSTask::terminationReason() const {
  std::lock_guard lock(state_->mutex);
  return state_->finished() ? state_->reason : 0;
}

std::optional<std::string> NSTask::launchPath() const {
  std::lock_guard lock(state_->mutex);
  return state_->launchPath;
}

void NSTask::setLaunchPath(std::optional<std::string> path) {
  std::lock_guard lock(state_->mutex);
  state_->executableURL = path ? URL::fileURLWithPath(*path) : nullptr;
  state_->launchPath = std::move(path);
}

std::optional<std::vector<std::string>> NSTask::arguments() const {
  std::lock_guard lock(state_->mutex);
  return state_->arguments;
}

void NSTask::setArguments(std::optional<std::vector<std::string>> arguments) {
  std::lock_guard lock(state_->mutex);
  state_->arguments = std::move(arguments);
}

ObjectPtr NSTask::standardInput() const {
  std::lock_guard lock(state_->mutex);
  return state_->streams[STDIN_FILENO];
}
ObjectPtr NSTask::standardOutput() const {
  std::lock_guard lock(state_->mutex);
  return state_->streams[STDOUT_FILENO];
}
ObjectPtr NSTask::standardError() const {
  std::lock_guard lock(state_->mutex);
  return state_->streams[STDERR_FILENO];
}
void NSTask::setStandardInput(ObjectPtr stream) {
  std::lock_guard lock(state_->mutex);
  state_->streams[STDIN_FILENO] = std::move(stream);
}
void NSTask::setStandardOutput(ObjectPtr stream) {
  std::lock_guard lock(state_->mutex);
  state_->streams[STDOUT_FILENO] = std::move(stream);
}
void NSTask::setStandardError(ObjectPtr stream) {
  std::lock_guard lock(state_->mutex);
  state_->streams[STDERR_FILENO] = std::move(stream);
}

bool NSTask::isRunning() const {
  std::lock_guard lock(state_->mutex);
  return state_->phase == State::Phase::Running;
}

std::int32_t NSTask::terminationStatus() const {
  std::lock_guard lock(state_->mutex);
  return state_->finished() ? state_->status : 0;
}

NSTaskTerminationHandler NSTask::terminationHandler() const {
  std::lock_guard lock(state_->mutex);
  return state_->handler;
}

void NSTask::setTerminationHandler(NSTaskTerminationHandler handler) {
  std::lock_guard lock(state_->mutex);
  state_->handler = std::move(handler);
}

std::optional<NSTaskEnvironment> NSTask::environment() const {
  std::lock_guard lock(state_->mutex);
  return state_->environment;
}

void NSTask::setEnvironment(std::optional<NSTaskEnvironment> environment) {
  std::lock_guard lock(state_->mutex);
  state_->environment = std::move(environment);
}

URLPtr NSTask::currentDirectoryURL() const {
  std::lock_guard lock(state_->mutex);
  if (state_->directoryURL) return state_->directoryURL;
  return URL::fileURLWithPath(state_->directory ? *state_->directory : workingDirectory());
}

void NSTask::setCurrentDirectoryURL(URLPtr url) {
  std::lock_guard lock(state_->mutex);
  state_->directory = url ? url->fileSystemRepresentation() : std::nullopt;
  // A URL that names no directory still makes the launch fail rather than
  // silently run in this process's directory.
  if (url && !state_->directory) state_->directory = std::string();
  state_->directoryURL = std::move(url);
}

std::string NSTask::currentDirectoryPath() const {
  std::lock_guard lock(state_->mutex);
  return state_->directory ? *state_->directory : workingDirectory();
}

void NSTask::setCurrentDirectoryPath(std::string path) {
  std::lock_guard lock(state_->mutex);
  state_->directoryURL = nullptr;
  state_->directory = std::move(path);
}

std::int32_t NSTask::processIdentifier() const {
  std::lock_guard lock(state_->mutex);
  return state_->phase == State::Phase::Failed ? 0 : state_->pid;
}

void NSTask::terminate() {
  // The child is reaped under the same lock, so a running child's pid is
  // never one the system has given to another process.
  std::lock_guard lock(state_->mutex);
  if (state_->phase == State::Phase::Running) ::kill(state_->pid, SIGTERM);
}

void NSTask::interrupt() {
  std::lock_guard lock(state_->mutex);
  if (state_->phase == State::Phase::Running) ::kill(state_->pid, SIGINT);
}

void NSTask::launch() { (void)launchAndReturnError(nullptr); }

void NSTask::waitUntilExit() {
  std::unique_lock lock(state_->mutex);
  state_->ended.wait(lock, [&] {
    return state_->phase != State::Phase::Launching && state_->phase != State::Phase::Running;
  });
}

namespace {

// Waits for the child, records how it ended, reaps it and hands the task to
// its termination handler on the global queue.
template <class State>
void reap(const std::shared_ptr<NSTask>& task, const std::shared_ptr<State>& state, pid_t pid) {
  siginfo_t info{};
  int result;
  // Wait without reaping: the pid stays ours until the state says so.
  do {
    result = ::waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOWAIT);
  } while (result != 0 && errno == EINTR);
  NSTaskTerminationHandler handler;
  {
    std::lock_guard lock(state->mutex);
    if (result != 0) {
      // Reaped behind the library's back (the host waits for any child, or
      // ignores SIGCHLD): the outcome is unknown.
      state->status = -1;
      state->reason = NSTaskTerminationReasonExit;
    } else {
      const bool signalled = info.si_code == CLD_KILLED || info.si_code == CLD_DUMPED;
      state->status = info.si_status;
      state->reason =
          signalled ? NSTaskTerminationReasonUncaughtSignal : NSTaskTerminationReasonExit;
      siginfo_t reaped{};
      while (::waitid(P_PID, static_cast<id_t>(pid), &reaped, WEXITED) != 0 && errno == EINTR) {
      }
    }
    state->phase = State::Phase::Exited;
    handler = state->handler;
    state->ended.notify_all();
  }
  if (handler)
    DispatchQueue::global()->async([handler = std::move(handler), task] { handler(task); });
}

}  // namespace

bool NSTask::launchAndReturnError(ErrorPtr* error) {
  Configuration config;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->phase != State::Phase::Configured) {
      if (error) *error = detail::posixError(EALREADY);
      return false;
    }
    state_->phase = State::Phase::Launching;
    config.path = state_->launchPath;
    config.arguments = state_->arguments;
    config.environment = state_->environment;
    config.directory = state_->directory;
    for (int i = 0; i < 3; ++i) config.streams[i] = state_->streams[i];
  }

  auto outcome = spawn(config);
  if (auto* failure = std::get_if<LaunchFailure>(&outcome)) {
    std::lock_guard lock(state_->mutex);
    state_->phase = State::Phase::Failed;
    state_->status = failure->status;
    state_->reason = NSTaskTerminationReasonExit;
    state_->ended.notify_all();
    if (error) *error = failure->error;
    return false;
  }
  const pid_t pid = std::get<pid_t>(outcome);
  {
    std::lock_guard lock(state_->mutex);
    state_->pid = pid;
    state_->phase = State::Phase::Running;
  }
  // The child holds its ends of the pipes now; this process lets go of its
  // copies so that readers see end of file when the child exits.
  for (int index = 0; index < 3; ++index) {
    if (auto pipe = std::dynamic_pointer_cast<NSPipe>(config.streams[index]))
      (index == STDIN_FILENO ? pipe->fileHandleForReading() : pipe->fileHandleForWriting())
          ->closeFile();
  }

  auto self = std::static_pointer_cast<NSTask>(shared_from_this());
  auto state = state_;
  try {
    std::thread([self, state, pid] { reap(self, state, pid); }).detach();
  } catch (const std::system_error&) {
    // No thread to spare: wait on a worker of the pool instead.
    DispatchQueue::global()->async([self, state, pid] { reap(self, state, pid); });
  }
  if (error) *error = nullptr;
  return true;
}

}  // namespace kivi
