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

// Throws Failure (kBadValue) unless the text is acceptable as a seed or a salt.
void requireSeed(const Secret& seed);
void requireSalt(const Secret& salt);

// The first line of a file that has to hold a salt.
Secret readSaltFile(const std::string& path);

KeyRecord deriveRecord(const Secret& seed, std::string_view salt);
// Of a random seed and salt, as the configuration's is.
KeyRecord drawRecord();

// Throws the Failure that a library code stands for; nothing for success. what begins its message.
void requireDone(int code, const std::string& what);

// Makes a directory's stash file; the one that it replaces is kept under another name.
KeyRecord makeDirectoryStash(const std::string& path, bool force, const Secret& seed, const Secret& salt);

// Writes a record's stash file and reads it back. Throws Failure when it is not whole or not closed to others.
void writeStash(OutputFile& file, const KeyRecord& record);

}  // namespace tool
