"""MessagePack-RPC, as much of it as asks the daemon a question."""

import socket
import struct


class Error(Exception):
    pass


class Connection:
    def __init__(self, path, seconds=20.0):
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.settimeout(seconds)
        self.stream = None
        try:
            self.socket.connect(str(path))
        except OSError:
            self.socket.close()
            raise
        self.stream = self.socket.makefile("rb")

    def close(self):
        self.stream.close()
        self.socket.close()

    def call(self, method):
        """The result of a request without arguments."""
        name = method.encode()
        self.socket.sendall(bytes([0x94, 0x00, 0x01, 0xA0 | len(name)]) + name + b"\x90")
        try:
            _, _, error, result = self.read()
        except (TimeoutError, struct.error, ValueError) as problem:
            raise Error(f"{method}: no answer ({problem})") from problem
        if error is not None:
            raise Error(f"{method}: {error}")
        return result

    def number(self, form):
        return struct.unpack(">" + form, self.stream.read(struct.calcsize(form)))[0]

    def read(self):
        tag = self.number("B")
        if tag <= 0x7F:
            return tag
        if tag >= 0xE0:
            return tag - 0x100
        if tag <= 0x8F:
            return self.read_map(tag & 0x0F)
        if tag <= 0x9F:
            return self.read_array(tag & 0x0F)
        if tag <= 0xBF:
            return self.read_text(tag & 0x1F)
        if tag in CONSTANTS:
            return CONSTANTS[tag]
        if tag in NUMBERS:
            return self.number(NUMBERS[tag])
        if tag in LENGTHS:
            form, reader = LENGTHS[tag]
            return getattr(self, reader)(self.number(form))
        raise ValueError(f"unexpected byte 0x{tag:02X}")

    def read_map(self, count):
        return {self.read(): self.read() for _ in range(count)}

    def read_array(self, count):
        return [self.read() for _ in range(count)]

    def read_text(self, length):
        return self.stream.read(length).decode(errors="replace")


CONSTANTS = {0xC0: None, 0xC2: False, 0xC3: True}
NUMBERS = {0xCA: "f", 0xCB: "d", 0xCC: "B", 0xCD: "H", 0xCE: "I", 0xCF: "Q",
           0xD0: "b", 0xD1: "h", 0xD2: "i", 0xD3: "q"}
LENGTHS = {0xC4: ("B", "read_text"), 0xC5: ("H", "read_text"), 0xC6: ("I", "read_text"),
           0xD9: ("B", "read_text"), 0xDA: ("H", "read_text"), 0xDB: ("I", "read_text"),
           0xDC: ("H", "read_array"), 0xDD: ("I", "read_array"),
           0xDE: ("H", "read_map"), 0xDF: ("I", "read_map")}
