// SPDX-License-Identifier: Apache-2.0
// What the key verbs share: seeds, salts, records derived from them, and stash files that the library has written.
#ifndef LDAPPW_TOOLS_KEYS_H
#define LDAPPW_TOOLS_KEYS_H

#include <string>
#include <string_view>

#include "command_line.h"
#include "key_record.h"
#include "output_file.h"

namespace tool {

constexpr mode_t kStashMode = 0600;
constexpr off_t kStashRoom = 2048;  // bytes, more than any stash file has

void setUpKeysCreate(CLI::App& verb, ExitCode& exitCode);
void setUpKeysRestore(CLI::App& verb, ExitCode& exitCode);
void setUpKeysShow(CLI::App& verb, ExitCode& exitCode);
void setUpKeysCheck(CLI::App& verb, ExitCode& exitCode);
void setUpKeysCompare(CLI::App& verb, ExitCode& exitCode);

// Says in a line how many AES values of the export the keys open; the code is 0 when all.
ExitCode checkExport(const KeyRecord& keys, const std::string& path, bool json, bool quiet);

// The options of the verbs that make keys from a seed.
struct SeedOptions {
  std::string seedFile;
  std::string saltFile;
  CLI::Option* secrets = nullptr;
  bool force = false;
  bool json = false;
};
void addSeedOptions(CLI::App& verb, SeedOptions& options, const std::string& saltHelp);

// Throws Failure (kBadValue) unless the text is acceptable as a seed or a salt.
void requireSeed(const Secret& seed);
void requireSalt(const Secret& salt);

// The first line of a file that has to hold a salt.
Secret readSaltFile(const std::string& path);

KeyRecord deriveRecord(const Secret& seed, std::string_view salt);

// Throw the Failure that a library code stands for; nothing for success. what begins its message. requireWritten is for
// a code from writing a file: a failed file operation and a failed provider have one code, and the provider was asked
// before.
void requireDone(int code, const std::string& what);
void requireWritten(int code, const std::string& what);

// Makes a directory's stash file; the one that it replaces is kept under another name.
KeyRecord makeDirectoryStash(const std::string& path, bool force, const Secret& seed, const Secret& salt);

// Reads what the library has written to the temporary file. Throws Failure unless that is still the file that was made
// for it, closed to others and of the size of its record.
KeyRecord readBack(const OutputFile& file);

}  // namespace tool

#endif
