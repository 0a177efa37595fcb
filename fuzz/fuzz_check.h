// Shared by the fuzz targets: a property check that reports the input and
// aborts, so libFuzzer saves it as a crash.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <string_view>

namespace kivi::fuzz {

inline void check(bool condition, const char* what, std::string_view input) {
  if (condition) return;
  std::fprintf(stderr, "check failed: %s\ninput: \"%.*s\"\n", what, static_cast<int>(input.size()),
               input.data());
  std::abort();
}

}  // namespace kivi::fuzz
