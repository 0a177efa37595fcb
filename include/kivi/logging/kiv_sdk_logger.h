// KivSdkLogger: the low-level levelled logger, which turns a log call into one
// call on its KivSdkLoggerDelegate.
//
// The caller gives the file and function names as C strings and the message
// as a printf-style format with typed arguments (see kivi/text/format.h:
// %@ prints a Value's or Object's description); the level picks the delegate
// method.
//
//   auto logger = kivi::KivSdkLogger::create(myDelegate);  // held weakly
//   logger->logWithModule("network", kivi::KivSdkLogLevelInfo, __FILE__, __func__, __LINE__,
//                         "%@ answered %d", url, status);
//   logger->aotLogWithModule(nullptr, kivi::KivSdkLogLevelError, __FILE__, __func__,
//                            __LINE__, "retry %d of %d", attempt, limit);
//
// Main channel: levels 1 to 6 go to the six log…WithModule methods. Aot
// channel: levels 1 to 4 go to the aot…WithModule methods the delegate
// announces in optionalMethods(); other lines are dropped, never rerouted.
// Any other level is ignored. Bad input is absorbed: a null module becomes
// "<unknown>", a null or non-UTF-8 file or function name "<unknown>", a null
// format string the message "" (the arguments are not looked at). Every line
// is built (names checked, message formatted) before the level and the
// delegate are looked at: a line that is then dropped, for want of a
// delegate or of a method for its level, has still been formatted, and the
// descriptions of its %@ arguments have run.
//
// Thread contract: every member may be called from any thread, also while
// another thread replaces the delegate. A log call reads the delegate once and
// keeps it alive until the delegate method returns; the method runs on the
// calling thread. There is no lock around the delegate call. The delegate is
// held weakly: once its last owner releases it, every line is dropped. (Each
// thread that logged keeps a weak reference to the delegate it last used, so
// the memory of a delegate made by std::make_shared is returned when that
// thread logs through another delegate or exits; its destructor runs on
// time.)
#pragma once

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/logging/kiv_sdk_logger_delegate.h"
#include "kivi/text/format.h"

namespace kivi {

// A string argument that may be absent: made from text (std::string,
// std::string_view, a C string) or from nullptr, std::nullopt or a null C
// string, which are absent. An empty string is present.
class KIVI_EXPORT KivSdkNullableString {
 public:
  // Absent by default and from nullptr, std::nullopt or a null C string; present from any
  // text, even empty.
  constexpr KivSdkNullableString() noexcept = default;
  constexpr KivSdkNullableString(std::nullptr_t) noexcept {}
  constexpr KivSdkNullableString(std::nullopt_t) noexcept {}
  constexpr KivSdkNullableString(const char* s) noexcept
      : data_(s), size_(s ? std::char_traits<char>::length(s) : 0) {}
  constexpr KivSdkNullableString(std::string_view s) noexcept
      : data_(s.data() ? s.data() : ""), size_(s.size()) {}
  KivSdkNullableString(const std::string& s) noexcept : data_(s.data()), size_(s.size()) {}
  KivSdkNullableString(const std::optional<std::string>& s) noexcept
      : data_(s ? s->data() : nullptr), size_(s ? s->size() : 0) {}

  // True when absent.
  constexpr bool isNull() const noexcept { return data_ == nullptr; }
  // The text, or `fallback` when absent.
  constexpr std::string_view valueOr(std::string_view fallback) const noexcept {
    return data_ ? std::string_view(data_, size_) : fallback;
  }

 private:
  // Two words, so that it travels in registers; absent is a null data_.
  const char* data_ = nullptr;
  std::size_t size_ = 0;
};

class KIVI_EXPORT KivSdkLogger : public Object {
 public:
  // A logger holding `delegate` (may be null) weakly.
  static std::shared_ptr<KivSdkLogger> create(
      const std::shared_ptr<KivSdkLoggerDelegate>& delegate = nullptr);

  ~KivSdkLogger() override;

  // The delegate, kept alive by the returned pointer; null when none is set or
  // it has been destroyed.
  std::shared_ptr<KivSdkLoggerDelegate> delegate() const;
  // Replaces the delegate (held weakly); null removes it.
  void setDelegate(const std::shared_ptr<KivSdkLoggerDelegate>& delegate);

  // Main channel. `module` and `formatString` may be null (absent).
  template <class... Args>
  void logWithModule(KivSdkNullableString module, KivSdkLogLevel logLevel, const char* fileName,
                     const char* functionName, std::uint64_t lineNumber,
                     KivSdkNullableString formatString, const Args&... args) const {
    const std::array<FormatArg, sizeof...(Args)> packed{FormatArg::from(args)...};
    log(false, module, logLevel, fileName, functionName, lineNumber, formatString, packed);
  }

  // Aot channel: levels 1 to 4, delivered only to an aot method the delegate
  // implements.
  template <class... Args>
  void aotLogWithModule(KivSdkNullableString module, KivSdkLogLevel logLevel, const char* fileName,
                        const char* functionName, std::uint64_t lineNumber,
                        KivSdkNullableString formatString, const Args&... args) const {
    const std::array<FormatArg, sizeof...(Args)> packed{FormatArg::from(args)...};
    log(true, module, logLevel, fileName, functionName, lineNumber, formatString, packed);
  }

  // The UTF-8 text of `cString`; "<unknown>" when it is null or not valid
  // UTF-8.
  static std::string nsStringFromCString(const char* cString);

 private:
  KivSdkLogger() = default;

  void log(bool aot, KivSdkNullableString module, KivSdkLogLevel logLevel, const char* fileName,
           const char* functionName, std::uint64_t lineNumber, KivSdkNullableString formatString,
           std::span<const FormatArg> args) const;

  // delegate_ is guarded by a spin lock (locked_), held only to copy or swap
  // the weak reference and never while user code runs. generation_ changes
  // with every setDelegate (under the lock); each thread keeps a copy of the
  // weak reference it last read with its generation, so a call takes the
  // lock only after the delegate changed. hasDelegate_ lets a logger without
  // a delegate skip all of it.
  mutable std::atomic<bool> locked_{false};
  std::atomic<bool> hasDelegate_{false};
  std::atomic<std::uint64_t> generation_{0};
  std::weak_ptr<KivSdkLoggerDelegate> delegate_;
};

}  // namespace kivi
