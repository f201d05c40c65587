"""A peer of the bus that need not behave: it writes and reads the bus's messages itself."""
import functools
import os
import re
import select
import socket
import struct

NAME, PATH, INTERFACE = "com.tarsil.kvragent", "/com/tarsil/kvragent", "com.tarsil.kvragent.KVRAgentProtocol"
BUS = ("org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus")
CALL, RETURN, ERROR, SIGNAL = 1, 2, 3, 4
# Codes of header fields.
ERROR_NAME, REPLY_SERIAL, SIGNATURE = 4, 5, 8
NUMBERS = {"y": "B", "b": "I", "n": "h", "q": "H", "i": "i", "u": "I", "x": "q", "t": "Q", "d": "d"}


def padded(data, to):
    return data + b"\0" * (-len(data) % to)


def text(value):
    return struct.pack("<I", len(value.encode())) + value.encode() + b"\0"


def complete_types(signature):
    """Splits a signature: "sa{sv}" is "s" and "a{sv}"."""
    start = depth = 0
    for end, code in enumerate(signature, 1):
        depth += {"(": 1, "{": 1, ")": -1, "}": -1}.get(code, 0)
        if depth == 0 and code != "a":
            yield signature[start:end]
            start = end


class Reader:
    """Reads values in the bus's encoding."""

    def __init__(self, data):
        self.data, self.at = data, 0

    def align(self, to):
        self.at += -self.at % to

    def take(self, size):
        self.at += size
        return self.data[self.at - size:self.at]

    def read(self, kind):
        code = kind[0]
        if code in NUMBERS:
            size = struct.calcsize(NUMBERS[code])
            self.align(size)
            return struct.unpack("<" + NUMBERS[code], self.take(size))[0]
        if code in "sog":
            found = self.take(self.read("y" if code == "g" else "u")).decode()
            self.at += 1
            return found
        if code == "v":
            return self.read(self.read("g"))
        if code in "({":
            self.align(8)
            return tuple(self.read(one) for one in complete_types(kind[1:-1]))
        return self.read_array(kind[1:])

    def read_array(self, kind):
        size = self.read("u")
        self.align(8 if kind[0] in "({" else {"v": 1, "g": 1}.get(kind[0]) or struct.calcsize(NUMBERS.get(kind[0], "I")))
        if kind == "y":
            return self.take(size)
        end, found = self.at + size, []
        while self.at < end:
            found.append(self.read(kind))
        return dict(found) if kind[0] == "{" else found


class Message:
    """A message as it came. Its parts are read when they are asked for, so that a measurement does not pay for them."""

    def __init__(self, whole, start):
        self.whole, self.kind, self.body = whole, whole[1], whole[start:]

    @property
    def reply_serial(self):
        at = self.whole.find(bytes([REPLY_SERIAL]) + b"\1u\0", 16)
        return struct.unpack("<I", self.whole[at + 4:at + 8])[0] if 0 <= at < len(self.whole) - len(self.body) else None

    @functools.cached_property
    def fields(self):
        reader = Reader(self.whole)
        reader.at = 12
        return dict(reader.read("a(yv)"))

    @property
    def error(self):
        return self.fields.get(ERROR_NAME)

    def values(self):
        reader = Reader(self.body)
        return [reader.read(kind) for kind in complete_types(self.fields.get(SIGNATURE, ""))]


class Peer:
    def __init__(self, address):
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.connect(re.search("path=([^,]*)", address).group(1))
        self.socket.sendall(b"\0AUTH EXTERNAL " + str(os.getuid()).encode().hex().encode() + b"\r\n")
        self.socket.recv(100)
        self.socket.sendall(b"BEGIN\r\n")
        self.unread, self.serial = b"", 0
        self.call(*BUS, "Hello")

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.socket.close()

    def message(self, kind, fields, body=b"", flags=0):
        self.serial += 1
        head = b""
        for code, signature, value in fields:
            head = padded(head, 8) + bytes([code, 1]) + signature.encode() + b"\0"
            head = head + bytes([len(value)]) + value.encode() + b"\0" if signature == "g" else padded(head, 4) + text(value)
        start = struct.pack("<cBBBIII", b"l", kind, flags, 1, len(body), self.serial, len(head))
        return padded(start + head, 8) + body

    def call_message(self, destination, path, interface, member, signature="", body=b""):
        fields = [(1, "o", path), (2, "s", interface), (3, "s", member), (6, "s", destination)]
        return self.message(CALL, fields + ([(8, "g", signature)] if signature else []), body)

    def signal(self, name):
        fields = [(1, "o", "/com/tarsil/NotificationCenter"), (2, "s", "com.tarsil.NotificationCenter"),
                  (3, "s", "Posted"), (8, "g", "s")]
        return self.message(SIGNAL, fields, text(name))

    def send(self, *arguments):
        """Sends a call; the serial number by which its answer is known."""
        self.socket.sendall(self.call_message(*arguments))
        return self.serial

    def call(self, *arguments, limit=60):
        return self.answer(self.send(*arguments), limit)

    def answer(self, serial, limit=60):
        while True:
            message = self.receive(limit)
            if message is None:
                raise SystemExit(f"no answer within {limit} s")
            if message.reply_serial == serial:
                return message

    def receive(self, limit):
        """The next message; none when none comes in time or the bus closes the connection."""
        while True:
            if len(self.unread) >= 16:
                body, _, head = struct.unpack("<III", self.unread[4:16])
                start = 16 + head + -head % 8
                if len(self.unread) >= start + body:
                    whole, self.unread = self.unread[:start + body], self.unread[start + body:]
                    return Message(whole, start)
            if not select.select([self.socket], [], [], limit)[0]:
                return None
            more = self.socket.recv(1 << 16)
            if not more:
                return None
            self.unread += more
