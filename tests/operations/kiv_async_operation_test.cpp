#include "kivi/operations/kiv_async_operation.h"

#include <gtest/gtest.h>

#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "kivi/foundation/error.h"
#include "operations/async_test_support.h"

namespace kivi {
namespace {

using optest::Event;
using optest::Recorder;
using State = KivAsyncOperation::State;

// "wR dF" → (will, isReady), (did, isFinished); R/E/F = isReady/isExecuting/isFinished.
std::vector<Event> events(const std::string& script) {
  std::vector<Event> out;
  std::istringstream words(script);
  for (std::string w; words >> w;)
    out.emplace_back(w[0] == 'w' ? "will" : "did", w[1] == 'R'   ? "isReady"
                                                   : w[1] == 'E' ? "isExecuting"
                                                                 : "isFinished");
  return out;
}

TEST(KivAsyncOperationVariants, StartReadyIdleAndAsynchronous) {
  auto flags = std::make_shared<KivAsyncOperationObjC>();
  EXPECT_TRUE(flags->readyState());
  EXPECT_EQ(flags->completionError(), nullptr);
  auto enumerated = std::make_shared<KivAsyncOperation>();
  EXPECT_EQ(enumerated->state(), State::ready);
  EXPECT_EQ(enumerated->completionError(), nullptr);
  for (OperationPtr op : {OperationPtr(flags), OperationPtr(enumerated)}) {
    SCOPED_TRACE(op->className());
    EXPECT_TRUE(op->isReady());
    EXPECT_FALSE(op->isExecuting());
    EXPECT_FALSE(op->isFinished());
    EXPECT_TRUE(op->isAsynchronous());
  }
}

TEST(KivAsyncOperationObjC, ReadyGateAnnouncesEverySetAndNarrowsDependencies) {
  auto op = std::make_shared<KivAsyncOperationObjC>();
  auto recorder = Recorder::watch(*op, {"isReady"});
  for (bool gate : {false, false, true}) {  // the same value again is announced again
    op->setReadyState(gate);
    EXPECT_EQ(op->isReady(), gate);
    EXPECT_EQ(recorder->take(), events("wR dR"));
  }
  auto dependency = std::make_shared<BlockOperation>([] {});
  op->addDependency(dependency);
  EXPECT_FALSE(op->isReady()) << "gate open, dependency unfinished";
  dependency->start();
  ASSERT_TRUE(dependency->isFinished());
  EXPECT_TRUE(op->isReady());
  op->setReadyState(false);
  EXPECT_FALSE(op->isReady()) << "dependency finished, gate closed";
}

TEST(KivAsyncOperation, RawValuesRoundTripExactly) {
  const std::pair<State, std::string_view> raw[] = {
      {State::ready, "Ready"}, {State::executing, "Executing"}, {State::finished, "Finished"}};
  for (auto [state, text] : raw) {
    EXPECT_EQ(KivAsyncOperation::rawValue(state), text);
    EXPECT_EQ(KivAsyncOperation::stateFromRawValue(text), state) << text;
  }
  for (std::string_view text : {"ready", "Ready ", " Ready", "", "FINISHED", "executing"})
    EXPECT_EQ(KivAsyncOperation::stateFromRawValue(text), std::nullopt) << '"' << text << '"';
}

// What each path announces to an observer of the three state keys. `setup`
// runs unrecorded, then `steps`; E = moveToExecutingState, C = coreCompleteOperation.
TEST(AsyncOperationTransitions, AnnounceExactSequences) {
  struct Case {
    bool flags;
    const char *setup, *steps, *expected;
    bool executing, finished;
  };
  const Case cases[] = {
      {true, "", "E", "wE wF dF dE", true, false},
      {true, "E", "C", "wE wF dF dE", false, true},
      {true, "", "C", "wE wF dF dE", false, true},  // completed without starting
      {true, "E", "CC", "wE wF dF dE wE wF dF dE", false, true},
      {false, "", "E", "wR wE dE dR", true, false},
      {false, "E", "C", "wE wF dF dE", false, true},
      {false, "", "C", "wR wF dF dR", false, true},
      {false, "C", "C", "wF wF dF dF", false, true},  // completed twice
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.flags ? "ObjC " : "enum ") + c.setup + "|" + c.steps);
    auto flags = std::make_shared<KivAsyncOperationObjC>();
    auto enumerated = std::make_shared<KivAsyncOperation>();
    OperationPtr op = c.flags ? OperationPtr(flags) : OperationPtr(enumerated);
    auto step = [&](char s) {
      if (c.flags) s == 'E' ? flags->moveToExecutingState() : flags->coreCompleteOperation();
      if (!c.flags)
        s == 'E' ? enumerated->moveToExecutingState() : enumerated->coreCompleteOperation();
    };
    for (const char* s = c.setup; *s; ++s) step(*s);
    auto recorder = Recorder::watch(*op, {"isReady", "isExecuting", "isFinished"});
    for (const char* s = c.steps; *s; ++s) step(*s);
    EXPECT_EQ(recorder->take(), events(c.expected));
    EXPECT_EQ(op->isExecuting(), c.executing);
    EXPECT_EQ(op->isFinished(), c.finished);
  }
}

// An observer reacting to "isFinished" must already see the outcome, and the
// announced new value must read finished.
TEST(AsyncOperationTransitions, CompletionErrorIsVisibleToFinishedObservers) {
  optest::forBothVariants([]<class Probe>() {
    auto op = std::make_shared<Probe>();
    auto error = Error::create("Test", 7);
    op->moveToExecutingState();
    auto recorder = Recorder::watch(*op, {"isFinished"}, KeyValueObservingOptionNew);
    int didChanges = 0;
    recorder->hook = [&](const Event&, Object* object, const Dictionary& change) {
      ++didChanges;
      EXPECT_EQ(dynamic_cast<Probe&>(*object).completionError(), error);
      auto value = change.find(KeyValueChangeNewKey);
      EXPECT_TRUE(value != change.end() && value->second == Value(true));
    };
    op->setCompletionError(error);
    op->coreCompleteOperation();
    EXPECT_EQ(didChanges, 1);
  });
}

}  // namespace
}  // namespace kivi
