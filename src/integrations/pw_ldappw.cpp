// SPDX-License-Identifier: Apache-2.0
// The password module of slapd: registers the schemes and serves slapd's calls. Its manual is slapd-pw-ldappw(5).
#include <lber.h>
#include <syslog.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string_view>

#include "key_file.h"
#include "passwords.h"

// What slapd exports, without a header of it. Weak, so that a host that lacks one is refused and not killed.
extern "C" {
using SlapdCheck = int(const berval* scheme, const berval* payload, const berval* cred, const char** text);
using SlapdHash = int(const berval* scheme, const berval* clear, berval* out, const char** text);
__attribute__((weak)) int lutil_passwd_add(berval* scheme, SlapdCheck* check, SlapdHash* hash);
__attribute__((weak)) void lutil_debug(int debug, int level, const char* format, ...);

__attribute__((visibility("default"))) int init_module(int argc, char** argv);
__attribute__((visibility("default"))) int term_module();
}

namespace plugin {
namespace {

constexpr int kMatch = 0;  // of a check; success of the others
constexpr int kError = -1;
constexpr int kAnyLevel = -1;  // LDAP_DEBUG_ANY

// All of it is set in init_module, before slapd has threads, and only read from then on.
struct Module {
  bool loaded = false;
  Library library{};
  AesKeyData* keys = nullptr;
  const char* keyFile = nullptr;
  bool served[kSchemeCount] = {};
  berval names[kSchemeCount] = {};  // slapd keeps pointers to them
};
Module module;

// One line in slapd's log: the system's, and, before slapd goes into the background, its standard error and log file.
__attribute__((format(printf, 1, 2))) void report(const char* format, ...) noexcept {
  char line[4608];
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(line, sizeof line, format, arguments);
  va_end(arguments);
  syslog(LOG_ERR, "pw-ldappw: %s", line);
  if (lutil_debug != nullptr) lutil_debug(kAnyLevel, kAnyLevel, "pw-ldappw: %s\n", line);
}

std::string_view viewOf(const berval* value) noexcept {
  return value->bv_val == nullptr ? std::string_view("") : std::string_view(value->bv_val, value->bv_len);
}

// slapd hands back the name that was registered. A text would reach the client, so a mismatch sets none.
int check(const berval* name, const berval* payload, const berval* cred, const char** /*text*/) noexcept {
  const Scheme* scheme = findScheme(viewOf(name));
  if (scheme == nullptr || !module.served[scheme - kSchemes]) return kError;
  return matches(*scheme, {module.library, module.keys, viewOf(payload), viewOf(cred)}) ? kMatch : kError;
}

void* allocate(size_t bytes) noexcept {
  return ber_memalloc(bytes);
}

int hash(const berval* name, const berval* clear, berval* out, const char** text) noexcept {
  const Scheme* scheme = findScheme(viewOf(name));
  const char* problem = "this scheme is not served";
  char* value = nullptr;
  if (scheme != nullptr && module.served[scheme - kSchemes]) {
    value = makeValue(module.library, *scheme, module.keys, viewOf(clear), allocate, problem);
  }
  if (value == nullptr) {
    if (text != nullptr) *text = problem;
    return kError;
  }
  out->bv_val = value;
  out->bv_len = std::strlen(value);
  return kMatch;
}

// The part of rest before a comma, which is taken off.
std::string_view nextName(std::string_view& rest) noexcept {
  const size_t comma = rest.find(',');
  const std::string_view name(rest.data(), comma == std::string_view::npos ? rest.size() : comma);
  rest.remove_prefix(comma == std::string_view::npos ? rest.size() : comma + 1);
  return name;
}

bool takeSchemes(const char* list) noexcept {
  std::string_view rest(list);
  do {
    const std::string_view name = nextName(rest);
    const Scheme* scheme = findScheme(name);
    if (scheme == nullptr) {
      report("unknown scheme \"%.*s\" in schemes=%s", static_cast<int>(name.size()), name.data(), list);
      return false;
    }
    module.served[scheme - kSchemes] = true;
  } while (!rest.empty());
  return true;
}

bool takeArguments(int argc, char** argv) noexcept {
  static constexpr char kKeys[] = "keys=";
  static constexpr char kSchemeList[] = "schemes=";
  bool chosen = false;
  for (int i = 0; i < argc; ++i) {
    if (std::strncmp(argv[i], kKeys, sizeof kKeys - 1) == 0 && module.keyFile == nullptr) {
      module.keyFile = argv[i] + sizeof kKeys - 1;
    } else if (std::strncmp(argv[i], kSchemeList, sizeof kSchemeList - 1) == 0 && !chosen) {
      chosen = true;
      if (!takeSchemes(argv[i] + sizeof kSchemeList - 1)) return false;
    } else {
      report("unknown or repeated argument \"%s\"; there are keys=FILE and schemes=LIST", argv[i]);
      return false;
    }
  }
  for (size_t i = 0; !chosen && i < kSchemeCount; ++i) module.served[i] = kSchemes[i].lacking;
  return true;
}

// Without keys the module is there all the same: an AES value then matches nothing.
void takeKeys() noexcept {
  bool needed = false;
  for (size_t i = 0; i < kSchemeCount; ++i) needed = needed || (module.served[i] && kSchemes[i].needsKeys());
  if (!needed) return;
  KeyReport found;
  module.keys = loadKeyFile(module.library, module.keyFile, found);
  if (module.keys == nullptr) report("%s; no value of {AES128}, {AES192} or {AES256} will match", found.problem);
  if (found.warning[0] != '\0') report("%s", found.warning);
}

// Also of a scheme that is not served, when slapd lacks it: its SASL mechanisms take a value with an unknown tag for a
// clear password, so that the stored text itself would do.
bool registerSchemes() noexcept {
  for (size_t i = 0; i < kSchemeCount; ++i) {
    const Scheme& scheme = kSchemes[i];
    if (!module.served[i] && !scheme.lacking) continue;
    module.names[i] = {std::strlen(scheme.tag), const_cast<char*>(scheme.tag)};
    if (lutil_passwd_add(&module.names[i], check, scheme.matches == nullptr ? nullptr : hash) != 0) {
      report("slapd does not take the scheme %s", scheme.tag);
      return false;
    }
  }
  return true;
}

bool start(int argc, char** argv) noexcept {
  const char* problem = nullptr;
  if (module.loaded) {
    report("the module is loaded twice");
    return false;
  }
  if (lutil_passwd_add == nullptr) {
    report("this program takes no password schemes");
    return false;
  }
  if (!openLibrary(module.library, problem)) {
    report("%s", problem);
    return false;
  }
  if (!takeArguments(argc, argv)) return false;
  module.loaded = true;
  takeKeys();
  return registerSchemes();
}

}  // namespace
}  // namespace plugin

int init_module(int argc, char** argv) {
  return plugin::start(argc, argv) ? plugin::kMatch : plugin::kError;
}

int term_module() {
  if (plugin::module.loaded) plugin::module.library.freeKeys(plugin::module.keys);
  plugin::module.keys = nullptr;
  return plugin::kMatch;
}
