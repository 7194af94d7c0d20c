#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# The verbs that read directory exports, as a process and on whole exports: ldif_test.sh LDAPPW. What becomes of a line
# is in command_ldif_test.cpp.
. "$(dirname "$0")/command_frame.sh"
S={SHA}5en6G6MezRroT3XKqkdPOmY/BfQ=  # of "secret"
for set in A B C; do
  echo "SaltOfTest-$set" >salt
  run 'keys create' 0 keys create --salt-file salt --config $set.cfg --directory $set <<<"aSeedForTheTest-$set"
done
python3 "$root/scripts/make/make_sample.py" --entries 3000 --out sample
sed -i "s|^userpassword: x$|userpassword: X|I" sample  # x alone locks
run 'to aes256' 0 ldif --to aes256 --new-keys B --in sample --allow-binary --out b

# Rotation and back gives the sample again; other keys open nothing, not even the one value in 250 whose padding comes
# out right by chance.
test_rotation() {
  run 'to aes128' 0 ldif --to aes128 --new-keys A --in sample --out a
  run rotation 0 ldif --to aes256 --keys A --new-keys B --allow-binary --in a --out rotated
  sameFile rotation b rotated
  run 'to clear' 0 ldif --to clear --allow-clear --keys B --allow-binary --in b --out back
  sameFile 'the passwords come back' <(unfold sample) <(unfold back)
  run 'wrong keys' 4 ldif --to aes256 --keys C --new-keys A --in b
  sameFile 'no value is converted with the wrong keys' b out
  same 'the values that do not open are listed by their lines' \
    "$(grep -ni '^userpassword' b | cut -d: -f1 | head -1000)" \
    "$(sed -n 's/^ldappw: line \([0-9]*\): uid=.*/\1/p' err | head -1000)"
}

# Threads change nothing but the time, and a line may have any length.
test_threads_and_lengths() {
  run 'one thread' 0 ldif --to sha --threads 1 --in sample; mv out one
  run 'five threads' 0 ldif --to sha --threads 5 --in sample
  sameFile 'the order of the output' one out
  {
    printf 'dn: a\ndescription: '; head -c 3000000 /dev/zero | tr '\0' x
    printf '\nuserPassword: secret\n\n\n'; cat sample
  } >in
  { head -c 2000000 in | gzip -c; tail -c +2000001 in | zstd -qc; } >packed
  run 'a long line' 0 ldif --to sha --in in
  sameFile 'a long line' <(sed "s|^userPassword: secret$|userPassword: $S|" in | head -4; printf '\n'; cat one) out
  mv out plain
  run packed 0 ldif --to sha <(gzip -c in)
  sameFile packed plain out
}

# The short audit of a mixed export has the figures of the whole one.
test_short_audit() {
  local mixed=$root/samples/mixed.ldif
  run 'the whole report' 3 audit --keys A --json "$mixed"
  mv out whole
  run 'the short report' 3 ldif --audit --keys A --json --in "$mixed"
  cat whole >>out
  json 'the short report' "d[0]['entries'] == 28 and d[0] == {key: [{n: row[n] for n in ('name', 'entries')}
    for row in d[1][key]] if key == 'findings' else d[1][key] for key in d[1].keys() - {'time', 'exports', 'subtrees',
    'policyMet'}}"
  run 'audit as text' 3 ldif --audit --keys A --in "$mixed"
  printed 'audit as text' 'aes256 +reversible +1' 'entries: 28' 'values: 29' 'behind a URL: 1' 'to be deleted: 1' \
    'finding: malformed: 9'
  grep -qE '^subtree|dc=' out && fail 'audit as text has more than counts'
}

# The next run names what is left, and not what another one is writing to.
left_by_killed() {
  echo >.old.AbCd12; flock --no-fork .old.AbCd12 sleep 600 &
  local holder=$!
  until_true grep -q " $holder " /proc/locks
  run 'after a run that was killed' 0 ldif --to sha --in kept --out old --force
  same 'after a run that was killed' 1 "$(grep -c 'warning: a run that was ended has left .*/[.]old[.]......$' err)"
  kill $holder; cp kept old; rm .old.*
}


# Output files: refused or replaced, and never in part.
test_output_files() {
  local signal writer command rc list
  umask 000
  run 'a new file' 0 ldif --to sha --in sample --out new
  same 'mode of a new file' 600 "$(mode new)"
  umask 022
  cp sample old && chmod 640 old && cp old kept
  "$tool" ldif --to sha --in sample >/dev/full 2>err; same 'full device' 5 $?
  (ulimit -f 100; trap '' XFSZ; failures=0; run 'file size limit' 5 ldif --to sha --in sample --out old --force
   exit $failures) || fail 'file size limit'
  mkfifo slow && exec 9<>slow  # with a writer that stays, the input does not end
  for signal in ${LDAPPW_SIGNALS:-TERM KILL}; do
    cat sample >&9 &
    writer=$!
    "$tool" ldif --to sha --in slow --out old --force 2>/dev/null 9>&- &
    command=$!
    until_true compgen -G '.old.*' || fail "$signal: there is no temporary file"
    kill -"$signal" $command; wait $command 2>/dev/null; rc=$?
    same "$signal: exit code" $((128 + $(kill -l "$signal"))) $rc
    kill $writer 2>/dev/null
    [[ $signal != KILL ]] || left_by_killed  # nothing can tidy up after that
    compgen -G '.old.*' && fail "$signal: a temporary file is left"
  done
  exec 9>&-
  sameFile 'the old output after runs that failed' kept old
  run 'the input as output' 0 ldif --to sha --in old --out old --force
  run 'the same to standard output' 0 ldif --to sha --in sample
  sameFile 'the input as output' out old
  same 'mode of a file that is replaced' 640 "$(mode old)"
  acl() { python3 -Sc 'import os; print(os.getxattr("old", "system.posix_acl_access").hex())'; }
  if python3 -Sc 'import os, struct; os.setxattr("old", "system.posix_acl_access", struct.pack("<I", 2) + b"".join(
       struct.pack("<HHI", tag, rights, user) for tag, rights, user in ((1, 6, 2**32 - 1), (2, 4, 65534),
       (4, 4, 2**32 - 1), (16, 4, 2**32 - 1), (32, 0, 2**32 - 1))))' 2>err; then
    list=$(acl)
    run 'an access list' 0 ldif --to sha --in old --out old --force; same 'an access list' "$list" "$(acl)"
  fi
  printf 'dn: a\nuserPassword: {Z}\n' >in
  "$tool" ldif --to sha --in in --out closed <&- 2>&-
  same 'closed descriptors' 3 $?
  sameFile 'messages do not go into the output' in closed
}

# What has been written of change records when a signal comes is whole.
test_stop_in_order() {
  python3 "$root/scripts/make/make_sample.py" --entries 9 --out small
  mkfifo changes; (exec "$tool" ldif --to argon2id --changes --threads 1 --out stopped changes 2>err) &
  local command=$! rc
  exec 9>changes; cat small >&9
  until_true compgen -G '.stopped.*'
  waitsForInput() { [[ $(ps -o stat= $command) == S* ]]; }  # and is ready for signals
  until_true waitsForInput
  kill -TERM $command; cat small >&9; exec 9>&-; wait $command; rc=$?
  same 'a stop in order' "143 $(grep -c '^dn' stopped) 1" \
    "$rc $(grep -c '^add: ' stopped) $(grep -c 'stopped before the end' err)"
}

finish
