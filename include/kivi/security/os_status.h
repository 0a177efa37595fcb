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

// A call's status: errSecSuccess, or a negative error code.
using OSStatus = std::int32_t;

// No error.
inline constexpr OSStatus errSecSuccess = 0;
// The call does not handle this kind of item (the keychain keeps generic passwords only).
inline constexpr OSStatus errSecUnimplemented = -4;
// A query or attribute is missing or of the wrong kind.
inline constexpr OSStatus errSecParam = -50;
// Memory ran out; not given by the keychain.
inline constexpr OSStatus errSecAllocate = -108;
// The keyring cannot be reached, did not answer in time, or is locked.
inline constexpr OSStatus errSecNotAvailable = -25291;
// Authentication failed; not given by the keychain.
inline constexpr OSStatus errSecAuthFailed = -25293;
// The item to add exists already.
inline constexpr OSStatus errSecDuplicateItem = -25299;
// No item matches.
inline constexpr OSStatus errSecItemNotFound = -25300;
// The user would have to be asked; not given by the keychain, which never asks (a locked
// keyring is errSecNotAvailable).
inline constexpr OSStatus errSecInteractionNotAllowed = -25308;
// Data could not be decoded; not given by the keychain.
inline constexpr OSStatus errSecDecode = -26275;

// The domain of errors whose code is an OSStatus.
inline constexpr const char* NSOSStatusErrorDomain = "NSOSStatusErrorDomain";

}  // namespace kivi
