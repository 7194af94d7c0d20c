// SPDX-License-Identifier: Apache-2.0
// The command line of ldappw: the verbs, and what happens to every failure.
#pragma once

#include "base/failure.h"

namespace tool {

// Runs the verb that the arguments name and reports every failure; nothing is thrown.
ExitCode runCommand(int argc, char** argv);

}  // namespace tool
