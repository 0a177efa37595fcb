// Compile-time checks that every double is a usable implementation of its
// interface and of nothing unexpected:
//   - it derives publicly from its interface (a pointer converts);
//   - it is not abstract, so every operation of the interface, inherited
//     ones included, has an implementation;
//   - it is made the way hosts make it: with a plain constructor, or with
//     exactly the extra constructor it documents (MockNSTask's termination
//     status, MockKivHttpHeaderProviderService's two maps,
//     MockKivNSXPCListener's interface and exported object);
//   - the doubles that extend another double derive from it, and the
//     class-level callbacks are static members (their address is a plain
//     pointer, shared by every object);
//   - it can be held and released through the interface (virtual
//     destructor).
// What C++ cannot check here: that a double adds no virtual function of its
// own (a class deriving from it with one more virtual function has the same
// size, since the table pointer is already there), that its callback
// properties carry the names hosts expect, and that a callback's parameter
// types are exactly the operation's rather than convertible to them. The
// forwarding and defaults tests exercise the callbacks operation by
// operation; the names are fixed by their compiling at all.
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <type_traits>

#include "kivi/doubles/mock_dispatch_queue.h"
#include "kivi/doubles/mock_kiv_device_attributes.h"
#include "kivi/doubles/mock_kiv_feature_flag_provider.h"
#include "kivi/doubles/mock_kiv_http_header_provider_service.h"
#include "kivi/doubles/mock_kiv_ns_alert.h"
#include "kivi/doubles/mock_kiv_ns_application.h"
#include "kivi/doubles/mock_kiv_ns_bundle.h"
#include "kivi/doubles/mock_kiv_ns_distributed_lock.h"
#include "kivi/doubles/mock_kiv_ns_distributed_notification_center.h"
#include "kivi/doubles/mock_kiv_ns_file_coordinator.h"
#include "kivi/doubles/mock_kiv_ns_file_handle.h"
#include "kivi/doubles/mock_kiv_ns_file_manager.h"
#include "kivi/doubles/mock_kiv_ns_http_cookie_storage.h"
#include "kivi/doubles/mock_kiv_ns_item_provider.h"
#include "kivi/doubles/mock_kiv_ns_notification_center.h"
#include "kivi/doubles/mock_kiv_ns_open_panel.h"
#include "kivi/doubles/mock_kiv_ns_operation_queue.h"
#include "kivi/doubles/mock_kiv_ns_paste_board.h"
#include "kivi/doubles/mock_kiv_ns_pipe_factory.h"
#include "kivi/doubles/mock_kiv_ns_process.h"
#include "kivi/doubles/mock_kiv_ns_run_loop.h"
#include "kivi/doubles/mock_kiv_ns_running_application.h"
#include "kivi/doubles/mock_kiv_ns_save_panel.h"
#include "kivi/doubles/mock_kiv_ns_sharing_service.h"
#include "kivi/doubles/mock_kiv_ns_string.h"
#include "kivi/doubles/mock_kiv_ns_url.h"
#include "kivi/doubles/mock_kiv_ns_user_defaults.h"
#include "kivi/doubles/mock_kiv_ns_window.h"
#include "kivi/doubles/mock_kiv_ns_workspace.h"
#include "kivi/doubles/mock_kiv_ns_xpc_listener.h"
#include "kivi/doubles/mock_kiv_process_factory.h"
#include "kivi/doubles/mock_kiv_sdk_logger_delegate.h"
#include "kivi/doubles/mock_kiv_timer.h"
#include "kivi/doubles/mock_kiv_un_user_notification_center.h"
#include "kivi/doubles/mock_kiv_wk_http_cookie_store.h"
#include "kivi/doubles/mock_ns_event.h"
#include "kivi/doubles/mock_ns_task.h"
#include "kivi/doubles/mock_un_notification.h"
#include "kivi/doubles/mock_un_notification_response.h"
#include "kivi/doubles/mock_un_text_input_notification_response.h"

namespace kivi {
namespace {

template <class Double, class Interface, class... ExtraConstructorArgs>
constexpr bool implements() {
  static_assert(std::is_base_of_v<Interface, Double>);
  static_assert(std::is_convertible_v<Double*, Interface*>, "public and unambiguous");
  static_assert(!std::is_abstract_v<Double>, "every operation implemented");
  static_assert(std::has_virtual_destructor_v<Interface>);
  if constexpr (sizeof...(ExtraConstructorArgs) == 0) {
    static_assert(std::is_default_constructible_v<Double>);
  } else {
    static_assert(std::is_constructible_v<Double, ExtraConstructorArgs...>);
  }
  return true;
}

static_assert(implements<MockKivNSAlert, KivNSAlertProtocol>());
static_assert(implements<MockKivNSNotificationCenter, KivNSNotificationCenterProtocol>());
static_assert(implements<MockKivNSDistributedNotificationCenter,
                         KivNSDistributedNotificationCenterProtocol>());
static_assert(
    implements<MockKivNSDistributedNotificationCenter, KivNSNotificationCenterProtocol>());
static_assert(implements<MockKivNSFileCoordinator, KivNSFileCoordinatorProtocol>());
static_assert(implements<MockKivNSFileHandle, KivNSFileHandleProtocol>());
static_assert(implements<MockKivNSFileManager, KivNSFileManagerProtocol>());
static_assert(implements<MockKivNSHTTPCookieStorage, KivNSHTTPCookieStorageProtocol>());
static_assert(implements<MockKivNSItemProvider, KivNSItemProviderProtocol>());
static_assert(implements<MockKivNSOperationQueue, OperationQueueProtocol>());
static_assert(implements<MockKivNSString, KivNSStringProtocol>());
static_assert(implements<MockKivNSUserDefaults, KivNSUserDefaultsProtocol>());
static_assert(implements<MockKivNSXPCListener, NSXPCListenerDelegate,
                         std::shared_ptr<NSXPCInterface>, ObjectPtr>());
static_assert(!std::is_default_constructible_v<MockKivNSXPCListener>);
static_assert(implements<MockKivSDKLoggerDelegate, KivSdkLoggerDelegate>());
static_assert(implements<MockKivTimer, KivTimerProtocol>());
static_assert(implements<MockKivWKHTTPCookieStore, KivWKHTTPCookieStoreProtocol>());
static_assert(implements<MockNSTask, KivNSTaskProtocol>());
static_assert(implements<MockNSTask, KivNSTaskProtocol, std::int32_t>());
static_assert(implements<MockUNNotification, KivUNNotificationProtocol>());
static_assert(implements<MockUNNotificationResponse, KivUNNotificationResponseProtocol>());
static_assert(
    implements<MockUNTextInputNotificationResponse, KivUNTextInputNotificationResponseProtocol>());
static_assert(implements<MockUNTextInputNotificationResponse, KivUNNotificationResponseProtocol>());
static_assert(implements<MockKivDeviceAttributes, KivDeviceAttributesProtocol>());
static_assert(implements<MockDispatchQueue, KivDispatchQueueProtocol>());
static_assert(implements<MockKivFeatureFlagProvider, KivFeatureFlagProviderProtocol>());
static_assert(implements<MockKivHttpHeaderProviderService, KivHttpHeaderProviderServiceProtocol>());
static_assert(implements<MockKivHttpHeaderProviderService, KivHttpHeaderProviderServiceProtocol,
                         StringDictionary, StringDictionary>());
static_assert(implements<MockKivNSApplication, KivNSApplicationProtocol>());
static_assert(implements<MockKivNSBundle, KivNSBundleProtocol>());
static_assert(implements<MockKivNSDistributedLock, KivNSDistributionLockProtocol>());
static_assert(implements<MockKivNSOpenPanel, KivNSOpenPanelProtocol>());
static_assert(implements<MockKivNSOpenPanel, KivNSSavePanelProtocol>());
static_assert(implements<MockKivNSSavePanel, KivNSSavePanelProtocol>());
static_assert(implements<MockKivNSPasteBoard, KivNSPasteBoardProtocol>());
static_assert(implements<MockKivNSPipeFactory, KivNSPipeFactoryProtocol>());
static_assert(implements<MockKivProcessFactory, KivNSProcessFactoryProtocol>());
static_assert(implements<MockKivNSProcess, KivNSProcessProtocol>());
static_assert(implements<MockKivNSRunLoop, KivNSRunLoopProtocol>());
static_assert(implements<MockKivNSRunningApplication, KivNSRunningApplicationProtocol>());
static_assert(implements<MockKivNSSharingService, KivNSSharingServiceProtocol>());
static_assert(implements<MockKivNSURL, KivNSURLProtocol>());
static_assert(implements<MockKivNSWindow, KivNSWindowProtocol>());
static_assert(implements<MockKivNSWorkspace, KivNSWorkspaceProtocol>());
static_assert(implements<MockKivUNUserNotificationCenter, KivUNUserNotificationCenterProtocol>());
static_assert(implements<MockNSEvent, KivNSEventProtocol>());

// The doubles that extend another double.
static_assert(std::is_base_of_v<MockKivNSSavePanel, MockKivNSOpenPanel>);
static_assert(
    std::is_base_of_v<MockKivNSNotificationCenter, MockKivNSDistributedNotificationCenter>);
static_assert(std::is_base_of_v<MockUNNotificationResponse, MockUNTextInputNotificationResponse>);

// Class-level callbacks are static data members.
template <class T>
constexpr bool isStaticCallback(T*) {
  return true;
}
static_assert(isStaticCallback(&MockDispatchQueue::globalQueuewithQOSBlock));
static_assert(isStaticCallback(&MockKivNSRunningApplication::runningApplicationsBlock));
static_assert(isStaticCallback(&MockNSEvent::addLocalMonitorBlock));
static_assert(isStaticCallback(&MockNSEvent::removeMonitorBlock));
static_assert(isStaticCallback(&MockKivNSURL::bookmarkDataBlock));
static_assert(isStaticCallback(&MockKivNSURL::writeBookmarkDataBlock));

// The runtime half: the base object interface answers the object's own
// description.
TEST(DoubleConformance, BaseObjectInterfaceAnswersTheObjectsDescription) {
  auto alert = std::make_shared<MockKivNSAlert>();
  const KivNSAlertProtocol& viaInterface = *alert;
  EXPECT_EQ(viaInterface.description(), alert->Object::description());
  auto center = std::make_shared<MockKivNSDistributedNotificationCenter>();
  const KivNSDistributedNotificationCenterProtocol& distributed = *center;
  const KivNSNotificationCenterProtocol& local = *center;
  EXPECT_EQ(distributed.description(), local.description());
  EXPECT_NE(distributed.description().find("MockKivNSDistributedNotificationCenter"),
            std::string::npos);
}

}  // namespace
}  // namespace kivi
