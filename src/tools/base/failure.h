// SPDX-License-Identifier: Apache-2.0
// Exit codes, and the two ways of a problem: an operation on a value returns a Status, because one bad value among many
// ends nothing; setting up (files, keys, options) throws Failure, which main reports.
#pragma once

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <string>

namespace tool {

enum ExitCode : int {
  kSuccess = 0,
  kNoMatch = 1,   // the password, or the sync text, does not match
  kUsage = 2,     // a wrong command line
  kBadValue = 3,  // an unknown or malformed value, a value or password that the scheme cannot serve
  kBadKey = 4,    // a missing, bad or wrong key
  kIoError = 5,
  kInternal = 6  // no memory, a library that cannot be loaded
};

// The result of one operation on a value. text is static, says what the problem is and holds no secret.
struct Status {
  ExitCode code = kSuccess;
  const char* text = "";
  bool ok() const noexcept { return code == kSuccess; }
};

class Failure : public std::runtime_error {
 public:
  Failure(ExitCode code, const std::string& text) : std::runtime_error(text), code_(code) {}
  ExitCode code() const noexcept { return code_; }

 private:
  ExitCode code_;
};

// "what: <the system's text>" with kIoError, for a system call that failed.
inline Failure ioFailure(const std::string& what, int error = errno) {
  return Failure(kIoError, what + ": " + strerror(error));
}

// Keeps the first problem's code, for a verb that goes on after one.
inline void keepFirst(ExitCode& exitCode, ExitCode code) noexcept {
  if (exitCode == kSuccess) exitCode = code;
}

}  // namespace tool
