// Small stateless operations on strings, byte data and arrays that the rest
// of the library and its hosts share: trimming and case-insensitive
// comparison, splitting into trimmed parts, SHA-256 digests as hexadecimal
// text, three base64 forms, filters over heterogeneous arrays, and removing
// duplicates from a typed array.
//
// Each operation takes the value it works on first and returns a new value;
// none changes its arguments. Strings are UTF-8; a string's "length" counts
// UTF-16 code units, so an empty string is one of zero bytes. Operations that
// must read a string as UTF-8 text give std::nullopt when it is not valid
// UTF-8.
//
// The three base64 forms of the same bytes:
//
//   text   standard (+ / =)   URL-safe (- _, no padding)   vrel (_ ! and - for =)
//   "a"    "YQ=="             "YQ"                         "YQ--"
//   "??>"  "Pz8+"             "Pz8-"                       "Pz8_"
//   "???"  "Pz8/"             "Pz8_"                       "Pz8!"
//
//   using namespace kivi;
//   KivUtils::trim("\u00a0 a b\n");                              // "a b"
//   KivUtils::trimmedCommponentsSeparatedByString(" a , ,b ", ","); // {"a", "b"}
//   KivUtils::vrelBase64URLEncodedStringFromString("a");          // "YQ--"
//   KivUtils::decodeFromVrelBase64URLEncodedString("YQ--");       // "a"
//   KivUtils::sha256Hash("abc");                                  // "ba7816bf…15ad"
//
//   Array mixed{Value("x"), Value(1), Value(Dictionary{})};
//   KivUtils::subArrayOfStrings(mixed);                           // {"x"}
//   KivUtils::subarrayWithObjectsPassingTest(mixed,
//       [](const Value&, std::size_t index, bool* stop) { *stop = index == 1; return true; });
//                                                                 // {"x", 1}
//   KivUtils::removingDuplicates(std::vector<int>{3, 1, 3, 2, 1}); // {3, 1, 2}
//
// Thread contract: every operation is pure and may run on any thread at once.
// The test of subarrayWithObjectsPassingTest runs on the calling thread.
#pragma once

#include <concepts>
#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi::KivUtils {

// ---- Strings ----

// SHA-256 of the string's UTF-8 bytes as 64 lowercase hexadecimal digits;
// std::nullopt when the string is not valid UTF-8.
KIVI_EXPORT std::optional<std::string> sha256Hash(std::string_view string);

// The string without leading and trailing white space and line breaks (the
// Unicode set: category Zs, U+0009–U+000D, U+0085, U+2028, U+2029).
KIVI_EXPORT std::string trim(std::string_view string);

// Whether the strings are equal ignoring case, treating canonically
// equivalent forms as equal ("É" equals "e" + U+0301), whatever the locale.
// No trimming. Text that is not valid UTF-8 equals only the same bytes.
KIVI_EXPORT bool isCaseInsensitiveEqualToString(std::string_view string, std::string_view other);

// The string split at every occurrence of `separator` (literally; an empty
// separator never occurs), each part trimmed, empty parts dropped. Null when
// no part remains.
KIVI_EXPORT std::optional<std::vector<std::string>> trimmedCommponentsSeparatedByString(
    std::string_view string, std::string_view separator);

// Standard base64 of the UTF-8 bytes, padded, without line breaks; null when
// the string is not valid UTF-8.
KIVI_EXPORT std::optional<std::string> encodeIntoBase64String(std::string_view string);

// The text that strict standard base64 encodes (see kivi/text/base64.h);
// null when the string is not such base64 or the bytes are not valid UTF-8.
KIVI_EXPORT std::optional<std::string> decodeFromBase64String(std::string_view string);

// URL-safe base64 turned into standard base64 text, nothing decoded: "-" and
// "_" become "+" and "/", and "=" is appended until the length is a multiple
// of four.
KIVI_EXPORT std::string base64FromBase64URLEncodedString(std::string_view string);

// URL-safe base64 of the UTF-8 bytes ("-" and "_" for "+" and "/"), without
// padding; null when the string is not valid UTF-8.
KIVI_EXPORT std::optional<std::string> base64URLEncodedStringFromString(std::string_view string);

// vrel base64 of the UTF-8 bytes: "_", "!" and "-" for "+", "/" and "=";
// null when the string is not valid UTF-8.
KIVI_EXPORT std::optional<std::string> vrelBase64URLEncodedStringFromString(
    std::string_view string);

// The text of vrel base64: "_", "!" and "-" become "+", "/" and "=", and the
// result is decoded as decodeFromBase64String does (no padding is added).
KIVI_EXPORT std::optional<std::string> decodeFromVrelBase64URLEncodedString(
    std::string_view string);

// The string itself when it is not empty, else the empty string.
KIVI_EXPORT std::string stringOrEmptyString(const std::optional<std::string>& string);

// Whether the string is null, or empty after trim().
KIVI_EXPORT bool isNilOrEmptyString(const std::optional<std::string>& string);

// ---- Byte data ----

// SHA-256 of the bytes as 64 lowercase hexadecimal digits.
KIVI_EXPORT std::string sha256AsString(const Data& data);

// ---- Heterogeneous arrays ----

// Whether some string element, trimmed, equals the trimmed needle as
// isCaseInsensitiveEqualToString() compares. Other kinds never match.
KIVI_EXPORT bool trimmedCaseInsensitiveContains(const Array& array, std::string_view needle);

// A test for subarrayWithObjectsPassingTest(): called with an element, its index and a
// `stop` flag to set; answers whether the element passes.
template <typename F>
concept ElementTest = std::predicate<F&, const Value&, std::size_t, bool*>;

// The elements for which `test(element, index, &stop)` returns true, in
// order. Once the test sets `stop`, no further element is tested; the answer
// of that call still counts.
template <ElementTest Test>
Array subarrayWithObjectsPassingTest(const Array& array, Test&& test) {
  Array passing;
  bool stop = false;
  for (std::size_t index = 0; index < array.size() && !stop; ++index) {
    if (std::invoke(test, array[index], index, &stop)) passing.push_back(array[index]);
  }
  return passing;
}

// The elements that are dictionaries, and those that are strings, in order.
KIVI_EXPORT Array subArrayOfDictionaries(const Array& array);
KIVI_EXPORT Array subArrayOfStrings(const Array& array);

// ---- Typed arrays ----

// The first occurrence of every value, in the order of first occurrence;
// values are the same when std::hash and == say so.
template <typename T>
std::vector<T> removingDuplicates(const std::vector<T>& array) {
  struct RefHash {
    std::size_t operator()(const T& value) const { return std::hash<T>{}(value); }
  };
  std::unordered_set<std::reference_wrapper<const T>, RefHash, std::equal_to<T>> seen;
  seen.reserve(array.size());
  std::vector<T> unique;
  for (const T& element : array) {
    if (seen.insert(std::cref(element)).second) unique.push_back(element);
  }
  return unique;
}

}  // namespace kivi::KivUtils
