// SPDX-License-Identifier: Apache-2.0
// The conversion of ldappw ldif.
#pragma once

#include <string>
#include <vector>

#include "ldif/export_run.h"
#include "schemes/scheme.h"

namespace tool {

struct LdifOptions {
  ExportOptions source;
  std::string to;
  std::vector<std::string> keys;
  std::string newKeys;
  std::string out = "-";
  std::string resume;  // change records of an earlier run, of which the new values are taken
  Costs costs;
  bool changes = false;  // write change records in place of the export
  bool dryRun = false;
  bool fix = false;  // values that are padded or encoded once more are unwrapped
  bool force = false;
  bool allowClear = false;
  bool allowBinary = false;  // what opens into bytes that are not text is taken for right
  bool json = false;
  bool quiet = false;  // no counts
};

// Converts the password values to another scheme or other keys, and leaves every other byte alone.
ExitCode convertExport(const LdifOptions& options);

}  // namespace tool
