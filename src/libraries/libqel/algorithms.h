// SPDX-License-Identifier: Apache-2.0
// Algorithms by name, fetched on the first use of a name in a provider context.
#ifndef QEL_ALGORITHMS_H
#define QEL_ALGORITHMS_H

#include "provider.h"

namespace qel {

// The slot of an algorithm; null after a failure, which is recorded.
DigestPool::Slot* findDigest(const Call& call, const char* name) noexcept;
CipherPool::Slot* findCipher(const Call& call, const char* name) noexcept;

// OpenSSL's algorithm for a replica that is not there yet; the first one when it cannot be had. The slot belongs to the
// provider context of the call.
[[gnu::cold]] EVP_MD* addReplica(const Call& call, DigestPool::Slot& slot, unsigned replica) noexcept;
[[gnu::cold]] EVP_CIPHER* addReplica(const Call& call, CipherPool::Slot& slot, unsigned replica) noexcept;

// OpenSSL's algorithm for contexts of this replica.
template <typename Slot>
auto* algorithmOf(const Call& call, Slot& slot, unsigned replica) noexcept {
  auto* algorithm = slot.value.replicas.get(replica);
  return algorithm != nullptr ? algorithm : addReplica(call, slot, replica);
}

}  // namespace qel

#endif
