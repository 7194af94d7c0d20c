// SPDX-License-Identifier: Apache-2.0
// What functions of vector code need around them: their entry, and the clearing of what they leave behind.
#pragma once

#include "support/wipe.h"

// Attributes of a kernel's entry. A 32-bit host may come with a stack on which vectors cannot be kept.
#ifdef __i386__
#define LDAPPW_KERNEL gnu::noinline, gnu::force_align_arg_pointer
#else
#define LDAPPW_KERNEL gnu::noinline
#endif

namespace ldappw {

#ifdef __x86_64__
// Clears the vector registers, whatever copies of clear text the compiler has made there. Sixteen are enough for the
// kernels to keep nothing on the stack: Secrets.AreGoneFromTheStack pins it.
inline void clearTraces() noexcept {
  __asm__ volatile(
      "pxor %%xmm0, %%xmm0\n\tpxor %%xmm1, %%xmm1\n\tpxor %%xmm2, %%xmm2\n\tpxor %%xmm3, %%xmm3\n\t"
      "pxor %%xmm4, %%xmm4\n\tpxor %%xmm5, %%xmm5\n\tpxor %%xmm6, %%xmm6\n\tpxor %%xmm7, %%xmm7\n\t"
      "pxor %%xmm8, %%xmm8\n\tpxor %%xmm9, %%xmm9\n\tpxor %%xmm10, %%xmm10\n\tpxor %%xmm11, %%xmm11\n\t"
      "pxor %%xmm12, %%xmm12\n\tpxor %%xmm13, %%xmm13\n\tpxor %%xmm14, %%xmm14\n\tpxor %%xmm15, %%xmm15"
      :
      :
      : "xmm0", "xmm1", "xmm2", "xmm3", "xmm4", "xmm5", "xmm6", "xmm7", "xmm8", "xmm9", "xmm10", "xmm11", "xmm12",
        "xmm13", "xmm14", "xmm15");
}
#else
// With eight registers a kernel also uses the stack, below its caller as this function does.
[[gnu::noinline, gnu::target("sse2")]] inline void clearTraces() noexcept {
  constexpr size_t kMostOfAKernel = 512;
  unsigned char stack[kMostOfAKernel];
  wipe(stack, sizeof stack);
  __asm__ volatile(
      "pxor %%xmm0, %%xmm0\n\tpxor %%xmm1, %%xmm1\n\tpxor %%xmm2, %%xmm2\n\tpxor %%xmm3, %%xmm3\n\t"
      "pxor %%xmm4, %%xmm4\n\tpxor %%xmm5, %%xmm5\n\tpxor %%xmm6, %%xmm6\n\tpxor %%xmm7, %%xmm7"
      :
      :
      : "xmm0", "xmm1", "xmm2", "xmm3", "xmm4", "xmm5", "xmm6", "xmm7");
}
#endif

}  // namespace ldappw
