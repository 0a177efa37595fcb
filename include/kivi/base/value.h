// Value: the one dynamic value of the library.
//
// JSON documents, dictionaries, arrays, user-info and key-value change
// dictionaries are all made of `Value`s. A value is one of:
//
//   null marker   Value() / Value(nullptr)          (the platform's NSNull)
//   number        Value(42), Value(3.5), Value(true) (a Number; booleans are
//                                                     numbers of bool flavour)
//   string        Value("text")                     (UTF-8, a String)
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
//   if (const kivi::String* name = value.find("name")->asString())
//     std::cout << *name;  // a String reads as a std::string_view
//
// "Absent" is not a Value: functions that may find nothing return
// std::optional<Value> or a null pointer from the as…() accessors.
//
// Representation (what it costs): a Value is 24 bytes. Numbers, dates and
// strings of up to 22 bytes live inside it; longer strings, data, arrays and
// dictionaries are shared, reference-counted blocks. A Dictionary is a flat
// array sorted by key: lookups are binary searches and iterating walks memory
// in order, while inserting one key shifts the keys after it, so build a large
// dictionary from a vector of entries (the range constructor sorts once). A
// document read by JSONSerialization lives in one arena that is freed at once
// when its last Value goes away.
//
// Thread contract: a Value is a value type. Distinct Values may be used from
// different threads freely; one Value may be read from many threads at once
// and needs outside synchronisation only if it is also assigned to. The same
// holds for String, Array and Dictionary.
#pragma once

#include <compare>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <iosfwd>
#include <iterator>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "kivi/base/value_string.h"
#include "kivi/export.h"

namespace kivi {

class Object;
class URL;
class Value;
class Array;
class Dictionary;

namespace detail {
struct ValueNode;
class DocumentBuilder;
}  // namespace detail

// How a URL (the network layer's type) is held, also inside a Value.
using URLPtr = std::shared_ptr<const URL>;

// The platform's NSNull.
struct KIVI_EXPORT Null {
  friend KIVI_EXPORT bool operator==(Null, Null) { return true; }
};

// Raw bytes: the data kind of a Value.
using Data = std::vector<std::uint8_t>;

// A point in time: seconds since 1970-01-01T00:00:00Z.
struct KIVI_EXPORT Date {
  double timeIntervalSince1970 = 0;  // negative before 1970
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
class KIVI_EXPORT Number {
 public:
  // The flavour a number was made with: bool, signed, unsigned or floating point.
  enum class Type : std::uint8_t { Bool, Int, UInt, Double };

  // A number of the argument's flavour; the default is the signed 0.
  constexpr Number() noexcept : type_(Type::Int), i_(0) {}
  constexpr explicit Number(bool b) noexcept : type_(Type::Bool), i_(b ? 1 : 0) {}
  constexpr explicit Number(std::int64_t i) noexcept : type_(Type::Int), i_(i) {}
  constexpr explicit Number(std::uint64_t u) noexcept : type_(Type::UInt), u_(u) {}
  constexpr explicit Number(double d) noexcept : type_(Type::Double), d_(d) {}

  // The flavour; isInteger() holds for Bool, Int and UInt.
  Type type() const noexcept { return type_; }
  bool isBool() const noexcept { return type_ == Type::Bool; }
  bool isInteger() const noexcept { return type_ != Type::Double; }

  // The value as another type: boolValue() is whether it is non-zero; a floating-point value
  // is truncated and saturates out of range (NaN gives 0); a negative value read unsigned
  // wraps (two's complement).
  bool boolValue() const noexcept;
  std::int64_t longLongValue() const noexcept;
  std::uint64_t unsignedLongLongValue() const noexcept;
  double doubleValue() const noexcept;

  // "1", "-3", "2.5", "true"/"false" printed as 1/0 like the platform.
  std::string stringValue() const;

  friend KIVI_EXPORT bool operator==(const Number& a, const Number& b) noexcept;

 private:
  Type type_;
  union {
    std::int64_t i_;
    std::uint64_t u_;
    double d_;
  };
};

class KIVI_EXPORT Value {
 public:
  // What a value holds; the table above shows each kind.
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

  // The null marker.
  Value() noexcept { kind_ = Kind::Null; }
  // Copies; a longer string, data, a collection or an object is shared, not duplicated.
  Value(const Value& other) {
    if (other.isPlain()) {
      std::memcpy(static_cast<void*>(this), &other, sizeof(Value));
    } else {
      copySlow(other);
    }
  }
  // Moves; `other` is left the null marker.
  Value(Value&& other) noexcept {
    std::memcpy(static_cast<void*>(this), &other, sizeof(Value));
    other.kind_ = Kind::Null;
  }
  // Assigns a copy, shared as the copy constructor does.
  Value& operator=(const Value& other) {
    if (this != &other) {
      Value copy(other);
      swap(copy);
    }
    return *this;
  }
  // Assigns by moving; `other` is left the null marker.
  Value& operator=(Value&& other) noexcept {
    if (this != &other) {
      Value moved(std::move(other));
      swap(moved);
    }
    return *this;
  }
  // Releases nested collections one after another, never recursively: a
  // Value nested a million levels deep is dropped like a flat one.
  ~Value() {
    if (!isPlain()) releaseSlow();
  }

  // The null marker.
  Value(std::nullptr_t) noexcept : Value() {}
  Value(Null) noexcept : Value() {}
  // A number of the argument's flavour: bool, signed, unsigned or floating point.
  Value(Number n) noexcept { setNumber(n); }
  Value(bool b) noexcept { setNumber(Number(b)); }
  Value(int i) noexcept { setNumber(Number(static_cast<std::int64_t>(i))); }
  Value(long i) noexcept { setNumber(Number(static_cast<std::int64_t>(i))); }
  Value(long long i) noexcept { setNumber(Number(static_cast<std::int64_t>(i))); }
  Value(unsigned i) noexcept { setNumber(Number(static_cast<std::uint64_t>(i))); }
  Value(unsigned long i) noexcept { setNumber(Number(static_cast<std::uint64_t>(i))); }
  Value(unsigned long long i) noexcept { setNumber(Number(static_cast<std::uint64_t>(i))); }
  Value(double d) noexcept { setNumber(Number(d)); }
  // A string.
  Value(String s) noexcept {
    new (raw_) String(std::move(s));
    kind_ = Kind::String;
  }
  // A string with a copy of `s` (a null `const char*` gives the empty string).
  Value(const char* s) : Value(String(s)) {}
  Value(const std::string& s) : Value(String(s)) {}
  Value(std::string_view s) : Value(String(s)) {}
  // Raw bytes.
  Value(Data d);
  // A date.
  Value(Date d) noexcept {
    new (raw_) Date(d);
    kind_ = Kind::Date;
  }
  // A URL is kept as the object it is; the URL type itself belongs to the
  // network layer, so these two are templates that take shape where it is
  // known.
  template <class T>
  requires(std::is_convertible_v<std::shared_ptr<T>, URLPtr>) Value(std::shared_ptr<T> url)
      : Value() {
    if (url) setURL(std::shared_ptr<const Object>(URLPtr(std::move(url))));
  }
  // An array or a dictionary; from now on it is immutable and shared between copies.
  Value(Array a);
  Value(Dictionary d);
  // A library object, of any Object subclass; a null pointer gives the null marker.
  Value(std::shared_ptr<Object> o);
  template <class T>
  requires(!std::is_same_v<T, Object> &&
           std::is_convertible_v<std::shared_ptr<T>, std::shared_ptr<Object>> &&
           !std::is_convertible_v<std::shared_ptr<T>, URLPtr>) Value(std::shared_ptr<T> o)
      : Value(std::shared_ptr<Object>(std::move(o))) {}

  // What the value holds; isNull() for the null marker.
  Kind kind() const noexcept { return kind_; }
  bool isNull() const noexcept { return kind_ == Kind::Null; }

  // The number held; this and the views below are null for a value of another kind.
  const Number* asNumber() const noexcept {
    return kind_ == Kind::Number ? std::launder(reinterpret_cast<const Number*>(raw_)) : nullptr;
  }
  // The text of a string value.
  const String* asString() const noexcept {
    return kind_ == Kind::String ? std::launder(reinterpret_cast<const String*>(raw_)) : nullptr;
  }
  // The bytes of a data value.
  const Data* asData() const noexcept;
  // The date held.
  const Date* asDate() const noexcept {
    return kind_ == Kind::Date ? std::launder(reinterpret_cast<const Date*>(raw_)) : nullptr;
  }
  // The URL held, as the network layer's URL type.
  template <class U = URL>
  std::shared_ptr<const U> asURL() const noexcept {
    const std::shared_ptr<const Object>* url = urlObject();
    return url ? std::static_pointer_cast<const U>(*url) : nullptr;
  }
  // The array, dictionary or library object held.
  const Array* asArray() const noexcept;
  const Dictionary* asDictionary() const noexcept;
  const std::shared_ptr<Object>* asObject() const noexcept;
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
  friend KIVI_EXPORT bool operator==(const Value& a, const Value& b) noexcept;

  // A readable rendering for logs and diagnostics (not JSON).
  std::string description() const;

  // Exchanges two values; never allocates.
  void swap(Value& other) noexcept {
    alignas(8) unsigned char t[sizeof(Value)];
    std::memcpy(t, static_cast<void*>(this), sizeof t);
    std::memcpy(static_cast<void*>(this), &other, sizeof t);
    std::memcpy(static_cast<void*>(&other), t, sizeof t);
  }

 private:
  friend class detail::DocumentBuilder;
  friend class Array;

  // Null, a number, a date or an inline string: copied as bytes, nothing to
  // release.
  bool isPlain() const noexcept {
    return kind_ == Kind::Null || kind_ == Kind::Number || kind_ == Kind::Date ||
           (kind_ == Kind::String &&
            static_cast<unsigned char>(raw_[String::kTagByte]) <= String::kInlineCapacity);
  }
  void setNumber(Number n) noexcept {
    new (raw_) Number(n);
    kind_ = Kind::Number;
  }
  detail::ValueNode* node() const noexcept {
    detail::ValueNode* p;
    std::memcpy(&p, raw_, sizeof p);
    return p;
  }
  void setNode(Kind kind, detail::ValueNode* p) noexcept {
    std::memcpy(raw_, &p, sizeof p);
    kind_ = kind;
  }
  void setURL(std::shared_ptr<const Object> url);
  const std::shared_ptr<const Object>* urlObject() const noexcept;
  void copySlow(const Value& other);
  void releaseSlow() noexcept;

  alignas(8) unsigned char raw_[23];
  Kind kind_;
};
static_assert(sizeof(Value) == 24);

// An array of Values with the interface of a std::vector. An Array read from
// a JSON document shares the document's storage and is read-only (reach it
// through a const pointer); copying it gives an Array of its own.
class KIVI_EXPORT Array {
 public:
  // The member types of a std::vector<Value>.
  using value_type = Value;
  using size_type = std::size_t;
  using difference_type = std::ptrdiff_t;
  using reference = Value&;
  using const_reference = const Value&;
  using pointer = Value*;
  using const_pointer = const Value*;
  using iterator = Value*;
  using const_iterator = const Value*;
  using reverse_iterator = std::reverse_iterator<iterator>;
  using const_reverse_iterator = std::reverse_iterator<const_iterator>;

  // Empty, the given values, or `count` copies of `value` (null markers by default).
  Array() noexcept = default;
  Array(std::initializer_list<Value> values);
  explicit Array(size_type count);
  Array(size_type count, const Value& value);
  // The elements of [first, last), each made a Value.
  template <class InputIt>
  requires(!std::is_integral_v<InputIt>) Array(InputIt first, InputIt last) {
    for (; first != last; ++first) emplace_back(*first);
  }
  // Copies the elements into an Array of its own, also from a document's read-only array.
  Array(const Array& other);
  // Moves; `other` is left empty.
  Array(Array&& other) noexcept
      : data_(other.data_),
        size_(other.size_),
        capacity_(other.capacity_),
        borrowed_(other.borrowed_) {
    other.data_ = nullptr;
    other.size_ = other.capacity_ = 0;
    other.borrowed_ = false;
  }
  // Assignment, of a copy or by moving as the constructors above, and destruction.
  Array& operator=(const Array& other);
  Array& operator=(Array&& other) noexcept;
  ~Array();

  // As std::vector's; resize() adds null markers.
  size_type size() const noexcept { return size_; }
  bool empty() const noexcept { return size_ == 0; }
  size_type capacity() const noexcept { return capacity_; }
  void reserve(size_type n);
  void clear() noexcept;
  void resize(size_type n);

  // The elements, stored contiguously, as std::vector's.
  Value* data() noexcept { return data_; }
  const Value* data() const noexcept { return data_; }
  iterator begin() noexcept { return data_; }
  iterator end() noexcept { return data_ + size_; }
  const_iterator begin() const noexcept { return data_; }
  const_iterator end() const noexcept { return data_ + size_; }
  const_iterator cbegin() const noexcept { return begin(); }
  const_iterator cend() const noexcept { return end(); }
  reverse_iterator rbegin() noexcept { return reverse_iterator(end()); }
  reverse_iterator rend() noexcept { return reverse_iterator(begin()); }
  const_reverse_iterator rbegin() const noexcept { return const_reverse_iterator(end()); }
  const_reverse_iterator rend() const noexcept { return const_reverse_iterator(begin()); }

  // Unchecked element access, as std::vector's: `i` must be in range, the array not empty.
  Value& operator[](size_type i) noexcept { return data_[i]; }
  const Value& operator[](size_type i) const noexcept { return data_[i]; }
  Value& front() noexcept { return data_[0]; }
  const Value& front() const noexcept { return data_[0]; }
  Value& back() noexcept { return data_[size_ - 1]; }
  const Value& back() const noexcept { return data_[size_ - 1]; }

  // As std::vector's; a change may invalidate iterators and element pointers.
  void push_back(const Value& value);
  void push_back(Value&& value);
  template <class... Args>
  Value& emplace_back(Args&&... args);
  void pop_back() noexcept;
  iterator insert(const_iterator position, Value value);
  // Inserts the elements of [first, last) before `position`; returns the first inserted.
  template <class InputIt>
  iterator insert(const_iterator position, InputIt first, InputIt last) {
    const difference_type at = position - begin();
    for (difference_type i = at; first != last; ++first, ++i) insert(begin() + i, Value(*first));
    return begin() + at;
  }
  // Remove one element or [first, last); return the element after the removed ones.
  iterator erase(const_iterator position);
  iterator erase(const_iterator first, const_iterator last);

  friend KIVI_EXPORT bool operator==(const Array& a, const Array& b) noexcept;

 private:
  friend class detail::DocumentBuilder;
  void grow(size_type atLeast);
  void makeOwn();

  Value* data_ = nullptr;
  std::uint32_t size_ = 0;
  std::uint32_t capacity_ = 0;
  bool borrowed_ = false;  // the elements belong to a document's arena
};

// One member of a Dictionary: `first` is the key, `second` the value, as in a
// std::map, so `for (const auto& [key, value] : dictionary)` reads the same.
struct KIVI_EXPORT DictionaryEntry {
  String first;  // the key
  Value second;  // the value
};

// A dictionary with string keys and the interface of a std::map, kept as an
// array sorted by key (byte order). Iterators and element pointers stay valid
// until the dictionary is next changed.
class KIVI_EXPORT Dictionary {
 public:
  // The member types of a std::map; an entry is a DictionaryEntry.
  using key_type = String;
  using mapped_type = Value;
  using value_type = DictionaryEntry;
  using size_type = std::size_t;
  using difference_type = std::ptrdiff_t;
  using reference = DictionaryEntry&;
  using const_reference = const DictionaryEntry&;
  using iterator = DictionaryEntry*;
  using const_iterator = const DictionaryEntry*;
  using reverse_iterator = std::reverse_iterator<iterator>;
  using const_reverse_iterator = std::reverse_iterator<const_iterator>;

  Dictionary() noexcept = default;
  // Of duplicate keys the first is kept, as std::map does.
  Dictionary(std::initializer_list<DictionaryEntry> entries);
  // The entries of [first, last), each with `first` and `second`; of duplicate keys the first
  // is kept.
  template <class InputIt>
  Dictionary(InputIt first, InputIt last) {
    std::vector<DictionaryEntry> entries;
    for (; first != last; ++first) entries.push_back(DictionaryEntry{first->first, first->second});
    adopt(std::move(entries), /*lastWins=*/false);
  }
  // Sorts once; of duplicate keys the first or, with lastWins, the last is
  // kept. The way to build a large dictionary.
  explicit Dictionary(std::vector<DictionaryEntry> entries, bool lastWins = false) {
    adopt(std::move(entries), lastWins);
  }
  // Copies the entries into a Dictionary of its own, also from a document's read-only one.
  Dictionary(const Dictionary& other);
  // Moves; `other` is left empty.
  Dictionary(Dictionary&& other) noexcept
      : data_(other.data_),
        size_(other.size_),
        capacity_(other.capacity_),
        borrowed_(other.borrowed_) {
    other.data_ = nullptr;
    other.size_ = other.capacity_ = 0;
    other.borrowed_ = false;
  }
  // Assignment, of a copy or by moving as the constructors above, and destruction.
  Dictionary& operator=(const Dictionary& other);
  Dictionary& operator=(Dictionary&& other) noexcept;
  ~Dictionary();

  // The number of entries; reserve() makes room for `n` of them.
  size_type size() const noexcept { return size_; }
  bool empty() const noexcept { return size_ == 0; }
  void clear() noexcept;
  void reserve(size_type n);

  // The entries in key order.
  iterator begin() noexcept { return data_; }
  iterator end() noexcept { return data_ + size_; }
  const_iterator begin() const noexcept { return data_; }
  const_iterator end() const noexcept { return data_ + size_; }
  const_iterator cbegin() const noexcept { return begin(); }
  const_iterator cend() const noexcept { return end(); }
  reverse_iterator rbegin() noexcept { return reverse_iterator(end()); }
  reverse_iterator rend() noexcept { return reverse_iterator(begin()); }
  const_reverse_iterator rbegin() const noexcept { return const_reverse_iterator(end()); }
  const_reverse_iterator rend() const noexcept { return const_reverse_iterator(begin()); }

  // The first entry whose key is not less than `key`.
  const_iterator lower_bound(std::string_view key) const noexcept;
  // The same, for changing the entry's value.
  iterator lower_bound(std::string_view key) noexcept {
    return data_ + (std::as_const(*this).lower_bound(key) - data_);
  }
  // The entry under `key`, or end().
  const_iterator find(std::string_view key) const noexcept {
    const_iterator it = lower_bound(key);
    return it != end() && it->first == key ? it : end();
  }
  // The same, for changing the entry's value.
  iterator find(std::string_view key) noexcept {
    return data_ + (std::as_const(*this).find(key) - data_);
  }
  // Whether an entry has `key`; count() answers 1 or 0.
  size_type count(std::string_view key) const noexcept { return find(key) != end() ? 1 : 0; }
  bool contains(std::string_view key) const noexcept { return find(key) != end(); }

  // The value under `key`, inserted as null when absent.
  Value& operator[](std::string_view key) { return try_emplace(key).first->second; }
  // The value under `key`; unlike std::map::at it never throws: an absent
  // key reads as a null Value.
  const Value& at(std::string_view key) const noexcept;

  // Adds `key` with a Value made from `args` (the null marker when none) unless the key is
  // there; returns the entry under `key` and whether it was added.
  template <class... Args>
  std::pair<iterator, bool> try_emplace(std::string_view key, Args&&... args) {
    iterator it = lower_bound(key);
    if (it != end() && it->first == key) return {it, false};
    return {insertAt(it - data_, String(key), Value(std::forward<Args>(args)...)), true};
  }
  // try_emplace() with a key of any string type.
  template <class K, class V>
  std::pair<iterator, bool> emplace(K&& key, V&& value) {
    return try_emplace(std::string_view(keyView(key)), std::forward<V>(value));
  }
  // emplace(); the hint is ignored.
  template <class K, class V>
  iterator emplace_hint(const_iterator, K&& key, V&& value) {
    return emplace(std::forward<K>(key), std::forward<V>(value)).first;
  }
  // Sets the value under `key`, adding the key when absent; returns the entry and whether it
  // was added.
  template <class V>
  std::pair<iterator, bool> insert_or_assign(std::string_view key, V&& value) {
    auto [it, inserted] = try_emplace(key);
    it->second = Value(std::forward<V>(value));
    return {it, inserted};
  }
  // Adds a pair's `first` and `second` unless the key is there, as std::map's.
  template <class Pair>
  requires requires(const Pair& p) {
    p.first;
    p.second;
  }
  std::pair<iterator, bool> insert(Pair&& entry) {
    return try_emplace(std::string_view(keyView(entry.first)), std::forward<Pair>(entry).second);
  }
  // insert() of each pair of [first, last).
  template <class InputIt>
  void insert(InputIt first, InputIt last) {
    for (; first != last; ++first) insert(*first);
  }
  // Remove the entry at `position` (returning the entry after it) or the one under `key`
  // (returning 1, or 0 when absent).
  iterator erase(const_iterator position);
  size_type erase(std::string_view key);

  friend KIVI_EXPORT bool operator==(const Dictionary& a, const Dictionary& b) noexcept;

 private:
  friend class detail::DocumentBuilder;
  static std::string_view keyView(const String& key) noexcept { return key.view(); }
  static std::string_view keyView(std::string_view key) noexcept { return key; }
  static std::string_view keyView(const std::string& key) noexcept { return key; }
  static std::string_view keyView(const char* key) noexcept { return key ? key : ""; }
  iterator insertAt(std::ptrdiff_t index, String key, Value value);
  void adopt(std::vector<DictionaryEntry> entries, bool lastWins);
  void makeOwn();

  DictionaryEntry* data_ = nullptr;
  std::uint32_t size_ = 0;
  std::uint32_t capacity_ = 0;
  bool borrowed_ = false;  // the entries belong to a document's arena
};

template <class... Args>
Value& Array::emplace_back(Args&&... args) {
  Value value(std::forward<Args>(args)...);  // may refer to an element: made first
  if (size_ == capacity_ || borrowed_) grow(size_ + 1);
  Value* slot = new (data_ + size_) Value(std::move(value));
  ++size_;
  return *slot;
}

}  // namespace kivi
