// SPDX-License-Identifier: Apache-2.0
// The verbs of the command: each in a file of its own, and a row in main.cpp. A verb's function adds its options and
// the callback that runs it and leaves the exit code. Failure may leave a callback; main reports it.
#ifndef LDAPPW_TOOLS_VERBS_H
#define LDAPPW_TOOLS_VERBS_H

#include "failure.h"

namespace CLI {
class App;
}

namespace tool {

struct Verb {
  const char* name;
  const char* help;
  void (*setUp)(CLI::App& verb, ExitCode& exitCode);
};

void setUpIdentify(CLI::App& verb, ExitCode& exitCode);
void setUpFormat(CLI::App& verb, ExitCode& exitCode);
void setUpVerify(CLI::App& verb, ExitCode& exitCode);
void setUpReveal(CLI::App& verb, ExitCode& exitCode);
void setUpKeys(CLI::App& verb, ExitCode& exitCode);
void setUpLdif(CLI::App& verb, ExitCode& exitCode);
void setUpTrial(CLI::App& verb, ExitCode& exitCode);

}  // namespace tool

#endif
