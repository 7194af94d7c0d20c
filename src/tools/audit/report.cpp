// SPDX-License-Identifier: Apache-2.0
// The report as text and as JSON.
#include "audit/report.h"

#include <algorithm>

#include "base/text.h"
#include "ldif/counts.h"
#include "schemes/schemes.h"

namespace tool {
namespace {

void writeDns(const std::vector<std::string>& dns, std::uint64_t count, Results& results) {
  for (const std::string& dn : dns) results.line("  " + printable(dn));
  if (!dns.empty() && count > dns.size()) results.line("  and " + std::to_string(count - dns.size()) + " more");
}

void addDns(Json& json, const std::vector<std::string>& dns) {
  json.openList("dns");
  for (const std::string& dn : dns) json.text("", dn);
  json.closeList();
}

void addStrengths(Json& json, const Strengths& strengths) {
  json.openList("strengths");
  for (size_t i = 0; i < kStrengthCount; ++i) {
    if (strengths[i] > 0) json.open("").text("name", kStrengthNames[i]).number("values", strengths[i]).close();
  }
  json.closeList();
}

void writeSubtree(const std::string& name, const Subtree& subtree, Results& results) {
  std::string line = "subtree " + printable(name) + ": " + std::to_string(subtree.entries) + " accounts, " +
                     std::to_string(subtree.values) + " values";
  for (size_t i = 0; i < kStrengthCount; ++i) {
    if (subtree.strengths[i] > 0) line += ", " + std::to_string(subtree.strengths[i]) + " " + kStrengthNames[i];
  }
  results.line(line);
}

void addSubtrees(const AuditReport& report, Json& json) {
  json.openList("subtrees");
  for (const auto& [name, subtree] : report.subtrees()) {
    json.open("").text("dn", name).number("accounts", subtree.entries).number("values", subtree.values);
    addStrengths(json, subtree.strengths);
    json.close();
  }
  json.closeList();
}

void writeFinding(const AuditReport& report, size_t i, Results& results) {
  const DnList& list = report.facts.findings[i];
  if (list.count == 0) return;
  const char* mark = report.fails(i) ? " (against the policy)" : "";
  results.line(std::string("finding: ") + kFindings[i].name + ": " + std::to_string(list.count) + mark);
  if (report.brief) return;
  if (i != static_cast<size_t>(Finding::kReused)) return writeDns(list.dns, list.count, results);
  results.line("  groups: " + std::to_string(report.reuseGroups));
  for (const ReuseGroup& group : report.reused) {
    results.line("  one password in " + std::to_string(group.entries) + " entries:");
    writeDns(group.dns, group.entries, results);
  }
}

void addFinding(const AuditReport& report, size_t i, Json& json) {
  const DnList& list = report.facts.findings[i];
  json.open("").text("name", kFindings[i].name).number("entries", list.count);
  if (report.brief) {
    json.close();
    return;
  }
  json.flag("forbidden", report.forbidden.test(i));
  addDns(json, list.dns);
  if (i == static_cast<size_t>(Finding::kReused)) {
    json.number("groups", report.reuseGroups).openList("largestGroups");
    for (const ReuseGroup& group : report.reused) {
      json.open("").number("entries", group.entries);
      addDns(json, group.dns);
      json.close();
    }
    json.closeList();
  }
  json.close();
}

}  // namespace

std::vector<AuditReport::SchemeRow> AuditReport::schemes() const {
  std::vector<SchemeRow> rows;
  for (const Scheme& scheme : kSchemes) {
    rows.push_back({scheme.name, scheme.strength, facts.schemes[indexOf(scheme)]});
  }
  rows.push_back({"unknown", Strength::kUnknown, facts.schemes.back()});
  rows.erase(std::remove_if(rows.begin(), rows.end(), [](const SchemeRow& row) { return row.values == 0; }),
             rows.end());
  std::stable_sort(rows.begin(), rows.end(), [](const SchemeRow& a, const SchemeRow& b) {
    return a.strength != b.strength ? a.strength < b.strength : a.values > b.values;
  });
  return rows;
}

std::vector<std::pair<std::string, Subtree>> AuditReport::subtrees() const {
  std::vector<std::pair<std::string, Subtree>> rows(facts.subtrees.begin(), facts.subtrees.end());
  std::stable_sort(rows.begin(), rows.end(),
                   [](const auto& a, const auto& b) { return a.second.entries > b.second.entries; });
  constexpr size_t kMost = 50;
  if (rows.size() <= kMost) return rows;
  Subtree others;
  for (size_t i = kMost; i < rows.size(); ++i) others.add(rows[i].second);
  rows.resize(kMost);
  rows.emplace_back(kOtherSubtrees, others);
  return rows;
}

bool AuditReport::met() const {
  for (size_t i = 0; i < kFindingCount; ++i) {
    if (fails(i)) return false;
  }
  return true;
}

void writeText(const AuditReport& report, Results& results) {
  const Facts& facts = report.facts;
  results.line(leftCell("scheme", 16) + leftCell("strength", 12) + cell("values", 12));
  for (const AuditReport::SchemeRow& row : report.schemes()) {
    results.line(leftCell(row.name, 16) + leftCell(nameOf(row.strength), 12) + cell(row.values, 12));
  }
  results.line("entries: " + std::to_string(facts.entries));
  results.line("accounts: " + std::to_string(facts.accounts));
  results.line("values: " + std::to_string(facts.values));
  if (facts.urls > 0) results.line("behind a URL: " + std::to_string(facts.urls));
  if (facts.authPasswords > 0) results.line("values of authPassword: " + std::to_string(facts.authPasswords));
  if (facts.deleted > 0) results.line("to be deleted: " + std::to_string(facts.deleted));
  for (size_t i = 0; i < kStrengthCount; ++i) {
    if (facts.strengths[i] > 0) {
      results.line(std::string("strength ") + kStrengthNames[i] + ": " + std::to_string(facts.strengths[i]));
    }
  }
  if (!report.brief) {
    for (const auto& [name, subtree] : report.subtrees()) writeSubtree(name, subtree, results);
  }
  for (size_t i = 0; i < kFindingCount; ++i) writeFinding(report, i, results);
  if (report.policy) results.line(report.met() ? "policy: met" : "policy: not met");
}

void writeObject(const AuditReport& report, Results& results) {
  const Facts& facts = report.facts;
  Json json;
  if (!report.brief) {
    json.text("time", report.time).openList("exports");
    for (const std::string& name : report.exports) json.text("", name);
    json.closeList();
  }
  json.number("entries", facts.entries).number("accounts", facts.accounts).number("values", facts.values);
  json.number("urls", facts.urls).number("deleted", facts.deleted);
  json.number("authPasswords", facts.authPasswords).openList("schemes");
  for (const AuditReport::SchemeRow& row : report.schemes()) {
    json.open("").text("name", row.name).text("strength", nameOf(row.strength)).number("values", row.values).close();
  }
  json.closeList();
  addStrengths(json, facts.strengths);
  if (!report.brief) addSubtrees(report, json);
  json.openList("findings");
  for (size_t i = 0; i < kFindingCount; ++i) {
    if (facts.findings[i].count > 0) addFinding(report, i, json);
  }
  json.closeList();
  if (!report.brief) report.policy ? json.flag("policyMet", report.met()) : json.null("policyMet");
  results.line(json.end());
}

}  // namespace tool
