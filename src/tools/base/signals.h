// SPDX-License-Identifier: Apache-2.0
// What has to be undone when a signal ends the process: temporary files are removed and the terminal gets its echo
// back.
#pragma once

#include <termios.h>

#include <csignal>
#include <string>

namespace tool {

// Holds the ending signals back on this thread while it exists.
class SignalBlock {
 public:
  SignalBlock() noexcept;
  ~SignalBlock();
  SignalBlock(const SignalBlock&) = delete;
  SignalBlock& operator=(const SignalBlock&) = delete;

 private:
  sigset_t before_;
};

// A file that is removed on destruction and when a signal ends the process, where not too many others are waiting for
// that. Made while signals are held back, so that none finds the file unknown.
class TemporaryFile {
 public:
  TemporaryFile() noexcept = default;
  // The folder stays the caller's, and open.
  TemporaryFile(int folder, std::string name) noexcept;
  TemporaryFile(const TemporaryFile&) = delete;
  TemporaryFile& operator=(TemporaryFile&& other) noexcept;
  ~TemporaryFile();

  const std::string& name() const noexcept { return name_; }
  void forget() noexcept;  // it has another name now

 private:
  int folder_ = -1;
  std::string name_;
  int slot_ = -1;
};

// Keeps echo and line editing of a terminal off while it exists. The mode normal comes back on destruction and when a
// signal ends or suspends the process; after a suspension echo is off again and prompt (a static text) is written to
// promptFd. One at a time. Throws Failure with kIoError.
class QuietTerminal {
 public:
  QuietTerminal(int fd, const termios& normal, int promptFd, const char* prompt);
  QuietTerminal(const QuietTerminal&) = delete;
  QuietTerminal& operator=(const QuietTerminal&) = delete;
  ~QuietTerminal();
};

// While it exists, the first ending signal only asks for a stop, so that work can be finished in order; the second ends
// the process. One at a time.
class GracefulStop {
 public:
  GracefulStop();
  ~GracefulStop();
  GracefulStop(const GracefulStop&) = delete;
  GracefulStop& operator=(const GracefulStop&) = delete;

  // Ends the process as the signal would have done, if there was one.
  void finish() const noexcept;
};
bool stopIsAsked() noexcept;

}  // namespace tool
