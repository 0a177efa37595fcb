// MockKivNSItemProvider: a scriptable KivNSItemProviderProtocol.
//
// Both load operations hand the type or class and the completion to their
// callback (loadFileRepresentationBlock, loadObjectOfClassBlock) and answer
// its progress. Without a callback the completion is not called and the
// answer is a new progress object with a total unit count of 0.
//
//   auto item = std::make_shared<kivi::MockKivNSItemProvider>();
//   item->loadFileRepresentationBlock = [&](const std::string&, auto completion) {
//     completion(kivi::URL::fileURLWithPath(fixture), nullptr);
//     return kivi::NSProgress::progressWithTotalUnitCount(1);
//   };
//   dropTarget.accept(item);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_item_provider_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSItemProvider : public Object, public KivNSItemProviderProtocol {
 public:
  MockKivNSItemProvider() = default;

  // Answers loadFileRepresentationForTypeIdentifier(typeIdentifier, completionHandler); without it,
  // a new progress and the completion is never called.
  std::function<NSProgressPtr(const std::string&,
                              std::function<void(const URLPtr&, const ErrorPtr&)>)>
      loadFileRepresentationBlock;
  // Answers loadObjectOfClass(aClass, completionHandler); without it, a new progress and the
  // completion is never called.
  std::function<NSProgressPtr(
      const NSItemProviderReadingClass&,
      std::function<void(const NSItemProviderReadingPtr&, const ErrorPtr&)>)>
      loadObjectOfClassBlock;

  std::string description() const override { return Object::description(); }

  // Loads the item's data of `typeIdentifier` as a file; here, hands both arguments to
  // loadFileRepresentationBlock.
  NSProgressPtr loadFileRepresentationForTypeIdentifier(
      const std::string& typeIdentifier,
      std::function<void(const URLPtr&, const ErrorPtr&)> completionHandler) override {
    if (loadFileRepresentationBlock) {
      return loadFileRepresentationBlock(typeIdentifier, std::move(completionHandler));
    }
    return std::make_shared<NSProgress>(0);
  }
  // Makes an object of `aClass` from the item's data; here, hands both arguments to
  // loadObjectOfClassBlock.
  NSProgressPtr loadObjectOfClass(
      const NSItemProviderReadingClass& aClass,
      std::function<void(const NSItemProviderReadingPtr&, const ErrorPtr&)> completionHandler)
      override {
    if (loadObjectOfClassBlock) return loadObjectOfClassBlock(aClass, std::move(completionHandler));
    return std::make_shared<NSProgress>(0);
  }
};

}  // namespace kivi
