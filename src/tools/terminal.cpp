// SPDX-License-Identifier: Apache-2.0
// The prompt reader. The terminal is read byte by byte and the line is edited here: the kernel's line editing would cut
// a line at 4095 bytes without a word.
#include "terminal.h"

#include <errno.h>
#include <fcntl.h>
#include <termios.h>
#include <unistd.h>

#include <cstring>

#include "common.h"
#include "signals.h"

namespace tool {
namespace {

constexpr int kInput = STDIN_FILENO;

class QuietTerminal {
 public:
  QuietTerminal(const termios& normal, int promptFd, const char* prompt) {
    termios quiet = normal;
    quiet.c_lflag &= ~static_cast<tcflag_t>(ECHO | ECHOE | ECHOK | ECHONL | ICANON);
    quiet.c_cc[VMIN] = 1;
    quiet.c_cc[VTIME] = 0;
    if (!quietTerminal(kInput, normal, quiet, promptFd, prompt)) {
      throw Failure(kIoError, systemText("the terminal's echo cannot be switched off", errno));
    }
  }
  ~QuietTerminal() { restoreTerminal(); }
  QuietTerminal(const QuietTerminal&) = delete;
  QuietTerminal& operator=(const QuietTerminal&) = delete;
};

void show(int fd, const char* text) noexcept {
  const ssize_t written = write(fd, text, strlen(text));
  static_cast<void>(written);  // without a prompt the answer can be typed all the same
}

void eraseCharacter(Secret& line) {
  auto continues = [](char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U; };
  while (!line.empty() && continues(line.view().back())) line.resize(line.size() - 1);
  if (!line.empty()) line.resize(line.size() - 1);
}

enum class Key { kByte, kEndOfLine, kEndOfInput };

// Acts on an editing character of the terminal; any other byte is part of the line.
Key edit(const termios& normal, char byte, Secret& line) {
  const cc_t code = static_cast<cc_t>(byte);
  auto is = [&](int index) { return code != _POSIX_VDISABLE && code == normal.c_cc[index]; };
  if (byte == '\n' || is(VEOL)) return Key::kEndOfLine;
  if (is(VEOF)) return line.empty() ? Key::kEndOfInput : Key::kEndOfLine;
  if (is(VERASE)) {
    eraseCharacter(line);
  } else if (is(VKILL)) {
    line.clear();
  } else {
    line.append(byte);
  }
  return Key::kByte;
}

char readByte() {
  for (;;) {
    char byte = 0;
    const ssize_t count = read(kInput, &byte, 1);
    if (count == 1) return byte;
    if (count == 0) throw Failure(kIoError, "the terminal was closed");
    if (errno != EINTR) throw Failure(kIoError, systemText("the terminal cannot be read", errno));
  }
}

}  // namespace

Secret promptSecret(const char* prompt) {
  termios normal;
  if (tcgetattr(kInput, &normal) != 0) throw Failure(kIoError, systemText("the terminal's mode is not known", errno));
  const Descriptor own(open("/dev/tty", O_WRONLY | O_NOCTTY | O_CLOEXEC));
  const int promptFd = own.valid() ? own.get() : STDERR_FILENO;
  Secret line;
  Key key = Key::kByte;
  {
    const QuietTerminal quiet(normal, promptFd, prompt);
    show(promptFd, prompt);
    while (key == Key::kByte) key = edit(normal, readByte(), line);
  }
  show(promptFd, "\n");
  if (key == Key::kEndOfInput) throw Failure(kUsage, "nothing was entered");
  return line;
}

SecretSource::SecretSource(const std::string& path)
    : file_(path.empty() ? Descriptor() : openInput(path)),
      interactive_(path.empty() && isatty(kInput) == 1),
      lines_(file_.valid() ? file_.get() : kInput, path.empty() ? "standard input" : path) {}

bool SecretSource::next(const char* prompt, Secret& out) {
  if (!interactive_) return lines_.next(out);
  out = promptSecret(prompt);
  return true;
}

Secret SecretSource::require(const char* prompt, const char* what) {
  Secret secret;
  if (!next(prompt, secret)) throw Failure(kUsage, std::string("there is no ") + what + " in the input");
  return secret;
}

}  // namespace tool
