#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Writes tests/data/derivation.vec: what key derivation must give, computed with Python's hashlib.

A block is U1 xor U2 xor ... with U1 = SHA1(salt || seed || INT(i)) and Uj = SHA1(Uj-1). Run by hand; the output is
committed with it.
"""
import base64
import hashlib
import pathlib
import random
import re
import sys


def block(seed, salt, iterations, index):
    u = hashlib.sha1(salt + seed + index.to_bytes(4, "big")).digest()
    total = int.from_bytes(u, "big")
    for _ in range(1, iterations):
        u = hashlib.sha1(u).digest()
        total ^= int.from_bytes(u, "big")
    return total.to_bytes(20, "big")


def derive(seed, salt, iterations, length):
    blocks = (block(seed, salt, iterations, i + 1) for i in range((length + 19) // 20))
    return b"".join(blocks)[:length]


def main():
    draw = random.Random("ldappw key derivation")
    lines = [
        "# Made by scripts/make/make_derivation_vectors.py with Python %d.%d's hashlib." % sys.version_info[:2],
        "# key: seed, salt, iterations, derived bytes (hexadecimal)",
    ]
    for iterations, length in [(1, 16), (2, 20), (3, 24), (3, 40), (7, 61), (1000, 32), (10000, 33)]:
        seed, salt = draw.randbytes(draw.randrange(1, 40)), draw.randbytes(draw.randrange(1, 20))
        lines.append(f"key {seed.hex()} {salt.hex()} {iterations} {derive(seed, salt, iterations, length).hex()}")
    lines.append("# record: seed, salt (text), sync text, AES-256 key (hexadecimal)")
    for seed, salt in [("abcdefghijkl", "saltsaltsalt"), ("~!" * 8, "!~!~!~!~!~!~"), ("s" * 1016, "another-salt")]:
        sync = base64.b64encode(derive(seed.encode(), salt.encode(), 3, len(seed))).decode()
        lines.append(f"record {seed} {salt} {sync} {derive(seed.encode(), salt.encode(), 10000, 32).hex()}")
    target = pathlib.Path(__file__).resolve().parents[2] / "tests" / "data" / "derivation.vec"
    # A line of more than 120 columns goes on in lines that begin with two blanks.
    target.write_text("".join("\n  ".join(re.findall("^.{1,120}|.{1,118}", line)) + "\n" for line in lines))


if __name__ == "__main__":
    main()
