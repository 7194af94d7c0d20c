// SPDX-License-Identifier: Apache-2.0
// Whole processes of the command beside other programs that do the same work, or the same command on other input. The
// small ones in processor time; an export in real time, beside cat. Named <row>/ours and <row>/<peer>.
#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "bench_support.h"

namespace {

using Arguments = std::vector<std::string>;
using Path = const std::string&;  // of a file

// Seconds of a process with these standard streams.
struct Cost {
  double real = 0;
  double processor = 0;
  bool failed = true;
};

Cost run(Arguments arguments, Path in, Path out) {
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, in.c_str(), O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  std::vector<char*> pointers;
  for (std::string& argument : arguments) pointers.push_back(argument.data());
  pointers.push_back(nullptr);
  const auto start = std::chrono::steady_clock::now();
  pid_t child = -1;
  const int failure = posix_spawn(&child, pointers[0], &actions, nullptr, pointers.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  Cost cost;
  int status = -1;
  struct rusage usage {};
  if (failure != 0 || wait4(child, &status, 0, &usage) != child) return cost;
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
  };
  cost.real = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  cost.processor = seconds(usage.ru_utime) + seconds(usage.ru_stime);
  cost.failed = status != 0;
  return cost;
}

Arguments ours(Arguments arguments) {
  arguments.insert(arguments.begin(), LDAPPW_COMMAND);
  return arguments;
}

// ---- The files that the processes work on: each is made when it is first asked for, and all go at the end ----

class Folder {
 public:
  Folder() {
    if (mkdtemp(path_.data()) == nullptr) std::abort();
  }
  ~Folder() { std::filesystem::remove_all(path_); }
  Folder(const Folder&) = delete;
  Folder& operator=(const Folder&) = delete;

  std::string operator/(const char* name) const { return path_ + "/" + name; }

 private:
  std::string path_ = std::filesystem::temp_directory_path() / "ldappw_bench.XXXXXX";
};

const Folder& folder() {
  static const Folder made;
  return made;
}

std::string none() {
  return "/dev/null";
}

std::string written(const char* name, const std::string& text) {
  std::ofstream(folder() / name) << text;
  return folder() / name;
}

std::string output() {
  unlink((folder() / "out").c_str());
  return folder() / "out";
}

std::string password() {
  static const std::string path = written("password", "x\n");
  return path;
}

std::string passwords() {
  static const std::string path = [] {
    std::string text;
    for (int i = 0; i < 1000; ++i) text += "password" + std::to_string(i) + "\n";
    return written("passwords", text);
  }();
  return path;
}

std::vector<std::string> formatted(Arguments more, Path in) {
  more.insert(more.begin(), {"format", "--scheme"});
  run(ours(more), in, folder() / "values");
  std::vector<std::string> lines;
  std::ifstream file(folder() / "values");
  for (std::string line; std::getline(file, line);) lines.push_back(line);
  return lines;
}

std::string keys(const char* name, const std::string& seed) {
  const std::string path = folder() / name;
  run(ours({"keys", "create", "--config", path + ".config", "--directory", path}), written("seed", seed + "\n"),
      none());
  return path;
}

std::string oldKeys() {
  static const std::string path = keys("old.stash", "aSeedThatNobodyKnows");
  return path;
}

std::string newKeys() {
  static const std::string path = keys("new.stash", "anotherSeedOfThatKind");
  return path;
}

// A million entries with a thousand {AES256} values.
std::string people() {
  static const std::string path = [] {
    const std::vector<std::string> values = formatted({"aes256", "--keys", oldKeys()}, passwords());
    std::ofstream file(folder() / "people.ldif");
    for (size_t i = 0; i < 1000000; ++i) {
      const std::string user = "u" + std::to_string(i);
      file << "dn: uid=" << user << ",ou=People,dc=example,dc=org\nobjectClass: inetOrgPerson\nuid: " << user
           << "\ncn: Mira Ibsen\nsn: Ibsen\nmail: " << user
           << "@example.org\nuserPassword: " << values.at(i % values.size()) << "\n\n";
    }
    return folder() / "people.ldif";
  }();
  return path;
}

// An entry with one value of 200 MB, as it is and folded.
std::string photo(const char* name, size_t columns) {
  const std::string line = "jpegPhoto:: " + std::string(200000000, 'A');
  std::ofstream file(folder() / name);
  file << "dn: uid=u0,dc=example,dc=org\n" << line.substr(0, columns);
  for (size_t at = columns; at < line.size(); at += columns - 1) file << "\n " << line.substr(at, columns - 1);
  file << "\n\n";
  return folder() / name;
}

std::string plainPhoto() {
  static const std::string path = photo("plain.ldif", 300000000);
  return path;
}

std::string foldedPhoto() {
  static const std::string path = photo("folded.ldif", 76);
  return path;
}

// A process a time, with these arguments, input and output.
void measure(const char* name, double Cost::*clock, Arguments (*arguments)(), std::string (*in)(),
             std::string (*out)()) {
  const auto body = [=](benchmark::State& state) {
    const Arguments command = arguments();
    const std::string input = in();
    for (auto _ : state) {
      const Cost cost = run(command, input, out());
      if (cost.failed) state.SkipWithError("the process failed");
      state.SetIterationTime(cost.*clock);
    }
  };
  benchmark::RegisterBenchmark(name, body)->UseManualTime();
}

// ---- The rows ----

constexpr char kSlappasswd[] = "/usr/sbin/slappasswd";
constexpr char kPerl[] = "/usr/bin/perl";
constexpr char kPerlProgram[] = R"(
use strict; use warnings;
use Digest::SHA 'sha1'; use MIME::Base64 'encode_base64';
open my $random, '<:raw', '/dev/urandom' or die;
while (my $line = <STDIN>) {
  chomp $line;
  read $random, my $salt, 20;
  print '{SSHA}', encode_base64(sha1($line . $salt) . $salt, ''), "\n";
}
)";

Arguments slappasswd() {
  return {kSlappasswd, "-h", "{SSHA}", "-s", "x"};
}

Arguments format() {
  return ours({"format", "--scheme", "ssha"});
}

Arguments rotation() {
  return ours({"ldif", "--to", "aes256", "--keys", oldKeys(), "--new-keys", newKeys()});
}

void addRows() {
  const auto processor = &Cost::processor;
  const auto version = [] { return ours({"--version"}); };
  const auto verify = [] { return ours({"verify", formatted({"ssha"}, password()).at(0)}); };
  measure("command-version/ours", processor, version, none, none);
  measure("command-verify/ours", processor, verify, password, none);
  if (access(kSlappasswd, X_OK) == 0) {  // of the package slapd; without it the two rows have no peer
    measure("command-version/slappasswd", processor, slappasswd, none, none);
    measure("command-verify/slappasswd", processor, slappasswd, none, none);
  }
  measure("command-format/ours", processor, format, passwords, none);
  measure(
      "command-format/perl", processor,
      [] {
        return Arguments{kPerl, "-e", kPerlProgram};
      },
      passwords, none);
  measure("ldif-rotation/ours", &Cost::real, rotation, people, output);
  measure(
      "ldif-rotation/cat", &Cost::real, [] { return Arguments{"/bin/cat"}; }, people, output);
  measure("ldif-unfolded/ours", processor, rotation, plainPhoto, output);
  measure("ldif-unfolded/folded", processor, rotation, foldedPhoto, output);
}

const bench::Rows kRows(addRows);

}  // namespace
