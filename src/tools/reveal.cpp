// SPDX-License-Identifier: Apache-2.0
// ldappw reveal: the clear text of reversible values.
#include "command_line.h"
#include "messages.h"
#include "text.h"
#include "values.h"

namespace tool {
namespace {

struct Options {
  CLI::Option* values = nullptr;
  std::string keys;
  bool json = false;
};

bool isOneLine(const Secret& clear) {
  return clear.view().find_first_of(std::string_view("\n\0", 2)) == std::string_view::npos;
}

void showJson(const Scheme& scheme, const Secret& clear, std::size_t index, Results& results) {
  Json json;
  json.number("index", index).text("scheme", scheme.name);
  isOneLine(clear) && wellFormedUtf8(clear.view()) ? json.text("password", clear.view())
                                                   : json.base64("password_base64", clear.view());
  results.line(json.end());
}

ExitCode reveal(const Options& options) {
  if (!options.keys.empty()) requireProvider();  // no value can be opened by it without keys
  const KeyRecord key = KeyRecord::load(options.keys);
  ExitCode exitCode = kSuccess;
  Results results;
  std::size_t index = 0;
  forEachValue(*options.values, results, [&](const Secret& whole) {
    const StoredValue value(whole);
    Secret clear;
    Status status = openValue(value, key, clear);
    if (status.ok() && !options.json && !isOneLine(clear)) {
      status = {kBadValue, "the password is not one line of text: --json shows it"};
    }
    keepFirst(exitCode, status.code);
    ++index;
    if (!status.ok()) {
      message("value " + std::to_string(index) + ": " + status.text);
      if (options.json) results.line(problemJson(index, status).end());
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
  addPath(verb, "--keys", options->keys, "key stash file, for the AES schemes");
  verb.add_flag(
      "--json", options->json,
      "one JSON object a line: the password as text, or as password_base64 where it is not one line of UTF-8");
  verb.callback([options, &exitCode] { exitCode = reveal(*options); });
}

}  // namespace tool
