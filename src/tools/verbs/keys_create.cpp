// SPDX-License-Identifier: Apache-2.0
// ldappw keys create: makes the two stash files.
#include "verbs/keys.h"

#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <vector>

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
  SecretSource source(seedFile);
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

// Names old files that are kept under a second name, unless the run fails.
class KeptFiles {
 public:
  void add(OutputFile& file) { names_.push_back(file.keepOld()); }
  // Takes the new file of the directory back, where it has its name already.
  void undo(const std::string& target) {
    if (!target.empty()) names_[0].empty() ? unlink(target.c_str()) : rename(names_[0].c_str(), target.c_str());
    for (const std::string& name : names_) {
      if (!name.empty()) unlink(name.c_str());
    }
  }
  void show() const {
    for (const std::string& name : names_) {
      if (!name.empty()) message("the old file is kept as " + name);
    }
  }

 private:
  std::vector<std::string> names_;
};

// Both or none: no signal comes in between.
void commitBoth(OutputFile& config, OutputFile& directory) {
  config.sync();
  directory.sync();
  KeptFiles kept;
  {
    const SignalBlock block;
    kept.add(directory);
    kept.add(config);
    std::string named;
    try {
      directory.giveName();
      named = directory.target();
      config.giveName();
    } catch (const Failure&) {
      kept.undo(named);
      throw;
    }
  }
  directory.syncFolder();
  config.syncFolder();
  kept.show();
}

ExitCode createDirectory(const Options& options, const Secret& seed, const Secret& salt) {
  const KeyRecord made = makeDirectoryStash(options.directory, options.force, seed, salt);
  showCreated(options, nullptr, made);
  return kSuccess;
}

ExitCode createBoth(const Options& options, const Secret& seed, const Secret& salt) {
  const Failure sameTarget(kUsage, "--config and --directory are the same file");
  const StashFolders locked({options.config, options.directory});
  OutputFile config(options.config, kStashMode, options.force);
  OutputFile directory(options.directory, kStashMode, options.force);
  if (config.target() == directory.target()) throw sameTarget;
  config.requireRoom(kStashRoom);
  directory.requireRoom(kStashRoom);
  char* syncText = nullptr;
  const int code = createKeyStashFiles(config.temporaryPath().c_str(), directory.temporaryPath().c_str(), seed.c_str(),
                                       &syncText, salt.empty() ? nullptr : salt.c_str());
  const AllocatedText sync(syncText);
  requireWritten(code, "the stash file " + options.config + " or " + options.directory);
  const KeyRecord configRecord = readBack(config);
  const KeyRecord directoryRecord = readBack(directory);
  if (!sync || configRecord.sync() != sync.get() ||
      !sameRecord(directoryRecord, deriveRecord(seed, directoryRecord.salt()))) {
    throw Failure(kIoError, "the stash files do not hold what was to be written; nothing was replaced");
  }
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
  if (alone && salt.empty()) salt = drawSalt();
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
