// SPDX-License-Identifier: Apache-2.0
// ldappw format: makes stored values of clear passwords.
#include "command_line.h"
#include "messages.h"
#include "terminal.h"
#include "values.h"

namespace tool {
namespace {

struct Options {
  std::string scheme;
  std::string keys;
  std::string passwordFile;
  CLI::Option* secrets = nullptr;
  bool json = false;
};

const Scheme& chosenScheme(const Options& options) {
  const Scheme* scheme = findScheme(options.scheme);
  if (scheme == nullptr) throw Failure(kUsage, "there is no scheme " + options.scheme);
  if (scheme->isClear()) throw Failure(kUsage, "clear text is not protected: choose another scheme");
  if (scheme->make == nullptr) throw Failure(kUsage, std::string("values of ") + scheme->name + " cannot be made");
  if (scheme->needsKey() && options.keys.empty()) {
    throw Failure(kUsage, std::string(scheme->name) + " needs the key stash (--keys)");
  }
  return *scheme;
}

void warnOfCut(const Scheme& scheme, const Secret& password, std::size_t index) {
  if (!scheme.cuts(password.size())) return;
  warning("password " + std::to_string(index) + " is cut: " + scheme.name + " takes its first " +
          std::to_string(scheme.cutBytes) + " bytes");
}

void show(const Options& options, const Scheme& scheme, const Secret& value, std::size_t index, Results& results) {
  if (!options.json) return results.line(value.view());
  results.line(Json().number("index", index).text("scheme", scheme.name).text("value", value.view()).end());
}

void showProblem(const Options& options, const Status& status, std::size_t index, Results& results) {
  message("password " + std::to_string(index) + ": " + status.text);
  if (options.json) results.line(problemJson(index, status).end());
}

ExitCode format(const Options& options) {
  refuseSecrets(options.secrets, "password");
  const Scheme& scheme = chosenScheme(options);
  if (scheme.needsProvider) requireProvider();
  const KeyRecord key = KeyRecord::load(scheme.needsKey() ? options.keys : "");
  ExitCode exitCode = kSuccess;
  Results results;
  SecretSource passwords(options.passwordFile);
  Secret password;
  Secret value;
  for (std::size_t index = 1; passwords.next("Password: ", password); ++index) {
    warnOfCut(scheme, password, index);
    const Status status = makeValue(scheme, key, password, value);
    if (status.ok()) show(options, scheme, value, index, results);
    if (!status.ok()) showProblem(options, status, index, results);
    keepFirst(exitCode, status.code);
    if (!passwords.lineBuffered()) results.flush();
    if (passwords.interactive()) break;
  }
  results.flush();
  return exitCode;
}

}  // namespace

void setUpFormat(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  verb.add_option("--scheme", options->scheme, "sha, ssha, md5, crypt, qveil, aes128, aes192 or aes256")->required();
  addPath(verb, "--keys", options->keys, "key stash file, for the AES schemes");
  addPath(verb, "--password-file", options->passwordFile, "read the passwords, one a line, from this file");
  verb.add_flag("--json", options->json, "one JSON object a line");
  options->secrets = addRefusedSecrets(verb, "PASSWORD");
  verb.callback([options, &exitCode] { exitCode = format(*options); });
}

}  // namespace tool
