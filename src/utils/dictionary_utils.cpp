#include "kivi/utils/dictionary_utils.h"

#include <cmath>
#include <cstdint>
#include <utility>

#include "kivi/text/json_serialization.h"
#include "kivi/text/unicode_text.h"

namespace kivi {
namespace {

const Value* find(const Dictionary& dictionary, JSONSupport::OptionalKey key) {
  if (!key.get()) return nullptr;
  const auto it = dictionary.find(*key.get());
  return it == dictionary.end() ? nullptr : &it->second;
}

const Value* findCaseInsensitive(const Dictionary& dictionary, std::string_view key) {
  for (const auto& entry : dictionary) {
    if (unicode::caseInsensitiveEquals(entry.first, key)) return &entry.second;
  }
  return nullptr;
}

// The platform's reading of a string as a boolean.
bool boolFromString(std::string_view text) {
  text = unicode::trimView(text);
  std::size_t i = 0;
  if (i < text.size() && (text[i] == '+' || text[i] == '-')) ++i;
  while (i < text.size() && text[i] == '0') ++i;
  if (i == text.size()) return false;
  const char c = text[i];
  return c == 'Y' || c == 'y' || c == 'T' || c == 't' || (c >= '1' && c <= '9');
}

// The number's unsigned 64-bit reading, fraction dropped; none for a negative
// number, NaN or 2^64 and beyond.
std::optional<std::uint64_t> unsignedValue(const Number& number) {
  switch (number.type()) {
    case Number::Type::Double: {
      const double d = number.doubleValue();
      if (!(d > -1.0 && d < 18446744073709551616.0)) return std::nullopt;
      return static_cast<std::uint64_t>(d);
    }
    case Number::Type::UInt:
      return number.unsignedLongLongValue();
    default: {
      const std::int64_t i = number.longLongValue();
      if (i < 0) return std::nullopt;
      return static_cast<std::uint64_t>(i);
    }
  }
}

std::optional<Date> epochDate(const Dictionary& dictionary, JSONSupport::OptionalKey key,
                              std::uint64_t unitsPerSecond) {
  const auto number = JSONSupport::jsonNumberForKey(dictionary, key);
  if (!number) return std::nullopt;
  const auto count = unsignedValue(*number);
  if (!count) return std::nullopt;
  return Date{static_cast<double>(*count / unitsPerSecond)};
}

}  // namespace

namespace CaseInsensitive {

std::optional<Value> valueForCaseInsensitiveKey(const Dictionary& dictionary,
                                                std::string_view key) {
  const Value* value = findCaseInsensitive(dictionary, key);
  return value ? std::optional<Value>(*value) : std::nullopt;
}

std::optional<Value> valueForCaseInsensitiveKey(const Dictionary& dictionary, std::string_view key,
                                                std::optional<Value> defaultValue) {
  const Value* value = findCaseInsensitive(dictionary, unicode::trimView(key));
  if (!value) return defaultValue;
  if (const String* string = value->asString(); string && string->empty()) {
    return defaultValue ? std::move(defaultValue) : std::optional<Value>(Value(""));
  }
  return *value;
}

bool boolForCaseInsensitiveKey(const Dictionary& dictionary, std::string_view key,
                               bool defaultValue) {
  const Value* value = findCaseInsensitive(dictionary, key);
  if (!value) return defaultValue;
  if (const Number* number = value->asNumber()) return number->boolValue();
  if (const String* string = value->asString()) return boolFromString(*string);
  return defaultValue;
}

Dictionary dictionaryWithLowercaseKeys(const Dictionary& dictionary) {
  Dictionary lowered;
  for (const auto& entry : dictionary) {
    lowered.insert_or_assign(unicode::toLower(entry.first), entry.second);
  }
  return lowered;
}

}  // namespace CaseInsensitive

namespace JSONSupport {

const String* jsonStringForKey(const Dictionary& dictionary, OptionalKey key) {
  const Value* value = find(dictionary, key);
  return value ? value->asString() : nullptr;
}

std::optional<Number> jsonNumberForKey(const Dictionary& dictionary, OptionalKey key) {
  const Value* value = find(dictionary, key);
  const Number* number = value ? value->asNumber() : nullptr;
  return number ? std::optional<Number>(*number) : std::nullopt;
}

bool jsonBoolForKey(const Dictionary& dictionary, OptionalKey key) {
  const auto number = jsonNumberForKey(dictionary, key);
  return number && number->boolValue();
}

const Array* jsonArrayForKey(const Dictionary& dictionary, OptionalKey key) {
  const Value* value = find(dictionary, key);
  return value ? value->asArray() : nullptr;
}

const Dictionary* jsonDictionaryForKey(const Dictionary& dictionary, OptionalKey key) {
  const Value* value = find(dictionary, key);
  return value ? value->asDictionary() : nullptr;
}

std::optional<Date> jsonDateFromUTCStringForKey(const Dictionary& dictionary, OptionalKey key) {
  const String* text = jsonStringForKey(dictionary, key);
  if (!text) return std::nullopt;
  return KivUtils::utcDateFormatter()->dateFromString(*text);
}

std::optional<Date> jsonDateFromEpochValueForKey(const Dictionary& dictionary, OptionalKey key) {
  return epochDate(dictionary, key, 1);
}

std::optional<Date> jsonDateFromEpochMillisecondsValueForKey(const Dictionary& dictionary,
                                                             OptionalKey key) {
  return epochDate(dictionary, key, 1000);
}

URLPtr jsonUrlForKey(const Dictionary& dictionary, OptionalKey key) {
  const String* text = jsonStringForKey(dictionary, key);
  if (!text) return nullptr;
  const std::string_view trimmed = unicode::trimView(*text);
  if (trimmed.empty()) return nullptr;
  return URL::URLWithString(trimmed);
}

}  // namespace JSONSupport

namespace KivUtils {

std::shared_ptr<DateFormatter> utcDateFormatter() {
  static const std::shared_ptr<DateFormatter> formatter =
      std::make_shared<DateFormatter>("yyyy-MM-dd'T'HH:mm:ss.SSSZ");
  return formatter;
}

std::optional<Value> toJSONObject(std::string_view text) {
  if (!unicode::isValidUTF8(text)) return std::nullopt;
  ErrorPtr error;
  auto value = JSONSerialization::JSONObjectWithData(text, 0, &error);
  if (value) return value;
  throw error ? std::move(error) : Error::create(CocoaErrorDomain, PropertyListReadCorruptError);
}

}  // namespace KivUtils

}  // namespace kivi
