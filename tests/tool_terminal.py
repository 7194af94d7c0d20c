#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Types at the command's prompts on a pseudo terminal: tool_terminal.py PATH-OF-LDAPPW.

Echo has to be off while a secret is typed and on afterwards, however the command ends.
"""
import os
import pty
import select
import signal
import subprocess
import sys
import tempfile
import termios
import time

TOOL = os.path.abspath(sys.argv[1])
PATIENCE = 60  # seconds until something that should come counts as missing


class Terminal:
    """A command on a terminal of its own. Whatever goes wrong, nothing is waited for without an end, and the command
    does not outlive the test."""

    def __init__(self, *arguments, shell=None):
        self.seen = b""
        # The slave stays open here: the terminal's mode can be read after the command has gone.
        self.master, self.slave = pty.openpty()
        os.set_blocking(self.master, False)
        self.pid = os.fork()
        if self.pid == 0:
            os.setsid()
            for number in (signal.SIGINT, signal.SIGQUIT, signal.SIGHUP):  # a shell may have them ignored
                signal.signal(number, signal.SIG_DFL)
            own = os.open(os.ttyname(self.slave), os.O_RDWR)
            for descriptor in range(3):
                os.dup2(own, descriptor)
            os.closerange(3, 256)
            command = ["bash", "-c", shell] if shell else [TOOL, *arguments]
            os.execvp(command[0], command)

    def __enter__(self):
        return self

    def __exit__(self, *_):
        os.close(self.slave)
        os.close(self.master)
        if self.pid:
            os.kill(self.pid, signal.SIGKILL)
            os.waitpid(self.pid, 0)

    def echo(self):
        flags = termios.tcgetattr(self.slave)[3]
        return bool(flags & termios.ECHO), bool(flags & termios.ICANON)

    def read(self, patience):
        if not select.select([self.master], [], [], patience)[0]:
            return False
        self.seen += os.read(self.master, 65536)
        return True

    def until(self, text):
        while text not in self.seen:
            assert self.read(PATIENCE), f"{text!r} did not come, but {self.seen!r}"
        self.seen = self.seen.partition(text)[2]

    def asks(self, prompt):
        self.until(prompt)
        assert self.echo() == (False, False), "echo is on while a secret is typed"

    def type(self, text):
        deadline = time.monotonic() + PATIENCE
        while text:
            assert time.monotonic() < deadline, f"nobody reads what is typed: {self.seen[:200]!r}"
            if select.select([], [self.master], [], 0.1)[1]:  # a terminal takes only so much at once
                text = text[os.write(self.master, text[:256]):]
            while self.read(0):
                pass

    def end(self):
        """The exit code and the modes that are left."""
        deadline = time.monotonic() + PATIENCE
        while self.pid:
            assert time.monotonic() < deadline, f"the command does not end: {self.seen[:200]!r}"
            pid, status = os.waitpid(self.pid, os.WNOHANG)
            if pid:
                self.pid = 0
            while self.read(0.01):
                pass
        return os.waitstatus_to_exitcode(status), self.echo()


def stored(password):
    return subprocess.run([TOOL, "format", "--scheme", "ssha", "--allow-empty"], input=password + b"\n", check=True,
                          capture_output=True).stdout.decode().strip()


def verify_prompt(typed, password, expected):
    with Terminal("verify", stored(password)) as terminal:
        terminal.asks(b"Password: ")
        terminal.type(typed)
        code, left = terminal.end()
        assert (code, left) == (expected, (True, True)), (code, left, terminal.seen)
        assert password == b"" or password not in terminal.seen, "the password was shown"


def ended_by(number, send):
    with Terminal("verify", stored(b"secret")) as terminal:
        terminal.asks(b"Password: ")
        terminal.type(b"sec")
        send(terminal)
        code, left = terminal.end()
        assert (code, left) == (-number, (True, True)), (code, left)


def suspended():
    # The prompt goes to the terminal, whatever has the messages.
    verify = f"'{TOOL}' verify '{stored(b'secret')}' 2>/dev/null"
    shell = f"set -m; {verify}; echo stopped; read -r; fg >/dev/null; echo rc=$?"
    with Terminal(shell=shell) as terminal:
        terminal.asks(b"Password: ")
        terminal.type(b"\x1a")
        terminal.until(b"stopped")
        assert terminal.echo()[0], "echo stays off while suspended"
        terminal.type(b"\n")
        terminal.asks(b"Password: ")
        terminal.type(b"secret\n")
        terminal.until(b"rc=0")
        assert terminal.end()[1] == (True, True)


def create_keys(second, expected):
    with tempfile.TemporaryDirectory() as folder:
        config, directory = os.path.join(folder, "c"), os.path.join(folder, "d")
        with Terminal("keys", "create", "--config", config, "--directory", directory) as terminal:
            terminal.asks(b"Seed: ")
            terminal.type(b"correct-horse-battery\n")
            terminal.asks(b"Seed again: ")
            terminal.type(second)
            code, left = terminal.end()
            assert (code, left) == (expected, (True, True)), (code, left, terminal.seen)
            assert len(os.listdir(folder)) == (2 if expected == 0 else 0)
            assert b"horse" not in terminal.seen


def format_one():
    """One password is asked for twice, and its value shown."""
    for typed, again, code, shown in ((b"secret", b"secret", 0, b"{SHA}5en6G6MezRroT3XKqkdPOmY/BfQ="),
                                      (b"secret", b"secreT", 2, b"the second password"), (b"", b"", 3, b"is empty")):
        with Terminal("format", "--scheme", "sha") as terminal:
            for prompt, answer in ((b"Password: ", typed), (b"Password again: ", again)):
                terminal.asks(prompt)
                terminal.type(answer + b"\n")
            assert terminal.end() == (code, (True, True)) and shown in terminal.seen, terminal.seen


def from_file():
    """A file is read and nothing is asked, on a terminal too."""
    with tempfile.NamedTemporaryFile() as file:
        file.write(b"secret\n")
        file.flush()
        with Terminal("verify", stored(b"secret"), "--password-file", file.name) as terminal:
            assert terminal.end()[0] == 0 and terminal.seen.strip() == b"match", terminal.seen


def progress():
    """A line that goes away again; none where results go to the same terminal."""
    if "ldif" not in subprocess.run([TOOL, "--help"], check=True, capture_output=True, text=True).stdout:
        return
    with tempfile.TemporaryDirectory() as folder:
        export = os.path.join(folder, "in")
        with open(export, "w", encoding="ascii") as file:
            file.write("dn: a\nuserPassword: secret\n\n" * 40000)
        for results, shown in (("--out " + os.path.join(folder, "out"), True), ("", False)):
            with Terminal(shell=f"'{TOOL}' ldif --to sha --in {export} {results}") as terminal:
                code = terminal.end()[0]
                assert code == 0 and (b" entries, " in terminal.seen) == shown, (code, terminal.seen[:200])
                assert terminal.seen.count(b"\r\x1b[K") >= 2 or not shown, "the progress line stays"


TYPED = [
    (b"secret\n", b"secret", 0),
    (b"Secret\n", b"secret", 1),
    (b"secrex\x7ft\n", b"secret", 0),  # erase
    (b"\x7fsecr\xe2\x82\xac\x7fet\n", b"secret", 0),  # erase takes a whole character
    (b"wrong\x15secret\n", b"secret", 0),  # kill
    (b"secret\x04", b"secret", 0),  # the end of the input ends a line
    (b"\n", b"", 0),
    (b"\x04", b"secret", 2),
    (b"x" * 10000 + b"\n", b"x" * 10000, 0),
]
TESTS = [
    *[(verify_prompt, *row) for row in TYPED],
    (ended_by, signal.SIGINT, lambda terminal: terminal.type(b"\x03")),
    (ended_by, signal.SIGQUIT, lambda terminal: terminal.type(b"\x1c")),
    (ended_by, signal.SIGTERM, lambda terminal: os.kill(terminal.pid, signal.SIGTERM)),
    (ended_by, signal.SIGHUP, lambda terminal: os.kill(terminal.pid, signal.SIGHUP)),
    (suspended,),
    (create_keys, b"correct-horse-battery\n", 0),
    (create_keys, b"correct-horse-batterY\n", 2),
    (format_one,),
    (from_file,),
    (progress,),
]

failures = 0
for test, *row in TESTS:
    try:
        test(*row)
    except AssertionError as failure:
        failures += 1
        print(f"FAIL: {test.__name__} {str(row)[:60]}: {failure}", file=sys.stderr)
sys.exit(failures > 0)
