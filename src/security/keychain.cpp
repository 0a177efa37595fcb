// The keychain over the Secret Service, through libsecret.
//
// The calls go through one SecretService proxy of the process (on GDBus's
// session-bus connection, as libsecret's own are), made on first use and
// again after a call failed on the bus. It is of a subclass that refuses
// every prompt, so nothing ever waits for the user: an operation the keyring
// would first ask the user about fails instead.
#include "kivi/security/keychain.h"

#include <fcntl.h>
#include <gio/gio.h>
#include <libsecret/secret.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cstdlib>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "bounded_bus.h"

namespace kivi {
namespace {

constexpr const char* kLockFileName = "kiviossdk-keychain.lock";
constexpr auto kLockTimeout = std::chrono::seconds(30);

// ---- The schema of the items ----

const SecretSchema* itemSchema() {
  static const SecretSchema schema = [] {
    SecretSchema s{};
    s.name = "org.kiviossdk.Keychain";
    s.flags = SECRET_SCHEMA_NONE;
    const char* names[] = {kSecClass, kSecAttrAccount, kSecAttrService, kSecAttrAccessGroup,
                           kSecAttrAccessible};
    for (std::size_t i = 0; i < std::size(names); ++i) {
      s.attributes[i] = {names[i], SECRET_SCHEMA_ATTRIBUTE_STRING};
    }
    return s;
  }();
  return &schema;
}

// ---- A SecretService that never prompts ----

GVariant* refusePromptSync(SecretService*, SecretPrompt*, GCancellable*, const GVariantType*,
                           GError** error) {
  g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_PERMISSION_DENIED,
                      "the keyring asked for the user, which the keychain never does");
  return nullptr;
}

void refusePromptAsync(SecretService* self, SecretPrompt*, const GVariantType*,
                       GCancellable* cancellable, GAsyncReadyCallback callback, gpointer userData) {
  GTask* task = g_task_new(self, cancellable, callback, userData);
  g_task_return_new_error(task, G_IO_ERROR, G_IO_ERROR_PERMISSION_DENIED,
                          "the keyring asked for the user, which the keychain never does");
  g_object_unref(task);
}

GVariant* refusePromptFinish(SecretService*, GAsyncResult* result, GError** error) {
  return static_cast<GVariant*>(g_task_propagate_pointer(G_TASK(result), error));
}

void refusingServiceClassInit(gpointer klass, gpointer) {
  auto* service = static_cast<SecretServiceClass*>(klass);
  service->prompt_sync = refusePromptSync;
  service->prompt_async = refusePromptAsync;
  service->prompt_finish = refusePromptFinish;
}

GType refusingServiceType() {
  static const GType type = [] {
    GTypeQuery parent;
    g_type_query(SECRET_TYPE_SERVICE, &parent);
    return g_type_register_static_simple(SECRET_TYPE_SERVICE, "KiviKeychainSecretService",
                                         parent.class_size, refusingServiceClassInit,
                                         parent.instance_size, nullptr, GTypeFlags(0));
  }();
  return type;
}

// ---- Owning handles ----

struct GErrorHolder {
  GError* error = nullptr;
  ~GErrorHolder() {
    if (error) g_error_free(error);
  }
};

std::mutex gServiceMutex;
SecretService* gService = nullptr;  // guarded by gServiceMutex
// How long the first call waits for a keyring to answer (a keyring started
// by the bus for that call included), and how long any later call waits.
constexpr guint kProbeTimeoutMs = 5000;
constexpr gint kCallTimeoutMs = 10000;

// Whether a Secret Service answers a ping on the session bus (starting it if
// the bus can), asked over a private connection with a bounded wait. libsecret
// connects through GDBus's shared connection, whose handshake has no time
// limit: a bus that accepts the connection and then says nothing would hold
// the caller forever.
bool keyringAnswers() {
  GErrorHolder e;
  detail::BoundedBus session{std::chrono::milliseconds(kProbeTimeoutMs)};
  bool answered = session.connect(&e.error);
  if (answered) {
    GVariant* reply =
        session.call("org.freedesktop.secrets", "/org/freedesktop/secrets",
                     "org.freedesktop.DBus.Peer", "Ping", nullptr, "()", nullptr, &e.error);
    answered = reply != nullptr;
    if (reply) g_variant_unref(reply);
  }
  return answered;
}

// The Secret Service for one call: the process's proxy, used by one call at
// a time. A call that fails on the bus drops the proxy, so that the next one
// finds a keyring daemon that has started or restarted since.
class Keyring {
 public:
  Keyring() : lock_(gServiceMutex) {}
  Keyring(const Keyring&) = delete;
  Keyring& operator=(const Keyring&) = delete;
  ~Keyring() {
    if (failed_ && gService) {
      g_object_unref(gService);
      gService = nullptr;
    }
  }

  // errSecNotAvailable when there is no session bus to reach or no keyring
  // answers on it within kProbeTimeoutMs.
  OSStatus open() {
    if (!gService) {
      if (!keyringAnswers()) return errSecNotAvailable;
      GErrorHolder e;
      gService = static_cast<SecretService*>(g_initable_new(
          refusingServiceType(), nullptr, &e.error, "flags", SECRET_SERVICE_NONE, nullptr));
      if (gService) g_dbus_proxy_set_default_timeout(G_DBUS_PROXY(gService), kCallTimeoutMs);
    }
    return gService ? errSecSuccess : errSecNotAvailable;
  }
  SecretService* service() const { return gService; }
  // Records that a call on the bus failed; answers errSecNotAvailable.
  OSStatus failed() {
    failed_ = true;
    return errSecNotAvailable;
  }

 private:
  std::unique_lock<std::mutex> lock_;
  bool failed_ = false;
};

// A search's items, released together.
class ItemList {
 public:
  ItemList() = default;
  ItemList(const ItemList&) = delete;
  ItemList& operator=(const ItemList&) = delete;
  ~ItemList() { g_list_free_full(list_, g_object_unref); }
  GList** out() { return &list_; }
  std::vector<SecretItem*> items() const {
    std::vector<SecretItem*> v;
    for (GList* l = list_; l; l = l->next) v.push_back(static_cast<SecretItem*>(l->data));
    return v;
  }

 private:
  GList* list_ = nullptr;
};

// Schema attributes for libsecret; the strings belong to the caller.
class AttributeTable {
 public:
  AttributeTable() : table_(g_hash_table_new(g_str_hash, g_str_equal)) {}
  AttributeTable(const AttributeTable&) = delete;
  AttributeTable& operator=(const AttributeTable&) = delete;
  ~AttributeTable() { g_hash_table_unref(table_); }
  void set(const char* key, const std::string& value) {
    g_hash_table_replace(table_, const_cast<char*>(key), const_cast<char*>(value.c_str()));
  }
  GHashTable* get() const { return table_; }

 private:
  GHashTable* table_;
};

// ---- Queries ----

struct Query {
  std::optional<std::string> account, service, group, accessible, label;
  std::optional<Data> data;
  bool returnAttributes = false;
  bool returnData = false;
  bool all = false;
};

OSStatus readString(const Dictionary& d, const char* key, std::optional<std::string>* out) {
  auto it = d.find(key);
  if (it == d.end()) return errSecSuccess;
  const String* s = it->second.asString();
  // D-Bus carries UTF-8 without NUL bytes (g_utf8_validate rejects both).
  if (!s || !g_utf8_validate(s->data(), static_cast<gssize>(s->size()), nullptr)) {
    return errSecParam;
  }
  *out = s->str();
  return errSecSuccess;
}

OSStatus readBool(const Dictionary& d, const char* key, bool* out) {
  auto it = d.find(key);
  if (it == d.end()) return errSecSuccess;
  const Number* n = it->second.asNumber();
  if (!n) return errSecParam;
  *out = n->boolValue();
  return errSecSuccess;
}

OSStatus parseQuery(const Dictionary& d, Query* q) {
  auto cls = d.find(kSecClass);
  if (cls == d.end() || !cls->second.asString()) return errSecParam;
  if (*cls->second.asString() != kSecClassGenericPassword) return errSecUnimplemented;
  for (auto [key, out] : {std::pair{kSecAttrAccount, &q->account},
                          {kSecAttrService, &q->service},
                          {kSecAttrAccessGroup, &q->group},
                          {kSecAttrAccessible, &q->accessible},
                          {kSecAttrLabel, &q->label}}) {
    if (OSStatus s = readString(d, key, out)) return s;
  }
  if (auto it = d.find(kSecValueData); it != d.end()) {
    if (!it->second.asData()) return errSecParam;
    q->data = *it->second.asData();
  }
  if (OSStatus s = readBool(d, kSecReturnAttributes, &q->returnAttributes)) return s;
  if (OSStatus s = readBool(d, kSecReturnData, &q->returnData)) return s;
  if (auto it = d.find(kSecMatchLimit); it != d.end()) {
    const String* limit = it->second.asString();
    if (!limit || (*limit != kSecMatchLimitOne && *limit != kSecMatchLimitAll)) return errSecParam;
    q->all = *limit == kSecMatchLimitAll;
  }
  return errSecSuccess;
}

// One item as read back from the keyring.
struct Item {
  std::string account, service, group, accessible, label;
  Data data;
};

Value describe(const Item& item, bool attributes, bool data) {
  if (!attributes) return data ? Value(item.data) : Value();
  Dictionary d{{kSecClass, kSecClassGenericPassword}, {kSecAttrAccount, item.account},
               {kSecAttrService, item.service},       {kSecAttrAccessGroup, item.group},
               {kSecAttrAccessible, item.accessible}, {kSecAttrLabel, item.label}};
  if (data) d[kSecValueData] = Value(item.data);
  return Value(std::move(d));
}

std::string attribute(GHashTable* table, const char* key) {
  const auto* value = static_cast<const char*>(g_hash_table_lookup(table, key));
  return value ? value : "";
}

Item readItem(SecretItem* secretItem) {
  Item item;
  GHashTable* table = secret_item_get_attributes(secretItem);
  if (table) {
    item.account = attribute(table, kSecAttrAccount);
    item.service = attribute(table, kSecAttrService);
    item.group = attribute(table, kSecAttrAccessGroup);
    item.accessible = attribute(table, kSecAttrAccessible);
    g_hash_table_unref(table);
  }
  if (gchar* label = secret_item_get_label(secretItem)) {
    item.label = label;
    g_free(label);
  }
  if (SecretValue* value = secret_item_get_secret(secretItem)) {
    gsize length = 0;
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(secret_value_get(value, &length));
    if (bytes) item.data.assign(bytes, bytes + length);
    secret_value_unref(value);
  }
  return item;
}

// The items matching class, account, service and group (the default one when
// the query has none), plus accessibility and label when the query gives
// them; they stay alive with `list`. A locked item answers errSecNotAvailable:
// opening it would need the user.
OSStatus findItems(Keyring& keyring, const Query& q, bool loadSecrets, ItemList* list,
                   std::vector<SecretItem*>* matching) {
  const std::string cls = kSecClassGenericPassword;
  const std::string group = q.group ? *q.group : SecDefaultAccessGroup();
  AttributeTable attributes;
  attributes.set(kSecClass, cls);
  attributes.set(kSecAttrAccessGroup, group);
  if (q.account) attributes.set(kSecAttrAccount, *q.account);
  if (q.service) attributes.set(kSecAttrService, *q.service);
  if (q.accessible) attributes.set(kSecAttrAccessible, *q.accessible);
  const int flags = SECRET_SEARCH_ALL | (loadSecrets ? SECRET_SEARCH_LOAD_SECRETS : 0);
  GErrorHolder e;
  *list->out() =
      secret_service_search_sync(keyring.service(), itemSchema(), attributes.get(),
                                 static_cast<SecretSearchFlags>(flags), nullptr, &e.error);
  if (e.error) return keyring.failed();
  for (SecretItem* item : list->items()) {
    if (secret_item_get_locked(item)) return errSecNotAvailable;
    if (q.label) {
      gchar* label = secret_item_get_label(item);
      const bool same = label && *q.label == label;
      g_free(label);
      if (!same) continue;
    }
    matching->push_back(item);
  }
  return errSecSuccess;
}

// ---- The inter-process lock ----

std::mutex gProcessLock;  // one thread of this process in a transaction
thread_local int tDepth = 0;
thread_local bool tLocked = false;
thread_local bool tHoldsProcessLock = false;
thread_local int tLockFd = -1;

int openLockFile() {
  std::string directory;
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  if (runtime && runtime[0] == '/') {
    directory = runtime;
  } else {
    const uid_t uid = ::getuid();
    directory = "/tmp/kiviossdk-" + std::to_string(uid);
    if (::mkdir(directory.c_str(), 0700) != 0 && errno != EEXIST) return -1;
    struct stat st;
    // Someone else's directory, a link or one others may write to: not ours.
    if (::lstat(directory.c_str(), &st) != 0 || !S_ISDIR(st.st_mode) || st.st_uid != uid ||
        (st.st_mode & 077) != 0) {
      return -1;
    }
  }
  const std::string path = directory + "/" + kLockFileName;
  return ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
}

// Calls `tryLock` until it succeeds, fails for good or the deadline passes,
// pausing a little longer each time (1 ms up to 16 ms).
template <class TryLock>
bool lockWithin(TryLock tryLock, std::chrono::steady_clock::time_point deadline) {
  auto pause = std::chrono::milliseconds(1);
  for (;;) {
    if (std::optional<bool> taken = tryLock()) return *taken;
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(pause);
    pause = std::min(pause * 2, std::chrono::milliseconds(16));
  }
}

// true: taken; false: cannot be; nullopt: held elsewhere, try again.
std::optional<bool> tryFlock(int fd) {
  if (::flock(fd, LOCK_EX | LOCK_NB) == 0) return true;
  if (errno == EWOULDBLOCK || errno == EINTR) return std::nullopt;
  return false;
}

}  // namespace

// ---- SecItemTransaction ----

SecItemTransaction::SecItemTransaction() {
  if (tDepth++ > 0) {
    locked_ = tLocked;
    return;
  }
  const auto deadline = std::chrono::steady_clock::now() + kLockTimeout;
  tLocked = false;
  // Polled rather than a timed wait, which ThreadSanitizer cannot follow.
  tHoldsProcessLock = lockWithin(
      []() -> std::optional<bool> {
        if (gProcessLock.try_lock()) return true;
        return std::nullopt;
      },
      deadline);
  if (tHoldsProcessLock) {
    tLockFd = openLockFile();
    tLocked = tLockFd >= 0 && lockWithin([] { return tryFlock(tLockFd); }, deadline);
  }
  locked_ = tLocked;
}

SecItemTransaction::~SecItemTransaction() {
  if (--tDepth > 0) return;
  if (tLockFd >= 0) {
    ::close(tLockFd);  // lets the flock go
    tLockFd = -1;
  }
  if (tHoldsProcessLock) gProcessLock.unlock();
  tHoldsProcessLock = false;
  tLocked = false;
}

// ---- The item calls ----

OSStatus SecItemCopyMatching(const Dictionary& query, Value* result) {
  Query q;
  if (OSStatus s = parseQuery(query, &q)) return s;
  Keyring keyring;
  if (OSStatus s = keyring.open()) return s;
  ItemList list;
  std::vector<SecretItem*> found;
  if (OSStatus s = findItems(keyring, q, q.returnData, &list, &found)) return s;
  if (found.empty()) return errSecItemNotFound;
  if (!result) return errSecSuccess;
  if (!q.returnAttributes && !q.returnData) {
    *result = Value();
  } else if (q.all) {
    Array items;
    for (SecretItem* item : found) {
      items.push_back(describe(readItem(item), q.returnAttributes, q.returnData));
    }
    *result = Value(std::move(items));
  } else {
    *result = describe(readItem(found.front()), q.returnAttributes, q.returnData);
  }
  return errSecSuccess;
}

OSStatus SecItemAdd(const Dictionary& attributes, Value* result) {
  Query q;
  if (OSStatus s = parseQuery(attributes, &q)) return s;
  Item item;
  item.account = q.account.value_or("");
  item.service = q.service.value_or("");
  item.group = q.group ? *q.group : SecDefaultAccessGroup();
  item.accessible = q.accessible.value_or(kSecAttrAccessibleWhenUnlocked);
  item.label = q.label ? *q.label : !item.service.empty() ? item.service : item.account;
  item.data = q.data.value_or(Data{});

  SecItemTransaction transaction;
  if (!transaction.locked()) return errSecNotAvailable;
  Keyring keyring;
  if (OSStatus s = keyring.open()) return s;
  // The key of an item: class, account, service and group.
  Query key;
  key.account = item.account;
  key.service = item.service;
  key.group = item.group;
  ItemList list;
  std::vector<SecretItem*> existing;
  if (OSStatus s = findItems(keyring, key, false, &list, &existing)) return s;
  if (!existing.empty()) return errSecDuplicateItem;

  const std::string cls = kSecClassGenericPassword;
  AttributeTable table;
  table.set(kSecClass, cls);
  table.set(kSecAttrAccount, item.account);
  table.set(kSecAttrService, item.service);
  table.set(kSecAttrAccessGroup, item.group);
  table.set(kSecAttrAccessible, item.accessible);
  static const char kNoBytes[] = "";
  SecretValue* value = secret_value_new(
      item.data.empty() ? kNoBytes : reinterpret_cast<const gchar*>(item.data.data()),
      static_cast<gssize>(item.data.size()), "application/octet-stream");
  GErrorHolder e;
  const gboolean stored = secret_service_store_sync(keyring.service(), itemSchema(), table.get(),
                                                    SECRET_COLLECTION_DEFAULT, item.label.c_str(),
                                                    value, nullptr, &e.error);
  secret_value_unref(value);
  if (!stored) return keyring.failed();
  if (result) *result = describe(item, q.returnAttributes, q.returnData);
  return errSecSuccess;
}

OSStatus SecItemDelete(const Dictionary& query) {
  Query q;
  if (OSStatus s = parseQuery(query, &q)) return s;
  SecItemTransaction transaction;
  Keyring keyring;
  if (OSStatus s = keyring.open()) return s;
  ItemList list;
  std::vector<SecretItem*> doomed;
  if (OSStatus s = findItems(keyring, q, false, &list, &doomed)) return s;
  if (doomed.empty()) return errSecItemNotFound;
  for (SecretItem* item : doomed) {
    GErrorHolder e;
    if (!secret_item_delete_sync(item, nullptr, &e.error)) return keyring.failed();
  }
  return errSecSuccess;
}

// ---- The default access group ----

std::string SecDefaultAccessGroup() {
  static const std::string group = [] {
    std::string path;
    if (const char* image = std::getenv("APPIMAGE"); image && image[0] == '/') path = image;
    char exe[PATH_MAX];
    const ssize_t n = ::readlink("/proc/self/exe", exe, sizeof exe - 1);
    std::string executable = n > 0 ? std::string(exe, static_cast<std::size_t>(n)) : "";
    // A program replaced on disk while it runs (an update) keeps its identity.
    constexpr std::string_view kDeleted = " (deleted)";
    if (executable.ends_with(kDeleted)) executable.resize(executable.size() - kDeleted.size());
    if (executable.empty()) executable = program_invocation_name ? program_invocation_name : "";
    if (path.empty()) path = executable;
    gchar* validName =
        g_utf8_make_valid(executable.substr(executable.find_last_of('/') + 1).c_str(), -1);
    const std::string name = validName;
    g_free(validName);
    gchar* digest = g_compute_checksum_for_string(G_CHECKSUM_SHA256, path.data(),
                                                  static_cast<gssize>(path.size()));
    std::string team(digest ? digest : "", 0, 10);
    g_free(digest);
    for (char& c : team) c = static_cast<char>(g_ascii_toupper(c));
    return team + "." + name;
  }();
  return group;
}

}  // namespace kivi
