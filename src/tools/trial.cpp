// SPDX-License-Identifier: Apache-2.0
// ldappw trial: shows on the passwords of a real export that every scheme does what it promises.
#include <CLI/CLI.hpp>
#include <memory>

#include "common.h"
#include "ldif_pipeline.h"
#include "ldif_report.h"
#include "trial_run.h"
#include "verbs.h"

namespace tool {
namespace {

constexpr char kNotes[] =
    "verified: accepted by the server's check. refused: a password that differs in the first byte is not accepted.\n"
    "recovered: read back and equal. values/s: made, checked twice and read back, per second of processor time.\n"
    "crypt looks at the first 8 bytes of a password and qveil holds the first 46. ssha, md5 and crypt end at a NUL "
    "byte.\n"
    "skipped: a password with a NUL byte, or under sha one that begins with {SHA}, which no value can stand for.";

struct Options {
  std::string file;
  std::string keys;
  bool json = false;
};

bool reversible(std::size_t scheme) noexcept {
  return findScheme(kTrialSchemes[scheme])->reversible;
}

std::uint64_t rateOf(const TrialCounts& counts) noexcept {
  return counts.seconds > 0 ? static_cast<std::uint64_t>(static_cast<double>(counts.values) / counts.seconds) : 0;
}

void writeTable(const TrialTally& tally, Results& results) {
  results.line(leftCell("scheme", 9) + cell("values", 10) + cell("verified", 10) + cell("refused", 10) +
               cell("recovered", 10) + cell("skipped", 10) + cell("values/s", 12));
  for (std::size_t i = 0; i < kTrialSchemeCount; ++i) {
    const TrialCounts& counts = tally.schemes[i];
    results.line(leftCell(kTrialSchemes[i], 9) + cell(counts.values, 10) + cell(counts.verified, 10) +
                 cell(counts.refused, 10) + (reversible(i) ? cell(counts.recovered, 10) : cell("-", 10)) +
                 cell(counts.skipped, 10) + cell(rateOf(counts), 12));
  }
  results.line(std::to_string(tally.entries) + " entries: " + std::to_string(tally.clear) + " clear passwords, " +
               std::to_string(tally.read) + " reversible values read, " + std::to_string(tally.unread) + " not read, " +
               std::to_string(tally.other) + " others; " + std::to_string(tally.differences) + " differences");
  results.line(kNotes);
}

void writeObject(const TrialTally& tally, Results& results) {
  const auto field = [](const char* name, std::uint64_t count) {
    return '"' + std::string(name) + "\":" + std::to_string(count);
  };
  std::string text = "{" + field("entries", tally.entries) + "," + field("clear", tally.clear) + "," +
                     field("reversibleRead", tally.read) + "," + field("reversibleUnread", tally.unread) + "," +
                     field("others", tally.other) + "," + field("differences", tally.differences) + ",\"schemes\":{";
  for (std::size_t i = 0; i < kTrialSchemeCount; ++i) {
    const TrialCounts& counts = tally.schemes[i];
    text += (i == 0 ? "\"" : ",\"") + std::string(kTrialSchemes[i]) + "\":{" + field("values", counts.values) + "," +
            field("verified", counts.verified) + "," + field("refused", counts.refused);
    if (reversible(i)) text += "," + field("recovered", counts.recovered);
    text += "," + field("skipped", counts.skipped) + "," + field("perSecond", rateOf(counts)) + "}";
  }
  results.line(text + "}}");
}

int trial(const Options& options) {
  requireProvider();
  const KeyRecord keys = KeyRecord::load(options.keys);
  const AttributeSet attributes({});
  const ExportInput input(options.file);
  RecordReader reader(input.fd(), input.name());
  Progress progress(input.fd(), false);
  TrialTally tally;

  Pipeline<TrialResult> pipeline(
      reader, [&](const Batch& batch) { return trialBatch(batch, attributes, keys); },
      [&](const Batch& batch, TrialResult& result) {
        if (!result.findings.empty()) progress.hide();
        for (const std::string& finding : result.findings) message(finding);
        tally.add(result.tally);
        progress.advance(result.tally.entries, batch.text.size());
      });
  pipeline.run(threadsFor(0));
  progress.hide();
  Results results;
  options.json ? writeObject(tally, results) : writeTable(tally, results);
  results.flush();
  if (tally.differences > 0) return kBadValue;
  return tally.unread > 0 ? kBadKey : kSuccess;
}

}  // namespace

void addTrial(CLI::App& app, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb = app.add_subcommand("trial", "Put the clear passwords of an export through every scheme and compare");
  verb->add_option("FILE", options->file, "export (LDIF) to read, \"-\" for standard input; it is not changed")
      ->required();
  verb->add_option("--keys", options->keys, "key stash file, for the AES schemes and values")->required();
  verb->add_flag("--json", options->json, "the counts as one JSON object");
  verb->footer("Exits with 0 when everything agrees, 3 when anything differs, 4 when the keys do not open a value.");
  verb->callback([options, &exitCode] { exitCode = trial(*options); });
}

}  // namespace tool
