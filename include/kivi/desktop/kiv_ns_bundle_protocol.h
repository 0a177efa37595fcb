// KivNSBundleProtocol: what a component asks of the application's bundle (its
// identifier, where it is installed, the processor types of its executable and
// the entries of its info dictionary), behind an interface so that a host can
// hand it the real bundle (NSBundle::mainBundle()) or a scriptable double.
//
//   std::shared_ptr<kivi::KivNSBundleProtocol> bundle = kivi::NSBundle::mainBundle();
//   auto id = bundle->bundleIdentifier();                  // "org.example.Viewer" or absent
//   kivi::Value version = bundle->objectForInfoDictionaryKey("CFBundleShortVersionString");
//   if (const kivi::String* text = version.asString()) show(*text);
//
// Thread contract: that of the implementation; NSBundle may be called from
// any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// The platform's processor-type numbers, as executableArchitectures() lists
// them.
inline constexpr std::int64_t NSBundleExecutableArchitectureI386 = 0x00000007;
inline constexpr std::int64_t NSBundleExecutableArchitectureX86_64 = 0x01000007;
inline constexpr std::int64_t NSBundleExecutableArchitectureARM = 0x0000000c;
inline constexpr std::int64_t NSBundleExecutableArchitectureARM64 = 0x0100000c;
inline constexpr std::int64_t NSBundleExecutableArchitecturePPC = 0x00000012;
inline constexpr std::int64_t NSBundleExecutableArchitecturePPC64 = 0x01000012;

class KIVI_EXPORT KivNSBundleProtocol {
 public:
  virtual ~KivNSBundleProtocol() = default;

  // bundleIdentifier (read-only): absent when the bundle has none.
  virtual std::optional<std::string> bundleIdentifier() = 0;
  // bundlePath (read-only).
  virtual std::string bundlePath() = 0;
  // executableArchitectures (read-only): absent when the bundle has no
  // executable or one of an unknown kind.
  virtual std::optional<std::vector<std::int64_t>> executableArchitectures() = 0;
  // objectForInfoDictionaryKey: — the null marker for a key that is absent.
  virtual Value objectForInfoDictionaryKey(const std::string& key) = 0;
};

}  // namespace kivi
