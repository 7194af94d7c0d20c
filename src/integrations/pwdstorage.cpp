// SPDX-License-Identifier: Apache-2.0
// The password storage plug-in of 389 Directory Server: one entry point a scheme. Its manual is ldappw-389(5).
#include <pthread.h>
#include <slapi-plugin.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string_view>
#include <utility>

#include "encoding_utils.h"
#include "key_file.h"
#include "passwords.h"

// The server's own; looked up where it loads the plug-in.
#pragma weak slapi_ch_malloc
#pragma weak slapi_log_error
#pragma weak slapi_pblock_get
#pragma weak slapi_pblock_set

namespace plugin {
namespace {

constexpr int kMatch = 0;  // of a comparison; success of the others
constexpr int kError = -1;

// What the server takes as texts that it could write to.
char subsystem[] = "ldappw-pwdstorage";
char vendor[] = "ldappw";
char version[] = LDAPPW_VERSION_TEXT;
char purpose[] = "Password storage schemes of ldappw";
char apiVersion[] = SLAPI_PLUGIN_VERSION_01;
char schemeNames[][7] = {"qVEIL", "AES128", "AES192", "AES256", "VLDL"};  // the tags without their braces

// The library is opened by the first entry point, before the server has threads. The keys of a scheme are set by its
// entry point and go when it is closed, which a running server does to an entry that is disabled.
struct Server {
  bool opened = false;
  Library library{};
  AesKeyData* keys[kSchemeCount] = {};  // each entry has its own argument
  pthread_rwlock_t keysLock = PTHREAD_RWLOCK_INITIALIZER;
};
Server server;

// Keeps the keys where they are while they are used.
class KeysInUse {
 public:
  KeysInUse() noexcept { pthread_rwlock_rdlock(&server.keysLock); }
  ~KeysInUse() { pthread_rwlock_unlock(&server.keysLock); }
  KeysInUse(const KeysInUse&) = delete;
  KeysInUse& operator=(const KeysInUse&) = delete;
};

void replaceKeys(SchemeIndex index, AesKeyData* keys) noexcept {
  pthread_rwlock_wrlock(&server.keysLock);
  AesKeyData* const old = std::exchange(server.keys[index], keys);
  pthread_rwlock_unlock(&server.keysLock);
  server.library.freeKeys(old);
}

// One line in the server's error log.
__attribute__((format(printf, 2, 3))) void report(int level, const char* format, ...) noexcept {
  static char whole[] = "%s\n";
  char line[4608];
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(line, sizeof line, format, arguments);
  va_end(arguments);
  slapi_log_error(level, subsystem, whole, line);
}

// One function for each scheme: the server knows the scheme by the function alone.
template <SchemeIndex kIndex>
int compare(const char* presented, const char* payload) noexcept {
  if (presented == nullptr || payload == nullptr) return kError;
  const KeysInUse used;
  return matches(kSchemes[kIndex], {server.library, server.keys[kIndex], payload, presented}) ? kMatch : kError;
}

void* allocate(size_t bytes) noexcept {
  return slapi_ch_malloc(bytes);
}

template <SchemeIndex kIndex>
char* encode(const char* clear) noexcept {
  const char* problem = "no password is given";
  char* value = nullptr;
  if (clear != nullptr) {
    const KeysInUse used;
    value = makeValue(server.library, kSchemes[kIndex], server.keys[kIndex], clear, allocate, problem);
  }
  if (value == nullptr) report(SLAPI_LOG_ERR, "%s: %s", kSchemes[kIndex].tag, problem);
  return value;
}

bool takeArguments(Slapi_PBlock* block, const char*& keyFile) noexcept {
  static constexpr char kKeys[] = "keys=";
  int argc = 0;
  char** argv = nullptr;
  if (slapi_pblock_get(block, SLAPI_PLUGIN_ARGC, &argc) != 0 || slapi_pblock_get(block, SLAPI_PLUGIN_ARGV, &argv) != 0)
    return false;
  for (int i = 0; i < argc; ++i) {
    if (std::strncmp(argv[i], kKeys, sizeof kKeys - 1) != 0 || keyFile != nullptr) {
      report(SLAPI_LOG_ERR, "unknown or repeated argument \"%s\"; there is keys=FILE", argv[i]);
      return false;
    }
    keyFile = argv[i] + sizeof kKeys - 1;
  }
  return true;
}

void takeKeys(SchemeIndex index, const char* keyFile) noexcept {
  KeyReport found;
  AesKeyData* const keys = loadKeyFile(server.library, keyFile, found);
  if (keys == nullptr) {
    report(SLAPI_LOG_ERR, "%s; no value of %s will match", found.problem, kSchemes[index].tag);
  }
  if (found.warning[0] != '\0') report(SLAPI_LOG_WARNING, "%s", found.warning);
  replaceKeys(index, keys);
}

bool openOnce() noexcept {
  const char* problem = nullptr;
  if (!server.opened) server.opened = openLibrary(server.library, problem);
  if (!server.opened) report(SLAPI_LOG_ERR, "%s", problem);
  return server.opened;
}

template <SchemeIndex kIndex>
int closeScheme(Slapi_PBlock* /*block*/) noexcept {
  replaceKeys(kIndex, nullptr);
  return kMatch;
}

template <typename Function>
void* asAddress(Function* function) noexcept {
  return reinterpret_cast<void*>(function);
}

// Without keys the scheme is registered all the same, and matches nothing: the server takes a value with an unknown tag
// for a clear password.
template <SchemeIndex kIndex>
int start(Slapi_PBlock* block) noexcept {
  static Slapi_PluginDesc description = {subsystem, vendor, version, purpose};
  const char* keyFile = nullptr;
  if (!openOnce() || !takeArguments(block, keyFile)) return kError;
  if (kSchemes[kIndex].needsKeys()) takeKeys(kIndex, keyFile);
  const struct {
    int parameter;
    void* value;
  } parameters[] = {
      {SLAPI_PLUGIN_VERSION, apiVersion},
      {SLAPI_PLUGIN_DESCRIPTION, &description},
      {SLAPI_PLUGIN_CLOSE_FN, asAddress(closeScheme<kIndex>)},
      {SLAPI_PLUGIN_PWD_STORAGE_SCHEME_CMP_FN, asAddress(compare<kIndex>)},
      {SLAPI_PLUGIN_PWD_STORAGE_SCHEME_ENC_FN, asAddress(encode<kIndex>)},
      {SLAPI_PLUGIN_PWD_STORAGE_SCHEME_NAME, schemeNames[kIndex]},
  };
  for (const auto& row : parameters) {
    if (slapi_pblock_set(block, row.parameter, row.value) != 0) return kError;
  }
  return kMatch;
}

}  // namespace
}  // namespace plugin

extern "C" {

#define LDAPPW_ENTRY(name, index)                                        \
  __attribute__((visibility("default"))) int name(Slapi_PBlock* block) { \
    return plugin::start<plugin::index>(block);                          \
  }
LDAPPW_ENTRY(ldappw_qveil_init, kQveil)
LDAPPW_ENTRY(ldappw_aes128_init, kAes128)
LDAPPW_ENTRY(ldappw_aes192_init, kAes192)
LDAPPW_ENTRY(ldappw_aes256_init, kAes256)
LDAPPW_ENTRY(ldappw_vldl_init, kVldl)
#undef LDAPPW_ENTRY
}
