// SPDX-License-Identifier: Apache-2.0
// ldappw reveal: the clear text of reversible values. JSON is written by hand here, so that clear text stays in memory
// that is wiped.
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <memory>

#include "command_line.h"
#include "common.h"
#include "verbs.h"

namespace tool {
namespace {

struct Options {
  CLI::Option* values = nullptr;
  std::string keys;
  bool json = false;
};

class Revealer {
 public:
  explicit Revealer(const Options& options) : options_(options), key_(KeyRecord::load(options.keys)) {}

  void one(std::string_view value) {
    ++index_;
    Status status = revealValue(value, key_, clear_);
    if (status.ok() && !oneLine() && !options_.json) {
      status = {kBadValue, "the password is not one line of text: --json shows it"};
    }
    if (!status.ok()) {
      tellProblem(status);
    } else if (options_.json) {
      showJson(schemeOf(value));
    } else {
      results_.line(clear_.view());
    }
    clear_.clear();
  }

  void flush() { results_.flush(); }
  int exitCode() const noexcept { return exitCode_; }

 private:
  bool oneLine() const { return clear_.view().find_first_of(std::string_view("\n\0", 2)) == std::string_view::npos; }

  void tellProblem(const Status& status) {
    message("value " + std::to_string(index_) + ": " + status.text);
    keepFirst(exitCode_, status.code);
    if (options_.json) results_.line(problemJson(index_, status));
  }

  void showJson(const Scheme& scheme) {
    Secret line("{\"index\":" + std::to_string(index_) + ",\"scheme\":\"" + scheme.name + "\",\"password");
    if (oneLine() && wellFormedUtf8(clear_.view())) {
      line.append("\":");
      appendJsonString(line, clear_.view());
    } else {
      line.append("_base64\":\"");
      appendBase64(line, clear_.view());
      line.append('"');
    }
    line.append('}');
    results_.line(line.view());
  }

  const Options& options_;
  const KeyRecord key_;
  Results results_;
  Secret clear_;
  std::size_t index_ = 0;
  int exitCode_ = kSuccess;
};

int reveal(const Options& options) {
  requireProvider();
  Revealer revealer(options);
  if (!options.values->empty()) {
    for (const std::string& value : options.values->results()) revealer.one(value);
  } else {
    LineReader lines(STDIN_FILENO, "standard input");
    Secret value;
    while (lines.next(value)) {
      revealer.one(value.view());
      if (!lines.lineBuffered()) revealer.flush();
    }
  }
  revealer.flush();
  return revealer.exitCode();
}

}  // namespace

void addReveal(CLI::App& app, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb = app.add_subcommand("reveal", "Turn reversible values back into clear passwords, one a line");
  options->values = addValues(*verb, "VALUE", "stored values; without any, one a line from standard input");
  verb->add_option("--keys", options->keys, "key stash file, for the AES schemes")->type_name("FILE");
  verb->add_flag(
      "--json", options->json,
      "one JSON object a line: the password as text, or as password_base64 where it is not one line of UTF-8");
  verb->callback([options, &exitCode] { exitCode = reveal(*options); });
}

}  // namespace tool
