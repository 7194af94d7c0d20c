#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Sees that includes follow the layers and that secrets are handled by the helpers made for them."""
import pathlib
import re
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parent.parent
LIBRARIES = ROOT / "src/libraries"
PUBLIC = {"password_schemes.h", "encoding_utils.h", "crypto_provider.h", "aes_keys.h"}
PUBLIC_SYSTEM = {"stddef.h", "stdint.h"}

# What a folder's files may include of the other folders.
ALLOWED = {
    "libdsutil": set(),
    "libqel": set(),
    "libcrypto": {"libdsutil"},
    "tools": {"public"},
    "integrations": {"public"},
}


def files(pattern):
    listed = subprocess.run(["git", "ls-files", pattern], cwd=ROOT, check=True, stdout=subprocess.PIPE, text=True).stdout
    return [ROOT / line for line in listed.split()]


def owners():
    result = {}
    for folder in ("libdsutil", "libqel", "libcrypto"):
        for header in (LIBRARIES / folder).glob("*.h"):
            result.setdefault(header.name, set()).add("public" if header.name in PUBLIC else folder)
    return result


def include_faults():
    owner = owners()
    for path in files("src/*.cpp") + files("src/*.h"):
        parts = path.relative_to(ROOT / "src").parts
        home = parts[1] if parts[0] == "libraries" else parts[0]
        own = {header.name for header in path.parent.glob("*.h")}
        for kind, name in re.findall(r'^#include ([<"])([^>"]+)[>"]', path.read_text(), flags=re.M):
            if path.name in PUBLIC:
                if name not in (PUBLIC_SYSTEM if kind == "<" else PUBLIC):
                    yield "%s: a public header includes %s" % (path.relative_to(ROOT), name)
            elif kind == '"' and name not in own:
                if not owner.get(name, {"?"}) & ALLOWED[home]:
                    yield "%s: includes %s against the layers" % (path.relative_to(ROOT), name)
            elif kind == "<" and name.startswith("openssl/") and home != "libqel":
                yield "%s: OpenSSL belongs to libqel" % path.relative_to(ROOT)


def call_faults():
    for path in files("src/libraries/libcrypto/*.cpp"):
        for number, line in enumerate(path.read_text().splitlines(), 1):
            if re.search(r"\bmemcmp\(", line):
                yield "%s:%d: memcmp; use equalBytes or compareBytes" % (path.relative_to(ROOT), number)
            if re.search(r"\brealloc\(|\bgoto\b|\bnew\b(?! line)", line.split("//")[0]):
                yield "%s:%d: realloc, goto or new" % (path.relative_to(ROOT), number)


def main():
    faults = [*include_faults(), *call_faults()]
    if faults:
        sys.exit("\n".join(faults))


if __name__ == "__main__":
    main()
