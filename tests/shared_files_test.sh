#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Compares the packages that may be installed for several architectures at once: shared_files_test.sh FOLDER FOLDER, of
# one architecture each. A file that both have must be the same, byte for byte, and each has some of its own.
set -euo pipefail
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

fail() { echo "shared_files_test: $*" >&2; exit 1; }

for package in libldappw1 libldappw-dev; do
  for folder in "$@"; do
    archive=$(echo "$folder/$package"_*.deb)
    architecture=$(dpkg-deb -f "$archive" Architecture)
    [ "$(dpkg-deb -f "$archive" Multi-Arch)" = same ] || fail "$archive is for one architecture at a time"
    dpkg -x "$archive" "$work/$architecture"
    (cd "$work/$architecture" && find . ! -type d | sort) >"$work/$architecture.files"
  done
done
mapfile -t lists < <(ls "$work"/*.files)
[ ${#lists[@]} -eq 2 ] || fail "these are not two architectures: ${lists[*]}"
shared=$(comm -12 "${lists[@]}")
while read -r file; do
  diff -q --no-dereference "${lists[0]%.files}/$file" "${lists[1]%.files}/$file" || fail "$file differs"
done <<<"$shared"
[ -n "$(comm -23 "${lists[@]}")" ] && [ -n "$(comm -13 "${lists[@]}")" ] || fail "one of the two has none of its own"
echo "shared_files_test: $(wc -l <<<"$shared") files are the same for both architectures"
