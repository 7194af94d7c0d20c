#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# The verbs that work on values and key stash files: tool_test.sh LDAPPW HELD-SYNC-LIBRARY. Answers come from openssl and
# perl, and from round trips.
. "$(dirname "$0")/command_frame.sh"

seed=correct-horse-battery salt=0123456789ab
printf '%s\n' "$seed" >seed; printf '%s\n' "$salt" >salt

# ---- keys ----
umask 000  # modes must not depend on it
check create 0 "configuration sync: [A-Za-z0-9+/]+=*.directory sync: [A-Za-z0-9+/]+=*.directory salt: $salt" \
  keys create --config cfg --directory dir --salt-file salt <seed
said create '^ldappw: write this down'
umask 022
same 'stash modes' '600 600' "$(mode cfg dir)"
cp dir dir.good; cp cfg cfg.good; ln -s dir link; ln -s nowhere loose
before=$(ls -A)
while IFS='|' read -r name code input arguments; do
  check "$name" "$code" '' keys $arguments < <(printf "$input")
done <<ROWS
create over files|2|$seed\n|create --config cfg --directory dir
create over the directory's file|2|$seed\n|create --config new --directory dir
create over the configuration's file|2|$seed\n|create --config cfg --directory new
create over a loose link|2|$seed\n|create --config new --directory loose
create same file|2|$seed\n|create --config dir --directory ./dir --force
create same new file|2|$seed\n|create --config new --directory ./new
create same file by link|2|$seed\n|create --config dir --directory link --force
create in no folder|5|$seed\n|create --config none/cfg --directory new
create no file|2|$seed\n|create --config new --directory none/..
create on a device|5|$seed\n|create --config /dev/null --directory new --force
create short seed|3|elevenchars\n|create --config new1 --directory new2
create long seed|3|$(printf '%01017d' 0)\n|create --config new1 --directory new2
create seed with a blank|3|twelve chars and more\n|create --config new1 --directory new2
create seed with a NUL|3|correct-horse\0battery\n|create --config new1 --directory new2
create without a seed|2||create --config new1 --directory new2
create short salt|3|$seed\n|create --config new1 --directory new2 --salt-file seed
create seed argument|2||create --config new1 --directory new2 $seed
create a directory's file over one|2|$seed\n|create --directory dir
create without --directory|2|$seed\n|create --config new1
restore over a file|2|$seed\n$salt\n|restore dir
restore without a salt|2|$seed\n|restore new
restore long salt|3|$seed\n${salt}c\n|restore new
check without --sync|2||check dir
ROWS
unsaid 'a refused seed' "$seed"
same 'create on a full disk' "ldappw: $work/cfg: File too large"$'\n'5 \
  "$(ulimit -f 0; "$tool" keys create --config cfg --directory dir --force 2>&1 <seed | cat; echo "${PIPESTATUS[0]}")"
sync=$("$tool" keys show --json dir | sed 's/.*"sync":"\([^"]*\)".*/\1/')
check 'restore other sync' 1 '' keys restore dir --force --expect-sync "${sync}x" < <(cat seed salt)
sameFile 'refused or failed runs' dir.good dir
sameFile 'refused or failed runs' cfg.good cfg
same 'nothing left behind' "$before" "$(ls -A)"
check restore 0 '.+' keys restore again --expect-sync "$sync" < <(cat seed salt)
sameFile 'restore gives the same bytes' dir again
run 'restore, salt from standard input' 0 keys restore third --seed-file seed --json <salt
json 'restore JSON' "d == [{'sync': '$sync'}]"
"$tool" keys restore closed --seed-file seed --salt-file salt <&- >&- 2>&-; same 'closed descriptors' 5 $?
sameFile 'nothing is written into a stash file' dir closed
check 'restore through a link' 0 '.+' keys restore link --force --seed-file seed --salt-file salt </dev/null
[ -L link ] || fail 'a symbolic link was replaced'
chmod 640 again; check 'restore over an open file' 0 '.+' keys restore again --force < <(cat seed salt)
same 'mode of a replaced stash file' 600 "$(mode again)"
same 'salt in the stash file' "$salt" "$(tail -c 84 dir | head -c 12)"
fingerprint() { tail -c 72 dir | tail -c +$(($1 + 1)) | head -c "$2" | openssl dgst -sha256 -r | cut -c 1-16; }
cp dir $'d\e[1m'
check show 0 "file: d.x1B\[1m.sync: ${sync//+/\\+} \(28 characters\).salt: $salt \(12 characters\).aes128: 16 bytes, fingerprint \
$(fingerprint 0 16).aes192: 24 bytes, fingerprint $(fingerprint 16 24).aes256: 32 bytes, fingerprint $(fingerprint 40 32)" \
  keys show $'d\e[1m'
run 'show JSON' 0 keys show dir --json
json 'show JSON' "d == [{'file': 'dir', 'sync': '$sync', 'salt': '$salt', 'keys': [
  {'scheme': 'aes128', 'bytes': 16, 'fingerprint': '$(fingerprint 0 16)'},
  {'scheme': 'aes192', 'bytes': 24, 'fingerprint': '$(fingerprint 16 24)'},
  {'scheme': 'aes256', 'bytes': 32, 'fingerprint': '$(fingerprint 40 32)'}]}]"
run 'create JSON' 0 keys create --config c3 --directory d3 --seed-file seed --json </dev/null
json 'create JSON' "list(d[0]) == ['config', 'directory', 'sync', 'directorySync', 'directorySalt']"
same 'the sync text is the configuration'"'"'s' "$("$tool" keys show c3 | sed -n 's/^sync: \(.*\) (.*/\1/p')" \
  "$(sed 's/.*"sync":"\([^"]*\).*/\1/' out)"
! cmp -s d3 dir || fail 'the salts that are drawn are the same'
echo 0123456789aX >salt.other; head -c 100 dir >short; head -c 200 /dev/zero >zeros; chmod 600 short zeros; cp dir open
chmod 604 open
rows <<ROWS
check|0|match|keys check dir --sync "$sync" --salt-file salt
check no sync|1|no match|keys check dir --sync other
check no salt|1|no match|keys check dir --sync "$sync" --salt-file salt.other
check JSON|1|\{"match":false\}|keys check dir --sync other --json
short stash|4||keys show short
no stash|4||keys show zeros
missing stash|5||keys show missing
folder as stash|5||keys show .
open stash|0|match|keys check open --sync "$sync"
ROWS
said 'open stash' 'warning: open is open to other'
chmod 640 open; run 'stash of its owner'"'"'s group' 0 keys show open; same 'stash of its group' '' "$(<err)"
if [ $UID = 0 ]; then
  chgrp daemon open
  run 'stash of a foreign group' 0 keys show open; said 'stash of a foreign group' 'warning: open is open to its group'
  run 'stash of the right group' 0 keys show open --keys-group daemon; same 'stash of the right group' '' "$(<err)"
fi

# A run that is stopped when both temporary files are complete: whatever ends it, the stash files stay what they were.
preload() { HELD_SYNC=$1 LD_PRELOAD=$held ASAN_OPTIONS=${ASAN_OPTIONS:-}:verify_asan_link_order=0 "${@:2}"; }
stopped() { for _ in {1..600}; do [[ $(ps -o stat= "$1") == [!T]* ]] || break; sleep 0.1; done; }
while read -r signal disposition rc; do
  (preload stop exec env "$disposition" "$tool" keys create --config cfg --directory dir --force <seed >/dev/null 2>&1) &
  pid=$!
  stopped $pid
  same "$signal: temporary files" 2 "$(ls -A | grep -cE '^\.(cfg|dir)\.')"
  kill -"$signal" $pid; kill -CONT $pid; wait $pid 2>/dev/null; same "$signal: exit code" "$rc" $?
  [ "$rc" = 0 ] || { sameFile "$signal" dir.good dir; sameFile "$signal" cfg.good cfg; }
  [ "$signal" != KILL ] || rm .cfg.* .dir.*  # nothing can tidy up after that
  same "$signal: left behind" '' "$(ls -A | grep -E '^\.(cfg|dir)\.')"
done <<'ROWS'
TERM --default-signal=TERM 143
INT --default-signal=INT 130
HUP --default-signal=HUP 129
KILL --default-signal=HUP 137
HUP --ignore-signal=HUP 0
ROWS
cp dir.good dir
# One run at a time, which names what another has left; a file that is replaced is kept, and both or none.
(preload stop exec "$tool" keys create --config pair.cfg --directory pair --seed-file seed >first 2>&1) &
pid=$!
stopped $pid
"$tool" keys create --config pair.cfg --directory pair --force --json >second 2>waits <<<another-seed-entirely &
other=$!
for _ in {1..600}; do ! grep -q 'waiting for another run' waits || break; sleep 0.1; done
same 'the second run waits' 0 "$(wc -c <second)"
grep -q 'warning: a run.*/.pair.cfg.*stash file' waits && fail 'what a run needs is named as left'
kill -CONT $pid; wait $pid $other
same 'the files of one run' "$(python3 -c 'import json; d = json.load(open("second")); print(d["sync"], d["directorySync"])')" \
  "$(for file in pair.cfg pair; do "$tool" keys show $file | sed -n 's/^sync: \(.*\) (.*/\1/p'; done | xargs)"
same 'the files of the first run' "$(sed -n 's/.* sync: //p' first | xargs)" \
  "$(for file in pair.cfg.bak pair.bak; do "$tool" keys show $file | sed -n 's/^sync: \(.*\) (.*/\1/p'; done | xargs)"
cp pair .pair.AbCd12; echo >.pair.AbCd13; cp pair pair.now
run 'a third run' 0 keys create --directory pair --force --seed-file seed
said 'a third run' 'warning: a run.* has left .*/.pair.AbCd12, a whole stash file with the sync text '
said 'a third run' 'AbCd13, no whole stash file'
said 'a third run' 'kept as .*/pair.bak2$'; sameFile 'a third run' pair.now pair.bak2
run 'the same again' 0 keys restore pair --force --seed-file seed --salt-file <(tail -c 84 pair | head -c 12)
same 'the same again' '' "$(grep kept err)$(compgen -G 'pair.bak3')"
(preload file exec "$tool" keys create --config pair.cfg --directory pair --force --seed-file seed) >out 2>err
same 'neither is kept when the run fails' 'pair pair.bak pair.bak2 pair.cfg pair.cfg.bak' "$(compgen -G 'pair*' | grep -v now | sort | xargs)"
for what in file folder; do
  preload $what "$tool" keys restore dir --force --seed-file seed --salt-file salt >/dev/null 2>err
  same "a $what that does not reach the disk" 5 $?
done
said 'a folder that does not reach the disk' "^ldappw: $work: Input/output error"
(preload stop exec "$tool" keys restore late --seed-file seed --salt-file salt >/dev/null 2>&1) &
pid=$!
stopped $pid
echo mine >late; kill -CONT $pid; wait $pid
same 'a file that appears meanwhile is not replaced' '2 mine' "$? $(<late)"

# ---- format, verify, reveal ----
key() { tail -c 72 dir | tail -c +$(($1 + 1)) | head -c "$2" | od -An -v -tx1 | tr -d ' \n'; }
aes() { printf %s "$1" | openssl enc -aes-"$2"-ecb -K "$(key "$3" $(($2 / 8)))" | b64; }
euro=$'gr\xc3\xbc\xc3\x9fe \xe2\x82\xac'
long=$(printf 'x%.0s' {1..2000})
passwords=('' a 12345678 123456789 "$(printf 'y%.0s' {1..46})" "$(printf 'z%.0s' {1..47})" "$long" "$euro"
  ' blanks ' $'return\r' '{SSHA}abc' '{XYZ}' '>1abcdef<' '$(id)`"\')
printf '%s\n' "${passwords[@]}" >passwords
for scheme in sha ssha MD5 '{crypt}' qVEIL aes128 aes192 aes256; do
  run "format $scheme" 0 format --scheme "$scheme" --allow-empty --keys dir --password-file passwords </dev/null
  mapfile -t values <out
  same "format $scheme" ${#passwords[@]} ${#values[@]}
  for i in "${!passwords[@]}"; do
    password=${passwords[i]} value=${values[i]}
    check "verify $scheme '$password'" 0 match verify --keys dir -- "$value" <<<"$password"
    ((i % 4)) || check "refuse $scheme '$password'" 1 'no match' verify --keys dir -- "$value" <<<"!$password"
    case $scheme in
      sha) same sha "{SHA}$(printf %s "$password" | openssl dgst -sha1 -binary | b64)" "$value" ;;
      MD5) same md5 "{MD5}$(printf %s "$password" | openssl dgst -md5 -binary | b64)" "$value" ;;
      '{crypt}') same crypt "{crypt}$(perl -e 'print crypt($ARGV[0], substr($ARGV[1], 7, 2))' "${password:0:8}" "$value")" "$value" ;;
      aes128) same aes128 "{AES128}$(aes "$password" 128 0)" "$value" ;;
      aes192) same aes192 "{AES192}$(aes "$password" 192 16)" "$value" ;;
      aes256) same aes256 "{AES256}$(aes "$password" 256 40)" "$value" ;;
    esac
  done
  case $scheme in
    qVEIL) reveal=(cut -b -46 passwords) ;;
    aes*) reveal=(cat passwords) ;;
    *) continue ;;
  esac
  run "reveal $scheme" 0 reveal --keys dir < <(printf '%s\n' "${values[@]}")
  sameFile "reveal $scheme" <("${reveal[@]}") out
done
yes same | head -100 | "$tool" format --scheme crypt >out
for column in 8 9; do
  [ "$(cut -c $column out | sort -u | wc -l)" -gt 30 ] || fail 'the characters of salts repeat'
done

# Fixed salts: one wrong key in some 250 opens a value to other bytes.
"$tool" keys create --config c2 --directory d2 --salt-file salt <<<another-seed-entirely >/dev/null 2>&1
rows <<'ROWS'
compare|0|match|keys compare dir dir.good
compare others|1|no match: other salts|keys compare dir pair
compare other seeds|1|\{"match":false,"sameSync":false,"sameSalt":true\}|keys compare dir d2 --json
compare, quiet|1||keys compare dir pair --quiet
ROWS
aesValue=$("$tool" format --scheme aes256 --keys dir <<<secret)
lengthy=$("$tool" format --scheme aes128 --keys dir <seed); echo "${seed}Y" | sed 's/.Y$/Y/' >seed.other
masked=$("$tool" format --scheme qveil <<<secret)
hidden='{SHA}'$(printf secret | openssl dgst -sha1 -binary | b64)
swapped=$(tr a-zA-Z A-Za-z <<<"${hidden#*\}}")
ssha='{SSHA}'$(printf 'secretsalt' | openssl dgst -sha1 -binary | cat - <(printf salt) | b64)
newline=$(aes $'a\nb' 128 0)
wrap=$(printf '%s' "$aesValue" | head -c -5)
printf '%s\n' "$ssha" other >value; printf 'secret\nother\n' >password; echo wrong >wrong; echo '{sha}abc' >tagged
printf 'a\0b\n' >nul; printf 'secret\n{SHA}x\n123456789\n' >three; printf "%s\n" 123456789{,,} >nine; echo >blank; printf "secret\0xyz\n" >cut; printf "a\n\n\n\nb" >holes; : >empty
printf '%s\n' secret "$ssha" "$masked" "{XYZ}a" >mixed; printf 'a\nb' >two
rows <<'ROWS'
foreign salt|0|match|verify "$ssha"
value from file|0|match|verify --value-file value --password-file password
empty value file|3||verify --value-file empty
missing value file|5||verify --value-file none
json match|0|\{"scheme":"ssha","match":true\}|verify --json "$ssha"
json no match|1|\{"scheme":"ssha","match":false\}|verify --json "$ssha" --password-file wrong
json no match, by opening|1|\{"scheme":"aes256","match":false\}|verify --json --keys dir "$aesValue" --password-file wrong
json problem|3|\{"error":"there is no payload","code":3\}|verify --json '{SHA}'
tag in another case|0|match|verify "{ssha}${ssha#*\}}"
payload in another case|1|no match|verify "{SHA}${swapped}"
masked without a tag, as the server takes it|1|no match|verify "${masked#*\}}"
two values|2||verify "$ssha" --value-file value
no value|2||verify
password as argument|2||verify "$ssha" hunter2
password as format argument|2||format --scheme sha hunter2
password as an option's value|2||format --scheme sha --pass=hunter2
password behind a short option|2||format --scheme sha -phunter2
no such scheme|2||format --scheme sha512
clear is no scheme|2||format --scheme clear
vldl cannot be made|2||format --scheme vldl
aes without keys|2||format --scheme aes128
no verb|2||
no key verb|2||keys
unknown option|2||identify --frobnicate
clear refused|3||verify secret
clear taken|0|match|verify --clear secret
clear, wrong|1|no match|verify --clear secreT
unknown tag|3||verify --clear '{XYZ}secret'
vldl cannot be checked|3||verify '{VLDL}secret'
tag alone|3||verify '{SHA}'
malformed|3||verify '{SHA}c2VjcmV0'
cut payload|3||verify --keys dir "$wrap"
no key|4||verify "$aesValue"
wrong key|4||verify --keys d2 "$aesValue"
wrong at the end|1|no match|verify --keys dir "$lengthy" --password-file seed.other
missing key file|5||verify --keys none "$aesValue"
a key file that is not needed|0|match|verify --keys none "$ssha"
damaged key file|4||verify --keys short "$aesValue"
no password|2||verify "$ssha" --password-file /dev/null
no passwords|2||format --scheme sha --password-file /dev/null
an empty password|3||format --scheme md5 --password-file blank
an empty password that may be|0|\{MD5\}1B2M2Y8AsgTpgAmY7PhCfg==|format --scheme md5 --allow-empty --password-file blank
empty lines for what fails|3|\{MD5\}.{24}....\{MD5\}.{24}|format --scheme md5 --password-file holes
NUL in a check|3||verify --password-file cut "$ssha"
password from standard input by name|0|match|verify --password-file - "$ssha"
a verb with a slip|2||fromat --scheme md5
a key verb with a slip|2||keys crate
a failure as JSON|5|\{"error":"none: No such file or directory","code":5\}|verify --json --keys none "$aesValue"
no such group|2||keys show dir --keys-group no.such.group
stash to standard output|2||keys restore - --seed-file seed --salt-file salt
{SHA} password|3||format --scheme sha --password-file tagged
NUL password|3||format --scheme ssha --password-file nul
last line without newline|0|\{MD5\}.{24}.\{MD5\}.{24}|format --scheme md5 --password-file two
json values|3|\{"index":1,"scheme":"sha","value":"\{SHA\}[^ ]*"\}.\{"index":2,"error":"[^"]*","code":3\}.\{"index":3,.*\}|format --scheme sha --json --password-file three
clear text|0|secret|reveal secret
one-way|3||reveal "$ssha"
reveal unknown tag|3||reveal '{XYZ}a'
reveal vldl|3||reveal '{VLDL}secret'
reveal untagged|0|secret|reveal "${masked#*\}}"
reveal without a key|4||reveal "$aesValue"
first problem wins|4|..secret|reveal --keys d2 "$aesValue" "$ssha" secret
values like options and lists|0|.a,b..-x|reveal -- '[a,b]' -x
newline in the password|3||reveal --keys dir "{AES128}$newline"
newline in JSON|0|.*"passwordBase64":"YQpi"\}|reveal --json --keys dir "{AES128}$newline"
bytes in JSON|0|.*"passwordBase64":"/w=="\}|reveal --json $'\xff'
JSON escapes|0|.*"password":"a\\"b\\\\\\u0001\\u007f\\u009bé"\}|reveal --json $'a"b\\\x01\x7f\xc2\x9bé'
ROWS
printf '%s\t%s\n' "$ssha" secret "$aesValue" secret "$ssha" $'se\tcret' '{X}y' a secret secret >pairs; echo tabless >>pairs
tr '\n' '\0' <pairs >pairs0; head -1 pairs >one
rows <<'ROWS'
batch|1|match.match.no match.the tag is of no known scheme.the value has no tag.*.there is no tab.*|verify --batch pairs --keys dir
batch, clear, the first problem|4|match.an AES value needs.*.no match.*scheme.match.there is no tab.*|verify --batch pairs --clear
batch, all match|0|match|verify --batch one
batch as JSON|1|\{"index":1,"match":true\}.*\{"index":3,"match":false\}.\{"index":4,"error":"the tag is of no known scheme","code":3\}.*|verify --batch pairs --keys dir --json
batch, quiet|1||verify --batch pairs --keys dir --quiet
empty batch|2||verify --batch empty
batch and a value|2||verify --batch pairs "$ssha"
quiet|1||verify --quiet "$ssha" --password-file wrong
check, quiet|1||keys check dir --sync other --quiet
too short|2||format --scheme md5 --generate 7
ROWS
same 'batch of NUL records' "$("$tool" verify --batch pairs --keys dir)" "$("$tool" verify --batch pairs0 --null --keys dir | tr '\0' '\n')"
same 'NUL records' '{MD5}kAFQmDzST7DWlj99KOF/cg== {MD5}'"$(printf 'a\nb' | openssl dgst -md5 -binary | b64) " \
  "$(printf 'abc\0a\nb\0' | "$tool" format --scheme md5 --null | tee values0 | tr '\0' ' ')"
same 'NUL records of identify and reveal' '2 2' "$(for verb in identify reveal; do "$tool" $verb --null <values0 2>err | tr -dc '\0' | wc -c; done | xargs)"
IFS=$'\t' read -r password value < <("$tool" format --scheme ssha --generate 40)
[[ $password =~ ^[a-km-zA-HJ-NP-Z2-9]{40}$ ]] || fail "generated: '$password'"
check 'generated' 0 match verify "$value" <<<"$password"
for arguments in 'hunter2' '--pass=hunter2' '-phunter2' '--pass hunter2' '--json=hunter2'; do
  run "format $arguments" 2 format --scheme sha $arguments <<<secret
  unsaid "format $arguments" hunter2
done
run 'a cut' 0 format --scheme crypt --password-file nine </dev/null
said 'a cut' 'warning: line 1: the password is cut: crypt takes the first 8 bytes'
said 'the other cuts' '^ldappw: warning: 2 more: passwords cut'
same 'the other cuts' 2 "$(grep -c cut err)"
run 'stray bytes' 0 format --scheme md5 < <(printf '\xef\xbb\xbfa\r\nb\r\n')
said 'stray bytes' '^ldappw: warning: standard input, line 1 begins with a byte order mark'
said 'stray bytes' '^ldappw: warning: standard input, line 1 ends in a carriage return.*'
said 'stray bytes' '^ldappw: warning: 1 more: with a carriage return'
while IFS='|' read -r arguments text; do
  run "$arguments" 2 $arguments </dev/null
  said "$arguments" "^ldappw: $text$"
done <<'ROWS'
fromat --scheme md5|there is no verb fromat; did you mean format\?
keys crate|there is no verb crate; did you mean create\?
hunter2|there is no such verb \(--help lists them\)
keys|a verb is missing \(--help lists them\)
format -scheme md5|unknown option: -s
--frob=hunter2 format|unknown option: --frob
keys restore none hunter2|a seed is not taken from the command line, .*--seed-file
keys create --directory none hunter2|a seed is not taken from the command line, .*--seed-file
verify {SHA}x hunter2|a password is not taken from the command line, .*--password-file
format --scheme md5 hunter2|a password is not taken from the command line, .*--password-file
ROWS
yes '{AES128}AAAAAAAAAAAAAAAAAAAAAA==' | head -1500 >many
run 'many problems' 4 reveal <many
same 'many problems' '1000 ldappw: 500 more: an AES value needs the key stash (--keys)' \
  "$(grep -c '^ldappw: line ' err) $(grep more: err)"
same 'results keep step' 1500 "$(wc -l <out)"
same 'as many problems as are shown' 1000 "$("$tool" reveal < <(head -1000 many) 2>&1 >out | wc -l)"
mkfifo pipe; cat dir >pipe &
check 'keys from a pipe' 0 match verify --keys pipe "$aesValue" <<<secret
run 'a cut in a check' 1 verify --clear 123 < <(printf '%047d\n' 0)
said 'a cut in a check' 'warning: with clear only the first 46 bytes'
check 'reveal from standard input' 3 'secret..secret' reveal <mixed
said 'the number of the value' '^ldappw: line 4: the tag is of no known scheme'

# Values that pwdhash, doveadm, slappasswd, mkpasswd and passlib have made of "secret".
while IFS= read -r value; do
  check "foreign $value" 0 match verify -- "$value" <<<secret
  check "foreign $value, another password" 1 'no match' verify -- "$value" <<<Secret
done <<'ROWS'
{SMD5}wMhWRf3bkgrQqmBHRrz4CR5dBtQ=
{SSHA256}U2qQedkN417sU2soQ0uZbSyD9h5ToM8wqpdjSAhZy1yRVotdybtl3w==
{SSHA384}n2YhMlZojiw0bI67bx8iEimz5ZnDzMW1o/Pgh6rwckKeCwoualVeNyhJ4hjRh+QW4aq1tpP1ttc=
{SSHA512}vybE/u0RBlpviq4W8icCHBJairbw0Alx4S3wPN997sfHok9Y8mAAssdhhwX00TkoJ05jl2rnsnnDaB/i4zt2kvVy+bw0TAfF
{SHA256}K7gNU3sdo+OL0wNhqoVWhr3g6s1xYv72ol/pe/Unols=
{SHA384}WKd1ukESvjAFrkQHznV9iP2nHUBJe7gCbsrFTU4//HIyzo3jq1rLMK45dg/ufFPt
{SHA512}vSsar3708Jvp9Szi2NWZZ02Bqp1qRCFpbcTZPdBhnWgs5WtNZKnvCXdhztmeD2cmW192CF5bDufKRpayrW/isg==
{PBKDF2-SHA1}10000$ObLy2y3LfhOIsfz9ZPdMzldj6kiRI0mJ$qNLwXTgDL3nQmWc5MiXvJ6LjfUc=
{PBKDF2-SHA256}10000$9AP9JR1E2KSk5mR81pFdIkO+tKSKiSdA$nRDALKQCycDqlXuf+FEIa7N7qpiYDVC+Vhr2AoNeDX4=
{PBKDF2-SHA512}10000$pBCcQy44vMJv+BivTaNIeS3eXK7Mmaes$JlO72F6tole47cHQVEZad12OlJL5Nm/LLLbbjxVTtgmAKQwpM6LCCADfqt1aZfiBqn/+CZ38MBBME8iGqtn2NQ==
{crypt}$5$Xm$w77Cj56HBNw1ZA2ahS8zfpVmmHNjAAY4HLrBuOoUKg3
{GOST_YESCRYPT}$gy$j9T$DMRWzktHK5Hk0QTr1qXaS/$H0qKLj9QLrHS9pmiuCjeVhkKQN62/tK8H5KYVTlPRgC
{PBKDF2}$1$ObEjipkF12afBkeh$5000$2c970ddf0da66ef7b5eaebbcd62913b65ada8802
{SCRAM-SHA-256}4096,a0LTKmpH4OztsuQlk+AUAQ==,7+UnLWhhT7C79XuNLJ5nVjfJDeqpv3sZVx+ard7zjtM=,gD/Qi6HCL9/Zl8SISdpqwZosHM85QjwpnDrb8ERXP6A=
{ARGON2I}$argon2i$v=19$m=32768,t=4,p=1$4RqXNKYtEKuUoDZmhV6HQA$XPbAHWG1BamI0vAykgyplHX5jJkljDgywKyssFx7NMc
{ARGON2ID}$argon2id$v=19$m=65536,t=3,p=1$6Efk+9RhbuSm/YHEuw4geg$+XZDRbou0GHK+JKPcU534PvrDKGViFkIITkiZaQrlBM
{BLF-CRYPT}$2y$05$9ieJVqK60QbqbZegWvh4s.oDzGABP7ViI0f4TibZB06lDPgz11os6
{SHA512-CRYPT}$6$iF4huNgJyyqbym9h$E/UnBFtn4u.M/e6Qk.TXd1tpIHMJmGTHQ9durtTBgD1BUOvZyg0d6LYFaY8E1qvBKT97gWFkhJEDClXJS2Y.m0
{PLAIN-MD5}5ebe2294ecd0e0f08eab7690d2a6ee69
{LDAP-MD5}Xr4ilOzQ4PCOq3aQ0qbuaQ==
{SHA1}5en6G6MezRroT3XKqkdPOmY/BfQ=
{MD5}$1$OSgPS168$JDi7QivvA8C321fWDgA2h0
{PBKDF2}10000$t7VrCGPe9b/yKN5LNfDQUg$5AhHB0a6paVMQo0xWnrUmG8JlzE
{PBKDF2-SHA256}10000$oKJIQhKH.88q/6frwYKb5A$rsdV6jHXcbAwY5Ztgh2yg2M77ZscGqaiWged0ao8ZOc
{PBKDF2-SHA512}10000$sAI.GWVb85FcTB5EH8vZsQ$eW3IijyvAsuDPVzidcJ7c0kN1.hM1aCHjGBAqX0MzEGlElih9ZZhiyJbapJws0YXRBj6ESOtc8NEw1KrIQ8fIw
{ARGON2}$argon2i$v=19$m=4096,t=3,p=1$+oytGx5z2WsiVom9sFqLQQ$FsL2ufdRT2d8ol4A/r4sgKPb3E4SAYy0V7gkLK2iR2k
{CRYPT}$y$j7T$c/w8QFw0KT8cS5PZ$/UpbKK9iiZobKGwPWG.76N7C5BiO.E3hsn0pAkfS/Z6
{CRYPT}$7$BU..../....PDiPjRFiivVA5.LtzmhI.1$jFit661uAyBw52Flzwj8wHwzUQYtLMVgqNq4pSAB5x7
{CRYPT}$md5,rounds=85327$s2DqDYT9$$n3ggj2LKCxePKKqmsVfbN.
{CRYPT}_J9..DkV7tNLdkKkc49I
{CRYPT}$3$$878d8014606cda29677a44efa1353fc7
{NT}878d8014606cda29677a44efa1353fc7
{CRYPT}$sha1$480000$lshbi.AY$x2X2CwPkOr4PTAEUhACrBHHxGE8s
{PBKDF2_SHA256}AAAgAL5J37mInzNTOIwxN9P0AskER+Ar7euAm4Wt78CsTngcPIVq63peOmvySss8mjqTyvmN/cgzGWDCbwQzZdRzgiNFyQ0rbPxtFa/jtfC08lyi7XEbqEg41ltSCjb5JIjb1NAQ0/dc9HGt+RgzLftJTH21GF+xeu3Xkb+DIm+2F/3PKJZ5fnEG8Ux58PZo90Ye7tfBiTkyD05hFsS/QgPrg+eCFnvSij5W5lDT5gMiaq6srPLyRGpW++a1QzGqSH90RXvf8EzdKIAfsSqLTfpS+anodHZe2/MoNac4yJsTjxSfpCftOLxusVIikv+HlybLOeCro+Byq2HWtQPB25Ke7LVSDzMSkYY3ZAKXqALttPX9ZVhOCkXxnDgFo7AV9y+Z/E4Ce9GwJF2WplIk96kurBZcgWh4fjQpV7TbIZyRhsBE
{CRYPT}ba7BQloW.9hYU
{CLEARTEXT}secret
{base64}c2VjcmV0
ROWS
for scheme in argon2id pbkdf2-sha512 yescrypt sha512-crypt ssha512 {ARGON2} {PBKDF2-SHA512} 'ssha --salt-bytes 4' \
  'argon2id --rounds 1 --memory 64 --parallelism 2 --salt-bytes 64' 'pbkdf2-sha512 --rounds 1000 --salt-bytes 8'; do
  run "format $scheme" 0 format --scheme $scheme <<<"$euro"
  value=$(<out) && check "verify $scheme" 0 match verify "$value" <<<"$euro"
  check "refuse $scheme" 1 'no match' verify "$value" <<<"${euro}x"
done
A=$(printf 'a%.0s' {1..86}); printf 'x%.0s' {1..512} >long
rows <<ROWS
argon2id's costs|0|\\{ARGON2\\}.argon2id.v=19.m=7168,t=5,p=1.[^ ]{22}.[^ ]{43}|format --scheme argon2id
costs that are chosen|0|\\{ARGON2\\}.argon2id.v=19.m=64,t=2,p=4.[^ ]{11}.[^ ]{43}|format --scheme argon2id --rounds 2 --memory 64 --parallelism 4 --salt-bytes 8
salt that is chosen|0|\\{SSHA\\}.{32}|format --scheme ssha --salt-bytes 4
rounds of crypt|0|\\{CRYPT\\}.6.rounds=1234.*|format --scheme sha512-crypt --rounds 1234
too little memory|2||format --scheme argon2id --memory 7
too little memory a lane|3||format --scheme argon2id --memory 8 --parallelism 2
no rounds|2||format --scheme argon2id --rounds 0
a cost that the scheme has not|2||format --scheme sha --rounds 2
too long for crypt|3||format --scheme yescrypt --password-file long
elsewhere|3||verify '{SASL}user@realm'
too much memory|3||verify '{ARGON2}\$argon2id\$v=19\$m=4194304,t=3,p=1\$c2FsdHNhbHQ\$dGFnZ3RhZ2c'
too many passes|3||verify '{ARGON2}\$argon2i\$v=19\$m=64,t=4294967295,p=1\$c2FsdHNhbHQ\$dGFnZ3RhZ2c'
too many iterations|3||verify '{PBKDF2}2147483647\$c2FsdA\$c2VjcmV0c2VjcmV0c2VjcmV0'
too many rounds|3||verify '{CRYPT}\$6\$rounds=999999999\$saltsalt\$$A'
too high a cost|3||verify '{CRYPT}\$2b\$31\$${A:0:53}'
too many blocks|3||verify '{CRYPT}\$y\$jzT\$abc\$${A:0:43}'
too many blocks of scrypt|3||verify '{CRYPT}\$7\$zU..../....abc\$${A:0:43}'
reveal of a tagged clear password|0|secret|reveal '{CLEARTEXT}secret'
ROWS

# ---- identify: value, columns ----
rows=()
while IFS='|' read -r columns value; do
  rows+=("$columns")
  eval "echo $value" >&7
done 7>values <<ROWS
clear.1.clear.well formed|secret
clear.1.clear.well formed|''
clear.1.clear.well formed|'{half open'
sha.2.one-way.well formed|'{sha}5en6G6MezRroT3XKqkdPOmY/BfQ='
sha.2.one-way.*20 bytes|'{SHA}c2VjcmV0'
sha.2.one-way.*not base64.*|'{SHA}5en6G6MezRroT3XKqkdPOmY/BfQ'
sha.2.one-way.*carriage return|$'{SHA}5en6G6MezRroT3XKqkdPOmY/BfQ=\\r'
sha.2.one-way.*no payload|'{SHA}'
ssha.9.one-way.well formed|'{SSHA}5en6G6MezRroT3XKqkdPOmY/BfQ='
ssha.9.one-way.*|'{SSHA}c2VjcmV0'
md5.3.one-way.well formed|'{MD5}Xr4ilOzQ4PCOq3aQ0qbuaQ=='
md5.3.one-way.*|'{MD5}5en6G6MezRroT3XKqkdPOmY/BfQ='
crypt.4.one-way.well formed|'{CRYPT}ab01FAX.bQRSU'
crypt.4.one-way.*|'{crypt}ab01FAX.bQRS'
crypt.4.one-way.*.des-crypt|'{crypt}\$99\$salt\$hash'
sha512-crypt.1.one-way.*no whole crypt value.*strong|'{crypt}\$6\$salt\$hash'
bcrypt.1.one-way.well formed.strong|'{BLF-CRYPT}\$2y\$05\$bvIG6Nmid91Mu9RcmmWZfO5HJIMCT8riNW0hEp8f6/FuA2/mHZFpe'
md5-crypt.1.one-way.well formed.salted-fast|'{MD5}\$1\$saltsalt\$qjXMvbEw8oaL.CzflDtaK/'
bigcrypt.1.one-way.well formed.des-crypt|'{CRYPT}abJnggxhB/yWI.qMXmRzKAlo'
bsdi-crypt.1.one-way.well formed.des-crypt|'{crypt}_J9..CCCCXBrJUJV154M'
locked.1.one-way.well formed.locked|'{CRYPT}!\$6\$salt\$hash'
smd5.1.one-way.well formed.salted-fast|'{smd5}4ZjWjMcT9fLtOJiI1oMDcHNhbHQ='
sha512.1.one-way.*digest.unsalted|'{SHA512}AAAA'
plain.1.reversible.well formed.clear|'{ClearText}secret'
389-aes.1.reversible.well formed.reversible|'{AES-TUhNR0NTcUdTSWIzRFFFRkRUQm1N}c2VjcmV0'
sasl.1.one-way.well formed.external|'{SASL}user@realm'
pbkdf2-sha512.1.one-way.*iterations.salt.hash.strong|'{PBKDF2-SHA512}10000\$abc\$def'
argon2id.1.one-way.*well formed.strong|'{ARGON2}\$argon2id\$v=19\$m=4096,t=3,p=1\$c2FsdHNhbHQ\$dGFnZ3RhZ2c'
argon2i.1.one-way.*salt.hash.strong|'{ARGON2}\$argon2i\$v=19\$m=4096,t=x,p=1\$c2FsdHNhbHQ\$dGFnZ3RhZ2c'
qveil.128.reversible.well formed|'$masked'
qveil.128.reversible.well formed, untagged|'${masked#*\}}'
qveil.128.reversible.*untagged|'>hello there<'
aes128.135.reversible.well formed|'{AES128}AAAAAAAAAAAAAAAAAAAAAA=='
aes192.134.reversible.*blocks|'{AES192}AAAA'
unknown .XYZ..1.unknown.*|'{XYZ}abc'
unknown .X.x1BZ..1.unknown.*|$'{X\\eZ}abc'
vldl.8.one-way.well formed|'{VLDL}anything'
vldl.8.one-way.well formed|'{VLDL}'
ROWS
run identify 3 identify <values
while IFS= read -r line; do
  [[ $line =~ ^(${rows[0]})($'\t'[a-z-]+)?$ ]] || fail "identify: '$line', not '${rows[0]}'"
  rows=("${rows[@]:1}")
done <out
same 'identify: no more and no less' 0 ${#rows[@]}
check 'identify well formed values' 0 'sha.*ssha.*' identify "$hidden" "$ssha"
run 'identify JSON' 3 identify --json "$hidden" secret $'{X\e}a' '>hello there<'
json 'identify JSON' "d == [
  {'index': 1, 'scheme': 'sha', 'code': 2, 'kind': 'one-way', 'tag': '{SHA}', 'wellFormed': True,
   'strength': 'unsalted', 'writers': d[0]['writers']},
  {'index': 2, 'scheme': 'clear', 'code': 1, 'kind': 'clear', 'tag': None, 'wellFormed': True,
   'strength': 'clear', 'writers': 'any'},
  {'index': 3, 'scheme': None, 'code': 1, 'kind': 'unknown', 'tag': '{X\\\\x1B}', 'wellFormed': False,
   'problem': 'the tag is of no known scheme', 'strength': 'unknown', 'writers': ''},
  {'index': 4, 'scheme': 'qveil', 'code': 128, 'kind': 'reversible', 'tag': None, 'wellFormed': False,
   'problem': d[3]['problem'], 'strength': 'reversible', 'writers': 'ldappw'}]"
check 'NUL in the payload' 3 'sha.2.one-way.*NUL byte.unsalted' identify < <(printf '{SHA}a\0b\n')
same 'identify lines' 100000 "$(yes '{MD5}Xr4ilOzQ4PCOq3aQ0qbuaQ==' | head -100000 | "$tool" identify | grep -c 'well formed')"

# ---- the command as a whole ----
check version 0 'ldappw [0-9.]+' --version
for verb in identify format verify reveal 'keys create' 'keys restore' 'keys show' 'keys check'; do
  run "$verb --help" 0 $verb --help
  grep -q -- --json out || fail "$verb --help: $(cat out)"
done
# The manual has every option, its examples run, and shells complete by what --help says.
for verb in identify format verify reveal 'keys create' 'keys restore' 'keys show' 'keys check' 'keys compare' ldif audit trial; do
  "$tool" $verb --help >out 2>err || continue  # built without libldap
  for option in $(grep -oE '^  --[a-z-]+' out); do
    grep -qE "Fl -${option#--}( |$)" "$root/docs/man/ldappw.1" || fail "$verb: $option is not in the manual"
  done
done
mkdir examples; cp seed examples; cp "$root/samples/directory.ldif" examples/export.ldif; echo secret >examples/given
(cd examples; gzip -c export.ldif >export.ldif.gz; cp given bad.txt; PATH=$(dirname "$tool"):$PATH
 sed -n '/^.Sh EXAMPLES/,/^.Sh/p' "$root/docs/man/ldappw.1" | sed -n '/^.Bd/,/^.Ed/{/^[.]/d; s/\\e$/\\/; p}' >all
 bash -e all) >out 2>err
same 'the examples of the manual' 0 $?
grep -qx welcome out && grep -qE '^ +1 aes256$' out && grep -qE '^yes: these keys open' out && [ -s examples/report.html ] || fail "the examples: $(<out)"
complete() { "${BASH}" -c '. "$0"; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _ldappw; echo "${COMPREPLY[@]}"' \
  "$root/src/tools/completions/ldappw.bash" "$tool" "$@"; }
same 'completion' 'format,create restore show check compare,--seed-file --salt-file,' \
  "$(complete fo),$(complete keys ''),$(complete keys create --s),$(complete verify x)"
! LD_DEBUG=files "$tool" --version 2>&1 | grep -E 'libldap-|tresk' || fail 'a library is loaded that is not needed'
"$tool" identify x >/dev/full 2>err; same 'full output' '5 ldappw: standard output: No space left on device' "$? $(<err)"
"$tool" identify x >&- 2>err; same 'closed output' 5 $?
"$tool" --version >/dev/full 2>err; same 'full output of the version' 5 $?
for verb in identify 'format --scheme md5' reveal; do  # whoever asks line by line is answered line by line
  coproc "$tool" $verb 2>/dev/null
  for _ in 1 2; do
    echo question >&"${COPROC[1]}"
    read -t 60 -r <&"${COPROC[0]}" || { fail "$verb does not answer"; break; }
  done
  eval "exec ${COPROC[1]}>&-"; wait
done
finish
