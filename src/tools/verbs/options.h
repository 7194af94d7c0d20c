// SPDX-License-Identifier: Apache-2.0
// The verbs, each in a file of its own and a row in command_line.cpp, and what they add to the command line in common:
// paths, positional values taken as they are, and the refusal of secrets among the arguments.
#pragma once

#include <CLI/CLI.hpp>
#include <functional>
#include <string>

#include "base/failure.h"
#include "base/results.h"
#include "base/secret.h"
#include "schemes/scheme.h"

namespace tool {

// setUp adds the options of a verb and the callback that runs it and leaves the exit code. Failure may leave a
// callback; main reports it.
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
void setUpAudit(CLI::App& verb, ExitCode& exitCode);
void setUpLdif(CLI::App& verb, ExitCode& exitCode);
void setUpTrial(CLI::App& verb, ExitCode& exitCode);

void addVerb(CLI::App& app, const Verb& row, ExitCode& exitCode);

// An option, or an argument, that takes a path.
CLI::Option* addPath(CLI::App& verb, const std::string& name, std::string& path, const std::string& help);

// --keys, or an argument in its place; and --keys-group.
CLI::Option* addKeys(CLI::App& verb, const std::string& name, std::string& path, const std::string& help);
CLI::Option* addKeys(CLI::App& verb, const std::string& name, std::vector<std::string>& paths, const std::string& help);

// The options for what new values cost.
void addCosts(CLI::App& verb, Costs& costs);

// Any number of positional values.
CLI::Option* addValues(CLI::App& verb, const std::string& name, const std::string& help);

// Calls work for each value of the command line or, if there is none, for each line of standard input, which end says
// how to split. Each comes with its number and its place ("line 3") for messages. Results are flushed whenever the next
// line may have to be waited for, and at the end.
using ValueWork = std::function<void(const Secret& value, size_t index, const std::string& place)>;
void forEachValue(const CLI::Option& given, char end, Results& results, const ValueWork& work);

// --null: records end in NUL bytes instead of newlines, in the input and in the results.
void addNull(CLI::App& verb, char& end);

// What takes the place of a result that cannot be given, so that results keep step with the input: an error object, or
// an empty line.
void showProblem(bool json, const Status& status, size_t index, Results& results);

// Catches arguments that can only be secrets, so that the message can say why they are refused without showing them.
CLI::Option* addRefusedSecrets(CLI::App& verb, const std::string& name);
void refuseSecrets(const CLI::Option* option, const std::string& what);

}  // namespace tool
