// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>

#include "base/failure.h"
#include "schemes/key_record.h"

namespace tool {

// Says in a line how many AES values of the export the keys open; the code is 0 when all.
ExitCode checkExport(const KeyRecord& keys, const std::string& path, bool json, bool quiet);

}  // namespace tool
