// Prints the version of the library it runs with and one value utility's
// answer: enough to show that the package links, statically or shared.
#include <cstdio>

#include "kivi/utils/kiv_utils.h"
#include "kivi/version.h"

int main() {
  std::printf("KiviOSSDK %s (headers %s)\n", kivi::KiviOSSDKVersionString, KIVI_VERSION_STRING);
  std::printf("sha256(\"hello\") = %s\n",
              kivi::KivUtils::sha256Hash("hello").value_or("?").c_str());
  return kivi::KiviOSSDKVersionNumber == KIVI_VERSION_NUMBER ? 0 : 1;
}
