// SPDX-License-Identifier: Apache-2.0
// Judges the entries of a batch: their schemes, and what is wrong with their passwords and values.
#pragma once

#include <bitset>
#include <set>
#include <string>
#include <vector>

#include "audit/facts.h"
#include "audit/lines.h"
#include "audit/marks.h"
#include "ldif/export_run.h"
#include "ldif/key_ring.h"
#include "ldif/record.h"
#include "schemes/examine.h"

namespace tool {

// What an audit is to look for. Used by many threads at once.
struct AuditRules {
  KeyRing keys;
  bool allowBinary = false;
  Lines lines = Lines::kNone;
  bool valuesAreProblems = false;  // a value that is not fine counts for the exit code, earlier passwords included
  MarkKey markKey;
  std::vector<Mark> knownBad;  // sorted
  std::vector<Secret> tried;   // the same passwords, where they are to be tried on one-way values
  bool checkHashes = false;    // tries these, and uid and cn, on one-way values
  std::vector<bool> accepted;  // schemes, as in Facts; none: all
  size_t subtreeDepth = 3;     // RDNs
  size_t listed = 20;          // DNs a finding

  // The passwords of a file, one a line.
  void loadKnownBad(const std::string& path);
};

// The attributes, besides passwords, that the collector has to see.
std::vector<std::string> auditedNames();

class Collector {
 public:
  // The lines that the rules ask for are appended to the output of the part.
  Collector(const AuditRules& rules, ExportPart& part) : rules_(rules), part_(part) {}

  Facts collect(RecordWalker& walker);
  // The code of the first value that is not fine.
  ExitCode firstProblem() const noexcept { return firstProblem_; }

 private:
  struct Entry {
    std::string dn;
    std::vector<Secret> names;           // uid and cn
    std::set<Secret, ByBytes> lowNames;  // the same in lower case
    std::vector<StoredLine> lines;
    bool account = false;
    bool hasPassword = false;  // some are not at hand: behind a URL, or on a line that is not well formed
    std::bitset<kFindingCount> findings;
  };

  void takeLine(const RecordWalker& walker);
  void takePassword(const RecordWalker& walker, std::string_view type);
  void finishEntry();
  Verdict judgeLine(const StoredLine& line, Subtree& subtree);
  Verdict judge(const Secret& value, bool current, Subtree& subtree);
  Condition judgeCurrent(const Examined& value);
  Condition open(const Examined& value, Secret& password) const;
  void judgePassword(std::string_view password);
  void tryNames(const Examined& value);
  bool matches(const Examined& value, const Secret& password);
  std::string keptDn();
  void found(Finding finding) { entry_.findings.set(static_cast<size_t>(finding)); }
  void sight(const Mark& mark);

  const AuditRules& rules_;
  ExportPart& part_;
  Facts facts_;
  Sha256 sha256_;
  Entry entry_;
  ExitCode firstProblem_ = kSuccess;
  bool inEntry_ = false;
  bool holds_ = false;  // the entry is the last one of the holders
};

}  // namespace tool
