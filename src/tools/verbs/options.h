// SPDX-License-Identifier: Apache-2.0
// The verbs, each in a file of its own and a row in command_line.cpp, and what they add to the command line in common:
// paths, positional values taken as they are, and the refusal of secrets among the arguments.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/failure.h"
#include "base/results.h"
#include "base/secret.h"
#include "schemes/scheme.h"

// The parser's header costs five seconds a source: it stays out of this one.
namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace tool {

// An option of a verb, or an argument without a name.
class Argument {
 public:
  explicit Argument(CLI::Option* option = nullptr) noexcept : option_(option) {}

  const Argument& required() const;
  const Argument& needs(const Argument& other) const;
  const Argument& excludes(const Argument& other) const;
  const Argument& between(std::uint64_t least, std::uint64_t most) const;
  const Argument& takes(const std::string& what) const;  // as --help names the value
  const Argument& hidden() const;

  bool empty() const noexcept;  // it was not given
  const std::vector<std::string>& results() const;

 private:
  CLI::Option* option_;
};

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

// At least one verb below the verb has to follow.
void requireVerb(CLI::App& verb);
void addFooter(CLI::App& verb, const std::string& text);
void onRun(CLI::App& verb, std::function<void()> work);

Argument addFlag(CLI::App& verb, const std::string& name, bool& flag, const std::string& help);
// Value: std::string, unsigned or unsigned long.
template <typename Value>
Argument addOption(CLI::App& verb, const std::string& name, Value& value, const std::string& help);
Argument addOption(CLI::App& verb, const std::string& name, const std::string& help);
// An option that may be given several times, with one value each.
Argument addList(CLI::App& verb, const std::string& name, std::vector<std::string>& values, const std::string& help);

// An option, or an argument, that takes a path.
Argument addPath(CLI::App& verb, const std::string& name, std::string& path, const std::string& help);

// --keys, or an argument in its place; and --keys-group.
Argument addKeys(CLI::App& verb, const std::string& name, std::string& path, const std::string& help);
Argument addKeys(CLI::App& verb, const std::string& name, std::vector<std::string>& paths, const std::string& help);

// The options for what new values cost.
void addCosts(CLI::App& verb, Costs& costs);

// --memory-limit, for the values of costly schemes that are worked on at once.
void addMemoryLimit(CLI::App& verb);

// Any number of positional values.
Argument addValues(CLI::App& verb, const std::string& name, const std::string& help);

// Calls work for each value given or, if none, for each line of standard input, which ends in end. Each comes with its
// number and its place ("line 3") for messages. Results are flushed before each wait for a line, and at the end.
using ValueWork = std::function<void(const Secret& value, size_t index, const std::string& place)>;
void forEachValue(const Argument& given, char end, Results& results, const ValueWork& work);

// --null: records end in NUL bytes instead of newlines, in the input and in the results.
void addNull(CLI::App& verb, char& end);

// Writes an error object, or an empty line, in place of a result, so that there is one result for each value.
void showProblem(bool json, const Status& status, size_t index, Results& results);

// Catches arguments that can only be secrets, so that the message can say why they are refused without showing them.
Argument addRefusedSecrets(CLI::App& verb, const std::string& name);
void refuseSecrets(const Argument& option, const std::string& what);

}  // namespace tool
