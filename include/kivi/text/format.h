// kivi::format: printf-style formatting over typed arguments.
//
// The format string follows printf, plus the object conversion %@, which
// prints an argument's description. The arguments are typed C++ values, so a
// mismatch between a conversion and its argument is detected and shown in the
// text instead of being undefined behaviour.
//
//   kivi::format("%@ has %d items (%.1f%%)", kivi::Value("cart"), 3, 42.5)
//       // "cart has 3 items (42.5%)"
//   kivi::format("%-6s|%04x|%+.2e", "ab", 255u, 1234.5)  // "ab    |00ff|+1.23e+03"
//   kivi::format("%2$s %1$s", "world", "hello")          // "hello world"
//
// Conversions: d i u o x X c C s S @ f F e E g G a A p %, with the flags
// "-+ #0'" (' is accepted and ignored), a width and a precision (digits or
// "*"), the length modifiers hh h l ll q z t j L (accepted and ignored: the
// arguments carry their own types) and positional arguments "%N$" / "*N$"
// (1-based; they do not move the position of the next unnumbered
// conversion). Numbers never depend on the locale: the decimal point is
// always ".".
//
// Arguments (FormatArg::from lists the accepted types):
//   d i u o x X c   any integer, bool or enum; u o x X print a negative value
//                   as its 64-bit two's complement; c prints a code point
//                   as UTF-8 (U+FFFD when it is none)
//   f F e E g G a A float or double (long double is printed as a double)
//   s S             C string (null prints "(null)"), std::string,
//                   std::string_view, character array
//   @               anything: a Value or Object prints its description (a
//                   string Value its text, unquoted; a null object or
//                   pointer "(null)"), strings their text, numbers in decimal
//   p               any pointer, C string or object, as 0x… hex ("0x0" when
//                   null)
// Precision limits s, S and @ to that many bytes, cutting before an
// incomplete UTF-8 sequence; width pads by bytes.
//
// Bad input gives a marker in the text, never a crash:
//   "%!d(MISSING)"       no argument left for the conversion
//   "%!d(string=abc)"    argument of the wrong kind (kinds: int, uint,
//                        double, string, value, object, pointer)
//   "%!n(BADVERB)"       %n (never honoured; it uses up its argument as in C)
//                        and unknown conversion characters (which use none)
//   "%!(BADWIDTH)", "%!(BADPREC)"
//                        a "*" whose argument is missing or not an integer;
//                        the conversion then goes on without it
// A "%" whose conversion the string ends before ("100%") is kept as it is.
// Widths and precisions above kMaxFormatField are taken as kMaxFormatField.
// Extra arguments are ignored, as in C.
//
// Thread contract: every function is pure and may run on any thread at once.
// A FormatArg refers to its source value without copying it; it must not
// outlive the argument it was made from.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// The largest width or precision honoured; a larger one is taken as this.
inline constexpr int kMaxFormatField = 4096;

// One argument of the engine: a tagged reference to, or copy of, a value.
class KIVI_EXPORT FormatArg {
 public:
  // What the argument holds; it decides which accessor below is meaningful.
  enum class Kind : std::uint8_t { Int, UInt, Double, CString, String, Value, Object, Pointer };

  // The FormatArg for one argument. Accepts: integers (char and bool
  // included), enums, floating point, const char* / char* (may be null),
  // character arrays, anything convertible to std::string_view, Value,
  // Objects by reference, pointer or shared_ptr (may be null), any other
  // pointer or shared_ptr, and nullptr (a null C string).
  template <class T>
  static FormatArg from(const T& arg) noexcept;

  // A signed integer, an unsigned integer or a double argument; from() picks the maker.
  static FormatArg signedInt(std::int64_t v) noexcept { return FormatArg(Kind::Int, v); }
  static FormatArg unsignedInt(std::uint64_t v) noexcept { return FormatArg(Kind::UInt, v); }
  static FormatArg floating(double v) noexcept {
    FormatArg a(Kind::Double);
    a.d_ = v;
    return a;
  }
  // A C string, which may be null; referred to, not copied.
  static FormatArg cString(const char* s) noexcept {
    FormatArg a(Kind::CString);
    a.p_ = s;
    return a;
  }
  // Text, referred to, not copied.
  static FormatArg string(std::string_view s) noexcept {
    FormatArg a(Kind::String);
    a.p_ = s.data();
    a.size_ = s.size();
    return a;
  }
  // A Value, referred to, not copied.
  static FormatArg value(const Value& v) noexcept {
    FormatArg a(Kind::Value);
    a.p_ = &v;
    return a;
  }
  // An object, which may be null.
  static FormatArg object(const Object* o) noexcept {
    FormatArg a(Kind::Object);
    a.p_ = o;
    return a;
  }
  // Any other pointer, which may be null.
  static FormatArg pointer(const void* p) noexcept {
    FormatArg a(Kind::Pointer);
    a.p_ = p;
    return a;
  }

  // What the argument holds.
  Kind kind() const noexcept { return kind_; }
  // Each accessor is meaningful for its own kind only.
  std::int64_t intValue() const noexcept { return static_cast<std::int64_t>(u_); }
  std::uint64_t uintValue() const noexcept { return u_; }
  double doubleValue() const noexcept { return d_; }
  const char* cStringValue() const noexcept { return static_cast<const char*>(p_); }
  std::string_view stringValue() const noexcept { return {static_cast<const char*>(p_), size_}; }
  const Value& valueValue() const noexcept { return *static_cast<const Value*>(p_); }
  const Object* objectValue() const noexcept { return static_cast<const Object*>(p_); }
  const void* pointerValue() const noexcept { return p_; }

 private:
  explicit FormatArg(Kind kind) noexcept : kind_(kind) {}
  FormatArg(Kind kind, std::int64_t v) noexcept : kind_(kind), u_(static_cast<std::uint64_t>(v)) {}
  FormatArg(Kind kind, std::uint64_t v) noexcept : kind_(kind), u_(v) {}

  template <class>
  static constexpr bool kUnsupported = false;
  template <class>
  struct SharedPointee {
    using type = void;
    static constexpr bool kIsShared = false;
  };
  template <class U>
  struct SharedPointee<std::shared_ptr<U>> {
    using type = U;
    static constexpr bool kIsShared = true;
  };

  Kind kind_;
  union {
    std::uint64_t u_ = 0;
    double d_;
    const void* p_;
  };
  std::size_t size_ = 0;
};

template <class T>
FormatArg FormatArg::from(const T& arg) noexcept {
  using U = std::remove_cv_t<T>;
  if constexpr (std::is_same_v<U, FormatArg>) {
    return arg;
  } else if constexpr (std::is_same_v<U, std::nullptr_t>) {
    return cString(nullptr);
  } else if constexpr (std::is_enum_v<U>) {
    return from(static_cast<std::underlying_type_t<U>>(arg));
  } else if constexpr (std::is_integral_v<U> && std::is_signed_v<U>) {
    return signedInt(arg);
  } else if constexpr (std::is_integral_v<U>) {
    return unsignedInt(arg);
  } else if constexpr (std::is_floating_point_v<U>) {
    return floating(static_cast<double>(arg));
  } else if constexpr (std::is_array_v<U> &&
                       std::is_same_v<std::remove_cv_t<std::remove_extent_t<U>>, char>) {
    const void* nul = std::memchr(arg, 0, std::extent_v<U>);
    return string(
        std::string_view(arg, nul ? static_cast<std::size_t>(static_cast<const char*>(nul) - arg)
                                  : std::extent_v<U>));
  } else if constexpr (std::is_same_v<U, const char*> || std::is_same_v<U, char*>) {
    return cString(arg);
  } else if constexpr (std::is_convertible_v<const U&, std::string_view>) {
    return string(std::string_view(arg));
  } else if constexpr (std::is_same_v<U, Value>) {
    return value(arg);
  } else if constexpr (std::is_base_of_v<Object, U>) {
    return object(&arg);
  } else if constexpr (std::is_pointer_v<U> &&
                       std::is_base_of_v<Object, std::remove_cv_t<std::remove_pointer_t<U>>>) {
    return object(arg);
  } else if constexpr (SharedPointee<U>::kIsShared) {
    using P = std::remove_cv_t<typename SharedPointee<U>::type>;
    if constexpr (std::is_base_of_v<Object, P>) {
      return object(arg.get());
    } else {
      return pointer(static_cast<const void*>(arg.get()));
    }
  } else if constexpr (std::is_pointer_v<U> && std::is_function_v<std::remove_pointer_t<U>>) {
    return pointer(reinterpret_cast<const void*>(arg));
  } else if constexpr (std::is_pointer_v<U>) {
    return pointer(static_cast<const void*>(arg));
  } else {
    static_assert(kUnsupported<T>, "kivi::format has no conversion for this argument type");
  }
}

// Appends `format` applied to `args` to `out`. The engine behind format().
KIVI_EXPORT void appendFormat(std::string& out, std::string_view format,
                              std::span<const FormatArg> args);

// `format` applied to `args`.
template <class... Args>
std::string format(std::string_view fmt, const Args&... args) {
  const std::array<FormatArg, sizeof...(Args)> packed{FormatArg::from(args)...};
  std::string out;
  appendFormat(out, fmt, packed);
  return out;
}

}  // namespace kivi
