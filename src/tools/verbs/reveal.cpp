// SPDX-License-Identifier: Apache-2.0
// ldappw reveal: the clear text of reversible values.
#include "base/messages.h"
#include "base/text.h"
#include "schemes/schemes.h"
#include "schemes/values.h"
#include "verbs/options.h"

namespace tool {
namespace {

struct Options {
  Argument values;
  std::string keys;
  char end = '\n';
  bool json = false;
};

bool isOneLine(const Secret& clear, char end = '\n') {
  const char ends[] = {end, '\0'};
  return clear.view().find_first_of(std::string_view(ends, 2)) == std::string_view::npos;
}

void showJson(const Scheme& scheme, const Secret& clear, size_t index, Results& results) {
  Json json;
  json.number("index", index).text("scheme", scheme.name);
  isOneLine(clear) && wellFormedUtf8(clear.view()) ? json.text("password", clear.view())
                                                   : json.base64("passwordBase64", clear.view());
  results.line(json.end());
}

ExitCode reveal(const Options& options) {
  if (!options.keys.empty()) requireProvider();  // no value can be opened by it without keys
  const KeyRecord key = KeyRecord::load(options.keys);
  ExitCode exitCode = kSuccess;
  Results results(options.end);
  Repeated problems(kMostOfAKind, message);
  forEachValue(options.values, options.end, results, [&](const Secret& whole, size_t index, const std::string& place) {
    const Examined value = examine(whole);
    Secret clear;
    Status status = openValue(value, key, clear);
    if (status.ok() && !options.json && !isOneLine(clear, options.end)) {
      status = {kBadValue, "the password is not one line of text: --json shows it"};
    }
    keepFirst(exitCode, status.code);
    if (!status.ok()) {
      problems.add(place + ": " + status.text, status.text);
      showProblem(options.json, status, index, results);
    } else {
      options.json ? showJson(value.scheme(), clear, index, results) : results.line(clear.view());
    }
  });
  return exitCode;
}

}  // namespace

void setUpReveal(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  options->values = addValues(verb, "VALUE", "stored values; without any, one a line from standard input");
  addKeys(verb, "--keys", options->keys, "key stash file, for the AES schemes");
  addNull(verb, options->end);
  addFlag(verb, "--json", options->json,
          "one JSON object a line: the password as text, or as passwordBase64 where it is not one line of UTF-8");
  onRun(verb, [options, &exitCode] { exitCode = reveal(*options); });
}

}  // namespace tool
