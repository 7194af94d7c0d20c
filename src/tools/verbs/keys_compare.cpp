// SPDX-License-Identifier: Apache-2.0
// ldappw keys compare: whether two stash files hold the same.
#include "verbs/keys.h"

#include "schemes/key_record.h"

namespace tool {
namespace {

struct Options {
  std::string first;
  std::string second;
  bool json = false;
  bool quiet = false;
};

ExitCode compare(const Options& options) {
  const KeyRecord a = KeyRecord::load(options.first);
  const KeyRecord b = KeyRecord::load(options.second);
  const bool match = sameRecord(a, b);
  if (!options.quiet) {
    Results results;
    if (options.json) {
      Json json;
      json.flag("match", match).flag("sameSync", a.sync() == b.sync()).flag("sameSalt", a.salt() == b.salt());
      results.line(json.end());
    } else {
      const char* difference = a.salt() != b.salt() ? "no match: other salts" : "no match: one salt, other seeds";
      results.line(match ? "match" : difference);
    }
    results.flush();
  }
  return match ? kSuccess : kNoMatch;
}

}  // namespace

void setUpKeysCompare(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addKeys(verb, "FILE", options->first, "key stash file").required();
  addPath(verb, "OTHER", options->second, "the one to compare it with").required();
  addFlag(verb, "--quiet", options->quiet, "show no result: the exit code has it");
  addFlag(verb, "--json", options->json, "the result as a JSON object");
  onRun(verb, [options, &exitCode] { exitCode = compare(*options); });
}

}  // namespace tool
