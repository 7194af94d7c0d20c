// SPDX-License-Identifier: Apache-2.0
// ldappw identify: what a stored value is, without opening it. Values are never repeated in the output: they may be
// clear text.
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <memory>
#include <nlohmann/json.hpp>
#include <vector>

#include "command_line.h"
#include "common.h"
#include "verbs.h"

namespace tool {
namespace {

struct Options {
  CLI::Option* values = nullptr;
  bool json = false;
};

const char* kindOf(const Scheme& scheme) {
  if (scheme.code == FORMAT_NONE) return "clear";
  return scheme.reversible ? "reversible" : "one-way";
}

std::string tagOf(std::string_view value) {
  return printable(value.substr(0, value.find('}') + 1));
}

std::string asText(std::string_view value, const Scheme& scheme, bool unknown, const char* problem) {
  const std::string verdict = problem != nullptr ? problem : "well formed";
  if (unknown) return "unknown " + tagOf(value) + "\t" + std::to_string(scheme.code) + "\tunknown\t" + verdict;
  const bool untagged = scheme.code != FORMAT_NONE && value.front() != '{';
  return scheme.name + std::string("\t") + std::to_string(scheme.code) + "\t" + kindOf(scheme) + "\t" + verdict +
         (untagged ? ", untagged" : "");
}

std::string asJson(std::string_view value, const Scheme& scheme, bool unknown, const char* problem, std::size_t index) {
  nlohmann::ordered_json line;
  line["index"] = index;
  line["scheme"] = unknown ? nlohmann::ordered_json() : nlohmann::ordered_json(scheme.name);
  line["code"] = scheme.code;
  line["kind"] = unknown ? "unknown" : kindOf(scheme);
  line["tag"] = !value.empty() && value.front() == '{' && (unknown || scheme.code != FORMAT_NONE)
                    ? nlohmann::ordered_json(tagOf(value))
                    : nlohmann::ordered_json();
  line["well_formed"] = problem == nullptr;
  if (problem != nullptr) line["problem"] = problem;
  return line.dump();
}

void identifyOne(std::string_view value, std::size_t index, const Options& options, Results& results, int& exitCode) {
  const bool unknown = unknownTag(value);
  const Scheme& scheme = schemeOf(value);
  const char* problem = payloadProblem(value);
  if (problem != nullptr) keepFirst(exitCode, kBadValue);
  results.line(options.json ? asJson(value, scheme, unknown, problem, index) : asText(value, scheme, unknown, problem));
}

int identify(const Options& options) {
  int exitCode = kSuccess;
  Results results;
  std::size_t index = 0;
  if (!options.values->empty()) {
    for (const std::string& value : options.values->results()) {
      identifyOne(value, ++index, options, results, exitCode);
    }
  } else {
    LineReader lines(STDIN_FILENO, "standard input");
    Secret value;
    while (lines.next(value)) {
      identifyOne(value.view(), ++index, options, results, exitCode);
      if (!lines.lineBuffered()) results.flush();
    }
  }
  results.flush();
  return exitCode;
}

}  // namespace

void addIdentify(CLI::App& app, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb = app.add_subcommand("identify", "Tell the scheme of stored values and whether they are well formed");
  options->values = addValues(*verb, "VALUE", "stored values; without any, one a line from standard input");
  verb->add_flag("--json", options->json, "one JSON object a line");
  verb->callback([options, &exitCode] { exitCode = identify(*options); });
}

}  // namespace tool
