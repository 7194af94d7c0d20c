// SPDX-License-Identifier: Apache-2.0
// ldappw verify: checks a password against a stored value and reports the result by its exit code.
#include "base/input.h"
#include "base/messages.h"
#include "base/terminal.h"
#include "schemes/schemes.h"
#include "schemes/values.h"
#include "verbs/options.h"
#include "verbs/verify_batch.h"

namespace tool {
namespace {

struct Options {
  Argument value;
  std::string valueFile;
  std::string passwordFile;
  std::string keys;
  BatchOptions batch;
  Argument secrets;
  bool clear = false;
  bool json = false;
  bool quiet = false;
};

Secret storedValue(const Options& options) {
  if (options.value.empty() == options.valueFile.empty()) {
    throw Failure(kUsage, "give either a VALUE or --value-file");
  }
  if (!options.value.empty()) return Secret(options.value.results().front());
  return firstLine(options.valueFile, kValueLine);
}

void warnOfCut(const Scheme& scheme, const Secret& password) {
  if (scheme.comparedBytes == 0 || password.size() <= scheme.comparedBytes) return;
  warning(std::string("with ") + scheme.name + " only the first " + std::to_string(scheme.comparedBytes) +
          " bytes of the password count");
}

Status checkPassword(const Options& options, const Examined& value) {
  const Scheme& scheme = value.scheme();
  if (value.problem != nullptr) return {kBadValue, value.problem};
  if (scheme.needsProvider) requireProvider();
  const KeyRecord key = KeyRecord::load(scheme.needsKey() ? options.keys : "");
  if (scheme.needsKey() && !key) throw Failure(kBadKey, "an AES value needs the key stash (--keys)");
  SecretSource source(options.passwordFile);
  const Secret password = source.require("Password: ", "password");
  warnOfCut(scheme, password);
  return checkValue(value, key, password);
}

void show(const Options& options, const Scheme& scheme, const Status& status) {
  const bool answered = status.code <= kNoMatch;
  if (!answered) message(status.text);
  if (options.quiet) return;
  Results results;
  if (options.json) {
    results.line(answered ? Json().text("scheme", scheme.name).flag("match", status.ok()).end()
                          : Json().problem(status).end());
  } else if (answered) {
    results.line(status.ok() ? "match" : "no match");
  }
  results.flush();
}

ExitCode batch(const Options& options) {
  if (!options.value.empty() || !options.valueFile.empty() || !options.passwordFile.empty()) {
    throw Failure(kUsage, "--batch has the values and the passwords");
  }
  BatchOptions all = options.batch;
  all.keys = options.keys;
  all.clear = options.clear;
  all.json = options.json;
  all.quiet = options.quiet;
  return verifyBatch(all);
}

ExitCode verify(const Options& options) {
  if (!options.batch.file.empty()) return batch(options);
  refuseSecrets(options.secrets, "password");
  const Secret whole = storedValue(options);
  const Examined value = examine(whole);
  if (value.scheme().isClear() && !options.clear) {
    throw Failure(kBadValue, "the value has no tag: --clear takes it as a clear password");
  }
  const Status status = checkPassword(options, value);
  show(options, value.scheme(), status);
  return status.code;
}

}  // namespace

void setUpVerify(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  options->value = addOption(verb, "VALUE", "stored value");
  addPath(verb, "--value-file", options->valueFile, "read the stored value from the first line of this file");
  addPath(verb, "--password-file", options->passwordFile, "read the password from the first line of this file");
  addKeys(verb, "--keys", options->keys, "key stash file, for the AES schemes");
  addFlag(verb, "--clear", options->clear, "take a value without a tag as a clear password");
  const Argument many = addPath(verb, "--batch", options->batch.file,
                                "check many: lines of value, tab, password in this file; a line of result for each");
  addPath(verb, "--ldif", options->batch.ldif, "export of the values: --batch has lines of DN, tab, password")
      .needs(many);
  addFlag(verb, "--null", options->batch.null, "lines of --batch and of its results end in NUL bytes").needs(many);
  addFlag(verb, "--quiet", options->quiet, "show no result: the exit code has it");
  addFlag(verb, "--json", options->json, "the result as a JSON object");
  addFooter(verb,
            "Exit code: 0 match, 1 no match, 2 usage, 3 unknown or malformed value, 4 missing or wrong key, "
            "5 input or output, 6 internal.");
  options->secrets = addRefusedSecrets(verb, "PASSWORD");
  onRun(verb, [options, &exitCode] { exitCode = verify(*options); });
}

}  // namespace tool
