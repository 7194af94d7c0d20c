// SPDX-License-Identifier: Apache-2.0
// ldappw identify: what a stored value is, without opening it. Values are never repeated in the output: they may be
// clear text.
#include "base/text.h"
#include "schemes/schemes.h"
#include "verbs/options.h"

namespace tool {
namespace {

struct Options {
  CLI::Option* values = nullptr;
  char end = '\n';
  bool json = false;
};

constexpr const char* kKindNames[] = {"clear", "one-way", "reversible", "unknown"};  // in the order of Kind

const char* kindName(const Scheme& scheme) {
  return kKindNames[static_cast<int>(scheme.kind)];
}

void showText(const StoredValue& value, const char* problem, Results& results) {
  const Scheme& scheme = value.scheme();
  const bool unknown = scheme.kind == Kind::kUnknown;
  const bool untagged = !scheme.isClear() && value.tag().empty();
  results.line(scheme.name + (unknown ? " " + printable(value.tag()) : "") + "\t" + std::to_string(scheme.code) + "\t" +
               kindName(scheme) + "\t" + (problem != nullptr ? problem : "well formed") +
               (untagged ? ", untagged" : "") + "\t" + nameOf(scheme.strength));
}

void showJson(const StoredValue& value, const char* problem, size_t index, Results& results) {
  const Scheme& scheme = value.scheme();
  Json json;
  json.number("index", index);
  scheme.kind == Kind::kUnknown ? json.null("scheme") : json.text("scheme", scheme.name);
  json.number("code", static_cast<unsigned>(scheme.code)).text("kind", kindName(scheme));
  value.tag().empty() ? json.null("tag") : json.text("tag", printable(value.tag()));
  json.flag("wellFormed", problem == nullptr);
  if (problem != nullptr) json.text("problem", problem);
  json.text("strength", nameOf(scheme.strength)).text("writers", scheme.writers);
  results.line(json.end());
}

ExitCode identify(const Options& options) {
  ExitCode exitCode = kSuccess;
  Results results(options.end);
  forEachValue(*options.values, options.end, results, [&](const Secret& whole, size_t index, const std::string&) {
    const StoredValue value(whole);
    const char* problem = value.problem();
    if (problem != nullptr) keepFirst(exitCode, kBadValue);
    options.json ? showJson(value, problem, index, results) : showText(value, problem, results);
  });
  return exitCode;
}

}  // namespace

void setUpIdentify(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  options->values = addValues(verb, "VALUE", "stored values; without any, one a line from standard input");
  addNull(verb, options->end);
  verb.add_flag("--json", options->json, "one JSON object a line");
  verb.callback([options, &exitCode] { exitCode = identify(*options); });
}

}  // namespace tool
