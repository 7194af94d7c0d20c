// SPDX-License-Identifier: Apache-2.0
// ldappw format: makes stored values of clear passwords.
#include "base/generate.h"
#include "base/messages.h"
#include "base/terminal.h"
#include "schemes/schemes.h"
#include "schemes/values.h"
#include "verbs/options.h"

namespace tool {
namespace {

struct Options {
  std::string scheme;
  std::string keys;
  std::string passwordFile;
  Costs costs;
  Argument secrets;
  char end = '\n';
  size_t generate = 0;  // characters
  bool allowEmpty = false;
  bool json = false;
};

constexpr Status kEmpty{kBadValue, "the password is empty (--allow-empty accepts it)"};

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

// Makes the values, one after the other.
class Maker {
 public:
  Maker(const Options& options, const Scheme& scheme, const Costs& costs, const KeyRecord& key)
      : results(options.end), options_(options), scheme_(scheme), costs_(costs), key_(key) {}

  void make(const Secret& password, size_t index, const std::string& place) {
    const Status status =
        password.empty() && !options_.allowEmpty ? kEmpty : makeValue(scheme_, key_, costs_, password, value_);
    keepFirst(exitCode_, status.code);
    if (!status.ok()) {
      problems_.add(place + ": " + status.text, status.text);
      return showProblem(options_.json, status, index, results);
    }
    warnOfCut(password, place);
    options_.json ? showJson(password, index) : showText(password);
  }

  ExitCode exitCode() const noexcept { return exitCode_; }

  Results results;

 private:
  // A password that was made here is shown before its value.
  void showText(const Secret& password) {
    if (options_.generate > 0) results.write(password.view());
    if (options_.generate > 0) results.write("\t");
    results.line(value_.view());
  }

  void showJson(const Secret& password, size_t index) {
    Json json;
    json.number("index", index).text("scheme", scheme_.name).text("value", value_.view());
    if (options_.generate > 0) json.text("password", password.view());
    results.line(json.end());
  }

  void warnOfCut(const Secret& password, const std::string& place) {
    if (!scheme_.cuts(password.size())) return;
    const std::string what =
        " cut: " + (scheme_.name + (" takes the first " + std::to_string(scheme_.cutBytes))) + " bytes";
    warnings_.add(place + ": the password is" + what, "passwords" + what);
  }

  const Options& options_;
  const Scheme& scheme_;
  const Costs costs_;
  const KeyRecord& key_;
  Secret value_;
  ExitCode exitCode_ = kSuccess;
  Repeated problems_{kMostOfAKind, message};
  Repeated warnings_{1, warning};
};

ExitCode format(const Options& options) {
  refuseSecrets(options.secrets, "password");
  const Scheme& scheme = chosenScheme(options);
  const Costs costs = completeCosts(scheme, options.costs);  // before a password is asked for
  if (scheme.needsProvider) requireProvider();
  const KeyRecord key = KeyRecord::load(scheme.needsKey() ? options.keys : "");
  Maker maker(options, scheme, costs, key);
  if (options.generate > 0) {
    maker.make(generatePassword(options.generate), 1, "the new password");
    maker.results.flush();
    return maker.exitCode();
  }
  SecretSource passwords(options.passwordFile, kPasswordLine, options.end);
  Secret password = passwords.requireTwice("Password: ", "Password again: ", "password");
  size_t index = 1;
  do {
    maker.make(password, index, passwords.interactive() ? "standard input" : "line " + std::to_string(index));
    if (!passwords.lineBuffered()) maker.results.flush();
    ++index;
  } while (!passwords.interactive() && passwords.next("", password));
  maker.results.flush();
  return maker.exitCode();
}

}  // namespace

void setUpFormat(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addOption(verb, "--scheme", options->scheme,
            "sha, ssha, md5, crypt, qveil, aes128, aes192, aes256; of other servers argon2id, pbkdf2-sha512, "
            "yescrypt, sha512-crypt, ssha512")
      .required();
  addCosts(verb, options->costs);
  addKeys(verb, "--keys", options->keys, "key stash file, for the AES schemes");
  const Argument file =
      addPath(verb, "--password-file", options->passwordFile, "read the passwords, one a line, from this file");
  addOption(verb, "--generate", options->generate,
            "make a password of this many letters and digits, shown before its value")
      .between(8, 1024)
      .takes("LENGTH")
      .excludes(file);
  addNull(verb, options->end);
  addFlag(verb, "--allow-empty", options->allowEmpty, "make a value of the empty password too");
  addFlag(verb, "--json", options->json, "one JSON object a line");
  options->secrets = addRefusedSecrets(verb, "PASSWORD");
  onRun(verb, [options, &exitCode] { exitCode = format(*options); });
}

}  // namespace tool
