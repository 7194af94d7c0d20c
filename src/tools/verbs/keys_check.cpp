// SPDX-License-Identifier: Apache-2.0
// ldappw keys check: compares a stash file with a sync text and a salt, or tries it on an export.
#include "verbs/keys.h"

#include "keys/stash.h"
#include "schemes/key_record.h"
#include "verbs/keys_export.h"

namespace tool {
namespace {

struct Options {
  std::string file;
  std::string exported;
  std::string sync;
  std::string saltFile;
  bool json = false;
  bool quiet = false;
};

ExitCode check(const Options& options) {
  if (options.exported.empty() == options.sync.empty()) throw Failure(kUsage, "give either an EXPORT or --sync");
  const KeyRecord record = KeyRecord::load(options.file);
#ifdef LDAPPW_WITH_LDIF
  if (!options.exported.empty()) return checkExport(record, options.exported, options.json, options.quiet);
#else
  if (!options.exported.empty()) throw Failure(kUsage, "this command is built without LDIF");
#endif
  Secret salt;
  const bool withSalt = !options.saltFile.empty();
  if (withSalt) salt = readSaltFile(options.saltFile);
  int isMatch = 0;
  requireDone(checkKeyStashFile(withSalt ? 1 : 0, record.get(), options.sync.c_str(), salt.c_str(), &isMatch),
              options.file);
  if (options.quiet) return isMatch == 1 ? kSuccess : kNoMatch;
  Results results;
  results.line(options.json ? Json().flag("match", isMatch == 1).end() : isMatch == 1 ? "match" : "no match");
  results.flush();
  return isMatch == 1 ? kSuccess : kNoMatch;
}

}  // namespace

void setUpKeysCheck(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addKeys(verb, "FILE", options->file, "key stash file").required();
  addPath(verb, "EXPORT", options->exported, "export (LDIF): how many of its AES values do these keys open?");
  const Argument sync = addOption(verb, "--sync", options->sync, "sync text to compare");
  addPath(verb, "--salt-file", options->saltFile, "compare the salt too, with the first line of this file").needs(sync);
  addFlag(verb, "--quiet", options->quiet, "show no result: the exit code has it");
  addFlag(verb, "--json", options->json, "the result as a JSON object");
  onRun(verb, [options, &exitCode] { exitCode = check(*options); });
}

}  // namespace tool
