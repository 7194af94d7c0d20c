# SPDX-License-Identifier: Apache-2.0
"""What the trials of both servers share: the count of checks, a server's process, the scratch folder, the people of the
sample export under every scheme, and key files that are no good."""
import base64
import contextlib
import os
import pathlib
import re
import shutil
import signal
import subprocess
import sys
import tempfile
import time

import client

ROOT = pathlib.Path(__file__).resolve().parents[3]
BUILD = ROOT / "build/release"
INSTALLED = "LDAPPW_INSTALLED" in os.environ  # the packages are tried, not what was built
LDAPPW = "ldappw" if INSTALLED else BUILD / "bin/ldappw"
SUFFIX = "dc=example,dc=org"
TOP = f"dn: {SUFFIX}\nobjectClass: domain\ndc: example"
MADE = ("aes256", "qveil", "aes192", "aes128", "ssha", "crypt", "sha", "md5")  # the schemes that values are made of
OWN = ("aes256", "qveil", "aes192", "aes128")
NOBODY = dict(user="nobody", group="nogroup", extra_groups=[]) if os.geteuid() == 0 else {}


class Trials:
    """Counts checks. At the first that fails in a step the log of the server is shown."""

    def __init__(self):
        self.passed = self.failed = 0
        self.log, self.shown = None, True

    def step(self, title, log=None):
        print(f"== {title}", flush=True)
        self.log, self.shown = log, False

    def check(self, good, text):
        self.passed, self.failed = self.passed + bool(good), self.failed + (not good)
        if good:
            return
        print(f"FAILED: {text}", flush=True)
        if self.log and not self.shown and self.log.exists():
            lines = self.log.read_text(errors="replace").splitlines()[-40:]
            print(f"-- the end of {self.log}:", *lines, "--", sep="\n")
        self.shown = True

    def equal(self, got, expected, text):
        self.check(got == expected, f"{text}: {got!r}, not {expected!r}")


class Server:
    """A server's process that answers at a port, from its start to the end of a with block. What it writes goes to the
    output, a path."""

    name, port, output, process = None, None, None, None

    def launch(self, command):
        with open(self.output, "ab") as output:
            self.process = subprocess.Popen([str(part) for part in command], stdout=output, stderr=output, **NOBODY)
        return self.wait()

    def wait(self):
        for _ in range(600):
            if self.process is not None and self.process.poll() is not None:
                break
            try:
                client.bind(self.port, "", b"")
                return self
            except OSError:
                time.sleep(0.05)
        raise RuntimeError(f"{self.name} does not answer:\n" + self.output.read_text(errors="replace"))

    def stop(self):
        self.process.send_signal(signal.SIGTERM)
        return self.process.wait(60)

    def __enter__(self):
        return self.start()

    def __exit__(self, *_):
        if self.process.poll() is None:
            self.stop()


def run(*command, text="", codes=(0,), **more):
    """Runs a command to its end; its output, or the two outputs and the code where other codes than 0 are expected."""
    done = subprocess.run([str(part) for part in command], input=text, encoding="utf-8", errors="replace",
                          stdout=subprocess.PIPE, stderr=subprocess.PIPE, timeout=300, **more)
    if codes is not None and done.returncode not in codes:
        sys.exit(f"servers: {command[0]} ended with {done.returncode}: {done.stdout}{done.stderr}")
    return (done.stdout, done.stderr, done.returncode) if codes is None else done.stdout


@contextlib.contextmanager
def scratch():
    """A folder that a server's user can enter, with the built libraries: they may lie where that user cannot read."""
    with tempfile.TemporaryDirectory(prefix="ldappw-servers-") as name:
        folder = pathlib.Path(name)
        folder.chmod(0o711)
        if not INSTALLED:
            shutil.copytree(BUILD / "lib", folder / "lib", symlinks=True)
        yield folder


def own(path):
    if NOBODY:
        for each in (path, *path.rglob("*")):
            shutil.chown(each, "nobody", "nogroup")
    return path


def make_keys(folder):
    """A key file for the servers and one for the tools."""
    path = folder / "dir.stash"
    run(LDAPPW, "keys", "create", "--config", folder / "cfg.stash", "--directory", path, text="aSeedThatNobodyKnows\n")
    own(shutil.copy(path, folder / "server.stash") and folder / "server.stash")
    return path


def blocks(text):
    """The entries of an LDIF text, in its own spelling."""
    return [block for block in re.split(r"\n\n+", text) if re.search(r"^dn:", block, re.M)]


def values(block, name):
    lines = re.findall(rf"^{name}(::?) ?(.*)$", block.replace("\n ", ""), re.M | re.I)
    return [base64.b64decode(value) if colons == "::" else value.encode() for colons, value in lines]


class Person:
    def __init__(self, clear, made):
        self.dn = values(clear, "dn")[0].decode()
        self.uid = values(clear, "uid")[0].decode()
        self.passwords = values(clear, "userpassword")
        self.scheme = next(scheme for scheme in made if all(
            value.lower().startswith(b"{%s}" % scheme.encode()) for value in values(made[scheme], "userpassword")))
        self.block = made[self.scheme]
        self.stored = values(self.block, "userpassword")
        self.others = [values(made[scheme], "userpassword")[0] for scheme in ("ssha", "aes128", "aes256")
                       if scheme != self.scheme and scheme in made]

    def wrong(self):
        """Clear passwords and pieces of stored values, none of which is a password of the person."""
        for password, value in zip(self.passwords, self.stored):
            cut = {"crypt": 8, "qveil": 46}.get(self.scheme, 1 << 30)  # what the scheme looks at
            if len(password) < cut:
                yield password + b"x"
            if 1 < len(password) <= cut:
                yield password[:-1]
            yield bytes([(password or b"\1")[0] ^ 1 or 1]) + password[1:]
            yield password + b"\0"
            yield password + b"\0x"
            payload = value.partition(b"}")[2]
            yield value
            yield payload
            with contextlib.suppress(ValueError):
                yield b"{SHA}" + base64.b64decode(payload, validate=True)[:20]
        yield from self.others


def people(keys):
    """The units of the sample export, and its people: the schemes in turn, AES where another cannot hold a password."""
    sample = ROOT / "samples/directory.ldif"
    clear = blocks(sample.read_text())
    made = {scheme: blocks(run(LDAPPW, "ldif", "--to", scheme, "--in", sample, "--new-keys", keys, codes=(0, 3)))
            for scheme in MADE}
    units = [block for block in clear if not values(block, "userpassword")]
    persons = []
    for at, block in enumerate(clear):
        if values(block, "userpassword"):
            first = MADE[at % len(MADE)]
            order = [first, *(scheme for scheme in MADE if scheme != first)]
            persons.append(Person(block, {scheme: made[scheme][at] for scheme in order}))
    return units, persons


def one_person(uid, value):
    return (f"dn: uid={uid},{SUFFIX}\nobjectClass: inetOrgPerson\nuid: {uid}\ncn: {uid}\nsn: {uid}\n"
            f"userPassword: {value}")


def make_value(scheme, password, keys):
    return run(LDAPPW, "format", "--scheme", scheme, "--keys", keys, text=password + "\n").strip()


def flipped(data, at):
    return data[:at] + bytes([data[at] ^ 0x40]) + data[at + 1:]


def bad_key_files(folder, keys):
    """Key files, what the log says of each, and whether its keys are of use."""
    good = keys.read_bytes()
    contents = {"missing": (None, "No such file or directory"), "empty": (b"", "the file is empty"),
                "damaged": (flipped(good, len(good) - 40), "not a whole key stash file"),
                "shortened": (good[:-1], "not a whole key stash file"),
                "another kind of file": (b"\xff\xff\xff\xff" + good[4:], "not a whole key stash file")}
    for name, (content, reason) in contents.items():
        path = folder / f"{name.replace(' ', '-')}.stash"
        if content is not None:
            path.write_bytes(content)
            own(path).chmod(0o600)
        yield name, path, reason, False
    path = folder / "unreadable.stash"
    path.write_bytes(good)
    path.chmod(0)
    yield "unreadable", path, "Permission denied", False
    (folder / "folder.stash").mkdir()
    yield "a directory", own(folder / "folder.stash"), "Is a directory", False
    os.mkfifo(folder / "pipe.stash", 0o666)
    own(folder / "pipe.stash")
    yield "a pipe", folder / "pipe.stash", "not a regular file", False
    path = folder / "open.stash"
    path.write_bytes(good)
    own(path).chmod(0o644)
    yield "open to others", path, "open to other users (mode 0644); its mode should be 0600", True
