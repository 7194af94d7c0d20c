// SPDX-License-Identifier: Apache-2.0
#include "base/base64.h"

#include <cstdlib>
#include <cstring>
#include <new>

#include "base/text.h"
#include "encoding_utils.h"

namespace tool {

void appendBase64(std::string_view bytes, Secret& out) {
  const auto* data = reinterpret_cast<const unsigned char*>(bytes.data());
  const AllocatedText text(binaryBlobToBase64(data, static_cast<int>(bytes.size())));
  if (!text) throw std::bad_alloc();
  out.append(text.get());
}

bool decodeBase64(std::string_view text, Secret& bytes) {
  bytes.clear();
  const long expected = base64Bytes(text);
  if (expected <= 0) return expected == 0;
  const Secret copy(text);  // for its NUL
  unsigned int length = 0;
  unsigned char* decoded = base64ToBinaryBlob(copy.c_str(), &length);
  if (decoded == nullptr) throw std::bad_alloc();
  bytes.append({reinterpret_cast<const char*>(decoded), length});
  explicit_bzero(decoded, length);
  free(decoded);
  if (length == static_cast<unsigned long>(expected)) return true;
  bytes.clear();
  return false;
}

}  // namespace tool
