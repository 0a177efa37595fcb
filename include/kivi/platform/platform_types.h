// The small handle and value types of the platform service interfaces
// (windows, panels, alerts, events, notifications, item providers): the
// least each interface needs to name what it hands over.
//
// The user-interface handles (NSWindow, NSView, NSViewController, NSImage,
// NSButton, NSEvent) are opaque: the library never looks inside them. A host
// subclasses them to carry its toolkit's objects through the interfaces:
//
//   class GtkWindowHandle : public kivi::NSWindow {
//    public:
//     explicit GtkWindowHandle(GtkWindow* w) : window(w) {}
//     GtkWindow* window;
//   };
//   panel->beginSheetModal(std::make_shared<GtkWindowHandle>(main),
//                          [](kivi::NSModalResponse r) { ... });
//
// NSProgress, NSNotification and the constants are plain values of the
// platform's meaning; Selector is a named callable that the observing code
// calls on a target.
//
// Thread contract: the handles carry no state of their own. NSProgress may
// be read and written from any thread; NSNotification is immutable.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

// A plain object with nothing but identity (an observer token, a sender).
class KIVI_EXPORT NSObject : public Object {
 public:
  NSObject() = default;
  std::string className() const override { return "NSObject"; }
};

// A top-level window.
class KIVI_EXPORT NSWindow : public Object {
 public:
  NSWindow() = default;
  std::string className() const override { return "NSWindow"; }
};
// An area of a window that shows content (an alert's accessory view).
class KIVI_EXPORT NSView : public Object {
 public:
  NSView() = default;
  std::string className() const override { return "NSView"; }
};
// What manages a view; a window shows one as its content.
class KIVI_EXPORT NSViewController : public Object {
 public:
  NSViewController() = default;
  std::string className() const override { return "NSViewController"; }
};
// An image (an alert's icon).
class KIVI_EXPORT NSImage : public Object {
 public:
  NSImage() = default;
  std::string className() const override { return "NSImage"; }
};
// A button (one of an alert's, as addButtonWithTitle() answers it).
class KIVI_EXPORT NSButton : public Object {
 public:
  NSButton() = default;
  std::string className() const override { return "NSButton"; }
};

// The type of an input event (the platform's numbers).
using NSEventType = std::uint64_t;
inline constexpr NSEventType NSEventTypeLeftMouseDown = 1;
inline constexpr NSEventType NSEventTypeLeftMouseUp = 2;
inline constexpr NSEventType NSEventTypeRightMouseDown = 3;
inline constexpr NSEventType NSEventTypeRightMouseUp = 4;
inline constexpr NSEventType NSEventTypeMouseMoved = 5;
inline constexpr NSEventType NSEventTypeKeyDown = 10;
inline constexpr NSEventType NSEventTypeKeyUp = 11;
inline constexpr NSEventType NSEventTypeFlagsChanged = 12;
inline constexpr NSEventType NSEventTypeScrollWheel = 22;

// An input event. Only its type is known here; a host's subclass carries
// the rest.
class KIVI_EXPORT NSEvent : public Object {
 public:
  // An event of `type` (0: of no known type).
  explicit NSEvent(NSEventType type = 0) : type_(type) {}
  // The type the event was made with.
  NSEventType type() const noexcept { return type_; }

  std::string className() const override { return "NSEvent"; }

 private:
  const NSEventType type_;
};
// How events are handed around; null where an event may be swallowed.
using NSEventPtr = std::shared_ptr<NSEvent>;

// The event types a monitor receives: the bit 1 << type of each.
using NSEventMask = std::uint64_t;
// The mask of one event type; 0 for a type of 64 or more, which no mask can
// hold.
constexpr NSEventMask NSEventMaskFromType(NSEventType type) noexcept {
  return type < 64 ? (NSEventMask{1} << type) : 0;
}
// The masks of single event types, and the mask of every type.
inline constexpr NSEventMask NSEventMaskLeftMouseDown =
    NSEventMaskFromType(NSEventTypeLeftMouseDown);
inline constexpr NSEventMask NSEventMaskKeyDown = NSEventMaskFromType(NSEventTypeKeyDown);
inline constexpr NSEventMask NSEventMaskKeyUp = NSEventMaskFromType(NSEventTypeKeyUp);
inline constexpr NSEventMask NSEventMaskFlagsChanged = NSEventMaskFromType(NSEventTypeFlagsChanged);
inline constexpr NSEventMask NSEventMaskScrollWheel = NSEventMaskFromType(NSEventTypeScrollWheel);
inline constexpr NSEventMask NSEventMaskAny = ~NSEventMask{0};

// A modal session's answer.
using NSModalResponse = std::int64_t;
inline constexpr NSModalResponse NSModalResponseCancel = 0;
inline constexpr NSModalResponse NSModalResponseOK = 1;
inline constexpr NSModalResponse NSModalResponseStop = -1000;
inline constexpr NSModalResponse NSModalResponseAbort = -1001;
inline constexpr NSModalResponse NSModalResponseContinue = -1002;
// An alert's answer: which of its buttons (in the order added) was chosen.
inline constexpr NSModalResponse NSAlertFirstButtonReturn = 1000;
inline constexpr NSModalResponse NSAlertSecondButtonReturn = 1001;
inline constexpr NSModalResponse NSAlertThirdButtonReturn = 1002;

// How an alert presents itself: as a warning, as information, or as a
// critical warning.
using NSAlertStyle = std::uint64_t;
inline constexpr NSAlertStyle NSAlertStyleWarning = 0;
inline constexpr NSAlertStyle NSAlertStyleInformational = 1;
inline constexpr NSAlertStyle NSAlertStyleCritical = 2;

// Pasteboard data types (uniform type identifiers) and contents options.
using NSPasteboardType = std::string;
inline constexpr const char* NSPasteboardTypeString = "public.utf8-plain-text";
inline constexpr const char* NSPasteboardTypeURL = "public.url";
inline constexpr const char* NSPasteboardTypeFileURL = "public.file-url";
inline constexpr const char* NSPasteboardTypeHTML = "public.html";
using NSPasteboardContentsOptions = std::uint64_t;
inline constexpr NSPasteboardContentsOptions NSPasteboardContentsCurrentHostOnly = 1;

// What a sharing service shares: text, URLs, data, images (as an NSImage
// object), any Value.
using NSSharingItems = std::vector<Value>;

// A named callable: the observing code calls invoke(target, argument) when
// the observed thing happens (a notification center passes the
// NSNotification as the argument). A null invoke is a selector that does
// nothing.
struct KIVI_EXPORT Selector {
  // The selector's name, for diagnostics; nothing calls it by name.
  std::string name;
  // Performs the selector on a target with an argument; null does nothing.
  std::function<void(const ObjectPtr& target, const ObjectPtr& argument)> invoke;
};

// A notification: its name, the object it is about (null for none) and
// extra information.
class KIVI_EXPORT NSNotification : public Object {
 public:
  // A notification named `name` about `object` (null for none).
  NSNotification(std::string name, ObjectPtr object, Dictionary userInfo = {})
      : name_(std::move(name)), object_(std::move(object)), userInfo_(std::move(userInfo)) {}
  // The name it was posted under.
  const std::string& name() const noexcept { return name_; }
  // The object it is about; null for none.
  const ObjectPtr& object() const noexcept { return object_; }
  // The extra information; empty for none.
  const Dictionary& userInfo() const noexcept { return userInfo_; }

  std::string className() const override { return "NSNotification"; }

 private:
  const std::string name_;
  const ObjectPtr object_;
  const Dictionary userInfo_;
};
// How notifications are handed around: shared and immutable.
using NSNotificationPtr = std::shared_ptr<const NSNotification>;

// The progress of a piece of work, in units: done when completed reaches
// total. A total of 0 (the start) means "not known yet".
class KIVI_EXPORT NSProgress : public Object {
 public:
  // A progress of the given total (0: not known yet) with nothing completed.
  explicit NSProgress(std::int64_t totalUnitCount = 0) : total_(totalUnitCount) {}
  static std::shared_ptr<NSProgress> progressWithTotalUnitCount(std::int64_t count) {
    return std::make_shared<NSProgress>(count);
  }
  // The units of the whole work; 0 while not known.
  std::int64_t totalUnitCount() const noexcept { return total_.load(); }
  void setTotalUnitCount(std::int64_t count) noexcept { total_.store(count); }
  // The units done so far (0 at first).
  std::int64_t completedUnitCount() const noexcept { return completed_.load(); }
  void setCompletedUnitCount(std::int64_t count) noexcept { completed_.store(count); }

  std::string className() const override { return "NSProgress"; }

 private:
  std::atomic<std::int64_t> total_;
  std::atomic<std::int64_t> completed_{0};
};
// How a progress is shared between the work and those who watch it.
using NSProgressPtr = std::shared_ptr<NSProgress>;

// A save or open panel's delegate. Every method is optional; the defaults
// let everything through.
class KIVI_EXPORT NSOpenSavePanelDelegate {
 public:
  virtual ~NSOpenSavePanelDelegate() = default;
  // Whether the panel shows `url` as selectable.
  virtual bool panelShouldEnableURL(const ObjectPtr& /*sender*/, const URLPtr& /*url*/) {
    return true;
  }
  // Whether the chosen `url` may be accepted; false with `*error` set to
  // keep the panel open.
  virtual bool panelValidateURL(const ObjectPtr& /*sender*/, const URLPtr& /*url*/,
                                ErrorPtr* /*error*/) {
    return true;
  }
};

// An alert's delegate.
class KIVI_EXPORT NSAlertDelegate {
 public:
  virtual ~NSAlertDelegate() = default;
  // Called when the user asks for help; true when the delegate gave it.
  virtual bool alertShowHelp(const ObjectPtr& /*alert*/) { return false; }
};

// An object an item provider can make from an item's data.
class KIVI_EXPORT NSItemProviderReading {
 public:
  virtual ~NSItemProviderReading() = default;
};
// How such an object reaches a load's completion; null when none was made.
using NSItemProviderReadingPtr = std::shared_ptr<NSItemProviderReading>;

// The class of such objects, as an item provider is handed it.
struct KIVI_EXPORT NSItemProviderReadingClass {
  // The class's name; informational (loads go by the type identifiers).
  std::string className;
  // The type identifiers it reads, in order of preference.
  std::vector<std::string> readableTypeIdentifiersForItemProvider;
  // Makes an object from data of one of those types; null with `*error` set
  // when it cannot.
  std::function<NSItemProviderReadingPtr(const Data& data, const std::string& typeIdentifier,
                                         ErrorPtr* error)>
      objectWithItemProviderData;
};

}  // namespace kivi
