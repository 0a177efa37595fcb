#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "kivi/logging/kiv_sdk_logger.h"
#include "kivi/logging/kiv_swift_sdk_logger.h"
#include "test_support.h"

namespace kivi {
namespace {

struct Line {
  std::string method, module, file, function;
  std::uint64_t line;
  std::string message;
  bool operator==(const Line&) const = default;
};

// Records every call; implements the aot methods announced in `optional`.
class Recorder : public KivSdkLoggerDelegate {
 public:
  explicit Recorder(std::uint32_t optional = KivSdkLoggerDelegateAllAotLogs)
      : optional_(optional) {}
  ~Recorder() override { alive_ = false; }

#define KIVI_RECORD(name)                                                                       \
  void name(std::string_view m, std::string_view f, std::string_view fn, std::uint64_t l,       \
            std::string_view msg) override {                                                    \
    record({#name, std::string(m), std::string(f), std::string(fn), l, std::string(msg)}, msg); \
  }
  KIVI_RECORD(logCriticalWithModule)
  KIVI_RECORD(logErrorWithModule)
  KIVI_RECORD(logWarnWithModule)
  KIVI_RECORD(logInfoWithModule)
  KIVI_RECORD(logVerboseWithModule)
  KIVI_RECORD(logSupportWithModule)
  KIVI_RECORD(aotLogCriticalWithModule)
  KIVI_RECORD(aotLogErrorWithModule)
  KIVI_RECORD(aotLogWarnWithModule)
  KIVI_RECORD(aotLogInfoWithModule)
#undef KIVI_RECORD
  std::uint32_t optionalMethods() const override { return optional_; }

  std::vector<Line> take() {
    std::lock_guard lock(mutex_);
    return std::exchange(lines_, {});
  }
  std::function<void(std::string_view message)> onLine;  // set before sharing

 private:
  void record(const Line& line, std::string_view message) {
    EXPECT_TRUE(alive_.load()) << "called after destruction";
    {
      std::lock_guard lock(mutex_);
      lines_.push_back(line);
    }
    if (onLine) onLine(message);
  }
  std::uint32_t optional_;
  std::atomic<bool> alive_{true};
  std::mutex mutex_;
  std::vector<Line> lines_;
};

// Counts how often its description is asked for.
class Counted : public Object {
 public:
  std::string description() const override {
    ++calls;
    return "<Counted>";
  }
  mutable std::atomic<int> calls{0};
};

// The method names one call at `level` reaches, through each entry point.
std::vector<std::string> methodsReached(Recorder& recorder, const KivSdkLogger& logger,
                                        KivSdkLogLevel level, bool aot) {
  if (aot) {
    logger.aotLogWithModule("m", level, "f", "fn", 1, "x");
  } else {
    logger.logWithModule("m", level, "f", "fn", 1, "x");
  }
  std::vector<std::string> names;
  for (const Line& line : recorder.take()) names.push_back(line.method);
  return names;
}

TEST(KivSdkLogger, LevelsPickOneMethodOnTheirOwnChannel) {
  const struct {
    KivSdkLogLevel level;
    const char* main;
    const char* aot;  // null: dropped
  } rows[] = {{0, nullptr, nullptr},
              {1, "logCriticalWithModule", "aotLogCriticalWithModule"},
              {2, "logErrorWithModule", "aotLogErrorWithModule"},
              {3, "logWarnWithModule", "aotLogWarnWithModule"},
              {4, "logInfoWithModule", "aotLogInfoWithModule"},
              {5, "logVerboseWithModule", nullptr},
              {6, "logSupportWithModule", nullptr},
              {7, nullptr, nullptr},
              {std::numeric_limits<std::uint64_t>::max(), nullptr, nullptr}};
  auto all = std::make_shared<Recorder>();
  auto mainOnly = std::make_shared<Recorder>(0);
  auto infoOnly = std::make_shared<Recorder>(KivSdkLoggerDelegateAotLogInfo);
  const auto logger = KivSdkLogger::create(all);
  using Names = std::vector<std::string>;
  for (const auto& row : rows) {
    SCOPED_TRACE(row.level);
    logger->setDelegate(all);
    EXPECT_EQ(methodsReached(*all, *logger, row.level, false),
              row.main ? Names{row.main} : Names{});
    EXPECT_EQ(methodsReached(*all, *logger, row.level, true), row.aot ? Names{row.aot} : Names{});
    logger->setDelegate(mainOnly);
    EXPECT_EQ(methodsReached(*mainOnly, *logger, row.level, true), Names{});
    logger->setDelegate(infoOnly);
    EXPECT_EQ(methodsReached(*infoOnly, *logger, row.level, true).size(), row.level == 4 ? 1u : 0u);
  }
}

TEST(KivSdkLogger, BadInputIsAbsorbed) {
  auto recorder = std::make_shared<Recorder>();
  const auto logger = KivSdkLogger::create(recorder);
  auto object = std::make_shared<Counted>();
  const char* nullText = nullptr;
  const char invalid[] = {'a', '\xff', 'b', 0};
  constexpr auto kMax = std::numeric_limits<std::uint64_t>::max();
  logger->logWithModule(nullptr, 4, nullText, invalid, 0, "%@ %d", object, 7);
  logger->logWithModule("", 4, "f\u00e9.cpp", "run", kMax, nullptr, 1, "ignored");
  logger->aotLogWithModule(std::nullopt, 2, "f", "g", 3, "%d%%", 50);
  EXPECT_EQ(recorder->take(),
            (std::vector<Line>{
                {"logInfoWithModule", "<unknown>", "<unknown>", "<unknown>", 0, "<Counted> 7"},
                {"logInfoWithModule", "", "f\u00e9.cpp", "run", kMax, ""},
                {"aotLogErrorWithModule", "<unknown>", "f", "g", 3, "50%"}}));

  EXPECT_EQ(KivSdkLogger::nsStringFromCString("caf\u00e9"), "caf\u00e9");
  EXPECT_EQ(KivSdkLogger::nsStringFromCString(nullptr), "<unknown>");
  EXPECT_EQ(KivSdkLogger::nsStringFromCString(invalid), "<unknown>");
  EXPECT_EQ(KivSdkLogger::nsStringFromCString("\xed\xa0\x80"), "<unknown>");  // a surrogate
}

// The message is built before the level and the delegate are looked at, so
// an argument's description runs once per call, delivered or not; without a
// format string the arguments are never touched.
TEST(KivSdkLogger, EveryLineIsFormattedEvenWhenDropped) {
  auto object = std::make_shared<Counted>();
  auto mainOnly = std::make_shared<Recorder>(0);
  const auto logger = KivSdkLogger::create();
  logger->logWithModule("m", 4, "f", "g", 1, "%@", object);     // no delegate
  logger->aotLogWithModule("m", 1, "f", "g", 1, "%@", object);  // no delegate
  logger->setDelegate(mainOnly);
  logger->logWithModule("m", 0, "f", "g", 1, "%@", object);     // no such level
  logger->logWithModule("m", 9, "f", "g", 1, "%@", object);     // no such level
  logger->aotLogWithModule("m", 5, "f", "g", 1, "%@", object);  // no aot level 5
  logger->aotLogWithModule("m", 4, "f", "g", 1, "%@", object);  // not implemented
  EXPECT_EQ(object->calls, 6);
  EXPECT_TRUE(mainOnly->take().empty());
  logger->logWithModule("m", 4, "f", "g", 1, nullptr, object);
  logger->logWithModule("m", 9, "f", "g", 1, nullptr, object);
  EXPECT_EQ(object->calls, 6);
  EXPECT_EQ(mainOnly->take().size(), 1u);
}

TEST(KivSdkLogger, HoldsTheDelegateWeakly) {
  auto recorder = std::make_shared<Recorder>();
  const auto logger = KivSdkLogger::create(recorder);
  KivSwiftSdkLogger facade("app", recorder);
  EXPECT_EQ(logger->delegate(), recorder);
  EXPECT_EQ(recorder.use_count(), 1);

  auto replacement = std::make_shared<Recorder>();
  logger->setDelegate(replacement);
  logger->logWithModule("m", 1, "f", "g", 1, "to the replacement");
  EXPECT_TRUE(recorder->take().empty());
  EXPECT_EQ(replacement->take().size(), 1u);
  // Two loggers used in turn on one thread each reach their own delegate.
  for (int i = 0; i < 3; ++i) {
    logger->logWithModule("m", 1, "f", "g", 1, "a");
    facade.logCritical("m", "f", "g", 1, "b");
  }
  EXPECT_EQ(replacement->take().size(), 3u);
  EXPECT_EQ(recorder->take().size(), 3u);

  logger->setDelegate(nullptr);
  facade.setLoggerDelegate(nullptr);
  logger->logWithModule("m", 1, "f", "g", 1, "dropped");
  facade.logCritical("m", "f", "g", 1, "dropped");
  EXPECT_TRUE(replacement->take().empty());

  logger->setDelegate(replacement);
  facade.setLoggerDelegate(replacement);
  replacement.reset();
  EXPECT_EQ(logger->delegate(), nullptr);
  logger->logWithModule("m", 1, "f", "g", 1, "no-op");
  facade.logCritical("m", "f", "g", 1, "no-op");
  facade.aotLogCritical("m", "f", "g", 1, "no-op");
}

TEST(KivSdkLogger, ADelegateMayLogFromInsideADelivery) {
  auto recorder = std::make_shared<Recorder>();
  const auto logger = KivSdkLogger::create(recorder);
  std::vector<std::string> seen;  // the outer message, read after the nested call
  recorder->onLine = [&](std::string_view message) {
    if (message != "outer 1") return;
    logger->logWithModule("m", 5, "f", "g", 2, "inner %d", 2);
    seen.emplace_back(message);
  };
  logger->logWithModule("m", 4, "f", "g", 1, "outer %d", 1);
  const auto lines = recorder->take();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].message, "outer 1");
  EXPECT_EQ(lines[1].message, "inner 2");
  EXPECT_EQ(seen, std::vector<std::string>{"outer 1"});
}

TEST(KivSwiftSdkLogger, PassesLinesThroughWithTheDefaultModule) {
  auto recorder = std::make_shared<Recorder>(KivSdkLoggerDelegateAotLogWarn);
  KivSwiftSdkLogger log("app", recorder);
  const char* nullModule = nullptr;
  log.logInfo(nullptr, "a.cpp", "f", 1, "%d stays");
  log.setDefaultModule("changed");
  log.logWarn(std::nullopt, "a.cpp", "f", 2, "w");
  log.logError(nullModule, "a.cpp", "f", 3, "e");
  log.logCritical("", "a.cpp", "f", 4, "c");
  log.logVerbose("net", "a.cpp", "f", 5, "v");
  log.logSupport("net", "a.cpp", "f", 6, "s");
  log.aotLogWarn(nullptr, "a.cpp", "f", 7, "aw");
  log.aotLogInfo("net", "a.cpp", "f", 8, "dropped: not implemented");
  log.aotLogError("net", "a.cpp", "f", 9, "dropped");
  log.aotLogCritical("net", "a.cpp", "f", 10, "dropped");
  EXPECT_EQ(recorder->take(),
            (std::vector<Line>{{"logInfoWithModule", "app", "a.cpp", "f", 1, "%d stays"},
                               {"logWarnWithModule", "changed", "a.cpp", "f", 2, "w"},
                               {"logErrorWithModule", "changed", "a.cpp", "f", 3, "e"},
                               {"logCriticalWithModule", "", "a.cpp", "f", 4, "c"},
                               {"logVerboseWithModule", "net", "a.cpp", "f", 5, "v"},
                               {"logSupportWithModule", "net", "a.cpp", "f", 6, "s"},
                               {"aotLogWarnWithModule", "changed", "a.cpp", "f", 7, "aw"}}));
}

// Threads log through both entry points while another replaces and destroys
// delegates: every delivered line is whole and no delegate is called after
// its destruction (the Recorder checks; ASan and TSan watch the rest).
TEST(KivSdkLogger, DelegateCanBeReplacedWhileThreadsLog) {
  auto first = std::make_shared<Recorder>();
  const auto logger = KivSdkLogger::create(first);
  KivSwiftSdkLogger facade("app", first);
  std::atomic<bool> stop{false};
  testing::Signal delivered;
  std::vector<std::thread> threads;
  for (int t = 0; t < 3; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; !stop; ++i) {
        logger->logWithModule("m", 4, "f", "g", i, "thread %d line %d", t, i);
        facade.aotLogInfo(nullptr, "f", "g", i, "facade");
      }
    });
  }
  for (int round = 0; round < 200; ++round) {
    auto next = std::make_shared<Recorder>();
    next->onLine = [&](std::string_view message) {
      EXPECT_TRUE(message == "facade" || message.starts_with("thread ")) << message;
      delivered.notify();
    };
    logger->setDelegate(next);
    facade.setLoggerDelegate(round % 2 ? next : nullptr);
    first = next;  // destroys the previous one, possibly while a call is under way
  }
  EXPECT_TRUE(delivered.wait(100));  // the last delegate stays: lines keep coming
  stop = true;
  for (auto& thread : threads) thread.join();
}

}  // namespace
}  // namespace kivi
