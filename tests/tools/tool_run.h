// Runs the kivi tool under test (KIVI_TOOL_PATH) as a separate process, with
// the test's own environment, and collects its exit code and both streams.
//
//   const kivi::testing::ToolRun run = kivi::testing::kivi({"sha256", "-"}, "abc");
//   EXPECT_EQ(run.exit, 0);
#pragma once

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace kivi::testing {

struct ToolRun {
  int exit = -1;  // 124: killed at the deadline
  std::string out, err;
};

inline std::string shellQuoted(const std::string& arg) {
  std::string q = "'";
  for (char c : arg) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return q + "'";
}

inline std::string slurp(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path).rdbuf();
  return text.str();
}

// Runs the tool with `input` on stdin (whatever PATH the test has set); one still running after
// `deadline` seconds is killed and reported with exit code 124.
inline ToolRun kivi(const std::vector<std::string>& args, const std::string& input = "",
                    int deadline = 20) {
  // ctest runs test cases as parallel processes: one set of files each.
  const std::string base = ::testing::TempDir() + "kivi_" + std::to_string(::getpid()) + "_";
  std::ofstream(base + "in") << input;
  std::string command =
      "/usr/bin/timeout -k 5 " + std::to_string(deadline) + " " + shellQuoted(KIVI_TOOL_PATH);
  for (const auto& arg : args) command += " " + shellQuoted(arg);
  command += " <" + base + "in >" + base + "out 2>" + base + "err";
  const int status = std::system(command.c_str());
  ToolRun run{WIFEXITED(status) ? WEXITSTATUS(status) : -1, slurp(base + "out"),
              slurp(base + "err")};
  for (const char* name : {"in", "out", "err"}) std::remove((base + name).c_str());
  return run;
}

}  // namespace kivi::testing
