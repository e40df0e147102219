"""Frames: how every message crosses the daemon's Unix stream socket.

    offset size field        (integers little-endian)
    0      4    magic        b"QVMB"
    4      2    version      1
    6      2    flags        0x1 reply expected, 0x2 reply, 0x4 goodbye; at most one
    8      8    message id   chosen by the sender: non-zero, increasing per connection
    16     8    in-reply-to  a reply: the id of its request; anything else: 0
    24     4    body length  at most 16 MiB; 0 for a goodbye
    28     n    body         exactly one CBOR item (a text-keyed map, normally)

FrameReader checks every rule on what the daemon sends, as the daemon does on
what it receives; a broken rule ends the connection.
"""

import struct

from . import cbor

__all__ = [
    "MAGIC", "VERSION", "HEADER_SIZE", "MAX_BODY_BYTES",
    "FLAG_REPLY_EXPECTED", "FLAG_REPLY", "FLAG_GOODBYE",
    "FrameError", "Frame", "encode_frame", "FrameReader",
]

MAGIC = b"QVMB"
VERSION = 1
HEADER_SIZE = 28
MAX_BODY_BYTES = 16 << 20

FLAG_REPLY_EXPECTED = 0x1
FLAG_REPLY = 0x2
FLAG_GOODBYE = 0x4
_KNOWN_FLAGS = FLAG_REPLY_EXPECTED | FLAG_REPLY | FLAG_GOODBYE

_HEADER = struct.Struct("<4sHHQQI")
_UINT64_MAX = (1 << 64) - 1

# Replies carry whole plug-in forms, a few hundred values each: a match over
# thousands of plug-ins holds far more values than a request may.
REPLY_MAX_ITEMS = 1 << 21


class FrameError(Exception):
    """The peer broke a rule of the framing; the connection is unusable."""


class Frame:
    __slots__ = ("flags", "message_id", "in_reply_to", "body")

    def __init__(self, flags, message_id, in_reply_to, body):
        self.flags = flags
        self.message_id = message_id
        self.in_reply_to = in_reply_to
        self.body = body

    @property
    def is_reply(self):
        return self.flags == FLAG_REPLY

    @property
    def is_goodbye(self):
        return self.flags == FLAG_GOODBYE

    def __repr__(self):
        return "Frame(flags=%#x, id=%d, in_reply_to=%d, body=%r)" % (
            self.flags, self.message_id, self.in_reply_to, self.body)


def encode_frame(flags, message_id, body=None, in_reply_to=0):
    """One whole frame. `body` is a value to encode (ignored for a goodbye)."""
    if flags not in (0, FLAG_REPLY_EXPECTED, FLAG_REPLY, FLAG_GOODBYE):
        raise ValueError("flags must be 0 or exactly one of the known flags")
    if not 0 < message_id <= _UINT64_MAX:
        raise ValueError("message id must be a non-zero 64-bit number")
    if (flags == FLAG_REPLY) != (in_reply_to != 0) or not 0 <= in_reply_to <= _UINT64_MAX:
        raise ValueError("in-reply-to is set on a reply, and only there")
    raw = b"" if flags == FLAG_GOODBYE else cbor.encode(body)
    if len(raw) > MAX_BODY_BYTES:
        raise ValueError("body of %d bytes exceeds the limit of %d" % (len(raw), MAX_BODY_BYTES))
    return _HEADER.pack(MAGIC, VERSION, flags, message_id, in_reply_to, len(raw)) + raw


class FrameReader:
    """Cuts a byte stream into checked frames with decoded bodies.

    feed() takes bytes in pieces of any size and returns the frames they
    completed. The buffer never holds more than one frame's header and the
    body bytes that actually arrived."""

    def __init__(self, max_body_bytes=MAX_BODY_BYTES, max_depth=cbor.DEFAULT_MAX_DEPTH,
                 max_items=REPLY_MAX_ITEMS):
        if max_body_bytes > MAX_BODY_BYTES:
            raise ValueError("the wire allows at most %d body bytes" % MAX_BODY_BYTES)
        self._max_body = max_body_bytes
        self._max_depth = max_depth
        self._max_items = max_items
        self._buffer = bytearray()
        self._header = None
        self._last_id = 0
        self._fault = None

    def at_frame_boundary(self):
        return not self._buffer and self._header is None

    def _fail(self, message):
        self._fault = FrameError(message)
        self._buffer = bytearray()
        raise self._fault

    def _check(self, header):
        _magic, version, flags, message_id, in_reply_to, length = header
        if version != VERSION:
            self._fail("unknown frame version %d" % version)
        if flags & ~_KNOWN_FLAGS:
            self._fail("unknown flags %#06x" % flags)
        if bin(flags).count("1") > 1:
            self._fail("conflicting flags %#06x" % flags)
        if message_id == 0:
            self._fail("message id 0")
        if message_id <= self._last_id:
            self._fail("message id %d after %d" % (message_id, self._last_id))
        if length > self._max_body:
            self._fail("body of %d bytes, limit %d" % (length, self._max_body))
        if flags == FLAG_GOODBYE and length != 0:
            self._fail("goodbye with a body of %d bytes" % length)
        if flags == FLAG_REPLY and in_reply_to == 0:
            self._fail("reply without the id of its request")
        if flags != FLAG_REPLY and in_reply_to != 0:
            self._fail("in-reply-to %d on a frame that is no reply" % in_reply_to)
        self._last_id = message_id

    def feed(self, data):
        if self._fault is not None:
            raise self._fault
        frames = []
        self._buffer += data
        while True:
            if self._header is None:
                # The magic is judged as soon as it is in: a peer speaking
                # something else is turned away without waiting for more.
                if len(self._buffer) >= 4 and self._buffer[:4] != MAGIC:
                    self._fail("bad magic %r" % bytes(self._buffer[:4]))
                if len(self._buffer) < HEADER_SIZE:
                    return frames
                header = _HEADER.unpack_from(self._buffer)
                self._check(header)
                self._header = header
                del self._buffer[:HEADER_SIZE]
            length = self._header[5]
            if len(self._buffer) < length:
                return frames
            raw = bytes(self._buffer[:length])
            del self._buffer[:length]
            _magic, _version, flags, message_id, in_reply_to, _length = self._header
            self._header = None
            body = None
            if flags != FLAG_GOODBYE:
                try:
                    body = cbor.decode(raw, max_bytes=self._max_body, max_depth=self._max_depth,
                                       max_items=self._max_items)
                except cbor.CborError as error:
                    self._fail("undecodable body: %s" % error)
            frames.append(Frame(flags, message_id, in_reply_to, body))

    def finish(self):
        """The stream has ended; raises when it ended inside a frame."""
        if self._fault is not None:
            raise self._fault
        if not self.at_frame_boundary():
            self._fail("stream ended inside a frame")
