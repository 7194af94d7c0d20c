# SPDX-License-Identifier: Apache-2.0
"""A small LDAP client: what no command line can send, such as passwords with NUL bytes, and fast enough for a load."""
import socket

OK, UNAVAILABLE, BUSY, REFUSED, UNWILLING = 0, 52, 51, 49, 53
PASSWORD_MODIFY = b"1.3.6.1.4.1.4203.1.11.1"


def ber(tag, *parts):
    body = b"".join(parts)
    if len(body) < 128:
        return bytes((tag, len(body))) + body
    size = len(body).to_bytes((len(body).bit_length() + 7) // 8, "big")
    return bytes((tag, 0x80 | len(size))) + size + body


def elements(data):
    """The (tag, content) pairs of a run of elements."""
    at = 0
    while at < len(data):
        tag, size = data[at], data[at + 1]
        at += 2
        if size & 0x80:
            count = size & 0x7F
            size = int.from_bytes(data[at:at + count], "big")
            at += count
        yield tag, data[at:at + size]
        at += size


def number(tag, value):
    return ber(tag, value.to_bytes(value.bit_length() // 8 + 1, "big"))


def bind_request(dn, password):
    return ber(0x60, number(2, 3), ber(4, dn.encode()), ber(0x80, password))


class Connection:
    def __init__(self, port, timeout=30):
        self.socket = socket.create_connection(("127.0.0.1", port), timeout)
        self.socket.setsockopt(socket.IPPROTO_TCP, socket.TCP_NODELAY, 1)
        self.buffer, self.last = b"", 0

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.socket.close()

    def receive(self):
        while True:
            if len(self.buffer) > 6:
                count = self.buffer[1] & 0x7F if self.buffer[1] & 0x80 else 0
                size = int.from_bytes(self.buffer[2:2 + count], "big") if count else self.buffer[1]
                end = 2 + count + size
                if len(self.buffer) >= end:
                    message, self.buffer = self.buffer[2 + count:end], self.buffer[end:]
                    _, (tag, body), *_ = elements(message)
                    return tag, body
            data = self.socket.recv(65536)
            if not data:
                raise ConnectionError("the server closed the connection")
            self.buffer += data

    def ask(self, request):
        """Sends a request; returns the code and the text of its result, and the entries before it."""
        self.last += 1
        self.socket.sendall(ber(0x30, number(2, self.last), request))
        entries = []
        while True:
            tag, body = self.receive()
            if tag == 0x64:
                entries.append(body)
                continue
            (_, code), _, (_, text), *_ = elements(body)
            return int.from_bytes(code, "big"), text.decode(), entries

    def bind(self, dn, password):
        return self.ask(bind_request(dn, password))[0]

    def change(self, dn, attribute, *values):
        """Replaces the values of an attribute."""
        row = ber(0x30, ber(4, attribute.encode()), ber(0x31, *(ber(4, value) for value in values)))
        replace = ber(0x30, ber(0x0A, b"\2"), row)
        return self.ask(ber(0x66, ber(4, dn.encode()), ber(0x30, replace)))[:2]

    def change_password(self, dn, new):
        request = ber(0x30, ber(0x80, dn.encode()), ber(0x82, new))
        return self.ask(ber(0x77, ber(0x80, PASSWORD_MODIFY), ber(0x81, request)))[:2]

    def values(self, dn, attribute):
        search = ber(0x63, ber(4, dn.encode()), ber(0x0A, b"\0"), ber(0x0A, b"\0"), number(2, 0), number(2, 0),
                     ber(1, b"\0"), ber(0x87, b"objectClass"), ber(0x30, ber(4, attribute.encode())))
        _, _, entries = self.ask(search)
        found = []
        for entry in entries:
            _, (_, attributes) = elements(entry)
            for _, row in elements(attributes):
                _, (_, values) = elements(row)
                found += [value for _, value in elements(values)]
        return found


def bind(port, dn, password):
    with Connection(port) as connection:
        return connection.bind(dn, password)
