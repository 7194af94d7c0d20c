// SPDX-License-Identifier: Apache-2.0
// ldappw keys create: makes the two stash files.
#include "keys.h"

#include <filesystem>

#include "terminal.h"

namespace tool {
namespace {

struct Options : SeedOptions {
  std::string config;
  std::string directory;
};

bool sameFile(const std::string& a, const std::string& b) {
  std::error_code missing;
  return a == b || std::filesystem::equivalent(a, b, missing);
}

Secret askSeed(const std::string& seedFile) {
  Secret seed = SecretSource(seedFile).requireTwice("Seed: ", "Seed again: ", "seed");
  requireSeed(seed);
  return seed;
}

void showCreated(const Options& options, const KeyRecord& config, const KeyRecord& directory) {
  Results results;
  if (options.json) {
    Json json;
    json.text("config", options.config).text("directory", options.directory).text("sync", config.sync());
    json.text("directorySync", directory.sync()).text("directorySalt", directory.salt());
    results.line(json.end());
  } else {
    results.line(config.sync());
  }
  results.flush();
}

// The directory's file first: its keys can be made again from seed and salt, the configuration's never.
void commitBoth(OutputFile& config, OutputFile& directory) {
  config.sync();
  directory.sync();
  directory.commit();
  try {
    config.commit();
  } catch (const Failure& failure) {
    throw Failure(failure.code(), std::string(failure.what()) + "; " + directory.target() + " has been replaced");
  }
}

ExitCode create(const Options& options) {
  refuseSecrets(options.secrets, "seed");
  const Failure sameTarget(kUsage, "--config and --directory are the same file");
  if (sameFile(options.config, options.directory)) throw sameTarget;
  requireProvider();
  Secret salt;
  if (!options.saltFile.empty()) salt = readSaltFile(options.saltFile);
  const Secret seed = askSeed(options.seedFile);
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
  showCreated(options, configRecord, directoryRecord);
  return kSuccess;
}

}  // namespace

void setUpKeysCreate(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addPath(verb, "--config", options->config, "configuration stash file to make")->required();
  addPath(verb, "--directory", options->directory, "directory stash file to make")->required();
  addSeedOptions(verb, *options, "read the directory's salt from this file instead of drawing one");
  verb.callback([options, &exitCode] { exitCode = create(*options); });
}

}  // namespace tool
