// SPDX-License-Identifier: Apache-2.0
// ldappw keys create: makes the two stash files.
#include "verbs/keys.h"

#include <filesystem>
#include <string>
#include <utility>

#include "base/messages.h"
#include "base/signals.h"
#include "base/terminal.h"
#include "crypto_provider.h"
#include "keys/stash.h"
#include "keys/stash_folder.h"
#include "verbs/seed_options.h"

namespace tool {
namespace {

struct Options : SeedOptions {
  std::string config;
  std::string directory;
};

constexpr char kSeedAdvice[] =
    "the seed is the key of all AES values: 20 random characters or more that nobody uses elsewhere, such as "
    "\"ldappw format --generate\" makes; whoever has it and the salt can make the directory's stash file again";
constexpr char kWriteDown[] =
    "write this down and keep it away from the stash files, with the seed: from seed and salt \"keys restore\" makes "
    "the directory's stash file again";

bool sameFile(const std::string& a, const std::string& b) {
  std::error_code missing;
  return a == b || std::filesystem::equivalent(a, b, missing);
}

Secret askSeed(const std::string& seedFile) {
  SecretSource source(seedFile, kSeedLine);
  if (source.interactive()) message(kSeedAdvice);
  Secret seed = source.requireTwice("Seed: ", "Seed again: ", "seed");
  requireSeed(seed);
  return seed;
}

Secret drawSalt() {
  constexpr unsigned kSaltBytes = 12;
  void* provider = nullptr;
  unsigned char salt[kSaltBytes + 1];
  if (initQelCrypto(&provider) != LDAPPW_SUCCESS) throw Failure(kInternal, "the crypto provider cannot be loaded");
  requireDone(morva_rand_ascii(provider, salt, sizeof salt), "no salt could be drawn");
  return Secret({reinterpret_cast<const char*>(salt), kSaltBytes});
}

void showCreated(const Options& options, const KeyRecord* config, const KeyRecord& directory) {
  Results results;
  if (options.json) {
    Json json;
    if (config != nullptr) json.text("config", options.config);
    json.text("directory", options.directory);
    if (config != nullptr) json.text("sync", config->sync());
    json.text("directorySync", directory.sync()).text("directorySalt", directory.salt());
    results.line(json.end());
  } else {
    if (config != nullptr) results.line("configuration sync: " + std::string(config->sync()));
    results.line("directory sync: " + std::string(directory.sync()));
    results.line("directory salt: " + std::string(directory.salt()));
  }
  results.flush();
  message(kWriteDown);
}

// Both or none: no signal comes in between.
void commitBoth(OutputFile& config, OutputFile& directory) {
  config.sync();
  directory.sync();
  std::string kept[2];
  {
    const SignalBlock block;
    try {
      kept[0] = directory.keepOld();
      kept[1] = config.keepOld();
      directory.giveName();
      config.giveName();
    } catch (const Failure&) {
      config.undo();
      directory.undo();
      throw;
    }
  }
  directory.syncFolder();
  config.syncFolder();
  for (const std::string& name : kept) {
    if (!name.empty()) message("the old file is kept as " + name);
  }
}

ExitCode createDirectory(const Options& options, const Secret& seed, const Secret& salt) {
  const KeyRecord made = makeDirectoryStash(options.directory, options.force, seed, salt);
  showCreated(options, nullptr, made);
  return kSuccess;
}

ExitCode createBoth(const Options& options, const Secret& seed, const Secret& salt) {
  const Failure sameTarget(kUsage, "--config and --directory are the same file");
  Place configPlace(options.config, options.force);
  Place directoryPlace(options.directory, options.force);
  if (configPlace.path() == directoryPlace.path()) throw sameTarget;
  const StashFolders locked({&configPlace, &directoryPlace});
  OutputFile config(std::move(configPlace), kStashMode);
  OutputFile directory(std::move(directoryPlace), kStashMode);
  const KeyRecord configRecord = drawRecord();
  const KeyRecord directoryRecord = deriveRecord(seed, salt.view());
  writeStash(config, configRecord);
  writeStash(directory, directoryRecord);
  commitBoth(config, directory);
  showCreated(options, &configRecord, directoryRecord);
  return kSuccess;
}

ExitCode create(const Options& options) {
  refuseSecrets(options.secrets, "seed");
  const bool alone = options.config.empty();
  if (!alone && sameFile(options.config, options.directory)) {
    throw Failure(kUsage, "--config and --directory are the same file");
  }
  requireProvider();
  Secret salt;
  if (!options.saltFile.empty()) salt = readSaltFile(options.saltFile);
  const Secret seed = askSeed(options.seedFile);
  if (salt.empty()) salt = drawSalt();
  return (alone ? createDirectory : createBoth)(options, seed, salt);
}

}  // namespace

void setUpKeysCreate(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addPath(verb, "--config", options->config, "configuration stash file to make; none without it");
  addPath(verb, "--directory", options->directory, "directory stash file to make").required();
  addSeedOptions(verb, *options, "read the directory's salt from this file instead of drawing one");
  onRun(verb, [options, &exitCode] { exitCode = create(*options); });
}

}  // namespace tool
