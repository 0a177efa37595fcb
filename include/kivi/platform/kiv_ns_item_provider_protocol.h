// KivNSItemProviderProtocol: an item being dragged, dropped or shared, which
// hands out its contents on request, as a file or as an object.
//
// The library implements it only by its double, MockKivNSItemProvider; a
// host implements it over its toolkit's drag-and-drop data.
//
//   auto progress = provider->loadFileRepresentationForTypeIdentifier(
//       "public.image", [](const kivi::URLPtr& file, const kivi::ErrorPtr& error) {
//         if (file) importImage(file);  // the file is gone after the call
//       });
//
// Thread contract: that of the implementation; completions may arrive on
// any thread.
#pragma once

#include <functional>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

class KIVI_EXPORT KivNSItemProviderProtocol {
 public:
  virtual ~KivNSItemProviderProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Copies the item's data of type `typeIdentifier` to a temporary file and
  // calls `completionHandler` with its URL, or with null and the error; the
  // file is removed once the handler returns. Answers the load's progress.
  virtual NSProgressPtr loadFileRepresentationForTypeIdentifier(
      const std::string& typeIdentifier,
      std::function<void(const URLPtr& url, const ErrorPtr& error)> completionHandler) = 0;
  // Makes an object of `aClass` from the item's data and calls
  // `completionHandler` with it, or with null and the error. Answers the
  // load's progress.
  virtual NSProgressPtr loadObjectOfClass(
      const NSItemProviderReadingClass& aClass,
      std::function<void(const NSItemProviderReadingPtr& object, const ErrorPtr& error)>
          completionHandler) = 0;
};

}  // namespace kivi
