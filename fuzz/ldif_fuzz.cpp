// SPDX-License-Identifier: Apache-2.0
// Directory exports, compressed ones among them, through the whole command, called as a function: any conversion leaves
// every line that holds no password as it was, and neither it nor an audit of its result, as counts, as a report or as
// a page, fails otherwise than by findings.
#include <strings.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

#include "command_line.h"
#include "fuzz_input.h"

using namespace fuzz;

namespace {

// An anonymous file with a path.
class File {
 public:
  explicit File(std::string_view content = {}) : descriptor_(memfd_create("fuzz", 0)) { write(content); }
  int descriptor() const { return descriptor_; }
  std::string path() const { return "/proc/self/fd/" + std::to_string(descriptor_); }
  void write(std::string_view content) const {
    const auto size = static_cast<off_t>(content.size());
    require(ftruncate(descriptor_, 0) == 0 && pwrite(descriptor_, content.data(), content.size(), 0) == size);
    require(lseek(descriptor_, 0, SEEK_SET) == 0);
  }
  std::string content() const {
    std::string bytes(static_cast<size_t>(lseek(descriptor_, 0, SEEK_END)), '\0');
    require(pread(descriptor_, bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size()));
    return bytes;
  }

 private:
  int descriptor_;
};

int run(std::vector<std::string> arguments, bool mayBeDamaged) {
  arguments.insert(arguments.begin(), "ldappw");
  arguments.insert(arguments.end(), {"--threads", "1"});
  std::vector<char*> pointers;
  for (std::string& argument : arguments) pointers.push_back(argument.data());
  pointers.push_back(nullptr);
  const int code = tool::runCommand(static_cast<int>(arguments.size()), pointers.data());
  require(code == 0 || code == 3 || code == 4 || (code == 5 && mayBeDamaged));
  return code;
}

std::string_view takeLine(std::string_view& text) {
  const size_t end = std::min(text.find('\n'), text.size() - 1) + 1;
  const std::string_view line = text.substr(0, end);
  text.remove_prefix(end);
  return line;
}

constexpr std::string_view kPasswords[] = {"userPassword", "2.5.4.35",       "pwdHistory",
                                           "olcRootPW",    "nsslapd-rootpw", "authPassword"};

// All lines but those of passwords, with their continuations.
std::string others(std::string_view text) {
  std::string kept;
  while (!text.empty()) {
    std::string raw(takeLine(text));
    std::string unfolded = raw.substr(0, raw.find_last_not_of("\r\n") + 1);
    while (!unfolded.empty() && !text.empty() && text.front() == ' ') {
      const std::string_view more = takeLine(text);
      raw += more;
      unfolded += more.substr(1, more.find_first_of("\r\n", 1) - 1);
    }
    const bool isPassword = std::any_of(std::begin(kPasswords), std::end(kPasswords), [&](std::string_view name) {
      return strncasecmp(unfolded.c_str(), name.data(), name.size()) == 0;
    });
    if (!isPassword) kept += raw;
  }
  return kept;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const std::string stash = std::string("\x10\0\0\0", 4) + std::string(16, 'y') + std::string(12, 's');
  static const File oldKeys(stash + std::string(72, 'k'));
  static const File newKeys(stash + std::string(72, 'n'));
  static const File in;
  static const File out;
  static const bool isRedirected = dup2(out.descriptor(), STDOUT_FILENO) == STDOUT_FILENO;
  static const char* const kTargets[] = {"clear", "sha", "ssha", "md5", "crypt", "qveil", "aes128", "aes192", "aes256"};
  require(isRedirected);

  Input input(data, size);
  const unsigned choice = input.byte();
  const std::string text(input.rest());
  const bool isCompressed = text.compare(0, 2, "\x1f\x8b") == 0 || text.compare(0, 4, "\x28\xb5\x2f\xfd") == 0;
  in.write(text);
  out.write("");
  std::vector<std::string> conversion = {"ldif",         "--to",         kTargets[choice % 9], "--in",
                                         in.path(),      "--keys",       oldKeys.path(),       "--new-keys",
                                         newKeys.path(), "--allow-clear"};
  if (choice >= 128) conversion.emplace_back("--allow-binary");
  if (choice / 9 % 2 == 1) conversion.emplace_back("--fix");
  const bool isRefused = run(conversion, isCompressed) == 3 && out.content().empty();  // what is no text
  const std::string converted = out.content();
  require(isCompressed || isRefused || others(converted) == others(text));

  static const std::vector<std::string> kAudits[] = {{"ldif", "--audit", "--verbose", "--in", in.path()},
                                                     {"ldif", "--audit", "--verbose", "--json", "--in", in.path()},
                                                     {"audit", "--json", in.path()},
                                                     {"audit", "--html", "-", in.path()}};
  in.write(converted);
  out.write("");
  std::vector<std::string> audit = kAudits[choice / 18 % 4];
  audit.insert(audit.end(), {"--keys", newKeys.path()});
  run(audit, isCompressed);
  return 0;
}
