// host_unit_test: unit tests of a host component that starts a program and
// talks to the desktop, run against the library's test doubles so that
// nothing is started and nothing opens on screen.
//
// The component, LogExporter, packs a folder of log files into a .tar.gz
// with tar and then opens the folder holding the archive in the file
// manager. It never creates a process or touches the desktop itself: it is
// handed a KivNSProcessFactoryProtocol and a KivNSWorkspaceProtocol. A
// program hands it the real services,
//
//   LogExporter exporter(std::make_shared<kivi::KivNSProcessFactory>(),
//                        kivi::NSWorkspace::sharedWorkspace());
//
// and the tests hand it MockKivProcessFactory (whose MockKivNSProcess plays
// tar) and MockKivNSWorkspace (whose callback plays the desktop). The
// doubles answer synchronously, on the calling thread, so a test reads the
// outcome as soon as exportLogs() returns.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/desktop/kiv_ns_workspace_protocol.h"
#include "kivi/desktop/ns_workspace_open_configuration.h"
#include "kivi/doubles/mock_kiv_ns_process.h"
#include "kivi/doubles/mock_kiv_ns_workspace.h"
#include "kivi/doubles/mock_kiv_process_factory.h"
#include "kivi/net/kiv_ns_url_protocol.h"  // POSIXErrorDomain
#include "kivi/net/url.h"
#include "kivi/process/kiv_ns_process_factory.h"
#include "kivi/process/kiv_ns_process_protocol.h"
#include "kivi/text/json_serialization.h"  // CocoaErrorDomain

namespace {

// ---- The component under test ----------------------------------------------

// Packs a log folder into an archive and shows where it went.
//
// exportLogs() blocks while tar runs, so call it off the UI thread. Its
// completion runs exactly once: with null once the folder was shown, or with
// the error that stopped the export (tar could not start, tar failed, the
// desktop could not open the folder). With the real workspace it runs on a
// worker thread.
class LogExporter {
 public:
  using Completion = std::function<void(const kivi::ErrorPtr& error)>;

  static constexpr const char* kErrorDomain = "LogExporter";
  // tar ran but did not exit with status 0.
  static constexpr std::int64_t kArchiverFailed = 1;

  LogExporter(std::shared_ptr<kivi::KivNSProcessFactoryProtocol> processes,
              std::shared_ptr<kivi::KivNSWorkspaceProtocol> workspace)
      : processes_(std::move(processes)), workspace_(std::move(workspace)) {}

  void exportLogs(const std::string& logDirectory, const std::string& archivePath,
                  Completion done) {
    std::shared_ptr<kivi::KivNSProcessProtocol> tar = processes_->createProcess();
    tar->setLaunchPath("/usr/bin/tar");
    tar->setArguments(std::vector<std::string>{"-czf", archivePath, "-C", logDirectory, "."});

    kivi::ErrorPtr error;
    if (!tar->launchAndReturnError(&error)) {
      done(error);  // the process's own error says why (no such program, ...)
      return;
    }
    tar->waitUntilExit();
    if (tar->terminationReason() != kivi::NSTaskTerminationReasonExit ||
        tar->terminationStatus() != 0) {
      done(kivi::Error::create(
          kErrorDomain, kArchiverFailed,
          {{kivi::LocalizedDescriptionKey,
            kivi::Value("tar failed with status " + std::to_string(tar->terminationStatus()))}}));
      return;
    }

    std::filesystem::path folder = std::filesystem::path(archivePath).parent_path();
    if (folder.empty()) folder = ".";  // the archive is in the working directory
    workspace_->openURL(kivi::URL::fileURLWithPath(folder.string()),
                        kivi::NSWorkspaceOpenConfiguration::configuration(),
                        [done = std::move(done)](const std::shared_ptr<kivi::NSRunningApplication>&,
                                                 const kivi::ErrorPtr& error) { done(error); });
  }

 private:
  const std::shared_ptr<kivi::KivNSProcessFactoryProtocol> processes_;
  const std::shared_ptr<kivi::KivNSWorkspaceProtocol> workspace_;
};

// ---- The tests ---------------------------------------------------------------

class LogExporterTest : public ::testing::Test {
 protected:
  LogExporterTest() {
    // Every process the exporter asks for is the one double the test scripts.
    processes_->createMockProcessBlock = [this] { return tar; };
    // The desktop records what it was asked to open and answers with
    // `desktopAnswer` (null: opened).
    workspace_->openURLConfigurationBlock = [this](const kivi::URLPtr& url,
                                                   const kivi::NSWorkspaceOpenConfiguration&,
                                                   kivi::NSWorkspaceCompletionHandler completion) {
      opened.push_back(url ? url->path().value_or("") : "(null URL)");
      if (completion) completion(nullptr, desktopAnswer);
    };
  }

  // Runs one export and returns the error its completion received, checking
  // that the completion ran exactly once.
  kivi::ErrorPtr exportLogs() {
    LogExporter exporter(processes_, workspace_);
    int calls = 0;
    kivi::ErrorPtr outcome;
    exporter.exportLogs("/var/log/notes", "/tmp/exports/notes-logs.tar.gz",
                        [&](const kivi::ErrorPtr& error) {
                          ++calls;
                          outcome = error;
                        });
    EXPECT_EQ(calls, 1) << "the completion must run exactly once";
    return outcome;
  }

  // The double that plays tar. Unscripted, it "exits" with status 1.
  const std::shared_ptr<kivi::MockKivNSProcess> tar = std::make_shared<kivi::MockKivNSProcess>();
  kivi::ErrorPtr desktopAnswer;
  std::vector<std::string> opened;  // paths the desktop was asked to open

 private:
  const std::shared_ptr<kivi::MockKivProcessFactory> processes_ =
      std::make_shared<kivi::MockKivProcessFactory>();
  const std::shared_ptr<kivi::MockKivNSWorkspace> workspace_ =
      std::make_shared<kivi::MockKivNSWorkspace>();
};

TEST_F(LogExporterTest, PacksTheFolderWaitsForTarAndShowsTheArchivesFolder) {
  tar->mockTerminationStatus = 0;
  bool waited = false;
  tar->waitUntilExitBlock = [&] { waited = true; };

  EXPECT_EQ(exportLogs(), nullptr);

  EXPECT_EQ(tar->launchPath(), "/usr/bin/tar");
  EXPECT_EQ(tar->arguments(), (std::vector<std::string>{"-czf", "/tmp/exports/notes-logs.tar.gz",
                                                        "-C", "/var/log/notes", "."}));
  EXPECT_TRUE(waited) << "the folder must not be shown before tar has finished";
  EXPECT_EQ(opened, std::vector<std::string>{"/tmp/exports"});
}

TEST_F(LogExporterTest, FailingTarIsReportedAndNothingIsShown) {
  tar->mockTerminationStatus = 2;

  const kivi::ErrorPtr error = exportLogs();

  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), LogExporter::kErrorDomain);
  EXPECT_EQ(error->code(), LogExporter::kArchiverFailed);
  EXPECT_EQ(error->localizedDescription(), "tar failed with status 2");
  EXPECT_TRUE(opened.empty());
}

TEST_F(LogExporterTest, TarThatCannotStartIsNotWaitedForAndItsErrorIsPassedOn) {
  const kivi::ErrorPtr noSuchProgram = kivi::Error::create(
      kivi::POSIXErrorDomain, ENOENT,
      {{kivi::LocalizedDescriptionKey, kivi::Value("No such file or directory")}});
  tar->runBlock = [&](kivi::ErrorPtr* error) {
    *error = noSuchProgram;
    return false;
  };
  tar->waitUntilExitBlock = [] { ADD_FAILURE() << "waited for a process that never started"; };

  EXPECT_EQ(exportLogs(), noSuchProgram);
  EXPECT_TRUE(opened.empty());
}

TEST_F(LogExporterTest, DesktopThatCannotOpenTheFolderFailsTheExport) {
  tar->mockTerminationStatus = 0;
  desktopAnswer = kivi::Error::create(
      kivi::CocoaErrorDomain, kivi::FeatureUnsupportedError,
      {{kivi::LocalizedDescriptionKey, kivi::Value("No application can open folders.")}});

  EXPECT_EQ(exportLogs(), desktopAnswer);
  EXPECT_EQ(opened.size(), 1u);
}

}  // namespace
