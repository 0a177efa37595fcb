// KIVI_EXPORT marks what the shared library exports. The library is built
// with hidden visibility, so a class, function or variable that a public
// header declares carries this mark; what is not marked stays inside the
// library.
//
//   class KIVI_EXPORT Thing { ... };
//   KIVI_EXPORT std::string describe(const Thing& thing);
//
// Consumers see the same mark; on ELF it changes nothing for them.
#pragma once

// Default visibility: the symbol is exported.
#define KIVI_EXPORT __attribute__((visibility("default")))
