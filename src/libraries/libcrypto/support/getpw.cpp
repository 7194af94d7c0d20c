// SPDX-License-Identifier: Apache-2.0
// The terminal password prompt.
#include "encoding_utils.h"

#include <poll.h>
#include <pthread.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>

#include "support/cancellation.h"
#include "support/owners.h"

namespace ldappw {
namespace {

constexpr size_t kLineSize = 255;
constexpr int kSignals[] = {SIGINT, SIGTERM, SIGHUP, SIGQUIT};

// What a signal handler brings back before the signal acts.
int terminal;
termios attributesBefore;
struct sigaction actionsBefore[std::size(kSignals)];

// The signal that is raised again acts, as it would have without us, once it is let through.
void restoreAndAct(int signal) noexcept {
  const int error = errno;
  tcsetattr(terminal, TCSANOW, &attributesBefore);
  for (size_t i = 0; i < std::size(kSignals); ++i) {
    if (kSignals[i] == signal) sigaction(signal, &actionsBefore[i], nullptr);
  }
  sigset_t itself;
  sigemptyset(&itself);
  sigaddset(&itself, signal);
  raise(signal);
  pthread_sigmask(SIG_UNBLOCK, &itself, nullptr);
  errno = error;
}

// Switches echo off while it lives. Input that is no terminal is left alone. The signals come while it waits for input
// and at no other time: one between the switching and the reading would leave the echo on.
class SilentTerminal {
 public:
  explicit SilentTerminal(int descriptor) noexcept {
    terminal = descriptor;
    isTerminal_ = tcgetattr(terminal, &attributesBefore) == 0;
    if (!isTerminal_) return;
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : kSignals) sigaddset(&signals, signal);
    pthread_sigmask(SIG_BLOCK, &signals, &maskBefore_);
    for (size_t i = 0; i < std::size(kSignals); ++i) sigaction(kSignals[i], nullptr, &actionsBefore[i]);
    silence();
  }
  ~SilentTerminal() {
    if (!isTerminal_) return;
    if (tcsetattr(terminal, TCSANOW, &attributesBefore) != 0) std::fprintf(stderr, "Unable to reset the display.\n");
    for (size_t i = 0; i < std::size(kSignals); ++i) sigaction(kSignals[i], &actionsBefore[i], nullptr);
    pthread_sigmask(SIG_SETMASK, &maskBefore_, nullptr);
  }
  SilentTerminal(const SilentTerminal&) = delete;
  SilentTerminal& operator=(const SilentTerminal&) = delete;

  // Returns when there is input. Where a signal comes and its action returns, echo is switched off again.
  void awaitInput() noexcept {
    pollfd input{terminal, POLLIN, 0};
    while (isTerminal_ && ppoll(&input, 1, nullptr, &maskBefore_) < 0 && errno == EINTR) silence();
  }

 private:
  static void silence() noexcept {
    struct sigaction restoring {};
    restoring.sa_handler = restoreAndAct;
    for (size_t i = 0; i < std::size(kSignals); ++i) {
      if (actionsBefore[i].sa_handler != SIG_IGN) sigaction(kSignals[i], &restoring, nullptr);
    }
    termios silent = attributesBefore;
    silent.c_lflag &= ~static_cast<tcflag_t>(ECHO | ECHONL);
    if (tcsetattr(terminal, TCSANOW, &silent) == 0) return;
    const int error = errno;
    std::fprintf(stderr, "Internal error setting terminal attribute.\n");
    std::exit(error);
  }

  bool isTerminal_;
  sigset_t maskBefore_{};
};

// One byte of the input, without a buffer in which the password or what follows it would stay; a stream without a
// descriptor is read as it is.
ssize_t readByte(int descriptor, char* byte) noexcept {
  if (descriptor >= 0) return read(descriptor, byte, 1);
  const int next = std::getc(stdin);
  if (next == EOF) return 0;
  *byte = static_cast<char>(next);
  return 1;
}

size_t readLine(SilentTerminal& silent, int descriptor, char* line, size_t size) noexcept {
  size_t length = 0;
  while (length + 1 < size) {
    silent.awaitInput();
    const ssize_t count = readByte(descriptor, line + length);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0 || line[length++] == '\n') break;
  }
  return length;
}

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

char* getPassword(void) noexcept {
  const NoCancellation uncancelled;
  SecretArray<kLineSize> line;
  const int descriptor = fileno(stdin);
  {
    SilentTerminal silent(descriptor);
    std::printf("Enter password ==> ");
    std::fflush(stdout);
    // The last character goes, whatever it is: a line that is too long or ends without a newline loses one of its own.
    const size_t length = readLine(silent, descriptor, line.text(), line.size());
    if (length > 0) line.text()[length - 1] = '\0';
  }
  std::putchar('\n');
  return newText(line.text());
}

}  // extern "C"
