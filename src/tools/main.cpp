// SPDX-License-Identifier: Apache-2.0
// The ldappw command: the command line, and what happens to every failure.
#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <memory>
#include <new>

#include "common.h"
#include "verbs.h"

namespace tool {
namespace {

// A descriptor 0, 1 or 2 that is not open would go to the next file that is: results would land in a stash file. The
// direction is the wrong one, so that using the descriptor still fails.
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

// Usage lines without the arguments that are there to be refused.
class HelpFormatter : public CLI::Formatter {
 public:
  std::string make_option_usage(const CLI::Option* option) const override {
    if (option->get_group().empty()) return "";
    const std::string name = option->get_name(true) + (option->get_items_expected_max() > 1 ? "..." : "");
    return option->get_required() ? name : "[" + name + "]";
  }
};

// Shows of unexpected arguments only the names of options: the rest may be a secret.
int tellUsage(const CLI::App& app, const CLI::ParseError& error) {
  if (dynamic_cast<const CLI::ExtrasError*>(&error) == nullptr) {
    message(error.what());
    return kUsage;
  }
  std::string names;
  for (const std::string& argument : app.remaining(true)) {
    if (argument.size() > 1 && argument.front() == '-') names += " " + argument.substr(0, argument.find('='));
  }
  message(names.empty() ? "there is an argument too many (--help shows what is taken)" : "unknown option:" + names);
  return kUsage;
}

int parseAndRun(int argc, char** argv) {
  int exitCode = kSuccess;
  CLI::App app("Password protection for an LDAP directory server: stored values, key stash files, directory exports",
               "ldappw");
  app.set_version_flag("--version", "ldappw " LDAPPW_VERSION);
  app.require_subcommand(1);
  app.formatter(std::make_shared<HelpFormatter>());
  app.footer("Results go to standard output, messages to standard error. \"ldappw VERB --help\" tells more.");
  addIdentify(app, exitCode);
  addFormat(app, exitCode);
  addVerify(app, exitCode);
  addReveal(app, exitCode);
  addKeys(app, exitCode);
#ifdef LDAPPW_WITH_LDIF
  addLdif(app, exitCode);
  addTrial(app, exitCode);
#endif
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() != 0) return tellUsage(app, error);
    app.exit(error);  // --help or --version
    std::cout.flush();
    return std::cout ? kSuccess : kIoError;
  }
  return exitCode;
}

int guarded(int argc, char** argv) {
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
