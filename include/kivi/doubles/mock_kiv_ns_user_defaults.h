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

  std::function<void(const Value&, const std::string&)> setObjectForKeyBlock;
  std::function<Value(const std::string&)> objectForKeyBlock;
  std::function<void(std::int64_t, const std::string&)> setIntegerForKeyBlock;
  std::function<std::int64_t(const std::string&)> integerForKeyBlock;
  std::function<void(bool, const std::string&)> setBoolForKeyBlock;
  std::function<bool(const std::string&)> boolForKeyBlock;
  std::function<void(const URLPtr&, const std::string&)> setURLForKeyBlock;
  std::function<URLPtr(const std::string&)> urlForKeyBlock;
  std::function<std::string(const std::string&)> stringForKeyBlock;
  std::function<Array(const std::string&)> arrayForKeyBlock;
  std::function<Dictionary(const std::string&)> dictionaryForKeyBlock;
  std::function<Data(const std::string&)> dataForKeyBlock;
  std::function<std::vector<std::string>(const std::string&)> stringArrayForKeyBlock;
  std::function<float(const std::string&)> floatForKeyBlock;
  std::function<double(const std::string&)> doubleForKeyBlock;
  std::function<void(const std::string&)> removeObjectForKeyBlock;
  std::function<void(const std::string&)> removePersistentDomainForNameBlock;
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
