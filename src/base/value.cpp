#include "kivi/base/value.h"

#include <charconv>
#include <chrono>
#include <cmath>
#include <limits>
#include <tuple>
#include <utility>
#include <vector>

#include "kivi/base/object.h"

namespace kivi {

Date Date::now() noexcept {
  const auto since = std::chrono::system_clock::now().time_since_epoch();
  return Date{std::chrono::duration<double>(since).count()};
}

bool Number::boolValue() const noexcept {
  switch (type_) {
    case Type::Double:
      return d_ != 0;
    default:
      return i_ != 0;
  }
}

std::int64_t Number::longLongValue() const noexcept {
  switch (type_) {
    case Type::UInt:
      return u_ > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())
                 ? std::numeric_limits<std::int64_t>::max()
                 : static_cast<std::int64_t>(u_);
    case Type::Double:
      if (std::isnan(d_)) return 0;
      if (d_ >= 9223372036854775808.0) return std::numeric_limits<std::int64_t>::max();
      if (d_ < -9223372036854775808.0) return std::numeric_limits<std::int64_t>::min();
      return static_cast<std::int64_t>(d_);
    default:
      return i_;
  }
}

std::uint64_t Number::unsignedLongLongValue() const noexcept {
  switch (type_) {
    case Type::UInt:
      return u_;
    case Type::Double:
      if (std::isnan(d_) || d_ <= -1.0) return static_cast<std::uint64_t>(longLongValue());
      if (d_ >= 18446744073709551616.0) return std::numeric_limits<std::uint64_t>::max();
      return static_cast<std::uint64_t>(d_);
    default:
      return static_cast<std::uint64_t>(i_);  // two's complement, as the platform
  }
}

double Number::doubleValue() const noexcept {
  switch (type_) {
    case Type::UInt:
      return static_cast<double>(u_);
    case Type::Double:
      return d_;
    default:
      return static_cast<double>(i_);
  }
}

std::string Number::stringValue() const {
  switch (type_) {
    case Type::UInt:
      return std::to_string(u_);
    case Type::Double: {
      // The shortest text that reads back the same ("100", "0.1", "1e+20");
      // std::to_chars never looks at the locale's decimal point.
      char buf[32];
      return std::string(buf, std::to_chars(buf, buf + sizeof buf, d_).ptr);
    }
    default:
      return std::to_string(i_);
  }
}

bool operator==(const Number& a, const Number& b) noexcept {
  using T = Number::Type;
  if (a.type_ != T::Double && b.type_ != T::Double) {
    const bool aNegative = a.type_ != T::UInt && a.i_ < 0;
    const bool bNegative = b.type_ != T::UInt && b.i_ < 0;
    return aNegative == bNegative && a.u_ == b.u_;
  }
  if (a.type_ == T::Double && b.type_ == T::Double) return a.d_ == b.d_;
  const Number& d = a.type_ == T::Double ? a : b;
  const Number& i = a.type_ == T::Double ? b : a;
  if (std::trunc(d.d_) != d.d_) return false;
  if (i.type_ == T::UInt)
    return d.d_ >= 0 && d.d_ < 18446744073709551616.0 && static_cast<std::uint64_t>(d.d_) == i.u_;
  return d.d_ >= -9223372036854775808.0 && d.d_ < 9223372036854775808.0 &&
         static_cast<std::int64_t>(d.d_) == i.i_;
}

const Value* Value::find(std::string_view key) const noexcept {
  const Dictionary* d = asDictionary();
  if (!d) return nullptr;
  auto it = d->find(key);
  return it == d->end() ? nullptr : &it->second;
}

const Value* Value::at(std::size_t index) const noexcept {
  const Array* a = asArray();
  return a && index < a->size() ? &(*a)[index] : nullptr;
}

bool operator==(const Value& a, const Value& b) noexcept {
  // Pairs of collection elements still to compare.
  std::vector<std::pair<const Value*, const Value*>> pending;
  const Value* x = &a;
  const Value* y = &b;
  for (;;) {
    if (x->kind() != y->kind()) return false;
    bool equal = true;
    switch (x->kind()) {
      case Value::Kind::Null:
        break;
      case Value::Kind::Number:
        equal = *x->asNumber() == *y->asNumber();
        break;
      case Value::Kind::String:
        equal = *x->asString() == *y->asString();
        break;
      case Value::Kind::Data:
        equal = *x->asData() == *y->asData();
        break;
      case Value::Kind::Date:
        equal = *x->asDate() == *y->asDate();
        break;
      case Value::Kind::URL:
        equal = x->asURL<Object>()->isEqual(*y->asURL<Object>());
        break;
      case Value::Kind::Array: {
        const Array* p = x->asArray();
        const Array* q = y->asArray();
        if (p == q) break;
        if (p->size() != q->size()) return false;
        for (std::size_t i = p->size(); i-- > 0;) pending.emplace_back(&(*p)[i], &(*q)[i]);
        break;
      }
      case Value::Kind::Dictionary: {
        const Dictionary* p = x->asDictionary();
        const Dictionary* q = y->asDictionary();
        if (p == q) break;
        if (p->size() != q->size()) return false;
        for (auto i = p->begin(), j = q->begin(); i != p->end(); ++i, ++j) {
          if (i->first != j->first) return false;
          pending.emplace_back(&i->second, &j->second);
        }
        break;
      }
      case Value::Kind::Object:
        equal = *x->asObject() == *y->asObject();
        break;
    }
    if (!equal) return false;
    if (pending.empty()) return true;
    std::tie(x, y) = pending.back();
    pending.pop_back();
  }
}

namespace {

void appendQuoted(std::string& out, std::string_view s) {
  out += '"';
  for (char c : s) {
    if (c == '"' || c == '\\') out += '\\';
    out += c;
  }
  out += '"';
}

// Describes a value that is not a collection.
void describeScalar(const Value& v, std::string& out) {
  switch (v.kind()) {
    case Value::Kind::Null:
      out += "<null>";
      return;
    case Value::Kind::Number:
      out += v.asNumber()->stringValue();
      return;
    case Value::Kind::String:
      appendQuoted(out, *v.asString());
      return;
    case Value::Kind::Data: {
      static const char* hex = "0123456789abcdef";
      out += '<';
      const Data& d = *v.asData();
      for (std::size_t i = 0; i < d.size(); ++i) {
        if (i && i % 4 == 0) out += ' ';
        out += hex[d[i] >> 4];
        out += hex[d[i] & 15];
      }
      out += '>';
      return;
    }
    case Value::Kind::Date: {
      char buf[400];  // the largest double written in full fits
      char* end = std::to_chars(buf, buf + sizeof buf, v.asDate()->timeIntervalSince1970,
                                std::chars_format::fixed, 3)
                      .ptr;
      out += "<date ";
      out.append(buf, end);
      out += '>';
      return;
    }
    case Value::Kind::URL:
      out += v.asURL<Object>()->description();
      return;
    case Value::Kind::Object:
      out += (*v.asObject())->description();
      return;
    case Value::Kind::Array:
    case Value::Kind::Dictionary:
      return;
  }
}

}  // namespace

std::string Value::description() const {
  // The collections being described, innermost last.
  struct Frame {
    const Array* array;
    std::size_t index;
    Dictionary::const_iterator member, end;
  };
  std::vector<Frame> stack;
  std::string out;
  const Value* next = this;
  for (;;) {
    if (next != nullptr) {
      if (const Array* array = next->asArray()) {
        out += '(';
        stack.push_back(Frame{array, 0, {}, {}});
      } else if (const Dictionary* dictionary = next->asDictionary()) {
        out += '{';
        stack.push_back(Frame{nullptr, 0, dictionary->begin(), dictionary->end()});
      } else {
        describeScalar(*next, out);
      }
      next = nullptr;
    }
    if (stack.empty()) return out;
    Frame& f = stack.back();
    if (f.array != nullptr && f.index < f.array->size()) {
      if (f.index != 0) out += ", ";
      next = &(*f.array)[f.index++];
    } else if (f.array == nullptr && f.member != f.end) {
      if (f.index++ != 0) out += "; ";
      appendQuoted(out, f.member->first);
      out += " = ";
      next = &(f.member++)->second;
    } else {
      out += f.array != nullptr ? ')' : '}';
      stack.pop_back();
    }
  }
}

}  // namespace kivi
