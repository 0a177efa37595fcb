// KivNSRunningApplicationProtocol: the interface of the one type-level
// lookup of running applications by bundle identifier, so that code that
// asks "is my helper already running?" can be handed a scripted answer.
// kivi::NSRunningApplication implements it; NSRunningApplication::
// classObject() is the object to hold.
//
//   std::shared_ptr<kivi::KivNSRunningApplicationProtocol> apps =
//       kivi::NSRunningApplication::classObject();
//   if (apps->runningApplicationsWithBundleIdentifier("org.example.Helper").empty()) startHelper();
//
// Thread contract: that of the implementation; NSRunningApplication may be
// called from any thread.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "kivi/export.h"

namespace kivi {

class NSRunningApplication;

class KIVI_EXPORT KivNSRunningApplicationProtocol {
 public:
  virtual ~KivNSRunningApplicationProtocol() = default;

  // Type-level: the running applications with `bundleIdentifier`, in no
  // particular order; empty when there are none.
  virtual std::vector<std::shared_ptr<NSRunningApplication>>
  runningApplicationsWithBundleIdentifier(const std::string& bundleIdentifier) = 0;
};

}  // namespace kivi
