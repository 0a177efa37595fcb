// MockKivHttpHeaderProviderService: a KivHttpHeaderProviderServiceProtocol
// that answers two stored maps: httpMonitoringHeaders() answers
// httpMonitoringHeadersInternal and uniqueTransactionIdHeader() answers
// uniqueTransactionIdHeaderInternal. Both are set by the constructor or
// later.
//
//   auto headers = std::make_shared<kivi::MockKivHttpHeaderProviderService>(
//       kivi::StringDictionary{{"X-Trace", "on"}}, kivi::StringDictionary{{"X-Txn", "42"}});
//   client.setHeaderProvider(headers);
//
// Thread contract: none; set the maps before handing the double out.
#pragma once

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_http_header_provider_service_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivHttpHeaderProviderService : public Object,
                                                     public KivHttpHeaderProviderServiceProtocol {
 public:
  // With both maps empty, or with the maps given.
  MockKivHttpHeaderProviderService() = default;
  MockKivHttpHeaderProviderService(StringDictionary httpMonitoringHeaders,
                                   StringDictionary uniqueTransactionIdHeader)
      : httpMonitoringHeadersInternal(std::move(httpMonitoringHeaders)),
        uniqueTransactionIdHeaderInternal(std::move(uniqueTransactionIdHeader)) {}

  // What httpMonitoringHeaders() answers.
  StringDictionary httpMonitoringHeadersInternal;
  // What uniqueTransactionIdHeader() answers.
  StringDictionary uniqueTransactionIdHeaderInternal;

  StringDictionary httpMonitoringHeaders() override { return httpMonitoringHeadersInternal; }
  StringDictionary uniqueTransactionIdHeader() override {
    return uniqueTransactionIdHeaderInternal;
  }
};

}  // namespace kivi
