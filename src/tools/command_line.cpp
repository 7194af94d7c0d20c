// SPDX-License-Identifier: Apache-2.0
#include "command_line.h"

#include <unistd.h>

#include <CLI/CLI.hpp>

#include <algorithm>
#include <new>
#include <numeric>
#include <utility>
#include <vector>

#include "base/descriptor.h"
#include "base/messages.h"
#include "encoding_utils.h"
#include "verbs/options.h"

namespace tool {
namespace {

constexpr Verb kVerbs[] = {
    {"identify", "Show the scheme of stored values and whether they are well formed", setUpIdentify},
    {"format", "Make stored values of passwords, which are asked for or read one a line", setUpFormat},
    {"verify", "Check a password, which is asked for or read, against a stored value", setUpVerify},
    {"reveal", "Turn reversible values back into clear passwords, one a line", setUpReveal},
    {"keys", "Make, restore, show and check key stash files", setUpKeys},
#ifdef LDAPPW_WITH_LDIF
    {"audit", "Report how well the passwords of directory exports are kept, and hold them to a policy", setUpAudit},
    {"ldif", "Convert or audit the password values of a directory export (LDIF)", setUpLdif},
    {"trial", "Put the clear passwords of an export through every scheme and compare", setUpTrial},
#endif
};

// Usage lines without the arguments that exist only to be refused.
class HelpFormatter : public CLI::Formatter {
 public:
  std::string make_option_usage(const CLI::Option* option) const override {
    if (option->get_group().empty()) return "";
    const std::string name = option->get_name(true) + (option->get_items_expected_max() > 1 ? "..." : "");
    return option->get_required() ? name : "[" + name + "]";
  }
};

// Of unexpected arguments only the names of options are shown: what follows a name may be a secret, and so may all
// else.
std::string optionName(const std::string& argument) {
  if (argument.size() < 2 || argument.front() != '-') return "";
  return argument[1] == '-' ? argument.substr(0, argument.find('=')) : argument.substr(0, 2);
}

// The least number of letters to change, drop or add that makes the one word of the other.
size_t distance(std::string_view a, std::string_view b) {
  std::vector<size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), size_t{0});
  for (size_t i = 0; i < a.size(); ++i) {
    size_t diagonal = std::exchange(row[0], i + 1);
    for (size_t j = 0; j < b.size(); ++j) {
      const size_t changed = diagonal + (a[i] == b[j] ? 0 : 1);
      diagonal = std::exchange(row[j + 1], std::min({changed, row[j] + 1, row[j + 1] + 1}));
    }
  }
  return row.back();
}

// The verb that a word is nearest to, if it is near to one. Another word may be a secret and is not shown.
std::string unknownVerb(const CLI::App& app, const std::string& word) {
  constexpr size_t kNear = 2;
  std::string nearest;
  size_t least = kNear + 1;
  for (const CLI::App* verb : app.get_subcommands(nullptr)) {
    const size_t away = distance(word, verb->get_name());
    if (away < least) nearest = verb->get_name();
    least = std::min(least, away);
  }
  if (nearest.empty()) return "there is no such verb (--help lists them)";
  return "there is no verb " + word + "; did you mean " + nearest + "?";
}

ExitCode reportUsage(const CLI::App& app, const CLI::ParseError& error) {
  const CLI::App* verb = &app;
  while (!verb->get_subcommands().empty()) verb = verb->get_subcommands().front();
  const bool wantsVerb = !verb->get_subcommands(nullptr).empty();
  const std::vector<std::string> rest = app.remaining(true);
  if (wantsVerb && (rest.empty() || optionName(rest.front()).empty())) {
    message(rest.empty() ? "a verb is missing (--help lists them)" : unknownVerb(*verb, rest.front()));
    return kUsage;
  }
  std::string names;
  for (const std::string& argument : rest) {
    const std::string name = optionName(argument);
    if (!name.empty()) names += " " + name;
  }
  if (!names.empty()) {
    message("unknown option:" + names);
  } else if (dynamic_cast<const CLI::ExtrasError*>(&error) != nullptr) {
    message("too many arguments (--help shows what is accepted)");
  } else if (dynamic_cast<const CLI::ConversionError*>(&error) != nullptr) {
    message("an option has a value that it does not accept (--help shows which it does)");
  } else {
    message(error.what());
  }
  return kUsage;
}

// Reports a failure; with --json as an error object too.
ExitCode reportFailure(const CLI::App& app, const Failure& failure) {
  message(failure.what());
  const CLI::App* verb = &app;
  while (!verb->get_subcommands().empty()) verb = verb->get_subcommands().front();
  const CLI::Option* json = verb->get_option_no_throw("--json");
  if (json != nullptr && !json->empty()) {
    Json object;
    tryWrite(STDOUT_FILENO, std::string(object.problem(failure.what(), failure.code()).end()) + "\n");
  }
  return failure.code();
}

ExitCode parseAndRun(int argc, char** argv) {
  ExitCode exitCode = kSuccess;
  CLI::App app("Password protection for an LDAP directory server: stored values, key stash files, directory exports",
               "ldappw");
  app.set_version_flag("--version", "ldappw " LDAPPW_VERSION_TEXT);
  app.require_subcommand(1);
  app.formatter(std::make_shared<HelpFormatter>());
  app.footer("Results go to standard output, messages to standard error. \"ldappw VERB --help\" says more.");
  for (const Verb& row : kVerbs) addVerb(app, row, exitCode);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() != 0) return reportUsage(app, error);
    app.exit(error);  // --help or --version
    std::cout.flush();
    return std::cout ? kSuccess : kIoError;
  } catch (const Failure& failure) {
    return reportFailure(app, failure);
  }
  return exitCode;
}

}  // namespace

ExitCode runCommand(int argc, char** argv) {
  try {
    return parseAndRun(argc, argv);
  } catch (const std::bad_alloc&) {
    message("out of memory");
  } catch (const std::exception& error) {
    message(error.what());
  }
  return kInternal;
}

}  // namespace tool
