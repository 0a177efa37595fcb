// MockKivNSBundle: a scriptable KivNSBundleProtocol.
//
// objectForInfoDictionaryKey() answers infoDictionaryObjectForKeyBlock and
// the three read-only properties answer bundleIdentifierBlock,
// bundlePathBlock and executableArchitecturesBlock. Without them the answers
// are the null marker, nullopt, "" and nullopt.
//
//   auto bundle = std::make_shared<kivi::MockKivNSBundle>();
//   bundle->bundleIdentifierBlock = [] { return std::optional<std::string>("org.example.App"); };
//   bundle->infoDictionaryObjectForKeyBlock = [](const std::string& key) {
//     return key == "CFBundleShortVersionString" ? kivi::Value("2.1") : kivi::Value();
//   };
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/desktop/kiv_ns_bundle_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivNSBundle : public Object, public KivNSBundleProtocol {
 public:
  MockKivNSBundle() = default;

  // Answers objectForInfoDictionaryKey(key); without it, the null marker.
  std::function<Value(const std::string&)> infoDictionaryObjectForKeyBlock;
  // Answers bundleIdentifier(); without it, nullopt.
  std::function<std::optional<std::string>()> bundleIdentifierBlock;
  // Answers executableArchitectures(); without it, nullopt.
  std::function<std::optional<std::vector<std::int64_t>>()> executableArchitecturesBlock;
  // Answers bundlePath(); without it, "".
  std::function<std::string()> bundlePathBlock;

  std::optional<std::string> bundleIdentifier() override {
    return bundleIdentifierBlock ? bundleIdentifierBlock() : std::nullopt;
  }
  std::string bundlePath() override { return bundlePathBlock ? bundlePathBlock() : std::string(); }
  std::optional<std::vector<std::int64_t>> executableArchitectures() override {
    if (executableArchitecturesBlock) return executableArchitecturesBlock();
    return std::nullopt;
  }
  Value objectForInfoDictionaryKey(const std::string& key) override {
    return infoDictionaryObjectForKeyBlock ? infoDictionaryObjectForKeyBlock(key) : Value();
  }
};

}  // namespace kivi
