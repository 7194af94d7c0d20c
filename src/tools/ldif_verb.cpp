// SPDX-License-Identifier: Apache-2.0
// ldappw ldif: converts or audits the password values of a directory export.
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <memory>
#include <optional>

#include "common.h"
#include "ldif_audit.h"
#include "ldif_convert.h"
#include "ldif_pipeline.h"
#include "ldif_report.h"
#include "verbs.h"

namespace tool {
namespace {

constexpr char kFooter[] =
    "Conversion (--to) makes every clear or reversible value anew and leaves all other bytes of the export as they "
    "are. A\n"
    "changed line keeps the spelling of its attribute, its options and its line ends; it is written as text or as "
    "base64,\n"
    "as the value needs, and folded at 76 columns only if the line was folded before. One-way values and values behind "
    "a\n"
    "URL are kept and counted. In change records the values of add and replace blocks are treated like those of "
    "entries;\n"
    "the values of delete blocks are kept, because they name what is stored.\n"
    "What cannot be carried over unharmed is kept as it was and listed by DN on standard error, and the exit code is "
    "not 0:\n"
    "3 for an unknown tag, a malformed value or a password that the scheme cannot hold, 4 for a value that the old "
    "keys do\n"
    "not open; 5 when a file cannot be read or written, and then --out has not changed.\n"
    "An audit (--audit) exits with 0 when it has no finding, else with the code of the first one. With --json it "
    "writes one\n"
    "object; with --verbose a line (with --json an object) for each value comes before it.";

struct Options {
  std::string to;
  std::string keys;
  std::string newKeys;
  std::vector<std::string> attributes;
  std::string in = "-";
  std::string out = "-";
  bool audit = false;
  bool force = false;
  bool allowClear = false;
  bool allowBinary = false;
  bool verbose = false;
  bool json = false;
  unsigned threads = 0;
};

// Where a converted export goes: a file that appears when it is complete, or standard output.
class Output {
 public:
  Output(const std::string& path, bool overwrite) {
    if (path == "-") return;
    struct stat old {};
    const bool there = stat(path.c_str(), &old) == 0;
    file_.emplace(path, there ? old.st_mode & 07777 : 0600, overwrite);
  }

  void write(std::string_view bytes) {
    if (file_) return file_->write(bytes);
    results_.write(bytes);
    results_.flush();
  }

  void commit() {
    if (file_) file_->commit();
  }

 private:
  std::optional<OutputFile> file_;
  Results results_;
};

const Scheme& targetOf(const Options& options) {
  const Scheme* scheme = findScheme(options.to);
  if (scheme == nullptr || !scheme->makeable) throw Failure(kUsage, options.to + " is no scheme that can be made");
  if (scheme->code == FORMAT_NONE && !options.allowClear) {
    throw Failure(kUsage, "passwords are written in the clear with --allow-clear only");
  }
  if (scheme->needsKey() && options.newKeys.empty()) throw Failure(kUsage, options.to + " needs --new-keys");
  return *scheme;
}

void addTally(ConvertTally& sum, const ConvertTally& part) {
  for (const ConvertField& field : kConvertFields) sum.*field.count += part.*field.count;
}

std::string summaryObject(const ConvertTally& tally) {
  std::string text = "{";
  for (const ConvertField& field : kConvertFields) {
    text += (text.size() > 1 ? ",\"" : "\"") + std::string(field.name) + "\":" + std::to_string(tally.*field.count);
  }
  return text + "}";
}

void writeSummary(const ConvertTally& tally, const ConvertOptions& conversion, bool json) {
  if (tally.cut > 0) {
    warning(std::to_string(tally.cut) + " passwords are longer than the " +
            std::to_string(conversion.target->cutBytes) + " bytes that " + conversion.target->name +
            " uses: their beginnings alone will be checked");
  }
  if (json) {
    Results results;
    results.line(summaryObject(tally));
    return results.flush();
  }
  for (const ConvertField& field : kConvertFields) {
    const std::uint64_t count = tally.*field.count;
    const bool always = &field - kConvertFields.data() < 3;
    if (always || count > 0) message(std::string(field.text) + ": " + std::to_string(count));
  }
}

int convert(const Options& options) {
  ConvertOptions conversion;
  conversion.target = &targetOf(options);
  conversion.allowBinary = options.allowBinary;
  requireProvider();
  conversion.oldKeys = KeyRecord::load(options.keys);
  conversion.newKeys = KeyRecord::load(options.newKeys);
  const AttributeSet attributes(options.attributes);
  const ExportInput input(options.in);
  Output output(options.out, options.force);
  RecordReader reader(input.fd(), input.name());
  Progress progress(input.fd(), options.out == "-");
  ConvertTally tally;
  int exitCode = kSuccess;

  Pipeline<ConvertResult> pipeline(
      reader, [&](const Batch& batch) { return convertBatch(batch, attributes, conversion); },
      [&](const Batch& batch, ConvertResult& result) {
        output.write(result.out.view());
        if (!result.findings.empty()) progress.hide();
        for (const Finding& finding : result.findings) {
          tell(finding);
          keepFirst(exitCode, finding.status.code);
        }
        addTally(tally, result.tally);
        progress.advance(result.tally.entries, batch.text.size());
      });
  pipeline.run(threadsFor(options.threads));
  progress.hide();
  output.commit();
  writeSummary(tally, conversion, options.json);
  return exitCode;
}

int audit(const Options& options) {
  requireProvider();
  AuditOptions auditing;
  auditing.keys = KeyRecord::load(options.keys);
  auditing.verbose = options.verbose;
  auditing.json = options.json;
  auditing.allowBinary = options.allowBinary;
  const AttributeSet attributes(options.attributes);
  const ExportInput input(options.in);
  RecordReader reader(input.fd(), input.name());
  Progress progress(input.fd(), options.verbose);
  Results results;
  AuditTally tally;

  Pipeline<AuditResult> pipeline(
      reader, [&](const Batch& batch) { return auditBatch(batch, attributes, auditing); },
      [&](const Batch& batch, AuditResult& result) {
        results.write(result.out.view());
        tally.add(result.tally);
        progress.advance(result.tally.entries, batch.text.size());
      });
  pipeline.run(threadsFor(options.threads));
  progress.hide();
  writeAudit(tally, options.json, results);
  results.flush();
  return tally.firstProblem;
}

int run(const Options& options) {
  if (options.audit == !options.to.empty()) throw Failure(kUsage, "give either --to or --audit");
  if (options.audit && (!options.newKeys.empty() || options.out != "-")) {
    throw Failure(kUsage, "--new-keys and --out go with --to");
  }
  if (!options.audit && options.json && options.out == "-") {
    throw Failure(kUsage, "--json needs --out: standard output is the export's");
  }
  return options.audit ? audit(options) : convert(options);
}

}  // namespace

void addLdif(CLI::App& app, int& exitCode) {
  const auto options = std::make_shared<Options>();
  CLI::App* verb = app.add_subcommand("ldif", "Convert or audit the password values of a directory export (LDIF)");
  verb->add_option("--to", options->to, "scheme to make the values anew under");
  verb->add_flag("--audit", options->audit, "count schemes and findings instead");
  verb->add_option("--keys", options->keys, "key stash file that opens the AES values of the export");
  verb->add_option("--new-keys", options->newKeys, "key stash file for the new values");
  verb->add_option("--attribute", options->attributes, "attributes that hold passwords (default: userPassword)");
  verb->add_option("--in", options->in, "export to read (default: standard input)");
  verb->add_option("--out", options->out, "file to write (default: standard output); may be the one read");
  verb->add_flag("--force", options->force, "replace the file of --out");
  verb->add_flag("--allow-clear", options->allowClear, "allow --to clear");
  verb->add_flag(
      "--allow-binary", options->allowBinary,
      "take values that open into bytes that are not text for right; a wrong key gives such bytes now and then");
  verb->add_option("--threads", options->threads, "threads to work with (default: one a processor)")
      ->check(CLI::Range(1U, 256U));
  verb->add_flag("--verbose", options->verbose, "in an audit, tell of every value");
  verb->add_flag("--json", options->json, "counts as JSON, on standard output");
  verb->footer(kFooter);
  verb->callback([options, &exitCode] { exitCode = run(*options); });
}

}  // namespace tool
