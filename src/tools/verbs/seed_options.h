// SPDX-License-Identifier: Apache-2.0
// The options of the verbs that make keys from a seed.
#pragma once

#include <string>

#include "verbs/options.h"

namespace tool {

struct SeedOptions {
  std::string seedFile;
  std::string saltFile;
  Argument secrets;
  bool force = false;
  bool json = false;
};
void addSeedOptions(CLI::App& verb, SeedOptions& options, const std::string& saltHelp);

}  // namespace tool
