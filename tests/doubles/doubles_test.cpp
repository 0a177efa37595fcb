#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

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
#include "kivi/doubles/mock_kiv_ns_open_panel.h"
#include "kivi/doubles/mock_kiv_ns_operation_queue.h"
#include "kivi/doubles/mock_kiv_ns_paste_board.h"
#include "kivi/doubles/mock_kiv_ns_pipe_factory.h"
#include "kivi/doubles/mock_kiv_ns_run_loop.h"
#include "kivi/doubles/mock_kiv_ns_running_application.h"
#include "kivi/doubles/mock_kiv_ns_sharing_service.h"
#include "kivi/doubles/mock_kiv_ns_string.h"
#include "kivi/doubles/mock_kiv_ns_url.h"
#include "kivi/doubles/mock_kiv_ns_user_defaults.h"
#include "kivi/doubles/mock_kiv_ns_window.h"
#include "kivi/doubles/mock_kiv_ns_workspace.h"
#include "kivi/doubles/mock_kiv_process_factory.h"
#include "kivi/doubles/mock_kiv_sdk_logger_delegate.h"
#include "kivi/doubles/mock_kiv_timer.h"
#include "kivi/doubles/mock_kiv_un_user_notification_center.h"
#include "kivi/doubles/mock_kiv_wk_http_cookie_store.h"
#include "kivi/doubles/mock_ns_event.h"
#include "kivi/doubles/mock_ns_task.h"
#include "kivi/doubles/mock_un_notification.h"
#include "kivi/doubles/mock_un_text_input_notification_response.h"
#include "scripted_call.h"

namespace kivi {
namespace {

using testing::expectScripted;
using testing::expectStored;

template <class T>
std::shared_ptr<T> make() {
  return std::make_shared<T>();
}

const auto isEmptyProgress = [](const NSProgressPtr& p) { return p && p->totalUnitCount() == 0; };

// Every operation of every double, each once without and once with its
// callback (see scripted_call.h), and every stored property once. The third
// argument is the default where it is not false, zero, null or empty.
struct Row {
  const char* name;
  std::function<void()> check;
};

const std::vector<Row> kDoubles = {
    {"MockKivNSAlert",
     [] {
       auto m = make<MockKivNSAlert>();
       using I = KivNSAlertProtocol;
       expectScripted(*m, m->runModalCallback, VIA(I, runModal), NSModalResponseContinue);
       expectScripted(*m, m->addButtonCallback, VIA(I, addButtonWithTitle));
       expectScripted(*m, m->beginSheetModalCallback, VIA(I, beginSheetModalForWindow));
       expectStored(*m, GET(I, messageText), SET(I, setMessageText));
       expectStored(*m, GET(I, informativeText), SET(I, setInformativeText));
       expectStored(*m, GET(I, accessoryView), SET(I, setAccessoryView));
       expectStored(*m, GET(I, alertStyle), SET(I, setAlertStyle));
       expectStored(*m, GET(I, icon), SET(I, setIcon));
       expectStored(*m, GET(I, showsHelp), SET(I, setShowsHelp));
       auto delegate = std::make_shared<NSAlertDelegate>();
       m->setDelegate(delegate);
       EXPECT_EQ(m->delegate(), delegate);
       delegate.reset();
       EXPECT_EQ(m->delegate(), nullptr) << "the delegate is held weakly";
     }},
    {"MockKivNSNotificationCenter",
     [] {
       auto m = make<MockKivNSNotificationCenter>();
       using I = KivNSNotificationCenterProtocol;
       expectScripted(*m, m->addObserverBlock, [](I& d, auto&... a) { d.addObserver(a...); });
       expectScripted(*m, m->addObserverForNameBlock, VIA(I, addObserverForName),
                      [](const ObjectPtr& token) { return token != nullptr; });
       expectScripted(*m, m->postNotificationBlock, VIA(I, postNotification));
       expectScripted(*m, m->postNotificationNameObjectBlock, VIA(I, postNotificationName));
       expectScripted(*m, m->postNotificationNameObjectUserInfoBlock, VIA(I, postNotificationName));
       expectScripted(*m, m->removeObserverBlock, VIA(I, removeObserver));
       expectScripted(*m, m->removeObserverNameObjectBlock, VIA(I, removeObserver));
       I& center = *m;
       EXPECT_NE(center.addObserverForName("n", nullptr, nullptr, nullptr),
                 center.addObserverForName("n", nullptr, nullptr, nullptr))
           << "a new token each time";
     }},
    {"MockKivNSDistributedNotificationCenter",
     [] {
       auto m = make<MockKivNSDistributedNotificationCenter>();
       using I = KivNSDistributedNotificationCenterProtocol;
       expectScripted(*m, m->postNotificationImmediatelyBlock, VIA(I, postNotificationName));
       expectScripted(*m, m->postNotificationWithOptionsBlock, VIA(I, postNotificationName));
       expectScripted(*m, m->addDistributedNotificationSuspensionBehaviourObserverBlock,
                      VIA(I, addObserver));
       expectScripted(*m, m->addDistributedNotificationObserverBlock, VIA(I, addObserver));
       expectScripted(*m, m->removeDistributedNotificationObserverBlock, VIA(I, removeObserver));
       using L = KivNSNotificationCenterProtocol;
       expectScripted(*m, m->postNotificationBlock, VIA(L, postNotification));
     }},
    {"MockKivNSFileCoordinator",
     [] {
       auto m = make<MockKivNSFileCoordinator>();
       using I = KivNSFileCoordinatorProtocol;
       expectScripted(*m, m->coordinateReadingItemAtURLImplementationBlock,
                      VIA(I, coordinateReadingItemAtURL));
       expectScripted(*m, m->coordinateWritingItemAtURLBlock, VIA(I, coordinateWritingItemAtURL));
       expectScripted(*m, m->coordinateReadWriteItemAtURLBlock, VIA(I, coordinateReadingItemAtURL));
       expectScripted(*m, m->coordinateWriteItemsAtMultipleURLsBlock,
                      VIA(I, coordinateWritingItemAtURL));
       expectScripted(*m, m->coordinateAsynchronousFileOperationsBlock,
                      VIA(I, coordinateAccessWithIntents));
     }},
    {"MockKivNSFileHandle",
     [] {
       auto m = make<MockKivNSFileHandle>();
       using I = KivNSFileHandleProtocol;
       expectScripted(*m, m->closeFileBlock, VIA(I, closeFile));
       expectScripted(*m, m->writeDataBlock, VIA(I, writeData));
     }},
    {"MockKivNSFileManager",
     [] {
       auto m = make<MockKivNSFileManager>();
       using I = KivNSFileManagerProtocol;
       expectScripted(*m, m->fileExistsAtPathBlock, VIA(I, fileExistsAtPath));
       expectScripted(*m, m->fileExistsAtPathIsDirectoryBlock, VIA(I, fileExistsAtPath));
       expectScripted(*m, m->moveItemAtURLBlock, VIA(I, moveItemAtURL));
       expectScripted(*m, m->moveItemAtPathBlock, VIA(I, moveItemAtPath));
       expectScripted(*m, m->copyItemAtURLBlock, VIA(I, copyItemAtURL));
       expectScripted(*m, m->copyItemAtPathBlock, VIA(I, copyItemAtPath));
       expectScripted(*m, m->removeItemAtURLBlock, VIA(I, removeItemAtURL));
       expectScripted(*m, m->removeItemAtPathBlock, VIA(I, removeItemAtPath));
       expectScripted(*m, m->contentsOfDirectoryAtPathBlock, VIA(I, contentsOfDirectoryAtPath));
       expectScripted(*m, m->contentsAtPathBlock, VIA(I, contentsAtPath));
       expectScripted(*m, m->contentsOfDirectoryAtURLBlock, VIA(I, contentsOfDirectoryAtURL));
       expectScripted(*m, m->createDirectoryAtURLBlock, VIA(I, createDirectoryAtURL));
       expectScripted(*m, m->createDirectoryAtPathBlock, VIA(I, createDirectoryAtPath));
       expectScripted(*m, m->createFileAtPathBlock, VIA(I, createFileAtPath));
       expectScripted(*m, m->urlsForDirectoryAndDomainBlock, VIA(I, URLsForDirectory));
       expectScripted(*m, m->urlForDirectoryBlock, VIA(I, URLForDirectory));
       expectScripted(*m, m->attributesOfItemAtPathBlock, VIA(I, attributesOfItemAtPath));
       expectScripted(*m, m->containerURLForSecurityApplicationGroupIdentifierBlock,
                      VIA(I, containerURLForSecurityApplicationGroupIdentifier));
       expectScripted(*m, m->homeDirectoryForUserBlock, VIA(I, homeDirectoryForUser));
       expectScripted(*m, m->linkItemAtPathBlock, VIA(I, linkItemAtPath));
       expectScripted(*m, m->displayNameAtPathBlock, VIA(I, displayNameAtPath),
                      "Mock display name");
       expectScripted(*m, m->destinationOfSymbolicLinkBlock,
                      VIA(I, destinationOfSymbolicLinkAtPath), "");
     }},
    {"MockKivNSHTTPCookieStorage",
     [] {
       auto m = make<MockKivNSHTTPCookieStorage>();
       using I = KivNSHTTPCookieStorageProtocol;
       expectScripted(*m, m->cookiesForURLBlock, VIA(I, cookiesForURL));
       expectScripted(*m, m->removeCookiesSinceDateBlock, VIA(I, removeCookiesSinceDate));
       expectScripted(*m, m->setCookiesWithMainDocumentURLBlock, VIA(I, setCookies));
       EXPECT_TRUE(m->cookies().empty()) << "the list-free operations left the list alone";
       EXPECT_EQ(m->cookieAcceptPolicy(), NSHTTPCookieAcceptPolicyAlways);
       expectStored(*m, GET(I, cookieAcceptPolicy), SET(I, setCookieAcceptPolicy));
     }},
    {"MockKivNSItemProvider",
     [] {
       auto m = make<MockKivNSItemProvider>();
       using I = KivNSItemProviderProtocol;
       expectScripted(*m, m->loadFileRepresentationBlock,
                      VIA(I, loadFileRepresentationForTypeIdentifier), isEmptyProgress);
       expectScripted(*m, m->loadObjectOfClassBlock, VIA(I, loadObjectOfClass), isEmptyProgress);
     }},
    {"MockKivNSOperationQueue",
     [] {
       auto m = make<MockKivNSOperationQueue>();
       using I = OperationQueueProtocol;
       expectScripted(*m, m->addOperationBlock, VIA(I, addOperation));
       expectScripted(*m, m->addOperationsBlock, VIA(I, addOperations));
       expectScripted(*m, m->cancelAllOperationsBlock, VIA(I, cancelAllOperations));
       expectScripted(*m, m->waitUntilAllOperationsAreFinishedBlock,
                      VIA(I, waitUntilAllOperationsAreFinished));
       expectScripted(*m, m->addObserverBlock, VIA(I, addObserver));
       expectScripted(*m, m->removeObserverBlock, VIA(I, removeObserver));
       expectStored(*m, GET(I, maxConcurrentOperationCount),
                    SET(I, setMaxConcurrentOperationCount));
       expectStored(*m, GET(I, name), SET(I, setName));
     }},
    {"MockKivNSString",
     [] {
       auto m = make<MockKivNSString>();
       expectScripted(*m, m->writeNSStringToURLImplementationBlock,
                      VIA(KivNSStringProtocol, writeToURL));
     }},
    {"MockKivNSUserDefaults",
     [] {
       auto m = make<MockKivNSUserDefaults>();
       using I = KivNSUserDefaultsProtocol;
       expectScripted(*m, m->setObjectForKeyBlock, VIA(I, setObject));
       expectScripted(*m, m->objectForKeyBlock, VIA(I, objectForKey));
       expectScripted(*m, m->setIntegerForKeyBlock, VIA(I, setInteger));
       expectScripted(*m, m->integerForKeyBlock, VIA(I, integerForKey));
       expectScripted(*m, m->setBoolForKeyBlock, VIA(I, setBool));
       expectScripted(*m, m->boolForKeyBlock, VIA(I, boolForKey));
       expectScripted(*m, m->setURLForKeyBlock, VIA(I, setURL));
       expectScripted(*m, m->urlForKeyBlock, VIA(I, URLForKey));
       expectScripted(*m, m->stringForKeyBlock, VIA(I, stringForKey));
       expectScripted(*m, m->arrayForKeyBlock, VIA(I, arrayForKey));
       expectScripted(*m, m->dictionaryForKeyBlock, VIA(I, dictionaryForKey));
       expectScripted(*m, m->dataForKeyBlock, VIA(I, dataForKey));
       expectScripted(*m, m->stringArrayForKeyBlock, VIA(I, stringArrayForKey));
       expectScripted(*m, m->floatForKeyBlock, VIA(I, floatForKey));
       expectScripted(*m, m->doubleForKeyBlock, VIA(I, doubleForKey));
       expectScripted(*m, m->removeObjectForKeyBlock, VIA(I, removeObjectForKey));
       expectScripted(*m, m->removePersistentDomainForNameBlock,
                      VIA(I, removePersistentDomainForName));
       expectScripted(*m, m->valueForKeyPathBlock, VIA(I, valueForKeyPath));
     }},
    {"MockKivSDKLoggerDelegate",
     [] {
       auto m = make<MockKivSDKLoggerDelegate>();
       using I = KivSdkLoggerDelegate;
       expectScripted(*m, m->logVerboseBlock, VIA(I, logVerboseWithModule));
       expectScripted(*m, m->logInfoBlock, VIA(I, logInfoWithModule));
       expectScripted(*m, m->logSupportBlock, VIA(I, logSupportWithModule));
       expectScripted(*m, m->logWarnBlock, VIA(I, logWarnWithModule));
       expectScripted(*m, m->logErrorBlock, VIA(I, logErrorWithModule));
       expectScripted(*m, m->logCriticalBlock, VIA(I, logCriticalWithModule));
       EXPECT_EQ(m->optionalMethods(), 0u);
     }},
    {"MockKivTimer",
     [] {
       auto m = make<MockKivTimer>();
       expectScripted(*m, m->startTimerBlock, VIA(KivTimerProtocol, start));
       expectScripted(*m, m->cancelTimerBlock, VIA(KivTimerProtocol, cancel));
     }},
    {"MockKivWKHTTPCookieStore",
     [] {
       auto m = make<MockKivWKHTTPCookieStore>();
       expectScripted(*m, m->setCookiesWithCompletionHandlerBlock,
                      VIA(KivWKHTTPCookieStoreProtocol, setCookie));
     }},
    {"MockNSTask",
     [] {
       auto m = make<MockNSTask>();
       using I = KivNSTaskProtocol;
       expectScripted(*m, m->kivLaunchBlock, VIA(I, launch));
       expectScripted(*m, m->kivWaitUntilExitBlock, VIA(I, waitUntilExit));
       EXPECT_EQ(m->terminationStatus(), 0);
       EXPECT_EQ(MockNSTask(3).terminationStatus(), 3);
       expectStored(*m, GET(I, launchPath), SET(I, setLaunchPath));
       expectStored(*m, GET(I, currentDirectoryPath), SET(I, setCurrentDirectoryPath));
       expectStored(*m, GET(I, arguments), SET(I, setArguments));
       expectStored(*m, GET(I, standardOutput), SET(I, setStandardOutput));
       expectStored(*m, GET(I, standardError), SET(I, setStandardError));
     }},
    {"MockUNNotification",
     [] {
       auto m = make<MockUNNotification>();
       using I = KivUNNotificationProtocol;
       expectStored(*m, GET(I, date), SET(I, setDate));
       expectStored(*m, GET(I, request), SET(I, setRequest));
     }},
    {"MockUNTextInputNotificationResponse",
     [] {
       auto m = make<MockUNTextInputNotificationResponse>();
       using I = KivUNTextInputNotificationResponseProtocol;
       auto notification = std::make_shared<UNNotification>(Date{5}, UNNotificationRequest{});
       m->setNotification(notification);
       EXPECT_EQ(m->notification(), notification);
       expectStored(*m, GET(I, actionIdentifier), SET(I, setActionIdentifier));
       expectStored(*m, GET(I, userText), SET(I, setUserText));
     }},
    {"MockKivDeviceAttributes",
     [] {
       auto m = make<MockKivDeviceAttributes>();
       expectScripted(*m, m->getMacHardwareSerialNumberBlock,
                      VIA(KivDeviceAttributesProtocol, getMacHardwareSerialNumber));
     }},
    {"MockDispatchQueue",
     [] {
       auto m = make<MockDispatchQueue>();
       expectScripted(
           *m, m->syncBlock,
           [](KivDispatchQueueProtocol& d, const std::function<void()>& w) { d.sync(w); });
     }},
    {"MockKivFeatureFlagProvider",
     [] {
       auto m = make<MockKivFeatureFlagProvider>();
       expectScripted(*m, m->valueForFeatureFlagBlock,
                      VIA(KivFeatureFlagProviderProtocol, valueForFeatureFlagWithServiceName),
                      true);
     }},
    {"MockKivHttpHeaderProviderService",
     [] {
       MockKivHttpHeaderProviderService empty;
       EXPECT_TRUE(empty.httpMonitoringHeaders().empty());
       MockKivHttpHeaderProviderService m({{"X-Trace", "1"}}, {{"X-Txn", "2"}});
       KivHttpHeaderProviderServiceProtocol& i = m;
       EXPECT_EQ(i.httpMonitoringHeaders(), (StringDictionary{{"X-Trace", "1"}}));
       EXPECT_EQ(i.uniqueTransactionIdHeader(), (StringDictionary{{"X-Txn", "2"}}));
       m.uniqueTransactionIdHeaderInternal = {{"X-Txn", "3"}};
       EXPECT_EQ(i.uniqueTransactionIdHeader(), (StringDictionary{{"X-Txn", "3"}}));
     }},
    {"MockKivNSApplication",
     [] {
       auto m = make<MockKivNSApplication>();
       using I = KivNSApplicationProtocol;
       expectScripted(*m, m->activateIgnoringOtherAppsBlock, VIA(I, activateIgnoringOtherApps));
       expectScripted(*m, m->terminateAppBlock, VIA(I, terminate));
     }},
    {"MockKivNSBundle",
     [] {
       auto m = make<MockKivNSBundle>();
       using I = KivNSBundleProtocol;
       expectScripted(*m, m->infoDictionaryObjectForKeyBlock, VIA(I, objectForInfoDictionaryKey));
       expectScripted(*m, m->bundleIdentifierBlock, VIA(I, bundleIdentifier));
       expectScripted(*m, m->executableArchitecturesBlock, VIA(I, executableArchitectures));
       expectScripted(*m, m->bundlePathBlock, VIA(I, bundlePath));
     }},
    {"MockKivNSDistributedLock",
     [] {
       auto m = make<MockKivNSDistributedLock>();
       using I = KivNSDistributionLockProtocol;
       expectScripted(*m, m->tryLockBlock, VIA(I, tryLock), true);
       expectScripted(*m, m->tryLockWithTimeOutBlock, VIA(I, tryLock), true);
       expectScripted(*m, m->tryLockWithTimeOutAndResolutionBlock, VIA(I, tryLock), true);
       expectScripted(*m, m->tryLockWithTimeOutAndProtectedBlock, VIA(I, tryLock));
       expectScripted(*m, m->tryLockWithProtectedBlock, VIA(I, tryLock));
       expectScripted(*m, m->unlockBlock, VIA(I, unlock));
       expectScripted(*m, m->breakLockBlock, VIA(I, breakLock));
     }},
    {"MockKivNSOpenPanel",
     [] {
       auto m = make<MockKivNSOpenPanel>();
       using I = KivNSOpenPanelProtocol;
       expectScripted(*m, m->panelCloseBlock, VIA(I, close));
       expectScripted(*m, m->beginBlock, VIA(I, begin));
       expectStored(*m, GET(I, canChooseFiles), SET(I, setCanChooseFiles));
       expectStored(*m, GET(I, allowsMultipleSelection), SET(I, setAllowsMultipleSelection));
       expectStored(*m, GET(I, canChooseDirectories), SET(I, setCanChooseDirectories));
       expectStored(*m, GET(I, urls), [](MockKivNSOpenPanel& d, const auto& v) { d.setUrls(v); });
       expectStored(*m, GET(I, title), SET(I, setTitle));
     }},
    {"MockKivNSSavePanel",
     [] {
       auto m = make<MockKivNSSavePanel>();
       using I = KivNSSavePanelProtocol;
       expectScripted(*m, m->beginSheetModalBlock, VIA(I, beginSheetModal));
       expectScripted(*m, m->beginBlock, VIA(I, begin));
       expectStored(*m, GET(I, title), SET(I, setTitle));
       expectStored(*m, GET(I, nameFieldLabel), SET(I, setNameFieldLabel));
       expectStored(*m, GET(I, delegate), SET(I, setDelegate));
       expectStored(*m, GET(I, canCreateDirectories), SET(I, setCanCreateDirectories));
       expectStored(*m, GET(I, nameFieldStringValue), SET(I, setNameFieldStringValue));
       expectStored(*m, GET(I, url), [](MockKivNSSavePanel& d, const URLPtr& v) { d.mockUrl = v; });
     }},
    {"MockKivNSPasteBoard",
     [] {
       auto m = make<MockKivNSPasteBoard>();
       using I = KivNSPasteBoardProtocol;
       expectScripted(*m, m->pasteBoardServiceBlock, VIA(I, setString));
       expectScripted(*m, m->prepareForNewContentBlock, VIA(I, prepareForNewContents));
     }},
    {"MockKivNSPipeFactory",
     [] {
       auto m = make<MockKivNSPipeFactory>();
       expectScripted(*m, m->createMockPipeBlock, VIA(KivNSPipeFactoryProtocol, createPipe),
                      [](const std::shared_ptr<NSPipe>& p) { return p != nullptr; });
     }},
    {"MockKivProcessFactory",
     [] {
       auto m = make<MockKivProcessFactory>();
       expectScripted(*m, m->createMockProcessBlock,
                      VIA(KivNSProcessFactoryProtocol, createProcess),
                      [](const std::shared_ptr<KivNSProcessProtocol>& p) {
                        return std::dynamic_pointer_cast<MockKivNSProcess>(p) != nullptr;
                      });
     }},
    {"MockKivNSProcess",
     [] {
       auto m = make<MockKivNSProcess>();
       using I = KivNSProcessProtocol;
       expectScripted(*m, m->launchBlock, VIA(I, launch));
       expectScripted(*m, m->waitUntilExitBlock, VIA(I, waitUntilExit));
       expectScripted(*m, m->runBlock, VIA(I, launchAndReturnError), true);
       expectScripted(*m, m->isRunningBlock, VIA(I, isRunning));
       expectStored(*m, GET(I, executableURL), SET(I, setExecutableURL));
       expectStored(*m, GET(I, launchPath), SET(I, setLaunchPath));
       expectStored(*m, GET(I, arguments), SET(I, setArguments));
       expectStored(*m, GET(I, standardOutput), SET(I, setStandardOutput));
       expectStored(*m, GET(I, standardInput), SET(I, setStandardInput));
       expectStored(*m, GET(I, standardError), SET(I, setStandardError));
       expectStored(*m, GET(I, terminationHandler), SET(I, setTerminationHandler));
     }},
    {"MockKivNSRunLoop",
     [] {
       auto m = make<MockKivNSRunLoop>();
       using I = KivNSRunLoopProtocol;
       expectScripted(*m, m->runBlock, VIA(I, run));
       expectScripted(*m, m->runUntilLimitDateBlock, VIA(I, run));
       expectScripted(*m, m->runInModeBeforeLimitDateBlock, VIA(I, run));
       expectScripted(*m, m->performInModesWithBlock, VIA(I, perform));
       expectScripted(*m, m->performWithBlock, VIA(I, perform));
     }},
    {"MockKivNSRunningApplication",
     [] {
       auto m = make<MockKivNSRunningApplication>();
       expectScripted(
           *m, MockKivNSRunningApplication::runningApplicationsBlock,
           VIA(KivNSRunningApplicationProtocol, runningApplicationsWithBundleIdentifier));
     }},
    {"MockKivNSSharingService",
     [] {
       auto m = make<MockKivNSSharingService>();
       using I = KivNSSharingServiceProtocol;
       expectScripted(*m, m->sharingServicePerformBlock, VIA(I, perform));
       expectScripted(*m, m->canPerformServiceBlock, VIA(I, canPerform));
       expectStored(*m, GET(I, subject), SET(I, setSubject));
       expectStored(*m, GET(I, recipients), SET(I, setRecipients));
     }},
    {"MockKivNSURL",
     [] {
       auto m = make<MockKivNSURL>();
       using I = KivNSURLProtocol;
       expectScripted(*m, MockKivNSURL::bookmarkDataBlock, VIA(I, bookmarkDataWithOptions),
                      [](const std::optional<Data>& d) { return d && d->empty(); });
       expectScripted(*m, MockKivNSURL::writeBookmarkDataBlock, VIA(I, writeBookmarkData));
       expectStored(*m, GET(I, path), [](MockKivNSURL& d, const auto& v) { d.setPath(v); });
     }},
    {"MockKivNSWindow",
     [] {
       auto m = make<MockKivNSWindow>();
       using I = KivNSWindowProtocol;
       expectScripted(*m, m->centerBlock, VIA(I, center));
       expectScripted(*m, m->makeKeyAndOrderFrontBlock, VIA(I, makeKeyAndOrderFront));
       expectScripted(*m, m->windowCloseBlock, VIA(I, close));
       expectStored(*m, GET(I, contentViewController), SET(I, setContentViewController));
       EXPECT_EQ(m->title, "");
     }},
    {"MockKivNSWorkspace",
     [] {
       auto m = make<MockKivNSWorkspace>();
       using I = KivNSWorkspaceProtocol;
       expectScripted(*m, m->openURLBlock, VIA(I, openURL));
       expectScripted(*m, m->openApplicationURLBlock, VIA(I, openApplicationAtURL));
       expectScripted(*m, m->openURLConfigurationBlock, VIA(I, openURL));
       expectScripted(*m, m->noteFileSystemChangedBlock, VIA(I, noteFileSystemChanged));
       expectScripted(*m, m->urlForApplicationWithBundleIdentifierBlock,
                      VIA(I, URLForApplicationWithBundleIdentifier));
       expectScripted(*m, m->openURLsWithAppAtConfigurationBlock, VIA(I, openURLs));
       expectScripted(*m, m->activateFileViewerSelectingBlock,
                      VIA(I, activateFileViewerSelectingURLs));
     }},
    {"MockKivUNUserNotificationCenter",
     [] {
       auto m = make<MockKivUNUserNotificationCenter>();
       using I = KivUNUserNotificationCenterProtocol;
       expectScripted(*m, m->addBlock, VIA(I, add));
       expectScripted(*m, m->requestAuthorizationBlock, VIA(I, requestAuthorization));
       expectScripted(*m, m->getNotificationCategoriesBlock, VIA(I, getNotificationCategories));
       expectScripted(*m, m->setNotificationCategoriesBlock, VIA(I, setNotificationCategories));
       expectStored(*m, GET(I, delegate), SET(I, setDelegate));
     }},
    {"MockNSEvent",
     [] {
       auto m = make<MockNSEvent>();
       using I = KivNSEventProtocol;
       expectScripted(*m, MockNSEvent::addLocalMonitorBlock, VIA(I, addLocalMonitorForEvents));
       expectScripted(*m, MockNSEvent::removeMonitorBlock, VIA(I, removeMonitor));
     }},
};

TEST(Doubles, EveryOperationAnswersItsCallbackOrItsDefault) {
  for (const Row& row : kDoubles) {
    SCOPED_TRACE(row.name);
    row.check();
  }
}

}  // namespace
}  // namespace kivi
