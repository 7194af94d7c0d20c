// SPDX-License-Identifier: Apache-2.0
// The loader wrappers, the library path, the repair of cipher specifications and the password prompt.
#include <dlfcn.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <gtest/gtest.h>
#include <pty.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <termios.h>

#include <thread>

#include "dsutil.h"
#include "encoding_utils.h"
#include "oracle.h"
#include "support.h"

static bool noCopies = false;
static int failingAttributes = 0;  // the number of the call that fails, from 1

// In place of the utility library's.
extern "C" char* ldap_getenv(const char* name) {
  const char* value = getenv(name);
  return value == nullptr || noCopies ? nullptr : strdup(value);
}

// In place of the C library's.
extern "C" int tcsetattr(int descriptor, int actions, const termios* attributes) noexcept {
  if (--failingAttributes == 0) return errno = EIO, -1;
  static const auto real = reinterpret_cast<decltype(&tcsetattr)>(dlsym(RTLD_NEXT, "tcsetattr"));
  return real(descriptor, actions, attributes);
}

namespace {

using test::Replaced;

// What the call prints for the debug log at that debug level.
template <typename Call>
std::string debugOutput(int level, Call call) {
  testing::internal::CaptureStderr();
  set_ldap_debug(level);
  call();
  set_ldap_debug(0);
  return testing::internal::GetCapturedStderr();
}

TEST(Loader, OpensResolvesClosesAndTellsFailuresToTheDebugLogAlone) {
  EXPECT_EQ(defFlags, 0x102);
  void** cell = ldapLoadLib("libm.so.6", 0);
  ASSERT_NE(cell, nullptr);
  EXPECT_NE(ldapGetSymAddress(cell, "cos"), nullptr);
  EXPECT_EQ(ldapGetSymAddress(cell, "cos"), dlsym(*cell, "cos"));
  EXPECT_EQ(ldapLoadLib("libutil.so.1", RTLD_NOW | RTLD_NOLOAD), nullptr);
  const auto noFile = [] { EXPECT_EQ(ldapLoadLib("/nowhere/lib.so", 0), nullptr); };
  const auto noSymbol = [&] { EXPECT_EQ(ldapGetSymAddress(cell, "no_such_symbol"), nullptr); };
  const auto noMemory = [] {
    const test::AllocationWatch watch(0);
    EXPECT_EQ(ldapLoadLib("libm.so.6", 0), nullptr);
  };
  EXPECT_EQ(debugOutput(1, noFile),
            "c8110000 dlopen failed for /nowhere/lib.so: /nowhere/lib.so: cannot open shared object file: No such "
            "file or directory\n");
  EXPECT_EQ(
      fnmatch("c8110000 dlsym failed: *: undefined symbol: no_such_symbol\n", debugOutput(-1, noSymbol).c_str(), 0), 0);
  EXPECT_EQ(debugOutput(0, noFile) + debugOutput(0, noSymbol) + debugOutput(1, noMemory), "");
  EXPECT_EQ(ldapUnloadLib(cell), 0);
  EXPECT_EQ(ldapUnloadLib(ldapLoadLib("libutil.so.1", 0)), 0);
  EXPECT_EQ(ldapLoadLib("libutil.so.1", RTLD_NOW | RTLD_NOLOAD), nullptr) << "not closed";
  const Replaced<int> flags(defFlags, RTLD_NOW | RTLD_NOLOAD);
  EXPECT_EQ(ldapLoadLib("libutil.so.1", 0), nullptr);
}

// Loaded by a relative name, which starts from where the process was then; a folder may lie deeper than any path.
TEST(InstallFolder, IsThatOfTheLibraryWhereverTheProcessGoes) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "a second copy of an instrumented library cannot be loaded";
#endif
  const test::TempFolder folder;
  const std::string library =
      std::filesystem::canonical("/proc/self/exe").parent_path().parent_path() / "lib/libdsutil.so.1";
  for (const size_t levels : {0U, 1U, 25U}) {
    if (levels == 25 && !test::loaderFindsDeepFolders()) continue;
    const auto run = [&] {
      std::filesystem::current_path(folder.file(""));
      std::string expected = std::filesystem::current_path();
      const std::string name(200, 'd');
      for (size_t i = 0; i < levels; ++i, expected += "/" + name) {
        std::filesystem::create_directory(name);
        if (chdir(name.c_str()) != 0) return 2;
      }
      std::filesystem::copy(library, "copy.so");
      void* handle = dlmopen(LM_ID_NEWLM, "./copy.so", RTLD_NOW);
      if (handle == nullptr || chdir("/") != 0) return 3;
      const auto path = reinterpret_cast<char* (*)()>(dlsym(handle, "getKUBInstallLibPath"));
      const char* const found = path();  // of another allocator
      return found == nullptr ? levels == 25 ? 0 : 4 : found == expected + "/." ? 0 : 5;
    };
    EXPECT_EQ(test::inChild(run), 0) << levels;
  }
}

// The number of overflow lines in a debug log that holds nothing else.
long overflows(const std::string& log) {
  std::istringstream lines(log);
  long count = 0;
  for (std::string line; std::getline(lines, line); ++count) {
    EXPECT_EQ(fnmatch("c8010000 kubstr error near *utils_loader.cpp:[1-9]*", line.c_str(), 0), 0) << line;
  }
  return count;
}

struct Repair {
  std::string before, after;
  long overflows;
};

TEST(LibraryPath, HoldsTheSystemFolderAfterwards) {
  const std::string full(2032, 'x');  // with the name, all the 2048 characters there are
  const Repair rows[] = {
      {"(unset)", "/usr/lib", 0},
      {"", ":/usr/lib", 0},
      {"/usr/lib:/opt/x", "/usr/lib:/opt/x", 0},
      {"/opt/x:/usr/lib/", "/opt/x:/usr/lib/:/usr/lib", 0},
      {full.substr(9), full.substr(9) + ":/usr/lib", 0},
      {full.substr(8), full.substr(8) + ":/usr/li", 1},
      {full.substr(1), full.substr(1) + ":", 1},
      {full, full, 2},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.after.substr(0, 40));
    unsetenv("LD_LIBRARY_PATH");
    if (row.before != "(unset)") setenv("LD_LIBRARY_PATH", row.before.c_str(), 1);
    if (row.before[0] == '/') {
      const Replaced<bool> none(noCopies, true);  // no memory: the path stays
      EXPECT_EQ(setDefLibpath(), 90);
      EXPECT_EQ(getenv("LD_LIBRARY_PATH"), row.before);
    }
    EXPECT_EQ(overflows(debugOutput(1, [] { EXPECT_EQ(setDefLibpath(), 0); })), row.overflows);
    EXPECT_EQ(getenv("LD_LIBRARY_PATH"), row.after);
    EXPECT_EQ(debugOutput(0, [] { setDefLibpath(); }), "");
    EXPECT_EQ(getenv("LD_LIBRARY_PATH"), row.after);
  }
}

TEST(TraceLines, ArriveWhole) {
  for (const size_t length : {size_t{0}, size_t{511}, size_t{512}, size_t{9000}}) {
    const std::string line(length, 'x');
    const test::TraceCapture trace;
    ldtr_formater_global(LDTR_ERROR, "%s", line.c_str());
    ASSERT_EQ(trace.records().size(), 1U);
    EXPECT_EQ(trace.records()[0].text, line);
    EXPECT_TRUE(trace.records()[0].kind == 3 && trace.records()[0].severity == 1);  // sinks know the numbers
  }
  testing::internal::CaptureStderr();
  ldtr_formater_global(LDTR_ERROR, "with %s", "a class");
  ldtr_formater_global(LDTR_DEBUG, "and an end\n");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "00000000 error with a class\n00000000 debug and an end\n");
}

TEST(CipherSpecs, GetTheStrongerCodeFirst) {
  const std::string long58 = "0102030405060708010203040506070801020304050607080102030405";
  const Repair rows[] = {
      {"0A09", "0A09", 0},
      {"0905", "0905", 0},
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
}

// What the prompt makes of standard input, and what it prints.
std::string prompted(FILE* stream) {
  const Replaced<FILE*> standardInput(stdin, stream);
  testing::internal::CaptureStdout();
  const std::string password = test::taken(getPassword());
  EXPECT_EQ(testing::internal::GetCapturedStdout(), "Enter password ==> \n");
  fclose(stream);
  return password;
}

TEST(Prompt, ReadsALineAndDropsItsLastCharacter) {
  const std::string longest(253, 'x');
  const std::pair<std::string, std::string> rows[] = {
      {"abc123\nmore\n", "abc123"}, {"no newline", "no newlin"}, {"\n", ""}, {"", ""},
      {longest + "\n", longest},    {longest + "x\n", longest},
  };
  for (const auto& [input, password] : rows) {
    SCOPED_TRACE(input);
    std::string content = input;
    EXPECT_EQ(prompted(fmemopen(content.data(), content.size(), "r")), password);
  }
}

// A terminal that echoes, with somebody at it.
class Terminal : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(openpty(&host, &terminal, nullptr, nullptr, nullptr), 0);
    ASSERT_EQ(tcgetattr(terminal, &before), 0);
    before.c_lflag |= ECHO | ECHONL;
    ASSERT_EQ(tcsetattr(terminal, TCSANOW, &before), 0);
  }
  void TearDown() override {
    EXPECT_TRUE(echoes());
    close(terminal);
    close(host);
  }
  bool echoes() const {
    termios now{};
    tcgetattr(terminal, &now);
    return (now.c_lflag & (ECHO | ECHONL)) != 0;
  }
  void awaitSilence() const {
    for (int i = 0; i < 100000 && echoes(); ++i) usleep(100);
  }
  int host = -1, terminal = -1;
  termios before{};
};

TEST_F(Terminal, DoesNotEchoWhileThePromptReads) {
  std::thread typist([this] {
    awaitSilence();
    EXPECT_EQ(write(host, "secret\n", 7), 7);
  });
  EXPECT_EQ(prompted(fdopen(dup(terminal), "r")), "secret");
  typist.join();
  char echoed[8];
  fcntl(host, F_SETFL, O_NONBLOCK);
  EXPECT_EQ(read(host, echoed, sizeof echoed), -1) << "the terminal showed what was typed";
}

TEST_F(Terminal, EndsTheProcessWhereEchoCannotBeSwitchedOffAndSaysSoWhereItStaysOff) {
  ASSERT_EQ(write(host, "secret\n", 7), 7);
  for (const int failing : {1, 2}) {
    const char* const says =
        failing == 1 ? "^Internal error setting terminal attribute.\n$" : "^Unable to reset the display.\n$";
    const auto run = [&] {
      const Replaced<FILE*> standardInput(stdin, fdopen(terminal, "r"));
      failingAttributes = failing;
      std::exit(test::taken(getPassword()) == "secret" ? 99 : 98);
    };
    EXPECT_EXIT(run(), testing::ExitedWithCode(failing == 1 ? EIO : 99), says);
    ASSERT_EQ(tcsetattr(terminal, TCSANOW, &before), 0);
  }
}

// What a child that prompts on the terminal gets, with a signal in the middle; its exit status is the password's
// length.
TEST_F(Terminal, EchoesAgainBeforeASignalActs) {
  static const struct {
    int signal;
    bool isHandled;
    int status;
  } rows[] = {{SIGINT, false, SIGINT},
              {SIGTERM, false, SIGTERM},
              {SIGHUP, false, SIGHUP},
              {SIGINT, true, 6 << 8U},
              {SIGUSR1, true, 6 << 8U}};
  for (const auto& row : rows) {
    SCOPED_TRACE(row.signal);
    const pid_t child = fork();
    if (child == 0) {
      alarm(60);
      dup2(terminal, STDIN_FILENO);
      struct sigaction ours {};  // without SA_RESTART, so the read is interrupted; a background job ignores some
      if (row.isHandled) ours.sa_handler = [](int) {};
      sigaction(row.signal, &ours, nullptr);
      if (freopen("/dev/null", "w", stdout) == nullptr) _exit(99);
      const std::string password = test::taken(getPassword());
      char rest = 0;
      _exit(read(STDIN_FILENO, &rest, 1) == 1 && rest == 'n' ? static_cast<int>(password.size()) : 98);
    }
    awaitSilence();
    kill(child, row.signal);
    int status = 0;
    if (row.isHandled) {
      usleep(20000);
      awaitSilence();
      EXPECT_EQ(write(host, "secret\nnext\n", 12), 12);
    }
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, row.status);
    EXPECT_TRUE(echoes());
    tcflush(terminal, TCIFLUSH);
  }
}

}  // namespace
