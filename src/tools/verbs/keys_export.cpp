// SPDX-License-Identifier: Apache-2.0
// ldappw keys check with an export: how many of its values the keys open.
#include "verbs/keys_export.h"

#include "base/text.h"
#include "ldif/export_run.h"
#include "schemes/schemes.h"
#include "schemes/values.h"

namespace tool {
namespace {

enum Total : size_t { kValues, kOpened, kNotText, kUnopened };

constexpr CountName kNames[] = {{"values", ""}, {"opened", ""}, {"notText", ""}, {"unopened", ""}};

void tryBatch(RecordWalker& walker, const KeyRecord& keys, Tally& tally) {
  Secret clear;
  while (walker.next()) {
    if (!walker.atPassword() || walker.password().form != ValueForm::kBytes) continue;
    const Examined value = examine(walker.password().value);
    if (!value.scheme().needsKey()) continue;
    ++tally.totals[kValues];
    const bool opened = openValue(value, keys, clear).ok();
    ++tally.totals[!opened ? kUnopened : looksLikeText(clear.view()) ? kOpened : kNotText];
  }
}

// A wrong key opens a value in some 250, into bytes that are not text.
std::string verdict(const Tally& tally) {
  const auto count = [&](Total total) { return std::to_string(tally.totals[total]); };
  const std::string all = count(kValues) + " AES values";
  if (tally.totals[kValues] == 0) return "in doubt: the export has no AES value";
  if (tally.totals[kOpened] == 0) return "no: these keys open none of " + all;
  const std::string bytes =
      tally.totals[kNotText] == 0 ? "" : ", " + count(kNotText) + " more into bytes that are not text";
  return (tally.totals[kUnopened] == 0 ? "yes" : "in part") + (": these keys open " + count(kOpened)) + " of " + all +
         bytes;
}

}  // namespace

ExitCode checkExport(const KeyRecord& keys, const std::string& path, bool json, bool quiet) {
  requireProvider();
  ExportOptions source;
  source.in = path;
  Input input = openExport(source);
  const Part sum = runExport(
      input, source, [&](RecordWalker& walker, Part& part) { tryBatch(walker, keys, part.tally); }, [](const Part&) {});
  const Tally& tally = sum.tally;
  Results results;
  if (json) {
    Json object;
    addCounts(object, kNames, tally.totals.data());
    results.line(object.end());
  } else if (!quiet) {
    results.line(verdict(tally));
  }
  results.flush();
  if (tally.totals[kValues] == 0) return kNoMatch;
  return tally.totals[kUnopened] > 0 || tally.totals[kOpened] == 0 ? kBadKey : kSuccess;
}

}  // namespace tool
