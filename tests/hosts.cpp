// SPDX-License-Identifier: Apache-2.0
// The built library in hosts that do what hosts do at the worst moment. Each case runs in a child process, in which
// nothing has been used before, and has a minute. The argument is how often those run that count on bad luck.
#include <dlfcn.h>
#include <openssl/opensslv.h>
#include <pthread.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <iterator>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "check.h"
#include "crypto_provider.h"
#include "ldtr.h"
#include "password_schemes.h"
#include "support.h"

extern "C" int bump_refuse(long number, int andLater) __attribute__((weak));  // of bump.c, where that is preloaded

namespace {

AesKeyData* newKeys() {
  AesKeyData* keys = nullptr;
  CHECK(initAesKeyData(&keys) == 0 && setCipherNameGlobal() == 0);
  return keys;
}

AesKeyData* const keys = newKeys();

// In an order of each caller's own.
void useEachScheme(unsigned first = 0) {
  static constexpr int kSchemes[] = {FORMAT_SSHA, FORMAT_AES256, FORMAT_CRYPT, FORMAT_QVEIL, FORMAT_MD5, FORMAT_SHA};
  char salt[] = "ab";
  const std::string password = "secret " + std::to_string(first), wrong = "Secret " + std::to_string(first);
  const int size = static_cast<int>(password.size());
  for (unsigned i = 0; i < std::size(kSchemes); ++i) {
    const int scheme = kSchemes[(first + i) % std::size(kSchemes)];
    char value[256];
    char* clear = nullptr;
    const int length = format_password(scheme, salt, keys, password.data(), size, value, sizeof value);
    CHECK(length > 0);
    CHECK(verify_password(password.data(), size, value, length, 1, keys) == 0);
    CHECK(verify_password(wrong.data(), size, value, length, 1, keys) != 0);
    if (scheme < FORMAT_QVEIL) continue;
    CHECK(unformat_password(std::string(value, value + length).c_str(), &clear, keys, nullptr) == 1);
    CHECK(clear == password);
    _morva_utils_decode_buffer_free(&clear);
  }
}

// Threads that begin at once.
void inThreads(unsigned count, void (*run)(unsigned number)) {
  std::atomic<unsigned> waiting{count};
  std::vector<std::thread> threads;
  for (unsigned number = 0; number < count; ++number) {
    threads.emplace_back([&waiting, run, number] {
      for (--waiting; waiting > 0;) std::this_thread::yield();
      run(number);
    });
  }
  for (std::thread& thread : threads) thread.join();
}

void startsManyThreads() {
  inThreads(32, [](unsigned number) { useEachScheme(number); });
}

// Keys and encodings.
void useTheOthers() {
  AesKeyData *made = nullptr, *loaded = nullptr;
  unsigned char block[8] = {};
  unsigned length = 0;
  uint32_t schedule[32];
  CHECK(restoreKeyStashFile("/dev/null", "a-seed-of-characters", "saltsaltsalt") == 0);
  CHECK(genTmpKeyDataVal("a-seed-of-characters", "saltsaltsalt", &made) == 0);
  CHECK(setAESKeyData("/dev/zero", &loaded) == 0 && freeAesKeyData(made) + freeAesKeyData(loaded) == 0);
  deskey(schedule, block, 0);
  des(schedule, block);
  char* text = binaryBlobToBase64(block, 8);
  unsigned char* back = base64ToBinaryBlob(text, &length);
  CHECK(back != nullptr && length == 8 && std::memcmp(back, block, 8) == 0);
  std::free(text);
  std::free(back);
}

void changeSink() {
  ldtr_set_sink([](const ldtr_record*, void*) {}, nullptr);
}

// The trace gets another sink meanwhile, again and again.
void worksInThreads() {
  changeSink();
  trcEvents = LDTR_EVENT_DEBUG;
  inThreads(16, [](unsigned number) {
    useTheOthers();
    for (unsigned round = 0; round < 200; ++round) {
      useEachScheme(number + round);
      changeSink();
    }
  });
}

// In a child: a stash file is rebuilt while memory runs out, and has its former bytes or the new ones afterwards.
int restoreWithoutMemory(const char* path, long number, int andLater) {
  const std::string former(200, 'x');
  test::putFile(path, former);
  alarm(20);
  bump_refuse(number, andLater);
  const int rc = restoreKeyStashFile(path, "a-seed-of-characters", "saltsaltsalt");
  const bool isEnd = bump_refuse(-1, 0) != 0;
  const std::string content = test::fileContent(path);
  CHECK(rc == 0 ? content.size() == 116 : content == former);
  return isEnd ? 77 : 0;
}

// In a child: stash files are made while memory runs out. The process ends where there are no random bytes.
int makeKeysWithoutMemory(long number, int andLater) {
  alarm(20);
  char* text = nullptr;
  bump_refuse(number, andLater);
  createKeyStashFiles("/dev/null", "/dev/null", "a-seed-of-characters", &text, nullptr);
  return bump_refuse(-1, 0) != 0 ? 77 : 0;
}

// In a child: a value is made while memory runs out at that request, and another one afterwards. 77: nothing was
// refused.
int useWithoutMemory(int scheme, long number, int andLater) {
  alarm(20);
  char value[2][64];
  int length[2];
  bump_refuse(number, andLater);
  length[0] = format_password(scheme, nullptr, keys, "secret", 6, value[0], 64);
  const bool isEnd = bump_refuse(-1, 0) != 0;
  length[1] = format_password(scheme, nullptr, keys, "secret", 6, value[1], 64);
  for (int i = 0; i < 2; ++i) {
    CHECK(length[i] == 0 || verify_password("secret", 6, value[i], length[i], 1, keys) == 0 || length[1] == 0);
  }
  return isEnd ? 77 : 0;
}

// The provider's part of the first use. Where memory is refused in its own start, an OpenSSL newer than 3.0 may wait
// for itself or release a block twice.
void startOpenssl() {
#if OPENSSL_VERSION_PREREQ(3, 1)
  void* const provider = dlopen(LDAPPW_PROVIDER_PATH, RTLD_NOW);
  CHECK(provider != nullptr);
  CHECK(reinterpret_cast<void* (*)(const char*, void*)>(dlsym(provider, "QEL_Init"))(nullptr, nullptr) != nullptr);
#endif
}

constexpr int kRebuilding = -1, kMaking = -2;  // no schemes, but a stash file

// Memory runs out somewhere in the first use: a refusal or a sound result, and no crash then or later.
void runsOutOfMemory() {
  if (bump_refuse == nullptr) return;
  startOpenssl();
  char path[] = "/tmp/ldappw-hosts-XXXXXX";
  CHECK(close(mkstemp(path)) == 0);
  for (const int scheme : {int{FORMAT_SSHA}, int{FORMAT_AES256}, kMaking, kRebuilding}) {
    if (scheme == kRebuilding) CHECK(restoreKeyStashFile(path, "a-seed-of-characters", "saltsaltsalt") == 0);
    for (const int andLater : {0, 1}) {
      int status = 0;
      for (long number = 0; status == 0; number += 1 + number / 50) {
        status = test::inChild([&] {
          return scheme == kMaking       ? makeKeysWithoutMemory(number, andLater)
                 : scheme == kRebuilding ? restoreWithoutMemory(path, number, andLater)
                                         : useWithoutMemory(scheme, number, andLater);
        });
        if (status != 0 && status != 77) {
          std::fprintf(stderr, "scheme %d, request %ld%s\n", scheme, number, andLater ? " and later" : "");
        }
      }
      CHECK(status == 77);
    }
  }
  unlink(path);
}

[[gnu::noinline]] void useMuch() {
  char* text = nullptr;
  AesKeyData* loaded = nullptr;
  QelStatus status{1, 1, ""};
  trcEvents = 0x4011000;
  useEachScheme();
  CHECK(createKeyStashFiles("/dev/null", "/dev/null", "a-seed-of-characters", &text, nullptr) == 0);
  CHECK(setAESKeyData("/dev/zero", &loaded) == 0 && qelStatusToLdap(nullptr, &status) == 1);
  CHECK(compactToOnlyBase64("==") == nullptr && ldapLoadLib("/nowhere", 0) == nullptr);
  trcEvents = 0;
  freeAesKeyData(loaded);
  std::free(text);
}

// A thread with a cancellation pending makes the first use, writes and reads files and prints; nothing of it is cut
// off.
void isCancelled() {
  std::atomic<bool> done{false};
  pthread_t thread;
  const auto body = [](void* flag) -> void* {  // has no objects, which the address sanitizer would miss later
    pthread_cancel(pthread_self());
    useMuch();
    *static_cast<std::atomic<bool>*>(flag) = true;
    pthread_testcancel();
    return nullptr;
  };
  CHECK(freopen("/dev/null", "w", stderr) != nullptr && freopen("/dev/null", "w", stdout) != nullptr);
  close(STDIN_FILENO);  // its number is that of the next file
  CHECK(pthread_create(&thread, nullptr, body, &done) == 0);
  void* result = nullptr;
  CHECK(pthread_join(thread, &result) == 0 && result == PTHREAD_CANCELED && done);
}

// A trace sink formats passwords itself, from inside the first use too, and forks there.
void tracesIntoItself() {
  static int nested = 0, forks = 0;
  const auto sink = [](const ldtr_record*, void*) {
    const pid_t child = forks++ < 60 ? fork() : -1;
    if (child == 0) _exit(0);
    if (child > 0) CHECK(waitpid(child, nullptr, 0) == child);
    if (nested++ == 0) useEachScheme();
    --nested;
  };
  ldtr_set_sink(sink, nullptr);
  trcEvents = 0x4011000;
  useEachScheme();
  trcEvents = 0;
}

// A trace sink throws, in a host that does not know that nothing throws here: the process ends in an orderly way.
void throwsFromItsSink() {
  int (*const volatile format)(int, char*, AesKeyData*, const char*, int, char*, int) = format_password;
  char value[64];
  std::set_terminate([] { _exit(0); });
  ldtr_set_sink([](const ldtr_record*, void*) { throw 1; }, nullptr);
  trcEvents = 0x4011000;
  try {
    format(FORMAT_SSHA, nullptr, nullptr, "secret", 6, value, sizeof value);
  } catch (int) {
  }
  CHECK(!"reached");
}

// A signal handler forks while the host makes {crypt} values.
void forksInASignalHandler() {
  static volatile sig_atomic_t forks = 0;
  const auto handler = [](int) {
    const pid_t child = fork();
    if (child == 0) _exit(0);
    if (child > 0 && waitpid(child, nullptr, 0) == child) ++forks;
  };
  std::signal(SIGPROF, handler);
  const itimerval often{{0, 1000}, {0, 1000}};
  CHECK(setitimer(ITIMER_PROF, &often, nullptr) == 0);
  char salt[] = "ab", value[32];
  while (forks < 50) CHECK(format_password(FORMAT_CRYPT, salt, nullptr, "secret", 6, value, sizeof value) == 20);
}

std::atomic<bool> isConstructing{false}, isLoading{false};

void await(const std::atomic<bool>& flag) {
  while (!flag) usleep(100);
}

// A plug-in makes values while it is loaded, and another thread is on its way to the loader in its first use.
void constructsAPlugIn() {
  ldtr_set_sink(
      [](const ldtr_record* record, void*) {
        if (record->text == nullptr || std::strncmp(record->text, "loadQelCrypto: Entering", 23) != 0) return;
        isLoading = true;
        await(isConstructing);
      },
      nullptr);
  trcEvents = LDTR_EVENT_DEBUG;
  std::thread user([] { useEachScheme(); });
  await(isLoading);
  CHECK(dlopen(LDAPPW_PLUG_IN, RTLD_NOW) != nullptr);
  user.join();
}

#ifndef __SANITIZE_ADDRESS__  // its own allocator leaves locks taken in the child
// A process forks with a mutex that the sink of another thread's first use waits for.
void forksWithWhatItsSinkWants() {
  static std::mutex mutex;
  ldtr_set_sink(
      [](const ldtr_record* record, void*) {
        if (record->text == nullptr || std::strncmp(record->text, "loadQelCrypto: Entering", 23) != 0) return;
        isLoading = true;
        const std::lock_guard<std::mutex> lock(mutex);
      },
      nullptr);
  trcEvents = LDTR_EVENT_DEBUG;
  mutex.lock();
  std::thread user([] { useEachScheme(); });
  await(isLoading);
  const pid_t child = fork();
  mutex.unlock();
  if (child == 0) {
    alarm(20);
    useEachScheme();
    _exit(0);
  }
  int status = -1;
  CHECK(waitpid(child, &status, 0) == child && status == 0);
  user.join();
}

void expectChildrenThatWork(int count) {
  for (int i = 0; i < count; ++i) {
    const pid_t child = fork();
    if (child == 0) {
      alarm(20);
      useEachScheme();
      _exit(0);
    }
    int status = -1;
    CHECK(waitpid(child, &status, 0) == child && status == 0);
    usleep(200);
  }
}

// Other threads are in their first use, and later in the middle of everything, when the process forks.
void forks() {
  std::atomic<bool> stop{false};
  std::vector<std::thread> threads;
  for (int i = 0; i < 3; ++i) {
    threads.emplace_back([&stop] {
      while (!stop) useEachScheme();
    });
  }
  threads.emplace_back([&stop] {
    while (!stop) ldtr_set_sink(nullptr, nullptr);
  });
  expectChildrenThatWork(60);
  stop = true;
  for (std::thread& thread : threads) thread.join();
}
#endif

// Parent and child go on drawing, and never the same.
void drawsAfterAFork() {
  std::string values[2];
  int ends[2];
  const auto draw = [] {
    char value[64] = "";
    CHECK(format_password(FORMAT_SSHA, nullptr, nullptr, "secret", 6, value, sizeof value) == 62);
    return std::string(value);
  };
  draw();
  CHECK(pipe(ends) == 0);
  const pid_t child = fork();
  if (child == 0) _exit(write(ends[1], draw().c_str(), 62) == 62 ? 0 : 1);
  values[0] = draw();
  values[1].resize(62);
  CHECK(read(ends[0], values[1].data(), 62) == 62 && waitpid(child, nullptr, 0) == child);
  CHECK(values[0] != values[1]);
}

// The process exits while threads work: every value stays what it is, and nothing goes from under them.
void exitsAmongThreads() {
  for (int round = 0; round < 30; ++round) {
    const pid_t child = fork();
    if (child == 0) {
      alarm(20);
      std::atomic<int> started{0};
      useEachScheme();                    // who finds no context is refused
      std::atexit([] { usleep(2000); });  // comes after the library's own handler
      for (int i = 0; i < 8; ++i) {
        std::thread([&started] {
          for (++started;;) useEachScheme();
        }).detach();
      }
      while (started < 8) usleep(100);
      usleep(static_cast<useconds_t>(round) * 200);
      std::exit(0);
    }
    int status = -1;
    CHECK(waitpid(child, &status, 0) == child && status == 0);
  }
}

// Handles of nowhere, before any provider is loaded.
void asksTooEarly() {
  char made_up = 0;
  void* const handle = &made_up;
  void* context = nullptr;
  void* algorithm = nullptr;
  unsigned char bytes[32] = {};
  AesKeyData* made = nullptr;
  QelStatus status{};
  CHECK(initQelCipher(handle, &context, "AES-128-ECB", &algorithm) == 1 && context == nullptr);
  CHECK(initQelDigest(handle, &context, "SHA1", &algorithm) == 1 && context == nullptr);
  CHECK(freeQelCipher(handle, handle) == 1 && freeQelDigest(handle, handle) == 1);
  CHECK(freeQelCrypto(handle) == 0 && qelStatusToLdap(handle, nullptr) == 0 && qelStatusToLdap(nullptr, &status) == 0);
  CHECK(morva_rand_ascii(handle, bytes, sizeof bytes) == 1 && genKeySaltVal(handle, keys) == 1);
  CHECK(morva_pbkdf2(handle, handle, handle, bytes, 4, bytes, 4, 2, bytes, 20) == 1);
  CHECK(growKeysFromSeed(handle, handle, handle, "seed", keys) == 1);
  CHECK(genKeySyncVal(handle, handle, handle, "seed", keys) == 1);
  CHECK(genKeyDataVal(handle, handle, handle, nullptr, nullptr, &made) == 1 && made == nullptr);
  unloadQelCrypto();
}

// What the loader has to report is still there for the host.
void asksTheLoader() {
  CHECK(ldapLoadLib("/nowhere/lib.so", 0) == nullptr);
  const char* reason = dlerror();
  CHECK(reason != nullptr && std::strstr(reason, "/nowhere/lib.so") != nullptr);
  void** cell = ldapLoadLib("libm.so.6", 0);
  CHECK(ldapGetSymAddress(cell, "no_such_symbol") == nullptr);
  reason = dlerror();
  CHECK(reason != nullptr && std::strstr(reason, "no_such_symbol") != nullptr);
  CHECK(ldapUnloadLib(cell) == 0);
}

struct Host {
  const char* name;
  void (*run)();
  bool countsOnLuck = false;
};

constexpr Host kHosts[] = {
    {"starts many threads", startsManyThreads, true},
    {"works in threads", worksInThreads},
    {"runs out of memory", runsOutOfMemory},
    {"is cancelled", isCancelled},
    {"traces into itself", tracesIntoItself},
    {"throws from its sink", throwsFromItsSink},
    {"forks in a signal handler", forksInASignalHandler},
    {"constructs a plug-in", constructsAPlugIn},
#ifndef __SANITIZE_ADDRESS__
    {"forks", forks},
    {"forks with what its sink wants", forksWithWhatItsSinkWants},
#endif
    {"draws after a fork", drawsAfterAFork},
    {"exits among threads", exitsAmongThreads},
    {"asks too early", asksTooEarly},
    {"asks the loader", asksTheLoader},
};

}  // namespace

// Called by plug_in.c while it is loaded.
extern "C" __attribute__((visibility("default"))) void hostIsConstructed() {
  isConstructing = true;
  usleep(50000);  // the other thread comes to the loader
  useEachScheme();
}

int main(int argc, char** argv) {
  const int times = argc > 1 ? std::atoi(argv[1]) : 20;
  int failed = 0;
  for (const Host& host : kHosts) {
    for (int i = 0; i < (host.countsOnLuck ? times : 1); ++i) {
      const int status = test::inChild([&host] { return host.run(), std::exit(0), 0; });
      if (status == 0) continue;
      std::fprintf(stderr, "a host that %s: status %d\n", host.name, status);
      failed = 1;
    }
  }
  return failed;
}
