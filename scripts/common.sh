# SPDX-License-Identifier: Apache-2.0
# What the scripts share; they read it with "source". Everything said here goes to standard error.
root=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
name=$(basename "$0")
cd "$root"
mkdir -p build

step() { echo "== $*"; }

say() { echo "$name: $*" >&2; }

fail() {
  say "$@"
  exit 1
}

# Runs a command with its output in a log; when it fails, shows the end of the log and stops.
logged() { # log, command...
  local log=$1
  shift
  mkdir -p "$(dirname "$log")"
  "$@" >"$log" 2>&1 </dev/null || failed "$log" "$1"
}

failed() { # log, what failed
  tail -n 40 "$1" >&2
  fail "$2 failed; all of its output is in $1"
}

# Gives the commands that follow a temporary folder of their own, which goes when the script ends.
own_temporary_folder() {
  TMPDIR=$(mktemp -d)
  chmod 711 "$TMPDIR" # servers that are tried run as another user, and pass through it
  export TMPDIR
  trap 'rm -rf "$TMPDIR"' EXIT
}

# The names of the sources in a folder, each with a NUL behind it: those that are committed or will be, as they are now.
# A tree without git's records has no others than those and build.
source_files() { # folder or pattern...
  if [ -e .git ] && git rev-parse --git-dir >/dev/null 2>&1; then
    git ls-files -z --cached --others --exclude-standard -- "$@" | while IFS= read -r -d '' file; do
      [ ! -e "$file" ] || printf '%s\0' "$file"
    done
  else
    find "$@" \( -path ./build -o -path ./.git \) -prune -o -type f -printf '%p\0'
  fi
}

# Writes the release file of the sources as they are: the same sources give the same file. debian/ is not in it, since
# packages change without a release.
write_source() { # file
  local version
  version=$(sed -n 's/^project(ldappw VERSION \([^ ]*\) .*/\1/p' CMakeLists.txt)
  source_files . | grep -zv '^\(\./\)\?debian/' |
    tar --null -T - --sort=name --format=gnu --owner=0 --group=0 --numeric-owner --mode=u=rwX,go=rX \
      --mtime="@$(dpkg-parsechangelog -S Timestamp)" --transform="s,^\(\./\)\?,ldappw-$version/," -cf - |
    xz -T1 -9 >"$1"
}

tests=ON # OFF in a script that neither builds tests nor has their packages

# Configures a preset unless that is done: the build itself sees when a list of sources changes.
configure() { # preset
  local folder=build/$1 fresh=()
  local cache=$folder/CMakeCache.txt
  if [ "$folder/build.ninja" -nt CMakePresets.json ] && grep -qFx "CMAKE_HOME_DIRECTORY:INTERNAL=$root" "$cache" &&
    { [ $tests = OFF ] || grep -qFx LDAPPW_TESTS:BOOL=ON "$cache"; }; then
    return
  fi
  say "configuring $folder"
  # A folder that another generator or another place of the tree has left is of no use.
  [ ! -e "$cache" ] || fresh=(--fresh)
  logged "$folder/configure.log" cmake --preset "$1" -DLDAPPW_TESTS=$tests "${fresh[@]}"
}

# Configures and builds, and shows how far it is; says nothing when there is nothing to do.
build() { # preset, target...
  local preset=$1 targets=()
  shift
  [ $# -eq 0 ] || targets=(--target "$@")
  configure "$preset"
  NINJA_STATUS='[%f/%t] ' cmake --build --preset "$preset" "${targets[@]}" </dev/null 2>&1 |
    tee "build/$preset/build.log" | progress "building build/$preset" ||
    failed "build/$preset/build.log" "the build"
}

# Turns a builder's "[done/all]" lines into one line that changes, or into a line each quarter where none can.
progress() { # what
  local line terminal=0 quarter last=-1
  [ ! -t 2 ] || terminal=1
  while IFS= read -r line; do
    [[ $line =~ ^\[([0-9]+)/([0-9]+)\] ]] || continue
    quarter=$((4 * BASH_REMATCH[1] / BASH_REMATCH[2]))
    if [ $terminal = 1 ]; then
      printf '\r%s: %s: %d of %d ' "$name" "$1" "${BASH_REMATCH[@]:1}"
    elif ((quarter > last)); then
      say "$1: ${BASH_REMATCH[1]} of ${BASH_REMATCH[2]}"
    fi
    last=$quarter
  done >&2
  if [ $terminal = 1 ] && ((last >= 0)); then echo >&2; fi
}
