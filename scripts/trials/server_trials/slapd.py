# SPDX-License-Identifier: Apache-2.0
"""The trials of slapd's module."""
import multiprocessing
import os
import pathlib
import random
import re
import signal
import statistics
import subprocess
import time

import client
from common import (INSTALLED, LDAPPW, MADE, NOBODY, OWN, SUFFIX, TOP, Server, bad_key_files, blocks, make_value,
                    one_person, own, people, run)

ROOT_DN, ROOT_PASSWORD, PORT = f"cn=admin,{SUFFIX}", b"of the trials", 38900
SCHEMA = "core cosine inetorgperson".split()
SLAPD = "/usr/sbin/slapd"


def module_folder(folder):
    return "/usr/lib/ldap" if INSTALLED else f"{folder}/lib/ldap"


class Slapd(Server):
    """One server over a scratch database, in one of the two styles of configuration."""

    name, port = "slapd", PORT

    def __init__(self, folder, arguments, style="slapd.conf", more=""):
        self.folder = folder / f"slapd-{len(list(folder.glob('slapd-*')))}"
        self.log = self.output = self.folder / "log"
        for name in ("db", "slapd.d"):
            (self.folder / name).mkdir(parents=True)
        self.module = f"{module_folder(folder)}/pw-ldappw.so {arguments}".strip()
        if style == "slapd.conf":
            (self.folder / "slapd.conf").write_text(self.conf(more))
            self.options = ["-f", self.folder / "slapd.conf"]
        else:
            self.options = ["-F", self.folder / "slapd.d"]
            run(SLAPD, "-T", "add", "-n", "0", *self.options, text=self.config())
        own(self.folder)

    def conf(self, more):
        return "".join(f"include /etc/ldap/schema/{name}.schema\n" for name in SCHEMA) + f"""
modulepath /usr/lib/ldap
moduleload back_mdb
moduleload {self.module}
pidfile {self.folder}/pid
{more}
database mdb
directory {self.folder}/db
maxsize 67108864
dbnosync
suffix {SUFFIX}
rootdn {ROOT_DN}
rootpw {ROOT_PASSWORD.decode()!r}
index uid eq
access to * by users write by * auth
""".replace("'", '"')

    def config(self):
        schema = "".join(f"include: file:///etc/ldap/schema/{name}.ldif\n\n" for name in SCHEMA)
        return f"""dn: cn=config
objectClass: olcGlobal
cn: config

dn: cn=module,cn=config
objectClass: olcModuleList
cn: module
olcModulePath: /usr/lib/ldap
olcModuleLoad: back_mdb
olcModuleLoad: {self.module}

dn: cn=schema,cn=config
objectClass: olcSchemaConfig
cn: schema

{schema}dn: olcDatabase=config,cn=config
objectClass: olcDatabaseConfig
olcDatabase: config
olcRootDN: cn=config
olcRootPW: {ROOT_PASSWORD.decode()}

dn: olcDatabase=mdb,cn=config
objectClass: olcMdbConfig
olcDatabase: mdb
olcDbDirectory: {self.folder}/db
olcDbMaxSize: 67108864
olcDbNoSync: TRUE
olcSuffix: {SUFFIX}
olcRootDN: {ROOT_DN}
olcRootPW: {ROOT_PASSWORD.decode()}
olcDbIndex: uid eq
olcAccess: to * by users write by * auth
"""

    def load(self, *entries):
        (self.folder / "import.ldif").write_text("\n\n".join(entries) + "\n")
        run(SLAPD, "-T", "add", "-q", *self.options, "-l", self.folder / "import.ldif", cwd="/")
        own(self.folder)
        return self

    def command(self):
        return [SLAPD, *map(str, self.options), "-h", f"ldap://127.0.0.1:{PORT}"]

    def start(self):
        return self.launch([*self.command(), "-d", "none"])

    def resident(self):
        return int(re.search(r"VmRSS:\s+(\d+)", pathlib.Path(f"/proc/{self.process.pid}/status").read_text())[1])

    def seconds_used(self):
        fields = pathlib.Path(f"/proc/{self.process.pid}/stat").read_text().rpartition(")")[2].split()
        return (int(fields[11]) + int(fields[12])) / os.sysconf("SC_CLK_TCK")


def refuse(trials, connection, dn, password, text):
    code = connection.bind(dn, password)
    trials.check(code in ((client.REFUSED,) if password else (client.REFUSED, client.UNWILLING)), f"{text}: {code}")


def try_people(trials, persons):
    with client.Connection(PORT) as connection:
        for person in persons:
            for password in filter(None, person.passwords):  # slapd lets nobody bind with an empty one
                code = connection.bind(person.dn, password)
                trials.equal(code, client.OK, f"{person.uid}, {person.scheme}, {password!r}")
            for password in set(person.wrong()) - set(person.passwords):
                refuse(trials, connection, person.dn, password, f"{person.uid}, {person.scheme}, wrong: {password!r}")


def administrator(dn=ROOT_DN):
    connection = client.Connection(PORT)
    if connection.bind(dn, ROOT_PASSWORD) != client.OK:
        raise RuntimeError(f"{dn} cannot bind")
    return connection


# ---- what is tried ----

def imports(trials, folder, units, persons):
    vldl = [one_person("vldl", "{VLDL}whatever"), one_person("vldl2", "{vldl}{SHA}2jmj7l5rSw0yVb/vlWAYkK/YBwk=")]
    for style in ("slapd.conf", "cn=config"):
        server = Slapd(folder, f"keys={folder}/server.stash", style)
        trials.step(f"slapd, {style}: {len(persons)} people of the sample export, right and wrong passwords",
                    server.log)
        server.load(*units, *(person.block for person in persons), *vldl)
        with server:
            try_people(trials, persons)
            for uid in ("vldl", "vldl2"):
                for password in (b"whatever", b"{VLDL}whatever", b"", b"{SHA}2jmj7l5rSw0yVb/vlWAYkK/YBwk="):
                    trials.check(client.bind(PORT, f"uid={uid},{SUFFIX}", password) != client.OK, f"vldl: {password!r}")
            if style == "cn=config":
                changes(trials, persons[7].dn)
            trials.equal(server.stop(), 0, "exit code")
    trials.equal(re.findall("pw-ldappw.*", server.log.read_text()), [], "log lines with good keys")


def changes(trials, dn):
    """Password modify under each hash, and the passwords that a scheme cannot hold."""
    long = b"0123456789" * 10000
    rows = [("{qVEIL}", b"correct horse", True), ("{qVEIL}", b"q" * 46, True), ("{qVEIL}", b"r" * 47, False),
            ("{qVEIL}", b"a\0b", False), ("{VLDL}", b"correct horse", False), ("{AES256}", long, True),
            ("{AES256}", b"a\0b", True), ("{AES256}", b"{SHA}5678901234567890123456789012", True)]
    rows += [(tag, password, True) for tag in ("{AES128}", "{AES192}", "{AES256}")
             for password in (b"x", b"correct horse", b"s" * 16, b"l" * 751, b"l" * 752, "Zoë€".encode())]
    config, admin, user = administrator("cn=config"), administrator(), client.Connection(PORT)
    before = b"the one before"
    trials.equal(admin.change(dn, "userPassword", before)[0], client.OK, "a clear password")
    for tag, password, holds in rows:
        name = f"password modify, {tag}, {len(password)} bytes"
        trials.equal(config.change("olcDatabase={-1}frontend,cn=config", "olcPasswordHash", tag.encode())[0], client.OK,
                     f"hash {tag}")
        code, text = admin.change_password(dn, password)
        trials.check((code == client.OK) == holds, f"{name}: {code} {text}")
        trials.check(admin.values(dn, "userPassword")[0].startswith(tag.encode()) or not holds, f"{name}: stored value")
        trials.equal(user.bind(dn, password), client.OK if holds else client.REFUSED, f"{name}: bind with the new one")
        trials.equal(user.bind(dn, before), client.REFUSED if holds else client.OK, f"{name}: bind with the old one")
        for wrong in (password[:-1] or b"y", password + b"\0", password + b"x", password.partition(b"\0")[0] or b"y"):
            if holds and wrong != password and not (len(password) >= 46 and tag == "{qVEIL}" and len(wrong) > 46):
                trials.equal(user.bind(dn, wrong), client.REFUSED, f"{name}: bind with {wrong[:20]!r}")
        before = password if holds else before


def slappasswd(trials, folder, keys):
    trials.step("slappasswd with the module")
    for scheme in MADE:
        tag = "{qVEIL}" if scheme == "qveil" else "{%s}" % scheme.upper()
        value = run(SLAPD, "-T", "passwd", "-n", "-o", f"module-path={module_folder(folder)}", "-o",
                    f"module-load=pw-ldappw.so keys={keys} schemes={','.join(MADE)}", "-h", tag, "-s", "horse")
        _, _, code = run(LDAPPW, "verify", "--keys", keys, value, text="horse\n", codes=None)
        trials.check(code == 0 and value.lower().startswith("{%s}" % scheme), f"{tag}: {value}")
    unknown = 'pw-ldappw: unknown or repeated argument "%s"; there are keys=FILE and schemes=LIST'
    for arguments, line in (("foo", unknown % "foo"), ("keys=/a keys=/b", unknown % "keys=/b"),
                            ("schemes=qveil,foo", 'pw-ldappw: unknown scheme "foo" in schemes=qveil,foo')):
        server = Slapd(folder, arguments)
        _, error, code = run(*server.command(), "-d", "none", codes=None, **NOBODY)
        trials.check(code != 0 and error.count("pw-ldappw:") == 1 and line in error, f"{arguments}: {code} {error}")


def served_here(trials, folder, units, persons):
    server = Slapd(folder, f"keys={folder}/server.stash schemes={','.join(MADE)}")
    trials.step("slapd: the schemes that it has itself served by the module", server.log)
    # A value that slapd itself would take, and one of a scheme that is left out.
    rows = {"long": run(LDAPPW, "format", "--scheme", "sha512-crypt", text="horse").strip(), "vldl": "{VLDL}horse"}
    server.load(*units, *(person.block for person in persons), *(one_person(*row) for row in rows.items()))
    with server:
        try_people(trials, persons)
        for uid, value in rows.items():
            for password in (b"horse", value.encode()):
                trials.equal(client.bind(PORT, f"uid={uid},{SUFFIX}", password), client.REFUSED, f"{uid}: {password!r}")


def key_files(trials, folder, keys):
    """A server starts whatever its key file is."""
    password = b"correct horse"
    values = {scheme: make_value(scheme, password.decode(), keys) for scheme in (*OWN, "ssha")}
    rows = [("none given", "", "no key file is given (keys=FILE)", False)]
    rows += [(name, f"keys={path}", f"key file {path}: {reason}", good)
             for name, path, reason, good in bad_key_files(folder, keys)]
    for name, arguments, line, good in rows:
        server = Slapd(folder, arguments, more="password-hash {AES256}")
        trials.step(f"slapd, key file: {name}", server.log)
        server.load(TOP, *(one_person(scheme, value) for scheme, value in values.items()))
        server.log.write_text("")
        with server:
            admin = administrator()
            for scheme, value in values.items():
                dn, opens = f"uid={scheme},{SUFFIX}", good or "aes" not in scheme
                trials.equal(client.bind(PORT, dn, password), client.OK if opens else client.REFUSED, scheme)
                trials.equal(client.bind(PORT, dn, value.encode()), client.REFUSED, f"{scheme}: the stored text")
            code, text = admin.change_password(f"uid=ssha,{SUFFIX}", b"new one")
            trials.check((code == client.OK) == good, f"a new password: {code} {text}")
            trials.equal(client.bind(PORT, f"uid=ssha,{SUFFIX}", b"new one"), client.OK if good else client.REFUSED,
                         "bind with the new password")
            trials.equal(server.stop(), 0, "exit code")
        end = "" if good else "; no value of {AES128}, {AES192} or {AES256} will match"
        lines = re.findall("pw-ldappw: .*", server.log.read_text())
        trials.equal(lines, [f"pw-ldappw: {line}{end}"], "the log")
        print(f"   {lines[0] if lines else ''}")


def sasl(trials, folder, keys):
    """SASL checks clear values alone, and takes one with an unregistered tag for clear: the stored text opens it."""
    server = Slapd(folder, f"keys={folder}/server.stash schemes=aes256", more=f"""sasl-secprops none
sasl-realm trials
authz-regexp uid=([^,@]*)[^,]*,.*cn=auth uid=$1,{SUFFIX}
""")
    trials.step("slapd, SASL: the password, and the stored text as the password", server.log)
    opened = {"clear": "horse", "unknown": "{NONE}horse"}
    values = opened | {"vldl": "{VLDL}horse"} | {scheme: make_value(scheme, "horse", keys) for scheme in OWN}
    server.load(TOP, *(one_person(*row) for row in values.items()))
    with server:
        for mechanism in ("PLAIN", "DIGEST-MD5"):
            for uid, value in values.items():
                for password in ("horse", value, value.partition("}")[2] or "none"):
                    out, error, code = run("ldapwhoami", "-Q", "-O", "none", "-H", f"ldap://127.0.0.1:{PORT}", "-Y",
                                           mechanism, "-U", uid, "-w", password, codes=None)
                    trials.equal(code == 0, opened.get(uid) == password,
                                 f"{mechanism}, {uid}, {password}: {out}{error}")


def background(trials, folder, keys):
    server = Slapd(folder, "keys=/none")
    trials.step("slapd in the background", server.log)
    server.load(TOP,
                *(one_person(scheme, make_value(scheme, "horse", keys)) for scheme in OWN))
    with open(server.folder / "start", "w") as start:
        subprocess.run(server.command(), stdout=start, stderr=start, check=True, **NOBODY)
    server.wait()
    for scheme in OWN:
        trials.equal(client.bind(PORT, f"uid={scheme},{SUFFIX}", b"horse"),
                     client.OK if scheme == "qveil" else client.REFUSED, scheme)
    pid = int((server.folder / "pid").read_text())
    os.kill(pid, signal.SIGTERM)
    for _ in range(200):
        if not os.path.exists(f"/proc/{pid}"):
            break
        time.sleep(0.05)
    trials.check(not os.path.exists(f"/proc/{pid}"), "it does not end")
    trials.check("key file /none: No such file" in (server.folder / "start").read_text(), "nothing on standard error")


def leaving(trials, folder, keys):
    """A directory of 1,000 people leaves reversible storage while it serves: export, change records, ldapmodify, binds."""
    server = Slapd(folder, f"keys={folder}/server.stash", more="moduleload argon2")
    trials.step("slapd: 1,000 people go to argon2id by ldapmodify", server.log)
    passwords = {f"uid=p{at},{SUFFIX}": f"horse {at}" for at in range(1000)}
    rows = [one_person(f"p{at}", password) for at, password in enumerate(passwords.values())]
    source = folder / "clear.ldif"
    source.write_text("\n\n".join(rows) + "\n")
    made = {scheme: blocks(run(LDAPPW, "ldif", "--to", scheme, "--new-keys", keys, "--allow-clear", source))
            for scheme in ("clear", "aes256", "qveil", "ssha")}
    server.load(TOP, *(made[list(made)[at % len(made)]][at] for at in range(len(rows))))
    export, changes = folder / "export.ldif", folder / "changes.ldif"
    with server:
        export.write_text(run(SLAPD, "-T", "cat", *server.options))
        _, plan, code = run(LDAPPW, "ldif", "--to", "argon2id", "--keys", keys, "--changes", "--out", changes, export,
                            codes=None)
        trials.check(code == 0 and "now argon2id: clear 250, qveil 250, aes256 250" in plan and
                     "at the next login: ssha 250" in plan, f"the plan: {code} {plan}")
        changed = f"uid=p0,{SUFFIX}"
        passwords[changed] = "changed meanwhile"
        trials.equal(administrator().change(changed, "userPassword", b"changed meanwhile")[0], client.OK, "a change")
        _, error, code = run("ldapmodify", "-c", "-x", "-H", f"ldap://127.0.0.1:{PORT}", "-D", ROOT_DN, "-w",
                             ROOT_PASSWORD.decode(), "-f", changes, codes=None)
        trials.equal((code, error.count("No such attribute")), (16, 1), "ldapmodify, of which one change fails")
        with client.Connection(PORT) as connection:
            for dn, password in passwords.items():
                trials.equal(connection.bind(dn, password.encode()), client.OK, dn)
                refuse(trials, connection, dn, password.encode() + b"x", dn)
        export.write_text(run(SLAPD, "-T", "cat", *server.options))
    _, plan, _ = run(LDAPPW, "ldif", "--to", "argon2id", "--dry-run", export, codes=None)
    trials.check("converted: 1\n" in plan and "done already, kept: 749" in plan, f"a second run: {plan}")
    print("   " + plan.replace("ldappw: ", "").strip().replace("\n", "; "))


# ---- load ----

def bind_until(until, people_of, seed, strict, results):
    """Binds with right and wrong passwords; reports the number of answers and those that are wrong."""
    rng, answers, faults, connection = random.Random(seed), 0, [], None
    while time.monotonic() < until:
        dn, right, wrong = people_of[rng.randrange(len(people_of))]
        good = rng.random() < 0.5
        password = right if good else rng.choice(wrong)
        try:
            connection = connection or client.Connection(PORT)
            code = connection.bind(dn, password)
        except OSError as error:
            if strict:
                faults.append(repr(error))
                break
            connection = None
            time.sleep(0.01)
            continue
        answers += 1
        passing = not strict and code in (client.BUSY, client.UNAVAILABLE)
        if code != (client.OK if good else client.REFUSED) and not passing:
            faults.append(f"{dn} {password!r}: {code}")
    results.put((answers, faults[:5]))


class Clients:
    def __init__(self, count, seconds, persons, strict=True):
        rows = [(person.dn, person.passwords[0], sorted(set(person.wrong()) - set(person.passwords) - {b""}))
                for person in persons if person.passwords[0]]
        until, self.results = time.monotonic() + seconds, multiprocessing.Queue()
        self.processes = [multiprocessing.Process(target=bind_until, args=(until, rows, seed, strict, self.results))
                          for seed in range(count)]
        for process in self.processes:
            process.start()

    def end(self, trials):
        found = [self.results.get(timeout=120) for _ in self.processes]
        for process in self.processes:
            process.join()
        answers, faults = sum(row[0] for row in found), [fault for row in found for fault in row[1]]
        trials.check(not faults and answers > 0, f"{answers} answers, among them {faults[:5]}")
        return answers


def load(trials, folder, units, persons, seconds):
    server = Slapd(folder, f"keys={folder}/server.stash")
    trials.step(f"slapd, 16 clients for {seconds} s, right and wrong passwords", server.log)
    server.load(*units, *(person.block for person in persons))
    with server:
        clients = Clients(16, seconds, persons)
        time.sleep(seconds / 3)
        early = server.resident()
        time.sleep(seconds / 2)
        late = server.resident()
        answers = clients.end(trials)
        trials.check(late - early < 2048, f"memory grew from {early} to {late} KiB")
        trials.equal(server.stop(), 0, "exit code")
    print(f"   {answers} answers, all as they should be; {early} KiB after a third of the time, {late} KiB later")
    restarts = max(3, seconds // 6)
    trials.step(f"slapd, {restarts} restarts while 16 clients bind", server.log)
    clients = Clients(16, restarts * 1.5, persons, strict=False)
    for _ in range(restarts):
        with server:
            time.sleep(1)
            trials.equal(server.stop(), 0, "exit code under load")
    print(f"   {clients.end(trials)} answers, all as they should be")


SLICE = 0.3  # seconds: short, so that what else the machine does falls on all schemes alike
COMPARED = ("ssha", "aes256", "qveil")


def bind_in_slices(start, rounds, results):
    """Binds under one scheme a slice, in turn; reports the count of each slice."""
    requests = [client.bind_request(f"uid={scheme},{SUFFIX}", b"correct horse") for scheme in COMPARED]
    counts = [0] * (rounds * len(requests))
    with client.Connection(PORT) as connection:
        time.sleep(max(0, start - time.monotonic()))
        while (at := int((time.monotonic() - start) / SLICE)) < len(counts):
            if connection.ask(requests[at % len(requests)])[0] != client.OK:
                raise RuntimeError(f"{COMPARED[at % len(requests)]}: cannot bind")
            counts[at] += 1
    results.put(counts)


def compare_rates(trials, folder, keys, rounds):
    server = Slapd(folder, f"keys={folder}/server.stash")
    trials.step(f"slapd, binds a second: {rounds} rounds in turn, 4 clients", server.log)
    values = {"ssha": run(SLAPD, "-T", "passwd", "-n", "-h", "{SSHA}", "-s", "correct horse").strip()}
    values |= {scheme: make_value(scheme, "correct horse", keys) for scheme in COMPARED[1:]}
    server.load(TOP, *(one_person(*row) for row in values.items()))
    used = {scheme: 0 for scheme in COMPARED}
    with server:
        start, results = time.monotonic() + 0.5, multiprocessing.Queue()
        clients = [multiprocessing.Process(target=bind_in_slices, args=(start, rounds, results)) for _ in range(4)]
        for process in clients:
            process.start()
        for at in range(rounds * len(COMPARED) + 1):
            time.sleep(max(0, start + at * SLICE - time.monotonic()))
            now = server.seconds_used()
            if at > 0:
                used[COMPARED[(at - 1) % len(COMPARED)]] += now - before
            before = now
        counts = [sum(row) for row in zip(*(results.get(timeout=60) for _ in clients))]
        for process in clients:
            process.join()
    by_scheme = {scheme: counts[at::len(COMPARED)] for at, scheme in enumerate(COMPARED)}
    for scheme in COMPARED[1:]:
        ratios = [mine / theirs for mine, theirs in zip(by_scheme[scheme], by_scheme["ssha"])]
        cost = used[scheme] / sum(by_scheme[scheme]) / (used["ssha"] / sum(by_scheme["ssha"]))
        quartiles = statistics.quantiles(ratios, n=4)
        print(f"   {scheme}: {statistics.median(ratios):.3f} of the binds a second of {{SSHA}} (half of the rounds "
              f"from {quartiles[0]:.3f} to {quartiles[2]:.3f}), {cost:.3f} of its processor time a bind")


def trials_of_slapd(trials, folder, keys, short):
    units, persons = people(keys)
    own_schemes = [person for person in persons if person.scheme in OWN]
    slappasswd(trials, folder, keys)
    imports(trials, folder, units, persons)
    served_here(trials, folder, units, persons)
    if INSTALLED:
        return
    key_files(trials, folder, keys)
    sasl(trials, folder, keys)
    leaving(trials, folder, keys)
    background(trials, folder, keys)
    load(trials, folder, units, own_schemes, 10 if short else 60)
    compare_rates(trials, folder, keys, 10 if short else 60)
