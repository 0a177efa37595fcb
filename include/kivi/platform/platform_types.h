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

// Opaque user-interface handles.
class KIVI_EXPORT NSWindow : public Object {
 public:
  NSWindow() = default;
  std::string className() const override { return "NSWindow"; }
};
class KIVI_EXPORT NSView : public Object {
 public:
  NSView() = default;
  std::string className() const override { return "NSView"; }
};
class KIVI_EXPORT NSViewController : public Object {
 public:
  NSViewController() = default;
  std::string className() const override { return "NSViewController"; }
};
class KIVI_EXPORT NSImage : public Object {
 public:
  NSImage() = default;
  std::string className() const override { return "NSImage"; }
};
class KIVI_EXPORT NSButton : public Object {
 public:
  NSButton() = default;
  std::string className() const override { return "NSButton"; }
};

// An input event. Only its type is known here (one of the NSEventType
// values below); a host's subclass carries the rest.
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

class KIVI_EXPORT NSEvent : public Object {
 public:
  explicit NSEvent(NSEventType type = 0) : type_(type) {}
  NSEventType type() const noexcept { return type_; }
  std::string className() const override { return "NSEvent"; }

 private:
  const NSEventType type_;
};
using NSEventPtr = std::shared_ptr<NSEvent>;

// The event types a monitor receives: the bit 1 << type of each.
using NSEventMask = std::uint64_t;
constexpr NSEventMask NSEventMaskFromType(NSEventType type) noexcept {
  return type < 64 ? (NSEventMask{1} << type) : 0;
}
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
  std::string name;
  std::function<void(const ObjectPtr& target, const ObjectPtr& argument)> invoke;
};

// A notification: its name, the object it is about (null for none) and
// extra information.
class KIVI_EXPORT NSNotification : public Object {
 public:
  NSNotification(std::string name, ObjectPtr object, Dictionary userInfo = {})
      : name_(std::move(name)), object_(std::move(object)), userInfo_(std::move(userInfo)) {}
  const std::string& name() const noexcept { return name_; }
  const ObjectPtr& object() const noexcept { return object_; }
  const Dictionary& userInfo() const noexcept { return userInfo_; }
  std::string className() const override { return "NSNotification"; }

 private:
  const std::string name_;
  const ObjectPtr object_;
  const Dictionary userInfo_;
};
using NSNotificationPtr = std::shared_ptr<const NSNotification>;

// The progress of a piece of work, in units: done when completed reaches
// total. A total of 0 (the start) means "not known yet".
class KIVI_EXPORT NSProgress : public Object {
 public:
  explicit NSProgress(std::int64_t totalUnitCount = 0) : total_(totalUnitCount) {}
  static std::shared_ptr<NSProgress> progressWithTotalUnitCount(std::int64_t count) {
    return std::make_shared<NSProgress>(count);
  }
  std::int64_t totalUnitCount() const noexcept { return total_.load(); }
  void setTotalUnitCount(std::int64_t count) noexcept { total_.store(count); }
  std::int64_t completedUnitCount() const noexcept { return completed_.load(); }
  void setCompletedUnitCount(std::int64_t count) noexcept { completed_.store(count); }
  std::string className() const override { return "NSProgress"; }

 private:
  std::atomic<std::int64_t> total_;
  std::atomic<std::int64_t> completed_{0};
};
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
using NSItemProviderReadingPtr = std::shared_ptr<NSItemProviderReading>;

// The class of such objects, as an item provider is handed it: its name,
// the type identifiers it reads (in order of preference), and how an object
// is made from data of one of them (null with `*error` set when it cannot).
struct KIVI_EXPORT NSItemProviderReadingClass {
  std::string className;
  std::vector<std::string> readableTypeIdentifiersForItemProvider;
  std::function<NSItemProviderReadingPtr(const Data& data, const std::string& typeIdentifier,
                                         ErrorPtr* error)>
      objectWithItemProviderData;
};

}  // namespace kivi
