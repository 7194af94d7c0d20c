// SPDX-License-Identifier: Apache-2.0
// ldappw format: makes stored values of clear passwords.
#include <CLI/CLI.hpp>
#include <memory>

#include "command_line.h"
#include "common.h"
#include "terminal.h"
#include "verbs.h"

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
  if (scheme->code == FORMAT_NONE) throw Failure(kUsage, "clear is no protection: choose another scheme");
  if (!scheme->makeable) throw Failure(kUsage, std::string("values of ") + scheme->name + " cannot be made");
  if (scheme->needsKey() && options.keys.empty()) {
    throw Failure(kUsage, std::string(scheme->name) + " needs the key stash (--keys)");
  }
  return *scheme;
}

void warnOfCut(const Scheme& scheme, const Secret& password, std::size_t index) {
  if (scheme.cutBytes == 0 || password.size() <= scheme.cutBytes) return;
  warning("password " + std::to_string(index) + " is cut: " + scheme.name + " takes its first " +
          std::to_string(scheme.cutBytes) + " bytes");
}

// Stored values hold ASCII alone, so that they need no escapes in JSON.
void show(const Options& options, const Scheme& scheme, const Secret& value, std::size_t index, Results& results) {
  if (options.json) {
    results.write("{\"index\":" + std::to_string(index) + ",\"scheme\":\"" + scheme.name + "\",\"value\":\"");
    results.write(value.view());
    results.line("\"}");
  } else {
    results.line(value.view());
  }
}

void showProblem(const Options& options, const Status& status, std::size_t index, Results& results) {
  message("password " + std::to_string(index) + ": " + status.text);
  if (options.json) results.line(problemJson(index, status));
}

int format(const Options& options) {
  refuseSecrets(options.secrets, "password");
  const Scheme& scheme = chosenScheme(options);
  requireProvider();
  const KeyRecord key = KeyRecord::load(scheme.needsKey() ? options.keys : "");
  int exitCode = kSuccess;
  Results results;
  SecretSource passwords(options.passwordFile);
  Secret password;
  Secret value;
  for (std::size_t index = 1; passwords.next("Password: ", password); ++index) {
    warnOfCut(scheme, password, index);
    const Status status = formatPassword(scheme, key, password, value);
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

void addFormat(CLI::App& app, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb =
      app.add_subcommand("format", "Make stored values of passwords, which are asked for or read one a line");
  verb->add_option("--scheme", options->scheme, "sha, ssha, md5, crypt, qveil, aes128, aes192 or aes256")->required();
  verb->add_option("--keys", options->keys, "key stash file, for the AES schemes")->type_name("FILE");
  verb->add_option("--password-file", options->passwordFile, "read the passwords, one a line, from this file")
      ->type_name("FILE");
  verb->add_flag("--json", options->json, "one JSON object a line");
  options->secrets = addRefusedSecrets(*verb, "PASSWORD");
  verb->callback([options, &exitCode] { exitCode = format(*options); });
}

}  // namespace tool
