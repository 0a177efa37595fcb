// Status codes of the keychain and the other security services, numbered as
// the platform numbers them, and the error domain they travel in.
//
//   kivi::OSStatus status = kivi::SecItemCopyMatching(query, &result);
//   if (status != kivi::errSecSuccess) {
//     auto error = kivi::Error::create(kivi::NSOSStatusErrorDomain, status, {});
//   }
//
// Thread contract: constants only.
#pragma once

#include <cstdint>

namespace kivi {

using OSStatus = std::int32_t;

inline constexpr OSStatus errSecSuccess = 0;
inline constexpr OSStatus errSecUnimplemented = -4;
inline constexpr OSStatus errSecParam = -50;
inline constexpr OSStatus errSecAllocate = -108;
inline constexpr OSStatus errSecNotAvailable = -25291;
inline constexpr OSStatus errSecAuthFailed = -25293;
inline constexpr OSStatus errSecDuplicateItem = -25299;
inline constexpr OSStatus errSecItemNotFound = -25300;
inline constexpr OSStatus errSecInteractionNotAllowed = -25308;
inline constexpr OSStatus errSecDecode = -26275;

// The domain of errors whose code is an OSStatus.
inline constexpr const char* NSOSStatusErrorDomain = "NSOSStatusErrorDomain";

}  // namespace kivi
