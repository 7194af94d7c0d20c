// SPDX-License-Identifier: Apache-2.0
// ldappw keys: the verb over the key verbs, what they share, and keys check.
#include "keys.h"

#include <CLI/CLI.hpp>
#include <memory>

#include "verbs.h"

namespace tool {
namespace {

struct CheckOptions {
  std::string file;
  std::string sync;
  std::string saltFile;
  bool json = false;
};

bool acceptable(const Secret& text, int type) {
  return text.view().find('\0') == std::string_view::npos && validateCryptoString(text.c_str(), type) == LDAPPW_SUCCESS;
}

int check(const CheckOptions& options) {
  const KeyRecord record = KeyRecord::load(options.file);
  Secret salt;
  const bool withSalt = !options.saltFile.empty();
  if (withSalt) salt = readSaltFile(options.saltFile);
  int isMatch = 0;
  requireDone(checkKeyStashFile(withSalt ? 1 : 0, record.get(), options.sync.c_str(), salt.c_str(), &isMatch),
              options.file);
  Results results;
  if (options.json) results.line(isMatch == 1 ? "{\"match\":true}" : "{\"match\":false}");
  if (!options.json) results.line(isMatch == 1 ? "match" : "no match");
  results.flush();
  return isMatch == 1 ? kSuccess : kNoMatch;
}

}  // namespace

void requireSeed(const Secret& seed) {
  if (acceptable(seed, 0)) return;
  throw Failure(kBadValue, "a seed has 12 to 1016 characters, each a letter, digit or punctuation mark of ASCII");
}

void requireSalt(const Secret& salt) {
  if (acceptable(salt, 1)) return;
  throw Failure(kBadValue, "a salt has exactly 12 characters, each a letter, digit or punctuation mark of ASCII");
}

Secret readSaltFile(const std::string& path) {
  const Descriptor file = openInput(path);
  LineReader lines(file.get(), path);
  Secret salt;
  if (!lines.next(salt)) throw Failure(kBadValue, "there is no salt in " + path);
  requireSalt(salt);
  return salt;
}

void requireDone(int code, const std::string& what) {
  if (code == LDAPPW_SUCCESS) return;
  if (code == LDAPPW_NO_MEMORY) throw Failure(kInternal, what + ": out of memory");
  if (code == LDAPPW_CONSTRAINT_VIOLATION) throw Failure(kBadValue, what + ": the seed or salt is not acceptable");
  throw Failure(kInternal, what + ": the library failed with code " + std::to_string(code));
}

void addKeysCheck(CLI::App& keys, int& exitCode) {
  const auto options = std::make_shared<CheckOptions>();
  CLI::App* verb = keys.add_subcommand("check", "Tell by exit code whether a stash file has this sync text and salt");
  verb->add_option("FILE", options->file, "key stash file")->type_name("")->required();
  verb->add_option("--sync", options->sync, "sync text")->required();
  verb->add_option("--salt-file", options->saltFile, "compare the salt too, with the first line of this file")
      ->type_name("FILE");
  verb->add_flag("--json", options->json, "the result as a JSON object");
  verb->callback([options, &exitCode] { exitCode = check(*options); });
}

void addKeys(CLI::App& app, int& exitCode) {
  CLI::App* keys = app.add_subcommand("keys", "Make, restore, show and check key stash files");
  keys->require_subcommand(1);
  addKeysCreate(*keys, exitCode);
  addKeysRestore(*keys, exitCode);
  addKeysShow(*keys, exitCode);
  addKeysCheck(*keys, exitCode);
}

}  // namespace tool
