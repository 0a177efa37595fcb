// String: an immutable UTF-8 string, the text of a string Value and the key
// of a Dictionary. Up to 22 bytes are kept inline; longer text is shared
// between copies. It reads as a std::string_view; str() copies it out.
//
//   kivi::String key = "name";
//   std::string_view view = key;
//   if (key == "name") ...
//
// Thread contract: a String is a value type, as Value is: distinct Strings
// may be used from different threads freely; one String may be read from
// many threads at once and needs outside synchronisation only if it is also
// assigned to.
#pragma once

#include <compare>
#include <cstddef>
#include <cstring>
#include <iosfwd>
#include <string>
#include <string_view>
#include <utility>

#include "kivi/export.h"

namespace kivi {

class Value;

namespace detail {
class DocumentBuilder;
}  // namespace detail

class KIVI_EXPORT String {
 public:
  // The longest text, in bytes, kept inside the String itself.
  static constexpr std::size_t kInlineCapacity = 22;

  // Empty, or a copy of `text` (a null `const char*` gives the empty string).
  String() noexcept { bytes_[kTagByte] = 0; }
  String(std::string_view text);
  String(const char* text) : String(std::string_view(text ? text : "")) {}
  String(const std::string& text) : String(std::string_view(text)) {}
  // Copies; a longer text is shared, not duplicated.
  String(const String& other) {
    if (other.isInline()) {
      std::memcpy(bytes_, other.bytes_, sizeof bytes_);
    } else {
      copySlow(other);
    }
  }
  // Moves; `other` is left empty.
  String(String&& other) noexcept {
    std::memcpy(bytes_, other.bytes_, sizeof bytes_);
    other.bytes_[kTagByte] = 0;
  }
  // Assigns a copy, shared as the copy constructor does.
  String& operator=(const String& other) {
    if (this != &other) {
      String copy(other);
      swap(copy);
    }
    return *this;
  }
  // Assigns by moving; `other` is left empty.
  String& operator=(String&& other) noexcept {
    if (this != &other) {
      String moved(std::move(other));
      swap(moved);
    }
    return *this;
  }
  ~String() {
    if (!isInline()) releaseSlow();
  }

  // The bytes of the text; they are not followed by a NUL.
  const char* data() const noexcept {
    return isInline() ? bytes_ : static_cast<const char*>(pointer());
  }
  // The length in bytes (length() alike) and the bytes as a range; [] does not check `i`.
  std::size_t size() const noexcept { return isInline() ? tag() : outOfLineSize(); }
  std::size_t length() const noexcept { return size(); }
  bool empty() const noexcept { return size() == 0; }
  const char* begin() const noexcept { return data(); }
  const char* end() const noexcept { return data() + size(); }
  char operator[](std::size_t i) const noexcept { return data()[i]; }

  // The text as a view, valid while this String lives unchanged, or copied out by str().
  std::string_view view() const noexcept { return {data(), size()}; }
  operator std::string_view() const noexcept { return view(); }
  std::string str() const { return std::string(view()); }
  // Implicit, as a std::string argument is the common case; it copies.
  operator std::string() const { return str(); }

  // Exchanges the texts of two strings; never allocates.
  void swap(String& other) noexcept {
    unsigned char t[sizeof bytes_];
    std::memcpy(t, bytes_, sizeof t);
    std::memcpy(bytes_, other.bytes_, sizeof t);
    std::memcpy(other.bytes_, t, sizeof t);
  }

  // One overload per argument type, so that no comparison needs a
  // conversion that could go two ways.
  friend KIVI_EXPORT bool operator==(const String& a, const String& b) noexcept {
    return a.view() == b.view();
  }
  friend KIVI_EXPORT bool operator==(const String& a, std::string_view b) noexcept {
    return a.view() == b;
  }
  friend KIVI_EXPORT bool operator==(const String& a, const std::string& b) noexcept {
    return a.view() == b;
  }
  friend KIVI_EXPORT bool operator==(const String& a, const char* b) noexcept {
    return a.view() == std::string_view(b ? b : "");
  }
  friend std::strong_ordering operator<=>(const String& a, const String& b) noexcept {
    return a.view().compare(b.view()) <=> 0;
  }
  friend std::strong_ordering operator<=>(const String& a, std::string_view b) noexcept {
    return a.view().compare(b) <=> 0;
  }
  friend std::strong_ordering operator<=>(const String& a, const std::string& b) noexcept {
    return a.view().compare(b) <=> 0;
  }
  friend std::strong_ordering operator<=>(const String& a, const char* b) noexcept {
    return a.view().compare(b ? b : "") <=> 0;
  }
  friend std::string operator+(const String& a, std::string_view b) {
    std::string s(a.view());
    s += b;
    return s;
  }
  friend std::string operator+(std::string_view a, const String& b) {
    std::string s(a);
    s += b.view();
    return s;
  }
  friend KIVI_EXPORT std::ostream& operator<<(std::ostream& out, const String& s);

 private:
  friend class detail::DocumentBuilder;
  friend class Value;
  // bytes_[22] holds the inline length (0…22) or one of these marks; an
  // out-of-line string keeps its pointer in bytes 0–7 and its length in 8–15.
  static constexpr std::size_t kTagByte = 22;
  static constexpr unsigned char kShared = 0x80;    // a reference-counted block
  static constexpr unsigned char kBorrowed = 0x81;  // text in a document's arena

  bool isInline() const noexcept { return tag() <= kInlineCapacity; }
  const void* pointer() const noexcept {
    const void* p;
    std::memcpy(&p, bytes_, sizeof p);
    return p;
  }
  std::size_t outOfLineSize() const noexcept {
    std::size_t n;
    std::memcpy(&n, bytes_ + 8, sizeof n);
    return n;
  }
  void setOutOfLine(const void* p, std::size_t n, unsigned char mark) noexcept {
    std::memcpy(bytes_, &p, sizeof p);
    std::memcpy(bytes_ + 8, &n, sizeof n);
    bytes_[kTagByte] = static_cast<char>(mark);
  }
  void copySlow(const String& other);
  void releaseSlow() noexcept;

  unsigned char tag() const noexcept { return static_cast<unsigned char>(bytes_[kTagByte]); }

  char bytes_[23];
};
static_assert(sizeof(String) == 23);

}  // namespace kivi
