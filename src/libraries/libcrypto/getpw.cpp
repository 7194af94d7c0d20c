// SPDX-License-Identifier: Apache-2.0
// The terminal password prompt.
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "encoding_utils.h"
#include "owners.h"

namespace ldappw {
namespace {

constexpr size_t kLineSize = 255;

// Switches echo off while it lives. Input that is no terminal is left alone.
class SilentTerminal {
 public:
  SilentTerminal() noexcept : descriptor_(fileno(stdin)) {
    if (tcgetattr(descriptor_, &saved_) != 0) return;
    termios silent = saved_;
    silent.c_lflag &= ~static_cast<tcflag_t>(ECHO | ECHONL);
    if (tcsetattr(descriptor_, TCSANOW, &silent) != 0) {
      const int error = errno;
      std::fprintf(stderr, "Internal error setting terminal attribute.\n");
      std::exit(error);
    }
    changed_ = true;
  }
  ~SilentTerminal() {
    if (changed_ && tcsetattr(descriptor_, TCSANOW, &saved_) != 0) {
      std::fprintf(stderr, "Unable to reset the display.\n");
    }
  }
  SilentTerminal(const SilentTerminal&) = delete;
  SilentTerminal& operator=(const SilentTerminal&) = delete;

 private:
  int descriptor_;
  termios saved_{};
  bool changed_ = false;
};

}  // namespace
}  // namespace ldappw

using namespace ldappw;

extern "C" {

// Documented in encoding_utils.h.

char* getPassword(void) noexcept {
  SecretArray<kLineSize> line;
  {
    const SilentTerminal silent;
    std::printf("Enter password ==> ");
    std::fflush(stdout);
    if (std::fgets(line.text(), static_cast<int>(line.size()), stdin) == nullptr) line.text()[0] = '\0';
    // Meant: the last character goes, whatever it is.
    if (const size_t length = std::strlen(line.text()); length > 0) line.text()[length - 1] = '\0';
  }
  std::putchar('\n');
  return strdup(line.text());
}

}  // extern "C"
