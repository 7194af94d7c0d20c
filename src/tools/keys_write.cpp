// SPDX-License-Identifier: Apache-2.0
// ldappw keys create and keys restore. The library writes to new files beside the targets; only what has been read back
// and found whole is given the target's name.
#include <errno.h>
#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <memory>
#include <nlohmann/json.hpp>

#include "command_line.h"
#include "keys.h"

namespace tool {
namespace {

constexpr mode_t kStashMode = S_IRUSR | S_IWUSR;

struct CreateOptions {
  std::string config;
  std::string directory;
  std::string seedFile;
  std::string saltFile;
  CLI::Option* secrets = nullptr;
  bool force = false;
  bool json = false;
};

struct RestoreOptions {
  std::string file;
  std::string seedFile;
  std::string saltFile;
  std::string expectSync;
  CLI::Option* secrets = nullptr;
  bool force = false;
  bool json = false;
};

struct Free {
  void operator()(char* text) const noexcept { free(text); }
};

bool sameFile(const std::string& a, const std::string& b) {
  if (a == b) return true;
  struct stat first {};
  struct stat second {};
  return stat(a.c_str(), &first) == 0 && stat(b.c_str(), &second) == 0 && first.st_dev == second.st_dev &&
         first.st_ino == second.st_ino;
}

std::string_view viewOf(const SecBuffer& buffer) {
  return {reinterpret_cast<const char*>(buffer.data), buffer.length};
}

bool sameRecord(const KeyRecord& a, const KeyRecord& b) {
  if (a.sync() != b.sync() || a.salt() != b.salt()) return false;
  for (int i = 0; i < 3; ++i) {
    if (!equalBytes(viewOf(a.get()->aesKeys[i]), viewOf(b.get()->aesKeys[i]))) return false;
  }
  return true;
}

// The size that the stash file format gives to a record.
off_t stashBytes(const KeyRecord& record) {
  std::size_t bytes = sizeof(std::uint32_t) + record.sync().size() + record.salt().size();
  for (const SecBuffer& key : record.get()->aesKeys) bytes += key.length;
  return static_cast<off_t>(bytes);
}

// Reads what the library has written: a file of the right size and mode that is still the one that was made for it.
KeyRecord readBack(const OutputFile& file) {
  const Failure damaged(kIoError, file.target() + " could not be written whole; nothing was replaced");
  AesKeyData* loaded = nullptr;
  const int code = setAESKeyData(file.temporaryPath().c_str(), &loaded);
  KeyRecord record(loaded);
  if (code != LDAPPW_SUCCESS) throw damaged;
  struct stat written {};
  struct stat made {};
  if (stat(file.temporaryPath().c_str(), &written) != 0 || fstat(file.fd(), &made) != 0) throw damaged;
  const bool ours = written.st_dev == made.st_dev && written.st_ino == made.st_ino;
  if (!ours || (made.st_mode & 07777) != kStashMode || made.st_size != stashBytes(record)) throw damaged;
  return record;
}

KeyRecord deriveRecord(const Secret& seed, std::string_view salt) {
  AesKeyData* made = nullptr;
  const int code = genTmpKeyDataVal(seed.c_str(), std::string(salt).c_str(), &made);
  KeyRecord record(made);
  requireDone(code, "the keys could not be derived");
  return record;
}

// A failed file operation and a failed provider have one code; the provider was asked before.
void requireWritten(int code, const std::string& what) {
  if (code == LDAPPW_OPERATIONS_ERROR) throw Failure(kIoError, what + " could not be written; nothing was replaced");
  requireDone(code, what);
}

Secret askSeedTwice(const std::string& seedFile) {
  SecretSource source(seedFile);
  Secret seed = source.require("Seed: ", "seed");
  if (source.interactive()) {
    const Secret again = source.require("Seed again: ", "seed");
    if (!equalBytes(seed.view(), again.view())) throw Failure(kUsage, "the two seeds are not the same");
  }
  requireSeed(seed);
  return seed;
}

void showCreated(const CreateOptions& options, const KeyRecord& config, const KeyRecord& directory) {
  Results results;
  if (options.json) {
    nlohmann::ordered_json object;
    object["config"] = options.config;
    object["directory"] = options.directory;
    object["sync"] = config.sync();
    object["directory_sync"] = directory.sync();
    object["directory_salt"] = directory.salt();
    results.line(object.dump(-1, ' ', false, nlohmann::ordered_json::error_handler_t::replace));
  } else {
    results.line(config.sync());
  }
  results.flush();
}

// The directory's file first: its keys can be had again from seed and salt, the configuration's never.
void commitBoth(OutputFile& config, OutputFile& directory) {
  config.sync();
  directory.sync();
  directory.commit();
  try {
    config.commit();
  } catch (const Failure& failure) {
    throw Failure(failure.code(), std::string(failure.what()) + "; " + directory.target() + " is new already");
  }
}

int create(const CreateOptions& options) {
  refuseSecrets(options.secrets, "seed");
  if (sameFile(options.config, options.directory)) throw Failure(kUsage, "--config and --directory are the same file");
  requireProvider();
  Secret salt;
  if (!options.saltFile.empty()) salt = readSaltFile(options.saltFile);
  const Secret seed = askSeedTwice(options.seedFile);
  OutputFile config(options.config, kStashMode, options.force);
  OutputFile directory(options.directory, kStashMode, options.force);
  if (config.target() == directory.target()) throw Failure(kUsage, "--config and --directory are the same file");
  char* syncText = nullptr;
  const int code = createKeyStashFiles(config.temporaryPath().c_str(), directory.temporaryPath().c_str(), seed.c_str(),
                                       &syncText, salt.empty() ? nullptr : salt.c_str());
  const std::unique_ptr<char, Free> sync(syncText);
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

void readSeedAndSalt(const RestoreOptions& options, Secret& seed, Secret& salt) {
  SecretSource source(options.seedFile);
  seed = source.require("Seed: ", "seed");
  requireSeed(seed);
  if (!options.saltFile.empty()) {
    salt = readSaltFile(options.saltFile);
    return;
  }
  SecretSource input("");
  SecretSource& saltSource = options.seedFile.empty() ? source : input;
  salt = saltSource.require("Salt: ", "salt");
  requireSalt(salt);
}

bool syncMatches(const KeyRecord& record, const std::string& sync) {
  int isMatch = 0;
  requireDone(checkKeyStashFile(0, record.get(), sync.c_str(), "", &isMatch), "the sync text could not be compared");
  return isMatch == 1;
}

int restore(const RestoreOptions& options) {
  refuseSecrets(options.secrets, "seed");
  requireProvider();
  Secret seed;
  Secret salt;
  readSeedAndSalt(options, seed, salt);
  const KeyRecord expected = deriveRecord(seed, salt.view());
  if (!options.expectSync.empty() && !syncMatches(expected, options.expectSync)) {
    message("seed and salt do not give the expected sync text; nothing was written");
    return kNoMatch;
  }
  OutputFile file(options.file, kStashMode, options.force);
  requireWritten(restoreKeyStashFile(file.temporaryPath().c_str(), seed.c_str(), salt.c_str()), options.file);
  if (!sameRecord(readBack(file), expected)) {
    throw Failure(kIoError, options.file + " could not be written whole; nothing was replaced");
  }
  file.commit();
  Results results;
  results.line(options.json ? nlohmann::ordered_json{{"sync", expected.sync()}}.dump() : std::string(expected.sync()));
  results.flush();
  return kSuccess;
}

}  // namespace

void addKeysCreate(CLI::App& keys, int& exitCode) {
  const auto options = std::make_shared<CreateOptions>();
  CLI::App* verb = keys.add_subcommand(
      "create", "Make the two stash files, the directory's from a seed; prints the configuration's sync text");
  verb->add_option("--config", options->config, "configuration stash file to make")->type_name("FILE")->required();
  verb->add_option("--directory", options->directory, "directory stash file to make")->type_name("FILE")->required();
  verb->add_option("--seed-file", options->seedFile, "read the seed from the first line of this file")
      ->type_name("FILE");
  verb->add_option("--salt-file", options->saltFile, "read the directory's salt from this file, or draw one")
      ->type_name("FILE");
  verb->add_flag("--force", options->force, "replace files that are there");
  verb->add_flag("--json", options->json, "the result as a JSON object");
  options->secrets = addRefusedSecrets(*verb, "SEED");
  verb->callback([options, &exitCode] { exitCode = create(*options); });
}

void addKeysRestore(CLI::App& keys, int& exitCode) {
  const auto options = std::make_shared<RestoreOptions>();
  CLI::App* verb =
      keys.add_subcommand("restore", "Make a directory stash file again from its seed and salt; prints its sync text");
  verb->add_option("FILE", options->file, "key stash file to make")->type_name("")->required();
  verb->add_option("--seed-file", options->seedFile, "read the seed from the first line of this file")
      ->type_name("FILE");
  verb->add_option("--salt-file", options->saltFile, "read the salt from the first line of this file")
      ->type_name("FILE");
  verb->add_option("--expect-sync", options->expectSync, "write nothing unless seed and salt give this sync text");
  verb->add_flag("--force", options->force, "replace a file that is there");
  verb->add_flag("--json", options->json, "the result as a JSON object");
  options->secrets = addRefusedSecrets(*verb, "SEED");
  verb->callback([options, &exitCode] { exitCode = restore(*options); });
}

}  // namespace tool
