// KivHttpHeaderProviderServiceProtocol: the host's extra HTTP header fields:
// those for request monitoring and the one that tags a request with a
// unique transaction id. The library has no implementation: what the fields
// hold is the host's (MockKivHttpHeaderProviderService answers stored maps).
//
//   auto fields = headers->httpMonitoringHeaders();
//   for (const auto& [name, value] : headers->uniqueTransactionIdHeader()) fields[name] = value;
//   request->setAllHTTPHeaderFields(fields);
//
// Thread contract: that of the host's implementation; the library may ask
// from any thread.
#pragma once

#include "kivi/export.h"
#include "kivi/net/url_request.h"

namespace kivi {

class KIVI_EXPORT KivHttpHeaderProviderServiceProtocol {
 public:
  virtual ~KivHttpHeaderProviderServiceProtocol() = default;

  // Header field name to value.
  virtual StringDictionary httpMonitoringHeaders() = 0;
  virtual StringDictionary uniqueTransactionIdHeader() = 0;
};

}  // namespace kivi
