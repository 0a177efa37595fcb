// JSON reading.
//
// Reading has two paths. The fast one parses with simdjson's DOM parser (a
// parser per thread, reused) and converts its tape to Values with an explicit
// stack, straight into one arena for the whole document. simdjson reports
// only an error code, so when it refuses a text the careful path reads the
// same text again with nlohmann::json's SAX parser, which says where it
// stopped, and turns that into a message with a line and column. The careful
// path also reads the integers simdjson refuses (beyond 64 bits), which
// become doubles.
//
// Neither reader recurses on the nesting of a document.
#include <simdjson.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <limits>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "json_common.h"
#include "kivi/base/detail/document_builder.h"
#include "kivi/base/object.h"
#include "kivi/text/json_serialization.h"
namespace kivi {

namespace json_detail {

ErrorPtr makeError(std::int64_t code, const char* description, std::string debugDescription) {
  Dictionary userInfo;
  userInfo.emplace(LocalizedDescriptionKey, Value(description));
  userInfo.emplace(DebugDescriptionErrorKey, Value(std::move(debugDescription)));
  return Error::create(CocoaErrorDomain, code, std::move(userInfo));
}

}  // namespace json_detail

namespace {

using json_detail::kNotAContainer;
using json_detail::kReadFailure;
using json_detail::makeError;

using json_detail::kLargestReusedCapacity;

// ---------------------------------------------------------------------------
// The fast reader

// Converts simdjson's document to a Value built in one arena. simdjson
// counts an empty innermost container as no level, so the parser runs with
// one level to spare and the converter applies the limit: false when the
// document is deeper than kMaxDepth.
class TapeConverter {
 public:
  static constexpr std::size_t kParserMaxDepth = JSONSerialization::kMaxDepth + 1;

  explicit TapeConverter(std::size_t sizeHint) : builder_(sizeHint) {}

  bool convert(simdjson::dom::element root, Value& out) {
    if (!isContainer(root)) {
      scalar(root, builder_.root());
      out = builder_.finish();
      return true;
    }
    if (!open(root, builder_.root())) return false;
    while (!stack_.empty()) {
      Frame& f = stack_.back();
      if (f.isObject) {
        if (f.member != f.membersEnd) {
          DictionaryEntry& entry = f.entries[f.index++];
          builder_.setKey(entry.first, f.member.key());
          const simdjson::dom::element element = f.member.value();
          ++f.member;
          if (!isContainer(element)) {
            scalar(element, entry.second);
          } else if (!open(element, entry.second)) {  // f is stale after
            return false;
          }
          continue;
        }
        builder_.finishDictionary(*f.slot);
      } else if (f.element != f.elementsEnd) {
        Value& slot = f.values[f.index++];
        const simdjson::dom::element element = *f.element;
        ++f.element;
        if (!isContainer(element)) {
          scalar(element, slot);
        } else if (!open(element, slot)) {
          return false;
        }
        continue;
      }
      stack_.pop_back();
    }
    out = builder_.finish();
    return true;
  }

 private:
  struct Frame {
    bool isObject = false;
    Value* slot = nullptr;  // the container's own place
    std::size_t index = 0;  // of the next member or element
    Value* values = nullptr;
    DictionaryEntry* entries = nullptr;
    simdjson::dom::array::iterator element, elementsEnd;
    simdjson::dom::object::iterator member, membersEnd;
  };

  static bool isContainer(simdjson::dom::element e) {
    const auto type = e.type();
    return type == simdjson::dom::element_type::ARRAY ||
           type == simdjson::dom::element_type::OBJECT;
  }

  // simdjson's counts stop at 0xFFFFFF; a container that large is counted.
  template <class Container>
  static std::size_t countOf(Container c) {
    const std::size_t n = c.size();
    return n < 0xFFFFFF ? n : static_cast<std::size_t>(std::distance(c.begin(), c.end()));
  }

  void scalar(simdjson::dom::element e, Value& slot) {
    using simdjson::dom::element_type;
    switch (e.type()) {
      case element_type::STRING:
        builder_.setString(slot, e.get_string().value_unsafe());
        break;
      case element_type::INT64:
        detail::DocumentBuilder::setNumber(slot, Number(e.get_int64().value_unsafe()));
        break;
      case element_type::UINT64:
        detail::DocumentBuilder::setNumber(slot, Number(e.get_uint64().value_unsafe()));
        break;
      case element_type::DOUBLE:
        detail::DocumentBuilder::setNumber(slot, Number(e.get_double().value_unsafe()));
        break;
      case element_type::BOOL:
        detail::DocumentBuilder::setNumber(slot, Number(e.get_bool().value_unsafe()));
        break;
      default:
        detail::DocumentBuilder::setNull(slot);
        break;
    }
  }

  bool open(simdjson::dom::element e, Value& slot) {
    if (stack_.size() == JSONSerialization::kMaxDepth) return false;
    Frame& f = stack_.emplace_back();
    f.slot = &slot;
    if (e.type() == simdjson::dom::element_type::OBJECT) {
      const simdjson::dom::object object = e.get_object().value_unsafe();
      f.isObject = true;
      f.member = object.begin();
      f.membersEnd = object.end();
      f.entries = builder_.makeDictionary(slot, countOf(object));
    } else {
      const simdjson::dom::array array = e.get_array().value_unsafe();
      f.element = array.begin();
      f.elementsEnd = array.end();
      f.values = builder_.makeArray(slot, countOf(array));
    }
    return true;
  }

  detail::DocumentBuilder builder_;
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
  bool string(std::string& s) { return add(Value(s)); }
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
    std::vector<DictionaryEntry> members;  // sorted once, at the end
    std::string key;                       // of the member being read, in an object
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
    Value done = top.isObject ? Value(Dictionary(std::move(top.members), /*lastWins=*/true))
                              : Value(std::move(top.array));
    stack_.pop_back();
    return add(std::move(done));
  }
  bool add(Value value) {
    if (stack_.empty()) {
      value_ = std::move(value);
    } else if (Container& top = stack_.back(); top.isObject) {
      top.members.push_back(DictionaryEntry{String(top.key), std::move(value)});
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
}  // namespace

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
  if (code == simdjson::SUCCESS && TapeConverter(data.size()).convert(root, value)) {
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
