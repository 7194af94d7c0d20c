// SPDX-License-Identifier: Apache-2.0
// The report as a page. Text becomes part of it only as Html, which escaped() makes; audit_page.h has all the rest.
#include "audit/report.h"

#include <algorithm>
#include <cstdio>
#include <initializer_list>
#include <iterator>
#include <memory>
#include <numeric>
#include <string_view>

#include "audit/page_parts.h"
#include "base/base64.h"
#include "base/secret.h"
#include "base/sha256.h"
#include "base/text.h"

namespace tool {
namespace {

// Markup. Made of constant parts and escaped text alone.
struct Html {
  std::string text;
};

constexpr std::pair<char, const char*> kEscapes[] = {
    {'&', "&amp;"}, {'<', "&lt;"}, {'>', "&gt;"}, {'"', "&quot;"}, {'\'', "&#39;"}};

// What a reader would not see is shown as a terminal is shown it.
Html escaped(std::string_view raw) {
  Html html;
  for (const char c : printable(raw)) {
    const auto* found =
        std::find_if(std::begin(kEscapes), std::end(kEscapes), [c](const auto& row) { return row.first == c; });
    found != std::end(kEscapes) ? html.text += found->second : html.text += c;
  }
  return html;
}

using Field = std::pair<std::string_view, Html>;

// The template with each @name@ replaced. What is filled in is not looked at again.
Html fill(std::string_view page, std::initializer_list<Field> fields) {
  Html html;
  for (;;) {
    const size_t begin = page.find('@');
    const size_t end = begin == std::string_view::npos ? begin : page.find('@', begin + 1);
    html.text += page.substr(0, begin);
    if (end == std::string_view::npos) return html;
    const std::string_view name = page.substr(begin + 1, end - begin - 1);
    for (const Field& field : fields) {
      if (field.first == name) html.text += field.second.text;
    }
    page.remove_prefix(end + 1);
  }
}

// With a comma between groups of three digits.
Html grouped(std::uint64_t number) {
  std::string text = std::to_string(number);
  for (size_t i = text.size(); i > 3; i -= 3) text.insert(i - 3, ",");
  return {text};
}

Html decimal(double number, int places, const char* unit = "") {
  char text[64];
  snprintf(text, sizeof text, "%.*f%s", places, number, unit);
  return {text};
}

// Only all are 100 %, and only none are 0 %.
Html share(std::uint64_t part, std::uint64_t whole) {
  if (whole == 0) return {"&ndash;"};
  const double percent = 100.0 * static_cast<double>(part) / static_cast<double>(whole);
  if (part > 0 && percent < 0.1) return {"&lt; 0.1 %"};
  if (part < whole && percent > 99.9) return {"&gt; 99.9 %"};
  const bool rounded = part == 0 || part == whole;
  return decimal(percent, rounded ? 0 : 1, " %");
}

std::uint64_t sumOf(const Strengths& strengths) {
  return std::accumulate(strengths.begin(), strengths.end(), std::uint64_t{0});
}

// A bar of the strengths, as long as they are a part of whole.
Html barOf(const char* kind, const Strengths& strengths, std::uint64_t whole) {
  Html parts;
  std::string label;
  std::uint64_t before = 0;
  const auto place = [&](std::uint64_t values) {
    return 1000.0 * static_cast<double>(values) / static_cast<double>(whole);
  };
  for (size_t i = 0; i < kStrengthCount; ++i) {
    if (strengths[i] == 0) continue;
    const std::string text = kStrengthNames[i] + (": " + std::to_string(strengths[i]));
    label += (label.empty() ? "" : ", ") + text;
    parts.text += fill(kBarPart, {{"strength", {kStrengthNames[i]}},
                                  {"x", decimal(place(before), 2)},
                                  {"width", decimal(place(strengths[i]), 2)},
                                  {"label", escaped(text)}})
                      .text;
    before += strengths[i];
  }
  return fill(kBar, {{"class", {kind}}, {"label", escaped(label)}, {"parts", parts}});
}

Html listOf(const std::string& title, const std::vector<std::string>& dns) {
  if (dns.empty()) return {};
  Html rows;
  for (const std::string& dn : dns) rows.text += fill(kListRow, {{"dn", escaped(dn)}}).text;
  return fill(kList, {{"title", escaped(title)}, {"rows", rows}});
}

Html listsOf(const AuditReport& report, size_t i) {
  const DnList& list = report.facts.findings[i];
  const std::string part = list.dns.size() < list.count ? std::to_string(list.dns.size()) + " of " : "";
  if (i != static_cast<size_t>(Finding::kReused)) {
    return listOf(part + std::to_string(list.count) + " entries", list.dns);
  }
  Html lists;
  for (const ReuseGroup& group : report.reused) {
    lists.text += listOf("one password in " + std::to_string(group.entries) + " entries", group.dns).text;
  }
  return lists;
}

Html findingsOf(const AuditReport& report) {
  Html page{kFindingsStart};
  for (size_t i = 0; i < kFindingCount; ++i) {
    const FindingText& row = kFindings[i];
    if (report.facts.findings[i].count == 0) continue;
    const Html command = *row.command != '\0' ? fill(kCommand, {{"command", escaped(row.command)}}) : Html{};
    page.text += fill(kFinding, {{"weight", {row.weight}},
                                 {"name", escaped(row.name)},
                                 {"forbidden", {report.fails(i) ? kForbidden : ""}},
                                 {"entries", grouped(report.facts.findings[i].count)},
                                 {"text", escaped(row.text)},
                                 {"advice", escaped(row.advice)},
                                 {"command", command},
                                 {"lists", listsOf(report, i)}})
                     .text;
  }
  if (page.text == kFindingsStart) page.text += kNoFinding;
  return page;
}

Html schemesOf(const AuditReport& report, std::uint64_t judged) {
  Html rows;
  for (const AuditReport::SchemeRow& row : report.schemes()) {
    Strengths one{};
    one[static_cast<size_t>(row.strength)] = row.values;
    rows.text += fill(kSchemeRow, {{"name", escaped(row.name)},
                                   {"strength", escaped(nameOf(row.strength))},
                                   {"values", grouped(row.values)},
                                   {"share", share(row.values, judged)},
                                   {"bar", barOf("small", one, judged)}})
                     .text;
  }
  return fill(kSchemeTable, {{"rows", rows}});
}

Html subtreesOf(const AuditReport& report) {
  Html rows;
  for (const auto& [name, subtree] : report.subtrees()) {
    rows.text += fill(kSubtreeRow, {{"name", escaped(name)},
                                    {"accounts", grouped(subtree.entries)},
                                    {"values", grouped(subtree.values)},
                                    {"bar", barOf("small", subtree.strengths, subtree.values)}})
                     .text;
  }
  return fill(kSubtreeTable, {{"rows", rows}});
}

Html legendOf(const Strengths& strengths, std::uint64_t judged) {
  Html rows;
  for (size_t i = 0; i < kStrengthCount; ++i) {
    if (strengths[i] == 0) continue;
    rows.text +=
        fill(kLegendRow,
             {{"name", {kStrengthNames[i]}}, {"values", grouped(strengths[i])}, {"share", share(strengths[i], judged)}})
            .text;
  }
  return fill(kLegend, {{"rows", rows}});
}

Html digestOf(std::string_view style) {
  const Sha256::Digest digest = Sha256().of({style});
  Secret text;
  appendBase64({reinterpret_cast<const char*>(digest.data()), digest.size()}, text);
  return {text.c_str()};
}

Html startOf(const AuditReport& report, std::uint64_t judged) {
  const auto strengthOf = [&](Strength strength) { return report.facts.strengths[static_cast<size_t>(strength)]; };
  std::string exports;
  for (const std::string& name : report.exports) exports += (exports.empty() ? "" : ", ") + name;
  const Html sentence =
      fill(kSentence, {{"values", grouped(judged)},
                       {"open", grouped(strengthOf(Strength::kClear) + strengthOf(Strength::kReversible))}});
  return fill(kPageStart, {{"digest", digestOf(kPageStyle)},
                           {"day", escaped(report.time.substr(0, 10))},
                           {"style", {kPageStyle}},
                           {"policy",
                            {!report.policy ? ""
                             : report.met() ? kPolicyMet
                                            : kPolicyNotMet}},
                           {"time", escaped(report.time)},
                           {"exports", escaped(exports)},
                           {"figure", share(strengthOf(Strength::kStrong), judged)},
                           {"sentence", sentence}});
}

}  // namespace

std::string pageOf(const AuditReport& report) {
  const Facts& facts = report.facts;
  const std::uint64_t judged = sumOf(facts.strengths);
  const Html tiles = fill(kTiles, {{"entries", grouped(facts.entries)},
                                   {"accounts", grouped(facts.accounts)},
                                   {"values", grouped(facts.values)},
                                   {"subtrees", grouped(facts.subtrees.size())}});
  std::string page = startOf(report, judged).text;
  page += barOf("bar", facts.strengths, judged).text + legendOf(facts.strengths, judged).text + tiles.text;
  page += schemesOf(report, judged).text + findingsOf(report).text + subtreesOf(report).text;
  return page + fill(kPageEnd, {{"version", {LDAPPW_VERSION_TEXT}}}).text;
}

}  // namespace tool
