// SPDX-License-Identifier: Apache-2.0
// The one process-wide provider context, and cipher and digest contexts over it.
#include <cstddef>
#include <cstdio>
#include <cstdlib>

#include "mutex_lock.h"
#include "qel_utils.h"
#include "trace_scope.h"

static_assert(sizeof(QelStatus) == 268 && offsetof(QelStatus, minRC) == 4 && offsetof(QelStatus, desc) == 8,
              "the layout is the provider's");

namespace ldappw {
namespace {

constexpr TraceInfo kInitCrypto{"initQelCrypto", operationScope(moduleId(kQelUtils, 4)), LineClass::error};
constexpr TraceInfo kFreeCrypto{"freeQelCrypto", operationScope(moduleId(kQelUtils, 5)), LineClass::error};
constexpr TraceInfo kStatusToLdap{"qelStatusToLdap", operationScope(moduleId(kQelUtils, 10)), LineClass::error};

constexpr int kPathValue = 1;
constexpr int kStateValue = 0;
constexpr uint32_t kProviderNoMemory = 15;

// What the cipher pair and the digest pair differ in. The operations are reached through the table at call time.
struct ContextKind {
  TraceInfo create;
  TraceInfo release;
  const char* contextArgument;
  const char* nameArgument;
  const char* algorithmArgument;
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

constexpr ContextKind kCipher{{"initQelCipher", operationScope(moduleId(kQelUtils, 6)), LineClass::error},
                              {"freeQelCipher", operationScope(moduleId(kQelUtils, 7)), LineClass::error},
                              "cipherCtx",
                              "cipherName",
                              "cipher",
                              &pQEL_EVP_CIPHER_CTX_new,
                              &pQEL_EVP_CIPHER_CTX_init,
                              &pQEL_EVP_get_cipherbyname,
                              &pQEL_EVP_CIPHER_CTX_cleanup,
                              &pQEL_EVP_CIPHER_CTX_free,
                              "QEL_EVP_CIPHER_CTX_new() failed.",
                              "QEL_EVP_get_cipherbyname() failed.",
                              "QEL_EVP_CIPHER_CTX_cleanup() failed.",
                              "QEL_EVP_CIPHER_CTX_free() failed."};

constexpr ContextKind kDigest{{"initQelDigest", operationScope(moduleId(kQelUtils, 8)), LineClass::error},
                              {"freeQelDigest", operationScope(moduleId(kQelUtils, 9)), LineClass::error},
                              "digestCtx",
                              "digestName",
                              "digest",
                              &pQEL_EVP_MD_CTX_new,
                              &pQEL_EVP_MD_CTX_init,
                              &pQEL_EVP_get_digestbyname,
                              &pQEL_EVP_MD_CTX_cleanup,
                              &pQEL_EVP_MD_CTX_free,
                              "QEL_EVP_MD_CTX_new() failed.",
                              "QEL_EVP_get_digestbyname() failed.",
                              "QEL_EVP_MD_CTX_cleanup() failed.",
                              "QEL_EVP_MD_CTX_free() failed."};

// Serialises the creation of the provider context.
pthread_mutex_t creationMutex = PTHREAD_MUTEX_INITIALIZER;

void* currentContext() noexcept {
  return __atomic_load_n(&qelCtxGlobal, __ATOMIC_ACQUIRE);
}

// Loads the provider and makes the context; under the lock.
[[gnu::cold]] int createProviderContext(TracedCall& call) noexcept {
  QelStatus status{};
  char* loadedPath = nullptr;
  const int rc = loadQelCrypto(&loadedPath);
  const PlainOwner<char> path(loadedPath);
  if (rc != LDAPPW_SUCCESS) {
    return call.failText(rc, "Error - initQelCrypto: loadQelCrypto() failed. \n");  // no code: meant
  }
  // A provider too old to tell its path leaves the table unresolved.
  void* context = pQEL_Init == nullptr ? nullptr : pQEL_Init(&status, path.get());
  if (context == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "QEL_Init() returned NULL context.");
  pQEL_SetValue(context, &status, kPathValue, path.get());
  pQEL_SetValue(context, &status, kStateValue, "on");
  pQEL_Attach(context, &status);
  std::atexit(unloadQelCrypto);
  __atomic_store_n(&qelCtxGlobal, context, __ATOMIC_RELEASE);
  return LDAPPW_SUCCESS;
}

// A copy for each kind, in which the kind's row is known.
template <const ContextKind& kind>
int releaseContext(void* qelCtx, void* context) noexcept {
  TracedCall call{kind.release, "qelCtx", qelCtx, kind.contextArgument, context};
  if (qelCtx == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  if (context == nullptr) return call.leave(LDAPPW_SUCCESS);
  if (const int rc = (*kind.cleanContext)(qelCtx, context); rc != 1) {
    return call.failShowing(LDAPPW_OPERATIONS_ERROR, kind.cleanFailed, rc);  // not released: meant
  }
  if (const int rc = (*kind.freeContext)(qelCtx, context); rc != 1) {
    return call.failShowing(LDAPPW_OPERATIONS_ERROR, kind.freeFailed, rc);
  }
  return call.leave(LDAPPW_SUCCESS);
}

template <const ContextKind& kind>
int createContext(void* qelCtx, void** context, const char* name, void** algorithm) noexcept {
  TracedCall call{kind.create, "qelCtx",          qelCtx, kind.contextArgument,
                  context,     kind.nameArgument, name,   kind.algorithmArgument,
                  algorithm};
  if (qelCtx == nullptr || context == nullptr || name == nullptr || algorithm == nullptr) {
    return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  }
  *context = *kind.newContext == nullptr ? nullptr : (*kind.newContext)(qelCtx);
  if (*context == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, kind.newFailed);
  (*kind.initContext)(qelCtx, *context);
  *algorithm = const_cast<void*>((*kind.byName)(qelCtx, name));
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

void* qelCtxGlobal = nullptr;

int initQelCrypto(void** qelCtx) noexcept {
  TracedCall call{kInitCrypto, "qelCtx", qelCtx};
  if (qelCtx == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
  void* context = currentContext();
  if (__builtin_expect(context == nullptr, 0)) {
    const MutexLock lock(creationMutex);
    if (currentContext() == nullptr) {
      if (const int rc = createProviderContext(call); rc != LDAPPW_SUCCESS) return rc;
    }
    context = currentContext();
  }
  *qelCtx = context;
  return call.leave(LDAPPW_SUCCESS);
}

int freeQelCrypto(void* qelCtx) noexcept {
  TracedCall call{kFreeCrypto, "qelCtx", qelCtx};
  if (qelCtx != nullptr && pQEL_Cleanup != nullptr) {
    QelStatus status{};
    pQEL_Cleanup(qelCtx, &status);
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
  TracedCall call{kStatusToLdap, "qelCtx", qelCtx, "status", status};
  QelStatus last{};
  if (status == nullptr) {
    if (qelCtx == nullptr) return call.fail(LDAPPW_OPERATIONS_ERROR, "Invalid parameter.");
    if (pQEL_GetStatus != nullptr) pQEL_GetStatus(qelCtx, &last);
    status = &last;
  }
  if (status->majRC == 0) return call.leave(LDAPPW_SUCCESS);
  std::printf("QEL Status - \nmajRC: %d\nminRC: %d\ndesc: %.*s\n", status->majRC, status->minRC,
              static_cast<int>(sizeof status->desc), status->desc);
  const bool noMemory = static_cast<uint32_t>(status->minRC) == kProviderNoMemory;
  return call.leave(noMemory ? LDAPPW_NO_MEMORY : LDAPPW_OPERATIONS_ERROR);
}

}  // extern "C"
