// SPDX-License-Identifier: Apache-2.0
// Owners over the provider's contexts, and what loading needs inside the library.
#pragma once

#include "crypto_provider.h"
#include "owners.h"

namespace ldappw {

// New paths of the provider library, or null: the system's copy (mode 1), and the copy shipped in the install tree
// (mode 1) or that tree's library folder itself (mode 2).
PlainOwner<char> getQelInstallLibPath(int mode) noexcept;
PlainOwner<char> getKubInstallLibPath(int mode) noexcept;

using InitContext = int (*)(void* qelCtx, void** context, const char* name, void** algorithm);
using FreeContext = int (*)(void* qelCtx, void* context);

// A cipher or digest context with its algorithm, released when it goes.
template <InitContext kInit, FreeContext kFree>
class ProviderContext {
 public:
  explicit ProviderContext(void* qelCtx) noexcept : qelCtx_(qelCtx) {}
  ~ProviderContext() {
    if (context_ != nullptr) kFree(qelCtx_, context_);
  }
  ProviderContext(const ProviderContext&) = delete;
  ProviderContext& operator=(const ProviderContext&) = delete;

  int init(const char* name) noexcept { return kInit(qelCtx_, &context_, name, &algorithm_); }
  void* get() const noexcept { return context_; }
  void* algorithm() const noexcept { return algorithm_; }

 private:
  void* qelCtx_;
  void* context_ = nullptr;
  void* algorithm_ = nullptr;
};

using CipherContext = ProviderContext<initQelCipher, freeQelCipher>;
using DigestContext = ProviderContext<initQelDigest, freeQelDigest>;

}  // namespace ldappw
