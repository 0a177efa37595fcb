// kivi demo: runs asynchronous operations through an atomic workflow service
// and a concurrent service, printing each observed state transition.
#include <httplib.h>

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <iomanip>
#include <map>
#include <mutex>
#include <ostream>
#include <set>
#include <thread>

#include "command.h"
#include "demo_doubles.h"
#include "demo_timing.h"
#include "journal.h"
#include "kivi/base/error.h"
#include "kivi/dispatch/worker_pool.h"
#include "kivi/net/url_session.h"
#include "kivi/operations/kiv_async_operation.h"
#include "kivi/operations/kiv_async_service.h"
#include "kivi/operations/kiv_json_api_operation.h"
#include "kivi/text/json_serialization.h"

namespace kivi::tool {

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// Counts finished operations; wait() gives up at a deadline.
class Countdown {
 public:
  explicit Countdown(int count) : count_(count) {}
  void done() {
    std::lock_guard lock(mutex_);
    if (--count_ <= 0) cv_.notify_all();
  }
  bool wait(milliseconds timeout) {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, timeout, [&] { return count_ <= 0; });
  }

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  int count_;
};

// Prints every Executing and Finished transition of the operations it
// watches, and readiness changes of gated ones; tracks how many of them
// execute at once.
class TransitionPrinter : public Object {
 public:
  explicit TransitionPrinter(Journal& journal) : journal_(journal) {}

  // `gated`: also print the operation's readiness changes.
  void watch(const OperationPtr& operation, const std::string& label, bool gated = false) {
    {
      std::lock_guard lock(mutex_);
      labels_[operation.get()] = label;
      if (gated) gated_.insert(operation.get());
    }
    journal_.line(label, "Ready");
    auto self = shared_from_this();
    for (const char* key : {"isReady", "isExecuting", "isFinished"}) {
      operation->addObserver(self, key, KeyValueObservingOptionNew, nullptr);
    }
  }

  std::string label(const Operation* operation) {
    std::lock_guard lock(mutex_);
    auto it = labels_.find(operation);
    return it == labels_.end() ? "?" : it->second;
  }

  int maxExecuting() {
    std::lock_guard lock(mutex_);
    return maxExecuting_;
  }

  void observeValueForKeyPath(std::string_view keyPath, Object* object, const Dictionary& change,
                              void*) override {
    auto* operation = dynamic_cast<Operation*>(object);
    auto it = change.find(KeyValueChangeNewKey);
    if (!operation || it == change.end() || !it->second.asNumber()) return;
    const bool value = it->second.asNumber()->boolValue();
    const std::string who = label(operation);
    if (keyPath == "isReady") {
      bool gated;
      {
        std::lock_guard lock(mutex_);
        gated = gated_.count(operation) && !operation->isExecuting() && !operation->isFinished();
      }
      if (gated) journal_.line(who, value ? "gate open: isReady true" : "held back: isReady false");
    } else if (keyPath == "isExecuting" && value) {
      {
        std::lock_guard lock(mutex_);
        executing_.insert(operation);
        maxExecuting_ = std::max(maxExecuting_, static_cast<int>(executing_.size()));
      }
      journal_.line(who, "Ready -> Executing");
    } else if (keyPath == "isFinished" && value) {
      bool wasExecuting;
      {
        std::lock_guard lock(mutex_);
        wasExecuting = executing_.erase(operation) > 0;
      }
      journal_.line(who, wasExecuting ? "Executing -> Finished"
                                      : "Ready -> Finished (cancelled before it began)");
    }
  }

 private:
  Journal& journal_;
  std::mutex mutex_;
  std::map<const Operation*, std::string> labels_;  // guarded by mutex_
  std::set<const Operation*> gated_;                // guarded by mutex_
  std::set<const Operation*> executing_;            // guarded by mutex_
  int maxExecuting_ = 0;                            // guarded by mutex_
};

ErrorPtr cancelledError() {
  return Error::create("KiviDemoErrorDomain", -999,
                       {{LocalizedDescriptionKey, Value("The operation was cancelled.")}});
}

// Simulated asynchronous work: start() returns at once and the operation
// completes later on another thread. Works with either operation variant.
template <class Base>
class SimulatedWork : public Base {
 public:
  explicit SimulatedWork(milliseconds duration) : duration_(duration) {}

  void start() override {
    if (this->isCancelled()) {
      this->setCompletionError(cancelledError());
      this->coreCompleteOperation();
      return;
    }
    this->moveToExecutingState();
    std::weak_ptr<Object> weak = this->weak_from_this();
    WorkerPool::shared().submit([weak, duration = duration_] {
      std::this_thread::sleep_for(duration);  // the "work"
      if (auto self = std::dynamic_pointer_cast<SimulatedWork>(weak.lock())) {
        self->coreCompleteOperation();
      }
    });
  }

 private:
  milliseconds duration_;
};

// A small JSON API on 127.0.0.1, on a port the system picks.
class DemoServer {
 public:
  DemoServer() {
    auto json = [](int status, const char* body) {
      return [status, body](const httplib::Request&, httplib::Response& res) {
        res.status = status;
        res.set_content(body, "application/json");
      };
    };
    server_.set_tcp_nodelay(true);
    server_.Get("/profile", json(200, R"({"name":"Ada","plan":"pro"})"));
    server_.Get("/session", json(401, R"({"error":"token expired"})"));
    server_.Get("/admin", json(403, R"({"error":"forbidden"})"));
    server_.Get("/broken", json(200, R"({"name":"Ada",)"));
    server_.Get("/status.txt", [](const httplib::Request&, httplib::Response& res) {
      res.set_content("all good", "text/plain");
    });
    // Answers only after the demo has cancelled the request (or 5 s).
    server_.Get("/slow", [this](const httplib::Request&, httplib::Response& res) {
      std::unique_lock lock(mutex_);
      slowArrived_ = true;
      cv_.notify_all();
      cv_.wait_for(lock, std::chrono::seconds(5), [&] { return released_; });
      res.set_content(R"({"late":true})", "application/json");
    });
    port_ = server_.bind_to_any_port("127.0.0.1");
    if (port_ > 0) thread_ = std::thread([this] { server_.listen_after_bind(); });
  }
  ~DemoServer() {
    releaseSlow();
    server_.stop();
    if (thread_.joinable()) thread_.join();
  }

  bool running() const { return port_ > 0; }
  std::string url(const std::string& path) const {
    return "http://127.0.0.1:" + std::to_string(port_) + path;
  }
  bool waitForSlowRequest(milliseconds timeout) {
    std::unique_lock lock(mutex_);
    return cv_.wait_for(lock, timeout, [&] { return slowArrived_; });
  }
  void releaseSlow() {
    std::lock_guard lock(mutex_);
    released_ = true;
    cv_.notify_all();
  }

 private:
  httplib::Server server_;
  int port_ = -1;
  std::thread thread_;
  std::mutex mutex_;
  std::condition_variable cv_;
  bool slowArrived_ = false;  // guarded by mutex_
  bool released_ = false;     // guarded by mutex_
};

// Accepts a 2xx answer with a JSON body.
class DemoCall : public KivJSONAPIOperation {
 public:
  using KivJSONAPIOperation::KivJSONAPIOperation;
  void processHTTPUrlResponse(HTTPURLResponsePtr response,
                              const std::optional<Data>& data) override {
    const bool ok = response && response->statusCode() / 100 == 2 &&
                    JSONSerialization::JSONObjectWithData(data.value_or(Data{}), 0, nullptr);
    completeOperationWithStatus(ok ? KivJSONAPIOperationCompletionStatusSuccess
                                   : KivJSONAPIOperationCompletionStatusInvalidServerResponse,
                                nullptr);
  }
};

std::string outcome(const KivJSONAPIOperation& call) {
  std::string name = KivJSONAPIOperation::descriptionForCompletionStatus(call.completionStatus());
  name.erase(0, std::string_view("KivJSONAPIOperationCompletionStatus").size());
  std::string text = "status " + name;
  if (auto response = call.urlResponse())
    text += " (http " + std::to_string(response->statusCode()) + ")";
  if (auto error = call.completionError()) {
    text += "; error " + error->domain() + " " + std::to_string(error->code()) + ": " +
            error->localizedDescription();
  }
  return text;
}

// 3. REST calls, one atomic workflow each, against the embedded server.
int runRestCalls(Journal& journal, TransitionPrinter& printer, std::ostream& err) {
  DemoServer server;
  if (!server.running()) {
    err << "kivi demo: could not start the embedded server on 127.0.0.1\n";
    return 1;
  }
  journal.heading("REST calls through KivAtomicWorkflowService against " + server.url("/"));
  auto service = std::make_shared<KivAtomicWorkflowService>("kivi.demo.rest");
  auto session =
      URLSession::sessionWithConfiguration(URLSessionConfiguration::defaultSessionConfiguration());
  const std::pair<const char*, const char*> calls[] = {
      {"profile", "/profile"},       {"session", "/session"}, {"admin", "/admin"},
      {"status.txt", "/status.txt"}, {"broken", "/broken"},   {"slow", "/slow"}};
  Countdown done(static_cast<int>(std::size(calls)));
  std::vector<std::shared_ptr<DemoCall>> ops;
  for (const auto& [label, path] : calls) {
    auto op = std::make_shared<DemoCall>(URL::URLWithString(server.url(path)), session);
    printer.watch(op, label);
    std::weak_ptr<KivAtomicWorkflowService> weakService = service;
    std::weak_ptr<DemoCall> weakOp = op;
    op->setCompletionBlock([&, weakService, weakOp, label = std::string(label)] {
      if (auto call = weakOp.lock()) journal.line(label, outcome(*call));
      if (auto s = weakService.lock()) s->endAtomicWorkflow();
      done.done();
    });
    ops.push_back(op);
  }
  for (const auto& op : ops) {
    service->startAtomicWorkflowWithOperation(op);
    journal.line(printer.label(op.get()), service->pendingOperations()->empty()
                                              ? "handed to the queue (workflow begins)"
                                              : "parked");
  }
  // The last call hangs on the server until it is cancelled.
  if (server.waitForSlowRequest(std::chrono::seconds(20))) {
    journal.line("slow", "request reached the server; cancelling it");
    ops.back()->cancel();
  }
  const bool finished = done.wait(std::chrono::seconds(20));
  server.releaseSlow();
  service->operationQueue()->waitUntilAllOperationsAreFinished();
  if (!finished) {
    err << "kivi demo: the REST calls did not finish in time\n";
    return 1;
  }
  return 0;
}

int runDemo(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  if (!args.empty()) {
    err << "kivi demo: unexpected argument '" << args[0] << "'\n";
    return 2;
  }
  Journal journal(out);
  auto printer = std::make_shared<TransitionPrinter>(journal);
  const auto deadline = std::chrono::seconds(20);

  // 1. Atomic workflows: one at a time, the rest parked in arrival order.
  journal.heading("Atomic workflows through KivAtomicWorkflowService \"kivi.demo.workflows\"");
  auto workflows = std::make_shared<KivAtomicWorkflowService>("kivi.demo.workflows");
  std::mutex releasedMutex;
  std::vector<std::string> released;
  Countdown workflowsDone(5);
  std::vector<OperationPtr> workflowOps;
  for (int i = 1; i <= 5; ++i) {
    auto op = std::make_shared<SimulatedWork<KivAsyncOperationObjC>>(milliseconds(15 + 5 * i));
    const std::string name = "workflow-" + std::to_string(i);
    printer->watch(op, name);
    std::weak_ptr<KivAtomicWorkflowService> weakService = workflows;
    op->setCompletionBlock([&, weakService, name] {
      if (auto service = weakService.lock()) {
        std::string next;
        std::lock_guard guard(*service->atomicWorkFlowLock());
        service->enumeratePendingOperationsUsingBlock(
            [&](const OperationPtr& parked, std::uint64_t, bool* stop) {
              next = printer->label(parked.get());
              *stop = true;
            });
        journal.line(name, next.empty() ? "completion: endAtomicWorkflow() (none parked)"
                                        : "completion: endAtomicWorkflow() releases " + next);
        if (!next.empty()) {
          std::lock_guard lock(releasedMutex);
          released.push_back(next);
        }
        service->endAtomicWorkflow();
      }
      workflowsDone.done();
    });
    workflowOps.push_back(op);
  }
  for (const auto& op : workflowOps) {
    workflows->startAtomicWorkflowWithOperation(op);
    journal.line(printer->label(op.get()), workflows->pendingOperations()->empty()
                                               ? "handed to the queue (workflow begins)"
                                               : "parked");
  }
  // A parked workflow that is cancelled is still released in turn, and
  // finishes at once when its turn comes.
  workflowOps.back()->cancel();
  journal.line("workflow-5", "cancelled while parked");
  if (!workflowsDone.wait(deadline)) {
    err << "kivi demo: the workflows did not finish in time\n";
    return 1;
  }

  // 2. A concurrent service: a limit of 2, a dependency and a readiness gate.
  journal.heading("Concurrent KivAsyncService \"kivi.demo.concurrent\" (limit 2)");
  KivAsyncService service("kivi.demo.concurrent", 2);
  Countdown concurrentDone(5);
  auto gated = std::make_shared<SimulatedWork<KivAsyncOperationObjC>>(milliseconds(10));
  printer->watch(gated, "gated", /*gated=*/true);
  gated->setReadyState(false);
  gated->setCompletionBlock([&] { concurrentDone.done(); });
  service.operationQueue()->addOperation(gated);
  std::vector<OperationPtr> jobs;
  const int durations[] = {40, 20, 30, 10};
  for (int i = 0; i < 4; ++i) {
    auto op = std::make_shared<SimulatedWork<KivAsyncOperation>>(milliseconds(durations[i]));
    printer->watch(op, "job-" + std::to_string(i + 1));
    op->setCompletionBlock([&] { concurrentDone.done(); });
    jobs.push_back(op);
  }
  jobs[3]->addDependency(jobs[0]);
  journal.line("job-4", "depends on job-1");
  for (const auto& op : jobs) service.operationQueue()->addOperation(op);
  for (const auto& op : jobs) op->waitUntilFinished();
  journal.line("gated", "all jobs done; still unstarted, opening its gate");
  gated->setReadyState(true);
  if (!concurrentDone.wait(deadline)) {
    err << "kivi demo: the concurrent operations did not finish in time\n";
    return 1;
  }
  service.operationQueue()->waitUntilAllOperationsAreFinished();
  workflows->operationQueue()->waitUntilAllOperationsAreFinished();

  if (int failed = runRestCalls(journal, *printer, err)) return failed;
  if (int failed = runTimingDemo(out, err)) return failed;
  if (int failed = runDoublesDemo(out, err)) return failed;

  out << "\nParked workflows were released in this order:";
  for (const auto& name : released) out << " " << name;
  out << "\nMost operations executing at once: " << printer->maxExecuting()
      << " (service limit 2, workflows 1)\n";
  return 0;
}

}  // namespace

Command demoCommand() {
  return {"demo", "run operations, workflows and REST calls against an embedded server",
          "usage: kivi demo\n\n"
          "Runs simulated asynchronous operations through a KivAtomicWorkflowService\n"
          "(one workflow at a time, later ones parked and released in arrival order,\n"
          "one of them cancelled while parked) and a KivAsyncService with a limit of 2\n"
          "(one dependency, one operation held back by its readiness gate). Prints each\n"
          "observed transition with a timestamp, then the order in which parked\n"
          "workflows were released.\n\n"
          "Then starts a small JSON server on 127.0.0.1 (no outside network needed) and\n"
          "runs one REST call per atomic workflow against it, showing the statuses\n"
          "Success, Unauthorized, AccessDenied, InvalidContentType, InvalidServerResponse\n"
          "and Cancelled (a request cancelled while the server holds it).\n\n"
          "Last, the timing primitives: a repeating KivTimer, a KivRunloopTimer that\n"
          "fires only while the main run loop runs in its mode, a main-thread\n"
          "KivRunLoopSemaphore wait during which main-queue work runs, a\n"
          "KivKeyValueObserver reporting an operation's \"isFinished\" on a chosen\n"
          "queue, and two `kivi lock` child processes taking turns on one lock.\n\n"
          "Finally, a host component that runs tar and shows the archive in the file\n"
          "manager is handed MockKivProcessFactory and MockKivNSWorkspace instead of the\n"
          "real services: their callbacks answer, and nothing is started or opened.\n",
          runDemo};
}

const CommandRegistration kRegistration{10, &demoCommand};

}  // namespace kivi::tool
