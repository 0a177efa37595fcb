// The keychain: small secrets (passwords, tokens, markers) kept for the
// application in the user's keyring, with the platform's item calls and
// status codes. On Linux the items live in the desktop's Secret Service
// (gnome-keyring, KWallet's bridge, KeePassXC …) reached over the session
// D-Bus; only generic passwords are kept.
//
//   using namespace kivi;
//   Dictionary item{{kSecClass, kSecClassGenericPassword},
//                   {kSecAttrService, "com.example.sync"},
//                   {kSecAttrAccount, "alice"},
//                   {kSecValueData, Data{'s', '3', 'c'}}};
//   OSStatus status = SecItemAdd(item, nullptr);       // or errSecDuplicateItem
//
//   Value found;
//   status = SecItemCopyMatching({{kSecClass, kSecClassGenericPassword},
//                                 {kSecAttrService, "com.example.sync"},
//                                 {kSecAttrAccount, "alice"},
//                                 {kSecReturnData, true}},
//                                &found);               // found.asData(): "s3c"
//
// Queries and attributes. kSecClass is required (errSecParam without it) and
// must be kSecClassGenericPassword (errSecUnimplemented otherwise). acct,
// svce, agrp, pdmn and labl are strings, v_Data is Data, the r_ keys are
// booleans; a value of another kind gives errSecParam. Other keys are
// ignored.
//
//   SecItemCopyMatching  matches class and each of acct, svce, agrp, pdmn and
//                        labl the query gives; without agrp it matches the
//                        application's default access group. The result is
//                        null without r_ keys; the attributes Dictionary
//                        (class, acct, svce, agrp, pdmn, labl) with
//                        r_Attributes; the Data with r_Data; the attributes
//                        plus v_Data with both. With m_Limit m_LimitAll it is
//                        an Array of those, one per item. No match:
//                        errSecItemNotFound.
//   SecItemAdd           stores an item in the default access group unless
//                        agrp is given, with pdmn "ak" unless given, acct and
//                        svce "" unless given, and the label labl or, without
//                        one, svce (acct when svce is empty) so that keyring
//                        viewers show something readable. An item with the
//                        same class, acct, svce and agrp exists:
//                        errSecDuplicateItem. With r_Attributes (and/or
//                        r_Data) the result is what SecItemCopyMatching would
//                        answer for the new item.
//   SecItemDelete        deletes every item the query matches (as above);
//                        errSecItemNotFound when none does.
//
// Access groups. An access group is a name space, not a wall: the Secret
// Service lets every program of the user read every unlocked item. The
// default group of an application is "<TEAM>.<name>", where <name> is the
// file name of the running executable and <TEAM> the first 10 upper-case hex
// digits of the SHA-256 of the executable's absolute path (as the kernel
// reports it, symbolic links resolved). So it is the same for every run and
// every process of one installed program, also after the program was updated
// in place, and differs between programs and between two copies of one
// program at different places, as two differently signed builds would. A
// program run from an AppImage ($APPIMAGE set) is named by the image's path
// instead of the path it is mounted at, which changes from run to run.
//
// Availability. Without a reachable Secret Service (no session bus, or no
// keyring daemon on it) every call answers errSecNotAvailable at once. A bus
// or keyring that accepts the call and never answers costs a call at most
// 5 seconds on first use (10 seconds once the keyring has answered), then
// errSecNotAvailable. The calls never ask the user anything: a locked keyring is not unlocked and
// no password dialog is shown, so an item found locked and an add into a locked keyring answer
// errSecNotAvailable too.
//
// Thread contract: every function may be called from any thread. The calls
// block the calling thread for a round trip to the keyring daemon (D-Bus
// timeouts bound the wait). SecItemAdd's duplicate check and store are one
// step for every thread and process of the user (see SecItemTransaction).
#pragma once

#include <string>

#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/security/os_status.h"

namespace kivi {

// Item class.
inline constexpr const char* kSecClass = "class";
inline constexpr const char* kSecClassGenericPassword = "genp";
// Item attributes.
inline constexpr const char* kSecAttrAccount = "acct";
inline constexpr const char* kSecAttrService = "svce";
inline constexpr const char* kSecAttrLabel = "labl";
inline constexpr const char* kSecAttrAccessible = "pdmn";
inline constexpr const char* kSecAttrAccessibleAfterFirstUnlock = "ck";
inline constexpr const char* kSecAttrAccessibleWhenUnlocked = "ak";
inline constexpr const char* kSecAttrAccessGroup = "agrp";
// The secret.
inline constexpr const char* kSecValueData = "v_Data";
// What a search or an add answers.
inline constexpr const char* kSecReturnAttributes = "r_Attributes";
inline constexpr const char* kSecReturnData = "r_Data";
// How many items a search answers.
inline constexpr const char* kSecMatchLimit = "m_Limit";
inline constexpr const char* kSecMatchLimitOne = "m_LimitOne";
inline constexpr const char* kSecMatchLimitAll = "m_LimitAll";

// Finds items; `result` (may be null) receives what the query's r_ keys ask
// for, and is left alone on failure.
KIVI_EXPORT OSStatus SecItemCopyMatching(const Dictionary& query, Value* result);
// Adds an item; `result` (may be null) receives what the r_ keys ask for.
KIVI_EXPORT OSStatus SecItemAdd(const Dictionary& attributes, Value* result);
// Deletes the items the query matches.
KIVI_EXPORT OSStatus SecItemDelete(const Dictionary& query);

// The access group this application's items get when none is given (see
// "Access groups" above). Computed once per process.
KIVI_EXPORT std::string SecDefaultAccessGroup();

// The keychain's lock, shared by every thread and every process of the user:
// while one SecItemTransaction is alive, no other thread or process adds an
// item. Hold one around a "search, and add when nothing was found" sequence
// so that two processes doing it at once end with one item:
//
//   kivi::SecItemTransaction transaction;
//   OSStatus status = kivi::SecItemCopyMatching(query, &found);
//   if (status == kivi::errSecItemNotFound) status = kivi::SecItemAdd(item, &found);
//
// Transactions nest on one thread (the keychain calls take one themselves).
// The lock is an flock on "kiviossdk-keychain.lock" in $XDG_RUNTIME_DIR, or
// in /tmp/kiviossdk-<uid>/ (made 0700) without it; a process that dies
// holding it lets it go. Taking it waits at most 30 seconds; when it could
// not be taken, locked() is false and SecItemAdd answers errSecNotAvailable
// while the transaction is alive.
//
// Thread contract: a transaction belongs to the thread that made it and is
// destroyed on that thread.
class KIVI_EXPORT SecItemTransaction {
 public:
  SecItemTransaction();
  ~SecItemTransaction();
  SecItemTransaction(const SecItemTransaction&) = delete;
  SecItemTransaction& operator=(const SecItemTransaction&) = delete;

  // Whether the lock is held.
  bool locked() const noexcept { return locked_; }

 private:
  bool locked_ = false;
};

}  // namespace kivi
