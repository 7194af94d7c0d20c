// SPDX-License-Identifier: Apache-2.0
// The constant parts of the audit's page. A name between two @ is filled in; audit_html.cpp says with what.
#pragma once

namespace tool {

// The policy of the page's head lets this style in by its digest, and no other style, script, image or request.
constexpr char kPageStyle[] = R"CSS(
:root {
  color-scheme: light dark;
  --ink: #1b2127; --soft: #5a6570; --line: #dde2e7; --ground: #ffffff; --card: #f5f7f9; --link: #175cd3;
  --clear: #b42318; --reversible: #d9572b; --unsalted: #e8912d; --des-crypt: #d9b23c; --salted-fast: #9fb0be;
  --strong: #2e7d5b; --external: #6b83b8; --locked: #7d8790; --unknown: #a184b5;
}
@media (prefers-color-scheme: dark) {
  :root {
    --ink: #e6e9ec; --soft: #9aa5b0; --line: #323a42; --ground: #14181c; --card: #1c2227; --link: #84adff;
    --clear: #e5594d; --reversible: #e2784f; --unsalted: #dd9a4b; --des-crypt: #c9ad55; --salted-fast: #7b8c9a;
    --strong: #4ba680; --external: #7f96c8; --locked: #6c757d; --unknown: #ab92bd;
  }
}
* { box-sizing: border-box; }
body {
  margin: 0 auto; padding: 2rem 1.25rem 3rem; max-width: 62rem; background: var(--ground); color: var(--ink);
  font: 1rem/1.5 system-ui, -apple-system, "Segoe UI", "Liberation Sans", "DejaVu Sans", sans-serif;
}
h1 { margin: 0; font-size: 1.05rem; font-weight: 600; }
h2 { margin: 2.75rem 0 .75rem; font-size: 1.25rem; font-weight: 600; }
h3 { margin: 0; font-size: 1rem; font-weight: 600; }
p { margin: .35rem 0; }
.soft { color: var(--soft); }
.dn, code { font: .85em/1.5 ui-monospace, "Liberation Mono", "DejaVu Sans Mono", monospace; overflow-wrap: anywhere; }
.dn { unicode-bidi: isolate; }
header { border-bottom: 1px solid var(--line); padding-bottom: 1rem; }
.headline { display: flex; flex-wrap: wrap; align-items: baseline; gap: .25rem 1.25rem; margin: 2rem 0 1.25rem; }
.figure { white-space: nowrap; font-size: clamp(3.5rem, 14vw, 5.5rem); font-weight: 650; line-height: 1; letter-spacing: -.03em; }
.headline p { margin: 0; flex: 1 1 16rem; max-width: 32rem; font-size: 1.1rem; }
.bar { display: block; width: 100%; height: 2.25rem; border-radius: .375rem; }
.bar rect { stroke: var(--ground); stroke-width: 2; vector-effect: non-scaling-stroke; }
.small { display: inline-block; width: 100%; min-width: 5rem; height: .6rem; border-radius: .2rem; vertical-align: middle; }
.small .rest { fill: var(--line); }
.swatch { width: .7rem; height: .7rem; margin-right: .5rem; border-radius: .15rem; flex: none; }
.legend { list-style: none; margin: 1rem 0 0; padding: 0; display: grid; gap: .2rem 2rem;
  grid-template-columns: repeat(auto-fill, minmax(15rem, 1fr)); }
.legend li { display: flex; align-items: center; font-variant-numeric: tabular-nums; }
.legend b { margin-left: auto; font-weight: 600; }
.legend span { width: 4.5rem; white-space: nowrap; text-align: right; color: var(--soft); }
.tiles { display: grid; gap: .75rem; grid-template-columns: repeat(auto-fit, minmax(8rem, 1fr)); margin: 2rem 0 0; }
.tiles div { background: var(--card); border-radius: .5rem; padding: .75rem 1rem; }
.tiles dt { color: var(--soft); font-size: .875rem; }
.tiles dd { margin: 0; font-size: 1.375rem; font-weight: 600; font-variant-numeric: tabular-nums; }
table { width: 100%; border-collapse: collapse; font-variant-numeric: tabular-nums; }
th { text-align: left; font-weight: 500; font-size: .875rem; color: var(--soft); }
th, td { padding: .4rem .75rem .4rem 0; border-bottom: 1px solid var(--line); vertical-align: middle; }
th:last-child, td:last-child { padding-right: 0; width: 30%; }
.number { text-align: right; white-space: nowrap; }
.finding { border: 1px solid var(--line); border-left: .3rem solid var(--salted-fast); border-radius: .375rem;
  padding: .85rem 1rem; margin: 0 0 .75rem; }
.high { border-left-color: var(--clear); }
.middle { border-left-color: var(--unsalted); }
.title { display: flex; flex-wrap: wrap; align-items: baseline; gap: .25rem .75rem; }
.title .count { margin-left: auto; font-weight: 600; font-variant-numeric: tabular-nums; }
.badge { font-size: .75rem; font-weight: 600; padding: .1rem .5rem; border-radius: 1rem; border: 1px solid currentColor; }
.bad { color: var(--clear); }
.good { color: var(--strong); }
code { background: var(--card); border-radius: .25rem; padding: .1rem .35rem; }
details { margin-top: .5rem; }
summary { cursor: pointer; color: var(--link); }
details ul { margin: .5rem 0 0; padding-left: 1.25rem; }
footer { margin-top: 3rem; padding-top: 1rem; border-top: 1px solid var(--line); font-size: .875rem; color: var(--soft); }
@media (max-width: 32rem) {
  body { padding: 1.25rem 1rem 2rem; }
  .wide { display: none; }
  th:last-child, td:last-child { width: 26%; }
}
@media print {
  :root { color-scheme: light; }
  body { padding: 0; max-width: none; font-size: 10pt; }
  * { print-color-adjust: exact; -webkit-print-color-adjust: exact; }
  details::details-content { content-visibility: visible; display: block; block-size: auto; opacity: 1; }
  h2, .title, .finding > p, summary { break-after: avoid; }
  tr, .title { break-inside: avoid; }
}
)CSS";

constexpr char kPageStart[] = R"HTML(<!DOCTYPE html>
<html lang="en">
<head>
<meta charset="utf-8">
<meta http-equiv="Content-Security-Policy" content="default-src 'none'; style-src 'sha256-@digest@'; base-uri 'none'; form-action 'none'">
<meta name="referrer" content="no-referrer">
<meta name="viewport" content="width=device-width, initial-scale=1">
<title>Password audit, @day@</title>
<style>@style@</style>
</head>
<body>
<header>
<h1>Password audit @policy@</h1>
<p class="soft">@time@ &middot; <span class="dn">@exports@</span></p>
</header>
<main>
<section class="headline">
<div class="figure">@figure@</div>
<p>@sentence@</p>
</section>
)HTML";

constexpr char kPolicyMet[] = R"HTML(<span class="badge good">policy met</span>)HTML";
constexpr char kPolicyNotMet[] = R"HTML(<span class="badge bad">policy not met</span>)HTML";
constexpr char kSentence[] =
    R"HTML(of @values@ password values are stored as a strong hash. @open@ can be read from the export, by anybody or by whoever has its keys.)HTML";

constexpr char kBar[] =
    R"HTML(<svg class="@class@" viewBox="0 0 1000 10" preserveAspectRatio="none" role="img" aria-label="@label@">@parts@</svg>)HTML";
constexpr char kBarPart[] =
    R"HTML(<rect x="@x@" y="0" width="@width@" height="10" fill="var(--@strength@)"><title>@label@</title></rect>)HTML";
constexpr char kLegend[] = "<ul class=\"legend\">\n@rows@</ul>\n";
constexpr char kLegendRow[] =
    R"HTML(<li><svg class="swatch" viewBox="0 0 10 10" aria-hidden="true"><rect width="10" height="10" fill="var(--@name@)"/></svg>@name@<b>@values@</b><span>@share@</span></li>
)HTML";
constexpr char kTiles[] = R"HTML(<dl class="tiles">
<div><dt>Entries</dt><dd>@entries@</dd></div>
<div><dt>Accounts</dt><dd>@accounts@</dd></div>
<div><dt>Password values</dt><dd>@values@</dd></div>
<div><dt>Subtrees</dt><dd>@subtrees@</dd></div>
</dl>
)HTML";

constexpr char kSchemeTable[] = R"HTML(<h2>Schemes</h2>
<table>
<thead><tr><th>Scheme</th><th>Strength</th><th class="number">Values</th><th class="number wide">Share</th><th></th></tr></thead>
<tbody>
@rows@</tbody>
</table>
)HTML";
constexpr char kSchemeRow[] =
    R"HTML(<tr><td>@name@</td><td>@strength@</td><td class="number">@values@</td><td class="number wide">@share@</td><td>@bar@</td></tr>
)HTML";
constexpr char kSubtreeTable[] = R"HTML(<h2>Subtrees</h2>
<table>
<thead><tr><th>Subtree</th><th class="number">Accounts</th><th class="number wide">Values</th><th></th></tr></thead>
<tbody>
@rows@</tbody>
</table>
)HTML";
constexpr char kSubtreeRow[] =
    R"HTML(<tr><td class="dn">@name@</td><td class="number">@accounts@</td><td class="number wide">@values@</td><td>@bar@</td></tr>
)HTML";

constexpr char kFindingsStart[] = "<h2>Findings</h2>\n";
constexpr char kNoFinding[] = "<p>There is none.</p>\n";
constexpr char kFinding[] = R"HTML(<section class="finding @weight@">
<div class="title"><h3>@name@</h3>@forbidden@<span class="count">@entries@ entries</span></div>
<p>@text@</p>
<p class="soft">Next: @advice@ @command@</p>
@lists@</section>
)HTML";
constexpr char kForbidden[] = R"HTML(<span class="badge bad">against the policy</span>)HTML";
constexpr char kCommand[] = "<code>@command@</code>";
constexpr char kList[] = "<details><summary>@title@</summary>\n<ul>\n@rows@</ul></details>\n";
constexpr char kListRow[] = "<li class=\"dn\">@dn@</li>\n";

constexpr char kPageEnd[] = R"HTML(</main>
<footer>Made by ldappw @version@. A finding counts entries, a scheme or strength counts values. No password is on this page; the names of entries with weak ones are: keep it like the export.</footer>
</body>
</html>
)HTML";

}  // namespace tool
