// SPDX-License-Identifier: Apache-2.0
// ldappw keys check with an export: how many of its values the keys open.
#include "verbs/keys_export.h"

#include "base/text.h"
#include "ldif/counts.h"
#include "ldif/export_run.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

struct Counts {
  std::uint64_t values = 0;
  std::uint64_t opened = 0;
  std::uint64_t notText = 0;
  std::uint64_t unopened = 0;
};
constexpr CountName<Counts> kNames[] = {{&Counts::values, "values", ""},
                                        {&Counts::opened, "opened", ""},
                                        {&Counts::notText, "notText", ""},
                                        {&Counts::unopened, "unopened", ""}};

struct CheckPart : ExportPart {
  Counts counts;
};

void tryBatch(RecordWalker& walker, const KeyRecord& keys, Counts& counts) {
  Secret clear;
  while (walker.next()) {
    if (!walker.atPassword() || walker.password().form != ValueForm::kBytes) continue;
    const Examined value = examine(walker.password().value);
    if (!value.scheme().needsKey()) continue;
    ++counts.values;
    const bool opened = openValue(value, keys, clear).ok();
    ++(!opened ? counts.unopened : looksLikeText(clear.view()) ? counts.opened : counts.notText);
  }
}

// About one value in 250 passes the padding check under a wrong key, and opens into bytes that are not text.
std::string verdict(const Counts& counts) {
  const std::string all = std::to_string(counts.values) + " AES values";
  if (counts.values == 0) return "in doubt: the export has no AES value";
  if (counts.opened == 0) return "no: these keys open none of " + all;
  std::string text = counts.unopened == 0 ? "yes" : "in part";
  text += ": these keys open " + std::to_string(counts.opened) + " of " + all;
  if (counts.notText > 0) text += ", " + std::to_string(counts.notText) + " more into bytes that are not text";
  return text;
}

}  // namespace

ExitCode checkExport(const KeyRecord& keys, const std::string& path, bool json, bool quiet) {
  requireProvider();
  ExportOptions source;
  source.in = path;
  Input input = openExport(source);
  Counts sum;
  runExport<CheckPart>(
      input, source, [&](RecordWalker& walker, CheckPart& part) { tryBatch(walker, keys, part.counts); },
      [&](const CheckPart& part) { addCounts(sum, part.counts, kNames); });
  Results results;
  if (json) {
    Json object;
    addFields(object, sum, kNames);
    results.line(object.end());
  } else if (!quiet) {
    results.line(verdict(sum));
  }
  results.flush();
  if (sum.values == 0) return kNoMatch;
  return sum.unopened > 0 || sum.opened == 0 ? kBadKey : kSuccess;
}

}  // namespace tool
