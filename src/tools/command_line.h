// SPDX-License-Identifier: Apache-2.0
// What the verbs add to the command line in common: positional values taken as they are, and the refusal of secrets
// among the arguments.
#ifndef LDAPPW_TOOLS_COMMAND_LINE_H
#define LDAPPW_TOOLS_COMMAND_LINE_H

#include <CLI/CLI.hpp>
#include <string>
#include <vector>

#include "common.h"

namespace tool {

// Any number of positional values; what was given is in results() of the option. A value list of the parser's own would
// split a value that is wrapped in brackets and drop "{}".
inline CLI::Option* addValues(CLI::App& verb, const std::string& name, const std::string& help) {
  constexpr int kMany = 1 << 20;
  CLI::Option* option = verb.add_option(name, help);
  option->expected(kMany)->allow_extra_args(false)->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  option->option_text("...");
  return option;
}

// Catches arguments that can only be secrets, so that the message can say why they are refused without showing them.
inline CLI::Option* addRefusedSecrets(CLI::App& verb, const std::string& name) {
  return addValues(verb, name, "")->group("");
}

inline void refuseSecrets(const CLI::Option* option, const std::string& what) {
  if (option->empty()) return;
  throw Failure(kUsage, "a " + what +
                            " is not taken from the command line, where other users of the system can see it; " +
                            "use the prompt, standard input or --" + what + "-file");
}

}  // namespace tool

#endif
