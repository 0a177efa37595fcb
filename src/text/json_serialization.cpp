// JSON reading and writing.
//
// Reading has two paths. The fast one parses with simdjson's DOM parser (a
// parser per thread, reused) and converts its tape to Values with an explicit
// stack. simdjson reports only an error code, so when it refuses a text the
// careful path reads the same text again with nlohmann::json's SAX parser,
// which says where it stopped, and turns that into a message with a line and
// column. The careful path also reads the integers simdjson refuses (beyond
// 64 bits), which become doubles.
//
// Both readers and the writer use explicit stacks: nothing here recurses on
// the nesting of a document or a Value.
#include "kivi/text/json_serialization.h"

#include <simdjson.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <limits>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "kivi/base/object.h"

namespace kivi {
namespace {

constexpr const char* kReadFailure =
    "The data couldn\u2019t be read because it isn\u2019t in the correct format.";
constexpr const char* kWriteFailure =
    "The data couldn\u2019t be written because it isn\u2019t in the correct format.";
constexpr const char* kNotAContainer =
    "JSON text did not start with array or object and option to allow fragments not set.";

// A thread's parser keeps its buffers between calls, unless a text this big
// made them grow: that one gets a parser of its own, freed on return.
constexpr std::size_t kLargestReusedCapacity = std::size_t{8} << 20;

ErrorPtr makeError(std::int64_t code, const char* description, std::string debugDescription) {
  Dictionary userInfo;
  userInfo.emplace(LocalizedDescriptionKey, Value(description));
  userInfo.emplace(DebugDescriptionErrorKey, Value(std::move(debugDescription)));
  return Error::create(CocoaErrorDomain, code, std::move(userInfo));
}

// ---------------------------------------------------------------------------
// The fast reader

// Converts simdjson's document to a Value. simdjson counts an empty
// innermost container as no level, so the parser runs with one level to
// spare and the converter applies the limit: false when the document is
// deeper than kMaxDepth.
class TapeConverter {
 public:
  static constexpr std::size_t kParserMaxDepth = JSONSerialization::kMaxDepth + 1;

  bool convert(simdjson::dom::element root, Value& out) {
    if (!isContainer(root)) {
      scalar(root, [&](auto&& value) { out = Value(std::forward<decltype(value)>(value)); });
      return true;
    }
    open(root, {});
    for (;;) {
      Frame& f = stack_.back();
      if (f.isObject) {
        if (f.member != f.membersEnd) {
          const std::string_view key = f.member.key();
          const simdjson::dom::element element = f.member.value();
          ++f.member;
          if (!isContainer(element)) {
            scalar(element, [&](auto&& value) {
              addMember(f.dictionary, key, std::forward<decltype(value)>(value));
            });
          } else if (!open(element, key)) {
            return false;
          }
          continue;
        }
      } else if (f.element != f.elementsEnd) {
        const simdjson::dom::element element = *f.element;
        ++f.element;
        if (!isContainer(element)) {
          scalar(element,
                 [&](auto&& value) { f.array.emplace_back(std::forward<decltype(value)>(value)); });
        } else if (!open(element, {})) {
          return false;
        }
        continue;
      }
      Value done = f.isObject ? Value(std::move(f.dictionary)) : Value(std::move(f.array));
      const std::string_view key = f.key;
      stack_.pop_back();
      if (stack_.empty()) {
        out = std::move(done);
        return true;
      }
      Frame& parent = stack_.back();
      if (parent.isObject) {
        addMember(parent.dictionary, key, std::move(done));
      } else {
        parent.array.push_back(std::move(done));
      }
    }
  }

 private:
  struct Frame {
    bool isObject = false;
    simdjson::dom::array::iterator element, elementsEnd;
    simdjson::dom::object::iterator member, membersEnd;
    Array array;
    Dictionary dictionary;
    std::string_view key;  // under which the container goes in its parent object
  };

  static bool isContainer(simdjson::dom::element e) {
    const auto type = e.type();
    return type == simdjson::dom::element_type::ARRAY ||
           type == simdjson::dom::element_type::OBJECT;
  }

  template <class T>
  static void addMember(Dictionary& dictionary, std::string_view key, T&& value) {
    // The last of duplicate keys wins.
    auto [it, inserted] = dictionary.try_emplace(std::string(key), std::forward<T>(value));
    if (!inserted) it->second = Value(std::forward<T>(value));
  }

  // Passes the scalar e to add(), made in place where it goes.
  template <class Add>
  static void scalar(simdjson::dom::element e, Add&& add) {
    using simdjson::dom::element_type;
    switch (e.type()) {
      case element_type::STRING:
        add(std::string(e.get_string().value_unsafe()));
        break;
      case element_type::INT64:
        add(Number(e.get_int64().value_unsafe()));
        break;
      case element_type::UINT64:
        add(Number(e.get_uint64().value_unsafe()));
        break;
      case element_type::DOUBLE:
        add(Number(e.get_double().value_unsafe()));
        break;
      case element_type::BOOL:
        add(Number(e.get_bool().value_unsafe()));
        break;
      default:
        add(Null{});
        break;
    }
  }

  bool open(simdjson::dom::element e, std::string_view key) {
    if (stack_.size() == JSONSerialization::kMaxDepth) return false;
    Frame& f = stack_.emplace_back();
    f.key = key;
    if (e.type() == simdjson::dom::element_type::OBJECT) {
      const simdjson::dom::object object = e.get_object().value_unsafe();
      f.isObject = true;
      f.member = object.begin();
      f.membersEnd = object.end();
    } else {
      const simdjson::dom::array array = e.get_array().value_unsafe();
      f.element = array.begin();
      f.elementsEnd = array.end();
      f.array.reserve(array.size());
    }
    return true;
  }

  std::vector<Frame> stack_;
};

// ---------------------------------------------------------------------------
// The careful reader

bool isDigit(char c) { return c >= '0' && c <= '9'; }
bool isNumberChar(char c) {
  return isDigit(c) || c == '-' || c == '+' || c == '.' || c == 'e' || c == 'E';
}
std::string codePointName(unsigned char c) {
  char name[8];
  std::snprintf(name, sizeof name, "U+%04X", c);
  return name;
}

// "<what> around line L, column C." for the byte at `offset`: both 1-based,
// the column counted in bytes.
std::string located(std::string_view text, std::string_view what, std::size_t offset) {
  const std::string_view before = text.substr(0, offset);
  const std::size_t newline = before.rfind('\n');
  const std::size_t column = offset - (newline == std::string_view::npos ? 0 : newline + 1) + 1;
  return std::string(what) + " around line " +
         std::to_string(1 + std::count(before.begin(), before.end(), '\n')) + ", column " +
         std::to_string(column) + ".";
}

// The character at `offset` (or the end of the text) where it cannot be.
std::string unexpected(std::string_view text, std::size_t offset) {
  if (offset >= text.size()) return located(text, "Unexpected end of input", text.size());
  const auto c = static_cast<unsigned char>(text[offset]);
  if (c >= 0x20 && c < 0x7F) {
    return located(text, std::string("Unexpected character '") + static_cast<char>(c) + "'",
                   offset);
  }
  if (c < 0x80) return located(text, "Unexpected character " + codePointName(c), offset);
  const std::size_t length = c >= 0xF0 ? 4 : c >= 0xE0 ? 3 : 2;
  if (text.size() - offset < length || !simdjson::validate_utf8(text.data() + offset, length)) {
    return located(text, "Invalid UTF-8", offset);
  }
  return located(text, "Unexpected character '" + std::string(text.substr(offset, length)) + "'",
                 offset);
}

// The run of number characters around `offset`, which is not a number (or
// not one a double can hold).
std::string badNumber(std::string_view text, std::string_view what, std::size_t offset) {
  std::size_t start = offset;
  while (start > 0 && isNumberChar(text[start - 1])) --start;
  while (start < offset && text[start] != '-' && !isDigit(text[start])) ++start;
  std::size_t end = start;
  while (end < text.size() && isNumberChar(text[end])) ++end;
  std::string shown(text.substr(start, std::min<std::size_t>(end - start, 40)));
  if (end - start > 40) shown += "\u2026";
  return located(text, std::string(what) + " '" + shown + "'", start);
}

// Where the UTF-8 sequence broken at `offset` starts: there, or at the lead
// byte of the sequence that byte should have continued.
std::size_t sequenceStart(std::string_view text, std::size_t offset) {
  std::size_t lead = offset;
  while (lead > 0 && offset - lead < 3 &&
         (static_cast<unsigned char>(text[lead - 1]) & 0xC0) == 0x80)
    --lead;
  if (lead == 0) return offset;
  const auto c = static_cast<unsigned char>(text[--lead]);
  const std::size_t length = c >= 0xF0 ? 4 : c >= 0xE0 ? 3 : c >= 0xC0 ? 2 : 0;
  return length > offset - lead ? lead : offset;
}

// The offset of the bracket that opens level kMaxDepth + 1, in a text that
// is valid up to there.
std::size_t tooDeepOffset(std::string_view text) {
  std::size_t depth = 0;
  bool inString = false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (inString) {
      if (c == '\\') {
        ++i;
      } else if (c == '"') {
        inString = false;
      }
    } else if (c == '"') {
      inString = true;
    } else if (c == '[' || c == '{') {
      if (++depth > JSONSerialization::kMaxDepth) return i;
    } else if (c == ']' || c == '}') {
      --depth;
    }
  }
  return text.size();
}

// Says what is wrong with `text` and where, from what nlohmann's parser
// reports: `position` counts the bytes it read, the last one being where it
// stopped (one more than the text when it ran out); its exception's message
// names a problem within a token before "; last read: ", otherwise the token
// that cannot be where it is.
std::string describeFailure(std::string_view text, std::size_t position, std::string_view lastToken,
                            const nlohmann::json::exception& e) {
  std::size_t at = position == 0 ? 0 : position - 1;
  if (at >= text.size()) return located(text, "Unexpected end of input", text.size());
  const std::string_view what = e.what();
  if (e.id == 406) return badNumber(text, "Number out of range", at);  // at: its last digit
  const std::size_t lastRead = what.find("; last read: ");
  auto says = [&](std::string_view words) {
    return lastRead != std::string_view::npos &&
           what.substr(0, lastRead).find(words) != std::string_view::npos;
  };
  auto escape = [&](std::string_view problem, std::size_t start) {
    start = std::min(start, at);  // never past where the reader stopped
    return located(text, std::string(problem) + " '" + std::string(text.substr(start, 6)) + "'",
                   start);
  };
  if (lastRead == std::string_view::npos) {
    // A whole token where it cannot be: point at its start. nlohmann keeps
    // the text of strings and numbers only; the others are literals or a
    // single byte.
    const char last = text[at];
    std::size_t length = 1;
    if (last == '"' || isDigit(last)) {
      length = lastToken.size();
    } else if (last == 'l' || last == 'e') {
      length = text.substr(0, at + 1).ends_with("false") ? 5 : 4;
    }
    at = at + 1 - std::min(length, at + 1);
  } else if (says("must follow U+D800")) {  // a low surrogate alone: at its last digit
    return escape("Unpaired surrogate", at - 5);
  } else if (says("must be followed by U+DC00")) {  // a high one without a low one after it
    return escape("Unpaired surrogate", text.rfind("\\u", at - 6));
  } else if (says("4 hex digits")) {
    return escape("Invalid unicode escape", text.rfind("\\u", at - 2));
  } else if (says("after backslash")) {
    const auto c = static_cast<unsigned char>(text[at]);
    if (c < 0x20 || c >= 0x7F) return unexpected(text, at);
    return located(text, std::string("Invalid escape sequence '\\") + text[at] + "'", at - 1);
  } else if (says("control character")) {
    const auto c = static_cast<unsigned char>(text[at]);
    return located(text, "Unescaped control character " + codePointName(c) + " in string", at);
  } else if (says("UTF-8")) {
    return located(text, "Invalid UTF-8", sequenceStart(text, at));
  } else if (says("invalid number")) {
    return badNumber(text, "Invalid number", at);
  }
  // Right after the digits of a number, a number character makes that number
  // invalid: 01, 1.5.2, 1-2.
  if (at > 0 && isDigit(text[at - 1]) && isNumberChar(text[at])) {
    return badNumber(text, "Invalid number", at);
  }
  return unexpected(text, at);
}

// Builds a Value from nlohmann's SAX events, with an explicit stack of open
// containers; on failure message() says what is wrong and where.
class ValueBuilder {
 public:
  explicit ValueBuilder(std::string_view text) : text_(text) {}

  Value& value() { return value_; }
  std::string& message() { return message_; }

  bool null() { return add(Value()); }
  bool boolean(bool b) { return add(Value(b)); }
  bool number_integer(std::int64_t i) { return add(Value(Number(i))); }
  bool number_unsigned(std::uint64_t u) {
    constexpr auto kInt64Max = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
    return add(u <= kInt64Max ? Value(Number(static_cast<std::int64_t>(u))) : Value(Number(u)));
  }
  bool number_float(double d, const std::string&) { return add(Value(Number(d))); }
  bool string(std::string& s) { return add(Value(std::move(s))); }
  bool binary(nlohmann::json::binary_t&) { return false; }  // never in JSON text
  bool start_object(std::size_t) { return open(true); }
  bool start_array(std::size_t) { return open(false); }
  bool key(std::string& key) {
    stack_.back().key = std::move(key);
    return true;
  }
  bool end_object() { return close(); }
  bool end_array() { return close(); }
  bool parse_error(std::size_t position, const std::string& lastToken,
                   const nlohmann::json::exception& e) {
    message_ = describeFailure(text_, position, lastToken, e);
    return false;
  }

 private:
  struct Container {
    bool isObject;
    Array array;
    Dictionary dictionary;
    std::string key;  // of the member being read, in an object
  };

  bool open(bool isObject) {
    if (stack_.size() == JSONSerialization::kMaxDepth) {
      message_ = located(text_, "Too deeply nested", tooDeepOffset(text_));
      return false;
    }
    stack_.push_back(Container{isObject, {}, {}, {}});
    return true;
  }
  bool close() {
    Container& top = stack_.back();
    Value done = top.isObject ? Value(std::move(top.dictionary)) : Value(std::move(top.array));
    stack_.pop_back();
    return add(std::move(done));
  }
  bool add(Value value) {
    if (stack_.empty()) {
      value_ = std::move(value);
    } else if (Container& top = stack_.back(); top.isObject) {
      top.dictionary.insert_or_assign(std::move(top.key), std::move(value));  // the last one wins
    } else {
      top.array.push_back(std::move(value));
    }
    return true;
  }

  std::string_view text_;
  std::vector<Container> stack_;
  Value value_;
  std::string message_;
};

// Reads `text` with nlohmann's parser: the value, or none and `message`
// saying what is wrong and where. Cold: kept from crowding the fast path's
// inlining.
[[gnu::cold]] std::optional<Value> readCarefully(std::string_view text, bool fragmentsAllowed,
                                                 std::string& message) {
  const std::size_t first = text.find_first_not_of(" \t\n\r");
  if (!fragmentsAllowed && first != std::string_view::npos &&
      std::string_view("\"-0123456789tfn").find(text[first]) != std::string_view::npos) {
    message = kNotAContainer;
    return std::nullopt;
  }
  // nlohmann skips a byte order mark; the fast reader refuses one, and so does this one.
  if (text.starts_with('\xEF')) {
    message = unexpected(text, 0);
    return std::nullopt;
  }
  ValueBuilder builder(text);
  if (!nlohmann::json::sax_parse(text.begin(), text.end(), &builder)) {
    message = std::move(builder.message());
    return std::nullopt;
  }
  // nlohmann takes a NUL byte for the end of the text: one it accepted is
  // after the value.
  if (const std::size_t nul = text.find('\0'); nul != std::string_view::npos) {
    message = unexpected(text, nul);
    return std::nullopt;
  }
  return std::move(builder.value());
}

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
    } else if (const std::string* s = next.asString()) {
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

std::optional<Value> JSONSerialization::JSONObjectWithData(std::string_view data,
                                                           JSONReadingOptions options,
                                                           ErrorPtr* error) {
  const bool fragmentsAllowed = (options & JSONReadingFragmentsAllowed) != 0;
  auto refuse = [&](std::string message) -> std::optional<Value> {
    if (error) *error = makeError(PropertyListReadCorruptError, kReadFailure, std::move(message));
    return std::nullopt;
  };

  thread_local simdjson::dom::parser threadParser;
  std::optional<simdjson::dom::parser> ownParser;
  simdjson::dom::parser* parser = &threadParser;
  if (data.size() > kLargestReusedCapacity) parser = &ownParser.emplace();
  simdjson::error_code code = simdjson::SUCCESS;
  if (parser->max_depth() != TapeConverter::kParserMaxDepth) {
    code =
        parser->allocate(std::max(data.size(), parser->capacity()), TapeConverter::kParserMaxDepth);
  }
  simdjson::dom::element root;
  if (code == simdjson::SUCCESS) code = parser->parse(data.data(), data.size()).get(root);
  Value value;
  if (code == simdjson::SUCCESS && TapeConverter().convert(root, value)) {
    if (!fragmentsAllowed && value.kind() != Value::Kind::Array &&
        value.kind() != Value::Kind::Dictionary) {
      return refuse(kNotAContainer);
    }
    if (error) *error = nullptr;
    return value;
  }
  if (code == simdjson::MEMALLOC) return refuse("Not enough memory to read the JSON text.");

  // Read again carefully to find what is wrong and where. The careful reader
  // accepts what simdjson refuses only for numbers (integers beyond 64 bits)
  // and sizes (beyond 4 GB).
  std::string message;
  std::optional<Value> careful = readCarefully(data, fragmentsAllowed, message);
  if (!careful) return refuse(std::move(message));
  if (code != simdjson::NUMBER_ERROR && code != simdjson::CAPACITY) {
    return refuse(std::string("Invalid JSON text (") + simdjson::error_message(code) + ").");
  }
  if (error) *error = nullptr;
  return careful;
}

}  // namespace kivi
