// SPDX-License-Identifier: Apache-2.0
// Random printable texts and the key salt.
#include "aes/aes_salt.h"

#include <cstdio>
#include <cstdlib>

#include "aes_keys.h"
#include "provider/qel_utils.h"
#include "support/trace_scope.h"

namespace ldappw {
namespace {

constexpr TraceInfo kSaltVal = operation(kAesSalt, 1, "genKeySaltVal", {"qelCtx", "keyData"});

constexpr int kFirstPrintable = 33;
constexpr int kLastPrintable = 126;

unsigned char* morva_rand(void* qelCtx, unsigned char* buffer, unsigned count) noexcept {
  if (randomBytes(qelCtx, buffer, static_cast<int>(count)) != 1) {
    std::fputs("The PRNG is not seeded!\n", stderr);  // keys must never come from a generator that failed
    std::abort();
  }
  return buffer;
}

uint32_t morva_rand_uint(void* qelCtx) noexcept {
  uint32_t number = 0;
  morva_rand(qelCtx, reinterpret_cast<unsigned char*>(&number), sizeof number);
  return number;
}

}  // namespace

// The multiplier is the width plus one and the modulus the width, so that highBound itself never comes out and the
// first two numbers come out more often than others. The quotient is that of extended floating point cut to an integer:
// where it is not whole it misses the next number by more than that rounds. A host's rounding and flags stay out of it.
// Derivation.RandomTextsAreOfTheirRangeAndEndAtTheLastByte pins it.
int morva_rand_range(void* qelCtx, int lowBound, int highBound) noexcept {
  if (highBound <= lowBound) std::abort();
  const int width = highBound - lowBound;
  const uint64_t scaled = uint64_t{morva_rand_uint(qelCtx)} * (static_cast<uint64_t>(width) + 1) / UINT32_MAX;
  return static_cast<int32_t>(scaled) % width + lowBound;
}

}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in aes_keys.h.

int morva_rand_ascii(void* qelCtx, unsigned char* buffer, unsigned int size) noexcept {
  if (pQEL_RAND_bytes == nullptr) return LDAPPW_OPERATIONS_ERROR;
  if (buffer == nullptr || size == 0) return LDAPPW_SUCCESS;
  for (unsigned i = 0; i + 1 < size; ++i) {
    buffer[i] = static_cast<unsigned char>(morva_rand_range(qelCtx, kFirstPrintable, kLastPrintable));
  }
  buffer[size - 1] = 0;
  return LDAPPW_SUCCESS;
}

int genKeySaltVal(void* qelCtx, AesKeyData* keyData) noexcept {
  TracedCall call{kSaltVal, qelCtx, keyData};
  if (anyNull(qelCtx, keyData) || keyData->cryptoSalt.data == nullptr) return call.invalid();
  const SecBuffer& salt = keyData->cryptoSalt;
  const int rc = morva_rand_ascii(qelCtx, salt.data, salt.length + 1);
  return rc == LDAPPW_SUCCESS ? call.leave(rc) : call.fail(rc, "morva_rand_ascii() failed.");
}

}  // extern "C"
