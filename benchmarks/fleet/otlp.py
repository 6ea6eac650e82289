"""As much of the protocol's bodies as is needed to tell what arrived, from whom.

Written from the public protocol files, not from the exporter, so that the two check each
other.
"""

import struct


def varint(data, at):
    value = shift = 0
    while True:
        byte = data[at]
        at += 1
        value |= (byte & 0x7F) << shift
        if byte < 0x80:
            return value, at
        shift += 7


def fields(data):
    """(number, value) of a message: bytes for what has a length, else an integer."""
    at, end = 0, len(data)
    while at < end:
        key, at = varint(data, at)
        kind = key & 7
        if kind == 2:
            length, at = varint(data, at)
            if at + length > end:
                raise ValueError("a field is longer than its message")
            value, at = data[at:at + length], at + length
        elif kind == 0:
            value, at = varint(data, at)
        elif kind in (1, 5):
            width = 8 if kind == 1 else 4
            value, at = int.from_bytes(data[at:at + width], "little"), at + width
        else:
            raise ValueError(f"no wire type: {kind}")
        yield key >> 3, value


def all_of(data, number):
    return [value for each, value in fields(data) if each == number]


def attribute(message, number, wanted):
    """The text of the attribute `wanted` of a message that has them in field `number`."""
    for pair in all_of(message, number):
        parts = dict(fields(pair))
        if parts.get(1) == wanted:
            return dict(fields(parts[2])).get(1, b"").decode()
    return None


def items(body):
    """(device, record) for each log record, span or metric of a request."""
    for resource_items in all_of(body, 1):
        device = attribute(all_of(resource_items, 1)[0], 1, b"device.id")
        for scope_items in all_of(resource_items, 2):
            for record in all_of(scope_items, 2):
                yield device, record


def points(metric):
    """(name, start, end, cause, count, sum) of each point of a histogram."""
    parts = dict(fields(metric))
    for point in all_of(parts.get(9, b""), 1):
        values = dict(fields(point))
        total = struct.unpack("<d", values.get(5, 0).to_bytes(8, "little"))[0]
        yield (parts[1].decode(), values.get(2), values.get(3),
               attribute(point, 9, b"issue_type") or attribute(point, 9, b"halyard.issue_type"),
               values.get(4, 0), total)
