// SPDX-License-Identifier: Apache-2.0
// The verbs of key stash files: ldappw keys create, restore, show and check.
#ifndef LDAPPW_TOOLS_KEYS_H
#define LDAPPW_TOOLS_KEYS_H

#include <string>

#include "common.h"
#include "terminal.h"

namespace CLI {
class App;
}

namespace tool {

void addKeysCreate(CLI::App& keys, int& exitCode);
void addKeysRestore(CLI::App& keys, int& exitCode);
void addKeysShow(CLI::App& keys, int& exitCode);
void addKeysCheck(CLI::App& keys, int& exitCode);

// Throws Failure (kBadValue) unless the text will do as a seed or a salt.
void requireSeed(const Secret& seed);
void requireSalt(const Secret& salt);

// The first line of a file that has to hold a salt.
Secret readSaltFile(const std::string& path);

// Throws the Failure that a library code stands for; nothing for success. what begins its message.
void requireDone(int code, const std::string& what);

}  // namespace tool

#endif
