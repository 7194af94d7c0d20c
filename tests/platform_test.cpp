// SPDX-License-Identifier: Apache-2.0
// What meets the system: the loader wrappers, the library path, the repair of cipher specifications and the password
// prompt.
#include <dlfcn.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <pty.h>
#include <termios.h>

#include <sstream>
#include <thread>

#include "dsutil.h"
#include "encoding_utils.h"
#include "oracle.h"
#include "support.h"

namespace {

using test::AllocationWatch;
using test::Replaced;
using test::taken;

// What the call prints for the debug log at that debug level.
template <class Call>
std::string debugOutput(int level, Call call) {
  testing::internal::CaptureStderr();
  set_ldap_debug(level);
  call();
  set_ldap_debug(0);
  return testing::internal::GetCapturedStderr();
}

// ---- Loading ----

TEST(Loader, OpensResolvesAndCloses) {
  EXPECT_EQ(defFlags, 0x102);
  void** cell = ldapLoadLib("libm.so.6", 0);
  ASSERT_NE(cell, nullptr);
  EXPECT_EQ(ldapGetSymAddress(cell, "cos"), dlsym(*cell, "cos"));
  EXPECT_NE(ldapGetSymAddress(cell, "cos"), nullptr);
  EXPECT_EQ(ldapGetSymAddress(cell, nullptr), nullptr);
  EXPECT_EQ(ldapGetSymAddress(nullptr, "cos"), nullptr);
  EXPECT_EQ(ldapUnloadLib(cell), 0);
  EXPECT_EQ(ldapUnloadLib(nullptr), 80);
  EXPECT_EQ(ldapLoadLib(nullptr, 0), nullptr);
}

TEST(Loader, PassesTheFlagsOn) {
  const Replaced<int> local(defFlags, RTLD_NOW | RTLD_NOLOAD);
  const char* notLoaded = "libutil.so.1";
  EXPECT_EQ(ldapLoadLib(notLoaded, 0), nullptr);
  void** cell = ldapLoadLib(notLoaded, RTLD_LAZY);
  ASSERT_NE(cell, nullptr);
  EXPECT_EQ(ldapUnloadLib(cell), 0);
}

TEST(Loader, TellsFailuresToTheDebugLogAlone) {
  void** cell = nullptr;
  const auto missing = [&] { cell = ldapLoadLib("/nowhere/lib.so", 0); };
  EXPECT_EQ(debugOutput(1, missing),
            "c8110000 dlopen failed for /nowhere/lib.so: /nowhere/lib.so: cannot open shared object file: No such "
            "file or directory\n");
  EXPECT_EQ(cell, nullptr);
  EXPECT_EQ(debugOutput(0, missing), "");
  EXPECT_EQ(debugOutput(1,
                        [&] {
                          const AllocationWatch watch(0);
                          EXPECT_EQ(ldapLoadLib("libm.so.6", 0), nullptr);
                        }),
            "");
  cell = ldapLoadLib("libm.so.6", 0);
  ASSERT_NE(cell, nullptr);
  const auto unknown = [&] { EXPECT_EQ(ldapGetSymAddress(cell, "no_such_symbol"), nullptr); };
  const std::string line = debugOutput(-1, unknown);
  const std::string end = ": undefined symbol: no_such_symbol\n";
  EXPECT_EQ(line.rfind("c8110000 dlsym failed: ", 0), 0U) << line;
  EXPECT_EQ(line.find(end), line.size() - end.size()) << line;
  EXPECT_EQ(debugOutput(0, unknown), "");
  ldapUnloadLib(cell);
}

// ---- The library path and cipher specifications ----

// The number of overflow lines in a debug log that holds nothing else.
int overflows(const std::string& log) {
  std::istringstream lines(log);
  int count = 0;
  for (std::string line; std::getline(lines, line); ++count) {
    EXPECT_EQ(line.rfind("c8010000 kubstr error near ", 0), 0U) << line;
    const size_t file = line.find("utils_loader.cpp:");
    EXPECT_NE(file, std::string::npos) << line;
    EXPECT_GT(std::atoi(line.c_str() + file + 17), 0) << line;
  }
  return count;
}

TEST(LibraryPath, HoldsTheSystemFolderAfterwards) {
  const std::string full(2032, 'x');  // with the name, all the 2048 characters there are
  const struct {
    const char* before;
    std::string after;
    int overflows;
  } rows[] = {
      {nullptr, "/usr/lib", 0},
      {"", ":/usr/lib", 0},
      {"/opt/x", "/opt/x:/usr/lib", 0},
      {"/opt/x:/usr/lib", "/opt/x:/usr/lib", 0},
      {"/usr/lib:/opt/x", "/usr/lib:/opt/x", 0},
      {"/opt/x:/usr/lib/", "/opt/x:/usr/lib/:/usr/lib", 0},
      {"/USR/LIB:/usr/lib64", "/USR/LIB:/usr/lib64:/usr/lib", 0},
      {full.c_str() + 9, full.substr(9) + ":/usr/lib", 0},
      {full.c_str() + 8, full.substr(8) + ":/usr/li", 1},
      {full.c_str() + 1, full.substr(1) + ":", 1},
      {full.c_str(), full, 2},
  };
  const std::string before = getenv("LD_LIBRARY_PATH") != nullptr ? getenv("LD_LIBRARY_PATH") : "";
  for (const auto& row : rows) {
    SCOPED_TRACE(row.after.substr(0, 40));
    unsetenv("LD_LIBRARY_PATH");
    if (row.before != nullptr) setenv("LD_LIBRARY_PATH", row.before, 1);
    int rc = -1;
    EXPECT_EQ(overflows(debugOutput(1, [&] { rc = setDefLibpath(); })), row.overflows);
    EXPECT_EQ(rc, 0);
    EXPECT_EQ(getenv("LD_LIBRARY_PATH"), row.after);
  }
  setenv("LD_LIBRARY_PATH", "/a", 1);
  setDefLibpath();
  setDefLibpath();  // the second call reads what the first one's buffer holds
  EXPECT_STREQ(getenv("LD_LIBRARY_PATH"), "/a:/usr/lib");
  setenv("LD_LIBRARY_PATH", (std::string(3000, 'y') + ":/usr/lib").c_str(), 1);
  EXPECT_EQ(overflows(debugOutput(0, [] { setDefLibpath(); })), 0);
  EXPECT_EQ(getenv("LD_LIBRARY_PATH"), std::string(2032, 'y'));
  setenv("LD_LIBRARY_PATH", before.c_str(), 1);
}

TEST(CipherSpecs, GetTheStrongerCodeFirst) {
  const std::string codes = "0102030405060708";
  const std::string long58 = codes + codes + codes + "0102030405";
  const struct {
    std::string before, after;
    int overflows;
  } rows[] = {
      {"", "", 0},
      {"0A09", "0A09", 0},
      {"090A", "0A090A", 0},
      {"35090A", "350A090A", 0},
      {"0905", "0905", 0},
      {"050A", "050A", 0},
      {"0A090A", "0A090A", 0},
      {"09350A0A09", "0A09350A0A09", 0},
      {long58 + "090A", long58 + "0A090A", 0},
      {long58 + "09050A", long58 + "0A0905", 1},
      {std::string(70, '1') + "090A", std::string(64, '1'), 2},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.before);
    std::string specs = row.before;
    specs.resize(row.before.size() + 3);  // the room that the caller owes, and the terminator
    EXPECT_EQ(overflows(debugOutput(1, [&] { fixupCipherSpecs(specs.data()); })), row.overflows);
    EXPECT_EQ(specs.c_str(), row.after);
  }
  fixupCipherSpecs(nullptr);
}

// ---- The prompt ----

struct Prompted {
  std::string password;
  std::string output;
};

Prompted prompted(int input) {
  FILE* stream = fdopen(input, "r");
  const Replaced<FILE*> standardInput(stdin, stream);
  testing::internal::CaptureStdout();
  Prompted result;
  result.password = taken(getPassword());
  result.output = testing::internal::GetCapturedStdout();
  fclose(stream);
  return result;
}

TEST(Prompt, ReadsALineAndDropsItsLastCharacter) {
  const struct {
    std::string input, password;
  } rows[] = {
      {"abc123\n", "abc123"},
      {"abc123\nmore\n", "abc123"},
      {"no newline", "no newlin"},
      {"\n", ""},
      {"", ""},
      {std::string(253, 'x') + "\n", std::string(253, 'x')},
      {std::string(254, 'x') + "\n", std::string(253, 'x')},
      {std::string(400, 'x') + "\n", std::string(253, 'x')},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.input);
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    ASSERT_EQ(write(ends[1], row.input.data(), row.input.size()), static_cast<ssize_t>(row.input.size()));
    close(ends[1]);
    const Prompted result = prompted(ends[0]);
    EXPECT_EQ(result.password, row.password);
    EXPECT_EQ(result.output, "Enter password ==> \n");
  }
}

TEST(Prompt, SwitchesEchoOffWhileItReads) {
  int host = -1;
  int terminal = -1;
  ASSERT_EQ(openpty(&host, &terminal, nullptr, nullptr, nullptr), 0);
  termios before{};
  ASSERT_EQ(tcgetattr(terminal, &before), 0);
  before.c_lflag |= ECHO | ECHONL;
  ASSERT_EQ(tcsetattr(terminal, TCSANOW, &before), 0);
  std::thread typist([host] {
    termios now{};
    do {
      std::this_thread::yield();
      tcgetattr(host, &now);
    } while ((now.c_lflag & (ECHO | ECHONL)) != 0);
    EXPECT_EQ(write(host, "secret\n", 7), 7);
  });
  const Prompted result = prompted(dup(terminal));
  typist.join();
  EXPECT_EQ(result.password, "secret");
  termios after{};
  ASSERT_EQ(tcgetattr(terminal, &after), 0);
  EXPECT_EQ(after.c_lflag, before.c_lflag);
  char echoed[8];
  fcntl(host, F_SETFL, O_NONBLOCK);
  EXPECT_EQ(read(host, echoed, sizeof echoed), -1) << "the terminal showed what was typed";
  close(terminal);
  close(host);
}

}  // namespace
