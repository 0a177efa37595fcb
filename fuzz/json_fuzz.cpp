// Feeds arbitrary bytes to the JSON reader. Beyond not crashing or leaking:
//   - a failed read always explains itself with an error, a successful one
//     never leaves one;
//   - without the fragments option exactly the texts with an array or object
//     at the top level read, to the same value as with it;
//   - the two readers agree: simdjson's (the fast one) and nlohmann's (the
//     careful one, which takes over when simdjson refuses a text). A text
//     only the careful one accepts is refused with "Invalid JSON text (...)";
//     a text only the fast one accepts fails to read once an integer beyond
//     64 bits sends it to the careful one; the value read must be the same,
//     number flavours and the sign of zero included;
//   - every value read writes back (compact, pretty, unescaped slashes) and
//     reads again to an equal value;
//   - the tree keeps its shape invariants: every dictionary's keys strictly
//     ascending, and a copy taken out of the document (its own storage, not
//     the document's arena) equal to it and still readable once the document
//     is gone.
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz_check.h"
#include "kivi/text/json_serialization.h"

using kivi::fuzz::check;

namespace {

std::string debugDescription(const kivi::ErrorPtr& error) {
  const auto it = error->userInfo().find(kivi::DebugDescriptionErrorKey);
  return it != error->userInfo().end() && it->second.asString() ? *it->second.asString() : "";
}

// Equal including the number flavours and the sign of zero.
bool identical(const kivi::Value& a, const kivi::Value& b) {
  if (a.kind() != b.kind()) return false;
  if (const kivi::Number* n = a.asNumber()) {
    const kivi::Number* m = b.asNumber();
    return n->type() == m->type() && *n == *m &&
           std::signbit(n->doubleValue()) == std::signbit(m->doubleValue());
  }
  if (const kivi::Array* x = a.asArray()) {
    const kivi::Array* y = b.asArray();
    if (x->size() != y->size()) return false;
    for (std::size_t i = 0; i < x->size(); ++i) {
      if (!identical((*x)[i], (*y)[i])) return false;
    }
    return true;
  }
  if (const kivi::Dictionary* x = a.asDictionary()) {
    const kivi::Dictionary* y = b.asDictionary();
    if (x->size() != y->size()) return false;
    for (auto i = x->begin(), j = y->begin(); i != x->end(); ++i, ++j) {
      if (i->first != j->first || !identical(i->second, j->second)) return false;
    }
    return true;
  }
  return a == b;
}

// Every dictionary in the tree has strictly ascending keys; walks with a
// stack so that deep documents do not recurse.
bool keysAscend(const kivi::Value& root) {
  std::vector<const kivi::Value*> pending{&root};
  while (!pending.empty()) {
    const kivi::Value* v = pending.back();
    pending.pop_back();
    if (const kivi::Array* a = v->asArray()) {
      for (const kivi::Value& e : *a) pending.push_back(&e);
    } else if (const kivi::Dictionary* d = v->asDictionary()) {
      for (auto i = d->begin(); i != d->end(); ++i) {
        if (i != d->begin() && !(i[-1].first.view() < i->first.view())) return false;
        pending.push_back(&i->second);
      }
    }
  }
  return true;
}

// A deep copy made of the library's own containers, never of the arena.
kivi::Value ownCopy(const kivi::Value& v) {
  if (const kivi::Array* a = v.asArray()) {
    kivi::Array copy;
    for (const kivi::Value& e : *a) copy.push_back(ownCopy(e));
    return kivi::Value(std::move(copy));
  }
  if (const kivi::Dictionary* d = v.asDictionary()) {
    kivi::Dictionary copy;
    for (const auto& [key, member] : *d) copy.emplace(kivi::String(key.view()), ownCopy(member));
    return kivi::Value(std::move(copy));
  }
  if (const kivi::String* s = v.asString()) return kivi::Value(std::string(s->view()));
  return v;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using kivi::JSONSerialization;
  const std::string_view text(reinterpret_cast<const char*>(data), size);

  kivi::ErrorPtr strictError;
  const auto strict = JSONSerialization::JSONObjectWithData(text, 0, &strictError);
  check(strict.has_value() != (strictError != nullptr), "strict read: value xor error", text);

  kivi::ErrorPtr error;
  const auto value =
      JSONSerialization::JSONObjectWithData(text, kivi::JSONReadingFragmentsAllowed, &error);
  check(value.has_value() != (error != nullptr), "read: value xor error", text);
  if (!value) {
    check(!strict, "the fragments option refused what reads without it", text);
    check(error->code() == kivi::PropertyListReadCorruptError, "read error code", text);
    check(!debugDescription(error).starts_with("Invalid JSON text ("),
          "the careful reader accepts what the fast one refuses", text);
    return 0;
  }
  const bool container =
      value->kind() == kivi::Value::Kind::Array || value->kind() == kivi::Value::Kind::Dictionary;
  check(strict.has_value() == container, "fragments option decides only the top level", text);
  check(!strict || *strict == *value, "same value with and without the fragments option", text);
  check(JSONSerialization::isValidJSONObject(*value) == container, "isValidJSONObject", text);

  check(keysAscend(*value), "dictionary keys strictly ascending", text);
  if (value->kind() != kivi::Value::Kind::Array || value->asArray()->size() < 10000) {
    kivi::Value own = ownCopy(*value);
    kivi::Value part = value->at(0) ? *value->at(0) : *value;
    {
      auto reread =
          JSONSerialization::JSONObjectWithData(text, kivi::JSONReadingFragmentsAllowed, nullptr);
      check(reread && identical(*reread, own), "a copy made of own containers is equal", text);
      part = reread->at(0) ? *reread->at(0) : *reread;  // outlives its document
    }
    check(identical(part, value->at(0) ? *value->at(0) : *value), "a part outlives its document",
          text);
  }

  const std::string careful = "[" + std::string(text) + ",18446744073709551616]";
  const auto carefulValue = JSONSerialization::JSONObjectWithData(careful, 0, &error);
  if (carefulValue) {
    check(identical(*carefulValue->at(0), *value), "both readers read the same value", text);
  } else {
    check(debugDescription(error).starts_with("Too deeply nested"),
          "the careful reader refuses what the fast one accepts", text);
  }

  for (const kivi::JSONWritingOptions options :
       {kivi::JSONWritingFragmentsAllowed,
        kivi::JSONWritingFragmentsAllowed | kivi::JSONWritingPrettyPrinted,
        kivi::JSONWritingFragmentsAllowed | kivi::JSONWritingWithoutEscapingSlashes}) {
    const auto written = JSONSerialization::dataWithJSONObject(*value, options, &error);
    check(written.has_value() && error == nullptr, "a value read writes back", text);
    const auto back =
        JSONSerialization::JSONObjectWithData(*written, kivi::JSONReadingFragmentsAllowed, &error);
    check(back.has_value() && error == nullptr, "written text reads", text);
    check(*back == *value, "written text reads back equal", text);
  }
  return 0;
}
