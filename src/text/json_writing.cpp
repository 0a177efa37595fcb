// JSON writing: a walk over the Value with an explicit stack (nothing here
// recurses on the nesting of a Value) that checks it can be written as JSON
// and, when asked, writes it into a buffer the thread keeps.
#include <simdjson.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "json_common.h"
#include "kivi/base/object.h"
#include "kivi/text/json_serialization.h"
namespace kivi {
namespace {

using json_detail::kWriteFailure;
using json_detail::makeError;

using json_detail::kLargestReusedCapacity;

// ---------------------------------------------------------------------------
// The writer

constexpr double kLargestExactInteger = 9007199254740992.0;  // 2^53

// Walks a Value with an explicit stack, checking it can be written as JSON
// and, when kEmit, writing it.
template <bool kEmit>
class Writer {
 public:
  // Writes into `buffer` from its start, growing it as needed; it may end up
  // larger than the text (see size()).
  Writer(JSONWritingOptions options, Data* buffer)
      : pretty_((options & JSONWritingPrettyPrinted) != 0),
        fragmentsAllowed_((options & JSONWritingFragmentsAllowed) != 0),
        escapeSlashes_((options & JSONWritingWithoutEscapingSlashes) == 0),
        buffer_(buffer) {}

  bool write(const Value& root);
  std::size_t size() const { return used_; }
  const std::string& message() const { return message_; }

 private:
  struct Frame {
    const Array* array;
    const Dictionary* dictionary;
    std::size_t index;
    Dictionary::const_iterator member;
  };

  bool fail(std::string message) {
    message_ = std::move(message);
    return false;
  }
  // Room for n more bytes; advance() by what was written there.
  char* room(std::size_t n) {
    if (used_ + n > buffer_->size()) {
      buffer_->resize(std::max({buffer_->size() * 2, used_ + n, std::size_t{256}}));
    }
    return reinterpret_cast<char*>(buffer_->data()) + used_;
  }
  void advance(const char* end) {
    used_ = static_cast<std::size_t>(end - reinterpret_cast<const char*>(buffer_->data()));
  }
  void put(char c) {
    if constexpr (kEmit) {
      *room(1) = c;
      ++used_;
    }
  }
  void put(std::string_view s) {
    if constexpr (kEmit) {
      std::memcpy(room(s.size()), s.data(), s.size());
      used_ += s.size();
    }
  }
  void newline(std::size_t depth) {
    if constexpr (kEmit) {
      if (!pretty_) return;
      char* p = room(1 + 2 * depth);
      *p = '\n';
      std::memset(p + 1, ' ', 2 * depth);
      used_ += 1 + 2 * depth;
    }
  }

  // Containers and long strings are blocks elsewhere in memory: fetching the
  // next one while writing this one hides much of the wait for it.
  static void prefetch(const Value& next) {
    __builtin_prefetch(&next);
    if (const Dictionary* d = next.asDictionary()) {
      __builtin_prefetch(d);
    } else if (const Array* a = next.asArray()) {
      __builtin_prefetch(a);
    } else if (const String* s = next.asString()) {
      __builtin_prefetch(s->data());
    }
  }

  bool writeValue(const Value& value);
  bool writeNumber(const Number& number);
  bool writeString(std::string_view s);

  bool pretty_;
  bool fragmentsAllowed_;
  bool escapeSlashes_;
  Data* buffer_;
  std::size_t used_ = 0;
  std::vector<Frame> stack_;
  std::string message_;
};

template <bool kEmit>
bool Writer<kEmit>::write(const Value& root) {
  const Value::Kind kind = root.kind();
  if (!fragmentsAllowed_ && kind != Value::Kind::Array && kind != Value::Kind::Dictionary) {
    return fail("Invalid top-level type in JSON write.");
  }
  if (!writeValue(root)) return false;
  while (!stack_.empty()) {
    Frame& f = stack_.back();
    const std::size_t depth = stack_.size();
    if (f.array != nullptr) {
      if (f.index < f.array->size()) {
        if (f.index != 0) put(',');
        newline(depth);
        const Value& element = (*f.array)[f.index++];
        if (f.index < f.array->size()) prefetch((*f.array)[f.index]);
        if (!writeValue(element)) return false;  // may push: f is stale after
        continue;
      }
      newline(depth - 1);
      put(']');
    } else {
      if (f.member != f.dictionary->end()) {
        if (f.member != f.dictionary->begin()) put(',');
        newline(depth);
        const auto& [key, value] = *f.member++;
        if (f.member != f.dictionary->end()) prefetch(f.member->second);
        if (!writeString(key)) return false;
        if (pretty_) {
          put(" : ");
        } else {
          put(':');
        }
        if (!writeValue(value)) return false;
        continue;
      }
      newline(depth - 1);
      put('}');
    }
    stack_.pop_back();
  }
  return true;
}

template <bool kEmit>
bool Writer<kEmit>::writeValue(const Value& value) {
  switch (value.kind()) {
    case Value::Kind::Null:
      put("null");
      return true;
    case Value::Kind::Number:
      return writeNumber(*value.asNumber());
    case Value::Kind::String:
      return writeString(*value.asString());
    case Value::Kind::Array:
    case Value::Kind::Dictionary: {
      if (stack_.size() == JSONSerialization::kMaxDepth) {
        return fail("Too deeply nested in JSON write (more than " +
                    std::to_string(JSONSerialization::kMaxDepth) + " levels).");
      }
      const Array* array = value.asArray();
      const Dictionary* dictionary = value.asDictionary();
      if (array != nullptr ? array->empty() : dictionary->empty()) {
        put(array != nullptr ? "[]" : "{}");
        return true;
      }
      put(array != nullptr ? '[' : '{');
      stack_.push_back(
          Frame{array, dictionary, 0,
                dictionary != nullptr ? dictionary->begin() : Dictionary::const_iterator{}});
      return true;
    }
    case Value::Kind::Data:
      return fail("Invalid type in JSON write (NSData).");
    case Value::Kind::Date:
      return fail("Invalid type in JSON write (NSDate).");
    case Value::Kind::URL:
      return fail("Invalid type in JSON write (NSURL).");
    case Value::Kind::Object:
      return fail("Invalid type in JSON write (" + (*value.asObject())->className() + ").");
  }
  return fail("Invalid type in JSON write.");
}

template <bool kEmit>
bool Writer<kEmit>::writeNumber(const Number& number) {
  if (number.isBool()) {
    put(number.boolValue() ? std::string_view("true") : std::string_view("false"));
    return true;
  }
  const double d = number.doubleValue();
  if (number.type() == Number::Type::Double) {
    if (std::isnan(d)) return fail("Invalid number value (NaN) in JSON write.");
    if (std::isinf(d)) return fail("Invalid number value (infinite) in JSON write.");
  }
  if constexpr (kEmit) {
    char* p = room(32);
    char* end = p + 32;
    std::to_chars_result result{p, {}};
    if (number.type() == Number::Type::Int) {
      result = std::to_chars(p, end, number.longLongValue());
    } else if (number.type() == Number::Type::UInt) {
      result = std::to_chars(p, end, number.unsignedLongLongValue());
    } else if (d == 0 && std::signbit(d)) {
      result.ptr = std::copy_n("-0", 2, p);
    } else if (std::trunc(d) != d) {
      result = std::to_chars(p, end, d);
    } else if (std::fabs(d) <= kLargestExactInteger) {
      result = std::to_chars(p, end, static_cast<std::int64_t>(d));
    } else {
      // Beyond 2^53 an integral double is written with an exponent so that
      // it reads back as a double, not as an integer (or one too long).
      result = std::to_chars(p, end, d, std::chars_format::scientific);
    }
    advance(result.ptr);
  }
  return true;
}

// What a byte is written as inside a string: 0 as itself, 'u' as \u00XX,
// otherwise a backslash and this character.
constexpr auto kEscapes = [] {
  std::array<char, 256> table{};
  for (int c = 0; c < 0x20; ++c) table[c] = 'u';
  table['\b'] = 'b';
  table['\f'] = 'f';
  table['\n'] = 'n';
  table['\r'] = 'r';
  table['\t'] = 't';
  table['"'] = '"';
  table['\\'] = '\\';
  table['/'] = '/';
  return table;
}();

template <bool kEmit>
bool Writer<kEmit>::writeString(std::string_view s) {
  const auto* p = reinterpret_cast<const unsigned char*>(s.data());
  const auto* end = p + s.size();
  unsigned char seen = 0;
  if constexpr (kEmit) {
    put('"');
    while (p != end) {
      // A piece at a time, so that a long string never asks for six times
      // its size.
      const auto* pieceEnd = p + std::min<std::size_t>(static_cast<std::size_t>(end - p), 4096);
      char* out = room(6 * static_cast<std::size_t>(pieceEnd - p));  // a byte may take six
      for (; p != pieceEnd; ++p) {
        const unsigned char c = *p;
        seen |= c;
        const char escape = kEscapes[c];
        if (escape == 0 || (c == '/' && !escapeSlashes_)) {
          *out++ = static_cast<char>(c);
        } else if (escape == 'u') {
          static constexpr char kHex[] = "0123456789abcdef";
          out = std::copy_n("\\u00", 4, out);
          *out++ = kHex[c >> 4];
          *out++ = kHex[c & 0xF];
        } else {
          *out++ = '\\';
          *out++ = escape;
        }
      }
      advance(out);
    }
    put('"');
  } else {
    for (; p != end; ++p) seen |= *p;
  }
  if ((seen & 0x80) != 0 && !simdjson::validate_utf8(s.data(), s.size())) {
    return fail("Invalid UTF-8 in string in JSON write.");
  }
  return true;
}

}  // namespace

bool JSONSerialization::isValidJSONObject(const Value& value) {
  return Writer<false>(0, nullptr).write(value);
}

std::optional<Data> JSONSerialization::dataWithJSONObject(const Value& value,
                                                          JSONWritingOptions options,
                                                          ErrorPtr* error) {
  // Texts are written into a buffer the thread keeps (unless it is in use,
  // or grew too large to keep) and copied out at their exact size.
  thread_local Data threadBuffer;
  thread_local bool threadBufferInUse = false;
  Data ownBuffer;
  Data* buffer = threadBufferInUse ? &ownBuffer : &threadBuffer;
  const bool usingThreadBuffer = buffer == &threadBuffer;
  if (usingThreadBuffer) threadBufferInUse = true;

  Writer<true> writer(options, buffer);
  const bool written = writer.write(value);
  std::optional<Data> text;
  if (written) text.emplace(buffer->begin(), buffer->begin() + writer.size());

  if (usingThreadBuffer) {
    threadBufferInUse = false;
    if (threadBuffer.size() > kLargestReusedCapacity) Data().swap(threadBuffer);
  }
  if (!written) {
    if (error) *error = makeError(PropertyListWriteInvalidError, kWriteFailure, writer.message());
    return std::nullopt;
  }
  if (error) *error = nullptr;
  return text;
}

}  // namespace kivi
