// SPDX-License-Identifier: Apache-2.0
// The one process-wide provider context, and cipher and digest contexts over it. Log readers match the texts as they
// are, the one that shows no code among them; the ProviderContext and Ledger suites pin all.
#include "provider/qel_utils.h"

#include <sys/stat.h>

#include <cstddef>
#include <cstdio>
#include <cstdlib>

#include "support/cancellation.h"
#include "support/no_fork.h"
#include "support/owners.h"
#include "support/trace_scope.h"

static_assert(sizeof(QelStatus) == 268 && offsetof(QelStatus, minRC) == 4 && offsetof(QelStatus, desc) == 8,
              "the layout is the provider's");

namespace ldappw {
namespace {

constexpr TraceInfo kInitCrypto = operation(kQelUtils, 4, "initQelCrypto", {"qelCtx"});
constexpr TraceInfo kFreeCrypto = operation(kQelUtils, 5, "freeQelCrypto", {"qelCtx"});
constexpr TraceInfo kStatusToLdap = operation(kQelUtils, 10, "qelStatusToLdap", {"qelCtx", "status"});

constexpr int kPathValue = 1;
constexpr int kStateValue = 0;
constexpr uint32_t kProviderNoMemory = 15;

// What the cipher pair and the digest pair differ in. The operations are reached through the table at call time.
struct ContextKind {
  TraceInfo create;
  TraceInfo release;
  void* (**newContext)(void*);
  int (**initContext)(void*, void*);
  const void* (**byName)(void*, const char*);
  int (**cleanContext)(void*, void*);
  int (**freeContext)(void*, void*);
  const char* newFailed;
  const char* byNameFailed;
  const char* cleanFailed;
  const char* freeFailed;
};

constexpr ContextKind kCipher{
    operation(kQelUtils, 6, "initQelCipher", {"qelCtx", "cipherCtx", "cipherName", "cipher"}),
    operation(kQelUtils, 7, "freeQelCipher", {"qelCtx", "cipherCtx"}),
    &pQEL_EVP_CIPHER_CTX_new,
    &pQEL_EVP_CIPHER_CTX_init,
    &pQEL_EVP_get_cipherbyname,
    &pQEL_EVP_CIPHER_CTX_cleanup,
    &pQEL_EVP_CIPHER_CTX_free,
    "QEL_EVP_CIPHER_CTX_new() failed.",
    "QEL_EVP_get_cipherbyname() failed.",
    "QEL_EVP_CIPHER_CTX_cleanup() failed.",
    "QEL_EVP_CIPHER_CTX_free() failed.",
};

constexpr ContextKind kDigest{
    operation(kQelUtils, 8, "initQelDigest", {"qelCtx", "digestCtx", "digestName", "digest"}),
    operation(kQelUtils, 9, "freeQelDigest", {"qelCtx", "digestCtx"}),
    &pQEL_EVP_MD_CTX_new,
    &pQEL_EVP_MD_CTX_init,
    &pQEL_EVP_get_digestbyname,
    &pQEL_EVP_MD_CTX_cleanup,
    &pQEL_EVP_MD_CTX_free,
    "QEL_EVP_MD_CTX_new() failed.",
    "QEL_EVP_get_digestbyname() failed.",
    "QEL_EVP_MD_CTX_cleanup() failed.",
    "QEL_EVP_MD_CTX_free() failed.",
};

// ---- The end of the process, and of the library ----

bool isUnloading = false;  // dlclose has begun, or the last part of exit
bool isExiting = false;    // exit has begun, with other threads about: no context is made any more

// Runs before the exit handlers of a library that is unloaded, and after those of a process that exits.
[[gnu::destructor]] void noteUnloading() noexcept {
  isUnloading = true;
}

// A task directory has a link for each thread beside its own two.
bool isOnlyThread() noexcept {
  struct stat tasks {};
  return stat("/proc/self/task", &tasks) == 0 && tasks.st_nlink == 3;
}

void noteExit() noexcept {
  if (!isUnloading && !isOnlyThread()) __atomic_store_n(&isExiting, true, __ATOMIC_RELEASE);
}

// Registered before any context is made: a context that a thread makes while the process exits would be released by its
// own handler as by dlclose.
[[gnu::constructor]] void watchExit() noexcept {
  std::atexit(noteExit);
}

// Threads that still work when the process exits would lose the code under them: they keep the provider, which the
// process takes with it anyway.
void unloadAtExit() noexcept {
  noteExit();
  if (!__atomic_load_n(&isExiting, __ATOMIC_ACQUIRE)) unloadQelCrypto();
}

// ---- The process-wide context ----

void* currentContext() noexcept {
  return __atomic_load_n(&qelCtxGlobal, __ATOMIC_ACQUIRE);
}

// A new context, set up; null when the provider gives none. A provider too old to report its path leaves the table
// unresolved.
void* newContext(const char* path) noexcept {
  const NoFork unforked;
  QelStatus status{};
  void* context = callEntry(pQEL_Init, &status, path);
  if (context == nullptr) return nullptr;
  callEntry(pQEL_SetValue, context, &status, kPathValue, path);
  callEntry(pQEL_SetValue, context, &status, kStateValue, "on");
  callEntry(pQEL_Attach, context, &status);
  return context;
}

// Makes the context the process's. Of several threads, or of a thread and a trace sink inside its loading, one is
// first; the others have theirs cleaned up.
void publishContext(void* context) noexcept {
  const NoFork unforked;
  void* none = nullptr;
  if (__atomic_compare_exchange_n(&qelCtxGlobal, &none, context, false, __ATOMIC_ACQ_REL, __ATOMIC_ACQUIRE)) {
    std::atexit(unloadAtExit);
  } else if (none != context) {  // a provider may have one for all
    QelStatus status{};
    callEntry(pQEL_Cleanup, context, &status);
  }
}

[[gnu::cold]] int firstContext(TracedCall& call) noexcept {
  const NoCancellation uncancelled;
  if (__atomic_load_n(&isExiting, __ATOMIC_ACQUIRE) && currentContext() == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "the process is exiting.");
  }
  char* loadedPath = nullptr;
  const int rc = loadQelCrypto(&loadedPath);
  const PlainOwner<char> path(loadedPath);
  if (rc != LDAPPW_SUCCESS) return call.failText(rc, "Error - initQelCrypto: loadQelCrypto() failed. \n");
  void* context = newContext(path.get());
  if (context == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_Init() returned NULL context.");
  publishContext(context);
  return LDAPPW_SUCCESS;
}

// ---- Contexts for one call: a copy for each kind, in which the kind's row is known ----

template <const ContextKind& kind>
int releaseContext(void* qelCtx, void* context) noexcept {
  TracedCall call{kind.release, qelCtx, context};
  if (qelCtx == nullptr) return call.invalid();
  if (context == nullptr) return call.leave(LDAPPW_SUCCESS);
  if (const int rc = callEntry(*kind.cleanContext, qelCtx, context);
      rc != 1) {  // what cannot be cleaned is not released
    return call.failShowing(LDAPPW_OPERATIONS_ERROR, kind.cleanFailed, rc);
  }
  if (const int rc = callEntry(*kind.freeContext, qelCtx, context); rc != 1) {
    return call.failShowing(LDAPPW_OPERATIONS_ERROR, kind.freeFailed, rc);
  }
  return call.leave(LDAPPW_SUCCESS);
}

template <const ContextKind& kind>
int createContext(void* qelCtx, void** context, const char* name, void** algorithm) noexcept {
  TracedCall call{kind.create, qelCtx, context, name, algorithm};
  if (anyNull(qelCtx, context, name, algorithm)) return call.invalid();
  *context = callEntry(*kind.newContext, qelCtx);
  if (*context == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, kind.newFailed);
  callEntry(*kind.initContext, qelCtx, *context);
  *algorithm = const_cast<void*>(callEntry(*kind.byName, qelCtx, name));
  if (*algorithm == nullptr) {
    call.fail(LDAPPW_OPERATIONS_ERROR, kind.byNameFailed);
    releaseContext<kind>(qelCtx, *context);
    *context = nullptr;
    return LDAPPW_OPERATIONS_ERROR;
  }
  return call.leave(LDAPPW_SUCCESS);
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in crypto_provider.h.

int initQelCrypto(void** qelCtx) noexcept {
  TracedCall call{kInitCrypto, qelCtx};
  if (qelCtx == nullptr) return call.invalid();
  if (currentContext() == nullptr) {
    if (const int rc = firstContext(call); rc != LDAPPW_SUCCESS) return rc;
  }
  *qelCtx = currentContext();
  return call.leave(LDAPPW_SUCCESS);
}

int freeQelCrypto(void* qelCtx) noexcept {
  TracedCall call{kFreeCrypto, qelCtx};
  if (qelCtx != nullptr) {
    const NoCancellation uncancelled;
    QelStatus status{};
    callEntry(pQEL_Cleanup, qelCtx, &status);
  }
  return call.leave(LDAPPW_SUCCESS);
}

int initQelCipher(void* qelCtx, void** cipherCtx, const char* cipherName, void** cipher) noexcept {
  return createContext<kCipher>(qelCtx, cipherCtx, cipherName, cipher);
}

int freeQelCipher(void* qelCtx, void* cipherCtx) noexcept {
  return releaseContext<kCipher>(qelCtx, cipherCtx);
}

int initQelDigest(void* qelCtx, void** digestCtx, const char* digestName, void** digest) noexcept {
  return createContext<kDigest>(qelCtx, digestCtx, digestName, digest);
}

int freeQelDigest(void* qelCtx, void* digestCtx) noexcept {
  return releaseContext<kDigest>(qelCtx, digestCtx);
}

int qelStatusToLdap(void* qelCtx, QelStatus* status) noexcept {
  TracedCall call{kStatusToLdap, qelCtx, status};
  QelStatus last{};
  if (status == nullptr) {
    if (qelCtx == nullptr) return call.invalid();
    callEntry(pQEL_GetStatus, qelCtx, &last);
    status = &last;
  }
  if (status->majRC == 0) return call.leave(LDAPPW_SUCCESS);
  const NoCancellation uncancelled;
  std::printf("QEL Status - \nmajRC: %d\nminRC: %d\ndesc: %.*s\n", status->majRC, status->minRC,
              static_cast<int>(sizeof status->desc), status->desc);
  const bool noMemory = static_cast<uint32_t>(status->minRC) == kProviderNoMemory;
  return call.leave(noMemory ? LDAPPW_NO_MEMORY : LDAPPW_OPERATIONS_ERROR);
}

}  // extern "C"
