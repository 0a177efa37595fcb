// MockKivNSPasteBoard: a scriptable KivNSPasteBoardProtocol.
//
// setString() answers pasteBoardServiceBlock and prepareForNewContents()
// answers prepareForNewContentBlock; without them they answer false and 0.
// Nothing reaches the real clipboard.
//
//   auto board = std::make_shared<kivi::MockKivNSPasteBoard>();
//   std::string copied;
//   board->pasteBoardServiceBlock = [&](const std::string& s, const kivi::NSPasteboardType&) {
//     copied = s;
//     return true;
//   };
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_paste_board_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSPasteBoard : public Object, public KivNSPasteBoardProtocol {
 public:
  MockKivNSPasteBoard() = default;

  // Answers setString(string, type); without it, false.
  std::function<bool(const std::string&, const NSPasteboardType&)> pasteBoardServiceBlock;
  // Answers prepareForNewContents(options); without it, 0.
  std::function<std::int64_t(NSPasteboardContentsOptions)> prepareForNewContentBlock;

  bool setString(const std::string& string, const NSPasteboardType& type) override {
    return pasteBoardServiceBlock ? pasteBoardServiceBlock(string, type) : false;
  }
  std::int64_t prepareForNewContents(NSPasteboardContentsOptions options) override {
    return prepareForNewContentBlock ? prepareForNewContentBlock(options) : 0;
  }
};

}  // namespace kivi
