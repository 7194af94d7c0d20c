// SPDX-License-Identifier: Apache-2.0
// What the processor can do beyond the least of its kind, for the few places that have a faster kernel for it.
#pragma once

namespace ldappw {

struct Processor {
  bool hasSse41;
  bool hasSha;  // the SHA extensions, and SSE4.1 with them
};

// Asked once, when the library is loaded.
extern const Processor processor;

}  // namespace ldappw
