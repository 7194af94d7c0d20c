// SPDX-License-Identifier: Apache-2.0
// ldappw audit: what a security officer wants to know of directory exports every night, and a policy as exit code.
#include "audit/pass.h"
#include "base/messages.h"
#include "base/output_file.h"
#include "base/text.h"
#include "schemes/schemes.h"
#include "verbs/options.h"

#include <algorithm>
#include <ctime>
#include <optional>

namespace tool {
namespace {

constexpr char kFooter[] =
    R"(Findings, as --fail-on takes them: clear, known-bad, name-as-password, empty, reused, reversible, unsalted,
des-crypt, malformed, wrapped, salted-fast, no-password, unopened, unknown, broken, unchecked. Findings count entries;
schemes and strengths count values. No password is shown, nor any part of a value.
Passwords are compared where they can be read: clear ones, masked ones, and AES values that --keys opens. Equal values
of unsalted schemes, and of AES without keys, count as reused as well. One-way values are tried only with
--check-hashes.
The exit code is 0 when the policy of --fail-on and --accept is met or none is given, 1 when it is not met, and else 3
when lines could not be judged or 4 when --keys does not open all values.)";

constexpr mode_t kPageMode = 0600;  // it names the entries with weak passwords

struct Options {
  ExportOptions source;
  std::vector<std::string> exports;
  std::string keys;
  std::string knownBad;
  std::vector<std::string> failOn;
  std::vector<std::string> accept;
  std::string html;
  size_t listed = 20;
  size_t subtreeDepth = 3;
  bool checkHashes = false;
  bool allowBinary = false;
  bool force = false;
  bool json = false;
};

std::string timeNow() {
  const time_t now = time(nullptr);
  tm parts{};
  gmtime_r(&now, &parts);
  char text[32];
  strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%SZ", &parts);
  return text;
}

// Lists separated by commas, as an option that may be given several times takes them.
std::vector<std::string> itemsOf(const Argument& option) {
  std::vector<std::string> items;
  for (const std::string& list : option.results()) {
    for (size_t begin = 0; begin <= list.size(); begin = list.find(',', begin) + 1) {
      items.push_back(list.substr(begin, list.find(',', begin) - begin));
      if (list.find(',', begin) == std::string::npos) break;
    }
  }
  return items;
}

std::bitset<kFindingCount> forbiddenBy(const Options& options) {
  std::bitset<kFindingCount> forbidden;
  constexpr auto kByAccept = static_cast<size_t>(Finding::kNotAccepted);
  for (const std::string& name : options.failOn) {
    const auto* found = std::find_if(kFindings, kFindings + kByAccept,
                                     [&](const FindingText& row) { return sameName(name, row.name); });
    if (found == kFindings + kByAccept) throw Failure(kUsage, "--fail-on has no finding '" + name + "'");
    forbidden.set(static_cast<size_t>(found - kFindings));
  }
  if (!options.accept.empty()) forbidden.set(kByAccept);
  if (forbidden.any()) forbidden.set(static_cast<size_t>(Finding::kUnchecked));  // whatever it hides
  return forbidden;
}

// True for the name of a row and for each tag that it has.
bool isCalled(const Scheme& scheme, const std::string& name) {
  for (size_t at = 0; name.front() == '{' && at + name.size() <= scheme.tag.size(); ++at) {
    if (sameName(scheme.tag.substr(at, name.size()), name)) return true;
  }
  return sameName(scheme.name, name);
}

std::vector<bool> acceptedBy(const Options& options) {
  if (options.accept.empty()) return {};
  std::vector<bool> accepted(kSchemes.size() + 1);
  for (const std::string& name : options.accept) {
    bool known = false;
    for (const Scheme& scheme : kSchemes) {
      if (name.empty() || !isCalled(scheme, name)) continue;
      accepted[indexOf(scheme)] = known = true;
    }
    if (!known) throw Failure(kUsage, "--accept has no scheme '" + name + "'");
  }
  return accepted;
}

void checkOptions(const Options& options) {
  const auto inputs = std::count(options.exports.begin(), options.exports.end(), "-");
  if (inputs + (options.knownBad == "-" ? 1 : 0) > 1) throw Failure(kUsage, "standard input is given twice");
  if (options.force && options.html.empty()) throw Failure(kUsage, "--force goes with --html");
  if (options.json && options.html == "-") throw Failure(kUsage, "--json and --html - are both for standard output");
}

void setRules(const Options& options, AuditRules& rules) {
  rules.keys.add(options.keys);
  rules.allowBinary = options.allowBinary;
  rules.checkHashes = options.checkHashes;
  rules.accepted = acceptedBy(options);
  rules.subtreeDepth = options.subtreeDepth;
  rules.listed = options.listed;
  if (!options.knownBad.empty()) rules.loadKnownBad(options.knownBad);
}

ExitCode exitCodeOf(const AuditReport& report, ExitCode reading, bool keysGiven) {
  for (size_t i = 0; i < kFindingCount; ++i) {
    const std::uint64_t count = report.facts.findings[i].count;
    if (report.fails(i)) message("policy: " + std::string(kFindings[i].name) + ": " + std::to_string(count));
  }
  if (!report.met()) return kNoMatch;
  if (reading != kSuccess) return reading;
  if (report.facts.of(Finding::kBroken).count > 0) return kBadValue;
  return keysGiven && report.facts.of(Finding::kUnopened).count > 0 ? kBadKey : kSuccess;
}

ExitCode run(const Options& options) {
  checkOptions(options);
  AuditReport report;
  report.policy = !options.failOn.empty() || !options.accept.empty();
  report.forbidden = forbiddenBy(options);
  report.exports = options.exports;
  report.time = timeNow();
  requireProvider();
  AuditRules rules;
  setRules(options, rules);
  std::optional<OutputFile> page;
  if (!options.html.empty() && options.html != "-") {
    Place place(options.html, options.force);
    nameLeftovers(place, nullptr);
    page.emplace(std::move(place), kPageMode);
  }
  Reuse reuse;
  Results results;
  ExitCode reading = kSuccess;
  for (const std::string& path : options.exports) {
    ExportOptions source = options.source;
    source.in = path;
    keepFirst(reading, auditExport(source, rules, report.facts, reuse, results));
  }
  report.reused = reuse.finish(report.facts, options.listed, report.reuseGroups);
  if (page) {
    page->write(pageOf(report));
    page->commit();
  }
  options.html == "-" ? results.write(pageOf(report)) : (options.json ? writeObject : writeText)(report, results);
  results.flush();
  return exitCodeOf(report, reading, !options.keys.empty());
}

}  // namespace

void setUpAudit(CLI::App& verb, ExitCode& exitCode) {
  const auto options = std::make_shared<Options>();
  const Argument exports = addValues(verb, "EXPORT", "exports to read; - is standard input").required();
  const Argument failOn = addValues(verb, "--fail-on", "findings that the policy forbids, separated by commas");
  const Argument accept = addValues(verb, "--accept", "schemes that the policy allows, separated by commas");
  addKeys(verb, "--keys", options->keys, "key stash file that opens the AES values");
  addPath(verb, "--known-bad", options->knownBad, "file of known bad passwords, one a line");
  addFlag(verb, "--check-hashes", options->checkHashes,
          "try known bad passwords, uid and cn on one-way values: as many checks, at the cost of each scheme");
  addOption(verb, "--list", options->listed, "DNs to list for each finding (default: 20)");
  addOption(verb, "--subtree-depth", options->subtreeDepth, "RDNs that name a subtree (default: 3)");
  const Argument attributes = addValues(verb, "--attribute", "an attribute that holds passwords");
  addFlag(verb, "--allow-binary", options->allowBinary, "accept values that open into bytes that are not text");
  addMemoryLimit(verb);
  addOption(verb, "--threads", options->source.threads, "threads to work with (default: one a processor)")
      .between(1, 256);
  addFlag(verb, "--json", options->json, "the report as a JSON object");
  addPath(verb, "--html", options->html, "write the report as a page, too; - puts it in the place of the text");
  addFlag(verb, "--force", options->force, "replace the file of --html");
  addFooter(verb, kFooter);
  onRun(verb, [=, &exitCode] {
    options->exports = exports.results();
    options->failOn = itemsOf(failOn);
    options->accept = itemsOf(accept);
    options->source.attributes = attributes.results();
    exitCode = run(*options);
  });
}

}  // namespace tool
