#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Runs the built command: tool_test.sh PATH-OF-LDAPPW. Answers come from openssl and perl, and from round trips; nothing
# here depends on how fast the machine is.
set -u
tool=$(readlink -f "$1")
work=$(mktemp -d) && cd "$work" || exit 2
failures=0

fail() { echo "FAIL: $*"; failures=$((failures + 1)); }

# check NAME CODE PATTERN ARGUMENT...: standard input goes to the command; PATTERN (extended, anchored) is for all of
# standard output. Messages must carry the command's name.
check() {
  local name=$1 code=$2 pattern=$3 out rc
  shift 3
  out=$("$tool" "$@" 2>err) && rc=0 || rc=$?
  [ "$rc" = "$code" ] || fail "$name: exit code $rc, not $code ($(head -1 err))"
  [[ $out =~ ^($pattern)$ ]] || fail "$name: printed '$out'"
  ! grep -qv '^ldappw: ' err || fail "$name: message '$(head -1 err)'"
}
# same NAME EXPECTED GOT
same() { [ "$2" = "$3" ] || fail "$1: '$3', not '$2'"; }

seed=correct-horse-battery salt=0123456789ab
printf '%s\n' "$seed" >seed; printf '%s\n' "$salt" >salt

# ---- keys ----
umask 000  # modes must not depend on it
check create 0 '[A-Za-z0-9+/]+=*' keys create --config cfg --directory dir --salt-file salt <seed
umask 022
same 'stash modes' '600 600' "$(stat -c %a cfg dir | xargs)"
cp dir dir.good; cp cfg cfg.good
check 'create over files' 2 '' keys create --config cfg --directory dir <seed
check 'create same file' 2 '' keys create --config dir --directory ./dir --force <seed
ln -s dir link; check 'create same file by link' 2 '' keys create --config dir --directory link --force <seed
check 'create in no folder' 5 '' keys create --config none/cfg --directory new <seed
check 'create on a device' 5 '' keys create --config /dev/null --directory new --force <seed
check 'create short seed' 3 '' keys create --config new1 --directory new2 <<<'elevenchars'
check 'create seed with a blank' 3 '' keys create --config new1 --directory new2 <<<'twelve chars and more'
check 'create seed argument' 2 '' keys create --config new1 --directory new2 "$seed"
! grep -q "$seed" err || fail 'a refused seed was shown'
(ulimit -f 0; check 'create on a full disk' 5 '' keys create --config cfg --directory dir --force <seed; exit $failures) \
  2>/dev/null || fail 'full disk'
sync=$("$tool" keys show --json dir | sed 's/.*"sync":"\([^"]*\)".*/\1/')
check 'restore other sync' 1 '' keys restore dir --force --expect-sync "${sync}x" < <(cat seed salt)
cmp -s dir dir.good && cmp -s cfg cfg.good || fail 'a refused or failed run changed a stash file'
same 'nothing left behind' 'cfg cfg.good dir dir.good err link salt seed' "$(ls -A | xargs)"
check restore 0 '.+' keys restore again --expect-sync "$sync" < <(cat seed salt)
cmp -s again dir || fail 'restore does not give the same bytes'
check 'restore through a link' 0 '.+' keys restore link --force --seed-file seed --salt-file salt </dev/null
[ -L link ] || fail 'a symbolic link was replaced'
same 'salt in the stash file' "$salt" "$(tail -c 84 dir | head -c 12)"
check show 0 ".*$(tail -c 32 dir | openssl dgst -sha256 -r | cut -c 1-16).*" keys show dir
check 'check' 0 match keys check dir --sync "$sync" --salt-file salt
check 'check no sync' 1 'no match' keys check dir --sync other
check 'check no salt' 1 'no match' keys check dir --sync "$sync" --salt-file <(echo 0123456789aX)
head -c 100 dir >short; head -c 200 /dev/zero >zeros; chmod 600 short zeros
check 'short stash' 4 '' keys show short
check 'no stash' 4 '' keys show zeros
check 'missing stash' 5 '' keys show missing
check 'folder as stash' 5 '' keys show .
cp dir open; chmod 640 open; "$tool" keys show open 2>&1 >/dev/null | grep -q warning || fail 'no warning of an open stash'
for i in {1..20}; do
  "$tool" keys create --config cfg --directory dir --force <seed >/dev/null 2>&1 & pid=$!
  [ "$i" = 1 ] || for ((n = 0; n < i * 40; ++n)); do :; done
  kill -TERM "$pid" 2>/dev/null; wait "$pid" 2>/dev/null
  "$tool" keys show dir >/dev/null && "$tool" keys show cfg >/dev/null || fail 'a signal left a damaged stash file'
done
same 'nothing left by signals' '' "$(ls -A | grep '^\.')"
cp dir.good dir

# ---- format, verify, reveal ----
b64() { openssl base64 -A; }
key() { tail -c 72 dir | tail -c +$(($1 + 1)) | head -c "$2" | od -An -v -tx1 | tr -d ' \n'; }
aes() { printf %s "$1" | openssl enc -aes-"$2"-ecb -K "$(key "$3" $(($2 / 8)))" | b64; }
euro=$'gr\xc3\xbc\xc3\x9fe \xe2\x82\xac'
long=$(printf 'x%.0s' {1..2000})
for password in '' a 12345678 123456789 "$(printf 'y%.0s' {1..46})" "$(printf 'z%.0s' {1..47})" "$long" "$euro" \
  ' blanks ' $'return\r' '{SSHA}abc' '{XYZ}' '>1abcdef<' '$(id)`"\'; do
  for scheme in sha ssha MD5 '{crypt}' qVEIL aes128 aes192 aes256; do
    value=$("$tool" format --scheme "$scheme" --keys dir <<<"$password" 2>/dev/null) || fail "format $scheme '$password'"
    check "verify $scheme '$password'" 0 match verify --keys dir -- "$value" <<<"$password"
    check "refuse $scheme '$password'" 1 'no match' verify --keys dir -- "$value" <<<"!$password"
    case $scheme in
      sha) same sha "{SHA}$(printf %s "$password" | openssl dgst -sha1 -binary | b64)" "$value" ;;
      MD5) same md5 "{MD5}$(printf %s "$password" | openssl dgst -md5 -binary | b64)" "$value" ;;
      '{crypt}') same crypt "{crypt}$(perl -e 'print crypt($ARGV[0], substr($ARGV[1], 7, 2))' "${password:0:8}" "$value")" "$value" ;;
      aes128) same aes128 "{AES128}$(aes "$password" 128 0)" "$value" ;;
      aes192) same aes192 "{AES192}$(aes "$password" 192 16)" "$value" ;;
      aes256) same aes256 "{AES256}$(aes "$password" 256 40)" "$value" ;;
    esac
    case $scheme in
      qVEIL) same "reveal $scheme" "$(printf %s "$password" | head -c 46)" "$("$tool" reveal "$value")" ;;
      aes*) same "reveal $scheme" "$password" "$("$tool" reveal --keys dir "$value")" ;;
    esac
  done
done
[ "$(yes same | head -20 | "$tool" format --scheme crypt | sort -u | wc -l)" -gt 15 ] || fail 'salts of one run are the same'
same 'last line without newline' 2 "$(printf 'a\nb' | "$tool" format --scheme ssha | wc -l)"
"$tool" format --scheme crypt <<<123456789 2>&1 >/dev/null | grep -q warning || fail 'no warning of a cut'

# Fixed salts: one wrong key in some 250 opens a value to other bytes.
"$tool" keys create --config c2 --directory d2 --salt-file salt <<<another-seed-entirely >/dev/null
aesValue=$("$tool" format --scheme aes256 --keys dir <<<secret)
ssha='{SSHA}'$(printf 'secretsalt' | openssl dgst -sha1 -binary | cat - <(printf salt) | b64)
newline=$(aes $'a\nb' 128 0)
wrap=$(printf '%s' "$aesValue" | head -c -5)
printf '%s\n' "$ssha" >value; printf 'secret\n' >password; echo '{SHA}abc' >tagged; printf 'a\0b\n' >nul
while IFS='|' read -r name code pattern arguments; do  # standard input: the line "secret"
  eval "set -- $arguments"
  check "$name" "$code" "$pattern" "$@" <<<secret
done <<'ROWS'
foreign salt|0|match|verify "$ssha"
value from file|0|match|verify --value-file value --password-file password
json match|0|\{"scheme":"ssha","match":true\}|verify --json "$ssha"
two values|2||verify "$ssha" --value-file value
password as argument|2||verify "$ssha" secret
password as format argument|2||format --scheme sha secret
no such scheme|2||format --scheme sha512
clear is no scheme|2||format --scheme clear
aes without keys|2||format --scheme aes128
no verb|2||
unknown option|2||identify --frobnicate
clear refused|3||verify secret
clear taken|0|match|verify --clear secret
unknown tag|3||verify --clear '{XYZ}secret'
tag alone|3||verify '{SHA}'
malformed|3||verify '{SHA}c2VjcmV0'
cut payload|3||verify --keys dir "$wrap"
no key|4||verify "$aesValue"
wrong key|4||verify --keys d2 "$aesValue"
missing key file|5||verify --keys none "$aesValue"
damaged key file|4||verify --keys short "$aesValue"
no password|2||verify "$ssha" --password-file /dev/null
{SHA} password|3||format --scheme sha --password-file tagged
NUL password|3||format --scheme ssha --password-file nul
one-way|3||reveal "$ssha"
first problem wins|4|secret|reveal --keys d2 "$aesValue" "$ssha" secret
values like options and lists|0|.a,b..-x|reveal -- '[a,b]' -x
newline in the password|3||reveal --keys dir "{AES128}$newline"
newline in JSON|0|.*"password_base64":"YQpi"\}|reveal --json --keys dir "{AES128}$newline"
JSON escapes|0|.*"password":"a\\"b\\\\\\u0001"\}|reveal --json $'a"b\\\x01'
ROWS

# ---- identify: value, columns ----
masked=$("$tool" format --scheme qveil <<<x)
while IFS='|' read -r code columns value; do
  check "identify $value" "$code" "$columns" identify -- "$(eval "echo $value")"
done <<ROWS
0|clear.1.clear.well formed|secret
0|clear.1.clear.well formed|''
0|sha.2.one-way.well formed|'{sha}5en6G6MezRroT3XKqkdPOmY/BfQ='
3|sha.2.one-way.*20 bytes|'{SHA}c2VjcmV0'
3|sha.2.one-way.*not base64.*|'{SHA}5en6G6MezRroT3XKqkdPOmY/BfQ'
3|sha.2.one-way.*no payload|'{SHA}'
0|ssha.9.one-way.well formed|'{SSHA}5en6G6MezRroT3XKqkdPOmY/BfQ='
3|ssha.9.one-way.*|'{SSHA}c2VjcmV0'
0|md5.3.one-way.well formed|'{MD5}Xr4ilOzQ4PCOq3aQ0qbuaQ=='
3|md5.3.one-way.*|'{MD5}5en6G6MezRroT3XKqkdPOmY/BfQ='
0|crypt.4.one-way.well formed|'{CRYPT}ab01FAX.bQRSU'
3|crypt.4.one-way.*|'{crypt}\$6\$salt\$hash'
0|qveil.128.reversible.well formed|'$masked'
0|qveil.128.reversible.well formed, untagged|'${masked#*\}}'
3|qveil.128.reversible.*untagged|'>hello there<'
0|aes128.135.reversible.well formed|'{AES128}AAAAAAAAAAAAAAAAAAAAAA=='
3|aes192.134.reversible.*blocks|'{AES192}AAAA'
3|unknown .XYZ..1.unknown.*|'{XYZ}abc'
0|vldl.8.one-way.well formed|'{VLDL}anything'
ROWS
same 'identify lines' 100000 "$(yes '{MD5}Xr4ilOzQ4PCOq3aQ0qbuaQ==' | head -100000 | "$tool" identify | grep -c 'well formed')"
check version 0 'ldappw [0-9.]+' --version
"$tool" identify x >/dev/full 2>err; same 'full output' 5 $?
"$tool" identify x >&- 2>err; same 'closed output' 5 $?
cd / && rm -rf "$work"
exit $((failures > 0))
