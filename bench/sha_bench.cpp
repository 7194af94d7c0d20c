// SPDX-License-Identifier: Apache-2.0
// SHA beside the SHA-1 of OpenSSL and of nettle, both called directly.
#include <nettle/sha1.h>
#include <openssl/sha.h>

#include "bench_support.h"

namespace {

const bench::Rows kRows([] {
  for (const size_t size : {8U, 16U, 32U, 55U, 64U, 1000U}) {
    const std::string row = "sha-" + std::to_string(size);
    const std::string text(size, 'x');
    bench::measure(row + "/ours", [text] {
      sha_digest digest;
      SHA(const_cast<char*>(text.data()), text.size(), &digest);
      benchmark::DoNotOptimize(digest);
    });
    bench::measure(row + "/openssl", [text] {
      SHA_CTX context;
      unsigned char digest[SHA_DIGEST_LENGTH];
      SHA1_Init(&context);
      SHA1_Update(&context, text.data(), text.size());
      SHA1_Final(digest, &context);
      benchmark::DoNotOptimize(digest);
    });
    bench::measure(row + "/nettle", [text] {
      sha1_ctx context;
      uint8_t digest[SHA1_DIGEST_SIZE];
      sha1_init(&context);
      sha1_update(&context, text.size(), bench::bytesOf(text));
      sha1_digest(&context, sizeof digest, digest);
      benchmark::DoNotOptimize(digest);
    });
  }
});

}  // namespace
