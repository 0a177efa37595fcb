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

  virtual void setObject(const Value& value, const std::string& defaultName) = 0;
  virtual Value objectForKey(const std::string& defaultName) = 0;
  virtual void setInteger(std::int64_t value, const std::string& defaultName) = 0;
  virtual std::int64_t integerForKey(const std::string& defaultName) = 0;
  virtual void setBool(bool value, const std::string& defaultName) = 0;
  virtual bool boolForKey(const std::string& defaultName) = 0;
  virtual void setURL(const URLPtr& url, const std::string& defaultName) = 0;
  virtual URLPtr URLForKey(const std::string& defaultName) = 0;
  virtual std::string stringForKey(const std::string& defaultName) = 0;
  virtual Array arrayForKey(const std::string& defaultName) = 0;
  virtual Dictionary dictionaryForKey(const std::string& defaultName) = 0;
  virtual Data dataForKey(const std::string& defaultName) = 0;
  virtual std::vector<std::string> stringArrayForKey(const std::string& defaultName) = 0;
  virtual float floatForKey(const std::string& defaultName) = 0;
  virtual double doubleForKey(const std::string& defaultName) = 0;
  virtual void removeObjectForKey(const std::string& defaultName) = 0;
  virtual void removePersistentDomainForName(const std::string& domainName) = 0;
  virtual Value valueForKeyPath(const std::string& keyPath) = 0;
};

}  // namespace kivi
