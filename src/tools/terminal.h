// SPDX-License-Identifier: Apache-2.0
// Asking for a secret on the terminal, and the one place that decides where a secret comes from: a file, the prompt or
// standard input.
#ifndef LDAPPW_TOOLS_TERMINAL_H
#define LDAPPW_TOOLS_TERMINAL_H

#include <string>

#include "input.h"
#include "secret.h"

namespace tool {

// Secrets that the user hands over one after the other: the lines of a file, or of standard input, or answers to
// prompts when standard input is a terminal.
class SecretSource {
 public:
  // An empty path means standard input.
  explicit SecretSource(const std::string& path);

  bool interactive() const noexcept { return interactive_; }
  // The next secret, or false at the end. At a terminal, prompt (a static text) asks for it and a line of any length is
  // read without echo. Throws Failure: kUsage when the terminal's input ends without a line, kIoError otherwise.
  bool next(const char* prompt, Secret& out);
  // The same where there has to be one: what names it in the message.
  Secret require(const char* prompt, const char* what);
  // False when next() may have to wait.
  bool lineBuffered() const noexcept { return !interactive_ && lines_.lineBuffered(); }

 private:
  bool interactive_;
  LineReader lines_;
};

}  // namespace tool

#endif
