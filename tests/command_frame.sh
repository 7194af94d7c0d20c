# SPDX-License-Identifier: Apache-2.0
# The frame of the command's tests, sourced with the command as $1: a folder of its own, functions that run
# the command and compare, and the count of what differs; FAIL_FAST in the environment ends it at the first of these.
# A suite is functions named test_PART, of which PARTS in the environment chooses some. Nothing depends on how fast the
# machine is.
set -u
tool=$(readlink -f "$1") held=$(readlink -f "${2:-}")
root=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
work=$(mktemp -d) && cd "$work" || exit 2
trap 'rm -rf "$work"' EXIT
failures=0

fail() {
  echo "FAIL: $*" >&2
  failures=$((failures + 1))
  [ -z "${FAIL_FAST:-}" ] || exit 1
}

# run NAME CODE ARGUMENT...: standard input goes to the command; the files out and err have what comes of it. Every
# message carries the command's name and nothing that a terminal would act on.
run() {
  local name=$1 code=$2 rc line LC_ALL=C
  shift 2
  "$tool" "$@" >out 2>err && rc=0 || rc=$?
  [ "$rc" = "$code" ] || fail "$name: exit code $rc, not $code ($(head -1 err))"
  while IFS= read -r line; do
    [[ $line == 'ldappw: '* && $line != *[[:cntrl:]]* ]] || fail "$name: message '$line'"
  done <err
}

# check NAME CODE PATTERN ARGUMENT...: the same; PATTERN (extended, anchored) is for all of standard output.
check() {
  local name=$1 code=$2 pattern=$3 text
  shift 3
  run "$name" "$code" "$@"
  text=$(<out)
  [[ $text =~ ^($pattern)$ ]] || fail "$name: printed '$text'"
}

same() { [ "$2" = "$3" ] || fail "$1: '$3', not '$2'"; }                             # NAME EXPECTED GOT
sameFile() { cmp -s "$2" "$3" || fail "$1: $(diff -a "$2" "$3" | head -5 | cut -c -200)"; }  # NAME EXPECTED GOT
said() { grep -qaE -- "$2" err || fail "$1: '$2' was not said but '$(head -c 300 err)'"; }   # NAME PATTERN
printed() {  # NAME PATTERN..., each the whole of a line that the last run printed
  local name=$1 pattern
  for pattern in "${@:2}"; do grep -qxE -- "$pattern" out || fail "$name: no '$pattern' in $(<out)"; done
}
mode() { stat -c %a "$@" | xargs; }
unfold() { awk 'NR > 1 && sub(/^ /, "") { l = l $0; next } NR > 1 { print l } { l = $0 } END { print l }' "$1"; }
b64() { openssl base64 -A; }
until_true() { for _ in {1..600}; do ! "$@" >/dev/null 2>&1 || return 0; sleep 0.1; done; }

# json NAME EXPRESSION: EXPRESSION (Python) is true of d, the objects that the last run printed.
json() {
  python3 -Sc 'import json, sys; d = [json.loads(line) for line in open("out")]
sys.exit(not eval("(" + sys.argv[1] + ")"))' "$2" || fail "$1: not '$2' but '$(head -c 600 out)'"
}

finish() {
  local part
  for part in ${PARTS:-$(compgen -A function test_)}; do "test_${part#test_}"; done
  echo "failures: $failures"
  exit $((failures > 0))
}
