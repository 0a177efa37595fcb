// JSON reading and writing.
//
// Reading has two paths. The fast one parses with simdjson's DOM parser (a
// parser per thread, reused) and converts its tape to Values with an explicit
// stack. simdjson reports only an error code, so when it refuses a text the
// careful path, CheckedReader, reads the same text byte by byte to say what
// is wrong and where. CheckedReader also reads the integers simdjson refuses
// (beyond 64 bits), which become doubles.
//
// Both readers and the writer use explicit stacks: nothing here recurses on
// the nesting of a document or a Value.
//
// Define KIVI_JSON_CROSS_CHECK (fuzzing builds) to run both readers on every
// text and abort when they disagree.
#include "kivi/foundation/json_serialization.h"

#include <simdjson.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <limits>
#include <optional>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#ifdef KIVI_JSON_CROSS_CHECK
#include <cstdlib>
#endif

#include "kivi/foundation/object.h"

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

bool isOneOf(char c, const char* set) { return c != '\0' && std::strchr(set, c) != nullptr; }

// ---------------------------------------------------------------------------
// UTF-8

// Length of the well-formed UTF-8 sequence at p (before end), 0 if there is
// none: no overlong forms, no surrogates, nothing above U+10FFFF.
std::size_t utf8SequenceLength(const unsigned char* p, const unsigned char* end) {
  const unsigned char c = p[0];
  if (c < 0x80) return 1;
  std::size_t length;
  unsigned char low = 0x80;
  unsigned char high = 0xBF;
  if (c < 0xC2) {
    return 0;
  } else if (c < 0xE0) {
    length = 2;
  } else if (c < 0xF0) {
    length = 3;
    if (c == 0xE0) low = 0xA0;
    if (c == 0xED) high = 0x9F;
  } else if (c < 0xF5) {
    length = 4;
    if (c == 0xF0) low = 0x90;
    if (c == 0xF4) high = 0x8F;
  } else {
    return 0;
  }
  if (static_cast<std::size_t>(end - p) < length) return 0;
  if (p[1] < low || p[1] > high) return 0;
  for (std::size_t i = 2; i < length; ++i) {
    if ((p[i] & 0xC0) != 0x80) return 0;
  }
  return length;
}

void appendUtf8(std::string& out, std::uint32_t codePoint) {
  if (codePoint < 0x80) {
    out.push_back(static_cast<char>(codePoint));
  } else if (codePoint < 0x800) {
    out.push_back(static_cast<char>(0xC0 | (codePoint >> 6)));
    out.push_back(static_cast<char>(0x80 | (codePoint & 0x3F)));
  } else if (codePoint < 0x10000) {
    out.push_back(static_cast<char>(0xE0 | (codePoint >> 12)));
    out.push_back(static_cast<char>(0x80 | ((codePoint >> 6) & 0x3F)));
    out.push_back(static_cast<char>(0x80 | (codePoint & 0x3F)));
  } else {
    out.push_back(static_cast<char>(0xF0 | (codePoint >> 18)));
    out.push_back(static_cast<char>(0x80 | ((codePoint >> 12) & 0x3F)));
    out.push_back(static_cast<char>(0x80 | ((codePoint >> 6) & 0x3F)));
    out.push_back(static_cast<char>(0x80 | (codePoint & 0x3F)));
  }
}

// ---------------------------------------------------------------------------
// The careful reader

// Reads JSON text byte by byte with an explicit stack of open containers.
// On failure message() says what is wrong and where ("... around line L,
// column C.", both 1-based, the column counted in bytes).
class CheckedReader {
 public:
  CheckedReader(std::string_view text, bool fragmentsAllowed)
      : text_(text), fragmentsAllowed_(fragmentsAllowed) {}

  std::optional<Value> read();
  const std::string& message() const { return message_; }

 private:
  struct Container {
    bool isObject;
    Array array;
    Dictionary dictionary;
    std::string key;  // of the member being read, in an object
  };

  bool atEnd() const { return pos_ >= text_.size(); }
  unsigned char peek() const { return static_cast<unsigned char>(text_[pos_]); }
  void skipWhitespace() {
    while (!atEnd()) {
      const unsigned char c = peek();
      if (c != ' ' && c != '\n' && c != '\r' && c != '\t') break;
      ++pos_;
    }
  }

  bool fail(std::string_view what, std::size_t offset);
  bool failUnexpected(std::size_t offset);  // the character at offset, or the end
  bool expect(char c);

  bool readScalar(Value& out);
  bool readLiteral(std::string_view literal);
  bool readNumber(Value& out);
  bool readString(std::string& out);
  bool readEscape(std::string& out);
  bool readHex4(std::size_t offset, std::uint32_t& out) const;

  std::string_view text_;
  bool fragmentsAllowed_;
  std::size_t pos_ = 0;
  std::string message_;
};

bool CheckedReader::fail(std::string_view what, std::size_t offset) {
  std::size_t line = 1;
  std::size_t lineStart = 0;
  for (std::size_t i = 0; i < offset && i < text_.size(); ++i) {
    if (text_[i] == '\n') {
      ++line;
      lineStart = i + 1;
    }
  }
  message_.assign(what);
  message_ += " around line " + std::to_string(line) + ", column " +
              std::to_string(offset - lineStart + 1) + ".";
  return false;
}

bool CheckedReader::failUnexpected(std::size_t offset) {
  if (offset >= text_.size()) return fail("Unexpected end of input", text_.size());
  const auto* p = reinterpret_cast<const unsigned char*>(text_.data()) + offset;
  const auto* end = reinterpret_cast<const unsigned char*>(text_.data()) + text_.size();
  if (*p >= 0x20 && *p < 0x7F) {
    return fail(std::string("Unexpected character '") + static_cast<char>(*p) + "'", offset);
  }
  if (*p < 0x80) {
    char name[8];
    std::snprintf(name, sizeof name, "U+%04X", *p);
    return fail(std::string("Unexpected character ") + name, offset);
  }
  const std::size_t length = utf8SequenceLength(p, end);
  if (length == 0) return fail("Invalid UTF-8", offset);
  return fail("Unexpected character '" + std::string(text_.substr(offset, length)) + "'", offset);
}

bool CheckedReader::expect(char c) {
  skipWhitespace();
  if (atEnd() || text_[pos_] != c) return failUnexpected(pos_);
  ++pos_;
  return true;
}

std::optional<Value> CheckedReader::read() {
  skipWhitespace();
  if (atEnd()) {
    fail("Unexpected end of input", text_.size());
    return std::nullopt;
  }
  if (!fragmentsAllowed_ && isOneOf(text_[pos_], "\"-0123456789tfn")) {
    message_ = kNotAContainer;
    return std::nullopt;
  }
  if (!fragmentsAllowed_ && peek() != '[' && peek() != '{') {
    failUnexpected(pos_);
    return std::nullopt;
  }

  std::vector<Container> stack;
  Value current;
  for (;;) {
    // A value starts here: open a container or read a scalar.
    skipWhitespace();
    if (atEnd()) {
      failUnexpected(pos_);
      return std::nullopt;
    }
    const unsigned char c = peek();
    bool haveValue = true;
    if (c == '[' || c == '{') {
      if (stack.size() == JSONSerialization::kMaxDepth) {
        fail("Too deeply nested", pos_);
        return std::nullopt;
      }
      ++pos_;
      stack.push_back(Container{c == '{', {}, {}, {}});
      skipWhitespace();
      if (!atEnd() && peek() == (c == '{' ? '}' : ']')) {
        ++pos_;
        current = c == '{' ? Value(Dictionary{}) : Value(Array{});
        stack.pop_back();
      } else if (c == '{') {
        skipWhitespace();
        if (atEnd() || peek() != '"') {
          failUnexpected(pos_);
          return std::nullopt;
        }
        if (!readString(stack.back().key) || !expect(':')) return std::nullopt;
        haveValue = false;
      } else {
        haveValue = false;
      }
    } else if (!readScalar(current)) {
      return std::nullopt;
    }
    if (!haveValue) continue;

    // A value is complete: add it to its container and close the containers
    // that end here.
    for (;;) {
      if (stack.empty()) {
        skipWhitespace();
        if (!atEnd()) {
          failUnexpected(pos_);
          return std::nullopt;
        }
        return current;
      }
      Container& top = stack.back();
      if (top.isObject) {
        top.dictionary.insert_or_assign(std::move(top.key), std::move(current));
        top.key.clear();
      } else {
        top.array.push_back(std::move(current));
      }
      skipWhitespace();
      if (atEnd()) {
        failUnexpected(pos_);
        return std::nullopt;
      }
      const unsigned char next = peek();
      if (next == ',') {
        ++pos_;
        if (top.isObject) {
          skipWhitespace();
          if (atEnd() || peek() != '"') {
            failUnexpected(pos_);
            return std::nullopt;
          }
          if (!readString(top.key) || !expect(':')) return std::nullopt;
        }
        break;
      }
      if (next != (top.isObject ? '}' : ']')) {
        failUnexpected(pos_);
        return std::nullopt;
      }
      ++pos_;
      current = top.isObject ? Value(std::move(top.dictionary)) : Value(std::move(top.array));
      stack.pop_back();
    }
  }
}

bool CheckedReader::readScalar(Value& out) {
  const unsigned char c = peek();
  switch (c) {
    case '"': {
      std::string s;
      if (!readString(s)) return false;
      out = Value(std::move(s));
      return true;
    }
    case 't':
      out = Value(true);
      return readLiteral("true");
    case 'f':
      out = Value(false);
      return readLiteral("false");
    case 'n':
      out = Value();
      return readLiteral("null");
    default:
      if (c == '-' || (c >= '0' && c <= '9')) return readNumber(out);
      return failUnexpected(pos_);
  }
}

bool CheckedReader::readLiteral(std::string_view literal) {
  for (char expected : literal) {
    if (atEnd() || text_[pos_] != expected) return failUnexpected(pos_);
    ++pos_;
  }
  return true;
}

bool CheckedReader::readNumber(Value& out) {
  const std::size_t start = pos_;
  std::size_t end = start;
  while (end < text_.size() && isOneOf(text_[end], "0123456789+-.eE")) ++end;
  const std::string_view token = text_.substr(start, end - start);
  auto invalid = [&](const char* what) {
    std::string shown(token.substr(0, 40));
    if (token.size() > 40) shown += "\u2026";
    return fail(std::string(what) + " '" + shown + "'", start);
  };
  auto isDigit = [&](std::size_t i) {
    return i < token.size() && token[i] >= '0' && token[i] <= '9';
  };

  std::size_t i = 0;
  const bool negative = token[0] == '-';
  if (negative) ++i;
  const std::size_t integerStart = i;
  if (!isDigit(i)) return invalid("Invalid number");
  if (token[i] == '0') {
    ++i;
  } else {
    while (isDigit(i)) ++i;
  }
  const std::size_t integerEnd = i;
  bool integral = true;
  if (i < token.size() && token[i] == '.') {
    integral = false;
    ++i;
    if (!isDigit(i)) return invalid("Invalid number");
    while (isDigit(i)) ++i;
  }
  const std::size_t fractionEnd = i;
  std::int64_t exponent = 0;
  if (i < token.size() && (token[i] == 'e' || token[i] == 'E')) {
    integral = false;
    ++i;
    bool negativeExponent = false;
    if (i < token.size() && (token[i] == '+' || token[i] == '-'))
      negativeExponent = token[i++] == '-';
    if (!isDigit(i)) return invalid("Invalid number");
    while (isDigit(i)) {
      if (exponent < 1'000'000'000) exponent = exponent * 10 + (token[i] - '0');
      ++i;
    }
    if (negativeExponent) exponent = -exponent;
  }
  if (i != token.size()) return invalid("Invalid number");
  pos_ = end;

  if (integral) {
    std::uint64_t magnitude = 0;
    bool overflow = false;
    for (std::size_t k = integerStart; k < integerEnd; ++k) {
      const auto digit = static_cast<std::uint64_t>(token[k] - '0');
      if (magnitude > (std::numeric_limits<std::uint64_t>::max() - digit) / 10) {
        overflow = true;
        break;
      }
      magnitude = magnitude * 10 + digit;
    }
    constexpr auto kInt64Max = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
    if (!overflow && !negative) {
      out = magnitude <= kInt64Max ? Value(Number(static_cast<std::int64_t>(magnitude)))
                                   : Value(Number(magnitude));
      return true;
    }
    if (!overflow && magnitude <= kInt64Max + 1) {
      out = Value(Number(magnitude == kInt64Max + 1 ? std::numeric_limits<std::int64_t>::min()
                                                    : -static_cast<std::int64_t>(magnitude)));
      return true;
    }
  }

  double d = 0;
  const auto result = std::from_chars(token.data(), token.data() + token.size(), d);
  if (result.ec == std::errc::result_out_of_range) {
    // Too large or too small for a double: find which from the position of
    // the first significant digit.
    std::int64_t magnitude = 0;
    std::size_t k = integerStart;
    while (k < fractionEnd && (token[k] == '0' || token[k] == '.')) ++k;
    if (k < integerEnd) {
      magnitude = static_cast<std::int64_t>(integerEnd - k) - 1;
    } else {
      magnitude = -static_cast<std::int64_t>(k - integerEnd);  // counts the '.'
    }
    if (magnitude + exponent > 0) return invalid("Number out of range");
    d = negative ? -0.0 : 0.0;
  } else if (result.ec != std::errc() || !std::isfinite(d)) {
    return invalid("Number out of range");
  }
  out = Value(Number(d));
  return true;
}

bool CheckedReader::readString(std::string& out) {
  out.clear();
  ++pos_;  // the opening quote
  const auto* base = reinterpret_cast<const unsigned char*>(text_.data());
  const auto* end = base + text_.size();
  for (;;) {
    if (atEnd()) return fail("Unexpected end of input", text_.size());
    const unsigned char c = peek();
    if (c == '"') {
      ++pos_;
      return true;
    }
    if (c == '\\') {
      if (!readEscape(out)) return false;
    } else if (c < 0x20) {
      char name[8];
      std::snprintf(name, sizeof name, "U+%04X", c);
      return fail(std::string("Unescaped control character ") + name + " in string", pos_);
    } else if (c < 0x80) {
      out.push_back(static_cast<char>(c));
      ++pos_;
    } else {
      const std::size_t length = utf8SequenceLength(base + pos_, end);
      if (length == 0) return fail("Invalid UTF-8", pos_);
      out.append(text_.data() + pos_, length);
      pos_ += length;
    }
  }
}

bool CheckedReader::readHex4(std::size_t offset, std::uint32_t& out) const {
  if (text_.size() - offset < 4) return false;
  out = 0;
  for (std::size_t i = 0; i < 4; ++i) {
    const char h = text_[offset + i];
    std::uint32_t digit;
    if (h >= '0' && h <= '9') {
      digit = static_cast<std::uint32_t>(h - '0');
    } else if (h >= 'a' && h <= 'f') {
      digit = static_cast<std::uint32_t>(h - 'a' + 10);
    } else if (h >= 'A' && h <= 'F') {
      digit = static_cast<std::uint32_t>(h - 'A' + 10);
    } else {
      return false;
    }
    out = out << 4 | digit;
  }
  return true;
}

bool CheckedReader::readEscape(std::string& out) {
  const std::size_t start = pos_;  // the backslash
  if (start + 1 >= text_.size()) return fail("Unexpected end of input", text_.size());
  const char kind = text_[start + 1];
  const char* simple = std::strchr("\"\\/bfnrt", kind);
  if (kind != '\0' && simple != nullptr) {
    static constexpr char kDecoded[] = "\"\\/\b\f\n\r\t";
    out.push_back(kDecoded[simple - "\"\\/bfnrt"]);
    pos_ += 2;
    return true;
  }
  if (kind != 'u') {
    const auto* p = reinterpret_cast<const unsigned char*>(text_.data()) + start + 1;
    if (*p < 0x20 || *p >= 0x7F) return failUnexpected(start + 1);
    return fail(std::string("Invalid escape sequence '\\") + kind + "'", start);
  }
  auto shown = [&](std::size_t offset) {
    return std::string(text_.substr(offset, std::min<std::size_t>(6, text_.size() - offset)));
  };
  std::uint32_t codePoint;
  if (!readHex4(start + 2, codePoint)) {
    return fail("Invalid unicode escape '" + shown(start) + "'", start);
  }
  pos_ = start + 6;
  if (codePoint >= 0xDC00 && codePoint <= 0xDFFF) {
    return fail("Unpaired surrogate '" + shown(start) + "'", start);
  }
  if (codePoint >= 0xD800 && codePoint <= 0xDBFF) {
    std::uint32_t low;
    if (text_.size() - pos_ < 6 || text_[pos_] != '\\' || text_[pos_ + 1] != 'u' ||
        !readHex4(pos_ + 2, low) || low < 0xDC00 || low > 0xDFFF) {
      return fail("Unpaired surrogate '" + shown(start) + "'", start);
    }
    codePoint = 0x10000 + ((codePoint - 0xD800) << 10) + (low - 0xDC00);
    pos_ += 6;
  }
  appendUtf8(out, codePoint);
  return true;
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

#ifdef KIVI_JSON_CROSS_CHECK
// Equal including the number flavours and the sign of zero.
bool identical(const Value& a, const Value& b) {
  if (a.kind() != b.kind()) return false;
  if (const Number* n = a.asNumber()) {
    const Number* m = b.asNumber();
    if (n->type() != m->type() || !(*n == *m)) return false;
    return n->type() != Number::Type::Double ||
           std::signbit(n->doubleValue()) == std::signbit(m->doubleValue());
  }
  if (const Array* x = a.asArray()) {
    const Array* y = b.asArray();
    if (x->size() != y->size()) return false;
    for (std::size_t i = 0; i < x->size(); ++i) {
      if (!identical((*x)[i], (*y)[i])) return false;
    }
    return true;
  }
  if (const Dictionary* x = a.asDictionary()) {
    const Dictionary* y = b.asDictionary();
    if (x->size() != y->size()) return false;
    for (auto i = x->begin(), j = y->begin(); i != x->end(); ++i, ++j) {
      if (i->first != j->first || !identical(i->second, j->second)) return false;
    }
    return true;
  }
  return a == b;
}

[[noreturn]] void readersDisagree(std::string_view text, const char* what) {
  std::fprintf(stderr, "JSON readers disagree (%s) on %zu bytes:\n%.*s\n", what, text.size(),
               static_cast<int>(std::min<std::size_t>(text.size(), 4096)), text.data());
  std::abort();
}
#endif

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
  const bool converted = code == simdjson::SUCCESS && TapeConverter().convert(root, value);

#ifdef KIVI_JSON_CROSS_CHECK
  {
    CheckedReader checked(data, true);
    const std::optional<Value> careful = checked.read();
    if (converted) {
      if (!careful) readersDisagree(data, checked.message().c_str());
      if (!identical(*careful, value)) readersDisagree(data, "values");
    } else if (careful && code != simdjson::NUMBER_ERROR && code != simdjson::CAPACITY) {
      readersDisagree(data, simdjson::error_message(code));
    }
  }
#endif

  if (converted) {
    if (!fragmentsAllowed && value.kind() != Value::Kind::Array &&
        value.kind() != Value::Kind::Dictionary) {
      return refuse(kNotAContainer);
    }
    if (error) *error = nullptr;
    return value;
  }
  if (code == simdjson::MEMALLOC) return refuse("Not enough memory to read the JSON text.");

  // Read again with the careful reader to find what is wrong and where. It
  // accepts what simdjson refuses only for numbers (integers beyond 64 bits)
  // and sizes (beyond 4 GB).
  CheckedReader checked(data, fragmentsAllowed);
  std::optional<Value> careful = checked.read();
  if (!careful) return refuse(checked.message());
  if (code != simdjson::NUMBER_ERROR && code != simdjson::CAPACITY) {
    return refuse(std::string("Invalid JSON text (") + simdjson::error_message(code) + ").");
  }
  if (error) *error = nullptr;
  return careful;
}

}  // namespace kivi
