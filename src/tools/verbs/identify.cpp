// SPDX-License-Identifier: Apache-2.0
// ldappw identify: what a stored value is, without opening it. Values are never repeated in the output: they may be
// clear text.
#include "base/text.h"
#include "schemes/examine.h"
#include "verbs/options.h"

namespace tool {
namespace {

struct Options {
  Argument values;
  char end = '\n';
  bool json = false;
};

constexpr const char* kKindNames[] = {"clear", "one-way", "reversible", "unknown"};  // in the order of Kind
static_assert(sizeof kKindNames / sizeof kKindNames[0] == static_cast<size_t>(Kind::kUnknown) + 1);

const char* kindName(const Scheme& scheme) {
  return kKindNames[static_cast<int>(scheme.kind)];
}

void showText(const Examined& examined, Results& results) {
  const Scheme& scheme = examined.scheme();
  const bool unknown = scheme.kind == Kind::kUnknown;
  const bool untagged = !scheme.isClear() && examined.value.tag().empty();
  results.line(scheme.name + (unknown ? " " + printable(examined.value.tag()) : "") + "\t" +
               std::to_string(scheme.code) + "\t" + kindName(scheme) + "\t" +
               (examined.problem != nullptr ? examined.problem : "well formed") + (untagged ? ", untagged" : "") +
               "\t" + nameOf(scheme.strength));
}

void showJson(const Examined& examined, size_t index, Results& results) {
  const Scheme& scheme = examined.scheme();
  Json json;
  json.number("index", index);
  scheme.kind == Kind::kUnknown ? json.null("scheme") : json.text("scheme", scheme.name);
  json.number("code", static_cast<unsigned>(scheme.code)).text("kind", kindName(scheme));
  examined.value.tag().empty() ? json.null("tag") : json.text("tag", printable(examined.value.tag()));
  json.flag("wellFormed", examined.problem == nullptr);
  if (examined.problem != nullptr) json.text("problem", examined.problem);
  json.text("strength", nameOf(scheme.strength)).text("writers", scheme.writers);
  results.line(json.end());
}

ExitCode identify(const Options& options) {
  ExitCode exitCode = kSuccess;
  Results results(options.end);
  forEachValue(options.values, options.end, results, [&](const Secret& whole, size_t index, const std::string&) {
    const Examined examined = examine(whole);
    if (examined.problem != nullptr) keepFirst(exitCode, kBadValue);
    options.json ? showJson(examined, index, results) : showText(examined, results);
  });
  return exitCode;
}

}  // namespace

void setUpIdentify(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  options->values = addValues(verb, "VALUE", "stored values; without any, one a line from standard input");
  addNull(verb, options->end);
  addFlag(verb, "--json", options->json, "one JSON object a line");
  onRun(verb, [options, &exitCode] { exitCode = identify(*options); });
}

}  // namespace tool
