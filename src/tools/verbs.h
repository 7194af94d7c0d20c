// SPDX-License-Identifier: Apache-2.0
// The verbs of the command. Each function adds one verb to the command line; when the verb has run, its callback leaves
// the exit code (an ExitCode of common.h) in exitCode. A Failure that leaves a callback is told by main.
#ifndef LDAPPW_TOOLS_VERBS_H
#define LDAPPW_TOOLS_VERBS_H

namespace CLI {
class App;
}

namespace tool {

void addIdentify(CLI::App& app, int& exitCode);
void addFormat(CLI::App& app, int& exitCode);
void addVerify(CLI::App& app, int& exitCode);
void addReveal(CLI::App& app, int& exitCode);
void addKeys(CLI::App& app, int& exitCode);
void addLdif(CLI::App& app, int& exitCode);
void addTrial(CLI::App& app, int& exitCode);

}  // namespace tool

#endif
