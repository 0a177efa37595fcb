// KivNSUserDefaultsProtocol: the application's stored preferences, read and
// written by key. Values are property-list values (kivi::Value: numbers,
// strings, data, dates, arrays, dictionaries).
//
// The library implements it only by its double, MockKivNSUserDefaults; a
// host implements it over its settings store.
//
//   defaults->setBool(true, "didShowConsent");
//   if (!defaults->boolForKey("didShowConsent")) showConsent();
//
// Readers answer the platform's "nothing stored" values: the null marker,
// 0, false, null, an empty string, array, dictionary or data.
//
// Thread contract: that of the implementation; the platform's defaults may
// be used from any thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivNSUserDefaultsProtocol {
 public:
  virtual ~KivNSUserDefaultsProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Any value under `defaultName`; reading answers the null marker when
  // nothing is stored.
  virtual void setObject(const Value& value, const std::string& defaultName) = 0;
  virtual Value objectForKey(const std::string& defaultName) = 0;
  // An integer under `defaultName`; reading answers 0 when none is stored.
  virtual void setInteger(std::int64_t value, const std::string& defaultName) = 0;
  virtual std::int64_t integerForKey(const std::string& defaultName) = 0;
  // A boolean under `defaultName`; reading answers false when none is
  // stored.
  virtual void setBool(bool value, const std::string& defaultName) = 0;
  virtual bool boolForKey(const std::string& defaultName) = 0;
  // A URL under `defaultName`; reading answers null when none is stored.
  virtual void setURL(const URLPtr& url, const std::string& defaultName) = 0;
  virtual URLPtr URLForKey(const std::string& defaultName) = 0;
  // The value under `defaultName` as a string, array, dictionary, data or
  // array of strings; empty when nothing of that type is stored.
  virtual std::string stringForKey(const std::string& defaultName) = 0;
  virtual Array arrayForKey(const std::string& defaultName) = 0;
  virtual Dictionary dictionaryForKey(const std::string& defaultName) = 0;
  virtual Data dataForKey(const std::string& defaultName) = 0;
  virtual std::vector<std::string> stringArrayForKey(const std::string& defaultName) = 0;
  // The number under `defaultName`; 0 when none is stored.
  virtual float floatForKey(const std::string& defaultName) = 0;
  virtual double doubleForKey(const std::string& defaultName) = 0;
  // Removes the value under `defaultName`: readers answer "nothing stored"
  // again.
  virtual void removeObjectForKey(const std::string& defaultName) = 0;
  // Removes every value of the domain `domainName` (an application's
  // identifier).
  virtual void removePersistentDomainForName(const std::string& domainName) = 0;
  // The value `keyPath` reaches: its first key names a stored value, each
  // further dot-separated key looks into the dictionary found so far; the
  // null marker when nothing is there.
  virtual Value valueForKeyPath(const std::string& keyPath) = 0;
};

}  // namespace kivi
