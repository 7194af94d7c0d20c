// SPDX-License-Identifier: Apache-2.0
// The prompt reader. The terminal is read byte by byte and the line is edited here: the kernel's line editing would cut
// a line at 4095 bytes without a word.
#include "base/terminal.h"

#include <fcntl.h>
#include <termios.h>
#include <unistd.h>

#include "base/failure.h"
#include "base/signals.h"

namespace tool {
namespace {

constexpr int kInput = STDIN_FILENO;

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

char readByte(Secret& byte) {
  byte.clear();
  if (!Input().more(byte, 1)) throw Failure(kIoError, "the terminal was closed");
  return byte.view().front();
}

Secret promptSecret(const char* prompt, LineLimit limit) {
  termios normal;
  if (tcgetattr(kInput, &normal) != 0) throw ioFailure("the terminal's mode is not known");
  const Descriptor own = openPath("/dev/tty", O_WRONLY);
  const int promptFd = own.valid() ? own.get() : STDERR_FILENO;
  Secret byte;
  Secret line;
  Key key = Key::kByte;
  {
    const QuietTerminal quiet(kInput, normal, promptFd, prompt);
    tryWrite(promptFd, prompt);  // without a prompt the answer can be typed all the same
    while (key == Key::kByte && line.size() <= limit.bytes) key = edit(normal, readByte(byte), line);
  }
  tryWrite(promptFd, "\n");
  if (line.size() > limit.bytes) throw Failure(kBadValue, std::string("that is too long for ") + limit.what);
  if (key == Key::kEndOfInput) throw Failure(kUsage, "nothing was entered");
  return line;
}

}  // namespace

SecretSource::SecretSource(const std::string& path, LineLimit limit, char end)
    : interactive_((path.empty() || path == "-") && isatty(kInput) == 1),
      limit_(limit),
      name_(Input::nameOf(path)),
      lines_(Input(path), limit, end) {}

// What a line has from the system that it comes from, and nobody types.
void SecretSource::warnOfStrayBytes(const Secret& line) {
  const std::string place = name_ + ", line " + std::to_string(++number_);
  if (line.view().substr(0, kByteOrderMark.size()) == kByteOrderMark) {
    warnings_.add(place + " begins with a byte order mark, which is taken as part of it", "with a byte order mark");
  }
  if (!line.empty() && line.view().back() == '\r') {
    warnings_.add(place + " ends in a carriage return, which is taken as part of it", "with a carriage return");
  }
}

bool SecretSource::next(const char* prompt, Secret& out) {
  if (!interactive_) {
    if (!lines_.next(out)) return false;
    warnOfStrayBytes(out);
    return true;
  }
  out = promptSecret(prompt, limit_);
  return true;
}

Secret SecretSource::require(const char* prompt, const char* what) {
  Secret secret;
  if (!next(prompt, secret)) throw Failure(kUsage, std::string("there is no ") + what + " in the input");
  return secret;
}

Secret SecretSource::requireTwice(const char* prompt, const char* again, const char* what) {
  Secret secret = require(prompt, what);
  if (interactive_ && !equalBytes(secret.view(), require(again, what).view())) {
    throw Failure(kUsage, std::string("the second ") + what + " is not the first one");
  }
  return secret;
}

}  // namespace tool
