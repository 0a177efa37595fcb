// The kivi binary run as a user runs it: arguments, standard input, exit
// code, and what lands on standard output and standard error.
#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "test_servers.h"
#include "tools/tool_run.h"

namespace kivi {
namespace {

using testing::HttpServer;

using testing::kivi;
using testing::ToolRun;
const auto& quoted = testing::shellQuoted;

TEST(KiviToolTest, GetClassifiesEachAnswerAndExitsWithItsStatus) {
  HttpServer server;
  const struct {
    std::vector<std::string> args;
    int exit;
    std::string out, err;
  } rows[] = {
      {{"get", server.url("/")},
       0,
       "status: KivJSONAPIOperationCompletionStatusSuccess\nhttp: 200\n",
       ""},
      {{"get", server.url("/status/401")},
       7,
       "status: KivJSONAPIOperationCompletionStatusUnauthorized\nhttp: 401\n",
       ""},
      {{"get", server.url("/status/403")},
       6,
       "status: KivJSONAPIOperationCompletionStatusAccessDenied\n",
       ""},
      {{"get", server.url("/status/299")},
       0,
       "status: KivJSONAPIOperationCompletionStatusSuccess\nhttp: 299\n",
       ""},
      {{"get", server.url("/status/300")},
       8,
       "status: KivJSONAPIOperationCompletionStatusInvalidServerResponse\nhttp: 300\n",
       ""},
      {{"get", server.url("/status/500")},
       8,
       "status: KivJSONAPIOperationCompletionStatusInvalidServerResponse\n",
       ""},
      {{"get", server.url("/?type=text/plain")},
       5,
       "status: KivJSONAPIOperationCompletionStatusInvalidContentType\n",
       ""},
      {{"get", server.url("/?type=text/plain"), "--allow-non-json"}, 0, "http: 200", ""},
      {{"get", server.url("/"), "--method", "POST", "--json", "{\"a\":[1]}"}, 0, "Success", ""},
      {{"get", server.url("/"), "--json", "{not json"}, 3, "FailedToBuildRequest", ""},
      {{"get", testing::refusedURL()}, 4, "error: NSURLErrorDomain -1004: ", ""},
      {{"get", "not a url"},
       2,
       "status: KivJSONAPIOperationCompletionStatusInvalidInput",
       "is not a valid absolute URL"},
      {{"get", server.url("/"), "--timeout", "0"}, 2, "", "positive number of seconds"},
      {{"get", server.url("/"), "--header", "NoColon"}, 2, "", "'Name: value'"},
      {{"get"}, 2, "", "no URL given"},
  };
  for (const auto& row : rows) {
    const ToolRun run = kivi(row.args);
    EXPECT_EQ(run.exit, row.exit) << row.args.back() << "\n" << run.out << run.err;
    EXPECT_NE(run.out.find(row.out), std::string::npos) << run.out;
    EXPECT_NE(run.err.find(row.err), std::string::npos) << run.err;
  }
  const auto requests = server.requests();
  ASSERT_FALSE(requests.empty());
  EXPECT_EQ(requests.back().method, "POST");
  std::string body = requests.back().body;
  std::erase_if(body, [](char c) { return c == ' ' || c == '\n'; });
  EXPECT_EQ(body, "{\"a\":[1]}");
}

// Secrets go to the server and to standard output, which belong to the user,
// but never into the log on standard error.
TEST(KiviToolTest, VerboseGetLogsRequestAndAnswerRedacted) {
  HttpServer server;
  const ToolRun run =
      kivi({"--verbose", "get",
            server.url("/p?key=SecretKey1&set-cookie=sid%3DSecretCookie2%3B%20Path%3D/"),
            "--header", "Authorization: Bearer SecretToken3"});
  ASSERT_EQ(run.exit, 0) << run.out << run.err;
  EXPECT_NE(run.out.find("Set-Cookie: sid=SecretCookie2; Path=/"), std::string::npos) << run.out;
  ASSERT_EQ(server.requests().size(), 1u);
  EXPECT_EQ(server.requests()[0].headers.find("Authorization")->second, "Bearer SecretToken3");

  for (const std::string& expected : std::vector<std::string>{
           "[info] kivi main.cpp:", "running command get",
           "sending GET " + server.url("/p?key=***&set-cookie=***"), "answer: ", "Status Code: 200",
           "Set-Cookie: sid=***, path=/, domain=127.0.0.1;"}) {
    EXPECT_NE(run.err.find(expected), std::string::npos) << expected << " not in\n" << run.err;
  }
  for (const char* secret : {"SecretKey1", "SecretCookie2", "SecretToken3"})
    EXPECT_EQ(run.err.find(secret), std::string::npos) << secret << " in\n" << run.err;

  // A user name holding "%40" decodes to a URL that does not parse again, so
  // the answer cannot be redacted as a whole: only its code is logged.
  std::string odd = server.url("/?key=SecretKey4&set-cookie=sid%3DSecretCookie5");
  odd.insert(odd.find("//") + 2, "a%40b@");
  const ToolRun fallback = kivi({"--verbose", "get", odd});
  ASSERT_EQ(fallback.exit, 0) << fallback.out << fallback.err;
  EXPECT_NE(fallback.err.find("answer: HTTP 200 from http://a@b@127.0.0.1:"), std::string::npos)
      << fallback.err;
  for (const char* secret : {"SecretKey4", "SecretCookie5"})
    EXPECT_EQ(fallback.err.find(secret), std::string::npos) << secret << " in\n" << fallback.err;

  const ToolRun quiet = kivi({"get", server.url("/")});
  EXPECT_EQ(quiet.err, "");
}

TEST(KiviToolTest, TextCommands) {
  const struct {
    std::vector<std::string> args;
    std::string input;
    int exit;
    std::string out;
  } rows[] = {
      {{"sha256", "abc"},
       "",
       0,
       "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad\n"},
      {{"base64", "encode", "foobar"}, "", 0, "Zm9vYmFy\n"},
      {{"redact", "url", "https://h/a?k=v&e="}, "", 0, "https://h/a?k=***&e=\n"},
      {{"redact", "token"}, "", 0, "nil\n"},
      {{"redact", "headers"}, "X-B: 2\nAuthorization: t\n", 0, "Authorization: ***\nX-B: 2\n"},
      {{"redact", "keep", "X-B"}, "X-B: 2\nX-A: 1\n", 0, "X-A: ***\nX-B: 2\n"},
      {{"redact", "headers"}, "no colon\n", 2, ""},
      // CRLF line ends, as copied from a wire trace: no value keeps the CR.
      {{"redact", "headers"},
       "X-B: 2\r\nAuthorization: t\r\n\r\n",
       0,
       "Authorization: ***\nX-B: 2\n"},
      {{"redact", "keep", "X-B"}, "X-B: 1\r\nX-A: 1\r\nX-B: 2\r\n", 0, "X-A: ***\nX-B: 1, 2\n"},
      {{"redact", "headers", "--url", "https://d/"},
       "Set-Cookie: a=1\r\nset-cookie: b=2\r\n",
       0,
       "Set-Cookie: a=***, path=/, domain=d;\nset-cookie: b=2\n"},
      {{"ulo", "get", "-", "B"}, "A=1\r\nB=2\r\n", 0, "2\n"},
      {{"ulo", "get", "-", "C"}, "A=1\r\nB=2\r\n", 1, ""},
      {{"ulo", "get", "-", ".*.*b"}, std::string(1024, 'a') + "\n", 3, ""},
      {{"ulo", "get", "-", "A"}, "A=\xff\n", 2, ""},
      {{"ulo", "get", "-"}, "A=1\n", 2, ""},
      {{"ulo", "bool", "-", "Flag", "on"}, "Flag=ON\r\n", 0, "true\n"},
      {{"ulo", "bool", "-", "Missing", "on"}, "Flag=ON\r\n", 0, "false\n"},
      {{"obfuscate", "Hello"}, "", 0, "BZ\\WU\n"},
      {{"unobfuscate", "BZ\\WU"}, "", 0, "Hello\n"},
      {{"nosuchcommand"}, "", 2, ""},
      {{}, "", 2, ""},
  };
  for (const auto& row : rows) {
    std::string call = "kivi";
    for (const auto& arg : row.args) call += " " + arg;
    SCOPED_TRACE(call + " < " + ::testing::PrintToString(row.input));
    const ToolRun run = kivi(row.args, row.input);
    EXPECT_EQ(run.exit, row.exit) << run.err;
    EXPECT_EQ(run.out, row.out) << run.err;
  }
}

// The demo must finish on its own and show what its help promises: every
// transition, the parked workflows released in order, and one status line per
// REST call.
TEST(KiviToolTest, DemoFinishesAndShowsTransitionsAndEveryRestStatus) {
  const ToolRun run = kivi({"demo"}, "", 40);
  ASSERT_EQ(run.exit, 0) << (run.exit == 124 ? "kivi demo hung\n" : "") << run.out << run.err;
  EXPECT_EQ(run.err, "");
  // Journal lines: the label padded to 13 columns, then the text.
  const auto line = [](std::string who, const std::string& what) {
    who.resize(std::max<std::size_t>(who.size(), 13), ' ');
    return "] " + who + what;
  };
  std::vector<std::string> expected;
  for (const char* who :
       {"workflow-1", "workflow-2", "workflow-3", "workflow-4", "job-1", "job-2", "job-3", "job-4",
        "gated", "profile", "session", "admin", "status.txt", "broken", "slow"}) {
    expected.push_back(line(who, "Ready -> Executing"));
    expected.push_back(line(who, "Executing -> Finished"));
  }
  for (const auto& [who, what] : std::vector<std::pair<std::string, std::string>>{
           {"workflow-5", "Ready -> Finished (cancelled before it began)"},
           {"gated", "held back: isReady false"},
           {"gated", "gate open: isReady true"},
           {"profile", "status Success (http 200)"},
           {"session", "status Unauthorized (http 401)"},
           {"admin", "status AccessDenied (http 403)"},
           {"status.txt", "status InvalidContentType (http 200)"},
           {"broken", "status InvalidServerResponse (http 200)"},
           {"slow", "status Cancelled"},
           {"process", "runBlock: /usr/bin/tar czf /tmp/kivi-support.tar.gz -C /var/log/kivi ."},
           {"workspace", "activateFileViewerSelectingBlock: file:///tmp/kivi-support.tar.gz"},
           {"archiver", "tar answered status 0: archive shown"},
           {"archiver", "tar answered status 2: nothing shown"}}) {
    expected.push_back(line(who, what));
  }
  expected.push_back(
      "Parked workflows were released in this order: workflow-2 workflow-3 workflow-4 "
      "workflow-5\n");
  for (const std::string& text : expected)
    EXPECT_NE(run.out.find(text), std::string::npos) << text << " not in\n" << run.out;
  const std::string most = "Most operations executing at once: ";
  const auto at = run.out.find(most);
  ASSERT_NE(at, std::string::npos) << run.out;
  EXPECT_TRUE(run.out.compare(at + most.size(), 2, "1 ") == 0 ||
              run.out.compare(at + most.size(), 2, "2 ") == 0)
      << "more than the service's limit of 2 ran at once:\n"
      << run.out;
}

}  // namespace
}  // namespace kivi

// ---- kivi lock ----

#include <signal.h>
#include <spawn.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <set>
#include <thread>

#include "kivi/dispatch/distributed_lock.h"
#include "kivi/text/json_serialization.h"

namespace kivi {
namespace {

// A fresh directory for one test's lock and files, removed with the object.
struct LockTestDirectory {
  std::string path = ::testing::TempDir() + "kivi_lock_XXXXXX";
  LockTestDirectory() { EXPECT_NE(::mkdtemp(path.data()), nullptr); }
  ~LockTestDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
  }
};

TEST(KiviToolTest, LockRunsTheCommandWhileHoldingTheLock) {
  LockTestDirectory dir;
  const std::string lock = dir.path + "/lock", ran = dir.path + "/ran";
  EXPECT_EQ(kivi({"lock", lock, "--", "sh", "-c", "test -d \"$0\" && exit 7", lock}).exit, 7);
  EXPECT_EQ(kivi({"lock", lock, "--", "sh", "-c", "kill -TERM $$"}).exit, 128 + SIGTERM);
  EXPECT_EQ(kivi({"lock", lock, "--", dir.path + "/no-such-program"}).exit, 127);
  EXPECT_FALSE(std::filesystem::exists(lock));

  ASSERT_TRUE(NSDistributedLock::lockWithPath(lock)->tryLock());
  const ToolRun held = kivi({"lock", lock, "--timeout", "0.3", "--", "touch", ran});
  EXPECT_EQ(held.exit, 75);
  EXPECT_NE(held.err.find("was not free within 0.3 seconds"), std::string::npos) << held.err;
  EXPECT_EQ(kivi({"lock", "--break", lock}).exit, 0);
  EXPECT_EQ(kivi({"lock", lock, "--", "touch", ran}).exit, 0);
  EXPECT_TRUE(std::filesystem::exists(ran));

  for (const std::vector<std::string>& args :
       std::vector<std::vector<std::string>>{{"lock"},
                                             {"lock", lock, "--"},
                                             {"lock", lock, "--timeout", "-1", "--", "true"},
                                             {"lock", lock, "--resolution", "nan", "--", "true"},
                                             {"lock", lock, "x", "--", "true"},
                                             {"lock", lock, "--wait", "1", "--", "true"},
                                             {"lock", "", "--", "true"}}) {
    EXPECT_EQ(kivi(args).exit, 64) << ::testing::PrintToString(args);
  }
  EXPECT_EQ(kivi({"lock", dir.path + "/missing/lock", "--", "true"}).exit, 73);
  EXPECT_EQ(kivi({"lock", "--break", ran}).exit, 73);
}

// Workers in four processes each take the lock 25 times and write one line
// in three write() calls while holding it: no line may be torn, none lost.
TEST(KiviToolTest, LockKeepsProcessesFromInterleavingTheirWrites) {
  LockTestDirectory dir;
  std::ofstream(dir.path + "/worker.sh")
      << "i=0; while [ $i -lt 25 ]; do\n"
         "  \"$1\" lock \"$2\" --timeout 60 --resolution 0.002 -- sh -c 'printf \"%s \" \"$1\" "
         ">>\"$0\"; printf \"%s \" \"$2\" >>\"$0\"; printf \"end\\n\" >>\"$0\"' \"$3\" \"$4\" $i "
         "|| exit 1\n"
         "  i=$((i + 1)); done\n";
  std::string workers;
  for (int w = 0; w < 4; ++w) {
    workers += "sh " + quoted(dir.path + "/worker.sh") + " " + quoted(KIVI_TOOL_PATH) + " " +
               quoted(dir.path + "/lock") + " " + quoted(dir.path + "/out") + " w" +
               std::to_string(w) + " & ";
  }
  ASSERT_EQ(std::system(("timeout -k 5 50 sh -c " + quoted(workers + "wait")).c_str()), 0);
  std::set<std::string> expected, lines;
  for (int w = 0; w < 4; ++w) {
    for (int i = 0; i < 25; ++i)
      expected.insert("w" + std::to_string(w) + " " + std::to_string(i) + " end");
  }
  std::ifstream out(dir.path + "/out");
  for (std::string line; std::getline(out, line);) EXPECT_TRUE(lines.insert(line).second) << line;
  EXPECT_EQ(lines, expected);
}

TEST(KiviToolTest, LockIsReleasedWhenTheToolIsTerminatedWhileTheCommandRuns) {
  LockTestDirectory dir;
  const std::string lock = dir.path + "/lock", started = dir.path + "/started";
  std::vector<std::string> args = {
      KIVI_TOOL_PATH, "lock", lock, "--", "sh", "-c", "touch \"$0\"; exec sleep 30", started};
  std::vector<char*> argv;
  for (auto& arg : args) argv.push_back(arg.data());
  argv.push_back(nullptr);
  pid_t pid = 0;
  ASSERT_EQ(::posix_spawn(&pid, argv[0], nullptr, nullptr, argv.data(), environ), 0);
  int status = 0;
  const auto within20s = [](const std::function<bool()>& done) {
    for (auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20); !done();) {
      if (std::chrono::steady_clock::now() > deadline) return false;
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return true;
  };
  EXPECT_TRUE(within20s([&] { return std::filesystem::exists(started); }));
  EXPECT_TRUE(std::filesystem::exists(lock));
  ::kill(pid, SIGTERM);
  if (!within20s([&] { return ::waitpid(pid, &status, WNOHANG) == pid; })) {
    ::kill(pid, SIGKILL);
    ::waitpid(pid, &status, 0);
    FAIL() << "kivi lock ignored SIGTERM";
  }
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 128 + SIGTERM) << status;
  EXPECT_FALSE(std::filesystem::exists(lock));
}

}  // namespace
}  // namespace kivi

namespace kivi {
namespace {

// Every fact, aligned for people and as one object for scripts; with no
// keyring or fingerprint service to reach, their answers are the in-band ones.
TEST(KiviToolTest, DeviceListsEveryFact) {
  ::setenv("DBUS_SESSION_BUS_ADDRESS", "unix:path=/nonexistent/kivi-bus", 1);
  ::setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/kivi-bus", 1);
  const ToolRun text = kivi({"device"});
  ASSERT_EQ(text.exit, 0) << text.err;
  const std::vector<std::string> names = {"machine",
                                          "platformName",
                                          "hardwareModel",
                                          "isDeviceiPadPro",
                                          "isDeviceiPhoneX",
                                          "processResidentSize",
                                          "processPhysicalFootprint",
                                          "physicalMemory",
                                          "processFreeMemory",
                                          "totalMemory",
                                          "userMemory",
                                          "applicationMemory",
                                          "freeMemory",
                                          "percentCpuUsage",
                                          "touchID",
                                          "faceID",
                                          "serialNumber",
                                          "applicationIdentifierPrefix",
                                          "region",
                                          "timeZone",
                                          "locatedInEU"};
  std::istringstream lines(text.out);
  std::string line;
  std::size_t column = std::string::npos;
  for (const auto& name : names) {
    ASSERT_TRUE(std::getline(lines, line)) << name;
    EXPECT_TRUE(line.starts_with(name + ":") || line.starts_with(name + " (")) << line;
    const std::size_t value = line.find_first_not_of(' ', line.find(':') + 1);
    if (column == std::string::npos) column = value;
    EXPECT_EQ(value, column) << line;  // aligned
  }
  EXPECT_NE(text.out.find(" none (NSOSStatusErrorDomain -25291)\n"), std::string::npos) << text.out;

  const ToolRun json = kivi({"device", "--json"});
  ASSERT_EQ(json.exit, 0) << json.err;
  ErrorPtr error;
  const auto object = JSONSerialization::JSONObjectWithData(json.out, 0, &error);
  ASSERT_TRUE(object && object->asDictionary()) << json.out;
  for (const auto& name : names) EXPECT_TRUE(object->asDictionary()->contains(name)) << name;
  EXPECT_TRUE(object->asDictionary()->at("processResidentSize").asNumber());

  EXPECT_EQ(kivi({"device", "--yaml"}).exit, 2);
  ::unsetenv("DBUS_SESSION_BUS_ADDRESS");
  ::unsetenv("DBUS_SYSTEM_BUS_ADDRESS");
}

}  // namespace
}  // namespace kivi
