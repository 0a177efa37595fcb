#include "kivi/logging/kiv_sdk_logger.h"

#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <thread>

#include "kivi/text/unicode_text.h"

namespace kivi {
namespace {

constexpr std::string_view kUnknown = "<unknown>";

// Source file and function names are nearly always ASCII: check that eight
// bytes at a time before asking the full validator.
bool isAscii(std::string_view text) {
  std::uint64_t bits = 0;
  std::size_t i = 0;
  for (; i + 8 <= text.size(); i += 8) {
    std::uint64_t word;
    std::memcpy(&word, text.data() + i, 8);
    bits |= word;
  }
  for (; i < text.size(); ++i) bits |= static_cast<unsigned char>(text[i]);
  return (bits & 0x8080808080808080ull) == 0;
}

// The text of a C string, or "<unknown>" when it is null or not UTF-8.
std::string_view cStringView(const char* cString) {
  if (!cString) return kUnknown;
  const std::string_view text(cString);
  return isAscii(text) || unicode::isValidUTF8(text) ? text : kUnknown;
}

using Method = void (KivSdkLoggerDelegate::*)(std::string_view, std::string_view, std::string_view,
                                              std::uint64_t, std::string_view);

// Indexed by level - 1.
constexpr Method kMainMethods[] = {
    &KivSdkLoggerDelegate::logCriticalWithModule, &KivSdkLoggerDelegate::logErrorWithModule,
    &KivSdkLoggerDelegate::logWarnWithModule,     &KivSdkLoggerDelegate::logInfoWithModule,
    &KivSdkLoggerDelegate::logVerboseWithModule,  &KivSdkLoggerDelegate::logSupportWithModule,
};
constexpr Method kAotMethods[] = {
    &KivSdkLoggerDelegate::aotLogCriticalWithModule,
    &KivSdkLoggerDelegate::aotLogErrorWithModule,
    &KivSdkLoggerDelegate::aotLogWarnWithModule,
    &KivSdkLoggerDelegate::aotLogInfoWithModule,
};

// Each thread formats into one reused buffer, so a steady stream of lines
// allocates nothing. A delegate that logs from inside a delivery gets a
// buffer of its own for the nested line, and so does a line logged while the
// thread is being torn down, after the buffer is gone.
struct Scratch {
  ~Scratch();
  std::string text;
  bool inUse = false;
};
thread_local Scratch tScratch;
thread_local bool tScratchGone = false;  // trivially destructible: readable to the end
Scratch::~Scratch() { tScratchGone = true; }
constexpr std::size_t kKeptCapacity = 4096;

class MessageBuffer {
 public:
  MessageBuffer()
      : owner_(!tScratchGone && !tScratch.inUse), text_(owner_ ? tScratch.text : local_) {
    if (owner_) tScratch.inUse = true;
    text_.clear();
  }
  ~MessageBuffer() {
    if (!owner_) return;
    if (text_.capacity() > kKeptCapacity) std::string().swap(text_);
    tScratch.inUse = false;
  }
  MessageBuffer(const MessageBuffer&) = delete;
  MessageBuffer& operator=(const MessageBuffer&) = delete;

  std::string& text() { return text_; }

 private:
  bool owner_;
  std::string local_;
  std::string& text_;
};

// Short critical sections only: the holder copies or swaps one weak_ptr.
class SpinGuard {
 public:
  explicit SpinGuard(std::atomic<bool>& flag) : flag_(flag) {
    for (int spins = 0; flag_.exchange(true, std::memory_order_acquire); ++spins) {
      if (spins >= 64) std::this_thread::yield();
    }
  }
  ~SpinGuard() { flag_.store(false, std::memory_order_release); }
  SpinGuard(const SpinGuard&) = delete;
  SpinGuard& operator=(const SpinGuard&) = delete;

 private:
  std::atomic<bool>& flag_;
};

// Every delegate assignment of every logger gets a number never used before.
std::atomic<std::uint64_t> gNextGeneration{1};

// The weak reference this thread last read from a logger, with the number of
// the assignment it came from. While the logger's number is unchanged, a log
// call upgrades this copy and never touches the logger's lock: one atomic
// read-modify-write on the way in and one on the way out, instead of three.
struct DelegateCache {
  ~DelegateCache();
  std::uint64_t generation = 0;
  std::weak_ptr<KivSdkLoggerDelegate> delegate;
};
thread_local DelegateCache tDelegateCache;
thread_local bool tDelegateCacheGone = false;  // trivially destructible
DelegateCache::~DelegateCache() { tDelegateCacheGone = true; }

}  // namespace

std::shared_ptr<KivSdkLogger> KivSdkLogger::create(
    const std::shared_ptr<KivSdkLoggerDelegate>& delegate) {
  std::shared_ptr<KivSdkLogger> logger(new KivSdkLogger());
  logger->setDelegate(delegate);
  return logger;
}

KivSdkLogger::~KivSdkLogger() = default;

std::shared_ptr<KivSdkLoggerDelegate> KivSdkLogger::delegate() const {
  if (!hasDelegate_.load(std::memory_order_acquire)) return nullptr;
  const std::uint64_t generation = generation_.load(std::memory_order_acquire);
  if (tDelegateCacheGone) {  // this thread is being torn down
    SpinGuard guard(locked_);
    return delegate_.lock();
  }
  DelegateCache& cache = tDelegateCache;
  if (cache.generation != generation) {
    std::weak_ptr<KivSdkLoggerDelegate> current;
    std::uint64_t currentGeneration;
    {
      SpinGuard guard(locked_);
      current = delegate_;
      currentGeneration = generation_.load(std::memory_order_relaxed);
    }
    cache.delegate.swap(current);  // the old copy is released outside the lock
    cache.generation = currentGeneration;
  }
  return cache.delegate.lock();
}

void KivSdkLogger::setDelegate(const std::shared_ptr<KivSdkLoggerDelegate>& delegate) {
  std::weak_ptr<KivSdkLoggerDelegate> replacement = delegate;
  {
    SpinGuard guard(locked_);
    delegate_.swap(replacement);
    generation_.store(gNextGeneration.fetch_add(1, std::memory_order_relaxed),
                      std::memory_order_release);
    hasDelegate_.store(delegate != nullptr, std::memory_order_release);
  }
  // The old reference is released here, outside the lock.
}

std::string KivSdkLogger::nsStringFromCString(const char* cString) {
  return std::string(cStringView(cString));
}

void KivSdkLogger::log(bool aot, KivSdkNullableString module, KivSdkLogLevel logLevel,
                       const char* fileName, const char* functionName, std::uint64_t lineNumber,
                       KivSdkNullableString formatString, std::span<const FormatArg> args) const {
  // The line is built before anything decides whether it is delivered, so a
  // description() with side effects runs the same way for every line.
  const std::string_view moduleText = module.valueOr(kUnknown);
  const std::string_view fileText = cStringView(fileName);
  const std::string_view functionText = cStringView(functionName);
  MessageBuffer message;
  if (!formatString.isNull()) appendFormat(message.text(), formatString.valueOr({}), args);

  if (logLevel < 1 || logLevel > (aot ? 4u : 6u)) return;
  const std::shared_ptr<KivSdkLoggerDelegate> target = delegate();
  if (!target || (aot && !target->implementsAotLog(logLevel))) return;
  const Method method = (aot ? kAotMethods : kMainMethods)[logLevel - 1];
  ((*target).*method)(moduleText, fileText, functionText, lineNumber, message.text());
}

}  // namespace kivi
