// KivObfuscator: a keyless, reversible scrambling of short printable texts,
// for values that should not be readable at a glance (in a log or a
// settings file). It is not encryption: anyone with this code can undo it.
//
//   auto hidden = kivi::KivObfuscator::obfuscateString("abc");   // "][Y"
//   kivi::KivObfuscator::unobfuscateString(hidden);               // "abc"
//
// Byte i of an n-byte text is rotated by s = (n × (i + 1)) mod 91 + 1:
// obfuscation rotates down within '#'…'~' (35…126), unobfuscation up within
// '"'…'}' (34…125). So texts of bytes 34…125 come back unchanged; '~' comes
// back as '"', bytes 1…33 (controls, space, '!') come back 92 higher (a space
// as '|'), and bytes above 126 do not come back in general. The arithmetic
// on other bytes is kept exactly as it always was, so that texts scrambled
// earlier still unscramble alike.
//
// Thread contract: no state; every operation may run on any thread at once.
// The buffer forms change only the caller's buffer.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivObfuscator {
 public:
  KivObfuscator() = delete;

  // Values of `transformation`; any other value leaves the text as it is.
  static constexpr std::uint64_t kObfuscate = 0;
  static constexpr std::uint64_t kUnobfuscate = 1;

  // The transformed text, as long as the input. None for none, for a text
  // holding U+0000, and when the transformed bytes are not UTF-8 (possible
  // only for input beyond ASCII). A transformed byte 0 (possible only for
  // input bytes above 126) ends the result. A bare nullptr means none.
  static std::optional<std::string> transformString(const std::optional<std::string>& string,
                                                    std::uint64_t transformation) noexcept;
  // transformString(string, kObfuscate).
  static std::optional<std::string> obfuscateString(
      const std::optional<std::string>& string) noexcept {
    return transformString(string, kObfuscate);
  }
  // transformString(string, kUnobfuscate).
  static std::optional<std::string> unobfuscateString(
      const std::optional<std::string>& string) noexcept {
    return transformString(string, kUnobfuscate);
  }
  // None, for a bare nullptr (as for std::nullopt).
  static std::optional<std::string> transformString(std::nullptr_t, std::uint64_t) noexcept {
    return std::nullopt;
  }
  // None, for a bare nullptr.
  static std::optional<std::string> obfuscateString(std::nullptr_t) noexcept {
    return std::nullopt;
  }
  // None, for a bare nullptr.
  static std::optional<std::string> unobfuscateString(std::nullptr_t) noexcept {
    return std::nullopt;
  }

  // In place, on `length` bytes (NUL bytes included): one pass, no
  // allocation. A null buffer or a length of 0 does nothing.
  static void obfuscateString(std::uint8_t* buffer, std::uint64_t length) noexcept;
  static void unobfuscateString(std::uint8_t* buffer, std::uint64_t length) noexcept;
  // The same, on a char buffer.
  static void obfuscateString(char* buffer, std::uint64_t length) noexcept {
    obfuscateString(reinterpret_cast<std::uint8_t*>(buffer), length);
  }
  // The same, on a char buffer.
  static void unobfuscateString(char* buffer, std::uint64_t length) noexcept {
    unobfuscateString(reinterpret_cast<std::uint8_t*>(buffer), length);
  }
};

}  // namespace kivi
