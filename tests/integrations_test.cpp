// SPDX-License-Identifier: Apache-2.0
// The plug-ins of directory servers without a server: what they share, and the built files in a host that stands in for
// slapd and for 389. Each host runs in a process of its own, since a plug-in starts once.
#include <dlfcn.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <lber.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdarg>
#include <cstring>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "key_file.h"
#include "passwords.h"

namespace {

const char* swappedIn = nullptr;  // takes the place of swappedOut as soon as an open file is looked at
const char* swappedOut = nullptr;

using plugin::kSchemes;
using plugin::Scheme;

const plugin::Library& library() {
  static const plugin::Library opened = [] {
    plugin::Library made{};
    const char* problem = "";
    EXPECT_TRUE(plugin::openLibrary(made, problem));
    EXPECT_STREQ(problem, "");
    return made;
  }();
  return opened;
}

// A key file made with the library, and its content.
struct Keys {
  Keys() {
    void* handle = dlopen("libldappw.so.1", RTLD_NOW | RTLD_LOCAL);
    const auto restore = reinterpret_cast<decltype(&restoreKeyStashFile)>(dlsym(handle, "restoreKeyStashFile"));
    EXPECT_EQ(restore(path.c_str(), "aSeedThatNobodyKnows", "0123456789ab"), 0);
    std::ifstream file(path, std::ios::binary);
    content.assign(std::istreambuf_iterator<char>(file), {});
    plugin::KeyReport report;
    data = plugin::loadKeyFile(library(), path.c_str(), report);
    EXPECT_STREQ(report.problem, "");
  }
  ~Keys() { library().freeKeys(data); }
  std::string path = testing::TempDir() + "integrations.stash";
  std::string content;
  AesKeyData* data = nullptr;
};

const Keys& keys() {
  static const Keys made;
  return made;
}

// The value of a password, or "refused: " and why.
std::string make(const Scheme& scheme, const std::string& password, AesKeyData* data) {
  const char* problem = nullptr;
  char* value = plugin::makeValue(library(), scheme, data, password, std::malloc, problem);
  const std::string result = value != nullptr ? value : std::string("refused: ") + problem;
  std::free(value);
  return result;
}

bool matches(const Scheme& scheme, const std::string& payload, const std::string& password) {
  return plugin::matches(scheme, {library(), keys().data, payload, password});
}

TEST(Passwords, NothingButThePasswordMatches) {
  const std::string password = "Horse 7";
  for (const Scheme& scheme : kSchemes) {
    SCOPED_TRACE(scheme.tag);
    const std::string value = make(scheme, password, keys().data);
    if (scheme.matches == nullptr) {
      EXPECT_EQ(value, "refused: values of this scheme cannot be made");
      EXPECT_FALSE(matches(scheme, password, password));
      continue;
    }
    const std::string payload = value.substr(std::string(scheme.tag).size());
    EXPECT_TRUE(matches(scheme, payload, password));
    for (const std::string& wrong : {std::string("Horse 8"), password + "x", password + '\0', password + '\0' + 'x',
                                     std::string(), value, payload, std::string(scheme.tag)}) {
      EXPECT_FALSE(matches(scheme, payload, wrong)) << wrong;
    }
    for (size_t at = 0; at < payload.size(); ++at) {
      const std::string cut = payload.substr(0, at);
      std::string damaged = payload;
      damaged[at] = '\0';
      EXPECT_FALSE(matches(scheme, cut, password) || matches(scheme, cut, cut)) << at;
      EXPECT_FALSE(matches(scheme, damaged, password) || matches(scheme, damaged, cut)) << at;
      damaged[at] = '!';
      EXPECT_FALSE(matches(scheme, damaged, password) || matches(scheme, damaged, damaged)) << at;
    }
    EXPECT_FALSE(matches(scheme, "", scheme.tag));
  }
}

TEST(Passwords, ADigestIsNoPassword) {
  // SHA-1 of "abc" (FIPS 180-1, appendix A), in base64 and as it is.
  const std::string raw = "\xa9\x99\x3e\x36\x47\x06\x81\x6a\xba\x3e\x25\x71\x78\x50\xc2\x6c\x9c\xd0\xd8\x9d";
  const std::string payload = "qZk+NkcGgWq6PiVxeFDCbJzQ2J0=";
  const Scheme& sha = kSchemes[plugin::kSha];
  EXPECT_TRUE(matches(sha, payload, "abc"));
  EXPECT_FALSE(matches(sha, payload, "{SHA}" + raw) || matches(sha, payload, "{sha}" + payload));
  EXPECT_EQ(make(sha, "{sHa}x", nullptr), "refused: this scheme takes no password that begins with its own tag");
}

TEST(Passwords, WhatASchemeHolds) {
  const struct {
    plugin::SchemeIndex scheme;
    std::string password;
    const char* problem;
  } rows[] = {
      {plugin::kQveil, std::string(46, 'q'), ""},
      {plugin::kQveil, std::string(47, 'q'), "refused: the password is longer than this scheme holds"},
      {plugin::kQveil, std::string("a\0b", 3), "refused: this scheme takes no password with a NUL byte"},
      {plugin::kCrypt, "12345678", ""},
      {plugin::kCrypt, "123456789", "refused: the password is longer than this scheme holds"},
      {plugin::kSsha, std::string("a\0b", 3), "refused: this scheme takes no password with a NUL byte"},
      {plugin::kAes128, std::string("a\0b", 3), ""},
      {plugin::kAes192, "", ""},
      {plugin::kAes256, std::string(100000, 'l'), ""},
  };
  for (const auto& row : rows) {
    const Scheme& scheme = kSchemes[row.scheme];
    const std::string value = make(scheme, row.password, keys().data);
    const std::string payload = value.substr(std::string(scheme.tag).size());
    if (*row.problem != '\0') {
      EXPECT_EQ(value, row.problem);
    } else {
      EXPECT_TRUE(matches(scheme, payload, row.password)) << scheme.tag;
    }
  }
  // A masked text without its terminator, or with one inside, is damaged.
  void* handle = dlopen("libldappw.so.1", RTLD_NOW | RTLD_LOCAL);
  const auto mask =
      reinterpret_cast<decltype(&_morva_utils_encode_binary)>(dlsym(handle, "_morva_utils_encode_binary"));
  for (const std::string& bytes : {std::string("cow"), std::string("cow\0x\0", 6), std::string("cow\0", 4)}) {
    char* payload = nullptr;
    ASSERT_EQ(mask(reinterpret_cast<const unsigned char*>(bytes.data()), static_cast<int>(bytes.size()), &payload), 0);
    EXPECT_EQ(matches(kSchemes[plugin::kQveil], payload, "cow"), bytes.size() == 4);
    std::free(payload);
  }
  // A value that was cut when it was made keeps its password.
  const std::string cut = make(kSchemes[plugin::kQveil], std::string(46, 'q'), nullptr).substr(7);
  EXPECT_TRUE(matches(kSchemes[plugin::kQveil], cut, std::string(60, 'q')));
  EXPECT_EQ(make(kSchemes[plugin::kAes256], "x", nullptr), "refused: the server has no keys for this scheme");
}

TEST(KeyFile, WhatTheLogSays) {
  const std::string& good = keys().content;
  const auto with = [&good](size_t at, const std::string& bytes) {
    return std::string(good).replace(at, bytes.size(), bytes);
  };
  const struct {
    std::string content;
    mode_t mode;
    std::string problem;
    std::string warning;
  } rows[] = {
      {good + "more", 0600, "", ""},
      {good, 0640, "", ": open to other users (mode 0640); its mode should be 0600"},
      {"", 0600, ": the file is empty", ""},
      {good.substr(0, good.size() - 1), 0600, ": not a whole key stash file", ""},
      {std::string(4, '\0') + good.substr(good.size() - 84), 0600, ": not a whole key stash file", ""},
      {with(0, "\xff\xff\xff\xff"), 0600, ": not a whole key stash file", ""},
      {with(5, "\x80"), 0600, ": not a whole key stash file", ""},                        // the sync text
      {with(good.size() - 84, " "), 0600, ": not a whole key stash file", ""},            // the salt
      {with(good.size() - 72, "not the key"), 0600, ": not a whole key stash file", ""},  // a key
  };
  const std::string path = testing::TempDir() + "integrations.tried";
  for (const auto& row : rows) {
    std::ofstream(path, std::ios::binary) << row.content;
    ASSERT_EQ(chmod(path.c_str(), row.mode), 0);
    plugin::KeyReport report;
    AesKeyData* data = plugin::loadKeyFile(library(), path.c_str(), report);
    const std::string begin = "key file " + path;
    EXPECT_EQ(report.problem, row.problem.empty() ? "" : begin + row.problem);
    EXPECT_EQ(report.warning, row.warning.empty() ? "" : begin + row.warning);
    EXPECT_EQ(data != nullptr, row.problem.empty());
    library().freeKeys(data);
  }
}

// What comes into a key file's place while it is loaded is not what was looked at, and a file that claims to be a long
// one is not read.
TEST(KeyFile, IsOpenedOnceAndReadNoFurtherThanAKeyFileGoes) {
  const std::string path = testing::TempDir() + "integrations.first";
  const std::string other = testing::TempDir() + "integrations.second";
  const std::string& good = keys().content;
  std::ofstream(path, std::ios::binary) << good;
  std::ofstream(other, std::ios::binary) << std::string(good).replace(good.size() - 84, 1, "X");
  ASSERT_EQ(chmod(path.c_str(), 0600), 0);
  swappedIn = other.c_str();
  swappedOut = path.c_str();
  plugin::KeyReport report;
  AesKeyData* data = plugin::loadKeyFile(library(), path.c_str(), report);
  ASSERT_EQ(swappedIn, nullptr);
  ASSERT_STREQ(report.problem, "");
  EXPECT_STREQ(reinterpret_cast<char*>(data->cryptoSalt.data), "0123456789ab");
  library().freeKeys(data);

  constexpr off_t kSparse = off_t{6} << 30;
  std::ofstream(path, std::ios::binary) << "\xff\xff\xff\x6f";  // the length of a sync text
  ASSERT_EQ(truncate(path.c_str(), kSparse), 0);
  EXPECT_EQ(plugin::loadKeyFile(library(), path.c_str(), report), nullptr);
  EXPECT_EQ(report.problem, "key file " + path + ": not a whole key stash file");
  rusage used{};
  ASSERT_EQ(getrusage(RUSAGE_SELF, &used), 0);
  EXPECT_LT(used.ru_maxrss, 1 << 20);  // KiB
  unlink(path.c_str());
}

// ---- slapd ----

std::string registered;  // the names, in their order

void* openPlugin(const char* path) {
  void* handle = dlopen(path, RTLD_NOW | RTLD_GLOBAL);
  if (handle == nullptr) std::fprintf(stderr, "%s\n", dlerror());
  return handle;
}

// Loads the module as slapd does, and ends.
[[noreturn]] void runSlapd(std::vector<std::string> arguments) {
  alarm(60);
  void* handle = openPlugin(LDAPPW_SLAPD_MODULE);
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  const auto start = reinterpret_cast<int (*)(int, char**)>(dlsym(handle, "init_module"));
  const int started = start(static_cast<int>(argv.size()), argv.data());
  std::fprintf(stderr, "%s", registered.c_str());
  reinterpret_cast<int (*)()>(dlsym(handle, "term_module"))();
  std::exit(started == 0 ? 0 : 1);
}

TEST(SlapdDeathTest, RegistersWhatItsArgumentsSay) {
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  const std::string file = "keys=" + keys().path;
  const struct {
    std::vector<std::string> arguments;
    int code;
    const char* said;
  } rows[] = {
      {{file}, 0, "^\\[.qVEIL.\\]\\[.AES128.\\]\\[.AES192.\\]\\[.AES256.\\]\\[.VLDL.\\]$"},
      {{file, "schemes=SSHA,{crypt},md5,"}, 0, "\\[.SSHA.\\]"},
      {{"keys=/"}, 0, "file /: Is a directory; no value of "},
      {{"schemes="}, 1, "unknown scheme \"\" in schemes="},
      {{"schemes=qveil", "schemes=sha"}, 1, "unknown or repeated argument \"schemes=sha\"; there are keys=FILE and"},
  };
  for (const auto& row : rows) EXPECT_EXIT(runSlapd(row.arguments), testing::ExitedWithCode(row.code), row.said);
}

// ---- 389 ----

#ifdef LDAPPW_389_PLUGIN
constexpr int kArgv = 6, kArgc = 7, kClose = 210, kEncode = 800, kCompare = 802, kName = 810;  // of slapi-plugin.h
std::map<int, void*> block;

using EntryPoint = int (*)(void*);

EntryPoint startEntry(void* handle, const char* entry, std::vector<char*>& argv) {
  block[kArgv] = argv.data();
  block[kArgc] = reinterpret_cast<void*>(argv.size());
  if (reinterpret_cast<EntryPoint>(dlsym(handle, entry))(&block) != 0) std::exit(1);
  return reinterpret_cast<EntryPoint>(block[kClose]);
}

// An entry that is named second is closed while values of the first are checked, as a server does that has been told to
// disable it.
[[noreturn]] void run389(const char* entry, std::vector<std::string> arguments, const char* disabled) {
  alarm(60);
  void* handle = openPlugin(LDAPPW_389_PLUGIN);
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  const EntryPoint closeOther = disabled == nullptr ? nullptr : startEntry(handle, disabled, argv);
  const EntryPoint close = startEntry(handle, entry, argv);
  char* value = reinterpret_cast<char* (*)(const char*)>(block[kEncode])("horse");
  const auto compare = reinterpret_cast<int (*)(const char*, const char*)>(block[kCompare]);
  const auto* name = static_cast<const char*>(block[kName]);
  const char* payload = value == nullptr ? "horse" : std::strchr(value, '}') + 1;
  std::atomic<bool> ends{false};
  std::atomic<int> checks{0};
  std::thread user([&] {
    for (; !ends; ++checks) compare("horse", payload);
  });
  while (checks < 10) std::this_thread::yield();
  if (closeOther != nullptr) closeOther(&block);
  std::fprintf(stderr, "[%s %s %d %d]\n", name, value == nullptr ? "none" : std::string(value, 6).c_str(),
               compare("horse", payload), compare(payload, payload));
  close(&block);
  ends = true;
  user.join();
  std::free(value);
  std::exit(0);
}

TEST(DirectoryServer389DeathTest, EachEntryPointIsAScheme) {
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  const std::string file = "keys=" + keys().path;
  const struct {
    const char* entry;
    std::vector<std::string> arguments;
    int code;
    const char* said;
    const char* disabled = nullptr;
  } rows[] = {
      {"ldappw_qveil_init", {}, 0, "^\\[qVEIL .qVEIL 0 -1\\]"},
      {"ldappw_aes128_init", {file}, 0, "^\\[AES128 .AES12 0 -1\\]"},
      {"ldappw_aes192_init", {file}, 0, "^\\[AES192 .AES19 0 -1\\]"},
      {"ldappw_aes256_init",
       {},
       0,
       "no key file is given \\(keys=FILE\\); no value of .AES256. (.|\n)*256 none -1 -1\\]"},
      {"ldappw_aes256_init", {file}, 0, "^\\[AES256 .AES25 0 -1\\]", "ldappw_aes128_init"},
      {"ldappw_vldl_init", {}, 0, "VLDL.: values of this scheme cannot be made\n\\[VLDL none -1 -1\\]"},
      {"ldappw_aes256_init", {file, file}, 1, "unknown or repeated argument \"keys=/.*\"; there is keys=FILE"},
  };
  for (const auto& row : rows)
    EXPECT_EXIT(run389(row.entry, row.arguments, row.disabled), testing::ExitedWithCode(row.code), row.said);
}
#endif

void print(const char* format, va_list arguments) {
  std::vfprintf(stderr, format, arguments);
}

}  // namespace

// What the servers give to their plug-ins.
#pragma GCC visibility push(default)
extern "C" {
int fstat(int fd, struct stat* found) noexcept {
  const int rc = fstatat(fd, "", found, AT_EMPTY_PATH);
  if (swappedIn != nullptr && std::rename(swappedIn, swappedOut) == 0) swappedIn = nullptr;
  return rc;
}
int lutil_passwd_add(berval* scheme, void*, void*) {
  registered += "[" + std::string(scheme->bv_val) + "]";
  return 0;
}
void lutil_debug(int, int, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  print(format, arguments);
  va_end(arguments);
}
#ifdef LDAPPW_389_PLUGIN
char* slapi_ch_malloc(unsigned long size) {
  return static_cast<char*>(std::malloc(size));
}
int slapi_log_error(int, char*, char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  print(format, arguments);
  va_end(arguments);
  return 0;
}
int slapi_pblock_get(void*, int parameter, void* value) {
  if (parameter == kArgc) *static_cast<int*>(value) = static_cast<int>(reinterpret_cast<intptr_t>(block[kArgc]));
  if (parameter == kArgv) *static_cast<void**>(value) = block[kArgv];
  return 0;
}
int slapi_pblock_set(void*, int parameter, void* value) {
  block[parameter] = value;
  return 0;
}
#endif
}
#pragma GCC visibility pop
