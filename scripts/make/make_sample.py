#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Makes the sample exports: the people of an invented company, with clear passwords of many kinds.

    scripts/make/make_sample.py                          writes samples/directory.ldif and samples/mixed.ldif again
    scripts/make/make_sample.py --check                  compares them with what would be written
    scripts/make/make_sample.py --entries 100000 --out F writes one larger directory of the same make

The same seed gives the same bytes.
"""
import argparse
import base64
import hashlib
import pathlib
import random
import sys

SEED = 20240607
SUFFIX = "dc=example,dc=org"
GIVEN = "Ada Bela Cleo Dario Edda Fynn Gita Hugo Ines Jaro Kaja Levi Mira Nilo Oona Pavo Rhea Sven Tuva Zoë".split()
FAMILY = "Adler Brandt Castor Dorn Ekberg Falk Grün Hallam Ibsen Jonker Kovač Lindt Moor Nygård Ostrow Pohl Quist".split()
UNITS = ["Foundry", "Harbour", "Observatory", "Paper Mill", "Tannery"]
SHELL = "$(id);`ls` && \"x\" 'y' | tee >> ~/*? # \\n !! %s"
LETTERS = "abcdefghijkmnopqrstuvwxyzABCDEFGHJKLMNPQRSTUVWXYZ23456789"


def word(rng, length, letters=LETTERS):
    return "".join(rng.choice(letters) for _ in range(length)).encode()


def binary(rng, length):
    """Neither text nor like a stored value."""
    return b"\xff" + bytes(rng.randrange(1, 256) for _ in range(length - 1))


# One maker a kind; a person's kind is the number of the entry modulo their count, so that every kind is met often.
KINDS = [
    lambda rng: b"",
    lambda rng: word(rng, 1),
    lambda rng: word(rng, rng.randrange(6, 16)),
    lambda rng: word(rng, 8),
    lambda rng: word(rng, 9),
    lambda rng: word(rng, 46),
    lambda rng: word(rng, 47),
    lambda rng: word(rng, rng.randrange(48, 201)),
    lambda rng: "Grüße-żółw-пароль-密码".encode() + word(rng, 3),
    lambda rng: "é".encode() * rng.randrange(1, 60),
    lambda rng: b"  " + word(rng, 7) + b" ",
    lambda rng: b" ",
    lambda rng: b"{" + word(rng, 9),
    lambda rng: b":" + word(rng, 6),
    lambda rng: b"<" + word(rng, 10),
    lambda rng: SHELL.encode() + word(rng, 2),
    lambda rng: word(rng, 5, "!\"#$%&'()*+,-./;=?@[]^_~") + b"x",
    lambda rng: binary(rng, rng.randrange(2, 40)),
    lambda rng: b"line one\nline two" + word(rng, 2),
    lambda rng: b"\t" + word(rng, 4) + b"\x7f",
]


def is_safe(value):
    """Whether RFC 2849 lets the bytes stand as they are (and no reader could trim them)."""
    plain = all(32 <= byte < 127 for byte in value)
    return plain and not value.endswith(b" ") and value[:1] not in (b" ", b":", b"<")


def fold(line, width, end="\n"):
    parts = [line[:width]] + [" " + line[at:at + width - 1] for at in range(width, len(line), width - 1)]
    return end.join(parts) + end


def attribute(name, value, width=76, end="\n"):
    if isinstance(value, str):
        value = value.encode()
    if is_safe(value):
        return fold(f"{name}: {value.decode()}" if value else f"{name}:", width, end)
    return fold(f"{name}:: {base64.b64encode(value).decode()}", width, end)


def person(rng, number):
    given, family = rng.choice(GIVEN), rng.choice(FAMILY)
    unit, uid = rng.choice(UNITS), f"u{number:06d}"
    # Some exporters do not fold at all, and some fold early.
    width = (76, 76, 1 << 30, 40)[number // 3 % 4]
    text = f"# person {number}\n" if number % 7 == 0 else ""
    text += attribute("dn", f"uid={uid},ou={unit},{SUFFIX}")
    text += "objectClass: inetOrgPerson\n" + f"uid: {uid}\n"
    text += attribute("cn", f"{given} {family}", width) + attribute("sn", family, width)
    if number % 5 == 0:
        text += attribute("description", f"Keeps the books of the {unit}, and the keys to it as well. " * 3, width)
    text += attribute("userPassword", KINDS[number % len(KINDS)](rng), width)
    if number % 11 == 0:
        text += attribute("userpassword", word(rng, 12), width)
    if number % 13 == 0:
        text += attribute("jpegPhoto", bytes(rng.randrange(256) for _ in range(150)), width)
    return text + "\n"


def directory(entries):
    rng = random.Random(SEED)
    yield f"# The people of an invented company.\n# Made by a script from seed {SEED}; this comment is\n  folded.\n"
    yield f"version: 1\n\ndn: {SUFFIX}\nobjectClass: domain\ndc: example\n\n"
    for unit in UNITS:
        yield f"dn: ou={unit},{SUFFIX}\nobjectClass: organizationalUnit\nou: {unit}\n\n"
    for number in range(entries):
        yield person(rng, number)


def digest_values():
    password, salt = b"winter-garden", bytes(range(20))
    sha, md5 = hashlib.sha1(password).digest(), hashlib.md5(password).digest()
    ssha = hashlib.sha1(password + salt).digest() + salt
    return ["{SHA}" + base64.b64encode(sha).decode(), "{ssha}" + base64.b64encode(ssha).decode(),
            "{MD5}" + base64.b64encode(md5).decode()]


def mixed():
    """CRLF, options, one-way values, unknown tags and damage: what an audit has to tell apart."""
    block = base64.b64encode(hashlib.sha256(b"no key opens this").digest()[:16]).decode()
    plain = digest_values() + [
        "{crypt}abYH7TYgEKz2Q",  # "abcdefgh" with the salt "ab"
        "{crypt}$1$saltsalt$UP1c/qh4R.MtWTIkIgxv70",
        "{crypt}$6$rounds=5000$salt$0123456789abcdefghijklmnopqrstuvwxyz",
        "{crypt}$2b$05$abcdefghijklmnopqrstuu5FgBJ9nLrQ5aBG3hpmUlqF7zq1qYkKq",
        "{crypt}_J9..CCCCKP6PiPPmozo",
        "{crypt}too-short",
        "{SHA}AAAA", "{SSHA}c2hvcnQ=", "{MD5}", "{PBKDF2-SHA512}10000$abc$def", "{X-OWN}whatever",
        "{AES256}" + block, "{AES128}not base64", "{AES192}AAAA", "{qVEIL}>1garbage<", "{VLDL}anything",
        ">1untagged-mask<", "plain text", "{half open", "{}empty tag",
    ]
    text = "version: 1\r\n# values of many kinds, lines that end in CR and LF\r\n\r\n"
    for number, value in enumerate(plain):
        text += f"dn: uid=m{number:02d},{SUFFIX}\r\nobjectClass: account\r\n"
        name = "USERPASSWORD;x-tag" if number % 3 == 0 else "userPassword"
        text += attribute(name, value, (76, 30)[number % 2], "\r\n")
        text += "description: kept as it is  \r\n\r\n"
    text += f"dn: uid=url,{SUFFIX}\r\nuserPassword:< file:///etc/hostname\r\n\r\n"
    text += f"dn: uid=bad,{SUFFIX}\r\nuserPassword:: @@@@\r\n\r\n"
    text += f"dn: uid=nul,{SUFFIX}\r\nuserPassword:: YQBi\r\n\r\n"  # "a", NUL, "b"
    text += f"dn: uid=change,{SUFFIX}\r\nchangetype: modify\r\ndelete: userPassword\r\nuserPassword: old one\r\n-\r\n"
    text += "add: userPassword\r\nuserPassword: new one\r\n-\r\n\r\n"
    text += f"dn: uid=last,{SUFFIX}\r\nuser\r\n Password: folded in its name"  # and no line end at the end of the file
    return text


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--entries", type=int, default=320, help="people in the directory")
    parser.add_argument("--out", type=pathlib.Path, help="write the directory here and no other file")
    parser.add_argument("--check", action="store_true", help="write nothing; fail when a sample is not as made here")
    options = parser.parse_args()
    if options.out:
        with open(options.out, "w", encoding="utf-8", newline="") as file:
            file.writelines(directory(options.entries))
        return
    samples = pathlib.Path(__file__).resolve().parents[2] / "samples"
    for name, text in (("directory.ldif", "".join(directory(options.entries))), ("mixed.ldif", mixed())):
        if not options.check:
            (samples / name).write_bytes(text.encode())
        elif (samples / name).read_bytes() != text.encode():
            sys.exit(f"make_sample: samples/{name} is not what this script makes")


if __name__ == "__main__":
    main()
