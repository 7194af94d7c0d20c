// SPDX-License-Identifier: Apache-2.0
// Putting the clear passwords of an export through every scheme: made, checked, a wrong one refused, read back.
#ifndef LDAPPW_TOOLS_TRIAL_RUN_H
#define LDAPPW_TOOLS_TRIAL_RUN_H

#include <cstdint>
#include <string>
#include <vector>

#include "common.h"
#include "ldif_record.h"

namespace tool {

// The schemes of a trial.
constexpr const char* kTrialSchemes[] = {"sha", "ssha", "md5", "crypt", "qveil", "aes128", "aes192", "aes256"};
constexpr std::size_t kTrialSchemeCount = sizeof kTrialSchemes / sizeof kTrialSchemes[0];

struct TrialCounts {
  std::uint64_t values = 0;     // made
  std::uint64_t verified = 0;   // accepted by the server's check
  std::uint64_t refused = 0;    // whose wrong password was not accepted
  std::uint64_t recovered = 0;  // read back and equal, as far as the scheme holds the password
  std::uint64_t skipped = 0;    // passwords that the scheme cannot hold
  double seconds = 0;           // of processor time
};

struct TrialTally {
  std::uint64_t entries = 0;
  std::uint64_t clear = 0;
  std::uint64_t read = 0;    // reversible values of the export that the keys open
  std::uint64_t unread = 0;  // and that they do not
  std::uint64_t other = 0;   // one-way, unknown, elsewhere, not well formed
  std::uint64_t differences = 0;
  TrialCounts schemes[kTrialSchemeCount];

  void add(const TrialTally& part) noexcept;
};

struct TrialResult {
  TrialTally tally;
  std::vector<std::string> findings;
};

TrialResult trialBatch(const Batch& batch, const AttributeSet& attributes, const KeyRecord& keys);

}  // namespace tool

#endif
