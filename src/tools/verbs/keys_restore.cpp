// SPDX-License-Identifier: Apache-2.0
// ldappw keys restore: makes a directory's stash file again.
#include "base/messages.h"
#include "base/terminal.h"
#include "keys/stash.h"
#include "verbs/keys.h"
#include "verbs/seed_options.h"

namespace tool {
namespace {

struct Options : SeedOptions {
  std::string file;
  std::string expectSync;
};

Secret readSalt(const Options& options, SecretSource& seedSource) {
  if (!options.saltFile.empty()) return readSaltFile(options.saltFile);
  SecretSource input("", kSaltLine);
  SecretSource& source = options.seedFile.empty() ? seedSource : input;
  Secret salt = source.require("Salt: ", "salt");
  requireSalt(salt);
  return salt;
}

bool syncMatches(const KeyRecord& record, const std::string& sync) {
  int isMatch = 0;
  requireDone(checkKeyStashFile(0, record.get(), sync.c_str(), "", &isMatch), "the sync text could not be compared");
  return isMatch == 1;
}

ExitCode restore(const Options& options) {
  refuseSecrets(options.secrets, "seed");
  requireProvider();
  SecretSource source(options.seedFile, kSeedLine);
  const Secret seed = source.require("Seed: ", "seed");
  requireSeed(seed);
  const Secret salt = readSalt(options, source);
  const KeyRecord expected = deriveRecord(seed, salt.view());
  if (!options.expectSync.empty() && !syncMatches(expected, options.expectSync)) {
    message("seed and salt do not give the expected sync text; nothing was written");
    return kNoMatch;
  }
  makeDirectoryStash(options.file, options.force, seed, salt);
  Results results;
  results.line(options.json ? Json().text("sync", expected.sync()).end() : expected.sync());
  results.flush();
  return kSuccess;
}

}  // namespace

void setUpKeysRestore(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addPath(verb, "FILE", options->file, "key stash file to make").required();
  addOption(verb, "--expect-sync", options->expectSync, "write nothing unless seed and salt give this sync text");
  addSeedOptions(verb, *options, "read the salt from the first line of this file");
  onRun(verb, [options, &exitCode] { exitCode = restore(*options); });
}

}  // namespace tool
