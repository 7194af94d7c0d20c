// SPDX-License-Identifier: Apache-2.0
// The ldappw command: the command line, and what happens to every failure.
#include "command_line.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <unistd.h>

#include <new>

#include "messages.h"

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

// A descriptor 0, 1 or 2 that is not open would go to the next file that is opened, and messages would be written into
// it: tool_test and ldif_test run with all three closed. The direction is the wrong one, so that using the descriptor
// still fails.
void occupyStandardDescriptors() {
  for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd) {
    if (fcntl(fd, F_GETFD) >= 0 || errno != EBADF) continue;
    if (open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY) < 0) _exit(kIoError);
  }
}

void prepareProcess() {
  occupyStandardDescriptors();
  signal(SIGXFSZ, SIG_IGN);  // a file that grows too large is an error like a full disk
  const struct rlimit noCore {};
  setrlimit(RLIMIT_CORE, &noCore);  // a core file would hold passwords and keys
}

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

ExitCode reportUsage(const CLI::App& app, const CLI::ParseError& error) {
  std::string names;
  for (const std::string& argument : app.remaining(true)) {
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

ExitCode parseAndRun(int argc, char** argv) {
  ExitCode exitCode = kSuccess;
  CLI::App app("Password protection for an LDAP directory server: stored values, key stash files, directory exports",
               "ldappw");
  app.set_version_flag("--version", "ldappw " LDAPPW_VERSION);
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
  }
  return exitCode;
}

ExitCode guarded(int argc, char** argv) {
  try {
    return parseAndRun(argc, argv);
  } catch (const Failure& failure) {
    message(failure.what());
    return failure.code();
  } catch (const std::bad_alloc&) {
    message("out of memory");
  } catch (const std::exception& error) {
    message(error.what());
  }
  return kInternal;
}

}  // namespace
}  // namespace tool

int main(int argc, char** argv) {
  tool::prepareProcess();
  return tool::guarded(argc, argv);
}
