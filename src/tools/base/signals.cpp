// SPDX-License-Identifier: Apache-2.0
// The handlers of ending signals. Everything here that a handler reads is static, filled while the signals are held
// back, and touched with async-signal-safe calls only.
#include "base/signals.h"

#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <utility>

#include "base/descriptor.h"
#include "base/failure.h"

namespace tool {
namespace {

constexpr int kEndingSignals[] = {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGPIPE};
constexpr int kFileSlots = 4;

struct FileSlot {
  volatile sig_atomic_t used;
  int folder;
  char name[NAME_MAX + 1];
};

struct TerminalState {
  volatile sig_atomic_t quiet;
  int fd;
  int promptFd;
  const char* prompt;
  termios normal;
  termios silent;
};

FileSlot fileSlots[kFileSlots];
volatile sig_atomic_t stopsGracefully;
volatile sig_atomic_t stopSignal;  // 0 until it has come
TerminalState terminal;

sigset_t endingSet() noexcept {
  sigset_t set;
  sigemptyset(&set);
  for (int number : kEndingSignals) sigaddset(&set, number);
  sigaddset(&set, SIGTSTP);
  return set;
}

void undoAll() noexcept {
  for (FileSlot& slot : fileSlots) {
    if (slot.used != 0) unlinkat(slot.folder, slot.name, 0);
  }
  if (terminal.quiet != 0) tcsetattr(terminal.fd, TCSANOW, &terminal.normal);
}

void install(int number, void (*handler)(int)) noexcept {
  struct sigaction action {};
  action.sa_handler = handler;
  action.sa_mask = endingSet();
  action.sa_flags = SA_RESTART;
  sigaction(number, &action, nullptr);
}

void handle(int number, void (*handler)(int)) noexcept {
  struct sigaction before;
  if (sigaction(number, nullptr, &before) != 0 || before.sa_handler == SIG_IGN) return;  // as of nohup: stays ignored
  install(number, handler);
}

// The signal is blocked while its handler runs: raised again, it takes its default effect on the return.
extern "C" void onEnd(int number) {
  if (stopsGracefully != 0 && stopSignal == 0 && number != SIGPIPE) {
    stopSignal = number;
    return;
  }
  undoAll();
  signal(number, SIG_DFL);
  raise(number);
}

// Stops with the terminal as it was found, and goes on with echo off.
extern "C" void onSuspend(int number) {
  const int savedErrno = errno;
  tcsetattr(terminal.fd, TCSANOW, &terminal.normal);
  signal(number, SIG_DFL);
  raise(number);
  sigset_t only;
  sigemptyset(&only);
  sigaddset(&only, number);
  pthread_sigmask(SIG_UNBLOCK, &only, nullptr);  // the process stops here
  pthread_sigmask(SIG_BLOCK, &only, nullptr);
  install(number, onSuspend);
  tcsetattr(terminal.fd, TCSANOW, &terminal.silent);
  tryWrite(terminal.promptFd, {terminal.prompt, strlen(terminal.prompt)});
  errno = savedErrno;
}

void handleEndings() noexcept {
  for (int number : kEndingSignals) handle(number, onEnd);
}

}  // namespace

SignalBlock::SignalBlock() noexcept {
  const sigset_t set = endingSet();
  pthread_sigmask(SIG_BLOCK, &set, &before_);
}

SignalBlock::~SignalBlock() {
  pthread_sigmask(SIG_SETMASK, &before_, nullptr);
}

TemporaryFile::TemporaryFile(int folder, std::string name) noexcept : folder_(folder), name_(std::move(name)) {
  if (name_.size() > NAME_MAX) return;
  for (int i = 0; i < kFileSlots && slot_ < 0; ++i) {
    if (fileSlots[i].used == 0) slot_ = i;
  }
  if (slot_ < 0) return;
  fileSlots[slot_].folder = folder_;
  memcpy(fileSlots[slot_].name, name_.c_str(), name_.size() + 1);
  fileSlots[slot_].used = 1;
  handleEndings();
}

TemporaryFile& TemporaryFile::operator=(TemporaryFile&& other) noexcept {
  std::swap(folder_, other.folder_);
  std::swap(name_, other.name_);
  std::swap(slot_, other.slot_);
  return *this;
}

TemporaryFile::~TemporaryFile() {
  if (!name_.empty()) unlinkat(folder_, name_.c_str(), 0);
  forget();
}

void TemporaryFile::forget() noexcept {
  if (slot_ >= 0) fileSlots[slot_].used = 0;
  slot_ = -1;
  name_.clear();
}

QuietTerminal::QuietTerminal(int fd, const termios& normal, int promptFd, const char* prompt) {
  const SignalBlock block;
  terminal.fd = fd;
  terminal.promptFd = promptFd;
  terminal.prompt = prompt;
  terminal.normal = normal;
  terminal.silent = normal;
  terminal.silent.c_lflag &= ~static_cast<tcflag_t>(ECHO | ECHOE | ECHOK | ECHONL | ICANON);
  terminal.silent.c_cc[VMIN] = 1;
  terminal.silent.c_cc[VTIME] = 0;
  if (tcsetattr(fd, TCSANOW, &terminal.silent) != 0) throw ioFailure("the terminal's echo cannot be switched off");
  terminal.quiet = 1;
  handleEndings();
  handle(SIGTSTP, onSuspend);
}

QuietTerminal::~QuietTerminal() {
  const SignalBlock block;
  tcsetattr(terminal.fd, TCSANOW, &terminal.normal);
  terminal.quiet = 0;
  struct sigaction before;
  if (sigaction(SIGTSTP, nullptr, &before) == 0 && before.sa_handler == onSuspend) signal(SIGTSTP, SIG_DFL);
}

GracefulStop::GracefulStop() {
  const SignalBlock block;
  stopsGracefully = 1;
  handleEndings();
}

GracefulStop::~GracefulStop() {
  stopsGracefully = 0;
}

void GracefulStop::finish() const noexcept {
  if (stopSignal == 0) return;
  signal(stopSignal, SIG_DFL);
  raise(stopSignal);
}

bool stopIsAsked() noexcept {
  return stopSignal != 0;
}

}  // namespace tool
