# SPDX-License-Identifier: Apache-2.0
"""The trials of 389 Directory Server's plug-in."""
import os
import pathlib
import re
import shutil
import threading

import client
from common import (INSTALLED, LDAPPW, NOBODY, OWN, ROOT, SUFFIX, TOP, Server, bad_key_files, make_value, one_person,
                    own, people, run)

MANAGER, PASSWORD, PORT = "cn=manager", "of the trials", 38990
DATA = pathlib.Path("/usr/share/dirsrv/data")
ENTRIES = DATA / "ldappw-schemes.ldif" if INSTALLED else ROOT / "src/integrations/ldappw-schemes.ldif"
FOLDERS = "config db run lock tmp log ldif bak inst".split()
# In the foreground, with all that the server logs by itself; -d 0 would log nothing.
FOREGROUND = ("-d", "266354688")
TAGS = {"qveil": "qVEIL"} | {scheme: scheme.upper() for scheme in ("aes128", "aes192", "aes256", "vldl")}


class Server389(Server):
    """One instance in a scratch folder, made of the server's own templates."""

    name, port = "389", PORT

    def __init__(self, folder, keys, registered=True):
        self.folder = folder / f"389-{len(list(folder.glob('389-*')))}"
        self.log, self.output = self.folder / "log/errors", self.folder / "output"
        for name in FOLDERS:
            (self.folder / name).mkdir(parents=True)
        shutil.copytree("/etc/dirsrv/schema", self.folder / "config/schema")
        for name in ("slapd-collations.conf", "certmap.conf"):
            shutil.copy(f"/etc/dirsrv/config/{name}", self.folder / "config")
        self.entries = ENTRIES.read_text()
        if not INSTALLED:
            self.entries = self.entries.replace("pluginPath: ", f"pluginPath: {folder}/lib/dirsrv/plugins/")
        self.entries = re.sub("keys=.*", f"keys={keys}", self.entries) if keys else re.sub(
            "nsslapd-pluginarg0.*\n", "", self.entries)
        text = self.template("template-dse.ldif") + self.template("template-suffix-db.ldif")
        if registered:  # among the other storage schemes: at the end of the file the server does not take them
            schemes = re.sub("(?m)^#.*\n", "", self.entries)
            text = text.replace("dn: cn=SSHA,cn=Password", f"{schemes}\n\ndn: cn=SSHA,cn=Password", 1)
        text = text.replace(f"nsslapd-port: {PORT}", f"nsslapd-port: {PORT}\nnsslapd-listenhost: 127.0.0.1")
        (self.folder / "config/dse.ldif").write_text(re.sub("\n{3,}", "\n\n", text))
        own(self.folder)

    def template(self, name):
        known = {"ds_port": PORT, "ds_user": NOBODY.get("user", os.environ.get("USER", "")), "rootdn": MANAGER,
                 "ds_passwd": run(LDAPPW, "format", "--scheme", "ssha", text=PASSWORD + "\n").strip(),
                 "ds_suffix": SUFFIX, "ds_bename": "userRoot", "fqdn": "localhost", "db_lib": "bdb",
                 "ldapi_enabled": "off", "ldapi_autobind": "off", "ldapi": self.folder / "run/ldapi",
                 "schema_dir": self.folder / "config/schema", "cert_dir": self.folder / "config",
                 "db_home_dir": self.folder / "db"}
        text = re.sub("(?m)^#.*\n", "", (DATA / name).read_text())
        folder = lambda name: self.folder / name.removesuffix("_dir")
        return re.sub(r"%(\w+)%", lambda match: str(known.get(match[1], folder(match[1]))), text) + "\n\n"

    def load(self, *entries):
        path = self.folder / "ldif/import.ldif"
        path.write_text("version: 1\n\n" + "\n\n".join(entries) + "\n")
        own(self.folder / "ldif")
        run("ns-slapd", "ldif2db", "-D", self.folder / "config", "-n", "userRoot", "-i", path, cwd="/", **NOBODY)
        return self

    def start(self):
        command = ["ns-slapd", "-D", self.folder / "config", "-i", self.folder / "run/pid", *FOREGROUND]
        return self.launch(command)

    def lines(self):
        """What the plug-in has logged."""
        return re.findall("ldappw-pwdstorage - (.*)", self.log.read_text()) if self.log.exists() else []


def manager():
    connection = client.Connection(PORT)
    if connection.bind(MANAGER, PASSWORD.encode()) != client.OK:
        raise RuntimeError("the manager cannot bind")
    return connection


def is_text(password):
    try:
        return password.decode() is not None
    except UnicodeDecodeError:
        return False


def imports(trials, folder, units, persons):
    """Wrong passwords first: after a right one the value is another."""
    server = Server389(folder, folder / "server.stash")
    trials.step(f"389: {len(persons)} people of the sample export, right and wrong passwords, upgrade", server.log)
    server.load(*units, *(person.block for person in persons), one_person("vldl", "{VLDL}whatever"))
    upgraded = 0
    with server, manager() as admin, client.Connection(PORT) as user:
        for person in persons:
            # The server hands passwords over as C text: it cuts what comes after a NUL, and so does every scheme there.
            for password in {each.partition(b"\0")[0] for each in person.wrong()} - set(person.passwords):
                code = user.bind(person.dn, password)
                trials.check(code != client.OK, f"{person.uid}, {person.scheme}, wrong: {password!r}: {code}")
            before = admin.values(person.dn, "userPassword")
            trials.equal(sorted(before), sorted(person.stored), f"{person.uid}: values before a bind")
            for password in filter(None, person.passwords[:1]):
                trials.equal(user.bind(person.dn, password), client.OK, f"{person.uid}, {person.scheme}, {password!r}")
                trials.equal(user.bind(person.dn, password), client.OK, f"{person.uid}, {person.scheme}, again")
                trials.check(user.bind(person.dn, b"\1" + password[1:]) != client.OK, f"{person.uid}: wrong afterwards")
            after = admin.values(person.dn, "userPassword")
            upgraded += any(value.startswith(b"{PBKDF2") for value in after)
            # The server makes no value of a password that is not text.
            if person.scheme in OWN and person.passwords[0] and len(before) == 1 and is_text(person.passwords[0]):
                trials.check(after[0].startswith(b"{PBKDF2"), f"{person.uid}: {after[0][:20]} after a bind")
        for password in (b"whatever", b"{VLDL}whatever", b""):
            trials.check(user.bind(f"uid=vldl,{SUFFIX}", password) != client.OK, f"vldl: {password!r}")
        trials.equal(server.stop(), 0, "exit code")
    print(f"   {upgraded} of {len(persons)} turned into PBKDF2 at the first bind")
    trials.equal(server.lines(), [], "log lines with good keys")


def added_over_ldap(trials, folder, keys):
    """The entries are added to a running server, which takes them at its next start."""
    server = Server389(folder, folder / "server.stash", registered=False)
    trials.step("389: entries added over LDAP, and storing under each scheme", server.log)
    server.load(TOP, one_person("user", make_value("ssha", "the one before", keys)))
    dn = f"uid=user,{SUFFIX}"
    with server:
        run("ldapadd", "-x", "-H", f"ldap://127.0.0.1:{PORT}", "-D", MANAGER, "-w", PASSWORD, text=server.entries)
        trials.equal(server.stop(), 0, "exit code")
    rows = [("qveil", b"correct horse", True), ("qveil", b"q" * 46, True), ("qveil", b"r" * 47, False),
            ("vldl", b"correct horse", False)]
    rows += [(scheme, password, True) for scheme in ("aes128", "aes192", "aes256")
             for password in (b"x", b"correct horse", b"l" * 752, "Zoë€".encode())]
    with server, manager() as admin, client.Connection(PORT) as user:
        before = b"the one before"
        for scheme, password, holds in rows:
            name = f"{scheme}, {len(password)} bytes"
            code, text = admin.change("cn=config", "passwordStorageScheme", TAGS[scheme].encode())
            trials.equal(code, client.OK, f"{name}: set: {text}")
            code, text = admin.change(dn, "userPassword", password)
            trials.check((code == client.OK) == holds, f"{name}: {code} {text}")
            value = admin.values(dn, "userPassword")[0]
            trials.check(value.startswith(b"{%s}" % TAGS[scheme].encode()) or not holds, f"{name}: {value[:20]}")
            trials.check((user.bind(dn, password) == client.OK) == holds, f"{name}: bind with the new one")
            trials.check((user.bind(dn, before) == client.OK) != holds, f"{name}: bind with the old one")
            trials.check(user.bind(dn, value) != client.OK, f"{name}: bind with the stored text")
            before = password if holds else before
        trials.equal(server.stop(), 0, "exit code")
    refused = {line.partition(":")[0] for line in server.lines()}
    trials.equal(refused, {"{qVEIL}", "{VLDL}"}, "the log of what was refused")


def key_files(trials, folder, keys, short):
    password = b"correct horse"
    values = {scheme: make_value(scheme, password.decode(), keys) for scheme in (*OWN, "ssha")}
    rows = [("none given", "", "no key file is given (keys=FILE)", False)]
    rows += [(name, path, f"key file {path}: {reason}", good)
             for name, path, reason, good in bad_key_files(folder, keys)]
    for name, path, line, good in rows[:3] + rows[-1:] if short else rows:
        server = Server389(folder, path)
        trials.step(f"389, key file: {name}", server.log)
        server.load(TOP, *(one_person(scheme, value) for scheme, value in values.items()))
        server.log.unlink()
        with server:
            for scheme, value in values.items():
                dn, opens = f"uid={scheme},{SUFFIX}", good or "aes" not in scheme
                trials.check(client.bind(PORT, dn, value.encode()) != client.OK, f"{scheme}: the stored text")
                trials.equal(client.bind(PORT, dn, password), client.OK if opens else client.REFUSED, scheme)
            trials.equal(server.stop(), 0, "exit code")
        expected = [line if good else f"{line}; no value of {{{scheme}}} will match"
                    for scheme in ("AES128", "AES192", "AES256")]
        trials.equal(sorted(server.lines()), sorted(expected), "the log")
        print("\n".join(f"   ldappw-pwdstorage - {text}" for text in server.lines()[:1]))


def disabled_entry(trials, folder, keys):
    """A running server closes the plug-in of an entry that is disabled, while others bind under the other entries."""
    schemes, password = ("aes128", "aes192", "aes256"), b"correct horse"
    server = Server389(folder, folder / "server.stash")
    trials.step("389: one entry disabled and enabled again while users bind", server.log)
    server.load(TOP, *(one_person(scheme, make_value(scheme, password.decode(), keys)) for scheme in schemes))
    codes, ends = [], threading.Event()

    def bind_on():
        with client.Connection(PORT) as user:
            while not ends.is_set():
                codes.append(user.bind(f"uid=aes256,{SUFFIX}", password))

    with server, manager() as admin:
        for attribute, value in ((b"nsslapd-enable-upgrade-hash", b"off"), (b"nsslapd-dynamic-plugins", b"on")):
            trials.equal(admin.change("cn=config", attribute.decode(), value)[0], client.OK, f"{attribute} set")
        threads = [threading.Thread(target=bind_on) for _ in range(4)]
        for thread in threads:
            thread.start()
        for state in (b"off", b"on") * 3:
            entry = "cn=AES128,cn=Password Storage Schemes,cn=plugins,cn=config"
            trials.equal(admin.change(entry, "nsslapd-pluginEnabled", state)[0], client.OK, f"AES128 {state}")
            for scheme in schemes[state == b"off":]:
                trials.equal(client.bind(PORT, f"uid={scheme},{SUFFIX}", password), client.OK,
                             f"{scheme} while AES128 is {state}")
        ends.set()
        for thread in threads:
            thread.join()
        trials.check(len(codes) > 100 and set(codes) == {client.OK}, f"{len(codes)} binds: {set(codes)}")
        trials.equal(server.stop(), 0, "exit code")
    trials.equal(server.lines(), [], "log lines")


def refusals(trials, folder):
    server = Server389(folder, "/none")
    trials.step("389: an unknown argument", server.log)
    path = server.folder / "config/dse.ldif"
    path.write_text(path.read_text().replace("keys=/none", "foo", 1))
    try:
        server.start().stop()
        trials.check(False, "the server starts")
    except RuntimeError as error:
        trials.check('unknown or repeated argument "foo"; there is keys=FILE' in str(error), f"it says {error}")


def trials_of_389(trials, folder, keys, short):
    units, persons = people(keys)
    imports(trials, folder, units, persons[:40] if short else persons)
    added_over_ldap(trials, folder, keys)
    if INSTALLED:
        return
    disabled_entry(trials, folder, keys)
    key_files(trials, folder, keys, short)
    refusals(trials, folder)
