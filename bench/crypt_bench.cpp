// SPDX-License-Identifier: Apache-2.0
// Unix crypt and DES beside libxcrypt's, OpenSSL's and nettle's, and the masked encoding beside its parts done by the
// fastest of them.
#include <crypt.h>
#include <nettle/des.h>
#include <openssl/des.h>
#include <openssl/evp.h>

#include <cstdlib>
#include <ctime>

#include "bench_support.h"
#include "crypt/crypto_des.h"

namespace {

using bench::kPassword;
using bench::measure;

const char* const kText = kPassword.c_str();
unsigned char key[8] = {0x13, 0x34, 0x57, 0x79, 0x9b, 0xbc, 0xdf, 0xf1};
unsigned char blocks[120];  // enciphered in place, so that each result is the next input
char salt[] = "ab";

// ---- Unix crypt ----

void libxcrypt() {
  static crypt_data data;
  benchmark::DoNotOptimize(crypt_r(kText, salt, &data));
}

void openssl() {
  char out[14];
  benchmark::DoNotOptimize(DES_fcrypt(kText, salt, out));
}

void addCrypt() {
  measure("crypt/ours", [] {
    static ldappw_crypt_data data;
    benchmark::DoNotOptimize(_crypt_r(kText, salt, &data));
  });
  measure("crypt/libxcrypt", libxcrypt);
  measure("crypt/openssl", openssl);
  measure("crypt-format/ours", [] {
    char out[32];
    benchmark::DoNotOptimize(
        format_password(FORMAT_CRYPT, salt, nullptr, kText, static_cast<int>(kPassword.size()), out, sizeof out));
  });
  measure("crypt-format/libxcrypt", libxcrypt);
  measure("crypt-format/openssl", openssl);
}

// ---- DES ----

struct NettleKey {
  des_ctx context;
  NettleKey() { des_set_key(&context, key); }
};

struct OurKey {
  uint32_t schedule[32];
  OurKey() { deskey(schedule, key, 0); }
};

void nettleBlocks(size_t count) {
  static const NettleKey nettle;
  des_encrypt(&nettle.context, 8 * count, blocks, blocks);
  benchmark::DoNotOptimize(blocks);
}

void opensslSchedule() {
  DES_key_schedule schedule;
  DES_set_key_unchecked(&key, &schedule);
  benchmark::DoNotOptimize(schedule);
}

void addDes() {
  static const OurKey ours;
  measure("des/ours", [] {
    des(ours.schedule, blocks);
    benchmark::DoNotOptimize(blocks);
  });
  measure("des/nettle", [] { nettleBlocks(1); });
  measure("des-12-blocks/ours", [] {
    ldappw::desBlocks(ours.schedule, blocks, 12);
    benchmark::DoNotOptimize(blocks);
  });
  measure("des-12-blocks/nettle", [] { nettleBlocks(12); });
  measure("deskey/ours", [] {
    uint32_t schedule[32];
    deskey(schedule, key, 0);
    benchmark::DoNotOptimize(schedule);
  });
  measure("deskey/openssl", opensslSchedule);
}

// ---- The masked encoding of a password: 13 blocks under two keys, a record of 120 bytes ----

// One of the values that the password can have: with another each time, instruction counts would not repeat.
const std::string kMasked =
    "{qVEIL}>1Vk8WFlANI4m9hMQH2x5VS4fJAKt7LFjXqsVbSp8s1ke3D/LA1hAA/PhroncGa06ergmjywLaP7fD4q8VMQ/e1mt5U0kvD+6O+gBbbbPj8"
    "xo3Z1KaZn8TXsTNH7uYeIA9e0t3la+KqPbLWAiC/6URVi/65tCoDU1pf<";

constexpr int kRecord = sizeof blocks;
constexpr int kRecordText = kRecord / 3 * 4;

void cipherParts() {
  opensslSchedule();
  opensslSchedule();
  nettleBlocks(12);
  nettleBlocks(1);
}

void draw(int count) {
  auto seed = static_cast<unsigned>(std::time(nullptr));
  for (int i = 0; i < count; ++i) benchmark::DoNotOptimize(rand_r(&seed));
}

void addMasking() {
  measure("mask/ours", [] {
    char* text = nullptr;
    _morva_utils_encode_buffer(kText, &text);
    benchmark::DoNotOptimize(text);
    std::free(text);
  });
  measure("mask/parts", [] {
    benchmark::DoNotOptimize(std::clock());
    draw(6 + 24);  // four bytes of background each
    draw(1);       // a key
    draw(1);
    cipherParts();
    auto* text = static_cast<unsigned char*>(std::malloc(kRecordText + 5));
    EVP_EncodeBlock(text, blocks, kRecord);
    benchmark::DoNotOptimize(text);
    std::free(text);
  });
  measure("unmask/ours", [masked = kMasked.substr(sizeof qVEIL_BRACED)] {
    char text[kRecordText + 5];
    masked.copy(text, sizeof text);
    text[masked.size()] = '\0';
    char* clear = nullptr;
    _morva_utils_decode_buffer(text, &clear);
    benchmark::DoNotOptimize(clear);
    std::free(clear);
  });
  measure("qveil-verify/ours", [] { benchmark::DoNotOptimize(bench::verified(kPassword, kMasked)); });
  measure("unmask/parts", [] {
    static const std::string text(kRecordText, 'x');
    unsigned char record[kRecord + 3];
    EVP_DecodeBlock(record, reinterpret_cast<const unsigned char*>(text.data()), kRecordText);
    benchmark::DoNotOptimize(record);
    cipherParts();
    void* clear = std::malloc(kPassword.size() + 1);
    benchmark::DoNotOptimize(clear);
    std::free(clear);
  });
}

const bench::Rows kRows([] {
  addCrypt();
  addDes();
  addMasking();
});

}  // namespace
