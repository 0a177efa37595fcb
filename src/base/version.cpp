#include "kivi/version.h"

namespace kivi {

extern "C" {
const double KiviOSSDKVersionNumber = KIVI_VERSION_NUMBER;
const char KiviOSSDKVersionString[] = KIVI_VERSION_STRING;
}

}  // namespace kivi
