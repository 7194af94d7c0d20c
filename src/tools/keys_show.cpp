// SPDX-License-Identifier: Apache-2.0
// ldappw keys show: what a stash file holds, with a fingerprint in place of each key.
#include <CLI/CLI.hpp>
#include <memory>
#include <nlohmann/json.hpp>

#include "crypto_provider.h"
#include "keys.h"

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
  std::string text;
  for (unsigned i = 0; i < kShownBytes; ++i) {
    text += kHex[digest[i] >> 4];
    text += kHex[digest[i] & 15U];
  }
  return {scheme.name, key.length, text};
}

std::vector<Fingerprint> fingerprints(const KeyRecord& record) {
  Sha256 sha256;
  std::vector<Fingerprint> all;
  for (const Scheme* scheme = kSchemes; scheme->name != nullptr; ++scheme) {
    if (scheme->needsKey()) all.push_back(fingerprintOf(*scheme, record.get()->aesKeys[scheme->keyIndex], sha256));
  }
  return all;
}

std::string asJson(const Options& options, const KeyRecord& record) {
  nlohmann::ordered_json object;
  object["file"] = options.file;
  object["sync"] = record.sync();
  object["salt"] = record.salt();
  for (const Fingerprint& key : fingerprints(record)) {
    object["keys"].push_back({{"scheme", key.name}, {"bytes", key.keyBytes}, {"fingerprint", key.text}});
  }
  return object.dump(-1, ' ', false, nlohmann::ordered_json::error_handler_t::replace);
}

std::string asText(const Options& options, const KeyRecord& record) {
  std::string text = "file: " + options.file + "\n";
  text += "sync: " + std::string(record.sync()) + " (" + std::to_string(record.sync().size()) + " characters)\n";
  text += "salt: " + std::string(record.salt()) + " (" + std::to_string(record.salt().size()) + " characters)";
  for (const Fingerprint& key : fingerprints(record)) {
    text += std::string("\n") + key.name + ": " + std::to_string(key.keyBytes) + " bytes, fingerprint " + key.text;
  }
  return text;
}

int show(const Options& options) {
  requireProvider();
  const KeyRecord record = KeyRecord::load(options.file);
  Results results;
  results.line(options.json ? asJson(options, record) : asText(options, record));
  results.flush();
  return kSuccess;
}

}  // namespace

void addKeysShow(CLI::App& keys, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb =
      keys.add_subcommand("show", "Show sync text, salt and key fingerprints of a stash file, never a key");
  verb->add_option("FILE", options->file, "key stash file")->type_name("")->required();
  verb->add_flag("--json", options->json, "the result as a JSON object");
  verb->callback([options, &exitCode] { exitCode = show(*options); });
}

}  // namespace tool
