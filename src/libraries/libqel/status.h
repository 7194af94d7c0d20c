// SPDX-License-Identifier: Apache-2.0
// Failure records: one for each thread and provider context, and the caller's own where an entry takes one.
#ifndef QEL_STATUS_H
#define QEL_STATUS_H

#include <cstdint>

#include "qel.h"

namespace qel {

// Whether OpenSSL's reason belongs to the failure.
enum class Source { kProvider, kOpenssl };

// Remembers a failure for the calling thread and the context handle (0: nothing to remember it for), fills *status when
// it is not null, and empties OpenSSL's error queue. An OpenSSL reason of "no memory" replaces the given one.
void recordFailure(std::uintptr_t context, QelStatus* status, QelReason reason, Source source,
                   const char* text) noexcept;

// The last failure of the calling thread with the context, all zero when there was none.
void lastFailure(std::uintptr_t context, QelStatus& status) noexcept;

// The record of a success.
void clearStatus(QelStatus* status) noexcept;

}  // namespace qel

#endif
