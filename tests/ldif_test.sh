#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# The verbs that read directory exports: ldif_test.sh LDAPPW. {SHA} values need no salt, so what a line has to become is
# known to the byte; openssl makes the digests.
. "$(dirname "$0")/command_frame.sh"
sha() { printf '{SHA}%s' "$(printf "$1" | openssl dgst -sha1 -binary | b64)"; }
S=$(sha secret)
LONG="x-$(printf 'a%.0s' {1..70})"
W="userPassword;$LONG: $S"

# name | exit code | input | output; "=" is "as it came in". Printf escapes.
table=(
  "plain|0|dn: cn=a\nuserPassword: secret\nsn: b  \n\n|dn: cn=a\nuserPassword: $S\nsn: b  \n\n"
  "spelling, option, CRLF, no last newline|0|dn: a\r\nUSERpassword;x-T: secret\r\ncn: x|dn: a\r\nUSERpassword;x-T: $S\r\ncn: x"
  "base64, last line without newline|0|dn: a\nuserPassword:: c2VjcmV0|dn: a\nuserPassword: $S"
  "several values of an entry|0|dn: a\nuserPassword: secret\nuserPassword;x: secret\n|dn: a\nuserPassword: $S\nuserPassword;x: $S\n"
  "equal to one before|0|dn: a\nuserPassword: secret\nUSERpassword:: c2VjcmV0\n\ndn: b\nuserPassword: secret\n|dn: a\nuserPassword: $S\n\ndn: b\nuserPassword: $S\n"
  "equal to one that is kept|0|dn: a\nuserPassword: $S\nuserPassword: secret\nuserPassword: $S\n|dn: a\nuserPassword: $S\nuserPassword: $S\n"
  "equal in another block|0|dn: a\nchangetype: modify\nadd: userPassword\nuserPassword: secret\n-\nadd: userPassword\nuserPassword: secret\n-\n|dn: a\nchangetype: modify\nadd: userPassword\nuserPassword: $S\n-\nadd: userPassword\nuserPassword: $S\n-\n"
  "locked|3|dn: a\nuserPassword: !$S\nuserPassword: *\nuserPassword: x\nuserPassword: {crypt}!ab01FAX.bQRSU\n|="
  "padded|3|dn: a\nuserPassword:: $(printf ' %s' "$S" | b64)\nuserPassword: $S \n|="
  "encoded once more|3|dn: a\nuserPassword: $(printf %s "$S" | b64)\n|="
  "what only looks like these|0|dn: a\nuserPassword: !x\nuserPassword: e1NI\n|dn: a\nuserPassword: $(sha '!x')\nuserPassword: $(sha e1NI)\n"
  "history|3|dn: a\npwdHistory: 20260101000000Z#1.3.6.1.4.1.1466.115.121.1.40#6#secret\npwdHistory: t#s#9#secret\n|dn: a\npwdHistory: 20260101000000Z#1.3.6.1.4.1.1466.115.121.1.40#33#$S\npwdHistory: t#s#9#secret\n"
  "other attributes|3|dn: a\nolcRootPW: secret\nnsslapd-rootPW: secret\nauthPassword: SHA1\$aaaa\$bbbb\nauthPassword: secret\n|dn: a\nolcRootPW: $S\nnsslapd-rootPW: $S\nauthPassword: SHA1\$aaaa\$bbbb\nauthPassword: secret\n"
  "byte order mark|0|\xef\xbb\xbfdn: a\nuserPassword: secret\n|\xef\xbb\xbfdn: a\nuserPassword: $S\n"
  "frames of a search|0|version: 1\n\ndn: a\n\n# result\nsearch: 2\nresult: 0 Success\n|="
  "by OID|0|dn: a\n2.5.4.35: secret\n|dn: a\n2.5.4.35: $S\n"
  "folded in the name, the mark and the value|0|dn: a\nuserPa\n ssword:\n : c2Vj\n cmV0\ncn: b\n|dn: a\nuserPassword: $S\ncn: b\n"
  "folded line stays folded at 76|0|dn: a\r\nuserPassword;$LONG\r\n : secret\r\n|dn: a\r\n${W:0:76}\r\n ${W:76}\r\n"
  "long line that was not folded|0|dn: a\nuserPassword;$LONG: secret\n|dn: a\n$W\n"
  "trailing blank is of the password|0|dn: a\nuserPassword: secret \n|dn: a\nuserPassword: $(sha 'secret ')\n"
  "empty|0|dn: a\nuserPassword:\n\ndn: b\nuserPassword:: \n|dn: a\nuserPassword: $(sha '')\n\ndn: b\nuserPassword: $(sha '')\n"
  "plain text of one colon|0|dn: a\nuserPassword: :\n|dn: a\nuserPassword: $(sha :)\n"
  "comments and other attributes|0|dn: a\n# userPassword: secret\n#x\n userPassword: secret\nuserPasswordX: secret\n userPassword: y\n|="
  "one-way and elsewhere|0|dn: a\nuserPassword: $S\nuserPassword: {crypt}abYH7TYgEKz2Q\nuserPassword:< file:///etc/hostname\n|="
  "delete block|0|dn: a\nchangetype: modify\ndelete: userPassword\nuserPassword: old\n-\nadd: userPassword\nuserPassword: secret\n-\n|dn: a\nchangetype: modify\ndelete: userPassword\nuserPassword: old\n-\nadd: userPassword\nuserPassword: $S\n-\n"
  "delete block, folded and in another case|0|dn: a\nCHANGEtype: Modi\n fy\nDELETE: userPassword\nuserPassword: old\n-\n|="
  "replace block|0|dn: a\nchangetype: modify\nreplace: userPassword\nuserPassword: secret\n-\n|dn: a\nchangetype: modify\nreplace: userPassword\nuserPassword: $S\n-\n"
  "add record|0|dn: a\nchangetype: add\ndelete: userPassword\nuserPassword: secret\n|dn: a\nchangetype: add\ndelete: userPassword\nuserPassword: $S\n"
  "a delete block ends with its record|0|dn: a\nchangetype: modify\ndelete: userPassword\n\ndn: b\nuserPassword: secret\n|dn: a\nchangetype: modify\ndelete: userPassword\n\ndn: b\nuserPassword: $S\n"
  "unknown tag|3|dn: a\nuserPassword: {X-OWN}secret\n|="
  "clear text that looks like a value|3|dn: a\nuserPassword: {SHA}secret\n|="
  "crypt variant|3|dn: a\nuserPassword: {crypt}\$6\$salt\$hash\n|="
  "damaged base64|3|dn: a\nuserPassword:: c2Vjc*\n|="
  "base64 after the padding|3|dn: a\nuserPassword:: YQ==YQ==\n|="
  "blank after base64|3|dn: a\nuserPassword:: YWJj \n|="
  "NUL byte|3|dn: a\nuserPassword:: YQBi\n|="
  "leading tab|3|dn: a\nuserPassword: \tsecret\n|="
  "carriage return within|3|dn: a\nuserPassword: sec\rret\n|="
  "no key for an AES value|4|dn: a\nuserPassword: {AES256}AAAAAAAAAAAAAAAAAAAAAA==\n|="
  "the first problem counts|4|dn: b\nuserPassword: {AES128}AAAAAAAAAAAAAAAAAAAAAA==\n\ndn: a\nuserPassword: {X}y\n|="
)
for row in "${table[@]}"; do
  IFS='|' read -r name code input output <<<"$row"
  printf "$input" >in
  if [[ $output == = ]]; then cp in expected; else printf "$output" >expected; fi
  run "$name" "$code" ldif --to sha --in in
  sameFile "$name" expected out
  [ "$code" = 0 ] || said "$name" '^ldappw: line [2345]: a: '
done

# Inputs and attributes that are not what they should be: name | exit code | input | output | message | options.
while IFS='|' read -r name code input output pattern options; do
  printf "$input" >in
  run "$name" "$code" ldif --to sha in $options
  sameFile "$name" <(printf "$output") out
  said "$name" "$pattern"
done <<ROWS
nothing|3|||in has no entry.* seems to be empty
blank lines|3|\n\r\n\n|\n\r\n\n|seems to be blank
UTF-16|3|\xff\xfed\0n\0||UTF-16
UTF-16 without a mark|3|d\0n\0:\0||UTF-16
binary|3|\x7fELF\0||seems to be binary
xz|3|\xfd7zX\0||xz -dc
JSON|3|{"dn":1}\n|{"dn":1}\n|seems to be JSON
cut gzip|5|\x1f\x8b\x08||ends too early
damaged gzip|5|\x1f\x8b\x08nothing-of-the-kind||gzip data is damaged
damaged zstd|5|\x28\xb5\x2f\xfdnothing-of-the-kind||zstd data is damaged
outside|3|cn: x\nuserPassword: y\n\ndn: a\n\nuserPassword: z\n|cn: x\nuserPassword: y\n\ndn: a\n\nuserPassword: z\n|line 6: \(no dn\): lines that belong to no entry
no newline|0|dn: a\nuserPassword: secret|dn: a\nuserPassword: $S|warning: in: the last line does not end
byte order mark|0|\xef\xbb\xbfdn: a\n|\xef\xbb\xbfdn: a\n|warning: in begins with a byte order mark
never there|0|dn: a\npin: w\n|dn: a\npin: $(sha w)\n|warning: no entry has an attribute userPasword|--attribute userPasword --attribute pin
with an option|0|dn: a\npin;Lang-en;b: w\npin: y\n|dn: a\npin;Lang-en;b: $(sha w)\npin: y\n||--attribute pin;lang-en
a list|2|dn: a\n|||--attribute a,b
an empty option|2|dn: a\n|||--attribute a;
no number|2|dn: a\n|||--attribute 2
too many|2|dn: a\n||more than 64 attributes|$(printf -- '--attribute a%d ' {1..65})
ROWS
run 'an empty attribute' 2 ldif --to sha in --attribute ''
run 'two exports' 2 ldif --to sha in --in in
printf 'dn: a\nuserPassword:: %s\nuserPassword: %s\nuserPassword: %s\nuserPassword: !%s\n' "$(printf ' %s' "$S" | b64)" \
  "$(printf %s "$(sha b)" | b64)" "$(printf '{AES256}AAAAAAAAAAAAAAAAAAAAAA==' | b64)" "$S" >in
run --fix 4 ldif --to sha --fix in --out fixed --json
json --fix "(d[0]['fixed'], d[0]['failed'], d[0]['locked']) == (2, 1, 1)"
sameFile --fix <(sed "2s|:.*|: $S|; 3s|:.*|: $(sha b)|" in) fixed
run 'audit of wrapped values' 3 ldif --audit --json in
json 'audit of wrapped values' "d[0]['findings'] == dict(d[0]['findings'], padded=1, encoded=2, locked=1)"
for ((i = 0; i < 1002; ++i)); do printf 'dn: %d\nuserPassword: {X}\n\n' "$i"; done >in
run 'many findings' 3 ldif --to sha in
same 'many findings' '1000 ldappw: 2 more: unknown tag; the value is kept' \
  "$(grep -c '^ldappw: line ' err) $(grep more: err)"

# What is said and shown of foreign text.
printf 'dn:: %s\nuserPassword: {\e}x\nuserPassword: \e[1m{\n' "$(printf 'cn=\e[31m\n' | b64)" >in
run 'control characters' 3 ldif --to sha --in in
said 'control characters' 'line 2: cn=.x1B\[31m.x0A: unknown tag'
run 'control characters in an audit' 3 ldif --audit --verbose --in in
LC_ALL=C grep -q $'[\e\r]' out && fail 'an audit shows control characters'
printf 'dn:: %s\npin: secret\nuserPassword: secret\nCODE: secret\n' "$(printf 'cn=\303\251' | b64)" >in
run --attribute 0 ldif --to sha --attribute PIN --attribute code in
printf 'pin: %s\nuserPassword: secret\nCODE: %s\n' "$S" "$S" >expected; sed -i 1d out; sameFile --attribute expected out

# Change records: one a value, whatever the dn and the value are made of; what comes to a value that the entry has goes.
H=20200101000000Z#1.3.6.1.4.1.1466.115.121.1.40#
printf 'dn: a\nuserPassword: secret\nuserPassword;x-t: %s\nsn: b\n\ndn:: Y8O8\nuserPassword:: c8O8\npwdHistory: %s6#secret\n\n' \
  "{CLEAR}x" "$H" >in
printf 'dn: c\nuserPassword: secret\nuserPassword: {CLEAR}secret\nuserPassword: %s\n\ndn: d\nuserPassword: {SHA}x\n' "$S" >>in
change() { printf '%s\nchangetype: modify\ndelete: %s\n%s\n-\nadd: %s\n%s\n-\n\n' "$1" "${2%%:*}" "$2" "${3%%:*}" "$3"; }
{ change 'dn: a' 'userPassword: secret' "userPassword: $S"
  change 'dn: a' 'userPassword;x-t: {CLEAR}x' "userPassword;x-t: $(sha x)"
  change 'dn:: Y8O8' 'userPassword:: c8O8' "userPassword: $(sha 's\303\274')"
  change 'dn:: Y8O8' "pwdHistory: ${H}6#secret" "pwdHistory: ${H}33#$S"
  printf 'dn: c\nchangetype: modify\ndelete: userPassword\nuserPassword: secret\nuserPassword: {CLEAR}secret\n-\n\n'; } >expected
run changes 3 ldif --to sha --changes in
sameFile changes expected out
said changes '^ldappw: now sha: clear 4, plain 2'
run 'changes of changes' 3 ldif --to sha --changes expected
same 'changes of changes' '' "$(<out)"

# To another server's scheme: what can be done now and what cannot, with and without the work; a second run has nothing to
# do, and what an earlier run has made is not made again, but for the record that it had not finished.
cost='--to argon2id --memory 8 --rounds 1'
run 'dry run' 3 ldif $cost --dry-run --out none --json in
json 'dry run' "(d[0]['values'], d[0]['made'], d[0]['oneWay'], d[0]['malformed']) == (8, 6, 1, 1) and
  d[0]['now'] == {'clear': 4, 'plain': 2} and d[0]['atNextLogin'] == {'sha': 1}"
[ ! -e none ] || fail 'a dry run has written a file'
head -n -3 in >good
run 'to argon2id' 0 ldif $cost --changes --out made good
same 'to argon2id' '5 6' "$(grep -c '^userP.*{ARGON2}.argon2id.v=19.m=8,t=1,p=1' made) $(grep -c '{ARGON2}' made)"
head -c -1 made >cut
run resumed 0 ldif $cost --changes --resume cut --out again --json good
json resumed "(d[0]['made'], d[0]['resumed']) == (6, 5)"
sameFile resumed <(head -c 900 made) <(head -c 900 again)
run 'resumed export' 0 ldif $cost --resume made good
same 'resumed export' "$(grep -c '{ARGON2}' made)" "$(grep '{ARGON2}' out | grep -cFf <(grep -o '{ARGON2}.*' made))"
cp out once; run 'a second run' 0 ldif $cost --json --out twice once
json 'a second run' "(d[0]['made'], d[0]['done'], d[0]['oneWay']) == (0, 6, 1)"
sameFile 'a second run' once twice

# Keys: rotation and back gives the sample again; other keys open nothing, not even the one value in 250 whose padding
# comes out right by chance.
for set in A B C; do
  echo "SaltOfTest-$set" >salt
  run 'keys create' 0 keys create --salt-file salt --config $set.cfg --directory $set <<<"aSeedForTheTest-$set"
done
python3 "$root/scripts/make_sample.py" --entries 3000 --out sample
sed -i "s|^userpassword: x$|userpassword: X|I" sample  # x alone locks
run 'to aes128' 0 ldif --to aes128 --new-keys A --in sample --out a
run rotation 0 ldif --to aes256 --keys A --new-keys B --allow-binary --in a --out b
run 'to clear' 0 ldif --to clear --allow-clear --keys B --allow-binary --in b --out back
sameFile 'the passwords come back' <(unfold sample) <(unfold back)
run 'wrong keys' 4 ldif --to aes256 --keys C --new-keys A --in b
sameFile 'no value is converted with the wrong keys' b out
same 'the values that do not open are listed by their lines' "$(grep -ni '^userpassword' b | cut -d: -f1 | head -1000)" \
  "$(sed -n 's/^ldappw: line \([0-9]*\): uid=.*/\1/p' err | head -1000)"
printf 'dn: a\nuserPassword: %s\n' "$("$tool" format --scheme qveil <<<'{SHA}x')" >in
run 'a password like a value' 3 ldif --to clear --allow-clear in
sameFile 'a password like a value' in out
printf 'dn: a\nuserPassword: %0800d\n' 0 >in  # a value of it is too long for the server's check
run 'a value that does not verify' 3 ldif --to aes256 --new-keys A --in in
sameFile 'a value that does not verify' in out
run 'trial of it' 3 trial in --keys A
said 'trial of it' '^ldappw: line 2: a: aes192: the value does not verify'
printf 'dn: %s\nuserPassword: secret%s\n\n' {1..400}{,} >in
{ "$tool" ldif --to aes256 --new-keys A in | head -300; "$tool" ldif --to aes256 --new-keys B in | tail -900; } >both 2>err
run 'a rotation that had stopped' 0 ldif --to aes256 --keys C --keys A --new-keys B --json --out all both
json 'a rotation that had stopped' "(d[0]['made'], d[0]['done'], d[0]['failed']) == (100, 300, 0)"
run 'the rotation once more' 0 ldif --to aes256 --keys C --new-keys B --in all
sameFile 'the rotation once more' all out
run 'audit with all its keys' 0 ldif --audit --keys C --keys A --keys B both
python3 -c 'import base64; [print("dn: %d\nuserPassword:: %s\n" % (i, base64.b64encode(b"\xff%07d" % i).decode())) for i in range(3000)]' >in
run 'bytes under one key' 0 ldif --to aes256 --new-keys A --in in --out bytes --force
run 'bytes that another key opens too' 0 ldif --to aes256 --keys C --keys A --new-keys B --allow-binary --in bytes --out moved
run 'bytes moved' 0 ldif --to clear --allow-clear --keys B --allow-binary --in moved
sameFile 'the one with more padding is right' in out
printf 'dn: a\nuserPassword: %s\n' "$(printf '\xff' | "$tool" format --scheme qveil)" >in
run 'bytes that need no key' 0 ldif --to sha --allow-binary --in in
run 'longer than qveil holds' 3 ldif --to qveil --keys B --allow-binary --in b
kept=$(unfold out | grep -ci '^userpassword: {AES256}') long=$(grep -c 'more bytes than' err)
[[ $kept == "$long" && $kept -gt 100 ]] || fail "qveil: $kept kept, $long listed"
printf 'dn: a\nuserPassword: 123456789\n\ndn: b\nuserPassword:< file:///x\n' >in
run 'longer than crypt takes' 0 ldif --to crypt --in in --out crypted --json
json 'the counts' "d == [{'entries': 2, 'values': 2, 'made': 1, 'cut': 1, 'resumed': 0, 'done': 0, 'asTheyAre': 0, 'oneWay': 0, 'urls': 1,
  'deleted': 0, 'authPasswords': 0, 'fixed': 0, 'dropped': 0, 'locked': 0, 'wrapped': 0, 'unknownTags': 0, 'malformed': 0,
  'failed': 0, 'now': {'clear': 1}, 'atNextLogin': {}}]"
said 'longer than crypt takes' 'warning: 1 passwords are longer than the 8 bytes'
run 'the counts as text' 0 ldif --to sha --in in
same 'the counts as text' 'entries: 2,password values: 2,converted: 1,behind a URL, kept: 1,now sha: clear 1' \
  "$(sed 's/^ldappw: //' err | paste -sd,)"

# Threads change nothing but the time, and a line may have any length.
run 'one thread' 0 ldif --to sha --threads 1 --in sample; mv out one
run 'five threads' 0 ldif --to sha --threads 5 --in sample
sameFile 'the order of the output' one out
{ printf 'dn: a\ndescription: '; head -c 3000000 /dev/zero | tr '\0' x; printf '\nuserPassword: secret\n\n\n'; cat sample; } >in
run 'a long line' 0 ldif --to sha --in in
sameFile 'a long line' <(sed "s|^userPassword: secret$|userPassword: $S|" in | head -4; printf '\n'; cat one) out
for packing in 'gzip -c' 'zstd -qc'; do  # in two pieces, as log rotation appends them
  { head -c 2000000 in | $packing; tail -c +2000001 in | $packing; } >packed
  run "$packing" 0 ldif --to sha packed
  sameFile "$packing" <(sed "s|^userPassword: secret$|userPassword: $S|" in | head -4; printf '\n'; cat one) out
done

# Whether a stash file is the one of an export.
opens=$(grep -ci '^userpassword[^:]*: {AES' b)
printf 'dn: a\nuserPassword: %s\n' "$("$tool" format --scheme aes256 --keys B <<<x)" >one.b
{ cat one.b; printf '\ndn: z\nuserPassword: {AES128}AAAAAAAAAAAAAAAAAAAAAA==\n'; } >two.b
rows <<ROWS
its stash|0|yes: these keys open [0-9]+ of $opens AES values, [0-9]+ more into bytes that are not text|keys check B b
its stash, no bytes|0|yes: these keys open 1 of 1 AES values|keys check B one.b
half of it|4|in part: these keys open 1 of 2 AES values|keys check B two.b
another stash|4|no: these keys open none of $opens AES values|keys check C b
nothing to open|1|in doubt: the export has no AES value|keys check B sample
stash and sync|2||keys check B b --sync x
as JSON|4|\{"values":2,"opened":1,"notText":0,"unopened":1\}|keys check B two.b --json
ROWS

# Checks of the entries of an export; an entry may have several values.
printf 'dn: uid=a, dc=x\nuserPassword: %s\nuserPassword: {X}y\npwdHistory: t#s#3#old\n\ndn:: %s\nuserPassword: b\n\ndn: c\n' \
  "$S" "$(printf 'uid=b,dc=x' | b64)" >in
printf '%s\n' $'UID=A,dc = x\tsecret' $'uid=a,dc=x\told' $'uid=b,dc=x\tb' $'c\tc' $'d\td' >pairs
check 'a batch of entries' 3 'match.the tag is of no known scheme.match.the entry has no password.the export has no such entry' \
  verify --batch pairs --ldif in --clear

# The audit of a mixed export, against counts made by hand.
run audit 3 ldif --audit --keys A --json --in "$root/samples/mixed.ldif"
json audit "d[0]['findings'] == {'unknownTag': 2, 'malformed': 9, 'untagged': 1, 'cryptVariant': 0, 'unopened': 1,
  'notText': 0, 'broken': 1, 'locked': 0, 'padded': 0, 'encoded': 0, 'outside': 0} and
  (d[0]['entries'], d[0]['values'], d[0]['urls'], d[0]['deleted']) == (28, 29, 1, 1) and
  d[0]['schemes']['clear'] == {'values': 5} and d[0]['schemes']['aes256'] == dict(values=1, opened=0, notText=0, unopened=1)"
run 'audit as text' 3 ldif --audit --keys A --in "$root/samples/mixed.ldif"
for line in 'scheme +values +opened +not text +unopened' 'clear +5 +0 +0 +0' 'aes256 +1 +0 +0 +1' 'entries: 28' \
  'values: 29' 'behind a URL: 1' 'to be deleted: 1' 'finding: unknown tag: 2' 'bcrypt +1 +0 +0 +0'; do
  grep -qxE "$line" out || fail "audit as text: no '$line' in $(cat out)"
done
printf 'dn: a\nuserPassword: {SHA}x\nUserPassword;x:< f\nuserPassword:: *\nuserPassword: {Z}\n\ndn: b\nuserPassword: y\n' >in
check 'verbose audit' 3 'line 2: a: sha: malformed payload \(the payload is not base64 text\).line 3: a: url.line 4: a: unknown: '\
'the line is not well formed \(the base64 of the line is damaged\).line 5: a: unknown: unknown tag.line 8: b: clear.scheme .*' \
  ldif --audit --verbose --in in
run 'verbose audit, JSON' 3 ldif --audit --verbose --json --in in
json 'verbose audit, JSON' "len(d) == 6 and d[0] == {'line': 2, 'dn': 'a', 'attribute': 'userPassword', 'kind': 'sha',
  'finding': 'malformed', 'detail': 'the payload is not base64 text'} and
  d[1] == {'line': 3, 'dn': 'a', 'attribute': 'UserPassword;x', 'kind': 'url'}"
"$tool" format --scheme qveil <<<x | sed 's/{qVEIL}/dn: a\nuserPassword: /' >in
check 'a masked value without its tag' 3 'scheme.*qveil +1 +1 +0 +0.*finding: masked without a tag: 1' ldif --audit --in in
run 'audit of what does not open' 4 ldif --audit --keys C --in b
run 'audit without keys' 0 ldif --audit --in b
run 'audit of bytes' 4 ldif --audit --keys B --in b
run 'audit of bytes that may be' 0 ldif --audit --keys B --allow-binary --in b --json
json 'audit of bytes that may be' "d[0]['schemes']['aes256']['notText'] > 300 and d[0]['findings']['notText'] == 0"

# Command lines that are refused, and nothing is written.
rows <<'ROWS'
neither|2||ldif --in sample
both|2||ldif --to sha --audit --in sample
no such scheme|2||ldif --to sha3 --in sample
not made|2||ldif --to vldl --in sample
clear without leave|2||ldif --to clear --in sample
no new keys|2||ldif --to aes128 --keys A --in sample
audit with output|2||ldif --audit --out x --in sample
audit with changes|2||ldif --audit --changes --in sample
a cost that sha has not|2||ldif --to sha --rounds 3 --in sample
audit with new keys|2||ldif --audit --new-keys A --in sample
JSON among the export|2|.*"code":2\}|ldif --to sha --json --in sample
the same keys|2||ldif --to aes256 --keys A --new-keys A --in sample
no threads|2||ldif --to sha --threads 0 --in sample
words for threads|2||ldif --to sha --threads two --in sample
missing export|5||ldif --to sha --in none
missing keys|5||ldif --to sha --keys none --in sample
trial without keys|2||trial sample
ROWS

# Output files: refused or replaced, and never in part.
umask 000
run 'a new file' 0 ldif --to sha --in sample --out new
same 'mode of a new file' 600 "$(mode new)"
umask 022
cp sample old && chmod 640 old && cp old kept
run 'existing output' 2 ldif --to sha --in sample --out old
"$tool" ldif --to sha --in sample >/dev/full 2>err; same 'full device' 5 $?
run 'unreadable input' 5 ldif --to sha --in . --out old --force
(ulimit -f 100; trap '' XFSZ; run 'file size limit' 5 ldif --to sha --in sample --out old --force; exit $failures) ||
  fail 'file size limit'
mkfifo slow && exec 9<>slow  # with a writer that stays, the input does not end
for signal in ${LDAPPW_SIGNALS:-TERM KILL}; do
  cat sample >&9 &
  writer=$!
  "$tool" ldif --to sha --in slow --out old --force 2>/dev/null 9>&- &
  command=$!
  for _ in {1..600}; do compgen -G '.old.*' >/dev/null && break || sleep 0.1; done
  compgen -G '.old.*' >/dev/null || fail "$signal: there is no temporary file"
  kill -"$signal" $command; wait $command 2>/dev/null; rc=$?
  same "$signal: exit code" $((128 + $(kill -l "$signal"))) $rc
  kill $writer 2>/dev/null
  [[ $signal != KILL ]] || rm .old.*  # nothing can tidy up after that
  compgen -G '.old.*' && fail "$signal: a temporary file is left"
done
exec 9>&-
sameFile 'the old output after runs that failed' kept old
printf 'dn: a\nuserPassword: secret\n\n' >in; python3 "$root/scripts/make_sample.py" --entries 9 --out small
mkfifo changes; (exec "$tool" ldif --to argon2id --changes --threads 1 --out stopped changes 2>err) &
command=$!; exec 9>changes; cat small >&9
for _ in {1..600}; do compgen -G '.stopped.*' >/dev/null && break || sleep 0.1; done
kill -TERM $command; cat small >&9; exec 9>&-; wait $command; rc=$?
same 'a stop in order' "143 $(grep -c '^dn' stopped) 1" "$rc $(grep -c '^add: ' stopped) $(grep -c 'stopped before the end' err)"
run 'the input as output' 0 ldif --to sha --in old --out old --force
sameFile 'the input as output' one old
same 'mode of a file that is replaced' 640 "$(mode old)"
acl() { python3 -c 'import os, sys; print(os.getxattr(sys.argv[1], "system.posix_acl_access").hex())' "$1"; }
if python3 -c 'import os, struct; os.setxattr("old", "system.posix_acl_access", struct.pack("<I", 2) + b"".join(struct.pack(
  "<HHI", *row) for row in ((1, 6, 2**32 - 1), (2, 4, 65534), (4, 4, 2**32 - 1), (16, 4, 2**32 - 1), (32, 0, 2**32 - 1))))' 2>err; then
  list=$(acl old); run 'an access list' 0 ldif --to sha --in old --out old --force; same 'an access list' "$list" "$(acl old)"
fi
printf 'dn: a\nuserPassword: {Z}\n' >in
"$tool" ldif --to sha --in in --out closed <&- 2>&-
same 'closed descriptors' 3 $?
sameFile 'messages do not go into the output' in closed

# The trial finds no fault with the sample, the empty passwords included.
run trial 0 trial "$root/samples/directory.ldif" --keys A --json
json trial "d[0]['clear'] > 320 and all(row['values'] == row['verified'] == row['refused'] ==
  row.get('recovered', row['values']) == d[0]['clear'] for row in d[0]['schemes'].values()) and
  list(d[0]['schemes']) == ['sha', 'ssha', 'md5', 'crypt', 'qveil', 'aes128', 'aes192', 'aes256']"
printf 'dn: a\nuserPassword: secret\nuserPassword: {SHA}\nuserPassword:: YQBi\n' >in; head -3 b >>in
grep -m1 '^userPassword: {AES' b >>in
run 'trial as text' 4 trial in --keys C
for line in 'scheme +values +verified +refused +recovered +skipped +values/s' 'sha +1 +1 +1 +- +1 +[0-9]+' \
  'aes256 +1 +1 +1 +1 +1 +[0-9]+' '1 entries: 2 clear passwords, 0 reversible values read, 1 not read, 1 others; 0 differences'; do
  grep -qxE "$line" out || fail "trial as text: no '$line' in $(cat out)"
done
finish
