// SPDX-License-Identifier: Apache-2.0
#include "base/sha256.h"

#include "base/failure.h"
#include "crypto_provider.h"

namespace tool {

Sha256::Sha256() {
  if (initQelCrypto(&provider_) != LDAPPW_SUCCESS ||
      initQelDigest(provider_, &context_, "SHA256", &digest_) != LDAPPW_SUCCESS) {
    throw Failure(kInternal, "the crypto provider has no SHA256");
  }
}

Sha256::~Sha256() {
  freeQelDigest(provider_, context_);
}

Sha256::Digest Sha256::of(std::initializer_list<std::string_view> parts) {
  Digest out{};
  unsigned length = 0;
  bool done = pQEL_EVP_DigestInit(provider_, context_, digest_) == 1;
  for (const std::string_view part : parts) {
    done = done && pQEL_EVP_DigestUpdate(provider_, context_, part.data(), static_cast<unsigned>(part.size())) == 1;
  }
  if (!done || pQEL_EVP_DigestFinal(provider_, context_, out.data(), &length) != 1 || length != out.size()) {
    throw Failure(kInternal, "the crypto provider failed to make a digest");
  }
  return out;
}

}  // namespace tool
