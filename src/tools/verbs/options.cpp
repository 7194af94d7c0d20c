// SPDX-License-Identifier: Apache-2.0
// The parts of the command line that verbs have in common.
#include "verbs/options.h"

#include <cstdint>

#include "base/input.h"
#include "schemes/key_record.h"

namespace tool {

// A verb's options are added when the verb is named: those of all the others take 8 % of a short run.
void addVerb(CLI::App& app, const Verb& row, ExitCode& exitCode) {
  CLI::App* verb = app.add_subcommand(row.name, row.help);
  verb->preparse_callback([verb, &row, &exitCode](size_t) { row.setUp(*verb, exitCode); });
}

CLI::Option* addPath(CLI::App& verb, const std::string& name, std::string& path, const std::string& help) {
  return verb.add_option(name, path, help)->type_name(name.front() == '-' ? "FILE" : "");
}

namespace {

void addKeysGroup(CLI::App& verb) {
  verb.add_option_function<std::string>("--keys-group", allowKeysGroup,
                                        "group that may read stash files; without it that of their owner")
      ->type_name("GROUP");
}

}  // namespace

CLI::Option* addKeys(CLI::App& verb, const std::string& name, std::string& path, const std::string& help) {
  addKeysGroup(verb);
  return addPath(verb, name, path, help);
}

CLI::Option* addKeys(CLI::App& verb, const std::string& name, std::vector<std::string>& paths,
                     const std::string& help) {
  addKeysGroup(verb);
  CLI::Option* option = verb.add_option(name, paths, help)->type_name("FILE");
  return option->expected(1)->allow_extra_args(false)->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
}

void addCosts(CLI::App& verb, Costs& costs) {
  for (const CostName& cost : kCostNames) {
    verb.add_option(cost.option, costs.*cost.member, cost.help)->check(CLI::Range(1U, UINT32_MAX));
  }
}

// A value list of the parser's own would split a value that is wrapped in brackets and drop "{}".
CLI::Option* addValues(CLI::App& verb, const std::string& name, const std::string& help) {
  constexpr int kMany = 1 << 20;
  CLI::Option* option = verb.add_option(name, help);
  option->expected(kMany)->allow_extra_args(false)->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  return option->option_text("...");
}

void addNull(CLI::App& verb, char& end) {
  verb.add_flag_callback(
      "--null", [&end] { end = '\0'; }, "lines end in NUL bytes, in the input and in the results");
}

void forEachValue(const CLI::Option& given, char end, Results& results, const ValueWork& work) {
  size_t index = 0;
  for (const std::string& value : given.results()) {
    ++index;
    work(Secret(value), index, "value " + std::to_string(index));
  }
  if (given.empty()) {
    LineReader lines(Input(), end);
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

CLI::Option* addRefusedSecrets(CLI::App& verb, const std::string& name) {
  return addValues(verb, name, "")->group("");
}

void refuseSecrets(const CLI::Option* option, const std::string& what) {
  if (option->empty()) return;
  throw Failure(kUsage, "a " + what +
                            " is not taken from the command line, where other users of the system can see it; " +
                            "use the prompt, standard input or --" + what + "-file");
}

}  // namespace tool
