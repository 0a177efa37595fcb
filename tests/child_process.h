// Child processes for tests that need another process: a second copy of the
// test binary, a bus tool, a daemon. Every wait has a deadline, after which
// the child is killed, so a stuck child fails its test instead of hanging
// the suite.
//
//   auto r = kivi::testing::runChild({"/proc/self/exe", "--gtest_filter=Child.Run"},
//                                    {"KIVI_CHILD=1"}, dir + "/child.out");
//   EXPECT_EQ(kivi::testing::printed(r.output, "ANSWER"), "42");
#pragma once

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <iterator>
#include <regex>
#include <string>
#include <thread>
#include <vector>

extern char** environ;

namespace kivi::testing {

// This process's environment with `overrides` ("NAME=value") replacing the
// variables of the same names.
inline std::vector<std::string> environmentWith(const std::vector<std::string>& overrides) {
  std::vector<std::string> env = overrides;
  for (char** e = environ; *e; ++e) {
    const std::string inherited = *e;
    const std::string name = inherited.substr(0, inherited.find('=') + 1);
    if (std::none_of(overrides.begin(), overrides.end(),
                     [&](const std::string& given) { return given.starts_with(name); })) {
      env.push_back(inherited);
    }
  }
  return env;
}

// Starts `arguments` (argv[0] a path) with environmentWith(`environment`) and,
// when `outputFile` is not empty, stdout into it. Answers the pid, or -1.
inline pid_t spawnChild(const std::vector<std::string>& arguments,
                        const std::vector<std::string>& environment = {},
                        const std::string& outputFile = "") {
  const std::vector<std::string> env = environmentWith(environment);
  std::vector<char*> argv, envp;
  for (const auto& a : arguments) argv.push_back(const_cast<char*>(a.c_str()));
  argv.push_back(nullptr);
  for (const auto& e : env) envp.push_back(const_cast<char*>(e.c_str()));
  envp.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  if (!outputFile.empty()) {
    posix_spawn_file_actions_addopen(&actions, 1, outputFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0600);
  }
  pid_t pid = -1;
  const int spawned = ::posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), envp.data());
  posix_spawn_file_actions_destroy(&actions);
  return spawned == 0 ? pid : -1;
}

struct ChildResult {
  int exitCode = -1;  // -1: not started, killed or ended by a signal
  std::string output;
};

// Waits for `pid` until `timeout` (then kills it) and reads `outputFile`.
inline ChildResult waitForChild(pid_t pid, const std::string& outputFile = "",
                                std::chrono::seconds timeout = std::chrono::seconds(30)) {
  ChildResult result;
  if (pid <= 0) return result;
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  int status = 0;
  while (::waitpid(pid, &status, WNOHANG) == 0) {
    if (std::chrono::steady_clock::now() > deadline) ::kill(pid, SIGKILL);
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  if (!outputFile.empty()) {
    std::ifstream in(outputFile);
    result.output.assign(std::istreambuf_iterator<char>(in), {});
  }
  return result;
}

inline ChildResult runChild(const std::vector<std::string>& arguments,
                            const std::vector<std::string>& environment = {},
                            const std::string& outputFile = "") {
  return waitForChild(spawnChild(arguments, environment, outputFile), outputFile);
}

// The value a child printed as "NAME=value" on a line of its own.
inline std::string printed(const std::string& output, const std::string& name) {
  std::smatch m;
  if (std::regex_search(output, m, std::regex("(^|\n)" + name + "=([^\n]*)"))) return m[2];
  return "<not printed>";
}

}  // namespace kivi::testing
