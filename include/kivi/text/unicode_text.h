// Unicode text operations on UTF-8 strings, on ICU.
//
// The building blocks the value utilities, the launch-file reader and the
// redaction helpers share: the whitespace-and-newlines trim set, comparison
// that ignores case and treats canonically equivalent sequences as equal,
// locale-independent full case mapping, strict UTF-8 validation and lengths in
// UTF-16 code units.
//
//   unicode::trim("\u00a0 abc\n")                        // "abc"
//   unicode::caseInsensitiveEquals("Ä", "a\u0308")       // true (Ä vs a + ◌̈)
//   unicode::toLower("İSTANBUL")                          // "i̇stanbul", whatever the locale
//
// Text that is not valid UTF-8 is never undefined behaviour: the trim set
// treats a malformed byte as a non-space character, the comparisons and case
// mappings read it as U+FFFD.
//
// Thread contract: every function is pure and may run on any thread at once.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "kivi/export.h"

namespace kivi::unicode {

// Whether `c` belongs to the whitespace-and-newlines set: general category Zs,
// U+0009, U+000A–U+000D, U+0085, U+2028 and U+2029.
KIVI_EXPORT bool isWhitespaceOrNewline(char32_t c);

// `text` without leading and trailing characters of the whitespace-and-newlines
// set; inner ones stay. Returns a view into `text`.
KIVI_EXPORT std::string_view trimView(std::string_view text);
KIVI_EXPORT std::string trim(std::string_view text);

// True when the two texts are equal ignoring case (full default case folding)
// and canonical equivalence: a precomposed letter equals its decomposed form.
// Independent of the locale. No trimming. A text over 2 GiB (beyond ICU's
// lengths) equals only the same bytes, here and in canonicalEquals.
KIVI_EXPORT bool caseInsensitiveEquals(std::string_view a, std::string_view b);

// True when the two texts are canonically equivalent (equal after NFD).
KIVI_EXPORT bool canonicalEquals(std::string_view a, std::string_view b);

// Full Unicode lower- and upper-case mapping with the root locale, so the
// result never depends on the process's locale ("I" lower-cases to "i" even
// under a Turkish default locale; "ß" upper-cases to "SS").
KIVI_EXPORT std::string toLower(std::string_view text);
KIVI_EXPORT std::string toUpper(std::string_view text);

// Whether `bytes` is well-formed UTF-8 (no overlongs, surrogates or values
// above U+10FFFF). An embedded NUL is valid UTF-8.
KIVI_EXPORT bool isValidUTF8(std::string_view bytes);

// The number of UTF-16 code units `text` takes. Each malformed sequence (a
// stray byte, or a truncated lead byte with its continuation bytes) counts as
// one unit, the U+FFFD that replaces it.
KIVI_EXPORT std::size_t utf16Length(std::string_view text);

}  // namespace kivi::unicode
