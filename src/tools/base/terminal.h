// SPDX-License-Identifier: Apache-2.0
// Asking for a secret on the terminal, and the one place that decides where a secret comes from: a file, the prompt or
// standard input.
#pragma once

#include <string>

#include "base/input.h"
#include "base/messages.h"
#include "base/secret.h"

namespace tool {

// Secrets that the user hands over one after the other: the lines of a file, or of standard input, or answers to
// prompts when standard input is a terminal.
class SecretSource {
 public:
  // An empty path, or "-", means standard input.
  explicit SecretSource(const std::string& path, LineLimit limit = kPasswordLine, char end = '\n');

  bool interactive() const noexcept { return interactive_; }
  // The next secret, or false at the end. At a terminal, prompt (a static text) asks for it and a line is read without
  // echo. Throws Failure: kUsage when the terminal's input ends without a line, kBadValue for a line beyond the limit,
  // kIoError otherwise. A line that ends in a carriage return, or begins with a byte order mark, is taken as it is,
  // with a warning.
  bool next(const char* prompt, Secret& out);
  // The same where there has to be one: what names it in the message.
  Secret require(const char* prompt, const char* what);
  // The same, and at a terminal it has to be typed a second time: again is the prompt for that.
  Secret requireTwice(const char* prompt, const char* again, const char* what);
  // False when next() may have to wait.
  bool lineBuffered() const noexcept { return !interactive_ && lines_.lineBuffered(); }

 private:
  void warnOfStrayBytes(const Secret& line);

  bool interactive_;
  LineLimit limit_;
  std::string name_;
  LineReader lines_;
  std::uint64_t number_ = 0;
  Repeated warnings_{1, warning};
};

}  // namespace tool
