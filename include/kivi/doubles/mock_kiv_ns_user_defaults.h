// MockKivNSUserDefaults: a scriptable KivNSUserDefaultsProtocol with no
// storage of its own: a value set is not seen by a later read unless the
// host's callbacks arrange it. Each operation answers its callback; without
// one, setters and removers do nothing and readers answer "nothing stored"
// (the null marker, 0, false, null, empty).
//
//   auto defaults = std::make_shared<kivi::MockKivNSUserDefaults>();
//   std::map<std::string, bool> flags;
//   defaults->setBoolForKeyBlock = [&](bool v, const std::string& k) { flags[k] = v; };
//   defaults->boolForKeyBlock = [&](const std::string& k) { return flags[k]; };
//   consent.setDefaults(defaults);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_ns_user_defaults_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSUserDefaults : public Object, public KivNSUserDefaultsProtocol {
 public:
  MockKivNSUserDefaults() = default;

  // Called by setObject(value, defaultName); without it nothing is stored.
  std::function<void(const Value&, const std::string&)> setObjectForKeyBlock;
  // Answers objectForKey(defaultName); without it, the null marker.
  std::function<Value(const std::string&)> objectForKeyBlock;
  // Called by setInteger(value, defaultName); without it nothing is stored.
  std::function<void(std::int64_t, const std::string&)> setIntegerForKeyBlock;
  // Answers integerForKey(defaultName); without it, 0.
  std::function<std::int64_t(const std::string&)> integerForKeyBlock;
  // Called by setBool(value, defaultName); without it nothing is stored.
  std::function<void(bool, const std::string&)> setBoolForKeyBlock;
  // Answers boolForKey(defaultName); without it, false.
  std::function<bool(const std::string&)> boolForKeyBlock;
  // Called by setURL(url, defaultName); without it nothing is stored.
  std::function<void(const URLPtr&, const std::string&)> setURLForKeyBlock;
  // Answers URLForKey(defaultName); without it, null.
  std::function<URLPtr(const std::string&)> urlForKeyBlock;
  // Answers stringForKey(defaultName); without it, "".
  std::function<std::string(const std::string&)> stringForKeyBlock;
  // Answers arrayForKey(defaultName); without it, an empty array.
  std::function<Array(const std::string&)> arrayForKeyBlock;
  // Answers dictionaryForKey(defaultName); without it, an empty dictionary.
  std::function<Dictionary(const std::string&)> dictionaryForKeyBlock;
  // Answers dataForKey(defaultName); without it, empty data.
  std::function<Data(const std::string&)> dataForKeyBlock;
  // Answers stringArrayForKey(defaultName); without it, an empty list.
  std::function<std::vector<std::string>(const std::string&)> stringArrayForKeyBlock;
  // Answers floatForKey(defaultName); without it, 0.
  std::function<float(const std::string&)> floatForKeyBlock;
  // Answers doubleForKey(defaultName); without it, 0.
  std::function<double(const std::string&)> doubleForKeyBlock;
  // Called by removeObjectForKey(defaultName); without it nothing happens.
  std::function<void(const std::string&)> removeObjectForKeyBlock;
  // Called by removePersistentDomainForName(domainName); without it nothing happens.
  std::function<void(const std::string&)> removePersistentDomainForNameBlock;
  // Answers valueForKeyPath(keyPath); without it, the null marker.
  std::function<Value(const std::string&)> valueForKeyPathBlock;

  std::string description() const override { return Object::description(); }

  void setObject(const Value& value, const std::string& defaultName) override {
    if (setObjectForKeyBlock) setObjectForKeyBlock(value, defaultName);
  }
  Value objectForKey(const std::string& defaultName) override {
    return objectForKeyBlock ? objectForKeyBlock(defaultName) : Value();
  }
  void setInteger(std::int64_t value, const std::string& defaultName) override {
    if (setIntegerForKeyBlock) setIntegerForKeyBlock(value, defaultName);
  }
  std::int64_t integerForKey(const std::string& defaultName) override {
    return integerForKeyBlock ? integerForKeyBlock(defaultName) : 0;
  }
  void setBool(bool value, const std::string& defaultName) override {
    if (setBoolForKeyBlock) setBoolForKeyBlock(value, defaultName);
  }
  bool boolForKey(const std::string& defaultName) override {
    return boolForKeyBlock ? boolForKeyBlock(defaultName) : false;
  }
  void setURL(const URLPtr& url, const std::string& defaultName) override {
    if (setURLForKeyBlock) setURLForKeyBlock(url, defaultName);
  }
  URLPtr URLForKey(const std::string& defaultName) override {
    return urlForKeyBlock ? urlForKeyBlock(defaultName) : nullptr;
  }
  std::string stringForKey(const std::string& defaultName) override {
    return stringForKeyBlock ? stringForKeyBlock(defaultName) : std::string();
  }
  Array arrayForKey(const std::string& defaultName) override {
    return arrayForKeyBlock ? arrayForKeyBlock(defaultName) : Array();
  }
  Dictionary dictionaryForKey(const std::string& defaultName) override {
    return dictionaryForKeyBlock ? dictionaryForKeyBlock(defaultName) : Dictionary();
  }
  Data dataForKey(const std::string& defaultName) override {
    return dataForKeyBlock ? dataForKeyBlock(defaultName) : Data();
  }
  std::vector<std::string> stringArrayForKey(const std::string& defaultName) override {
    if (stringArrayForKeyBlock) return stringArrayForKeyBlock(defaultName);
    return {};
  }
  float floatForKey(const std::string& defaultName) override {
    return floatForKeyBlock ? floatForKeyBlock(defaultName) : 0.0f;
  }
  double doubleForKey(const std::string& defaultName) override {
    return doubleForKeyBlock ? doubleForKeyBlock(defaultName) : 0.0;
  }
  void removeObjectForKey(const std::string& defaultName) override {
    if (removeObjectForKeyBlock) removeObjectForKeyBlock(defaultName);
  }
  void removePersistentDomainForName(const std::string& domainName) override {
    if (removePersistentDomainForNameBlock) removePersistentDomainForNameBlock(domainName);
  }
  Value valueForKeyPath(const std::string& keyPath) override {
    return valueForKeyPathBlock ? valueForKeyPathBlock(keyPath) : Value();
  }
};

}  // namespace kivi
