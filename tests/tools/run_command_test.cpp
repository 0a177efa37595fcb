// `kivi run`: a child's output passed through, its end reported, its status
// turned into the tool's exit code.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "tools/tool_run.h"

namespace kivi {
namespace {

testing::ToolRun kiviRun(std::vector<std::string> args) {
  args.insert(args.begin(), "run");
  return testing::kivi(args, "", 60);
}

TEST(KiviRunTest, PassesOutputThroughAndExitsWithTheChildsStatus) {
  auto run = kiviRun({"--", "sh", "-c", "echo out; echo err >&2; exit 3"});
  EXPECT_EQ(run.exit, 3);
  EXPECT_EQ(run.out, "out\n");
  EXPECT_EQ(run.err, "err\nterminated: status 3, reason exit\n");

  run = kiviRun({"sh", "-c", "kill -TERM $$"});
  EXPECT_EQ(run.exit, 128 + 15);
  EXPECT_EQ(run.err, "terminated: status 15, reason uncaught signal\n");

  // Large output on both streams at once.
  run = kiviRun({"sh", "-c", "head -c 3000000 /dev/zero >&2 & head -c 3000000 /dev/zero; wait"});
  EXPECT_EQ(run.exit, 0);
  EXPECT_EQ(run.out.size(), 3000000u);
  EXPECT_EQ(run.err.size(), 3000000u + std::string("terminated: status 0, reason exit\n").size());
}

TEST(KiviRunTest, WorkingDirectoryAndEnvironment) {
  const std::string dir = std::filesystem::canonical(::testing::TempDir()).string();
  auto run = kiviRun({"--cwd", dir, "--env", "GREETING=hello there", "--env", "EMPTY=", "--", "sh",
                      "-c", "pwd -P; echo \"$GREETING|${EMPTY-unset}|${HOME:+home}\""});
  EXPECT_EQ(run.exit, 0) << run.err;
  EXPECT_EQ(run.out, dir + "\nhello there||" + (std::getenv("HOME") ? "home" : "") + "\n");
}

TEST(KiviRunTest, RefusesWhatItCannotRun) {
  auto run = kiviRun({"--", "/nonexistent/program"});
  EXPECT_EQ(run.exit, 127);
  EXPECT_NE(run.err.find("cannot run '/nonexistent/program'"), std::string::npos) << run.err;
  EXPECT_EQ(run.err.find("terminated:"), std::string::npos);

  const std::string plain = ::testing::TempDir() + "kivi_run_plain_" + std::to_string(::getpid());
  std::ofstream(plain) << "#!/bin/sh\n";
  std::filesystem::permissions(plain, std::filesystem::perms::owner_read);
  EXPECT_EQ(kiviRun({"--", plain}).exit, 126);
  std::remove(plain.c_str());
  EXPECT_EQ(kiviRun({"--cwd", "/nonexistent", "--", "true"}).exit, 127);
  for (const auto& args : std::vector<std::vector<std::string>>{
           {}, {"--"}, {"--env", "NOEQUALS", "--", "true"}, {"--bogus", "true"}}) {
    EXPECT_EQ(kiviRun(args).exit, 2);
  }
  run = kiviRun({"--help"});
  EXPECT_EQ(run.exit, 0);
  EXPECT_NE(run.out.find("usage: kivi run"), std::string::npos);
}

}  // namespace
}  // namespace kivi
