// SPDX-License-Identifier: Apache-2.0
// Runs a pass over a directory export: several threads work on batches of records, and what they make of them is
// delivered in the order of the input.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/failure.h"
#include "base/input.h"
#include "ldif/record.h"

namespace tool {

// What a pass makes of a batch. A pass that counts anything derives a part of its own.
struct ExportPart {
  struct Message {
    std::string text;
    std::string kind;  // the text without the place
  };

  Secret out;
  std::vector<Message> messages;                  // the first of each kind
  std::map<std::string, std::uint64_t> reported;  // all, by kind
  ExitCode exitCode = kSuccess;                   // of the first problem
  std::function<void()> early;                    // writes the output so far, when its turn has come

  // Writes the output so far when it is much: an entry can come to far more than it takes in the export.
  void spill();
  // Reports a problem with a value of an entry.
  void report(std::uint64_t line, const std::string& dn, ExitCode code, const std::string& text);
};

struct ExportSum {
  std::uint64_t entries = 0;
  ExitCode exitCode = kSuccess;  // of the first problem
};

struct ExportOptions {
  std::string in = "-";                         // "-" for standard input
  std::vector<std::string> attributes;          // none: those of AttributeSet
  std::vector<std::string> others;              // attributes that hold no passwords and are stopped at all the same
  unsigned threads = 0;                         // 0: one a processor
  bool resultsOnStdout = false;                 // the progress line stays away from them
  bool progress = false;                        // progress also where standard error is no terminal
  bool costly = false;                          // values are expensive: use small batches
  std::function<void(std::string_view)> write;  // takes the output of the parts, in order and in pieces
};

// Opens the export, compressed or not, and the library that its lines need. Throws Failure.
Input openExport(const ExportOptions& options);

// The threads of a pass, and the order of their batches.
class ExportRun {
 public:
  ExportRun(Input& input, const ExportOptions& options);
  ~ExportRun();
  ExportRun(const ExportRun&) = delete;
  ExportRun& operator=(const ExportRun&) = delete;

  const AttributeSet& attributes() const noexcept;
  // Runs loop on each thread. If one throws, all stop and this rethrows.
  ExportSum all(const std::function<void()>& loop);
  // For a loop: the next batch, false at the end; output of a batch before its end; and the turn of a batch, false
  // after a failure.
  bool take(Batch& batch);
  void spill(const Batch& batch, ExportPart& part);
  bool hand(const Batch& batch, const RecordWalker& walker, ExportPart& part, const std::function<void()>& deliver);

 private:
  class State;
  std::unique_ptr<State> state_;
};

// Calls work(walker, part) on many threads at once, and deliver(part) on one at a time, in order. If either throws, all
// threads stop and runExport rethrows. Reports lines that belong to no entry, and what is odd about the export as a
// whole; throws Failure (kBadValue) for one without entries.
template <typename Part, typename Work, typename Deliver>
ExportSum runExport(Input& input, const ExportOptions& options, const Work& work, const Deliver& deliver) {
  ExportRun run(input, options);
  return run.all([&] {
    Batch batch;
    Secret memory;  // of the part before
    while (run.take(batch)) {
      Part part;
      part.out = std::move(memory);
      part.early = [&] { run.spill(batch, part); };
      RecordWalker walker(batch, run.attributes());
      work(walker, part);
      if (!run.hand(batch, walker, part, [&] { deliver(part); })) return;
      memory = std::move(part.out);
      memory.clear();
    }
  });
}

}  // namespace tool
