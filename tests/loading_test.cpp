// SPDX-License-Identifier: Apache-2.0
// Finding, loading and unloading the provider, and its one context. That leaves process-wide state behind, so each case
// runs in a child process, over stand-in providers that tell what was called.
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <atomic>
#include <functional>
#include <sstream>
#include <thread>

#include "crypto_provider.h"
#include "dsutil.h"
#include "failures.h"
#include "support.h"

namespace {

using test::AllocationWatch;
using test::Record;
using test::TempFolder;
using test::TraceCapture;

std::string installFolder;  // empty: cannot be told
int failingPutEnvVar = 0;   // the number of the call that fails, from 1

}  // namespace

// In place of those of the utility library.
extern "C" char* getKUBInstallLibPath(void) {
  return installFolder.empty() ? nullptr : strdup(installFolder.c_str());
}

extern "C" int putEnvVar(const char* name, const char* value) {
  return --failingPutEnvVar == 0 ? 7 : setenv(name, value, 1);
}

namespace {

// clang-format off
#define LDAPPW_ENTRIES(X) \
  X(GetStatus) X(SetValue) X(GetValue) X(Init) X(Attach) X(Cleanup) X(EVP_get_cipherbyname) X(EVP_get_digestbyname) \
  X(EVP_MD_CTX_new) X(EVP_MD_CTX_free) X(EVP_MD_CTX_init) X(EVP_MD_CTX_cleanup) X(EVP_MD_block_size) X(EVP_MD_size) \
  X(EVP_DigestInit) X(EVP_DigestUpdate) X(EVP_DigestFinal) X(EVP_CIPHER_CTX_new) X(EVP_CIPHER_CTX_free) \
  X(EVP_CIPHER_CTX_init) X(EVP_CIPHER_CTX_cleanup) X(EVP_CIPHER_CTX_set_key_length) X(EVP_CIPHER_CTX_set_padding) \
  X(EVP_CIPHER_block_size) X(EVP_CIPHER_key_length) X(EVP_CIPHER_iv_length) X(EVP_EncryptInit) X(EVP_EncryptUpdate) \
  X(EVP_EncryptFinal) X(EVP_DecryptInit) X(EVP_DecryptUpdate) X(EVP_DecryptFinal) X(EVP_CIPHER_CTX_cipher) \
  X(RAND_bytes) X(RAND_seed) X(GenerateRandomSeed)
// clang-format on

// The number of entries, from the first on, that hold the open library's symbol; the rest must be null.
int resolvedEntries() {
  const struct {
    const char* symbol;
    void* address;
  } table[] = {
#define LDAPPW_ROW(operation) {"QEL_" #operation, reinterpret_cast<void*>(pQEL_##operation)},
      LDAPPW_ENTRIES(LDAPPW_ROW)
#undef LDAPPW_ROW
  };
  int resolved = 0;
  bool ended = false;
  for (const auto& entry : table) {
    ended = ended || entry.address == nullptr;
    if (ended) {
      EXPECT_EQ(entry.address, nullptr) << entry.symbol;
    } else {
      EXPECT_EQ(entry.address, dlsym(*qelLoadGlobal, entry.symbol)) << entry.symbol;
      ++resolved;
    }
  }
  return resolved;
}

void inChild(const std::function<void()>& body) {
  std::fflush(nullptr);
  const pid_t child = fork();
  if (child == 0) {
    body();
    std::exit(testing::Test::HasFailure() ? 1 : 0);
  }
  int status = -1;
  EXPECT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
}

// An install tree and a folder with the system's copy, each with the stand-in asked for or none.
class Stage {
 public:
  Stage(const char* system, const char* shipped) {
    namespace fs = std::filesystem;
    fs::create_directories(folder_.file("install/qel/qellib"));
    fs::create_directories(folder_.file("system"));
    if (system != nullptr) fs::create_symlink(standIn(system), folder_.file("system/libtresk7qels.so"));
    if (shipped != nullptr) fs::create_symlink(standIn(shipped), folder_.file("install/qel/qellib/libtresk7qels.so"));
  }
  // In the child: the loader finds the system's copy in the current folder.
  void enter() const {
    installFolder = install();
    std::filesystem::current_path(folder_.file("system"));
    qelLibraryName = "./libtresk7qels.so";
    setenv("TRESK_LOCAL_INSTALL_MODE", "1", 1);
    setenv("STANDIN_LOG", folder_.file("log").c_str(), 1);
    setenv("STANDIN_PATH", "/toolkit", 1);
  }
  std::string install() const { return folder_.file("install"); }
  std::string log() const { return test::fileContent(folder_.file("log")); }

 private:
  static std::string standIn(const char* kind) { return LDAPPW_STANDINS "/standin_" + std::string(kind) + ".so"; }
  TempFolder folder_;
};

// The lines but those of entering and leaving, each with its class, E or D, before it.
std::vector<std::string> classedLines(const TraceCapture& trace) {
  std::vector<std::string> lines;
  for (const Record& r : trace.records()) {
    const bool usual =
        r.text.find(": Entering.") != std::string::npos || r.text.find(": Leaving.") != std::string::npos;
    if (r.kind == LDTR_LINE && !usual) lines.push_back((r.severity == LDTR_ERROR ? "E " : "D ") + r.text);
  }
  return lines;
}

std::string withInstallFolder(std::string text) {
  for (size_t at = text.find('@'); at != std::string::npos; at = text.find('@')) text.replace(at, 1, installFolder);
  return text;
}

// ---- Loading ----

constexpr char kHint[] = "E Error - Check the supported version of TRESK in the install guide.\n";
constexpr char kShipped[] = "D loadQelCrypto: Loading shipped version of qel library.\n";
constexpr char kNoStatus[] = "E Error - loadQelCrypto: ldapGetSymAddress(pQEL_GetStatus) failed.\n";
constexpr char kToolkit[] = "D loadQelCrypto:- qelAttachPath = /toolkit\n";

enum Lacking : int { kInstallFolder = -1, kNone = 0, kFirstVariable = 1, kSecondVariable = 2 };

struct Loading {
  const char* name;
  const char *system, *shipped;  // stand-ins
  const char* reported;          // null: the path operation fails
  Lacking lacking;
  long failingAllocation;
  int rc;
  const char* copyVariable;
  const char* attachPath;  // @ is the install folder
  bool open;
  int entries;
  std::vector<std::string> lines;
};

// clang-format off
const Loading kLoadings[] = {
    {"the system's copy", "complete", "complete", "/toolkit", kNone, -1,
     0, "FALSE", "/toolkit", true, 36, {kToolkit}},
    {"the shipped copy", nullptr, "complete", "/toolkit", kNone, -1,
     0, "TRUE", "/toolkit", true, 36, {kToolkit}},
    {"attached above the shipped folder", nullptr, "complete", "@/qel", kNone, -1,
     0, "TRUE", "@", true, 36, {"D loadQelCrypto:- qelAttachPath = @/qel\n"}},
    {"not quite the shipped folder", nullptr, "complete", "@/qel/", kNone, -1,
     0, "TRUE", "@/qel/", true, 36, {"D loadQelCrypto:- qelAttachPath = @/qel/\n"}},
    {"an old system copy", "nopath", "complete", "/toolkit", kNone, -1,
     0, "TRUE", "/toolkit", true, 36, {kHint, kShipped, kToolkit}},
    {"an old system copy alone", "nopath", nullptr, "/toolkit", kNone, -1,
     1, "TRUE", nullptr, false, 0, {kHint, kShipped, kNoStatus}},
    {"an old shipped copy succeeds unresolved", nullptr, "nopath", "/toolkit", kNone, -1,
     0, "TRUE", nullptr, true, 0, {"E Error - loadQelCrypto: ldapGetSymAddress(pQEL_PATH) failed.\n", kHint}},
    {"no copy", nullptr, nullptr, "/toolkit", kNone, -1,
     1, "TRUE", nullptr, false, 0, {kNoStatus}},
    {"an entry lacking", "noseed", nullptr, "/toolkit", kNone, -1, 1, "FALSE", "/toolkit", true, 35,
     {kToolkit, "E Error - loadQelCrypto: ldapGetSymAddress(pQEL_GenerateRandomSeed) failed.\n"}},
    {"no path", "complete", nullptr, nullptr, kNone, -1,
     1, "FALSE", "", true, 0, {"E Error - loadQelCrypto: pQEL_PATH failed to get QEL library path.\n"}},
    {"no install folder", "complete", nullptr, "/toolkit", kInstallFolder, -1,
     1, "FALSE", "/toolkit", true, 0, {kToolkit, "E Error - loadQelCrypto: getKUBInstallLibPath failed.\n"}},
    {"no install folder to look in", nullptr, nullptr, "/toolkit", kInstallFolder, -1,
     1, "TRUE", nullptr, false, 0,
     {"E Error - getKubInstallLibPath: getKUBInstallLibPath() failed. \n", kNoStatus}},
    {"the first variable", "complete", nullptr, "/toolkit", kFirstVariable, -1,
     7, nullptr, nullptr, false, 0, {"E Error - loadQelCrypto: putEnvVar failed rc = 7\n"}},
    {"the second variable", nullptr, "complete", "/toolkit", kSecondVariable, -1,
     7, "FALSE", nullptr, false, 0, {"E Error - loadQelCrypto: putEnvVar failed rc = 7\n"}},
    {"no memory for the system path", "complete", nullptr, "/toolkit", kNone, 0,
     1, "FALSE", nullptr, false, 0, {"D  Memory allocation failed ! \n", kNoStatus}},
    {"no memory for the system cell", "complete", "complete", "/toolkit", kNone, 1,
     0, "TRUE", "/toolkit", true, 36, {kToolkit}},
    {"no memory for the attach path", "complete", nullptr, "/toolkit", kNone, 2,
     90, "FALSE", nullptr, true, 0, {"E Error - loadQelCrypto: Out of Memory!.\n"}},
    {"no memory for the shipped path", nullptr, "complete", "/toolkit", kNone, 3,
     1, "TRUE", nullptr, false, 0,
     {"E Error - getKubInstallLibPath: kub_strlcat() failed. \n", kNoStatus}},
};
// clang-format on

void load(const Loading& row) {
  if (row.lacking == kInstallFolder) installFolder.clear();
  if (row.reported == nullptr) unsetenv("STANDIN_PATH");
  if (row.reported != nullptr) setenv("STANDIN_PATH", withInstallFolder(row.reported).c_str(), 1);
  unsetenv("TRESK_SHIPPED_QEL");
  failingPutEnvVar = row.lacking;
  char* attachPath = nullptr;
  const TraceCapture trace;
  {
    const AllocationWatch watch(row.failingAllocation);
    EXPECT_EQ(loadQelCrypto(&attachPath), row.rc);
  }
  const char* variable = getenv("TRESK_SHIPPED_QEL");
  EXPECT_STREQ(variable, row.copyVariable);
  ASSERT_EQ(attachPath == nullptr, row.attachPath == nullptr);
  if (attachPath != nullptr) {
    std::string whole = withInstallFolder(row.attachPath);
    whole.resize(1024);
    EXPECT_EQ(std::string(attachPath, 1024), whole);
  }
  free(attachPath);
  ASSERT_EQ(qelLoadGlobal != nullptr, row.open);
  EXPECT_EQ(resolvedEntries(), row.entries);
  std::vector<std::string> expected;
  for (const std::string& line : row.lines) expected.push_back(withInstallFolder(line));
  EXPECT_EQ(classedLines(trace), expected);
  unloadQelCrypto();
}

TEST(ProviderLoading, FindsACopyOrTellsWhatIsWrong) {
  for (const Loading& row : kLoadings) {
    SCOPED_TRACE(row.name);
    const Stage stage(row.system, row.shipped);
    inChild([&] {
      stage.enter();
      load(row);
    });
  }
}

TEST(ProviderLoading, LooksInTheseFiles) {
  const struct {
    const char* mode;
    std::string lines;
  } rows[] = {{nullptr, "/usr/lib/libtresk7qels.so@/qel/qellib/libtresk7qels.so"},
              {"", "/usr/lib/libtresk7qels.so@/qel/qellib/libtresk7qels.so"},
              {"1", "libtresk7qels.so@/qel/qellib/libtresk7qels.so"}};
  for (const auto& row : rows) {
    const Stage stage(nullptr, nullptr);
    inChild([&] {
      stage.enter();
      qelLibraryName = "libtresk7qels.so";
      unsetenv("TRESK_LOCAL_INSTALL_MODE");
      if (row.mode != nullptr) setenv("TRESK_LOCAL_INSTALL_MODE", row.mode, 1);
      testing::internal::CaptureStderr();
      set_ldap_debug(1);
      char* attachPath = nullptr;
      EXPECT_EQ(loadQelCrypto(&attachPath), 1);
      std::istringstream log(testing::internal::GetCapturedStderr());
      std::string files;
      for (std::string line; std::getline(log, line);) {
        const std::string start = "c8110000 dlopen failed for ";
        EXPECT_EQ(line.rfind(start, 0), 0U) << line;
        files += line.substr(start.size(), line.find(": ") - start.size());
      }
      EXPECT_EQ(files, withInstallFolder(row.lines));
    });
  }
}

TEST(ProviderLoading, RefusesANullSlotAndUsesAnOpenLibraryAgain) {
  const Stage stage("complete", nullptr);
  inChild([&] {
    stage.enter();
    {
      const TraceCapture trace;
      EXPECT_EQ(loadQelCrypto(nullptr), 1);
      EXPECT_EQ(classedLines(trace), std::vector<std::string>{"E Error - loadQelCrypto: Invalid parameter. rc = 1\n"});
    }
    unsetenv("STANDIN_PATH");
    char* attachPath = nullptr;
    EXPECT_EQ(loadQelCrypto(&attachPath), 1);
    free(attachPath);
    setenv("STANDIN_PATH", "/toolkit", 1);
    qelLibraryName = "not_there.so";  // not opened any more
    void** cell = qelLoadGlobal;
    EXPECT_EQ(loadQelCrypto(&attachPath), 0);
    EXPECT_EQ(qelLoadGlobal, cell);
    EXPECT_STREQ(attachPath, "/toolkit");
    free(attachPath);
    unloadQelCrypto();
    EXPECT_EQ(qelLoadGlobal, cell);  // stays as it is, as does the table
    EXPECT_NE(pQEL_Init, nullptr);
  });
  EXPECT_EQ(stage.log(), "closed\n");
}

// ---- The one context ----

constexpr char kCreation[] = "Init /toolkit\nSetValue 1 /toolkit\nSetValue 0 on\nAttach\n";

TEST(ProviderContext, IsMadeOnceAndCleanedUpAtExit) {
  const Stage stage("complete", nullptr);
  inChild([&] {
    stage.enter();
    void* first = nullptr;
    void* second = nullptr;
    EXPECT_EQ(initQelCrypto(&first), 0);
    qelLibraryName = "not_there.so";
    EXPECT_EQ(initQelCrypto(&second), 0);
    EXPECT_NE(first, nullptr);
    EXPECT_EQ(first, second);
    EXPECT_EQ(first, qelCtxGlobal);
    EXPECT_EQ(stage.log(), kCreation);
  });
  EXPECT_EQ(stage.log(), std::string(kCreation) + "Cleanup\nclosed\n");
}

TEST(ProviderContext, IsReleasedOnceHoweverOftenItIsUnloaded) {
  const Stage stage("complete", nullptr);
  inChild([&] {
    stage.enter();
    void* context = nullptr;
    EXPECT_EQ(initQelCrypto(&context), 0);
    EXPECT_EQ(freeQelCrypto(nullptr), 0);
    EXPECT_EQ(freeQelCrypto(context), 0);
    EXPECT_EQ(qelCtxGlobal, context);
    unloadQelCrypto();
    unloadQelCrypto();
  });
  EXPECT_EQ(stage.log(), std::string(kCreation) + "Cleanup\nCleanup\nclosed\n");
}

TEST(ProviderContext, FailuresLeaveItAbsentAndMayBeRetried) {
  const Stage stage("complete", nullptr);
  inChild([&] {
    stage.enter();
    char untouched = 0;
    void* context = &untouched;
    const TraceCapture trace(TraceCapture::kLinesOnly);
    EXPECT_EQ(initQelCrypto(nullptr), 1);
    failingPutEnvVar = 1;
    EXPECT_EQ(initQelCrypto(&context), 7);
    setenv("STANDIN_FAILS", "1", 1);
    EXPECT_EQ(initQelCrypto(&context), 1);
    EXPECT_EQ(context, &untouched);
    EXPECT_EQ(qelCtxGlobal, nullptr);
    EXPECT_NE(qelLoadGlobal, nullptr);
    unsetenv("STANDIN_FAILS");
    EXPECT_EQ(initQelCrypto(&context), 0);
    EXPECT_EQ(context, qelCtxGlobal);
    const std::vector<std::string> expected = {"E Error - initQelCrypto: Invalid parameter. rc = 1\n",
                                               "E Error - loadQelCrypto: putEnvVar failed rc = 7\n",
                                               "E Error - initQelCrypto: loadQelCrypto() failed. \n",
                                               kToolkit,
                                               "E Error - initQelCrypto: QEL_Init() returned NULL context. rc = 1\n",
                                               kToolkit};
    EXPECT_EQ(classedLines(trace), expected);
  });
  EXPECT_EQ(stage.log(), "Init /toolkit\n" + std::string(kCreation) + "Cleanup\nclosed\n");
}

TEST(ProviderContext, CannotComeFromAProviderTooOldToBeResolved) {
  const Stage stage(nullptr, "nopath");
  inChild([&] {
    stage.enter();
    void* context = nullptr;
    EXPECT_EQ(initQelCrypto(&context), 1);
    EXPECT_EQ(context, nullptr);
  });
}

TEST(ProviderContext, IsOneForThreadsThatAskAtOnce) {
  const Stage stage("complete", nullptr);
  inChild([&] {
    stage.enter();
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
  EXPECT_EQ(stage.log(), std::string(kCreation) + "Cleanup\nclosed\n");
}

TEST(ProviderContext, TracesTheLoadingInsideItsOwnScope) {
  static const struct {
    unsigned events;
    const char* outline;
  } rows[] = {
      {0x4010000,
       ">initQelCrypto: Entering. qelCtx = #\n>loadQelCrypto: Entering. attachPath = #\n"
       ">getQelInstallLibPath: Entering.\ngetQelInstallLibPath: Leaving. rc = 0\n<"
       "loadQelCrypto:- qelAttachPath = /toolkit\nloadQelCrypto: Leaving. rc = 0\n<initQelCrypto: Leaving. rc = 0\n<"},
      {0x10000, ">>><<<"},
      {0xfbfeffff, ""}};
  for (const auto& row : rows) {
    const Stage stage("complete", nullptr);
    inChild([&] {
      stage.enter();
      void* context = nullptr;
      const TraceCapture trace(row.events);
      EXPECT_EQ(initQelCrypto(&context), 0);
      EXPECT_EQ(test::outlineOf(trace), row.outline);
      for (const Record& r : trace.records()) {
        EXPECT_TRUE((r.id & 0xffff00ffU) == 0x50010000U && r.level == 43 && r.mask == 0x10000) << r.text;
      }
    });
  }
}

}  // namespace
