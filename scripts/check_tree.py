#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Sees that includes and calls follow the layers, that secrets are handled by the helpers made for them, and that sources
keep to what this project has agreed on. Calls are read from object files, so a build comes first.

    scripts/check_tree.py [BUILD-FOLDER]     (default: build/release)
"""
import collections
import pathlib
import re
import subprocess
import sys

import check_exports

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

# The layers of libcrypto by the beginnings of file names, the upper first. A file uses its own layer and those below.
LAYERS = (
    ("password schemes", ("rdbm_pwd",)),
    ("digests, crypt, masked encoding and AES",
     ("sha", "salted_hash", "unsalted_hash", "crypt", "crypto", "utils_masked", "aes")),
    ("provider contexts", ("qel_utils",)),
    ("loader wrappers", ("utils_loader",)),
    ("helpers", ("utils_base64", "getpw", "locks", "trace_scope", "bits", "cancellation", "owners", "processor",
                 "text_target", "vector_kernel", "wipe")),
)


def files(*patterns):
    listed = subprocess.run(["git", "ls-files", *patterns], cwd=ROOT, check=True, stdout=subprocess.PIPE, text=True).stdout
    return [ROOT / line for line in listed.split()]


def owners():
    result = {}
    for folder in ("libdsutil", "libqel", "libcrypto"):
        for header in (LIBRARIES / folder).glob("*.h"):
            result.setdefault(header.name, set()).add("public" if header.name in PUBLIC else folder)
    return result


def include_faults():
    owner = owners()
    for path in files("src/*.cpp", "src/*.h"):
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
            elif kind == "<" and name.startswith("openssl/") and home not in ("libqel", "tools"):
                yield "%s: OpenSSL belongs to libqel and the command" % path.relative_to(ROOT)


def forbidden_call_faults():
    for path in files("src/libraries/libcrypto/*.cpp"):
        for number, line in enumerate(path.read_text().splitlines(), 1):
            if re.search(r"\bmemcmp\(", line):
                yield "%s:%d: memcmp; use equalBytes or compareBytes" % (path.relative_to(ROOT), number)
            if re.search(r"\brealloc\(|\bgoto\b|\bnew\b(?! line)", line.split("//")[0]):
                yield "%s:%d: realloc, goto or new" % (path.relative_to(ROOT), number)


def begins_with(stem, beginning):
    return stem == beginning or stem.startswith(beginning + "_")


def layer(stem):
    """The number of a file's layer, 0 being the uppermost; None for a file that is in none."""
    return next((number for number, (_, beginnings) in enumerate(LAYERS)
                 if any(begins_with(stem, beginning) for beginning in beginnings)), None)


def missing_layer_faults():
    for path in files("src/libraries/libcrypto/*.cpp", "src/libraries/libcrypto/*.h", "src/libraries/libcrypto/*.S"):
        if path.name not in PUBLIC and layer(path.stem) is None:
            yield "%s: is in no layer of scripts/check_tree.py" % path.relative_to(ROOT)


def layer_include_faults():
    for path in files("src/libraries/libcrypto/*.cpp", "src/libraries/libcrypto/*.h"):
        for name in re.findall(r'^#include "([^"]+)"', path.read_text(), flags=re.M):
            upper, lower = layer(path.stem), layer(pathlib.Path(name).stem)
            if name not in PUBLIC and None not in (upper, lower) and lower < upper:
                yield "%s: includes %s of an upper layer" % (path.relative_to(ROOT), name)


def defined_and_needed(objects):
    """By file name: the symbols that an object file defines for others, and those that it needs of others."""
    defined, needed = collections.defaultdict(set), collections.defaultdict(set)
    for path in objects:
        stem = path.name.split(".")[0]
        rows = subprocess.run(["nm", "--format=posix", path], check=True, stdout=subprocess.PIPE, text=True).stdout
        for symbol, kind in (row.split()[:2] for row in rows.splitlines()):
            if kind in "Uwv":
                needed[stem].add(symbol)
            elif kind.isupper() and kind not in "WV":  # weak: inline functions, which every user has
                defined[stem].add(symbol)
    return defined, needed


def calls(defined, needed):
    """By user and used file, the symbol in between that comes first."""
    home = {symbol: stem for stem, symbols in defined.items() for symbol in symbols}
    found = collections.defaultdict(dict)
    for stem, symbols in needed.items():
        for symbol in sorted(symbols, reverse=True):
            if home.get(symbol, stem) != stem:
                found[stem][home[symbol]] = symbol
    return found


def plain(symbol):
    return subprocess.run(["c++filt", symbol], check=True, stdout=subprocess.PIPE, text=True).stdout.strip()


def layer_call_faults(graph):
    for user, used in sorted((user, used) for user in graph for used in graph[user]):
        if None not in (layer(user), layer(used)) and layer(used) < layer(user):
            yield "libcrypto: %s calls %s of an upper layer: %s" % (user, used, plain(graph[user][used]))


def shortest_circle(graph, start):
    ways, seen = collections.deque([[start]]), set()
    while ways:
        way = ways.popleft()
        for used in sorted(graph.get(way[-1], ())):
            if used == start:
                return way
            if used not in seen:
                seen.add(used)
                ways.append(way + [used])
    return None


def circle_faults(graph):
    """A line for each circle; a file is named in the shortest one that it is part of."""
    shown = set()
    for start in sorted(graph):
        way = None if start in shown else shortest_circle(graph, start)
        if way:
            shown.update(way)
            steps = ("%s (%s)" % (used, plain(graph[user][used])) for user, used in zip(way, way[1:] + way[:1]))
            yield "libcrypto: calls run in a circle: %s -> %s" % (start, " -> ".join(steps))


def own_headers(path, defined):
    """The header of the same name; or those of the module, and the public ones that declare what the file defines."""
    own = path.with_suffix(".h")
    if own.exists() or path.parent.name != "libcrypto":
        return {own.name}
    near = {header.name for header in path.parent.glob("*.h")
            if begins_with(path.stem, header.stem) or begins_with(header.stem, path.stem)}
    return near | {header for header in PUBLIC if check_exports.declared_in(header) & defined.get(path.stem, set())}


def first_include_faults(defined):
    for path in files("src/*.cpp", "tests/*.cpp"):
        includes = re.findall(r'^#include [<"]([^>"]+)[>"]', path.read_text(), flags=re.M)
        own = own_headers(path, defined) & set(includes)
        if own and includes[0] not in own:
            yield "%s: the first include is not its own header, %s" % (path.relative_to(ROOT), " or ".join(sorted(own)))


def bare_word_faults():
    """"Meant" by itself says that something is no slip, and neither why nor what follows from it."""
    bare = re.compile(r"[:(]\s*meant\b|\bmeant\s*([:;.)]|\*/|$)|(//|/\*|^ \*)\s*meant\b")
    for path in files("src", "tests"):
        for number, line in enumerate(path.read_text(errors="replace").splitlines(), 1):
            if bare.search(line):
                yield '%s:%d: a bare "meant"; say why, and what follows' % (path.relative_to(ROOT), number)


def main():
    build = ROOT / (sys.argv[1] if len(sys.argv) > 1 else "build/release")
    objects = [path for path in sorted(build.glob("src/libraries/libcrypto/CMakeFiles/ldappw_objects.dir/*.o"))
               if (LIBRARIES / "libcrypto" / path.stem).exists()]  # a source that was renamed leaves its object behind
    if not objects:
        sys.exit("check_tree: %s has no object files of libcrypto; build it first" % build)
    defined, needed = defined_and_needed(objects)
    graph = calls(defined, needed)
    faults = [*include_faults(), *forbidden_call_faults(), *missing_layer_faults(), *layer_include_faults(),
              *layer_call_faults(graph), *circle_faults(graph), *first_include_faults(defined), *bare_word_faults()]
    if faults:
        sys.exit("\n".join(faults))


if __name__ == "__main__":
    main()
