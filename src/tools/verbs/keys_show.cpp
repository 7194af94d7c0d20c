// SPDX-License-Identifier: Apache-2.0
// ldappw keys show: what a stash file holds, with a fingerprint in place of each key.
#include "verbs/keys.h"

#include <cstdio>

#include "base/sha256.h"
#include "base/text.h"
#include "schemes/key_record.h"
#include "schemes/scheme.h"

namespace tool {
namespace {

constexpr unsigned kShownBytes = 8;

struct Options {
  std::string file;
  bool json = false;
};

// Calls work with the name, the bytes and the fingerprint of each key.
template <typename Work>
void forEachKey(const KeyRecord& record, Work work) {
  Sha256 sha256;
  for (const Scheme& scheme : kSchemes) {
    if (!scheme.needsKey()) continue;
    const SecBuffer& key = record.get()->aesKeys[scheme.keyIndex];
    const Sha256::Digest digest = sha256.of({viewOf(key)});
    char shown[2 * kShownBytes + 1];
    for (unsigned i = 0; i < kShownBytes; ++i) snprintf(shown + 2 * i, 3, "%02x", static_cast<unsigned>(digest[i]));
    work(scheme.name, key.length, shown);
  }
}

void showJson(const Options& options, const KeyRecord& record, Results& results) {
  Json json;
  json.text("file", options.file).text("sync", record.sync()).text("salt", record.salt()).openList("keys");
  forEachKey(record, [&](const char* name, unsigned bytes, const char* fingerprint) {
    json.open("").text("scheme", name).number("bytes", bytes).text("fingerprint", fingerprint).close();
  });
  results.line(json.closeList().end());
}

void showText(const Options& options, const KeyRecord& record, Results& results) {
  const auto characters = [](const char* name, std::string_view text) {
    return name + std::string(text) + " (" + std::to_string(text.size()) + " characters)";
  };
  results.line("file: " + printable(options.file));
  results.line(characters("sync: ", record.sync()));
  results.line(characters("salt: ", record.salt()));
  forEachKey(record, [&](const char* name, unsigned bytes, const char* fingerprint) {
    results.line(name + (": " + std::to_string(bytes)) + " bytes, fingerprint " + fingerprint);
  });
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
  addKeys(verb, "FILE", options->file, "key stash file").required();
  addFlag(verb, "--json", options->json, "the result as a JSON object");
  onRun(verb, [options, &exitCode] { exitCode = show(*options); });
}

}  // namespace tool
