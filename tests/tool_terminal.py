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
    """A command on a terminal of its own."""

    def __init__(self, *arguments, shell=None):
        self.seen = b""
        # The slave stays open here: the terminal's mode can be read after the command has gone.
        self.master, self.slave = pty.openpty()
        self.pid = os.fork()
        if self.pid == 0:
            os.setsid()
            own = os.open(os.ttyname(self.slave), os.O_RDWR)
            for descriptor in range(3):
                os.dup2(own, descriptor)
            os.closerange(3, 256)
            command = ["bash", "-c", shell] if shell else [TOOL, *arguments]
            os.execvp(command[0], command)

    def echo(self):
        flags = termios.tcgetattr(self.slave)[3]
        return bool(flags & termios.ECHO), bool(flags & termios.ICANON)

    def until(self, text):
        while text not in self.seen:
            assert select.select([self.master], [], [], PATIENCE)[0], f"{text!r} did not come, but {self.seen!r}"
            self.seen += os.read(self.master, 4096)
        self.seen = self.seen.partition(text)[2]

    def type(self, text):
        os.write(self.master, text)

    def end(self):
        deadline = time.monotonic() + PATIENCE
        status = None
        while status is None:
            assert time.monotonic() < deadline, f"the command does not end: {self.seen!r}"
            pid, code = os.waitpid(self.pid, os.WNOHANG)
            status = code if pid else None
            while select.select([self.master], [], [], 0.01)[0]:
                self.seen += os.read(self.master, 65536)
        left = self.echo()
        os.close(self.slave)
        os.close(self.master)
        return os.waitstatus_to_exitcode(status), left


def stored(password):
    return subprocess.run([TOOL, "format", "--scheme", "ssha"], input=password + b"\n", check=True,
                          capture_output=True).stdout.decode().strip()


def verify_prompt(typed, password, expected):
    terminal = Terminal("verify", stored(password))
    terminal.until(b"Password: ")
    assert terminal.echo() == (False, False), "echo is on while a password is typed"
    for start in range(0, len(typed), 500):  # a terminal takes only so much at once
        terminal.type(typed[start:start + 500])
        time.sleep(0.01)
    code, left = terminal.end()
    assert code == expected, (typed[:40], code, terminal.seen)
    assert left == (True, True), "echo stays off"
    assert password == b"" or password not in terminal.seen, "the password was shown"


def ended_by(number, send):
    terminal = Terminal("verify", stored(b"secret"))
    terminal.until(b"Password: ")
    terminal.type(b"sec")
    send(terminal)
    code, left = terminal.end()
    assert code == -number, (number, code)
    assert left == (True, True), f"echo stays off after signal {number}"


def suspended():
    terminal = Terminal(shell=f"set -m; '{TOOL}' verify '{stored(b'secret')}'; echo stopped; read -r; "
                              "fg >/dev/null; echo rc=$?")
    terminal.until(b"Password: ")
    terminal.type(b"\x1a")
    terminal.until(b"stopped")
    assert terminal.echo()[0], "echo stays off while suspended"
    terminal.type(b"\n")
    terminal.until(b"Password: ")
    assert terminal.echo() == (False, False), "echo comes back on when it goes on"
    terminal.type(b"secret\n")
    terminal.until(b"rc=0")
    assert terminal.end()[1] == (True, True)


def create_keys(second, expected):
    with tempfile.TemporaryDirectory() as folder:
        config, directory = os.path.join(folder, "c"), os.path.join(folder, "d")
        terminal = Terminal("keys", "create", "--config", config, "--directory", directory)
        terminal.until(b"Seed: ")
        terminal.type(b"correct-horse-battery\n")
        terminal.until(b"Seed again: ")
        terminal.type(second)
        code, left = terminal.end()
        assert (code, left) == (expected, (True, True)), (code, left, terminal.seen)
        assert len(os.listdir(folder)) == (2 if expected == 0 else 0)
        assert b"horse" not in terminal.seen


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

for row in TYPED:
    verify_prompt(row[0], row[1], row[2])
ended_by(signal.SIGINT, lambda terminal: terminal.type(b"\x03"))
ended_by(signal.SIGQUIT, lambda terminal: terminal.type(b"\x1c"))
for sent in (signal.SIGTERM, signal.SIGHUP):
    ended_by(sent, lambda terminal, sent=sent: os.kill(terminal.pid, sent))
suspended()
create_keys(b"correct-horse-battery\n", 0)
create_keys(b"correct-horse-batterY\n", 2)
print("terminal: all well")
