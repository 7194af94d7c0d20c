// SPDX-License-Identifier: Apache-2.0
// ldappw keys show: what a stash file holds, with a fingerprint in place of each key.
#include <memory>
#include <vector>

#include "command_line.h"
#include "crypto_provider.h"
#include "keys.h"
#include "scheme.h"
#include "text.h"

namespace tool {
namespace {

constexpr unsigned kDigestBytes = 32;
constexpr unsigned kShownBytes = 8;

struct Options {
  std::string file;
  bool json = false;
};

struct Fingerprint {
  const char* name;
  std::size_t keyBytes;
  std::string text;
};

// A digest context of the provider.
class Sha256 {
 public:
  Sha256() {
    if (initQelCrypto(&provider_) != LDAPPW_SUCCESS ||
        initQelDigest(provider_, &context_, "SHA256", &digest_) != LDAPPW_SUCCESS) {
      throw Failure(kInternal, "the crypto provider has no SHA256");
    }
  }
  ~Sha256() { freeQelDigest(provider_, context_); }
  Sha256(const Sha256&) = delete;
  Sha256& operator=(const Sha256&) = delete;

  void of(const SecBuffer& bytes, unsigned char (&out)[kDigestBytes]) {
    unsigned length = 0;
    if (pQEL_EVP_DigestInit(provider_, context_, digest_) != 1 ||
        pQEL_EVP_DigestUpdate(provider_, context_, bytes.data, bytes.length) != 1 ||
        pQEL_EVP_DigestFinal(provider_, context_, out, &length) != 1 || length != kDigestBytes) {
      throw Failure(kInternal, "the crypto provider failed to make a digest");
    }
  }

 private:
  void* provider_ = nullptr;
  void* context_ = nullptr;
  void* digest_ = nullptr;
};

Fingerprint fingerprintOf(const Scheme& scheme, const SecBuffer& key, Sha256& sha256) {
  static constexpr char kHex[] = "0123456789abcdef";
  unsigned char digest[kDigestBytes];
  sha256.of(key, digest);
  Fingerprint fingerprint{scheme.name, key.length, ""};
  for (unsigned i = 0; i < kShownBytes; ++i) {
    fingerprint.text += kHex[digest[i] >> 4];
    fingerprint.text += kHex[digest[i] & 15U];
  }
  return fingerprint;
}

std::vector<Fingerprint> fingerprints(const KeyRecord& record) {
  Sha256 sha256;
  std::vector<Fingerprint> all;
  for (const Scheme& scheme : kSchemes) {
    if (scheme.needsKey()) all.push_back(fingerprintOf(scheme, record.get()->aesKeys[scheme.keyIndex], sha256));
  }
  return all;
}

void showJson(const Options& options, const KeyRecord& record, Results& results) {
  Json json;
  json.text("file", options.file).text("sync", record.sync()).text("salt", record.salt()).openList("keys");
  for (const Fingerprint& key : fingerprints(record)) {
    json.open("").text("scheme", key.name).number("bytes", key.keyBytes).text("fingerprint", key.text).close();
  }
  results.line(json.closeList().end());
}

void showText(const Options& options, const KeyRecord& record, Results& results) {
  const auto characters = [](const char* name, std::string_view text) {
    return name + std::string(text) + " (" + std::to_string(text.size()) + " characters)";
  };
  results.line("file: " + printable(options.file));
  results.line(characters("sync: ", record.sync()));
  results.line(characters("salt: ", record.salt()));
  for (const Fingerprint& key : fingerprints(record)) {
    results.line(std::string(key.name) + ": " + std::to_string(key.keyBytes) + " bytes, fingerprint " + key.text);
  }
}

ExitCode show(const Options& options) {
  requireProvider();
  const KeyRecord record = KeyRecord::load(options.file);
  Results results;
  (options.json ? showJson : showText)(options, record, results);
  results.flush();
  return kSuccess;
}

}  // namespace

void setUpKeysShow(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addPath(verb, "FILE", options->file, "key stash file")->required();
  verb.add_flag("--json", options->json, "the result as a JSON object");
  verb.callback([options, &exitCode] { exitCode = show(*options); });
}

}  // namespace tool
