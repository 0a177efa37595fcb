#include "kivi/process/ns_file_handle.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <condition_variable>
#include <mutex>
#include <thread>
#include <utility>

#include "process_errors.h"

namespace kivi {

namespace detail {

namespace {

constexpr std::size_t kChunk = 64 * 1024;

// One readability watcher: a thread polling the descriptor and an eventfd
// that wakes it to stop.
struct Watcher {
  std::atomic<bool> stop{false};
  int wakeFd = -1;
  std::thread thread;
  ~Watcher() {
    if (wakeFd >= 0) ::close(wakeFd);
  }
  void requestStop() {
    stop.store(true);
    const std::uint64_t one = 1;
    [[maybe_unused]] ssize_t n = ::write(wakeFd, &one, sizeof one);
  }
  // Stops the thread and waits for it. When called on the watcher thread
  // itself (the last reference went away inside a handler call), the thread
  // is detached and ends on its own, keeping the state.
  void stopAndJoin() {
    requestStop();
    if (thread.get_id() == std::this_thread::get_id())
      thread.detach();
    else if (thread.joinable())
      thread.join();
  }
};

// The chunk a watcher thread has read, offered to availableData() while its
// handler runs.
struct Delivery {
  const FileHandleState* state = nullptr;
  Data* chunk = nullptr;
};
thread_local Delivery currentDelivery;

}  // namespace

struct FileHandleState {
  std::mutex mutex;
  std::condition_variable idle;
  int fd = -1;
  bool ownsDescriptor = false;
  bool closed = false;
  // Operations running on the descriptor; the descriptor is closed only once
  // none is, so that a concurrent close never lets a read hit a reused number.
  int users = 0;
  bool closePending = false;
  ErrorPtr lastError;
  NSFileHandleReadabilityHandler handler;
  std::shared_ptr<Watcher> watcher;

  ~FileHandleState() {
    if (fd >= 0 && ownsDescriptor) ::close(fd);
  }

  // The descriptor for one operation, or -1 when closed.
  int acquire() {
    std::lock_guard lock(mutex);
    if (closed) return -1;
    ++users;
    return fd;
  }
  void release() {
    int toClose = -1;
    {
      std::lock_guard lock(mutex);
      if (--users == 0 && closePending) {
        toClose = std::exchange(fd, -1);
        closePending = false;
      }
    }
    if (toClose >= 0) ::close(toClose);
  }
  void recordError(int code) {
    std::lock_guard lock(mutex);
    lastError = posixError(code);
  }
};

namespace {

class Use {
 public:
  explicit Use(FileHandleState& state) : state_(state), fd_(state.acquire()) {}
  ~Use() {
    if (fd_ >= 0) state_.release();
  }
  Use(const Use&) = delete;
  Use& operator=(const Use&) = delete;
  int fd() const { return fd_; }

 private:
  FileHandleState& state_;
  int fd_;
};

// One read into `out`, appending; the bytes read, 0 at end of file, -1 with
// errno on error.
ssize_t readOnce(int fd, Data& out, std::size_t most) {
  const std::size_t before = out.size();
  out.resize(before + most);
  ssize_t n;
  do {
    n = ::read(fd, out.data() + before, most);
  } while (n < 0 && errno == EINTR);
  out.resize(before + (n > 0 ? static_cast<std::size_t>(n) : 0));
  return n;
}

// Writes everything with SIGPIPE held back for this thread, so that a
// reader that has gone away gives EPIPE instead of killing the process. A
// SIGPIPE this write raised is discarded; one that was already pending stays.
bool writeAll(int fd, const std::uint8_t* bytes, std::size_t size, int& errorCode) {
  sigset_t pipeOnly, previous, pending;
  sigemptyset(&pipeOnly);
  sigaddset(&pipeOnly, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &pipeOnly, &previous);
  sigpending(&pending);
  const bool alreadyPending = sigismember(&pending, SIGPIPE) == 1;
  bool ok = true;
  std::size_t done = 0;
  while (done < size) {
    ssize_t n = ::write(fd, bytes + done, size - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      errorCode = n < 0 ? errno : EIO;
      ok = false;
      break;
    }
    done += static_cast<std::size_t>(n);
  }
  if (!ok && errorCode == EPIPE && !alreadyPending) {
    const timespec zero{};
    while (sigtimedwait(&pipeOnly, nullptr, &zero) == -1 && errno == EINTR) {
    }
  }
  pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  return ok;
}

void watch(std::shared_ptr<FileHandleState> state, std::shared_ptr<Watcher> watcher,
           std::weak_ptr<NSFileHandle> weakHandle) {
  Use use(*state);
  if (use.fd() < 0) return;
  pollfd fds[2] = {{use.fd(), POLLIN, 0}, {watcher->wakeFd, POLLIN, 0}};
  while (!watcher->stop.load()) {
    int ready = ::poll(fds, 2, -1);
    if (ready < 0) {
      if (errno == EINTR) continue;
      break;
    }
    if (watcher->stop.load()) break;
    if (fds[0].revents == 0) continue;
    Data chunk;
    ssize_t n = readOnce(use.fd(), chunk, kChunk);
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) continue;
    if (n < 0) state->recordError(errno);
    const bool ended = n <= 0;
    NSFileHandleReadabilityHandler handler;
    {
      std::lock_guard lock(state->mutex);
      handler = state->handler;
    }
    auto handle = weakHandle.lock();
    if (!handle || !handler) break;
    currentDelivery = Delivery{state.get(), &chunk};
    handler(handle);
    currentDelivery = Delivery{};
    handle.reset();
    if (ended) break;
  }
}

}  // namespace

}  // namespace detail

using detail::FileHandleState;

NSFileHandle::NSFileHandle(int fd, bool closeOnDealloc)
    : state_(std::make_shared<FileHandleState>()) {
  state_->fd = fd;
  state_->ownsDescriptor = closeOnDealloc;
  state_->closed = fd < 0;
}

std::shared_ptr<NSFileHandle> NSFileHandle::initWithFileDescriptor(int fd, bool closeOnDealloc) {
  return std::shared_ptr<NSFileHandle>(new NSFileHandle(fd < 0 ? -1 : fd, closeOnDealloc));
}

std::shared_ptr<NSFileHandle> NSFileHandle::fileHandleWithStandardInput() {
  return initWithFileDescriptor(STDIN_FILENO, false);
}
std::shared_ptr<NSFileHandle> NSFileHandle::fileHandleWithStandardOutput() {
  return initWithFileDescriptor(STDOUT_FILENO, false);
}
std::shared_ptr<NSFileHandle> NSFileHandle::fileHandleWithStandardError() {
  return initWithFileDescriptor(STDERR_FILENO, false);
}

std::shared_ptr<NSFileHandle> NSFileHandle::fileHandleWithNullDevice() {
  int fd = ::open("/dev/null", O_RDWR | O_CLOEXEC);
  if (fd < 0) return nullptr;
  return initWithFileDescriptor(fd, true);
}

NSFileHandle::~NSFileHandle() {
  std::shared_ptr<detail::Watcher> watcher;
  {
    std::lock_guard lock(state_->mutex);
    watcher = std::move(state_->watcher);
    state_->handler = nullptr;
  }
  if (watcher) watcher->stopAndJoin();
  // Descriptors that are not owned stay open; owned ones close with the
  // state once no operation uses them.
}

int NSFileHandle::fileDescriptor() const {
  std::lock_guard lock(state_->mutex);
  return state_->closed ? -1 : state_->fd;
}

Data NSFileHandle::readDataToEndOfFile() {
  detail::Use use(*state_);
  Data out;
  if (use.fd() < 0) return out;
  struct stat info {};
  if (::fstat(use.fd(), &info) == 0 && S_ISREG(info.st_mode) && info.st_size > 0)
    out.reserve(static_cast<std::size_t>(info.st_size));
  for (;;) {
    ssize_t n = detail::readOnce(use.fd(), out, detail::kChunk);
    if (n == 0) break;
    if (n < 0) {
      state_->recordError(errno);
      break;
    }
  }
  return out;
}

Data NSFileHandle::availableData() {
  auto& delivery = detail::currentDelivery;
  if (delivery.state == state_.get() && delivery.chunk) {
    Data chunk = std::move(*delivery.chunk);
    delivery.chunk = nullptr;
    return chunk;
  }
  if (delivery.state == state_.get()) return {};  // the chunk was taken already
  detail::Use use(*state_);
  Data out;
  if (use.fd() < 0) return out;
  if (detail::readOnce(use.fd(), out, detail::kChunk) < 0) state_->recordError(errno);
  return out;
}

Data NSFileHandle::readDataOfLength(std::size_t length) {
  detail::Use use(*state_);
  Data out;
  if (use.fd() < 0) return out;
  while (out.size() < length) {
    ssize_t n = detail::readOnce(use.fd(), out, std::min(length - out.size(), detail::kChunk));
    if (n == 0) break;
    if (n < 0) {
      state_->recordError(errno);
      break;
    }
  }
  return out;
}

void NSFileHandle::writeData(const Data& data) { (void)writeData(data, nullptr); }

bool NSFileHandle::writeData(const Data& data, ErrorPtr* error) {
  detail::Use use(*state_);
  int code = EBADF;
  if (use.fd() >= 0 && detail::writeAll(use.fd(), data.data(), data.size(), code)) {
    if (error) *error = nullptr;
    return true;
  }
  ErrorPtr failure = detail::posixError(code);
  {
    std::lock_guard lock(state_->mutex);
    state_->lastError = failure;
  }
  if (error) *error = std::move(failure);
  return false;
}

void NSFileHandle::closeFile() {
  std::shared_ptr<detail::Watcher> watcher;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->closed) return;
    state_->closed = true;
    watcher = std::move(state_->watcher);
    state_->handler = nullptr;
  }
  if (watcher) watcher->stopAndJoin();
  int toClose = -1;
  {
    std::lock_guard lock(state_->mutex);
    if (state_->users == 0)
      toClose = std::exchange(state_->fd, -1);
    else
      state_->closePending = true;
  }
  if (toClose >= 0) ::close(toClose);
}

ErrorPtr NSFileHandle::lastError() const {
  std::lock_guard lock(state_->mutex);
  return state_->lastError;
}

NSFileHandleReadabilityHandler NSFileHandle::readabilityHandler() const {
  std::lock_guard lock(state_->mutex);
  return state_->handler;
}

void NSFileHandle::setReadabilityHandler(NSFileHandleReadabilityHandler handler) {
  std::shared_ptr<detail::Watcher> stopped;
  {
    std::lock_guard lock(state_->mutex);
    state_->handler = handler;
    if (!handler) {
      stopped = std::move(state_->watcher);
    } else if (!state_->watcher && !state_->closed) {
      auto watcher = std::make_shared<detail::Watcher>();
      watcher->wakeFd = ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
      if (watcher->wakeFd < 0) {
        state_->lastError = detail::posixError(errno);
        state_->handler = nullptr;
        return;
      }
      state_->watcher = watcher;
      auto self = std::static_pointer_cast<NSFileHandle>(shared_from_this());
      watcher->thread =
          std::thread(detail::watch, state_, watcher, std::weak_ptr<NSFileHandle>(self));
    }
  }
  if (stopped) stopped->stopAndJoin();
}

}  // namespace kivi
