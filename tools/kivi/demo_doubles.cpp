#include "demo_doubles.h"

#include <memory>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "journal.h"
#include "kivi/doubles/mock_kiv_ns_process.h"
#include "kivi/doubles/mock_kiv_ns_workspace.h"
#include "kivi/doubles/mock_kiv_process_factory.h"
#include "kivi/net/url.h"
#include "kivi/process/kiv_ns_process_factory.h"

namespace kivi::tool {
namespace {

// A host component as a host would write it: it packs a support archive with
// tar and shows the archive in the file manager. It holds only the seams, so
// production code hands it KivNSProcessFactory and NSWorkspace, and a test
// hands it doubles.
class SupportArchiver {
 public:
  SupportArchiver(std::shared_ptr<KivNSProcessFactoryProtocol> processes,
                  std::shared_ptr<KivNSWorkspaceProtocol> workspace)
      : processes_(std::move(processes)), workspace_(std::move(workspace)) {}

  // True when tar succeeded and the archive was shown.
  bool archive(const std::string& directory, const std::string& archivePath) {
    auto tar = processes_->createProcess();
    tar->setLaunchPath("/usr/bin/tar");
    tar->setArguments(std::vector<std::string>{"czf", archivePath, "-C", directory, "."});
    ErrorPtr error;
    if (!tar->launchAndReturnError(&error)) return false;
    tar->waitUntilExit();
    if (tar->terminationReason() != NSTaskTerminationReasonExit || tar->terminationStatus() != 0)
      return false;
    workspace_->activateFileViewerSelectingURLs({URL::fileURLWithPath(archivePath)});
    return true;
  }

 private:
  std::shared_ptr<KivNSProcessFactoryProtocol> processes_;
  std::shared_ptr<KivNSWorkspaceProtocol> workspace_;
};

std::string joined(const std::vector<std::string>& words) {
  std::string text;
  for (const auto& word : words) text += (text.empty() ? "" : " ") + word;
  return text;
}

}  // namespace

int runDoublesDemo(std::ostream& out, std::ostream& err) {
  Journal journal(out);
  journal.heading("A host component handed doubles instead of the process and workspace services");

  auto processes = std::make_shared<MockKivProcessFactory>();
  auto workspace = std::make_shared<MockKivNSWorkspace>();
  std::int32_t exitStatus = 0;
  processes->createMockProcessBlock = [&]() -> std::shared_ptr<KivNSProcessProtocol> {
    auto process = std::make_shared<MockKivNSProcess>();
    std::weak_ptr<MockKivNSProcess> weak = process;
    process->runBlock = [&journal, &exitStatus, weak](ErrorPtr*) {
      auto self = weak.lock();
      journal.line("process", "runBlock: " + self->launchPath().value_or("?") + " " +
                                  joined(self->arguments().value_or(std::vector<std::string>{})));
      self->mockTerminationStatus = exitStatus;
      return true;
    };
    process->waitUntilExitBlock = [&journal] { journal.line("process", "waitUntilExitBlock"); };
    return process;
  };
  int shown = 0;
  workspace->activateFileViewerSelectingBlock = [&](const std::vector<URLPtr>& urls) {
    ++shown;
    for (const auto& url : urls) {
      journal.line("workspace", "activateFileViewerSelectingBlock: " + url->absoluteString());
    }
  };

  SupportArchiver archiver(processes, workspace);
  const bool archived = archiver.archive("/var/log/kivi", "/tmp/kivi-support.tar.gz");
  journal.line("archiver", archived ? "tar answered status 0: archive shown"
                                    : "archive failed although tar answered 0");
  exitStatus = 2;
  const bool failed = !archiver.archive("/var/log/kivi", "/tmp/kivi-support.tar.gz");
  journal.line("archiver", failed ? "tar answered status 2: nothing shown"
                                  : "archive shown although tar answered 2");
  if (!archived || !failed || shown != 1) {
    err << "kivi demo: the doubles did not answer the host component as scripted\n";
    return 1;
  }
  return 0;
}

}  // namespace kivi::tool
