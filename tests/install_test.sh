#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Installs the build tree, moves what was installed, and builds and runs an outside program against it, once through
# find_package and once through pkg-config: install_test.sh BUILD-FOLDER C-FLAGS.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

cmake --install "$1" --prefix "$work/first" > "$work/log"
mv "$work/first" "$work/moved"
export CFLAGS=$2

cmake -G Ninja -S "$here/install" -B "$work/cmake" -DCMAKE_PREFIX_PATH="$work/moved" >> "$work/log"
cmake --build "$work/cmake" >> "$work/log"
"$work/cmake/outside"

PKG_CONFIG_PATH=$(dirname "$(find "$work/moved" -name ldappw.pc)")
export PKG_CONFIG_PATH
libdir=$(pkg-config --variable=libdir ldappw)
# shellcheck disable=SC2046 # the flags are words
cc $CFLAGS -D_GNU_SOURCE -fPIE -pie "$here/consumer.c" -o "$work/outside" $(pkg-config --cflags --libs ldappw) \
  -Wl,-rpath,"$libdir"
"$work/outside"

# The examples as they were installed, and the links of the manual.
cmake -G Ninja -S "$work/moved/share/ldappw/examples" -B "$work/examples" -DCMAKE_PREFIX_PATH="$work/moved" \
  >> "$work/log"
cmake --build "$work/examples" >> "$work/log"
"$here/example_test.sh" "$work/examples/server"
cd "$work/moved/share/man"
ls man3/{format_password,initQelCrypto,setAESKeyData,des}.3ldappw man7/ldappw.7 >> "$work/log"
sed -n 's/^\.so //p' man3/* | xargs -d '\n' ls >> "$work/log"

for file in bash-completion/completions/ldappw zsh/*/_ldappw fish/vendor_completions.d/ldappw.fish \
  doc/ldappw/{values,interoperability,moving}.md; do
  compgen -G "$work/moved/share/$file" >/dev/null || { echo "install_test: $file is missing" >&2; exit 1; }
done
echo abc | "$work/moved/bin/ldappw" format --scheme md5 | grep -qx '{MD5}kAFQmDzST7DWlj99KOF/cg=='
