// SPDX-License-Identifier: Apache-2.0
// What the verbs share: exit codes and messages, the table of schemes, telling stored values apart, key records, and
// making, checking and opening stored values.
//
// Operations on values return a Status and may be called from many threads at once, with one KeyRecord for all of them.
// Setting up (files, keys, options) throws Failure, which main tells.
#ifndef LDAPPW_TOOLS_COMMON_H
#define LDAPPW_TOOLS_COMMON_H

#include <cstddef>
#include <exception>
#include <string>
#include <string_view>

#include "aes_keys.h"
#include "output_file.h"
#include "password_schemes.h"
#include "secret.h"

namespace tool {

// ---- Results ----

enum ExitCode : int {
  kSuccess = 0,
  kNoMatch = 1,   // the password, or the sync text, does not match
  kUsage = 2,     // a wrong command line
  kBadValue = 3,  // an unknown or malformed value, a value or password that the scheme cannot serve
  kBadKey = 4,    // a missing, bad or wrong key
  kIoError = 5,
  kInternal = 6  // no memory, no provider
};

// The result of one operation on a value. text is a static text that tells the problem and holds no secret.
struct Status {
  ExitCode code = kSuccess;
  const char* text = "";
  bool ok() const noexcept { return code == kSuccess; }
};

class Failure : public std::exception {
 public:
  Failure(ExitCode code, std::string text) : code_(code), text_(std::move(text)) {}
  ExitCode code() const noexcept { return code_; }
  const char* what() const noexcept override { return text_.c_str(); }

 private:
  ExitCode code_;
  std::string text_;
};

// "what: <the text of error>", for a Failure after a system call.
std::string systemText(const std::string& what, int error);

// Writes "ldappw: text" or "ldappw: warning: text" and a newline to standard error, in one write. Bytes that a terminal
// would act on are shown as \xNN.
void message(std::string_view text) noexcept;
void warning(std::string_view text) noexcept;

// The text with bytes outside printable ASCII and well-formed UTF-8 as \xNN.
std::string printable(std::string_view text);

// Keeps the first problem's code: for a verb that goes on after one.
inline void keepFirst(int& exitCode, ExitCode code) noexcept {
  if (exitCode == kSuccess) exitCode = code;
}

// ---- Schemes ----

struct Scheme {
  const char* name;      // "ssha"; "clear" for clear text
  const char* tag;       // "{SSHA}"; empty for clear text
  int code;              // of enum PasswordFormat
  bool reversible;       // clear text is not: there is nothing to reverse
  bool makeable;         // formatPassword can make it
  std::size_t cutBytes;  // passwords are cut to this many bytes; 0: taken whole
  int keyIndex;          // 0 to 2 for the AES schemes, else -1
  bool needsKey() const noexcept { return keyIndex >= 0; }
};

// All schemes, clear text first; the end of the table has a null name.
extern const Scheme kSchemes[];

// By name, in any case, with or without braces ("ssha", "{SSHA}", "clear"); null when there is none.
const Scheme* findScheme(std::string_view name) noexcept;

// The scheme of a stored value: by its tag, qveil for an untagged value wrapped in ">" and "<", otherwise clear text.
// Ask unknownTag first: a value with a tag of no known scheme counts as clear text here. A known tag without a payload
// is of that scheme (and malformed).
const Scheme& schemeOf(std::string_view value) noexcept;

// True for a value that begins with a tag "{...}" of no known scheme.
bool unknownTag(std::string_view value) noexcept;

// What is wrong with the payload of a value, or null when it is well formed. Clear text always is; vldl is not looked
// at; an unknown tag is a problem.
const char* payloadProblem(std::string_view value);

// The number of bytes that base64 text (RFC 4648, padded, no other characters) stands for, or -1 when it is none.
long base64Bytes(std::string_view text) noexcept;

// ---- Keys ----

// The record of one stash file. Move-only.
class KeyRecord {
 public:
  KeyRecord() noexcept = default;
  explicit KeyRecord(AesKeyData* record) noexcept : record_(record) {}
  KeyRecord(KeyRecord&& other) noexcept : record_(other.record_) { other.record_ = nullptr; }
  KeyRecord& operator=(KeyRecord&& other) noexcept;
  ~KeyRecord() { freeAesKeyData(record_); }

  // Loads a stash file and warns when others can read it; an empty path gives no record. Throws Failure: kIoError when
  // the file cannot be opened, kBadKey when it is no stash file.
  static KeyRecord load(const std::string& path);

  AesKeyData* get() const noexcept { return record_; }
  explicit operator bool() const noexcept { return record_ != nullptr; }
  std::string_view sync() const noexcept;
  std::string_view salt() const noexcept;

 private:
  AesKeyData* record_ = nullptr;
};

// Loads the crypto provider; throws Failure (kInternal) when it cannot be had. Call it before threads start.
void requireProvider();

// ---- Stored values ----

// Why the scheme cannot hold the password unharmed: a NUL byte; under sha a beginning of "{SHA}"; too long a password.
// A cut (see cutBytes) is no such reason.
Status passwordProblem(const Scheme& scheme, std::string_view password) noexcept;

// Makes the stored value of a password; for clear text that is the password. The AES schemes need key (kBadKey
// otherwise). A crypt salt is drawn anew for each call.
Status formatPassword(const Scheme& scheme, const KeyRecord& key, std::string_view password, Secret& out);
inline Status formatPassword(const Scheme& scheme, const KeyRecord& key, const Secret& password, Secret& out) {
  return formatPassword(scheme, key, password.view(), out);
}

// Turns a stored value into clear text; clear text comes back as it is. kBadValue for an unknown tag, a malformed
// payload or a one-way scheme; kBadKey for an AES value when there is no key, or when the key does not open it.
Status revealValue(std::string_view value, const KeyRecord& key, Secret& out);

// Checks a password against a stored value: kSuccess, kNoMatch, or the problem (as of revealValue, one-way schemes
// being fine). Bytes beyond a scheme's cut do not count.
Status verifyValue(std::string_view value, const KeyRecord& key, std::string_view password);

// ---- Results on standard output ----

// Gathers results and writes them to standard output. Its buffer is wiped. Throws Failure with kIoError.
class Results {
 public:
  void write(std::string_view bytes);
  void line(std::string_view text);
  void flush();

 private:
  Secret buffer_;
};

// Appends text as a JSON string, quotes included; the text must be well-formed UTF-8. For secrets, which must not go
// through a JSON library's buffers.
void appendJsonString(Secret& out, std::string_view text);
bool wellFormedUtf8(std::string_view text) noexcept;

// Appends the base64 of bytes.
void appendBase64(Secret& out, std::string_view bytes);

// The JSON object that stands for a value or password that could not be served; index counts from 1.
std::string problemJson(std::size_t index, const Status& status);

}  // namespace tool

#endif
