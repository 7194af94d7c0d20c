#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Runs the example server in a folder of its own: example_test.sh PROGRAM. It must not start where it cannot make its
# key stash files.
set -euo pipefail
folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT

"$1" "$folder" | grep -qx "8 threads, [0-9]* requests, 5 rotations"
code=0
"$1" "$folder/missing" 2>"$folder/messages" || code=$?
[ $code -eq 1 ] && grep -q "cannot start, code 1;" "$folder/messages"
