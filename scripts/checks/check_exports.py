#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Compares what the public headers declare, what the version script lists and what the built library exports; and sees
that the product neither throws nor allocates with operator new, and the provider needs nothing that is newer than
OpenSSL 3.0.0.

    scripts/checks/check_exports.py LIBRARY-FOLDER
"""
import pathlib
import re
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parents[2]
SOURCES = ROOT / "src/libraries/libcrypto/include"
HEADERS = ("password_schemes.h", "encoding_utils.h", "crypto_provider.h", "aes_keys.h")
FORBIDDEN_IMPORTS = re.compile(r"^(__cxa_throw|__cxa_allocate_exception|_Zn[wa][jm])$")


def declared_in(header):
    names = set()
    text = re.sub(r"/\*.*?\*/", "", (SOURCES / header).read_text(), flags=re.S)
    for declaration in re.findall(r"^LDAPPW_(?:API|DATA)\s([^;]*);", text, flags=re.M):
        symbol = re.search(r'LDAPPW_SYMBOL\("(\w+)"\)', declaration) or \
            re.search(r"\(\*(\w+)\)\(", declaration) or re.search(r"(\w+)\s*(?:\(|\[|$)", declaration)
        names.add(symbol[1])
    return names


def declared():
    return set.union(*(declared_in(header) for header in HEADERS))


def listed():
    text = (SOURCES / "ldappw.map").read_text()
    exported, local = text.split("local:")
    if local.split() != ["*;", "};"]:
        sys.exit("ldappw.map does not end in local: *")
    return set(re.findall(r"^\s+(\w+);", exported, flags=re.M))


def output(*command):
    return subprocess.run(command, check=True, stdout=subprocess.PIPE, text=True).stdout


def symbols(library, *options):
    lines = output("nm", "-D", *options, library).splitlines()
    return {line.split()[-1].split("@")[0] for line in lines if " A " not in line}


def main():
    library = pathlib.Path(sys.argv[1]) / "libldappw.so.1"
    found = {"headers": declared(), "version script": listed(), "library": symbols(library, "--defined-only")}
    everything = set.union(*found.values())
    wrong = ["%s is missing in: %s" % (name, ", ".join(where for where, names in found.items() if name not in names))
             for name in sorted(everything) if any(name not in names for names in found.values())]
    wrong += ["%s is imported" % name for name in sorted(symbols(library, "--undefined-only"))
              if FORBIDDEN_IMPORTS.match(name)]
    imports = output("nm", "-D", "--undefined-only", pathlib.Path(sys.argv[1]) / "qel/qellib/libtresk7qels.so")
    wrong += ["%s is imported" % name for name in re.findall(r"\S+@OPENSSL_\S+", imports)
              if not name.endswith("@OPENSSL_3.0.0")]
    if wrong:
        sys.exit("\n".join(wrong))
    print("%d names are declared, listed and exported" % len(everything))


if __name__ == "__main__":
    main()
