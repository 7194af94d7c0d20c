// SPDX-License-Identifier: Apache-2.0
// ldappw ldif: the command line of the conversion and the audit of a directory export.
#include "audit/pass.h"
#include "ldif/passes.h"
#include "verbs/options.h"

namespace tool {
namespace {

constexpr char kFooter[] =
    R"(Conversion (--to) covers every clear or reversible value and leaves all other bytes of the export as they are. A
changed line keeps the spelling of its attribute, its options and its line ends; it is written as text or as base64,
as the value needs, and folded at 76 columns only if the line was folded before. One-way values and values behind a
URL are kept and counted; of two values of an entry that become equal the second is dropped and counted. In change
records the values of add and replace blocks are treated like those of entries; the values of delete blocks are kept,
because they name what is stored.
What cannot be carried over unharmed is kept as it was and listed by DN on standard error, and the exit code is not 0:
3 for an unknown tag, a malformed, locked, padded or doubly encoded value or a password that the scheme cannot hold,
4 for a value that the old keys do not open; 5 when a file cannot be read or written, and then --out has not changed.
An audit (--audit) shows the counts of "ldappw audit". It exits with 0 when every value is well formed and the keys
open it, else with the code of the first one that is not. With --json it writes one object; with --verbose a line
(with --json an object) for each value comes before it.)";

struct Options : LdifOptions {
  bool audit = false;
  bool verbose = false;
};

ExitCode audit(const Options& options) {
  requireProvider();
  AuditRules rules;
  for (const std::string& path : options.keys) rules.keys.add(path);
  rules.allowBinary = options.allowBinary;
  rules.valuesAreProblems = true;
  rules.listed = 0;
  if (options.verbose) rules.lines = options.json ? Lines::kJson : Lines::kText;
  ExportOptions source = options.source;
  source.resultsOnStdout = options.verbose;
  AuditReport report;
  report.brief = true;
  Reuse reuse;
  Results results;
  const ExitCode exitCode = auditExport(source, rules, report.facts, reuse, results);
  report.reused = reuse.finish(report.facts, rules.listed, report.reuseGroups);
  (options.json ? writeObject : writeText)(report, results);
  results.flush();
  return exitCode;
}

ExitCode run(const Options& options) {
  if (options.audit == !options.to.empty()) throw Failure(kUsage, "give either --to or --audit");
  if (options.audit && (!options.newKeys.empty() || options.changes || options.dryRun || !options.resume.empty() ||
                        options.fix || options.out != "-")) {
    throw Failure(kUsage, "--new-keys, --fix, --changes, --dry-run, --resume and --out go with --to");
  }
  if (!options.audit && options.json && options.out == "-" && !options.dryRun) {
    throw Failure(kUsage, "--json needs --out: the export goes to standard output");
  }
  return options.audit ? audit(options) : convertExport(options);
}

}  // namespace

void setUpLdif(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  addOption(verb, "--to", options->to, "scheme to convert the values to");
  addFlag(verb, "--audit", options->audit, "count schemes and findings instead, as \"ldappw audit\" does");
  addKeys(verb, "--keys", options->keys, "key stash file that opens the AES values of the export; may be repeated");
  addPath(verb, "--new-keys", options->newKeys, "key stash file for the new values");
  addList(verb, "--attribute", options->source.attributes,
          "attribute that holds passwords, as often as there are such; without it userPassword, pwdHistory, "
          "olcRootPW, nsslapd-rootpw and authPassword")
      .takes("NAME");
  const Argument in = addPath(verb, "--in", options->source.in, "export to read, \"-\" (default) for standard input");
  addPath(verb, "FILE", options->source.in, "export to read, in place of --in").excludes(in);
  addPath(verb, "--out", options->out, "file to write (default: standard output); may be the one that is read");
  addFlag(verb, "--force", options->force, "replace the file of --out");
  addFlag(verb, "--changes", options->changes, "write change records for ldapmodify in place of the export");
  addFlag(verb, "--dry-run", options->dryRun, "write nothing but the summary");
  addPath(verb, "--resume", options->resume, "change records of a stopped run; what they hold is not made again");
  addFlag(verb, "--progress", options->source.progress, "show progress where standard error is no terminal too");
  addCosts(verb, options->costs);
  addFlag(verb, "--fix", options->fix, "unwrap values with blanks around them or encoded in base64 once more");
  addFlag(verb, "--allow-clear", options->allowClear, "allow --to clear");
  addFlag(verb, "--allow-binary", options->allowBinary,
          "accept values that open into bytes that are not text; a wrong key gives such bytes now and then");
  addMemoryLimit(verb);
  addOption(verb, "--threads", options->source.threads, "threads to work with (default: one a processor)")
      .between(1, 256);
  addFlag(verb, "--verbose", options->verbose, "in an audit, report every value");
  const Argument json = addFlag(verb, "--json", options->json, "counts as JSON, on standard output");
  addFlag(verb, "--quiet", options->quiet, "no counts after a conversion").excludes(json);
  addFooter(verb, kFooter);
  onRun(verb, [options, &exitCode] { exitCode = run(*options); });
}

}  // namespace tool
