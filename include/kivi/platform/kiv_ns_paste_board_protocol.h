// KivNSPasteBoardProtocol: the clipboard, for putting text on it.
//
// Linux toolkits own the clipboard, so the library has no default
// implementation: a host implements the interface over its toolkit (or uses
// MockKivNSPasteBoard in tests).
//
//   board->prepareForNewContents(0);
//   board->setString(token, kivi::NSPasteboardTypeString);
//
// Thread contract: call on the main thread.
#pragma once

#include <cstdint>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

class KIVI_EXPORT KivNSPasteBoardProtocol {
 public:
  virtual ~KivNSPasteBoardProtocol() = default;

  // Puts `string` on the clipboard as `type`; false when it was refused.
  virtual bool setString(const std::string& string, const NSPasteboardType& type) = 0;
  // Clears the clipboard for new contents; answers its new change count.
  virtual std::int64_t prepareForNewContents(NSPasteboardContentsOptions options) = 0;
};

}  // namespace kivi
