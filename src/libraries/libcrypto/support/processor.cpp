// SPDX-License-Identifier: Apache-2.0
// The loader has asked the processor already, and is asked here: CPUID itself takes some ten microseconds a time in a
// virtual machine, where a few of them are a twentieth of the library's loading.
#include "support/processor.h"

#ifdef __clang__
#define _Bool bool  // the header is C
#endif
#include <sys/platform/x86.h>

namespace ldappw {

const Processor processor{CPU_FEATURE_ACTIVE(SSE4_1), CPU_FEATURE_ACTIVE(SSE4_1) && CPU_FEATURE_ACTIVE(SHA)};

}  // namespace ldappw
