// Looks names up in arbitrary launch-file text. The first byte gives the
// name's length (0 to 32), the name follows and the rest is the text.
//   - any name: the lookup and the yes/no lookup return;
//   - a plain name (ASCII letters, digits, "_", "-"): the plain search and the
//     regular-expression lookup give the same answer. A name outside that
//     alphabet is mapped into it, byte by byte, for this check.
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
  (void)parser.getValue(name);
  (void)parser.getBooleanValue(name, {"yes", "", "\u00e9"});

  const std::string plain = plainName(name);
  const auto byPattern = kivi::detail::uloValueByPattern(text, plain);
  const auto byPlainSearch = kivi::detail::uloValueByPlainSearch(text, plain);
  check(byPattern == byPlainSearch, "plain search agrees with the pattern", input);
  check(parser.getValue(plain) == byPlainSearch, "the parser takes the plain search", input);
  return 0;
}
