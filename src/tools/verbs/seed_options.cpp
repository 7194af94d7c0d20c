// SPDX-License-Identifier: Apache-2.0
#include "verbs/seed_options.h"

namespace tool {

void addSeedOptions(CLI::App& verb, SeedOptions& options, const std::string& saltHelp) {
  addPath(verb, "--seed-file", options.seedFile, "read the seed from the first line of this file");
  addPath(verb, "--salt-file", options.saltFile, saltHelp);
  addFlag(verb, "--force", options.force, "replace what exists");
  addFlag(verb, "--json", options.json, "the result as a JSON object");
  options.secrets = addRefusedSecrets(verb, "SEED");
}

}  // namespace tool
