// SPDX-License-Identifier: Apache-2.0
// Seeds, salts, the records derived from them, and the stash files that the library writes of them.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "base/output_file.h"
#include "base/secret.h"
#include "schemes/key_record.h"

namespace tool {

constexpr mode_t kStashMode = 0600;
constexpr off_t kStashRoom = 2048;  // bytes, more than any stash file has

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
