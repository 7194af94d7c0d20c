#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# The ldif and trial verbs, run as a user runs them: ldif_test.sh LDAPPW. {SHA} values need no salt, so what a line has to
# become is known to the byte; another program makes the digests.
set -uo pipefail

ldappw=$(realpath "${1:?the path of the command}")
root=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cd "$work" || exit 1
failures=0

bad() {
  echo "FAILED: $*" >&2
  failures=$((failures + 1))
}

ldif() { "$ldappw" ldif "$@" 2> err; }

expectCode() { # name expected actual
  [[ $2 == "$3" ]] || bad "$1: exit code $3 instead of $2: $(head -c 300 err)"
}

sha() { printf '{SHA}%s' "$(printf "$1" | openssl dgst -sha1 -binary | base64)"; }

S=$(sha secret)
LONG="x-$(printf 'a%.0s' {1..70})"
W="userPassword;$LONG: $S"

# name | exit code | input | output; "=" is "as it came in". Printf escapes.
rows=(
  "plain|0|dn: cn=a\nuserPassword: secret\nsn: b  \n\n|dn: cn=a\nuserPassword: $S\nsn: b  \n\n"
  "spelling, option, CRLF, no last newline|0|dn: a\r\nUSERpassword;x-T: secret\r\ncn: x|dn: a\r\nUSERpassword;x-T: $S\r\ncn: x"
  "base64, last line without newline|0|dn: a\nuserPassword:: c2VjcmV0|dn: a\nuserPassword: $S"
  "by OID|0|dn: a\n2.5.4.35: secret\n|dn: a\n2.5.4.35: $S\n"
  "folded in the name, the mark and the value|0|dn: a\nuserPa\n ssword:\n : c2Vj\n cmV0\ncn: b\n|dn: a\nuserPassword: $S\ncn: b\n"
  "folded line stays folded at 76|0|dn: a\r\nuserPassword;$LONG\r\n : secret\r\n|dn: a\r\n${W:0:76}\r\n ${W:76}\r\n"
  "long line that was not folded|0|dn: a\nuserPassword;$LONG: secret\n|dn: a\n$W\n"
  "trailing blank is of the password|0|dn: a\nuserPassword: secret \n|dn: a\nuserPassword: $(sha 'secret ')\n"
  "empty|0|dn: a\nuserPassword:\n\ndn: b\nuserPassword:: \n|dn: a\nuserPassword: $(sha '')\n\ndn: b\nuserPassword: $(sha '')\n"
  "plain text of one colon|0|dn: a\nuserPassword: :\n|dn: a\nuserPassword: $(sha :)\n"
  "comments and other attributes|0|# userPassword: secret\n#x\n userPassword: secret\nuserPasswordX: secret\n userPassword: y\n|="
  "one-way and elsewhere|0|dn: a\nuserPassword: $S\nuserPassword: {crypt}abYH7TYgEKz2Q\nuserPassword:< file:///etc/hostname\n|="
  "delete block|0|dn: a\nchangetype: modify\ndelete: userPassword\nuserPassword: old\n-\nadd: userPassword\nuserPassword: secret\n-\n|dn: a\nchangetype: modify\ndelete: userPassword\nuserPassword: old\n-\nadd: userPassword\nuserPassword: $S\n-\n"
  "a delete block ends with its record|0|dn: a\nchangetype: modify\ndelete: userPassword\n\ndn: b\nuserPassword: secret\n|dn: a\nchangetype: modify\ndelete: userPassword\n\ndn: b\nuserPassword: $S\n"
  "unknown tag|3|dn: a\nuserPassword: {X-OWN}secret\n|="
  "clear text that looks like a value|3|dn: a\nuserPassword: {SHA}secret\n|="
  "damaged base64|3|dn: a\nuserPassword:: c2Vjc*\n|="
  "base64 after the padding|3|dn: a\nuserPassword:: YQ==YQ==\n|="
  "NUL byte|3|dn: a\nuserPassword:: YQBi\n|="
  "leading tab|3|dn: a\nuserPassword: \tsecret\n|="
  "carriage return within|3|dn: a\nuserPassword: sec\rret\n|="
  "no key for an AES value|4|dn: a\nuserPassword: {AES256}AAAAAAAAAAAAAAAAAAAAAA==\n|="
)
for row in "${rows[@]}"; do
  IFS='|' read -r name code input output <<< "$row"
  printf "$input" > in
  if [[ $output == "=" ]]; then cp in expected; else printf "$output" > expected; fi
  ldif --to sha --in in > out
  expectCode "$name" "$code" $?
  cmp -s out expected || bad "$name: $(diff expected out | head -5)"
  [[ $code == 0 ]] || grep -q "line 2: a: " err || bad "$name: not listed by line and DN: $(cat err)"
done

printf 'dn:: %s\npin: secret\nuserPassword: secret\n' "$(printf 'cn=\303\251' | base64)" > in
ldif --to sha --attribute PIN < in > out
printf 'pin: %s\n' "$S" | cmp -s - <(sed -n 2p out) && grep -q 'userPassword: secret' out || bad "--attribute: $(cat out)"

# Keys: rotation and back gives the sample again; other keys open nothing, not even the one value in 250 whose padding
# comes out right by chance.
for set in A B C; do
  echo "SaltOfTest-$set" > salt
  echo "aSeedForTheTest-$set" | "$ldappw" keys create --salt-file salt --config $set.cfg --directory $set > /dev/null ||
    bad "keys create"
done
unfold() { awk 'NR > 1 && sub(/^ /, "") { line = line $0; next } NR > 1 { print line } { line = $0 } END { print line }' "$1"; }
python3 "$root/scripts/make_sample.py" --entries 3000 --out sample
ldif --to aes128 --new-keys A --in sample --out a || bad "to aes128: $(cat err)"
ldif --to aes256 --keys A --new-keys B --allow-binary --in a --out b || bad "rotation: $(cat err)"
ldif --to clear --allow-clear --keys B --allow-binary --in b --out back || bad "to clear: $(cat err)"
cmp -s <(unfold sample) <(unfold back) || bad "the passwords did not come back"
ldif --to aes256 --keys C --new-keys A --in b > out
expectCode "wrong keys" 4 $?
cmp -s b out || bad "values were made anew with the wrong keys: $(diff b out | grep -c '^<') lines"
cmp -s <(sed -n 's/^ldappw: line \([0-9]*\): uid=.*/\1/p' err) <(grep -ni '^userpassword' b | cut -d: -f1) ||
  bad "the values that do not open are not listed by their lines"
printf 'dn: a\nuserPassword: %0800d\n' 0 > in # a value of it is too long for the server's check
ldif --to aes256 --new-keys A --in in > out
expectCode "a value that does not verify" 3 $?
cmp -s in out || bad "a value that does not verify was written"
ldif --to qveil --keys B --allow-binary --in b --out q
expectCode "longer than qveil holds" 3 $?
kept=$(unfold q | grep -ci '^userpassword: {AES256}') long=$(grep -c 'more bytes than' err)
[[ $kept == "$long" && $kept -gt 100 ]] || bad "qveil: $kept kept, $long listed"

# Threads change nothing but the time.
ldif --to sha --threads 1 --in sample > one
ldif --to sha --threads 5 --in sample | cmp -s - one || bad "the order of the output depends on the threads"

# The audit of a mixed export, against counts made by hand.
"$ldappw" ldif --audit --keys A --json --in "$root/samples/mixed.ldif" > audit
expectCode "audit" 3 $?
python3 - audit << 'END' || bad "audit: $(cat audit)"
import json, sys
audit = json.load(open(sys.argv[1]))
want = {"unknownTag": 3, "malformed": 7, "untagged": 1, "cryptVariant": 4, "unopened": 1, "notText": 0, "broken": 1}
assert audit["findings"] == want, audit["findings"]
assert (audit["entries"], audit["values"], audit["urls"], audit["deleted"]) == (28, 29, 1, 1)
assert audit["schemes"]["clear"]["values"] == 5, audit["schemes"]
END

# Output files: refused or replaced, and never in part.
cp sample old && chmod 640 old && cp old kept
ldif --to sha --in sample --out old
expectCode "existing output" 2 $?
ldif --to sha --in sample > /dev/full
expectCode "full device" 5 $?
ldif --to sha --in . --out old --force
expectCode "unreadable input" 5 $?
(ulimit -f 100 && trap '' XFSZ && ldif --to sha --in sample --out old --force)
expectCode "file size limit" 5 $?
mkfifo slow && exec 9<> slow # with a writer that stays, the input does not end
for signal in ${LDAPPW_SIGNALS:-TERM KILL}; do
  cat sample >&9 &
  writer=$!
  "$ldappw" ldif --to sha --in slow --out old --force 2> /dev/null 9>&- &
  command=$!
  for _ in {1..100}; do compgen -G '.old.*' > /dev/null && break || sleep 0.1; done
  kill -$signal $command && wait $command 2> /dev/null
  kill $writer 2> /dev/null
  [[ $signal == KILL ]] && rm -f .old.* # nothing can tidy up after that
done
exec 9>&-
cmp -s old kept || bad "the old output was touched by a run that failed"
compgen -G '.old.*' > /dev/null && bad "temporary files are left: $(ls -A)"
ldif --to sha --in old --out old --force && cmp -s old one && [[ $(stat -c %a old) == 640 ]] || bad "the input as output"

# The trial finds no fault with the sample, the empty passwords included.
"$ldappw" trial "$root/samples/directory.ldif" --keys A --json > trial 2> err
expectCode "trial" 0 $?
python3 - trial << 'END' || bad "trial: $(cat trial)"
import json, sys
trial = json.load(open(sys.argv[1]))
for name, row in trial["schemes"].items():
    assert row["values"] == row["verified"] == row["refused"] == row.get("recovered", row["values"]) == trial["clear"], name
assert trial["clear"] > 320
END
((failures == 0)) && echo "all passed"
exit $((failures > 0))
