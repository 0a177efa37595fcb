#include "kivi/text/format.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <system_error>

namespace kivi {
namespace {

using Kind = FormatArg::Kind;

// One conversion's flags, width, precision and character.
struct Field {
  bool minus = false;
  bool plus = false;
  bool space = false;
  bool hash = false;
  bool zero = false;
  std::size_t width = 0;
  int precision = -1;  // none
  char conversion = 0;
};

bool isDigit(char c) { return c >= '0' && c <= '9'; }

bool isConversion(char c) {
  switch (c) {
    case 'd':
    case 'i':
    case 'u':
    case 'o':
    case 'x':
    case 'X':
    case 'c':
    case 'C':
    case 's':
    case 'S':
    case '@':
    case 'f':
    case 'F':
    case 'e':
    case 'E':
    case 'g':
    case 'G':
    case 'a':
    case 'A':
    case 'p':
    case 'n':
      return true;
    default:
      return false;
  }
}

// The decimal number at `i`, which moves past it. Saturates just above
// kMaxFormatField, so the callers clamp.
int readNumber(std::string_view f, std::size_t& i) {
  int n = 0;
  for (; i < f.size() && isDigit(f[i]); ++i)
    n = std::min(n * 10 + (f[i] - '0'), kMaxFormatField + 1);
  return n;
}

// A "N$" argument number at `i` (1-based in the text, 0-based here); `i`
// moves past it only when there is one.
bool readPosition(std::string_view f, std::size_t& i, std::size_t& position) {
  if (i >= f.size() || !isDigit(f[i]) || f[i] == '0') return false;
  std::size_t j = i;
  const int n = readNumber(f, j);
  if (j >= f.size() || f[j] != '$') return false;
  position = static_cast<std::size_t>(n - 1);
  i = j + 1;
  return true;
}

// Writes prefix, zeros and body padded to the field width: with spaces on the
// left, zeros after the prefix (zeroPad), or spaces on the right (flag "-").
void emit(std::string& out, const Field& field, std::string_view prefix, std::size_t zeros,
          std::string_view body, bool zeroPad) {
  const std::size_t length = prefix.size() + zeros + body.size();
  if (field.width <= length && zeros == 0) {  // the common case: no padding at all
    if (!prefix.empty()) out.append(prefix);
    out.append(body);
    return;
  }
  const std::size_t fill = field.width > length ? field.width - length : 0;
  if (!field.minus && !zeroPad) out.append(fill, ' ');
  out.append(prefix);
  if (!field.minus && zeroPad) out.append(fill, '0');
  out.append(zeros, '0');
  out.append(body);
  if (field.minus) out.append(fill, ' ');
}

// The length of `s` without a UTF-8 sequence cut short at its end.
std::size_t withoutCutSequence(std::string_view s) {
  std::size_t k = s.size();
  int continuations = 0;
  while (k > 0 && continuations < 4 && (static_cast<unsigned char>(s[k - 1]) & 0xC0) == 0x80) {
    --k;
    ++continuations;
  }
  if (k == 0) return s.size();
  const auto lead = static_cast<unsigned char>(s[k - 1]);
  const std::size_t need = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : lead >= 0xC0 ? 2 : 1;
  return s.size() - (k - 1) < need ? k - 1 : s.size();
}

// `text` limited to `precision` bytes.
std::string_view limit(std::string_view text, int precision) {
  if (precision < 0 || text.size() <= static_cast<std::size_t>(precision)) return text;
  return text.substr(0, withoutCutSequence(text.substr(0, precision)));
}

// A C string, reading at most `precision` bytes of it when one is given.
std::string_view cStringText(const char* s, int precision) {
  if (!s) return "(null)";
  if (precision < 0) return s;
  const void* nul = std::memchr(s, 0, static_cast<std::size_t>(precision));
  if (nul) return {s, static_cast<std::size_t>(static_cast<const char*>(nul) - s)};
  const std::string_view text(s, static_cast<std::size_t>(precision));
  return text.substr(0, withoutCutSequence(text));
}

// Scratch space for one number's text.
struct NumberText {
  char chars[40];
  template <class T>
  std::string_view write(T value, int base = 10) {
    return {chars, static_cast<std::size_t>(
                       std::to_chars(chars, chars + sizeof chars, value, base).ptr - chars)};
  }
  std::string_view write(double value) {
    return {chars, static_cast<std::size_t>(std::to_chars(chars, chars + sizeof chars, value).ptr -
                                            chars)};
  }
  std::string_view address(const void* p) {
    chars[0] = '0';
    chars[1] = 'x';
    const auto bits = reinterpret_cast<std::uintptr_t>(p);
    return {chars, static_cast<std::size_t>(
                       std::to_chars(chars + 2, chars + sizeof chars, bits, 16).ptr - chars)};
  }
};

// What %@ prints for `arg`: a view of the argument, of `number` or of
// `storage`, whichever holds it. C strings are read up to `precision` bytes.
std::string_view describe(const FormatArg& arg, int precision, std::string& storage,
                          NumberText& number) {
  switch (arg.kind()) {
    case Kind::Int:
      return number.write(arg.intValue());
    case Kind::UInt:
      return number.write(arg.uintValue());
    case Kind::Double:
      return number.write(arg.doubleValue());
    case Kind::CString:
      return cStringText(arg.cStringValue(), precision);
    case Kind::String:
      return arg.stringValue();
    case Kind::Value: {
      const Value& value = arg.valueValue();
      if (const String* s = value.asString()) return *s;
      if (const Number* n = value.asNumber()) {
        switch (n->type()) {
          case Number::Type::Bool:
          case Number::Type::Int:
            return number.write(n->longLongValue());
          case Number::Type::UInt:
            return number.write(n->unsignedLongLongValue());
          case Number::Type::Double:
            return number.write(n->doubleValue());
        }
      }
      storage = value.description();
      return storage;
    }
    case Kind::Object:
      if (!arg.objectValue()) return "(null)";
      storage = arg.objectValue()->description();
      return storage;
    case Kind::Pointer:
      if (!arg.pointerValue()) return "(null)";
      return number.address(arg.pointerValue());
  }
  return {};
}

std::string_view kindName(Kind kind) {
  switch (kind) {
    case Kind::Int:
      return "int";
    case Kind::UInt:
      return "uint";
    case Kind::Double:
      return "double";
    case Kind::CString:
    case Kind::String:
      return "string";
    case Kind::Value:
      return "value";
    case Kind::Object:
      return "object";
    case Kind::Pointer:
      return "pointer";
  }
  return "?";
}

void appendMismatch(std::string& out, char conversion, const FormatArg& arg) {
  std::string storage;
  NumberText number;
  out += "%!";
  out += conversion;
  out += '(';
  out += kindName(arg.kind());
  out += '=';
  out += describe(arg, -1, storage, number);
  out += ')';
}

bool isInteger(const FormatArg& arg) { return arg.kind() == Kind::Int || arg.kind() == Kind::UInt; }

void formatInteger(std::string& out, const Field& field, const FormatArg& arg) {
  const char c = field.conversion;
  const bool isSigned = c == 'd' || c == 'i';
  bool negative = false;
  std::uint64_t magnitude = arg.uintValue();
  if (arg.kind() == Kind::Int && isSigned && arg.intValue() < 0) {
    negative = true;
    magnitude = 0 - magnitude;
  }
  const int base = c == 'o' ? 8 : (c == 'x' || c == 'X') ? 16 : 10;
  NumberText number;
  std::string_view digits;
  if (field.precision != 0 || magnitude != 0) digits = number.write(magnitude, base);
  if (c == 'X') {
    for (std::size_t k = 0; k < digits.size(); ++k) {
      char& d = number.chars[k];
      if (d >= 'a' && d <= 'f') d = static_cast<char>(d - 32);
    }
  }
  std::size_t zeros = field.precision > static_cast<int>(digits.size())
                          ? static_cast<std::size_t>(field.precision) - digits.size()
                          : 0;
  if (c == 'o' && field.hash && zeros == 0 && (digits.empty() || digits[0] != '0')) zeros = 1;

  char prefix[3];
  std::size_t prefixLength = 0;
  if (negative) {
    prefix[prefixLength++] = '-';
  } else if (isSigned && (field.plus || field.space)) {
    prefix[prefixLength++] = field.plus ? '+' : ' ';
  }
  if (field.hash && base == 16 && magnitude != 0) {
    prefix[prefixLength++] = '0';
    prefix[prefixLength++] = c;
  }
  emit(out, field, {prefix, prefixLength}, zeros, digits, field.zero && field.precision < 0);
}

void formatCharacter(std::string& out, const Field& field, const FormatArg& arg) {
  std::uint64_t cp = arg.uintValue();
  if ((arg.kind() == Kind::Int && arg.intValue() < 0) || cp > 0x10FFFF ||
      (cp >= 0xD800 && cp <= 0xDFFF)) {
    cp = 0xFFFD;
  }
  char utf8[4];
  std::size_t n;
  if (cp < 0x80) {
    utf8[0] = static_cast<char>(cp);
    n = 1;
  } else if (cp < 0x800) {
    utf8[0] = static_cast<char>(0xC0 | (cp >> 6));
    utf8[1] = static_cast<char>(0x80 | (cp & 0x3F));
    n = 2;
  } else if (cp < 0x10000) {
    utf8[0] = static_cast<char>(0xE0 | (cp >> 12));
    utf8[1] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    utf8[2] = static_cast<char>(0x80 | (cp & 0x3F));
    n = 3;
  } else {
    utf8[0] = static_cast<char>(0xF0 | (cp >> 18));
    utf8[1] = static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
    utf8[2] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    utf8[3] = static_cast<char>(0x80 | (cp & 0x3F));
    n = 4;
  }
  emit(out, field, {}, 0, {utf8, n}, false);
}

// Floating-point text is written by std::to_chars, which never looks at the
// locale. Largest text: 309 integer digits, a point and kMaxFormatField
// decimals.
constexpr std::size_t kFloatBuffer = kMaxFormatField + 512;

std::size_t toChars(char* buf, double v, std::chars_format format, int precision) {
  const auto result = std::to_chars(buf, buf + kFloatBuffer - 1, v, format, precision);
  return result.ec == std::errc() ? static_cast<std::size_t>(result.ptr - buf) : 0;
}

// Puts a decimal point before the exponent marker (or at the end) unless the
// text already has one.
void ensurePoint(char* buf, std::size_t& n, char exponentMarker) {
  const std::string_view text(buf, n);
  if (text.find('.') != std::string_view::npos) return;
  const std::size_t at = std::min(text.find(exponentMarker), n);
  std::memmove(buf + at + 1, buf + at, n - at);
  buf[at] = '.';
  ++n;
}

void formatFloat(std::string& out, const Field& field, double v) {
  const char c = field.conversion;
  const char lower = static_cast<char>(c | 0x20);
  char prefix[3];
  std::size_t prefixLength = 0;
  if (std::signbit(v)) {
    prefix[prefixLength++] = '-';
  } else if (field.plus || field.space) {
    prefix[prefixLength++] = field.plus ? '+' : ' ';
  }
  const double a = std::fabs(v);
  const bool finite = std::isfinite(a);
  char buf[kFloatBuffer];
  std::size_t n = 0;
  const int p = field.precision;
  if (!finite) {
    std::memcpy(buf, std::isnan(a) ? "nan" : "inf", 3);
    n = 3;
  } else if (lower == 'f') {
    n = toChars(buf, a, std::chars_format::fixed, p < 0 ? 6 : p);
    if (field.hash && p == 0) buf[n++] = '.';
  } else if (lower == 'e') {
    n = toChars(buf, a, std::chars_format::scientific, p < 0 ? 6 : p);
    if (field.hash) ensurePoint(buf, n, 'e');
  } else if (lower == 'g') {
    const int significant = p < 0 ? 6 : p == 0 ? 1 : p;
    if (!field.hash) {
      n = toChars(buf, a, std::chars_format::general, significant);
    } else {
      // "#" keeps the trailing zeros, so choose between the two styles by hand.
      n = toChars(buf, a, std::chars_format::scientific, significant - 1);
      const std::string_view text(buf, n);
      int exponent = 0;
      const std::size_t e = text.find('e');
      if (e != std::string_view::npos && e + 1 < n) {
        const std::size_t digits = e + (buf[e + 1] == '+' ? 2 : 1);
        std::from_chars(buf + digits, buf + n, exponent);
      }
      if (exponent < significant && exponent >= -4) {
        n = toChars(buf, a, std::chars_format::fixed, significant - 1 - exponent);
      }
      ensurePoint(buf, n, 'e');
    }
  } else {  // 'a'
    prefix[prefixLength++] = '0';
    prefix[prefixLength++] = 'x';
    const auto result =
        p < 0 ? std::to_chars(buf, buf + kFloatBuffer - 1, a, std::chars_format::hex)
              : std::to_chars(buf, buf + kFloatBuffer - 1, a, std::chars_format::hex, p);
    n = result.ec == std::errc() ? static_cast<std::size_t>(result.ptr - buf) : 0;
    if (field.hash) ensurePoint(buf, n, 'p');
  }
  if (c != lower) {
    for (std::size_t i = 0; i < n; ++i) {
      if (buf[i] >= 'a' && buf[i] <= 'z') buf[i] = static_cast<char>(buf[i] - 32);
    }
    for (std::size_t i = 0; i < prefixLength; ++i) {
      if (prefix[i] == 'x') prefix[i] = 'X';
    }
  }
  emit(out, field, {prefix, prefixLength}, 0, {buf, n}, field.zero && finite);
}

// The conversion character at `i` (a whole UTF-8 sequence when it is not
// ASCII), for markers.
std::string_view conversionText(std::string_view f, std::size_t i) {
  const auto lead = static_cast<unsigned char>(f[i]);
  std::size_t n = 1;
  const std::size_t need = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : lead >= 0xC0 ? 2 : 1;
  while (n < need && i + n < f.size() && (static_cast<unsigned char>(f[i + n]) & 0xC0) == 0x80) {
    ++n;
  }
  return f.substr(i, n);
}

class Formatter {
 public:
  Formatter(std::string& out, std::string_view format, std::span<const FormatArg> args)
      : out_(out), f_(format), args_(args) {}

  void run() {
    std::size_t i = 0;
    while (i < f_.size()) {
      const void* percent = std::memchr(f_.data() + i, '%', f_.size() - i);
      if (!percent) {
        out_.append(f_.substr(i));
        return;
      }
      const auto at = static_cast<std::size_t>(static_cast<const char*>(percent) - f_.data());
      out_.append(f_.substr(i, at - i));
      i = conversion(at);
    }
  }

 private:
  // The argument for "*" at `i` (after the star), which moves past an "N$".
  const FormatArg* starArgument(std::size_t& i) {
    std::size_t position;
    if (!readPosition(f_, i, position)) position = next_++;
    return position < args_.size() ? &args_[position] : nullptr;
  }

  // Formats the conversion that starts with the "%" at `start`; returns the
  // index after it.
  std::size_t conversion(std::size_t start) {
    const std::size_t size = f_.size();
    std::size_t i = start + 1;
    Field field;
    std::size_t position = 0;
    const bool positional = readPosition(f_, i, position);

    for (bool flags = true; flags && i < size; ++i) {
      switch (f_[i]) {
        case '-':
          field.minus = true;
          break;
        case '+':
          field.plus = true;
          break;
        case ' ':
          field.space = true;
          break;
        case '#':
          field.hash = true;
          break;
        case '0':
          field.zero = true;
          break;
        case '\'':
          break;
        default:
          flags = false;
          --i;
      }
    }

    if (i < size && f_[i] == '*') {
      ++i;
      const FormatArg* width = starArgument(i);
      if (!width || !isInteger(*width)) {
        out_ += "%!(BADWIDTH)";
      } else if (width->kind() == Kind::Int && width->intValue() < 0) {
        field.minus = true;
        field.width = static_cast<std::size_t>(std::min<std::uint64_t>(
            0 - width->uintValue(), static_cast<std::uint64_t>(kMaxFormatField)));
      } else {
        field.width =
            static_cast<std::size_t>(std::min<std::uint64_t>(width->uintValue(), kMaxFormatField));
      }
    } else {
      field.width = static_cast<std::size_t>(std::min(readNumber(f_, i), kMaxFormatField));
    }

    if (i < size && f_[i] == '.') {
      ++i;
      if (i < size && f_[i] == '*') {
        ++i;
        const FormatArg* precision = starArgument(i);
        if (!precision || !isInteger(*precision)) {
          out_ += "%!(BADPREC)";
        } else if (precision->kind() == Kind::UInt || precision->intValue() >= 0) {
          field.precision =
              static_cast<int>(std::min<std::uint64_t>(precision->uintValue(), kMaxFormatField));
        }
      } else {
        field.precision = std::min(readNumber(f_, i), kMaxFormatField);
      }
    }

    for (bool length = true; length && i < size;) {
      switch (f_[i]) {
        case 'h':
        case 'l':
        case 'q':
        case 'z':
        case 't':
        case 'j':
        case 'L':
          ++i;
          break;
        default:
          length = false;
      }
    }

    if (i >= size) {  // the text ends inside the conversion: keep it as it is
      out_.append(f_.substr(start));
      return size;
    }
    field.conversion = f_[i];
    if (field.conversion == '%') {
      out_ += '%';
      return i + 1;
    }
    if (!isConversion(field.conversion)) {
      const std::string_view verb = conversionText(f_, i);
      out_ += "%!";
      out_.append(verb);
      out_ += "(BADVERB)";
      return i + verb.size();
    }

    if (!positional) position = next_++;
    if (field.conversion == 'n') {
      out_ += "%!n(BADVERB)";
      return i + 1;
    }
    if (position >= args_.size()) {
      out_ += "%!";
      out_ += field.conversion;
      out_ += "(MISSING)";
      return i + 1;
    }
    format(field, args_[position]);
    return i + 1;
  }

  void format(const Field& field, const FormatArg& arg) {
    switch (field.conversion) {
      case 'd':
      case 'i':
      case 'u':
      case 'o':
      case 'x':
      case 'X':
        if (!isInteger(arg)) return appendMismatch(out_, field.conversion, arg);
        return formatInteger(out_, field, arg);
      case 'c':
      case 'C':
        if (!isInteger(arg)) return appendMismatch(out_, field.conversion, arg);
        return formatCharacter(out_, field, arg);
      case 's':
      case 'S':
        if (arg.kind() != Kind::CString && arg.kind() != Kind::String) {
          return appendMismatch(out_, field.conversion, arg);
        }
        [[fallthrough]];
      case '@': {
        std::string storage;
        NumberText number;
        const std::string_view text = describe(arg, field.precision, storage, number);
        return emit(out_, field, {}, 0, limit(text, field.precision), false);
      }
      case 'p': {
        if (arg.kind() != Kind::Pointer && arg.kind() != Kind::CString &&
            arg.kind() != Kind::Object) {
          return appendMismatch(out_, field.conversion, arg);
        }
        NumberText number;
        return emit(out_, field, {}, 0, number.address(arg.pointerValue()), false);
      }
      default:  // floating point
        if (arg.kind() != Kind::Double) return appendMismatch(out_, field.conversion, arg);
        return formatFloat(out_, field, arg.doubleValue());
    }
  }

  std::string& out_;
  std::string_view f_;
  std::span<const FormatArg> args_;
  std::size_t next_ = 0;  // the next unnumbered argument
};

}  // namespace

void appendFormat(std::string& out, std::string_view format, std::span<const FormatArg> args) {
  Formatter(out, format, args).run();
}

}  // namespace kivi
