// SPDX-License-Identifier: Apache-2.0
// The verbs under ldappw keys.
#pragma once

#include "base/failure.h"
#include "verbs/options.h"

namespace tool {

void setUpKeysCreate(CLI::App& verb, ExitCode& exitCode);
void setUpKeysRestore(CLI::App& verb, ExitCode& exitCode);
void setUpKeysShow(CLI::App& verb, ExitCode& exitCode);
void setUpKeysCheck(CLI::App& verb, ExitCode& exitCode);
void setUpKeysCompare(CLI::App& verb, ExitCode& exitCode);

}  // namespace tool
