// SPDX-License-Identifier: Apache-2.0
// What has to be undone when a signal ends the process: temporary files are removed and the terminal gets its echo
// back.
#ifndef LDAPPW_TOOLS_SIGNALS_H
#define LDAPPW_TOOLS_SIGNALS_H

#include <signal.h>
#include <termios.h>

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

// Has the file removed when a signal ends the process. Returns a slot for forgetFile, or -1 when the path is too long
// or all slots are taken.
int removeOnSignal(const std::string& path) noexcept;
void forgetFile(int slot) noexcept;

// Puts the terminal into the mode quiet and has the mode normal restored when a signal ends or suspends the process;
// after a suspension quiet is set again and prompt (a static text) written to promptFd. False when the mode cannot be
// set. One terminal at a time.
bool quietTerminal(int fd, const termios& normal, const termios& quiet, int promptFd, const char* prompt) noexcept;
void restoreTerminal() noexcept;

}  // namespace tool

#endif
