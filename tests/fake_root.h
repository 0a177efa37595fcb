// A directory that stands for "/" while a test runs: the system layer reads
// its /proc, /sys and /etc files from here, and from the real machine again
// once the FakeRoot is gone.
//
//   kivi::testing::FakeRoot root;
//   root.write("/proc/sys/kernel/arch", "iPhone3,3\n");
//   EXPECT_EQ(kivi::KivDevice::platformName(), "iPhone 4 CDMA");
#pragma once

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <string_view>
#include <vector>

#include "kivi/system/system_root.h"

namespace kivi::testing {

struct ProcStat {
  char state = 'S';
  long utime = 0, stime = 0, start = 0, vsize = 0, rss = 0, policy = 0;
};

// A /proc/<pid>/stat line whose command name holds a space and a ')', as names may.
inline std::string procStatLine(const ProcStat& s) {
  std::vector<std::string> fields(50, "0");
  fields[0] = std::string(1, s.state);
  fields[11] = std::to_string(s.utime);
  fields[12] = std::to_string(s.stime);
  fields[19] = std::to_string(s.start);
  fields[20] = std::to_string(s.vsize);
  fields[21] = std::to_string(s.rss);
  fields[38] = std::to_string(s.policy);
  std::string line = "4242 (my (prog) x)";
  for (const auto& field : fields) line += " " + field;
  return line + "\n";
}

class FakeRoot {
 public:
  FakeRoot() {
    char pattern[] = "/tmp/kivi-root-XXXXXX";
    if (::mkdtemp(pattern)) directory_ = pattern;
    system::setRoot(directory_);
  }
  ~FakeRoot() {
    system::setRoot("");
    std::error_code ignored;
    std::filesystem::remove_all(directory_, ignored);
  }
  FakeRoot(const FakeRoot&) = delete;
  FakeRoot& operator=(const FakeRoot&) = delete;

  const std::string& directory() const { return directory_; }
  std::string path(std::string_view absolute) const { return directory_ + std::string(absolute); }

  void write(std::string_view absolute, std::string_view contents) const {
    const std::filesystem::path file = path(absolute);
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary) << contents;
  }
  void link(std::string_view absolute, const std::string& target) const {
    const std::filesystem::path file = path(absolute);
    std::filesystem::create_directories(file.parent_path());
    std::error_code ignored;
    std::filesystem::remove(file, ignored);
    std::filesystem::create_symlink(target, file);
  }
  void remove(std::string_view absolute) const {
    std::error_code ignored;
    std::filesystem::remove_all(path(absolute), ignored);
  }

 private:
  std::string directory_;
};

}  // namespace kivi::testing
