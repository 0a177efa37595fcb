// Looks names up in arbitrary launch-file text. The first byte gives the
// name's length (0 to 32), the name follows and the rest is the text.
//   - any name: a lookup with a small step budget either decides or answers
//     absent with an error; one that decided gives the same answer through
//     the parser's full budget, and the yes/no lookup decides too. (A name
//     that needs more is not given the full budget here: up to a second per
//     input would starve the fuzzer.)
//   - a plain name (ASCII letters, digits, "_", "-"): the regular-expression
//     lookup decides within its budget and gives the plain search's answer.
//     A name outside that alphabet is mapped into it, byte by byte, for this
//     check.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "fuzz_check.h"
#include "kivi/launch/kiv_ulo_file_parser.h"

using kivi::fuzz::check;

namespace {

constexpr std::int32_t kQuickSteps = 16;

std::string plainName(std::string_view name) {
  if (kivi::detail::isPlainUloKey(name)) return std::string(name);
  static constexpr std::string_view kAlphabet =
      "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-";
  std::string mapped;
  for (char c : name) mapped += kAlphabet[static_cast<unsigned char>(c) % kAlphabet.size()];
  return mapped;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view input(reinterpret_cast<const char*>(data), size);
  if (input.empty()) return 0;
  const std::size_t nameLength = std::min<std::size_t>(data[0] % 33, input.size() - 1);
  const std::string_view name = input.substr(1, nameLength);
  const std::string_view text = input.substr(1 + nameLength);

  const kivi::KivUloFileParser parser{std::string(text)};
  kivi::ErrorPtr error;
  const auto quick = kivi::detail::uloValueByPattern(text, name, &error, kQuickSteps);
  check(!error || !quick, "a stopped lookup answers absent", input);
  if (!error) {
    check(parser.getValue(name, &error) == quick && !error, "more steps, the same answer", input);
    const bool yes = parser.getBooleanValue(name, {"yes", "", "\u00e9"}, &error);
    check(!error && (!yes || quick), "the yes/no lookup decides alike", input);
  }

  const std::string plain = plainName(name);
  const auto byPattern = kivi::detail::uloValueByPattern(text, plain, &error);
  check(error == nullptr, "a plain name's pattern search decides", input);
  const auto byPlainSearch = kivi::detail::uloValueByPlainSearch(text, plain);
  check(byPattern == byPlainSearch, "plain search agrees with the pattern", input);
  check(parser.getValue(plain) == byPlainSearch, "the parser takes the plain search", input);
  return 0;
}
