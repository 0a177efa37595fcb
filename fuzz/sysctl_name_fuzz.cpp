// Asks the kernel-facts interface for arbitrary names, by text and by number,
// with buffers of every size. Beyond not crashing:
//   - each call returns 0, or -1 with one of the documented errno values;
//   - a successful read never reports more bytes than the buffer holds;
//   - ENOMEM reports a size larger than the buffer that was given;
//   - a size query (no buffer) agrees with a read into a buffer of that size;
//   - KivDevice's text lookup is valid UTF-8 or null.
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz_check.h"
#include "kivi/device/kiv_device.h"
#include "kivi/system/sysctl.h"
#include "kivi/text/unicode_text.h"

using kivi::fuzz::check;

namespace {

bool documentedErrno(int error) {
  return error == EINVAL || error == ENOENT || error == EPERM || error == ENOMEM || error == EIO;
}

template <typename Call>
void exercise(Call call, std::size_t bufferSize, std::string_view input) {
  std::vector<unsigned char> buffer(bufferSize + 1, 0xAB);
  std::size_t length = bufferSize;
  errno = 0;
  const int result = call(buffer.data(), &length);
  check(result == 0 || result == -1, "the result is 0 or -1", input);
  if (result == 0) {
    check(length <= bufferSize, "a read fits the buffer", input);
    check(buffer[bufferSize] == 0xAB, "nothing is written past the buffer", input);
  } else {
    check(documentedErrno(errno), "a documented errno", input);
    if (errno == ENOMEM) check(length > bufferSize, "ENOMEM asks for more", input);
  }

  std::size_t needed = 0;
  if (call(nullptr, &needed) == 0 && needed > 0 && needed < 4096) {
    std::vector<unsigned char> exact(needed);
    std::size_t exactLength = needed;
    const int again = call(exact.data(), &exactLength);
    check(again == 0 || errno == EIO, "the size asked for is enough", input);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::size_t bufferSize = data[0] % 80;
  const std::string_view input(reinterpret_cast<const char*>(data) + 1, size - 1);

  const std::string name(input);  // stops at the first NUL when used as C text
  exercise(
      [&](void* old, std::size_t* length) {
        return kivi::sysctlbyname(name.c_str(), old, length, nullptr, 0);
      },
      bufferSize, input);

  std::vector<int> mib(input.size() / sizeof(int));
  if (!mib.empty()) std::memcpy(mib.data(), input.data(), mib.size() * sizeof(int));
  exercise(
      [&](void* old, std::size_t* length) {
        return kivi::sysctl(mib.data(), static_cast<unsigned int>(mib.size()), old, length, nullptr,
                            0);
      },
      bufferSize, input);

  const auto text = kivi::KivDevice::getSystemInformationByName(name.c_str());
  check(!text || kivi::unicode::isValidUTF8(*text), "text answers are UTF-8", input);
  if (!mib.empty()) (void)kivi::KivDevice::getSystemInformationForSpecifier(mib[0]);
  return 0;
}
