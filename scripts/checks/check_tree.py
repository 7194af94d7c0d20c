#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Sees that includes and calls follow the layers, that secrets are handled by the helpers made for them, and that sources
keep to what this project has agreed on. Calls are read from object files, so a build comes first.

    scripts/checks/check_tree.py [BUILD-FOLDER]     (default: build/release)
"""
import collections
import pathlib
import re
import subprocess
import sys

import check_exports

ROOT = pathlib.Path(__file__).resolve().parents[2]
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

# The folders of a part, the upper layer first; a file uses its own layer and those below. "." is the part's own folder.
# "include" has the public headers, which all may use.
LAYERS = {
    "src/libraries/libcrypto": (
        ("passwords",),
        ("digests", "crypt", "masked", "aes"),
        ("provider",),
        ("support",),
    ),
    "src/tools": (
        (".",),
        ("verbs",),
        ("audit",),
        ("ldif", "keys"),
        ("schemes",),
        ("base",),
    ),
}
OBJECTS = {"src/libraries/libcrypto": "ldappw_objects", "src/tools": "ldappw_command"}


def files(*patterns):
    listed = subprocess.run(["git", "ls-files", *patterns], cwd=ROOT, check=True, stdout=subprocess.PIPE, text=True).stdout
    return [ROOT / line for line in listed.split()]


def owners():
    result = {}
    for folder in ("libdsutil", "libqel", "libcrypto"):
        for header in (LIBRARIES / folder).rglob("*.h"):
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
            elif kind == '"' and "/" not in name and name not in own:
                if not owner.get(name, {"?"}) & ({home} | ALLOWED[home] | {"public"}):
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


def layer(part, place):
    """The number of the layer of a file, by its place in a part, 0 being the uppermost; None for one that is in none."""
    folder = str(pathlib.PurePath(place).parent)
    return next((number for number, folders in enumerate(LAYERS[part]) if folder in folders), None)


def missing_layer_faults(part):
    for path in files(part + "/*.cpp", part + "/*.h", part + "/*.S"):
        if path.parent.name != "include" and layer(part, path.relative_to(ROOT / part)) is None:
            yield "%s: is in no layer of scripts/checks/check_tree.py" % path.relative_to(ROOT)


def layer_include_faults(part):
    """Headers of a part are included by their folders, so that a reader sees the layer."""
    for path in files(part + "/*.cpp", part + "/*.h"):
        upper = layer(part, path.relative_to(ROOT / part))
        for name in re.findall(r'^#include "([^"]+)"', path.read_text(), flags=re.M):
            if "/" not in name and (path.parent / name).exists() and path.parent != ROOT / part and upper is not None:
                yield "%s: includes %s without its folder" % (path.relative_to(ROOT), name)
            lower = layer(part, name)
            if (ROOT / part / name).exists() and None not in (upper, lower) and lower < upper:
                yield "%s: includes %s of an upper layer" % (path.relative_to(ROOT), name)


def defined_and_needed(objects):
    """By a source's place: the symbols that its object file defines for others, and those that it needs of others."""
    defined, needed = collections.defaultdict(set), collections.defaultdict(set)
    for place, path in objects.items():
        rows = subprocess.run(["nm", "--format=posix", path], check=True, stdout=subprocess.PIPE, text=True).stdout
        for symbol, kind in (row.split()[:2] for row in rows.splitlines()):
            if kind in "Uwv":
                needed[place].add(symbol)
            elif kind.isupper() and kind not in "WV":  # weak: inline functions, which every user has
                defined[place].add(symbol)
    return defined, needed


def calls(defined, needed):
    """By user and used file, the symbol in between that comes first."""
    home = {symbol: place for place, symbols in defined.items() for symbol in symbols}
    found = collections.defaultdict(dict)
    for place, symbols in needed.items():
        for symbol in sorted(symbols, reverse=True):
            if home.get(symbol, place) != place:
                found[place][home[symbol]] = symbol
    return found


def plain(symbol):
    return subprocess.run(["c++filt", symbol], check=True, stdout=subprocess.PIPE, text=True).stdout.strip()


def layer_call_faults(part, graph):
    for user, used in sorted((user, used) for user in graph for used in graph[user]):
        upper, lower = layer(part, user), layer(part, used)
        if None not in (upper, lower) and lower < upper:
            yield "%s: %s calls %s of an upper layer: %s" % (part, user, used, plain(graph[user][used]))


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


def circle_faults(part, graph):
    """A line for each circle; a file is named in the shortest one that it is part of."""
    shown = set()
    for start in sorted(graph):
        way = None if start in shown else shortest_circle(graph, start)
        if way:
            shown.update(way)
            steps = ("%s (%s)" % (used, plain(graph[user][used])) for user, used in zip(way, way[1:] + way[:1]))
            yield "%s: calls run in a circle: %s -> %s" % (part, start, " -> ".join(steps))


def begins_with(stem, beginning):
    return stem == beginning or stem.startswith(beginning + "_")


def own_headers(path, defined):
    """The header of the same name; or those of the module, and the public ones that declare what the file defines."""
    own = path.with_suffix(".h")
    part = ROOT / "src/libraries/libcrypto"
    if own.exists() or part not in path.parents:
        return {own.name}
    near = {header.name for header in path.parent.glob("*.h")
            if begins_with(path.stem, header.stem) or begins_with(header.stem, path.stem)}
    symbols = defined.get(str(path.relative_to(part)), set())
    return near | {header for header in PUBLIC if check_exports.declared_in(header) & symbols}


def first_include_faults(defined):
    for path in files("src/*.cpp", "tests/*.cpp"):
        includes = [pathlib.PurePath(name).name
                    for name in re.findall(r'^#include [<"]([^>"]+)[>"]', path.read_text(), flags=re.M)]
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


DIALECT = (
    (re.compile(r"^#ifndef \w+_H_?$", re.M), "an include guard; use #pragma once"),
    (re.compile(r"\bstd::size_t\b"), "std::size_t; write size_t"),
    (re.compile(r"\btemplate <[^>]*\bclass\b"), "template <class; write typename"),
    (re.compile(r"^#include <(?:errno|limits|signal|stddef|stdint|stdio|stdlib|string|time)\.h>", re.M),
     "a header of C; include its C++ form"),
)
# C programs read these too.
C_HEADERS = PUBLIC | {"qel.h", "ldtr.h", "dsutil.h"}


def dialect_faults():
    for path in files("src/*.cpp", "src/*.h", "tests/*.cpp", "tests/*.h", "bench/*.cpp", "bench/*.h", "fuzz/*.cpp",
                      "fuzz/*.h"):
        text = path.read_text()
        for pattern, what in DIALECT:
            for match in pattern.finditer(text) if path.name not in C_HEADERS else ():
                yield "%s:%d: %s" % (path.relative_to(ROOT), text.count("\n", 0, match.start()) + 1, what)


def wide_line_faults():
    """Of code, and of comments wherever they are: the formatter leaves them alone, and reads no scripts."""
    for path in files("src", "bench/*.cpp", "bench/*.h", "examples", "cmake", "fuzz/*.cpp", "fuzz/*.h", "tests",
                      "scripts"):
        if path.name == "page_parts.h" or path.suffix == ".vec":  # text of a page, data
            continue
        for number, line in enumerate(path.read_text(errors="replace").splitlines(), 1):
            if len(line) > 120 and (path.parts[len(ROOT.parts)] != "scripts" or line.lstrip().startswith("#")):
                yield "%s:%d: wider than 120 columns" % (path.relative_to(ROOT), number)


def objects_of(part, build):
    folder = build / part / "CMakeFiles" / (OBJECTS[part] + ".dir")
    objects = {str(path.relative_to(folder).with_suffix("")): path for path in sorted(folder.rglob("*.o"))}
    if not objects:
        sys.exit("check_tree: %s has no object files of %s; build it first" % (build, part))
    # A source that was renamed leaves its object behind.
    return {place: path for place, path in objects.items() if (ROOT / part / place).exists()}


def main():
    build = ROOT / (sys.argv[1] if len(sys.argv) > 1 else "build/release")
    faults = [*include_faults(), *forbidden_call_faults(), *bare_word_faults(), *dialect_faults(),
              *wide_line_faults()]
    for part in LAYERS:
        defined, needed = defined_and_needed(objects_of(part, build))
        graph = calls(defined, needed)
        faults += [*missing_layer_faults(part), *layer_include_faults(part), *layer_call_faults(part, graph),
                   *circle_faults(part, graph)]
        if part == "src/libraries/libcrypto":
            faults += first_include_faults(defined)
    if faults:
        sys.exit("\n".join(faults))


if __name__ == "__main__":
    main()
