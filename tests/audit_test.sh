#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# The audit of exports: audit_test.sh LDAPPW. Counts are made by hand; no password and no part of a value is ever shown.
. "$(dirname "$0")/command_frame.sh"
digest() { printf '{%s}%s' "$1" "$(printf "$2" | openssl dgst "-$3" -binary | b64)"; }
entry() {
  printf 'dn: uid=%s,ou=%s,dc=example,dc=org\nobjectClass: inetOrgPerson\ncn: Some One\n' "$1" "$2"
  printf 'userPassword: %s\n' "${@:3}"; echo
}

echo SaltOfTest-A >salt
run 'keys create' 0 keys create --salt-file salt --config cfg --directory dir <<<aSeedForTheTest-A
run 'other keys' 0 keys create --salt-file salt --config cfg2 --directory dir2 <<<aSeedForTheTest-B
aes=$("$tool" format --scheme aes256 --keys dir <<<teatime99)
{
  printf 'dn: dc=example,dc=org\nobjectClass: domain\n\n'
  entry anna People hunter2xyz
  entry ben People "$(digest SHA sharedone sha1)"
  entry cem People "$(digest sha sharedone sha1)" '{CRYPT}$6$salt$'"$(printf 'a%.0s' {1..86})"
  entry dora People DORA
  entry finn Ops "$("$tool" format --scheme ssha <<<letmein77)"
  entry gus Ops "$aes"
  entry guy 'OPS' "$aes"
  entry hal Ops teatime99 teatime99
  entry kim Ops "$("$tool" format --scheme qveil <<<teatime99)"
  entry leo Ops "$("$tool" format --scheme md5 <<<leo)" '!{SSHA}teatime99' "$(digest SHA sharedone sha1 | b64)"
  printf 'dn: uid=eve,ou=Ops,dc=example,dc=org\nobjectClass: account\n\n'
  printf 'dn: uid=ida,ou=Ops,dc=example,dc=org\nuserPassword:\n\n'
  printf 'dn: uid=eve,ou=Ops,dc=example,dc=org\nchangetype: modify\nreplace: uid\nuid: eve\n-\n\n'
  printf 'dn:: %s\n' "$(printf 'uid=<script>\33[1m\377@style@"&\342\200\256\330\234\342\200\213,%s' \
    'ou=</td>,dc=example,dc=org' | b64)"
  printf 'userPassword%s\n' ':: *' ': {sha}broken' ': {X-teatime}99' ':< file:///x'; echo
} >export
printf 'letmein77\r\nhunter2xyz\n\n' >bad
for i in {1..52}; do entry "u$i" "O$i" '{crypt}abYH7TYgEKz2Q'; done >many
secrets="hunter2xyz sharedone DORA letmein77 teatime99 ${aes:8:20} $(digest SHA sharedone sha1 | cut -c 6-20) X-teatime"
unshown() {
  local text
  for text in $secrets; do ! grep -qaF -- "$text" out err page* 2>/dev/null || fail "$1: '$text' was shown"; done
}
always='clear=4, empty=1, reversible=3, unsalted=4, malformed=1, wrapped=1, salted_fast=1, no_password=1, unknown=1,'
always+=' broken=1, reused=6'
named() {
  json "$1" "{f['name'].replace('-', '_'): f['entries'] for f in d[0]['findings']} == dict($always, $2)"
  unshown "$1"
}

# What is read alone is compared alone: equal AES values without keys, their passwords with them, hashes on request.
test_counts() {
  run 'without keys' 3 audit export --json --known-bad bad
  named 'without keys' 'name_as_password=1, known_bad=1'
  json 'groups' "[f for f in d[0]['findings'] if f['name'] == 'reused'][0]['largestGroups'] == [{'entries': 2, 'dns':
    ['uid=%s,ou=%s,dc=example,dc=org' % name for name in pair]} for pair in ((('ben', 'People'), ('cem', 'People')),
    (('gus', 'Ops'), ('guy', 'OPS')), (('hal', 'Ops'), ('kim', 'Ops')))]"
  json 'counts' "[d[0][name] for name in ('entries', 'accounts', 'values', 'urls', 'policyMet')] ==
    [15, 13, 19, 1, None] and {s['name']: s['values'] for s in d[0]['strengths']} == {'clear': 5,
    'reversible': 3, 'unsalted': 5, 'salted-fast': 1, 'strong': 1, 'locked': 1, 'unknown': 1} and
    {'name': 'sha512-crypt', 'strength': 'strong', 'values': 1} in d[0]['schemes']"
  json 'subtrees' "[(s['dn'], s['accounts'], s['values']) for s in d[0]['subtrees']] == [
    ('ou=ops,dc=example,dc=org', 8, 10), ('ou=people,dc=example,dc=org', 4, 5), ('ou=</td>,dc=example,dc=org', 1, 2)]"
  gzip -c export >export.gz
  run 'with keys' 3 audit --json --keys dir - <export.gz
  named 'with keys' 'name_as_password=1'
  json 'one group of four' "d[0]['findings'][3]['largestGroups'][0]['entries'] == 4"
  run 'other keys' 3 audit --json --keys dir2 export
  named 'other keys' 'name_as_password=1, unopened=2'
  run hashes 3 audit --json --known-bad bad --check-hashes export
  named hashes 'name_as_password=2, known_bad=2'
  run 'an entry in two exports is one' 3 audit export export --json --threads 1
  json 'an entry in two exports is one' "d[0]['entries'] == 30 and d[0]['findings'][3]['entries'] == 6"
  run 'many subtrees' 0 audit many --json
  json 'many subtrees' "len(d[0]['subtrees']) == 51 and
    (d[0]['subtrees'][50]['dn'], d[0]['subtrees'][50]['accounts']) == ('(others)', 2) and
    [(f['name'], f['entries']) for f in d[0]['findings']] == [('des-crypt', 52)]"
  run 'several batches' 0 audit "$root/samples/directory.ldif" --json --list 2
  json 'several batches' "[(f['entries'], len(f['dns'])) for f in d[0]['findings']] == [(320, 2), (16, 2), (24, 2)]"
}

# The text, and that nothing of the export acts on a terminal or a page.
test_text_and_page() {
  run text 1 audit export --fail-on clear,des-crypt --fail-on REUSED --list 1 --html page
  printed text 'scheme +strength +values' 'sha +unsalted +4' 'entries: 15' 'strength reversible: 3' '  and 3 more' \
    '  uid=anna,ou=People,dc=example,dc=org' 'finding: reversible: 3' 'finding: reused: 6 \(against the policy\)' \
    'subtree ou=people,dc=example,dc=org: 4 accounts, 5 values, 2 clear, 2 unsalted, 1 strong' 'policy: not met' \
    '  one password in 2 entries:' '  uid=<script>.x1B\[1m.xFF@style@.*'
  said text '^ldappw: policy: clear: 4'
  unshown text
  LC_ALL=C grep -qaE '[[:cntrl:]]|and 0 more' <(tr -d '\n' <out) && fail 'text: control characters, or a rest of none'
  same 'mode of a page' 600 "$(mode page)"
  grep -qF 'uid=&lt;script&gt;\x1B[1m\xFF@style@&quot;&amp;\u202E\u061C\u200B,ou=&lt;/td&gt;,dc=example' page ||
    fail 'page: the hostile DN is not there as text'
  python3 - page <<'PAGE' || fail 'page: markup'
import base64, hashlib, html.parser, sys
text, stack, seen = open(sys.argv[1], encoding="utf-8").read(), [], set()
class Page(html.parser.HTMLParser):
    def handle_starttag(self, tag, attributes):
        names = {name for name, _ in attributes}
        assert not names & {"href", "src", "style", "action"} and not any(name.startswith("on") for name in names)
        seen.add(tag)
        if tag not in ("meta",): stack.append(tag)
    def handle_endtag(self, tag):
        assert stack.pop() == tag, tag
Page().feed(text)
assert not stack and {"svg", "details"} < seen
assert not seen & {"script", "link", "img", "iframe", "object", "form", "base"}
style = text.split("<style>")[1].split("</style>")[0]
digest = base64.b64encode(hashlib.sha256(style.encode()).digest()).decode()
assert "content=\"default-src 'none'; style-src 'sha256-%s'; base-uri 'none'; form-action 'none'\"" % digest in text
assert not any(c < " " and c != "\n" for c in text)
PAGE
  run 'a page that is replaced' 0 audit many --html page --force
  grep -q '<h3>clear' page && fail 'a page that is replaced: it is the old one'
}

finish
