// SPDX-License-Identifier: Apache-2.0
// The parts of the command line that verbs have in common.
#include "verbs/options.h"

#include <CLI/CLI.hpp>
#include <cstdint>
#include <utility>

#include "base/input.h"
#include "schemes/key_record.h"
#include "schemes/memory_budget.h"

namespace tool {

const Argument& Argument::required() const {
  option_->required();
  return *this;
}

const Argument& Argument::needs(const Argument& other) const {
  option_->needs(other.option_);
  return *this;
}

const Argument& Argument::excludes(const Argument& other) const {
  option_->excludes(other.option_);
  return *this;
}

const Argument& Argument::between(std::uint64_t least, std::uint64_t most) const {
  option_->check(CLI::Range(least, most));
  return *this;
}

const Argument& Argument::takes(const std::string& what) const {
  option_->type_name(what);
  return *this;
}

const Argument& Argument::hidden() const {
  option_->group("");
  return *this;
}

bool Argument::empty() const noexcept {
  return option_->empty();
}

const std::vector<std::string>& Argument::results() const {
  return option_->results();
}

// A verb's options are added when the verb is named: those of all the others take 8 % of a short run.
void addVerb(CLI::App& app, const Verb& row, ExitCode& exitCode) {
  CLI::App* verb = app.add_subcommand(row.name, row.help);
  verb->preparse_callback([verb, &row, &exitCode](size_t) { row.setUp(*verb, exitCode); });
}

void requireVerb(CLI::App& verb) {
  verb.require_subcommand(1);
}

void addFooter(CLI::App& verb, const std::string& text) {
  verb.footer(text);
}

void onRun(CLI::App& verb, std::function<void()> work) {
  verb.callback(std::move(work));
}

Argument addFlag(CLI::App& verb, const std::string& name, bool& flag, const std::string& help) {
  return Argument(verb.add_flag(name, flag, help));
}

template <typename Value>
Argument addOption(CLI::App& verb, const std::string& name, Value& value, const std::string& help) {
  return Argument(verb.add_option(name, value, help));
}
template Argument addOption(CLI::App&, const std::string&, std::string&, const std::string&);
template Argument addOption(CLI::App&, const std::string&, unsigned&, const std::string&);
template Argument addOption(CLI::App&, const std::string&, unsigned long&, const std::string&);

Argument addOption(CLI::App& verb, const std::string& name, const std::string& help) {
  return Argument(verb.add_option(name, help));
}

Argument addList(CLI::App& verb, const std::string& name, std::vector<std::string>& values, const std::string& help) {
  CLI::Option* option = verb.add_option(name, values, help);
  return Argument(option->expected(1)->allow_extra_args(false)->multi_option_policy(CLI::MultiOptionPolicy::TakeAll));
}

Argument addPath(CLI::App& verb, const std::string& name, std::string& path, const std::string& help) {
  return addOption(verb, name, path, help).takes(name.front() == '-' ? "FILE" : "");
}

namespace {

void addKeysGroup(CLI::App& verb) {
  verb.add_option_function<std::string>("--keys-group", allowKeysGroup,
                                        "group that may read stash files; without it that of their owner")
      ->type_name("GROUP");
}

}  // namespace

Argument addKeys(CLI::App& verb, const std::string& name, std::string& path, const std::string& help) {
  addKeysGroup(verb);
  return addPath(verb, name, path, help);
}

Argument addKeys(CLI::App& verb, const std::string& name, std::vector<std::string>& paths, const std::string& help) {
  addKeysGroup(verb);
  return addList(verb, name, paths, help).takes("FILE");
}

void addCosts(CLI::App& verb, Costs& costs) {
  for (const CostName& cost : kCostNames) {
    addOption(verb, cost.option, costs.*cost.member, cost.help).between(1, UINT32_MAX);
  }
}

void addMemoryLimit(CLI::App& verb) {
  verb.add_option_function<std::uint32_t>("--memory-limit", setMemoryLimit,
                                          "MiB for costly values, of all threads (default: a quarter of the machine's)")
      ->check(CLI::Range(1U, UINT32_MAX));
}

// A value list of the parser's own would split a value that is wrapped in brackets and drop "{}".
Argument addValues(CLI::App& verb, const std::string& name, const std::string& help) {
  constexpr int kMany = 1 << 20;
  CLI::Option* option = verb.add_option(name, help);
  option->expected(kMany)->allow_extra_args(false)->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  return Argument(option->option_text("..."));
}

void addNull(CLI::App& verb, char& end) {
  verb.add_flag_callback(
      "--null", [&end] { end = '\0'; }, "lines end in NUL bytes, in the input and in the results");
}

void forEachValue(const Argument& given, char end, Results& results, const ValueWork& work) {
  size_t index = 0;
  for (const std::string& value : given.results()) {
    ++index;
    work(Secret(value), index, "value " + std::to_string(index));
  }
  if (given.empty()) {
    LineReader lines(Input(), kValueLine, end);
    Secret value;
    while (lines.next(value)) {
      ++index;
      work(value, index, "line " + std::to_string(index));
      if (!lines.lineBuffered()) results.flush();
    }
  }
  results.flush();
}

void showProblem(bool json, const Status& status, size_t index, Results& results) {
  results.line(json ? Json().number("index", index).problem(status).end() : "");
}

Argument addRefusedSecrets(CLI::App& verb, const std::string& name) {
  return addValues(verb, name, "").hidden();
}

void refuseSecrets(const Argument& option, const std::string& what) {
  if (option.empty()) return;
  throw Failure(kUsage, "a " + what +
                            " is not taken from the command line, where other users of the system can see it; " +
                            "use the prompt, standard input or --" + what + "-file");
}

}  // namespace tool
