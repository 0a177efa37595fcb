// Forgiving, typed access to dictionaries that come from JSON documents and
// HTTP headers, JSON text parsing, and the shared date formatter:
//
//   CaseInsensitive::valueForCaseInsensitiveKey   header-style lookup
//   CaseInsensitive::boolForCaseInsensitiveKey    "YES", "true", 1 ... as bool
//   CaseInsensitive::dictionaryWithLowercaseKeys  keys lower-cased
//   JSONSupport::json…ForKey                      a member of one kind, or nothing
//   KivUtils::utcDateFormatter                    "yyyy-MM-dd'T'HH:mm:ss.SSSZ"
//   KivUtils::toJSONObject                        JSON text to an array or dictionary
//
//   auto json = kivi::KivUtils::toJSONObject(R"({"id": 7, "when": "2021-03-04T05:06:07.089Z"})");
//   const kivi::Dictionary& d = *json->asDictionary();
//   kivi::JSONSupport::jsonNumberForKey(d, "id")->longLongValue();   // 7
//   kivi::JSONSupport::jsonDateFromUTCStringForKey(d, "when");       // Date{1614834367.089}
//   kivi::CaseInsensitive::valueForCaseInsensitiveKey(headers, "content-type");
//
// Keys of a Dictionary are always strings: there is no key of another kind
// to skip in lookups or to keep as it is when lower-casing. Case-insensitive means
// unicode::caseInsensitiveEquals: full case folding and canonical equivalence,
// independent of the locale. A Dictionary enumerates its keys in byte-wise
// order; where several keys match one lookup, or lower-case to the same key,
// that order decides (see each function). Callers should not build on it.
//
// No getter converts between kinds: the string "12" is not a number, the
// number 1 is not a string, JSON true and false are numbers (of bool flavour).
// Nothing here throws, except toJSONObject() on malformed JSON.
//
// Thread contract: every function is pure apart from the shared formatter,
// which is made once on first use, even when several threads ask at once, and
// may then be used from any number of threads at the same time.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/error.h"
#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/net/url.h"
#include "kivi/text/date_formatter.h"

namespace kivi {

namespace CaseInsensitive {

// The value of the first key, in the dictionary's order, equal to `key`
// ignoring case (neither is trimmed); nullopt when none is. A stored null
// marker is returned as such.
KIVI_EXPORT std::optional<Value> valueForCaseInsensitiveKey(const Dictionary& dictionary,
                                                            std::string_view key);

// valueForCaseInsensitiveKey with `key` trimmed, then: an empty string value
// gives `defaultValue`, or the empty string when there is no default; any
// other value found is returned unchanged (the null marker, 0, an empty
// array); nothing found gives `defaultValue`.
KIVI_EXPORT std::optional<Value> valueForCaseInsensitiveKey(const Dictionary& dictionary,
                                                            std::string_view key,
                                                            std::optional<Value> defaultValue);

// The value of valueForCaseInsensitiveKey (`key` not trimmed) as a boolean:
// a number is true when it is not zero; a string is true when, after leading
// whitespace, one optional sign and any zeros, its next character is Y, y,
// T, t or a digit 1 to 9 ("YES", "true", "T", "0001", "-5" are true; "NO",
// "0", "0.9", "" are false). Anything else, or nothing, gives `defaultValue`.
KIVI_EXPORT bool boolForCaseInsensitiveKey(const Dictionary& dictionary, std::string_view key,
                                           bool defaultValue);

// A copy with every key lower-cased (unicode::toLower, locale-independent);
// values unchanged. Of keys that lower-case alike, the value of the one
// enumerated last (the greatest in byte order) is kept.
KIVI_EXPORT Dictionary dictionaryWithLowercaseKeys(const Dictionary& dictionary);

}  // namespace CaseInsensitive

namespace JSONSupport {

// A key that may be missing: a string, a C string (null means no key) or
// std::nullopt. A missing key finds nothing. Holds a view: pass it straight
// to a getter.
class KIVI_EXPORT OptionalKey {
 public:
  // No key.
  constexpr OptionalKey(std::nullopt_t = std::nullopt) noexcept {}
  constexpr OptionalKey(std::nullptr_t) noexcept {}
  // `key`, or no key when it is null.
  constexpr OptionalKey(const char* key) noexcept {
    if (key) key_ = std::string_view(key);
  }
  // `key`; an empty optional gives no key.
  constexpr OptionalKey(std::string_view key) noexcept : key_(key) {}
  OptionalKey(const std::string& key) noexcept : key_(key) {}
  constexpr OptionalKey(std::optional<std::string_view> key) noexcept : key_(key) {}
  OptionalKey(const std::optional<std::string>& key) noexcept {
    if (key) key_ = std::string_view(*key);
  }

  // The key, or std::nullopt when there is none.
  constexpr const std::optional<std::string_view>& get() const noexcept { return key_; }

 private:
  std::optional<std::string_view> key_;
};

// Each getter looks `key` up exactly (case-sensitive) and answers nothing
// when the key is missing or its value is of another kind. The pointers point
// into `dictionary` and live as long as it does.

// The string value.
KIVI_EXPORT const String* jsonStringForKey(const Dictionary& dictionary, OptionalKey key);
// Booleans included.
KIVI_EXPORT std::optional<Number> jsonNumberForKey(const Dictionary& dictionary, OptionalKey key);
// jsonNumberForKey not zero; false when there is no number.
KIVI_EXPORT bool jsonBoolForKey(const Dictionary& dictionary, OptionalKey key);
// The array value, or the dictionary value.
KIVI_EXPORT const Array* jsonArrayForKey(const Dictionary& dictionary, OptionalKey key);
KIVI_EXPORT const Dictionary* jsonDictionaryForKey(const Dictionary& dictionary, OptionalKey key);

// The string value parsed with KivUtils::utcDateFormatter(); nullopt when it
// does not match the pattern exactly.
KIVI_EXPORT std::optional<Date> jsonDateFromUTCStringForKey(const Dictionary& dictionary,
                                                            OptionalKey key);

// The number value read as an unsigned 64-bit count of seconds (the fraction
// dropped), since 1970-01-01 00:00:00 UTC. A number with no unsigned 64-bit
// reading gives nullopt: a negative one (from -1 down; -0.5 reads as 0), NaN,
// and one of 2^64 or more.
KIVI_EXPORT std::optional<Date> jsonDateFromEpochValueForKey(const Dictionary& dictionary,
                                                             OptionalKey key);

// As jsonDateFromEpochValueForKey, for a count of milliseconds; the date is
// rounded down to the whole second (1500 and 1999 give 1970-01-01 00:00:01).
KIVI_EXPORT std::optional<Date> jsonDateFromEpochMillisecondsValueForKey(
    const Dictionary& dictionary, OptionalKey key);

// The string value trimmed, as a URL (URL::URLWithString); null when it is
// empty after trimming or not a URL.
KIVI_EXPORT URLPtr jsonUrlForKey(const Dictionary& dictionary, OptionalKey key);

}  // namespace JSONSupport

namespace KivUtils {

// The process-wide formatter with the pattern "yyyy-MM-dd'T'HH:mm:ss.SSSZ"
// and neither locale nor time zone: it formats in the process's current
// default time zone and locale, with their offset, and parses the offset
// written in the text. Every call returns the same instance.
KIVI_EXPORT std::shared_ptr<DateFormatter> utcDateFormatter();

// Parses `text` as JSON with JSONSerialization's default options: the top
// level must be an array or an object. nullopt when `text` is not valid
// UTF-8. Malformed JSON (or nesting deeper than JSONSerialization::kMaxDepth)
// throws the reader's error unchanged, as an ErrorPtr in CocoaErrorDomain with
// the code PropertyListReadCorruptError; its user info's DebugDescriptionErrorKey
// tells where the text goes wrong:
//
//   try {
//     auto value = kivi::KivUtils::toJSONObject(text);
//   } catch (const kivi::ErrorPtr& error) {
//     log(error->description());
//   }
KIVI_EXPORT std::optional<Value> toJSONObject(std::string_view text);

}  // namespace KivUtils

}  // namespace kivi
