// SPDX-License-Identifier: Apache-2.0
// ldappw keys: the verb over the key verbs.
#include "verbs/keys.h"

namespace tool {
namespace {

constexpr Verb kKeyVerbs[] = {
    {"create", "Make the two stash files, the directory's from a seed, or this one alone; prints what to write down",
     setUpKeysCreate},
    {"restore", "Make a directory stash file again from its seed and salt; prints its sync text", setUpKeysRestore},
    {"show", "Show sync text, salt and key fingerprints of a stash file, never a key", setUpKeysShow},
    {"check", "Report whether a stash file has this sync text and salt, or opens this export", setUpKeysCheck},
    {"compare", "Report by exit code whether two stash files hold the same", setUpKeysCompare},
};

}  // namespace

void setUpKeys(CLI::App& verb, ExitCode& exitCode) {
  requireVerb(verb);
  for (const Verb& row : kKeyVerbs) addVerb(verb, row, exitCode);
}

}  // namespace tool
