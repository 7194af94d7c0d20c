// SPDX-License-Identifier: Apache-2.0
// Compressed input: decoders of gzip and zstd streams, whose memory is wiped before it is released.
#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

#include "base/secret.h"

namespace tool {

class Decompressor {
 public:
  Decompressor() = default;
  Decompressor(const Decompressor&) = delete;
  Decompressor& operator=(const Decompressor&) = delete;
  virtual ~Decompressor() = default;

  // Consumes input from the front of in; appends at most bytes to out. Throws Failure (kIoError) for damaged data.
  virtual void decode(std::string_view& in, Secret& out, size_t bytes) = 0;
  // True where the input may end.
  virtual bool complete() const noexcept = 0;
};

// The decoder for an input that begins like this, or null when it is not compressed in a way that is known here.
std::unique_ptr<Decompressor> decompressorFor(std::string_view beginning);

}  // namespace tool
