// SPDX-License-Identifier: Apache-2.0
// Owners of OpenSSL's objects.
#ifndef QEL_OPENSSL_OWNER_H
#define QEL_OPENSSL_OWNER_H

#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/provider.h>

#include <memory>

namespace qel {

struct OpensslRelease {
  void operator()(OSSL_LIB_CTX* context) const noexcept { OSSL_LIB_CTX_free(context); }
  void operator()(OSSL_PROVIDER* provider) const noexcept { OSSL_PROVIDER_unload(provider); }
  void operator()(EVP_MD* digest) const noexcept { EVP_MD_free(digest); }
  void operator()(EVP_CIPHER* cipher) const noexcept { EVP_CIPHER_free(cipher); }
  void operator()(EVP_MD_CTX* context) const noexcept { EVP_MD_CTX_free(context); }
  void operator()(EVP_CIPHER_CTX* context) const noexcept { EVP_CIPHER_CTX_free(context); }
};

template <typename T>
using Owned = std::unique_ptr<T, OpensslRelease>;

}  // namespace qel

#endif
