// Generic checks of the doubles' one rule: an operation with its callback set
// passes every argument, unchanged and in order, and answers the callback's
// result; without it, it answers its default and calls nothing it was given
// (completions, accessors, handlers) and writes no out-parameter.
//
//   expectScripted(alert, alert.runModalCallback, VIA(KivNSAlertProtocol, runModal), -1002);
//
// Arguments are distinguishable samples per type and position; a function
// argument is a tagged function object, so the test sees that the very
// function given arrived, and counts whether anything called it.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <source_location>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

#include "kivi/desktop/kiv_ns_workspace_protocol.h"
#include "kivi/desktop/user_notifications.h"
#include "kivi/dispatch/operation_queue.h"
#include "kivi/doubles/mock_kiv_ns_process.h"
#include "kivi/net/http_cookie.h"
#include "kivi/net/url.h"
#include "kivi/platform/kiv_ns_file_coordinator_protocol.h"
#include "kivi/platform/ns_xpc.h"
#include "kivi/platform/platform_types.h"
#include "kivi/process/ns_pipe.h"
#include "kivi/process/ns_running_application.h"

namespace kivi::testing {

// Calls of any sample function since the last reset.
inline int sampleCalls = 0;

template <class R>
struct Tagged {
  int id;
  template <class... A>
  R operator()(A&&...) const {
    ++sampleCalls;
    if constexpr (!std::is_void_v<R>) return R{};
  }
};

template <class T>
struct Tag {};

template <class T>
struct IsVector : std::false_type {};
template <class T>
struct IsVector<std::vector<T>> : std::true_type {};
template <class T>
struct IsOptional : std::false_type {};
template <class T>
struct IsOptional<std::optional<T>> : std::true_type {};
template <class T>
struct IsSharedPtr : std::false_type {};
template <class T>
struct IsSharedPtr<std::shared_ptr<T>> : std::true_type {};
template <class T>
struct IsFunction : std::false_type {};
template <class R, class... A>
struct IsFunction<std::function<R(A...)>> : std::true_type {
  using Result = R;
};

// Out-parameter slots: what a double must leave alone without a callback.
inline ErrorPtr errorSlots[8];
inline bool boolSlots[8];
inline const ErrorPtr kUntouchedError = Error::create("untouched", 0);
inline void resetSlots() {
  for (auto& e : errorSlots) e = kUntouchedError;
  for (auto& b : boolSlots) b = true;
}

template <class T>
T sample(int seed);

template <class T>
T sampleOf(Tag<T>, int seed) {
  const std::string text = "s" + std::to_string(seed);
  if constexpr (std::is_same_v<T, bool>) {
    return seed % 2 == 1;
  } else if constexpr (std::is_integral_v<T>) {
    return static_cast<T>(seed + 7);
  } else if constexpr (std::is_floating_point_v<T>) {
    return static_cast<T>(seed + 0.5);
  } else if constexpr (std::is_same_v<T, std::string>) {
    return text;
  } else if constexpr (std::is_same_v<T, std::string_view>) {
    static std::deque<std::string> kept;
    return kept.emplace_back(text);
  } else if constexpr (std::is_same_v<T, Date>) {
    return Date{seed * 10.0};
  } else if constexpr (std::is_same_v<T, Data>) {
    return Data{static_cast<std::uint8_t>(seed), 1};
  } else if constexpr (std::is_same_v<T, Value>) {
    return Value(text);
  } else if constexpr (std::is_same_v<T, Dictionary>) {
    return Dictionary{{"k", Value(text)}};
  } else if constexpr (std::is_same_v<T, Array>) {
    return Array{Value(text)};
  } else if constexpr (std::is_same_v<T, ErrorPtr*>) {
    return &errorSlots[seed % 8];
  } else if constexpr (std::is_same_v<T, bool*>) {
    return &boolSlots[seed % 8];
  } else if constexpr (std::is_pointer_v<T>) {
    // Opaque pointers (contexts, observers): never dereferenced by a double.
    return reinterpret_cast<T>(static_cast<std::uintptr_t>(0x1000 + seed * 16));
  } else if constexpr (std::is_same_v<T, Selector>) {
    return Selector{"selector" + text, {}};
  } else if constexpr (std::is_same_v<T, NSFileAccessIntent>) {
    return NSFileAccessIntent::writingIntentWithURL(sample<URLPtr>(seed), seed);
  } else if constexpr (std::is_same_v<T, NSItemProviderReadingClass>) {
    return NSItemProviderReadingClass{"Class" + text, {}, {}};
  } else if constexpr (std::is_same_v<T, NSWorkspaceOpenConfiguration>) {
    NSWorkspaceOpenConfiguration c;
    c.arguments = {text};
    return c;
  } else if constexpr (std::is_same_v<T, UNNotificationRequest>) {
    return UNNotificationRequest{text, {}, std::nullopt};
  } else if constexpr (std::is_same_v<T, std::set<UNNotificationCategory>>) {
    return {UNNotificationCategory{text, {}, {}, 0}};
  } else if constexpr (std::is_same_v<T, URLPtr>) {
    return URL::URLWithString("https://example.com/" + text);
  } else if constexpr (std::is_same_v<T, HTTPCookiePtr>) {
    HTTPCookie::Properties p;
    p.name = text;
    p.value = "v";
    p.domain = "example.com";
    return HTTPCookie::cookieWithProperties(p);
  } else if constexpr (std::is_same_v<T, ErrorPtr>) {
    return Error::create("sample", seed);
  } else if constexpr (std::is_same_v<T, NSNotificationPtr>) {
    return std::make_shared<NSNotification>(text, nullptr);
  } else if constexpr (std::is_same_v<T, ObjectPtr>) {
    return std::make_shared<NSObject>();
  } else if constexpr (std::is_same_v<T, std::shared_ptr<KivNSProcessProtocol>>) {
    return std::make_shared<MockKivNSProcess>();
  } else if constexpr (std::is_same_v<T, std::shared_ptr<NSPipe>>) {
    return NSPipe::pipe();
  } else if constexpr (std::is_same_v<T, std::shared_ptr<NSXPCListener>>) {
    return NSXPCListener::anonymousListener();
  } else if constexpr (std::is_same_v<T, std::shared_ptr<NSXPCConnection>>) {
    return NSXPCConnection::create(nullptr);
  } else if constexpr (IsFunction<T>::value) {
    return T(Tagged<typename IsFunction<T>::Result>{seed});
  } else if constexpr (IsOptional<T>::value) {
    return T(sample<typename T::value_type>(seed));
  } else if constexpr (IsVector<T>::value) {
    return T{sample<typename T::value_type>(seed), sample<typename T::value_type>(seed + 1)};
  } else if constexpr (IsSharedPtr<T>::value) {
    using E = typename T::element_type;
    if constexpr (std::is_default_constructible_v<E> && !std::is_abstract_v<E>) {
      return std::make_shared<E>();
    } else {
      return nullptr;  // a type only the platform makes: compared as null
    }
  } else {
    static_assert(sizeof(T) == 0, "no sample for this type");
  }
}

template <class T>
T sample(int seed) {
  return sampleOf(Tag<T>{}, seed);
}

// Equality that sees through sample functions (by tag) and the types
// without their own ==.
template <class T>
bool same(const T& a, const T& b) {
  if constexpr (IsFunction<T>::value) {
    using Target = Tagged<typename IsFunction<T>::Result>;
    if (!a || !b) return !a && !b;
    const Target* x = a.template target<Target>();
    const Target* y = b.template target<Target>();
    return x && y && x->id == y->id;
  } else if constexpr (IsVector<T>::value) {
    if (a.size() != b.size()) return false;
    for (std::size_t i = 0; i < a.size(); ++i) {
      if (!same(a[i], b[i])) return false;
    }
    return true;
  } else if constexpr (IsOptional<T>::value) {
    return a.has_value() == b.has_value() && (!a || same(*a, *b));
  } else if constexpr (std::is_same_v<T, Selector>) {
    return a.name == b.name;
  } else if constexpr (std::is_same_v<T, NSFileAccessIntent>) {
    return a.url == b.url && a.writing == b.writing && a.options == b.options;
  } else if constexpr (std::is_same_v<T, NSItemProviderReadingClass>) {
    return a.className == b.className;
  } else if constexpr (std::is_same_v<T, std::string_view>) {
    return a.data() == b.data() && a.size() == b.size();
  } else {
    return a == b;
  }
}

// `call(double, args...)` invokes the operation (through the interface when
// the lambda's first parameter names it).
#define VIA(Interface, op) [](Interface& d, auto&... a) -> decltype(auto) { return d.op(a...); }

// Without `block`: `call` answers `fallback` (a value, or a predicate on the
// answer), calls no function argument and writes no out-parameter. With it:
// every argument reaches the block unchanged and its answer comes back.
template <class Double, class R, class... A, class Call, class Fallback = std::nullptr_t>
void expectScripted(Double& dbl, std::function<R(A...)>& block, Call call,
                    Fallback fallback = nullptr,
                    std::source_location where = std::source_location::current()) {
  SCOPED_TRACE(::testing::Message() << "operation checked at line " << where.line());
  using Args = std::tuple<std::decay_t<A>...>;
  Args args = []<std::size_t... I>(std::index_sequence<I...>) {
    return Args{sample<std::decay_t<A>>(static_cast<int>(I) + 1)...};
  }
  (std::index_sequence_for<A...>{});
  block = nullptr;
  resetSlots();
  sampleCalls = 0;
  if constexpr (std::is_void_v<R>) {
    std::apply([&](auto&... a) { call(dbl, a...); }, args);
  } else {
    R answer = std::apply([&](auto&... a) -> R { return call(dbl, a...); }, args);
    if constexpr (std::is_invocable_r_v<bool, Fallback, const R&>) {
      EXPECT_TRUE(fallback(answer)) << "default answer";
    } else if constexpr (!std::is_same_v<Fallback, std::nullptr_t>) {
      EXPECT_TRUE(same(answer, static_cast<R>(fallback))) << "default answer";
    } else {
      EXPECT_TRUE(same(answer, R{})) << "default answer";
    }
  }
  EXPECT_EQ(sampleCalls, 0) << "a function argument ran without a callback";
  for (const auto& e : errorSlots) EXPECT_EQ(e, kUntouchedError) << "error written";
  for (bool b : boolSlots) EXPECT_TRUE(b) << "bool out-parameter written";

  std::optional<Args> seen;
  int calls = 0;
  using Answer = std::conditional_t<std::is_void_v<R>, int, std::decay_t<R>>;
  Answer canned{};
  if constexpr (!std::is_void_v<R>) canned = sample<Answer>(42);
  block = [&](A... a) -> R {
    ++calls;
    seen.emplace(a...);
    if constexpr (!std::is_void_v<R>) return canned;
  };
  if constexpr (std::is_void_v<R>) {
    std::apply([&](auto&... a) { call(dbl, a...); }, args);
  } else {
    R answer = std::apply([&](auto&... a) -> R { return call(dbl, a...); }, args);
    EXPECT_TRUE(same(answer, canned)) << "the callback's answer was not passed back";
  }
  block = nullptr;
  EXPECT_EQ(calls, 1);
  ASSERT_TRUE(seen);
  auto expectArgument = [&]<std::size_t I>(std::integral_constant<std::size_t, I>) {
    EXPECT_TRUE(same(std::get<I>(*seen), std::get<I>(args))) << "argument " << I << " changed";
  };
  [&]<std::size_t... I>(std::index_sequence<I...>) {
    (expectArgument(std::integral_constant<std::size_t, I>{}), ...);
  }
  (std::index_sequence_for<A...>{});
}

// A stored property reads back what was written.
template <class Double, class Get, class Set>
void expectStored(Double& dbl, Get get, Set set) {
  using T = std::decay_t<decltype(get(dbl))>;
  const T value = sample<T>(5);
  set(dbl, value);
  EXPECT_TRUE(same(static_cast<T>(get(dbl)), value)) << "stored value not read back";
}

#define GET(Interface, name) [](Interface& d) { return d.name(); }
#define SET(Interface, name) [](Interface& d, const auto& v) { d.name(v); }

}  // namespace kivi::testing
