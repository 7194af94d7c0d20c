// SPDX-License-Identifier: Apache-2.0
// What a process has left in its memory when it exits: nothing of a password, a seed or a key. Each case is a
// run of the command, or of this program as the control, which gets its secrets through a pipe and is stopped as it
// exits; then all memory that it could write is searched, and so is what it has logged with everything traced.
#include <fcntl.h>
#include <sys/ptrace.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "aes_keys.h"
#include "encoding_utils.h"
#include "password_schemes.h"
#include "support.h"

namespace {

using Words = std::vector<std::string>;

constexpr size_t kSecretBytes = 24;
constexpr char kConfig[] = "cfg.stash", kDirectory[] = "dir.stash", kLog[] = "log";

// The control: a program that keeps what it reads.
int leaveACopy() {
  static char secret[kSecretBytes];
  return read(STDIN_FILENO, secret, kSecretBytes) == static_cast<ssize_t>(kSecretBytes) ? 0 : 2;
}

// ---- The search ----

// A released block has two pointers of the allocator where it begins: one end of a word tells as much as the whole.
bool has(const std::string& text, const std::string& word) {
  const size_t end = std::min(kSecretBytes - 2 * sizeof(void*), word.size());
  return text.find(word.substr(0, end)) != std::string::npos ||
         text.find(word.substr(word.size() - end)) != std::string::npos;
}

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
    if (has(bytes, word)) found += "\n  " + line;
  }
  close(memory);
  return found;
}

// Runs a program with that as its standard input; where it has left the words, or how else it failed.
std::string leftBy(const Words& program, const std::string& input, const Words& words, unsigned long expected = 0) {
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
    alarm(120);
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
  const std::string log = test::fileContent(kLog);
  for (const std::string& word : words) {
    found += placeOf(child, word);
    if (has(log, word)) found += "\n  in the log";
  }
  unsigned long code = 0;
  ptrace(PTRACE_GETEVENTMSG, child, nullptr, &code);
  if (code >> 8 != expected) found += "\n  exit code " + std::to_string(code >> 8) + "\n" + log;
  ptrace(PTRACE_CONT, child, nullptr, 0);
  waitpid(child, &status, 0);
  return found;
}

std::string randomText(std::mt19937& random) {
  std::string text;
  while (text.size() < kSecretBytes) text += static_cast<char>('A' + random() % 26);
  return text;
}

// A stored value under the keys of the case.
std::string valueOf(const std::string& password, int scheme) {
  AesKeyData* keys = nullptr;
  setAESKeyData(kDirectory, &keys);
  char value[256];
  const int length =
      format_password(scheme, nullptr, keys, password.data(), static_cast<int>(password.size()), value, sizeof value);
  freeAesKeyData(keys);
  return {value, value + length};
}

std::string exportOf(const std::string& value) {
  return "dn: cn=a\ncn: a\nuserPassword: " + value + "\n\n";
}

// A run of the command: its arguments, with blanks between them, its input, what is looked for, its exit code.
struct Run {
  std::string arguments, input;
  Words words;
  unsigned long code = 0;
};

std::vector<Run> runsWith(const std::string& password, const std::string& seed) {
  const std::string keys = " --keys dir.stash", content = test::fileContent(kDirectory);
  const Words both = {password, content.substr(content.size() - 32, 16)}, keyAlone = {both[1]};
  const std::string aes = valueOf(password, FORMAT_AES256), ssha = valueOf(password, FORMAT_SSHA);
  const std::string mixed = exportOf(aes) + exportOf(password) + exportOf(valueOf(password, FORMAT_QVEIL));
  const std::string bytes = std::string("\xff\0", 2) + password;  // releasing looks no further than the NUL
  char* base64 =
      binaryBlobToBase64(reinterpret_cast<const unsigned char*>(bytes.data()), static_cast<int>(bytes.size()));
  const Words encoded = {base64, password};
  free(base64);
  std::ofstream("salt") << "saltsaltsalt\n";
  std::ofstream("short.stash") << content.substr(0, content.size() - 1);
  std::ofstream("bad") << password << '\n';
  std::ofstream("changes") << "dn: cn=a\nchangetype: modify\ndelete: userPassword\nuserPassword: " + password +
                                  "\n-\nadd: userPassword\nuserPassword: " + ssha + "\n-\n\n";
  std::ofstream("value") << aes << '\n';
  std::vector<Run> runs = {
      {"keys restore --force --salt-file salt " + std::string(kConfig), seed, {seed}},
      {"keys restore --salt-file salt none/at/all", seed, {seed}, 5},
      {"keys create --config none/at --directory none/all", seed, {seed}, 5},
      {"keys show dir.stash", "", keyAlone},
      {"keys show short.stash", "", keyAlone, 4},
      {"keys show --json dir.stash", "", keyAlone},
      {"keys compare dir.stash dir.stash", "", keyAlone},
      {"keys check --sync other dir.stash", "", keyAlone, 1},
      {"keys check dir.stash -", mixed, both},
      {"identify", password + '\n' + aes + '\n', {password}},
      {"format --scheme argon2id --memory 64", password, {password}},
      {"format --scheme ssha512 --json", password, {password}},
      {"verify " + ssha, password, {password}},
      {"verify --value-file value" + keys, password, both},
      {"verify --value-file value" + keys, password + "x", both, 1},
      {"verify " + aes.substr(0, 30) + keys, password, {password}, 3},
      {"verify --batch -" + keys, aes + '\t' + password + '\n' + ssha + '\t' + password + "y\n", both, 1},
      {"reveal" + keys, aes + '\n', both},
      {"reveal --json" + keys, aes + '\n' + aes.substr(0, 30) + '\n', both, 3},
      {"reveal --json" + keys, valueOf(bytes, FORMAT_AES256) + '\n', encoded},
      {"ldif --to aes128 --new-keys cfg.stash" + keys, mixed, both},
      {"ldif --to argon2id --memory 64 --changes" + keys, mixed, both},
      {"ldif --to ssha --changes --resume changes" + keys, mixed, both},
      {"ldif --to clear" + keys + " --allow-clear", mixed, both},
      {"ldif --to ssha" + keys + " --out none/at/all", mixed, both, 5},
      {"ldif --audit" + keys, mixed, both},
      {"audit --known-bad bad --check-hashes -" + keys, mixed + exportOf(ssha), both},
      {"trial -" + keys, mixed, both},
  };
  for (const char* scheme : {"sha", "ssha", "md5", "crypt", "qveil", "aes128", "aes192", "aes256"}) {
    const std::string text = scheme == std::string("crypt") ? password.substr(0, 8) : password;
    runs.push_back({"format --scheme " + std::string(scheme) + keys, text, {text, both[1]}});
  }
  return runs;
}

int examine(const std::string& command) {
  std::mt19937 random{std::random_device{}()};
  const std::string password = randomText(random), seed = randomText(random);
  if (leftBy({"/proc/self/exe"}, password, {password}).empty()) {
    std::fputs("the search finds nothing\n", stderr);
    return 1;
  }
  int failed = 0;
  const auto expectNothing = [&failed](const Words& program, const Run& run) {
    const std::string found = leftBy(program, run.input, run.words, run.code);
    if (found.empty()) return;
    std::fprintf(stderr, "%s leaves secrets:%s\n", run.arguments.c_str(), found.c_str());
    failed = 1;
  };
  expectNothing({command, "keys", "create", "--config", kConfig, "--directory", kDirectory}, {"create", seed, {seed}});
  for (const Run& run : runsWith(password, seed)) {
    std::istringstream arguments(run.arguments);
    Words program{command};
    program.insert(program.end(), std::istream_iterator<std::string>(arguments), {});
    expectNothing(program, run);
  }
  return failed;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2) return leaveACopy();
  const test::TempFolder folder;
  std::filesystem::current_path(folder.file(""));
  return examine(argv[1]);
}
