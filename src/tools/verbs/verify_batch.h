// SPDX-License-Identifier: Apache-2.0
// Many checks in one run of ldappw verify.
#pragma once

#include <string>

#include "base/failure.h"

namespace tool {

struct BatchOptions {
  std::string file;  // records of value, tab, password; "-" for standard input
  std::string ldif;  // an export: then records of DN, tab, password
  std::string keys;
  bool clear = false;  // values without a tag are clear passwords
  bool json = false;
  bool null = false;  // records end in NUL bytes, those of the results too
  bool quiet = false;
};

// Writes a result for each record, in their order. The code is 0 when all match, else that of the first that does not.
ExitCode verifyBatch(const BatchOptions& options);

}  // namespace tool
