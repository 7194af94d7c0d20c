#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# The command as a process, on values and key stash files: tool_test.sh LDAPPW HELD-SYNC-LIBRARY. What it answers in a
# process of its own is in command_test.cpp.
. "$(dirname "$0")/command_frame.sh"

seed=correct-horse-battery salt=0123456789ab
printf '%s\n' "$seed" >seed; printf '%s\n' "$salt" >salt; echo secret >password
umask 000  # modes must not depend on it
check create 0 "configuration sync: [A-Za-z0-9+/]+=*.directory sync: [A-Za-z0-9+/]+=*.directory salt: $salt" \
  keys create --config cfg --directory dir --salt-file salt <seed
said create '^ldappw: write this down'
umask 022
same 'stash modes' '600 600' "$(mode cfg dir)"
cp dir dir.good; cp cfg cfg.good; ln -s dir link
syncOf() { "$tool" keys show "$1" | sed -n 's/^sync: \(.*\) (.*/\1/p'; }
sync=$(syncOf dir)

test_stash_files() {
  same 'salt in the stash file' "$salt" "$(tail -c 84 dir | head -c 12)"
  same 'a full disk' "ldappw: $work/cfg: File too large"$'\n'5 \
    "$(ulimit -f 0; "$tool" keys create --config cfg --directory dir --force 2>&1 <seed | cat; echo "${PIPESTATUS[0]}")"
  check restore 0 '.+' keys restore again --expect-sync "$sync" < <(cat seed salt)
  sameFile 'restore gives the same bytes' dir again
  run 'restore, salt from standard input' 0 keys restore third --seed-file seed --json <salt
  same 'restore JSON' "{\"sync\":\"$sync\"}" "$(<out)"
  "$tool" keys restore closed --seed-file seed --salt-file salt <&- >&- 2>&-; same 'closed descriptors' 5 $?
  sameFile 'nothing is written into a stash file' dir closed
  check 'restore through a link' 0 '.+' keys restore link --force --seed-file seed --salt-file salt </dev/null
  [ -L link ] || fail 'a symbolic link was replaced'
  chmod 640 again; check 'restore over an open file' 0 '.+' keys restore again --force < <(cat seed salt)
  same 'mode of a replaced stash file' 600 "$(mode again)"
  check 'create JSON' 0 '\{"config":"c3","directory":"d3","sync":"[^"]*","directorySync":"[^"]*","directorySalt":.*\}' \
    keys create --config c3 --directory d3 --seed-file seed --json
  same 'the sync text is the configuration'"'"'s' "$(syncOf c3)" "$(sed 's/.*"sync":"\([^"]*\).*/\1/' out)"
  ! cmp -s d3 dir || fail 'the salts that are drawn are the same'
  cp dir open; chmod 604 open
  check 'open stash' 0 match keys check open --sync "$sync"; said 'open stash' 'warning: open is open to other'
  chmod 640 open; run 'stash of its owner'"'"'s group' 0 keys show open; same 'stash of its group' '' "$(<err)"
  [ $UID = 0 ] || return
  chgrp daemon open
  run 'stash of a foreign group' 0 keys show open; said 'stash of a foreign group' 'warning: open is open to its group'
  run 'stash of the right group' 0 keys show open --keys-group daemon; same 'stash of the right group' '' "$(<err)"
}

preload() { HELD_SYNC=$1 LD_PRELOAD=$held ASAN_OPTIONS=${ASAN_OPTIONS:-}:verify_asan_link_order=0 "${@:2}"; }
isWaiting() { [[ $(ps -o comm=,stat= "$1") == ldappw*S* ]]; }
isStopped() { [[ $(ps -o stat= "$1") != [!T]* ]]; }

# A run that is stopped when both temporary files are complete: whatever ends it, the stash files stay what they were.
test_signals() {
  local signal disposition rc pid
  while read -r signal disposition rc; do
    cp dir.good dir; cp cfg.good cfg
    (preload stop exec env "$disposition" "$tool" keys create --config cfg --directory dir --force <seed &>/dev/null) &
    pid=$!
    until_true isStopped $pid
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
  cp dir.good dir; cp cfg.good cfg
}

# One run at a time, which names what another has left; a file that is replaced is kept, and both or none.
test_runs_one_after_the_other() {
  (preload stop exec "$tool" keys create --config pair.cfg --directory pair --seed-file seed >first 2>&1) &
  local pid=$! other file what
  until_true isStopped $pid
  "$tool" keys create --config pair.cfg --directory pair --force --json >second 2>waits <<<another-seed-entirely &
  other=$!
  until_true grep -q 'waiting for another run' waits
  same 'the second run waits' 0 "$(wc -c <second)"
  grep -q 'warning: a run.*/.pair.cfg.*stash file' waits && fail 'what a run needs is named as left'
  kill -CONT $pid; wait $pid $other
  same 'the files of one run' "$(sed 's/.*"sync":"\([^"]*\)","directorySync":"\([^"]*\).*/\1 \2/' second)" \
    "$(syncOf pair.cfg) $(syncOf pair)"
  same 'the files of the first run' "$(sed -n 's/.* sync: //p' first | xargs)" \
    "$(syncOf pair.cfg.bak) $(syncOf pair.bak)"
  cp pair .pair.AbCd12; echo >.pair.AbCd13; mkfifo .pair.AbCd14; cp pair pair.now
  run 'a third run' 0 keys create --directory pair --force --seed-file seed
  said 'a third run' 'warning: a run.* has left .*/.pair.AbCd12, a whole stash file with the sync text '
  said 'a third run' 'AbCd13, no whole stash file'
  said 'a third run, a pipe' 'has left .*/.pair.AbCd14$'; rm .pair.AbCd14
  said 'a third run' 'kept as [^ ]*/pair.bak2'; sameFile 'a third run' pair.now pair.bak2
  run 'the same again' 0 keys restore pair --force --seed-file seed --salt-file <(tail -c 84 pair | head -c 12)
  same 'the same again' '' "$(grep kept err)$(compgen -G 'pair.bak3')"
  (preload file exec "$tool" keys create --config pair.cfg --directory pair --force --seed-file seed) >out 2>err
  same 'neither is kept when the run fails' 'pair pair.bak pair.bak2 pair.cfg pair.cfg.bak' \
    "$(compgen -G 'pair*' | grep -v now | sort | xargs)"
  for what in file folder; do
    preload $what "$tool" keys restore dir --force --seed-file seed --salt-file salt >/dev/null 2>err
    same "a $what that does not reach the disk" 5 $?
  done
  said 'a folder that does not reach the disk' "^ldappw: $work: Input/output error"
  (preload stop exec "$tool" keys restore late --seed-file seed --salt-file salt >/dev/null 2>&1) &
  pid=$!
  until_true isStopped $pid
  echo mine >late; kill -CONT $pid; wait $pid
  same 'a file that appears meanwhile is not replaced' '2 mine' "$? $(<late)"
}

# Others who may write to the folder, or read it, or the memory of processes of their own.
test_other_users() {
  echo mine >victim
  preload swap "$tool" keys restore swapped --seed-file seed --salt-file salt >/dev/null 2>err
  same 'a temporary file that is swapped' '5 mine' "$? $(<victim)"
  said 'a temporary file that is swapped' 'swapped is not the file that was written: somebody else writes to its folder'
  flock --no-fork "$work" sleep 600 &
  local holder=$!
  until_true grep -q " $holder " /proc/locks
  timeout 60 "$tool" keys restore locked --seed-file seed --salt-file salt >out 2>err
  same 'a folder that is locked' 5 $?
  kill $holder
  said 'a folder that is locked' "^ldappw: $work is locked by process $holder \(sleep\); nothing was written"
  [ $UID = 0 ] || return
  ln -s victim theirs; chown -h daemon theirs
  run "another user's link" 5 keys restore theirs --force --seed-file seed --salt-file salt
  same "another user's link" mine "$(<victim)"
  # Root owns the memory, as the kernel shows it, of a process that is not to be dumped.
  setpriv --reuid=65534 --clear-groups test -x "$tool" || return 0  # out of its reach
  chmod 711 .
  coproc setpriv --reuid=65534 --clear-groups "$tool" identify 2>/dev/null
  until_true isWaiting $COPROC_PID
  same 'no dump' 0 "$(stat -c %u /proc/$COPROC_PID/mem)"
  eval "exec ${COPROC[1]}>&-"; wait
}

test_input_and_output() {
  local verb
  check 'keys from a pipe' 0 match verify --keys <(cat dir) --password-file password \
    "$("$tool" format --scheme aes256 --keys dir <password)"
  run 'value and password from files' 0 verify --value-file <("$tool" format --scheme ssha <password) <password
  "$tool" identify x >/dev/full 2>err
  same 'full output' '5 ldappw: standard output: No space left on device' "$? $(<err)"
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
}

complete() {
  "${BASH}" -c '. "$0"; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _ldappw; echo "${COMPREPLY[@]}"' \
    "$root/src/tools/completions/ldappw.bash" "$tool" "$@"
}

# The manual has every option, its examples run, and shells complete by what --help says.
test_help_and_manual() {
  local verb known
  check version 0 'ldappw [0-9.]+' --version
  known=$(grep -oE 'Fl -[a-z-]+' "$root/docs/man/ldappw.1" | sed 's/Fl -/  --/' | sort -u)
  for verb in identify format verify reveal keys\ {create,restore,show,check,compare} ldif audit trial; do
    "$tool" $verb --help >out 2>err || continue  # built without libldap
    printed "$verb" '  --json .*'
    same "$verb: options that are not in the manual" '' \
      "$(comm -13 <(echo "$known") <(grep -oE '^  --[a-z-]+' out | sort -u))"
  done
  mkdir examples; cp seed examples; cp "$root/samples/directory.ldif" examples/export.ldif; cp password examples/given
  (cd examples; gzip -c export.ldif >export.ldif.gz; cp given bad.txt; PATH=$(dirname "$tool"):$PATH
   sed -n '/^.Sh EXAMPLES/,/^.Sh/p' "$root/docs/man/ldappw.1" | sed -n '/^.Bd/,/^.Ed/{/^[.]/d; s/\\e$/\\/; p}' >all
   bash -e all) >out 2>err
  same 'the examples of the manual' 0 $?
  printed 'the examples' welcome ' +1 aes256' 'yes: these keys open.*'
  [ -s examples/report.html ] || fail 'the examples: no report'
  same 'completion' 'format,create restore show check compare,--seed-file --salt-file,' \
    "$(complete fo),$(complete keys ''),$(complete keys create --s),$(complete verify x)"
  ! LD_DEBUG=files "$tool" --version 2>&1 | grep -E 'libldap-|tresk' || fail 'a library is loaded that is not needed'
}
finish
