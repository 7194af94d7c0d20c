// SPDX-License-Identifier: Apache-2.0
// Runs a pass over a directory export: batches of records through several threads, and what comes of them in the order
// of the input. A pass is a work, which makes a part of one batch, and a delivery, which takes the output of the parts.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/failure.h"
#include "base/input.h"
#include "ldif/record.h"
#include "ldif/tally.h"

namespace tool {

// What a pass makes of a batch beside the counts: each that needs it derives its own.
struct Gathered {
  virtual ~Gathered() = default;
};
constexpr char kOutsideText[] = "lines that belong to no entry";

// What comes of one batch, and in sum of all.
struct Part {
  struct Message {
    std::string text;
    std::string kind;  // the text without the place
  };

  Secret out;
  std::vector<Message> messages;
  Tally tally;
  ExitCode exitCode = kSuccess;  // of the first problem
  std::unique_ptr<Gathered> gathered;

  // Reports a problem with a value of an entry.
  void report(std::uint64_t line, const std::string& dn, ExitCode code, const std::string& text);
};

struct ExportOptions {
  std::string in = "-";                 // "-" for standard input
  std::vector<std::string> attributes;  // none: those of AttributeSet
  std::vector<std::string> others;      // attributes that hold no passwords and are stopped at all the same
  unsigned threads = 0;                 // 0: one a processor
  bool resultsOnStdout = false;         // the progress line stays away from them
  bool progress = false;                // progress also where standard error is no terminal
  bool costly = false;                  // values take so long that few at a time are worked on
};

// Opens the export, compressed or not, and the library that its lines need. Throws Failure.
Input openExport(const ExportOptions& options);

// work runs on many threads at once; deliver, and all reporting, on one at a time, in order. An exception of either
// ends all and leaves runExport. Returns the sum of the parts, without their output, messages and what was gathered.
// Lines that belong to no entry are reported here, and what is odd about the export as a whole; one without entries is
// a Failure (kBadValue).
Part runExport(Input& input, const ExportOptions& options, const std::function<void(RecordWalker&, Part&)>& work,
               const std::function<void(const Part& part)>& deliver);

}  // namespace tool
