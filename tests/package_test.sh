#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Unpacks the Debian packages into an empty root and uses them there: package_test.sh PACKAGES-FOLDER. The root has
# nothing else, so the system's own libraries are used, and LD_LIBRARY_PATH stands for the loader's standard folder.
set -euo pipefail
here=$(cd "$(dirname "$0")" && pwd)
packages=$(cd "$1" && pwd)
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
root="$work/root"

fail() { echo "package_test: $*" >&2; exit 1; }
field() { dpkg-deb -f "$(echo "$packages/$1"_*.deb)" "$2"; }

for package in libldappw1 libldappw-dev ldappw slapd-ldappw 389-ds-ldappw; do
  archive=$(echo "$packages/$package"_*.deb)
  dpkg-deb --ctrl-tarfile "$archive" | tar -xf - --one-top-level="$work/control/$package"
  dpkg-deb --fsys-tarfile "$archive" | tar -tf - | grep -v '/$' | sort >"$work/$package.files"
  dpkg -x "$archive" "$root"
done
[ -z "$(sort "$work"/*.files | uniq -d)" ] || fail "two packages have the same file"

# ---- what the package manager is told ----
version=$(field libldappw1 Version)
[ "$(field libldappw-dev Depends)" = "libldappw1 (= $version)" ] || fail "the headers may meet another library"
for package in slapd-ldappw:slapd 389-ds-ldappw:389-ds-base; do
  depends=", $(field ${package%:*} Depends)"
  [[ "$depends" == *", libldappw1 (= $version), "* && "$depends" == *", ${package#*:} (>= "* ]] ||
    fail "$package: $depends"
done
grep -qw libldappw1 <<<"$(field ldappw Depends)" || fail "the command does not ask for its library"
grep -qw 'libldap[-.0-9]*' <<<"$(field ldappw Depends)" || fail "the command does not ask for what it opens"
for package in zlib1g libzstd1; do
  grep -qw $package <<<"$(field ldappw Depends)" || fail "the command does not ask for $package"
done
grep -qE '\blibssl3(t64)?\b' <<<"$(field libldappw1 Depends)" ||
  fail "the library does not ask for what its provider links"
for library in "$root"/usr/lib/*/*.so.*; do
  name=$(objdump -p "$library" | awk '$1 == "SONAME" { print $2 }')
  grep -q "^${name%.so.*} ${name##*.so.} libldappw1 " "$work/control/libldappw1/shlibs" ||
    fail "no shlibs line of $name"
done
grep -q ldconfig "$work/control/libldappw1/triggers" || fail "the loader's cache would not be renewed"

# ---- the files ----
libdir=$(dirname "$(echo "$root"/usr/lib/*/libldappw.so.1)")
tool="$root/usr/bin/ldappw"
for program in "$tool" "$libdir"/*.so.* "$libdir"/qel/qellib/*.so "$root"/usr/lib/ldap/*.so "$libdir"/dirsrv/*/*.so; do
  ! readelf -d "$program" | grep -E 'R(UN)?PATH' || fail "$program searches a folder of its own"
  readelf -d "$program" | grep -qE 'BIND_NOW|Flags: NOW' || fail "$program is bound late"
  ! readelf -S "$program" | grep -qE '\.symtab|\.debug' || fail "$program is not stripped"
done
for file in bash-completion/completions/ldappw zsh/vendor-completions/_ldappw fish/vendor_completions.d/ldappw.fish \
  doc/ldappw/{README,SECURITY,values,interoperability,moving}.md.gz doc/ldappw/examples/directory.ldif \
  doc/ldappw/CLI11.copyright doc/libldappw1/README.Debian; do
  [ -s "$root/usr/share/$file" ] || fail "$file is missing"
done
for page in "$root"/usr/share/man/*/*.gz; do
  gzip -dc "$page" | mandoc -T lint -W error >/dev/null || fail "$page is no manual page"
done

# ---- the command, and a program of the package's own tests, in this root ----
export LD_LIBRARY_PATH=$libdir PKG_CONFIG_SYSROOT_DIR=$root PKG_CONFIG_LIBDIR=$libdir/pkgconfig
PATH=$root/usr/bin:$PATH "$here/../debian/tests/command"
"$here/../debian/tests/build"

# ---- an outside program, against the development package ----
export PKG_CONFIG_SYSROOT_DIR=$root PKG_CONFIG_LIBDIR=$libdir/pkgconfig
# shellcheck disable=SC2046 # the flags are words
cc -D_GNU_SOURCE "$here/consumer.c" -o "$work/outside" $(pkg-config --cflags --libs ldappw)
"$work/outside"
cmake -G Ninja -S "$here/install" -B "$work/cmake" -DCMAKE_PREFIX_PATH="$root/usr" >"$work/log"
cmake --build "$work/cmake" >>"$work/log"
"$work/cmake/outside"

# These packages are not in Debian, so their first version closes no bug there. The standard may be newer than lintian.
# Compilers copy short texts in halves that overlap, which lintian reads as misspelt words ("rep" + "port").
lintian --allow-root -I --pedantic --fail-on warning,info,pedantic \
  --suppress-tags initial-upload-closes-no-bugs,newer-standards-version,spelling-error-in-binary "$packages"/*.changes
echo "package_test: the packages of version $version are in order"
