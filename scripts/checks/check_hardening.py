#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Sees that built files are hardened: guarded stacks, checked copies, marked jump targets, tables read-only after start,
and no path of the machine that built them.

    scripts/checks/check_hardening.py BUILD-FOLDER...
"""
import pathlib
import re
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parents[2]
FILES = ("lib/libldappw.so.1", "lib/libdsutil.so.1", "lib/qel/qellib/libtresk7qels.so", "bin/ldappw")
PLUGINS = ("lib/ldap/pw-ldappw.so", "lib/dirsrv/plugins/libldappw-pwdstorage.so")  # where their servers' headers are
MARK = re.compile(r"x86 feature:.*\bIBT\b.*\bSHSTK\b")


def output(*command):
    return subprocess.run(command, check=True, stdout=subprocess.PIPE, text=True).stdout


def import_faults(path):
    imports = output("nm", "-D", "--undefined-only", path)
    if "__stack_chk_fail" not in imports:
        yield "%s: no function guards its stack" % path
    if not re.search(r"\b__\w+_chk@", imports):
        yield "%s: no copy is checked" % path


def linking_faults(path):
    if "GNU_RELRO" not in output("readelf", "-lW", path):
        yield "%s: its tables stay writable (no RELRO)" % path
    if "BIND_NOW" not in output("readelf", "-dW", path):
        yield "%s: binds as it goes (no BIND_NOW)" % path
    if not re.search(r"Type:\s+DYN\b", output("readelf", "-h", path)):
        yield "%s: is not position-independent" % path


def mark_faults(path, needs_mark):
    if needs_mark and not MARK.search(output("readelf", "-nW", path)):
        yield "%s: jump targets are not marked (IBT, SHSTK)" % path


def path_faults(path):
    """The 32-bit build tree may search the private folder of 32-bit libraries; packages have no search path."""
    content = path.read_bytes()
    for searched in re.findall(r"\((?:RPATH|RUNPATH)\)[^\[]*\[([^\]]*)\]", output("readelf", "-dW", path)):
        own = [folder for folder in searched.split(":") if folder.startswith(str(ROOT)) and "/sysroot-i386/" not in folder]
        if not own:
            content = content.replace(searched.encode(), b"")
    if str(ROOT).encode() in content:
        yield "%s: holds the path %s" % (path, ROOT)


def start_file_is_marked(path):
    """Whether the C library's own part of every linked file is marked; when it is not, no linked file can be."""
    width = "-m32" if "ELF32" in output("readelf", "-h", path) else "-m64"
    return bool(MARK.search(output("readelf", "-nW", output("gcc", width, "-print-file-name=crti.o").strip())))


def main():
    faults = []
    for build in map(pathlib.Path, sys.argv[1:]):
        linked = [build / name for name in FILES] + [build / name for name in PLUGINS if (build / name).exists()]
        for path in linked:
            faults += [*import_faults(path), *linking_faults(path), *path_faults(path),
                       *mark_faults(path, start_file_is_marked(path))]
        objects = [path for path in sorted((build / "src").rglob("*.o")) if any((ROOT / "src").rglob(path.stem))]
        for path in objects:
            faults += mark_faults(path, True)
        print("%s: %d files and the %d object files behind them" % (build, len(linked), len(objects)))
    if faults:
        sys.exit("\n".join(faults))


if __name__ == "__main__":
    main()
