// SPDX-License-Identifier: Apache-2.0
// What a process has left in its memory when it exits: nothing of a password, a seed or a key. Each case is a program of
// its own, either the command or this one with the case's name, which gets its secrets through a pipe and is stopped as
// it exits; then all memory that it could write is searched, and so is what it has logged with everything traced.
#include <fcntl.h>
#include <sys/ptrace.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "crypto_provider.h"
#include "password_schemes.h"

namespace {

using Words = std::vector<std::string>;

constexpr size_t kSecretBytes = 24;
constexpr char kConfig[] = "cfg.stash", kDirectory[] = "dir.stash", kLog[] = "log";

// ---- The cases of this program; the secret lies in the buffer and is wiped by its owner ----

char secret[kSecretBytes + 1];

void useSchemes() {
  AesKeyData* keys = nullptr;
  char salt[] = "ab", value[1024];
  setAESKeyData(kDirectory, &keys);
  for (const int scheme : {2, 3, 4, 9, 128, 133, 134, 135}) {
    char* clear = nullptr;
    const int length = format_password(scheme, salt, keys, secret, kSecretBytes, value, sizeof value);
    verify_password(secret, kSecretBytes, value, length, 1, keys);
    verify_password("wrong", 5, value, length, 1, keys);
    morva_decodePW(&clear, std::string(value, value + length).c_str(), keys);
    _morva_utils_decode_buffer_free(&clear);
  }
  freeAesKeyData(keys);
}

void failInSchemes() {
  void* context = nullptr;
  initQelCrypto(&context);
  pQEL_EVP_DigestFinal = [](auto...) { return 0; };
  pQEL_EVP_EncryptFinal = pQEL_EVP_DecryptFinal = [](auto...) { return 0; };
  useSchemes();
}

void makeKeys() {
  AesKeyData* keys = nullptr;
  restoreKeyStashFile(kConfig, secret, "saltsaltsalt");
  restoreKeyStashFile("/dev/full", secret, "saltsaltsalt");
  genTmpKeyDataVal(secret, "saltsaltsalt", &keys);
  freeAesKeyData(keys);
}

void leaveACopy() {
  [[maybe_unused]] static char* copy = strdup(secret);
}

const struct {
  const char* name;
  void (*run)();
} kOwnCases[] = {{"leaves a copy", leaveACopy},
                 {"uses schemes", useSchemes},
                 {"fails in schemes", failInSchemes},
                 {"makes keys", makeKeys}};

int runOwnCase(const std::string& name) {
  if (read(STDIN_FILENO, secret, kSecretBytes) != static_cast<ssize_t>(kSecretBytes)) return 2;
  for (const auto& each : kOwnCases) {
    if (name == each.name) each.run();
  }
  explicit_bzero(secret, sizeof secret);
  return 0;
}

// ---- The search ----

// What the stopped process can write, searched for the word.
std::string placeOf(pid_t process, const std::string& word) {
  const std::string folder = "/proc/" + std::to_string(process);
  const int memory = open((folder + "/mem").c_str(), O_RDONLY | O_CLOEXEC);
  std::ifstream maps(folder + "/maps");
  std::string found = memory < 0 ? "nothing can be read" : "";
  for (std::string line; std::getline(maps, line);) {
    unsigned long begin = 0, end = 0;
    char mode[5] = "";
    std::sscanf(line.c_str(), "%lx-%lx %4s", &begin, &end, mode);
    if (mode[1] != 'w') continue;
    std::string bytes(end - begin, '\0');
    if (pread(memory, bytes.data(), bytes.size(), static_cast<off_t>(begin)) < 0) continue;
    if (const size_t at = bytes.find(word); at != std::string::npos) {
      found += "\n  " + line + " at " + std::to_string(at);
    }
  }
  close(memory);
  return found;
}

// Runs a program with that as its standard input; where it has left the words, or how else it failed.
std::string leftBy(const Words& program, const std::string& input, const Words& words) {
  int ends[2];
  if (pipe(ends) != 0) return "no pipe";
  const pid_t child = fork();
  if (child == 0) {
    std::vector<char*> arguments;
    for (const std::string& word : program) arguments.push_back(const_cast<char*>(word.c_str()));
    arguments.push_back(nullptr);
    dup2(ends[0], STDIN_FILENO);
    close(ends[1]);
    dup2(open("/dev/null", O_WRONLY), STDOUT_FILENO);
    dup2(open(kLog, O_WRONLY | O_CREAT | O_TRUNC, 0600), STDERR_FILENO);
    setenv("LDTR_EVENTS", "0x4011000", 1);
    setenv("LDAP_DEBUG", "1", 1);
    ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
    execv(arguments[0], arguments.data());
    _exit(127);
  }
  close(ends[0]);
  if (write(ends[1], input.data(), input.size()) < 0) return "no input";
  close(ends[1]);
  int status = 0;
  waitpid(child, &status, 0);
  ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_EXITKILL | PTRACE_O_TRACEEXIT);
  int delivered = 0;
  do {
    ptrace(PTRACE_CONT, child, nullptr, delivered);
    if (waitpid(child, &status, 0) != child || !WIFSTOPPED(status)) return "was not stopped as it exits";
    delivered = WSTOPSIG(status) == SIGTRAP ? 0 : WSTOPSIG(status);
  } while (status >> 8 != (SIGTRAP | PTRACE_EVENT_EXIT << 8));
  std::string found;
  std::ostringstream log;
  log << std::ifstream(kLog).rdbuf();
  for (const std::string& word : words) {
    found += placeOf(child, word);
    if (log.str().find(word) != std::string::npos) found += "\n  in the log";
  }
  unsigned long code = 0;
  ptrace(PTRACE_GETEVENTMSG, child, nullptr, &code);
  if (code >> 8 > 1) found += "\n  exit code " + std::to_string(code >> 8) + "\n" + log.str();
  ptrace(PTRACE_CONT, child, nullptr, 0);
  waitpid(child, &status, 0);
  return found;
}

std::string randomText(std::mt19937& random) {
  std::string text;
  while (text.size() < kSecretBytes) text += static_cast<char>('A' + random() % 26);
  return text;
}

int examine(const std::string& command) {
  const std::string self = "/proc/self/exe";
  std::mt19937 random{std::random_device{}()};
  const std::string password = randomText(random), seed = randomText(random);
  const std::string left =
      leftBy({command, "keys", "create", "--config", kConfig, "--directory", kDirectory}, seed, {seed});
  if (!left.empty()) std::fprintf(stderr, "keys create leaves secrets:%s\n", left.c_str());
  std::ofstream("salt") << "saltsaltsalt\n";
  std::ostringstream file;
  file << std::ifstream(kDirectory, std::ios::binary).rdbuf();
  const Words keyWords = {password, file.str().substr(file.str().size() - 32, 16)};
  int failed = left.empty() ? 0 : 1;
  const auto expectNothing = [&failed](const Words& program, const std::string& input, const Words& words) {
    const std::string found = leftBy(program, input, words);
    if (found.empty()) return;
    for (const std::string& word : program) std::fprintf(stderr, "%s ", word.c_str());
    std::fprintf(stderr, "leaves secrets:%s\n", found.c_str());
    failed = 1;
  };
  if (leftBy({self, "leaves a copy"}, password, {password}).empty()) {
    std::fputs("the search finds nothing\n", stderr);
    return 1;
  }
  expectNothing({self, "uses schemes"}, password, keyWords);
  expectNothing({self, "fails in schemes"}, password, keyWords);
  expectNothing({self, "makes keys"}, seed, {seed});
  for (const char* scheme : {"sha", "ssha", "md5", "crypt", "qveil", "aes128", "aes192", "aes256"}) {
    const std::string text = scheme == std::string("crypt") ? password.substr(0, 8) : password;
    expectNothing({command, "format", "--scheme", scheme, "--keys", kDirectory}, text, {text, keyWords[1]});
  }
  const char value[] = "{SSHA}3sxkqG4X7uu7lHneEWd5ccxI/x6WqNovnWWVMHm6dusWNK/KinBDCw==";
  expectNothing({command, "verify", value}, password, {password});
  expectNothing({command, "keys", "restore", "--force", "--salt-file", "salt", kConfig}, seed, {seed});
  return failed;
}

}  // namespace

int main(int argc, char** argv) {
  const std::string argument = argc == 2 ? argv[1] : "";
  if (argument.find('/') == std::string::npos) return runOwnCase(argument);
  const std::filesystem::path folder = std::filesystem::temp_directory_path() / ("secrets-" + std::to_string(getpid()));
  std::filesystem::create_directory(folder);
  std::filesystem::current_path(folder);
  const int failed = examine(argument);
  std::filesystem::remove_all(folder);
  return failed;
}
