// SPDX-License-Identifier: Apache-2.0
// Finding, loading and unloading the provider, its one context and its statuses. Loading leaves process-wide state
// behind, so each case runs in a child process, over stand-in providers that report what was called.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <atomic>
#include <map>
#include <thread>

#include "dsutil.h"
#include "failures.h"

static const char* installFolder = "install";  // null: unknown
static int failingPutEnvVar = 0;               // the number of the call that fails, from 1

// In place of those of the utility library.
extern "C" char* getKUBInstallLibPath(void) {
  return installFolder == nullptr ? nullptr : strdup(installFolder);
}
extern "C" int putEnvVar(const char* name, const char* value) {
  return __atomic_sub_fetch(&failingPutEnvVar, 1, __ATOMIC_RELAXED) == 0 ? 7 : setenv(name, value, 1);
}

namespace {

using test::Body;
using test::failingAllocation;
using test::Lines;
using test::TraceCapture;

// Runs the body in a child process, in a folder that holds the stand-ins asked for as the system's and as the shipped
// copy, and returns what they were called with.
std::string staged(const char* system, const char* shipped, const Body& body) {
  const test::TempFolder folder;
  const auto run = [&] {
    namespace fs = std::filesystem;
    fs::current_path(folder.file(""));
    fs::create_directories("install/qel/qellib");
    const std::string standIn = LDAPPW_STANDINS "/standin_";
    if (system != nullptr) fs::create_symlink(standIn + system + ".so", "libtresk7qels.so");
    if (shipped != nullptr) fs::create_symlink(standIn + shipped + ".so", "install/qel/qellib/libtresk7qels.so");
    qelLibraryName = "./libtresk7qels.so";
    setenv("TRESK_LOCAL_INSTALL_MODE", "1", 1);
    setenv("STANDIN_LOG", folder.file("log").c_str(), 1);
    setenv("STANDIN_PATH", "/toolkit", 1);
    body();
    std::exit(testing::Test::HasFailure() ? 1 : 0);
    return 0;
  };
  EXPECT_EQ(test::inChild(run), 0);
  return test::fileContent(folder.file("log"));
}

constexpr char kHint[] = "Error - Check the supported version of TRESK in the install guide.\n";
constexpr char kShipped[] = "loadQelCrypto: Loading shipped version of qel library.\n";
constexpr char kNoStatus[] = "Error - loadQelCrypto: ldapGetSymAddress(pQEL_GetStatus) failed.\n";
constexpr char kToolkit[] = "loadQelCrypto:- qelAttachPath = /toolkit\n";

struct Loading {
  const char* name;
  const char *system, *shipped;  // stand-ins
  int rc;
  const char *copyVariable, *attachPath;
  int state;  // 0 no library, 1 open, 3 and all entries but the last resolved, 4 that too
  Lines lines;
  test::Failure failure = failingAllocation(-1);
};

// clang-format off
const Loading kLoadings[] = {
    {"the system's copy", "complete", "complete", 0, "FALSE", "/toolkit", 4, {kToolkit}},
    {"attached above the shipped folder", nullptr, "complete", 0, "TRUE", "install", 4,
     {"loadQelCrypto:- qelAttachPath = install/qel\n"},
     [](const Body& body) { setenv("STANDIN_PATH", "install/qel", 1), body(); }},
    {"not quite the shipped folder", nullptr, "complete", 0, "TRUE", "install/qel/", 4,
     {"loadQelCrypto:- qelAttachPath = install/qel/\n"},
     [](const Body& body) { setenv("STANDIN_PATH", "install/qel/", 1), body(); }},
    {"an old system copy", "nopath", "complete", 0, "TRUE", "/toolkit", 4, {kHint, kShipped, kToolkit}},
    {"an old system copy alone", "nopath", nullptr, 1, "TRUE", nullptr, 0, {kHint, kShipped, kNoStatus}},
    {"an old shipped copy succeeds unresolved", nullptr, "nopath", 0, "TRUE", nullptr, 1,
     {"Error - loadQelCrypto: ldapGetSymAddress(pQEL_PATH) failed.\n", kHint}},
    {"an entry lacking", "noseed", nullptr, 1, "FALSE", "/toolkit", 3,
     {kToolkit, "Error - loadQelCrypto: ldapGetSymAddress(pQEL_GenerateRandomSeed) failed.\n"}},
    {"no path", "complete", nullptr, 1, "FALSE", "", 1,
     {"Error - loadQelCrypto: pQEL_PATH failed to get QEL library path.\n"},
     [](const Body& body) { unsetenv("STANDIN_PATH"), body(); }},
    {"no install folder", "complete", nullptr, 1, "FALSE", "/toolkit", 1,
     {kToolkit, "Error - loadQelCrypto: getKUBInstallLibPath failed.\n"}, test::replacing(installFolder, nullptr)},
    {"no install folder to look in", nullptr, nullptr, 1, "TRUE", nullptr, 0,
     {"Error - getKubInstallLibPath: getKUBInstallLibPath() failed. \n", kNoStatus},
     test::replacing(installFolder, nullptr)},
    {"the second variable", nullptr, "complete", 7, "FALSE", nullptr, 0,
     {"Error - loadQelCrypto: putEnvVar failed rc = 7\n"}, test::replacing(failingPutEnvVar, 2)},
    {"no memory for the system path", "complete", nullptr, 1, "FALSE", nullptr, 0,
     {" Memory allocation failed ! \n", kNoStatus}, failingAllocation(0)},
    {"no memory for the attach path", "complete", nullptr, 90, "FALSE", nullptr, 1,
     {"Error - loadQelCrypto: Out of Memory!.\n"}, failingAllocation(2)},
    {"no memory for the shipped path", nullptr, "complete", 1, "TRUE", nullptr, 0,
     {"Error - getKubInstallLibPath: kub_strlcat() failed. \n", kNoStatus}, failingAllocation(3)},
};
// clang-format on

TEST(ProviderLoading, FindsACopyOrTellsWhatIsWrong) {
  for (const Loading& row : kLoadings) {
    staged(row.system, row.shipped, [&row] {
      SCOPED_TRACE(row.name);
      char* attachPath = nullptr;
      const TraceCapture trace(TraceCapture::kLinesOnly);
      row.failure([&] { EXPECT_EQ(loadQelCrypto(&attachPath), row.rc); });
      EXPECT_STREQ(getenv("TRESK_SHIPPED_QEL"), row.copyVariable);
      EXPECT_STREQ(attachPath, row.attachPath);
      EXPECT_TRUE(attachPath == nullptr ||
                  std::string(attachPath, 1024).find_last_not_of('\0') + 1 == std::strlen(attachPath));
      free(attachPath);
      const bool resolved[] = {pQEL_GetStatus != nullptr, pQEL_RAND_seed != nullptr,
                               pQEL_GenerateRandomSeed != nullptr};
      EXPECT_EQ((qelLoadGlobal != nullptr) + resolved[0] + resolved[1] + resolved[2], row.state);
      EXPECT_EQ(trace.messages(), row.lines);
      test::expectErrorClasses(trace);
      unloadQelCrypto();
    });
  }
}

TEST(ProviderLoading, LooksInTheSystemFolderUnlessTheModeIsLocal) {
  staged(nullptr, nullptr, [] {
    setenv("TRESK_LOCAL_INSTALL_MODE", "", 1);
    testing::internal::CaptureStderr();
    set_ldap_debug(1);
    char before = 0;
    char* attachPath = &before;
    EXPECT_EQ(loadQelCrypto(&attachPath), 1);
    EXPECT_EQ(attachPath, nullptr);
    const std::string log = testing::internal::GetCapturedStderr();
    EXPECT_EQ(log.rfind("c8110000 dlopen failed for /usr/lib/./libtresk7qels.so: ", 0), 0U) << log;
  });
}

#ifdef __SANITIZE_THREAD__  // its own thread is still there at exit, so that nothing is cleaned up
const std::string kEnd = "closed\n";
#else
const std::string kEnd = "Cleanup\nclosed\n";
#endif
const std::string kCreation = "Init /toolkit\nSetValue 1 /toolkit\nSetValue 0 on\nAttach\n";

TEST(ProviderContext, IsOneForThreadsThatAskAtOnceAndCleanedUpAtExit) {
  const std::string log = staged("complete", nullptr, [] {
    std::atomic<int> waiting{8};
    void* contexts[8] = {};
    std::vector<std::thread> threads;
    for (void*& context : contexts) {
      threads.emplace_back([&waiting, &context] {
        for (--waiting; waiting > 0;) std::this_thread::yield();
        EXPECT_EQ(initQelCrypto(&context), 0);
      });
    }
    for (std::thread& thread : threads) thread.join();
    for (const void* context : contexts) EXPECT_EQ(context, qelCtxGlobal);
  });
  std::map<std::string, long> steps;
  std::istringstream lines(log);
  for (std::string line; std::getline(lines, line);) ++steps[line];
  const long made = steps["Init /toolkit"], kept = kEnd == "closed\n" ? 1 : 0;
  const std::map<std::string, long> expected = {
      {"Attach", made},        {"Cleanup", made - kept},      {"Init /toolkit", made},
      {"SetValue 0 on", made}, {"SetValue 1 /toolkit", made}, {"closed", 1}};
  EXPECT_EQ(steps, expected) << "of those that are made at once, all but one are cleaned up at once";
  EXPECT_EQ(log.substr(log.size() - kEnd.size()), kEnd);
}

TEST(ProviderContext, ServesAtExitWhileAnotherThreadWorksAndNoNewOneIsMade) {
  const std::string log = staged("complete", nullptr, [] {
    std::atexit([] {  // comes after the library's own handler
      void* context = nullptr;
      const bool serves = initQelCrypto(&context) == 0 && context == qelCtxGlobal;
      const TraceCapture trace(TraceCapture::kLinesOnly);
      qelCtxGlobal = nullptr;
      const bool isRefused = initQelCrypto(&context) == 1;
      const std::string line = trace.messages().empty() ? "" : trace.messages().back();
      _exit(serves && isRefused && line == "Error - initQelCrypto: the process is exiting. rc = 1\n" ? 0 : 1);
    });
    void* context = nullptr;
    EXPECT_EQ(initQelCrypto(&context), 0);
    std::thread([] { pause(); }).detach();
  });
  EXPECT_EQ(log, kCreation);
}

TEST(ProviderContext, IsMadeOverOneLibraryAndReleasedOnceHoweverOftenThatIsUnloaded) {
  const std::string log = staged("complete", nullptr, [] {
    void* context = nullptr;
    char* attachPath = nullptr;
    EXPECT_EQ(initQelCrypto(&context), 0);
    qelLibraryName = "not_there.so";  // not opened any more
    void** cell = qelLoadGlobal;
    EXPECT_EQ(loadQelCrypto(&attachPath), 0);
    EXPECT_EQ(test::taken(attachPath), "/toolkit");
    EXPECT_EQ(freeQelCrypto(nullptr), 0);
    EXPECT_EQ(freeQelCrypto(context), 0);
    unloadQelCrypto();
    unloadQelCrypto();
    EXPECT_EQ(qelLoadGlobal, cell);  // stays as it is, as do the context and the table
    EXPECT_EQ(qelCtxGlobal, context);
    EXPECT_NE(pQEL_Init, nullptr);
  });
  EXPECT_EQ(log, kCreation + "Cleanup\nCleanup again\nclosed\n");
}

// A fork waits for a thread that sets the provider up, but not for ever, since that may wait for who forks.
TEST(ProviderContext, IsMadeInAChildWhereTheParentsIsHalfDone) {
  staged("complete", nullptr, [] {
    setenv("STANDIN_WAITS", "goes_on", 1);
    std::thread user([] {
      void* context = nullptr;
      EXPECT_EQ(initQelCrypto(&context), 0);
    });
    const auto log = [] { return test::fileContent(getenv("STANDIN_LOG")); };
    while (log().empty()) usleep(100);  // of Init
    const pid_t child = fork();
    test::putFile("goes_on", "");
    if (child == 0) {
      void* context = nullptr;
      alarm(20);
      _exit(initQelCrypto(&context));
    }
    int status = -1;
    EXPECT_TRUE(waitpid(child, &status, 0) == child && status == 0) << status;
    user.join();
  });
}

TEST(ProviderContext, UnloadingClosesANewLibraryInTheOldCell) {
  const std::string log = staged("complete", nullptr, [] {
    void* context = nullptr;
    EXPECT_EQ(initQelCrypto(&context), 0);
    unloadQelCrypto();
    qelCtxGlobal = nullptr;
    qelLoadGlobal = ldapLoadLib(qelLibraryName, 0);  // malloc gives the cell's address again, as a rule
    unloadQelCrypto();
  });
  EXPECT_EQ(log, kCreation + "Cleanup\nclosed\nclosed\n");
}

TEST(ProviderContext, FailuresLeaveItAbsentAndMayBeRetried) {
  const std::string log = staged("complete", nullptr, [] {
    char untouched = 0;
    void* context = &untouched;
    const TraceCapture trace(TraceCapture::kLinesOnly);
    failingPutEnvVar = 1;
    EXPECT_EQ(initQelCrypto(&context), 7);
    setenv("STANDIN_FAILS", "1", 1);
    EXPECT_EQ(initQelCrypto(&context), 1);
    EXPECT_EQ(context, &untouched);
    EXPECT_EQ(qelCtxGlobal, nullptr);
    unsetenv("STANDIN_FAILS");
    EXPECT_EQ(initQelCrypto(&context), 0);
    EXPECT_EQ(context, qelCtxGlobal);
    const Lines expected = {"Error - loadQelCrypto: putEnvVar failed rc = 7\n",
                            "Error - initQelCrypto: loadQelCrypto() failed. \n", kToolkit,
                            "Error - initQelCrypto: QEL_Init() returned NULL context. rc = 1\n", kToolkit};
    EXPECT_EQ(trace.messages(), expected);
    test::expectErrorClasses(trace);
  });
  EXPECT_EQ(log, "Init /toolkit\n" + kCreation + kEnd);
  staged(nullptr, "nopath", [] {  // too old to be resolved
    void* context = nullptr;
    EXPECT_EQ(initQelCrypto(&context), 1);
    EXPECT_EQ(context, nullptr);
  });
}

char provider;
QelStatus known;

TEST(ProviderStatus, MapsToAnLdapCodeAndShowsItselfGivenOrAskedFor) {
  const std::string longest(sizeof known.desc, 'x');
  const struct {
    int major, minor, rc;
    std::string description, output;
  } rows[] = {
      {0, 15, 0, "unseen", ""},
      {3, 14, 1, "what happened", "QEL Status - \nmajRC: 3\nminRC: 14\ndesc: what happened\n"},
      {-1, 16, 1, "", "QEL Status - \nmajRC: -1\nminRC: 16\ndesc: \n"},
      {1, 15, 90, longest, "QEL Status - \nmajRC: 1\nminRC: 15\ndesc: " + longest + "\n"},
  };
  const test::Replaced asked(
      pQEL_GetStatus, +[](void* context, QelStatus* status) {
        EXPECT_EQ(context, &provider);
        EXPECT_EQ(test::toHex(status, sizeof *status), std::string(536, '0'));
        return *status = known, 0;
      });
  for (const auto& row : rows) {
    known = {row.major, row.minor, ""};
    row.description.copy(known.desc, sizeof known.desc);
    testing::internal::CaptureStdout();
    EXPECT_EQ(qelStatusToLdap(nullptr, &known), row.rc);
    EXPECT_EQ(qelStatusToLdap(&provider, nullptr), row.rc);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), row.output + row.output);
  }
}

}  // namespace
