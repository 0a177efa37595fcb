// Value: the one dynamic value of the library.
//
// JSON documents, dictionaries, arrays, user-info and key-value change
// dictionaries are all made of `Value`s. A value is one of:
//
//   null marker   Value() / Value(nullptr)          (the platform's NSNull)
//   number        Value(42), Value(3.5), Value(true) (a Number; booleans are
//                                                     numbers of bool flavour)
//   string        Value("text")                     (UTF-8)
//   data          Value(Data{...})                  (raw bytes)
//   date          Value(Date{seconds})              (seconds since 1970, UTC)
//   URL           Value(URLPtr)                     (a null pointer gives the
//                                                     null marker)
//   array         Value(Array{...})
//   dictionary    Value(Dictionary{{"key", ...}})   (string keys, sorted)
//   object        Value(std::shared_ptr<Object>)    (any library object)
//
// Arrays and dictionaries are immutable once wrapped and shared between
// copies, so copying a Value is cheap. To change one, copy it out, change the
// copy and wrap it again:
//
//   kivi::Dictionary d = *value.asDictionary();
//   d["name"] = kivi::Value("new");
//   value = kivi::Value(std::move(d));
//
// "Absent" is not a Value: functions that may find nothing return
// std::optional<Value> or a null pointer from the as…() accessors.
//
// Thread contract: a Value is a value type. Distinct Values may be used from
// different threads freely; one Value may be read from many threads at once
// and needs outside synchronisation only if it is also assigned to.
#pragma once

#include <compare>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>
#include <vector>

namespace kivi {

class Object;
class URL;
class Value;

using URLPtr = std::shared_ptr<const URL>;

// The platform's NSNull.
struct Null {
  friend bool operator==(Null, Null) { return true; }
};

using Data = std::vector<std::uint8_t>;
using Array = std::vector<Value>;
using Dictionary = std::map<std::string, Value, std::less<>>;

// A point in time: seconds since 1970-01-01T00:00:00Z.
struct Date {
  double timeIntervalSince1970 = 0;
  friend auto operator<=>(const Date&, const Date&) = default;

  // The wall clock now.
  static Date now() noexcept;
  // Far ahead of and far behind any real time (the years 4001 and 1 of the
  // Gregorian calendar), for "no limit" and "already passed".
  static constexpr Date distantFuture() noexcept { return Date{64092211200.0}; }
  static constexpr Date distantPast() noexcept { return Date{-62135769600.0}; }
  // This date plus `seconds`.
  constexpr Date addingTimeInterval(double seconds) const noexcept {
    return Date{timeIntervalSince1970 + seconds};
  }
  // Seconds from now to this date (negative when it has passed).
  double timeIntervalSinceNow() const noexcept {
    return timeIntervalSince1970 - now().timeIntervalSince1970;
  }
};

// A number with the flavour it was made with (bool, signed, unsigned or
// floating point), like the platform's NSNumber. Two numbers are equal when
// their values are equal, whatever their flavours (true == 1).
class Number {
 public:
  enum class Type : std::uint8_t { Bool, Int, UInt, Double };

  constexpr Number() noexcept : type_(Type::Int), i_(0) {}
  constexpr explicit Number(bool b) noexcept : type_(Type::Bool), i_(b ? 1 : 0) {}
  constexpr explicit Number(std::int64_t i) noexcept : type_(Type::Int), i_(i) {}
  constexpr explicit Number(std::uint64_t u) noexcept : type_(Type::UInt), u_(u) {}
  constexpr explicit Number(double d) noexcept : type_(Type::Double), d_(d) {}

  Type type() const noexcept { return type_; }
  bool isBool() const noexcept { return type_ == Type::Bool; }
  bool isInteger() const noexcept { return type_ != Type::Double; }

  bool boolValue() const noexcept;
  std::int64_t longLongValue() const noexcept;  // truncates; saturates out of range
  std::uint64_t unsignedLongLongValue() const noexcept;
  double doubleValue() const noexcept;

  // "1", "-3", "2.5", "true"/"false" printed as 1/0 like the platform.
  std::string stringValue() const;

  friend bool operator==(const Number& a, const Number& b) noexcept;

 private:
  Type type_;
  union {
    std::int64_t i_;
    std::uint64_t u_;
    double d_;
  };
};

class Value {
 public:
  enum class Kind : std::uint8_t {
    Null,
    Number,
    String,
    Data,
    Date,
    URL,
    Array,
    Dictionary,
    Object
  };

  Value() noexcept = default;
  Value(const Value&) = default;
  Value(Value&&) noexcept = default;
  Value& operator=(const Value&) = default;
  Value& operator=(Value&&) noexcept = default;
  // Releases nested collections one after another, never recursively: a
  // Value nested a million levels deep is dropped like a flat one.
  ~Value() {
    if (holdsCollection()) releaseCollection();
  }

  Value(std::nullptr_t) noexcept {}
  Value(Null) noexcept {}
  Value(Number n) noexcept : v_(n) {}
  Value(bool b) noexcept : v_(Number(b)) {}
  Value(int i) noexcept : v_(Number(static_cast<std::int64_t>(i))) {}
  Value(long i) noexcept : v_(Number(static_cast<std::int64_t>(i))) {}
  Value(long long i) noexcept : v_(Number(static_cast<std::int64_t>(i))) {}
  Value(unsigned i) noexcept : v_(Number(static_cast<std::uint64_t>(i))) {}
  Value(unsigned long i) noexcept : v_(Number(static_cast<std::uint64_t>(i))) {}
  Value(unsigned long long i) noexcept : v_(Number(static_cast<std::uint64_t>(i))) {}
  Value(double d) noexcept : v_(Number(d)) {}
  Value(const char* s) : v_(std::string(s ? s : "")) {}
  Value(std::string s) noexcept : v_(std::move(s)) {}
  Value(std::string_view s) : v_(std::string(s)) {}
  Value(Data d) noexcept : v_(std::move(d)) {}
  Value(Date d) noexcept : v_(d) {}
  // A URL is kept as the object it is; the URL type itself belongs to the
  // network layer, so these two are templates that take shape where it is
  // known.
  template <class T>
  requires(std::is_convertible_v<std::shared_ptr<T>, URLPtr>) Value(std::shared_ptr<T> url)
  noexcept {
    if (url) v_ = URLHandle{std::shared_ptr<const Object>(URLPtr(std::move(url)))};
  }
  Value(Array a);
  Value(Dictionary d);
  Value(std::shared_ptr<Object> o) noexcept;
  template <class T>
  requires(!std::is_same_v<T, Object> &&
           std::is_convertible_v<std::shared_ptr<T>, std::shared_ptr<Object>> &&
           !std::is_convertible_v<std::shared_ptr<T>, URLPtr>) Value(std::shared_ptr<T> o)
  noexcept : Value(std::shared_ptr<Object>(std::move(o))) {}

  Kind kind() const noexcept { return static_cast<Kind>(v_.index()); }
  bool isNull() const noexcept { return kind() == Kind::Null; }

  // Typed views; null when the value is of another kind.
  const Number* asNumber() const noexcept { return std::get_if<Number>(&v_); }
  const std::string* asString() const noexcept { return std::get_if<std::string>(&v_); }
  const Data* asData() const noexcept { return std::get_if<Data>(&v_); }
  const Date* asDate() const noexcept { return std::get_if<Date>(&v_); }
  template <class U = URL>
  std::shared_ptr<const U> asURL() const noexcept {
    auto* p = std::get_if<URLHandle>(&v_);
    return p ? std::static_pointer_cast<const U>(p->object) : nullptr;
  }
  const Array* asArray() const noexcept;
  const Dictionary* asDictionary() const noexcept;
  const std::shared_ptr<Object>* asObject() const noexcept {
    return std::get_if<std::shared_ptr<Object>>(&v_);
  }
  // The object, if it is one of type T.
  template <class T>
  std::shared_ptr<T> asObjectOf() const {
    auto* o = asObject();
    return o ? std::dynamic_pointer_cast<T>(*o) : nullptr;
  }

  // Dictionary member or array element; null when absent or of another kind.
  const Value* find(std::string_view key) const noexcept;
  const Value* at(std::size_t index) const noexcept;

  // Equality as the platform's isEqual: numbers by value, URLs by text,
  // collections element-wise, objects by identity. Like description(), it
  // walks nested collections with a stack of its own, not recursion.
  friend bool operator==(const Value& a, const Value& b) noexcept;

  // A readable rendering for logs and diagnostics (not JSON).
  std::string description() const;

 private:
  // An array or dictionary, not just the moved-from husk of one.
  bool holdsCollection() const noexcept {
    if (auto* array = std::get_if<std::shared_ptr<const Array>>(&v_)) return *array != nullptr;
    auto* dictionary = std::get_if<std::shared_ptr<const Dictionary>>(&v_);
    return dictionary != nullptr && *dictionary != nullptr;
  }
  void releaseCollection() noexcept;

  struct URLHandle {
    std::shared_ptr<const Object> object;  // a URL
  };
  std::variant<Null, Number, std::string, Data, Date, URLHandle, std::shared_ptr<const Array>,
               std::shared_ptr<const Dictionary>, std::shared_ptr<Object>>
      v_;
};

}  // namespace kivi
