#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Sees that the code in documents is code that works: what docs/server.md shows stands in examples/server.c, and the
lines in README.md compile against the public headers."""
import re
import subprocess
import sys

import check_exports

ROOT = check_exports.ROOT
FUNCTION = """%s
int server(const char* clear, int clearLength, const char* presented, int presentedLength);
int server(const char* clear, int clearLength, const char* presented, int presentedLength) {
%s
  return matches;
}
"""


def blocks(name):
    found = re.findall(r"^```c\n(.*?)^```", (ROOT / name).read_text(), flags=re.M | re.S)
    return found or sys.exit("check_snippets: %s has no code in C" % name)


def main():
    example = (ROOT / "examples/server.c").read_text()
    strange = [block for block in blocks("docs/server.md") if block not in example]
    if strange:
        sys.exit("check_snippets: docs/server.md shows what examples/server.c does not have:\n" + "\n".join(strange))
    for block in blocks("README.md"):
        lines = block.splitlines()
        source = FUNCTION % tuple("\n".join(line for line in lines if line.startswith("#include") == included)
                                  for included in (True, False))
        subprocess.run(["gcc", "-std=c11", "-Wall", "-Wextra", "-Wpedantic", "-Werror", "-fsyntax-only", "-x", "c", "-",
                        "-I", str(check_exports.SOURCES)], input=source, text=True, check=True)


if __name__ == "__main__":
    main()
