// SPDX-License-Identifier: Apache-2.0
// ldappw verify: checks a password against a stored value; the exit code tells the result.
#include <CLI/CLI.hpp>
#include <memory>

#include "command_line.h"
#include "common.h"
#include "terminal.h"
#include "verbs.h"

namespace tool {
namespace {

// The library compares two clear texts as far as it compares two masked ones.
constexpr std::size_t kClearComparedBytes = 46;

struct Options {
  CLI::Option* value = nullptr;
  std::string valueFile;
  std::string passwordFile;
  std::string keys;
  CLI::Option* secrets = nullptr;
  bool clear = false;
  bool json = false;
};

Secret storedValue(const Options& options) {
  if (options.value->empty() == options.valueFile.empty()) {
    throw Failure(kUsage, "give either a VALUE or --value-file");
  }
  if (!options.value->empty()) return Secret(options.value->results().front());
  const Descriptor file = openInput(options.valueFile);
  LineReader lines(file.get(), options.valueFile);
  Secret value;
  if (!lines.next(value)) throw Failure(kBadValue, "there is no value in " + options.valueFile);
  return value;
}

void refuseClear(const Options& options, const Secret& value) {
  if (options.clear || unknownTag(value.view()) || schemeOf(value.view()).code != FORMAT_NONE) return;
  throw Failure(kBadValue, "the value has no tag: --clear takes it as a clear password");
}

void warnOfCut(const Scheme& scheme, const Secret& password) {
  const std::size_t compared = scheme.code == FORMAT_NONE ? kClearComparedBytes : scheme.cutBytes;
  if (compared == 0 || password.size() <= compared) return;
  warning(std::string("with ") + scheme.name + " only the first " + std::to_string(compared) +
          " bytes of the password count");
}

void show(const Options& options, const Scheme& scheme, const Status& status) {
  if (status.code > kNoMatch) message(status.text);
  Results results;
  if (options.json && status.code <= kNoMatch) {
    results.line(std::string("{\"scheme\":\"") + scheme.name + "\",\"match\":" + (status.ok() ? "true}" : "false}"));
  } else if (options.json) {
    results.line(problemJson(1, status));
  } else if (status.code <= kNoMatch) {
    results.line(status.ok() ? "match" : "no match");
  }
  results.flush();
}

int verify(const Options& options) {
  refuseSecrets(options.secrets, "password");
  const Secret value = storedValue(options);
  refuseClear(options, value);
  const Scheme& scheme = schemeOf(value.view());
  Status status;
  if (const char* problem = payloadProblem(value.view())) status = {kBadValue, problem};
  if (status.ok()) {
    requireProvider();
    const KeyRecord key = KeyRecord::load(scheme.needsKey() ? options.keys : "");
    if (scheme.needsKey() && !key) throw Failure(kBadKey, "an AES value needs the key stash (--keys)");
    SecretSource source(options.passwordFile);
    const Secret password = source.require("Password: ", "password");
    warnOfCut(scheme, password);
    status = verifyValue(value.view(), key, password.view());
  }
  show(options, scheme, status);
  return status.code;
}

}  // namespace

void addVerify(CLI::App& app, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb = app.add_subcommand("verify", "Check a password, which is asked for or read, against a stored value");
  options->value = verb->add_option("VALUE", "stored value");
  verb->add_option("--value-file", options->valueFile, "read the stored value from the first line of this file")
      ->type_name("FILE");
  verb->add_option("--password-file", options->passwordFile, "read the password from the first line of this file")
      ->type_name("FILE");
  verb->add_option("--keys", options->keys, "key stash file, for the AES schemes")->type_name("FILE");
  verb->add_flag("--clear", options->clear, "take a value without a tag as a clear password");
  verb->add_flag("--json", options->json, "the result as a JSON object");
  verb->footer(
      "Exit code: 0 match, 1 no match, 2 usage, 3 unknown or malformed value, 4 missing or wrong key, "
      "5 input or output, 6 internal.");
  options->secrets = addRefusedSecrets(*verb, "PASSWORD");
  verb->callback([options, &exitCode] { exitCode = verify(*options); });
}

}  // namespace tool
