"""The CBOR subset the daemon speaks, in both directions.

Python value        CBOR written                         also read
-----------------   ----------------------------------   ---------------------------
dict (str keys)     map, keys in insertion order         longer heads
list, tuple         array                                longer heads (always a list)
str                 text string (UTF-8)                  longer heads
int                 major 0 (>= 0) or major 1 (< 0)      longer heads
float               64-bit float (0xfb)                  16- and 32-bit floats
bool                0xf4 / 0xf5
Date                tag 1 on a 64-bit float              tag 1 on any float or integer
bytes, bytearray    byte string                          longer heads (always bytes)
uuid.UUID           tag 37 on a 16-byte byte string      longer tag/length heads
None                never: encoding it is an error

Heads are written in their shortest form. Everything else is refused when
reading: indefinite lengths, other tags, null, undefined and the other simple
values, reserved additional information, duplicate or non-text keys, invalid
UTF-8, negative integers below -2**63 and bytes after the item. Every input is
untrusted, so decoding is bounded in size, nesting and item count, and a
declared length the rest of the input cannot hold fails before anything is
read. Error codes are those of the daemon's own codec.
"""

import datetime
import math
import struct
import uuid

__all__ = [
    "CborError", "Date", "decode", "encode",
    "TRUNCATED", "TRAILING_BYTES", "TOO_DEEP", "TOO_MANY_ITEMS", "TOO_LARGE",
    "INVALID_UTF8", "DUPLICATE_KEY", "NON_TEXT_KEY", "INDEFINITE_LENGTH",
    "UNSUPPORTED_TAG", "UNSUPPORTED_SIMPLE_VALUE", "BAD_UUID_LENGTH",
    "INTEGER_OUT_OF_RANGE", "UNENCODABLE_VALUE", "MALFORMED_HEAD", "BAD_TAG_CONTENT",
    "DEFAULT_MAX_BYTES", "DEFAULT_MAX_DEPTH", "DEFAULT_MAX_ITEMS",
]

TRUNCATED = 1
TRAILING_BYTES = 2
TOO_DEEP = 3
TOO_MANY_ITEMS = 4
TOO_LARGE = 5
INVALID_UTF8 = 6
DUPLICATE_KEY = 7
NON_TEXT_KEY = 8
INDEFINITE_LENGTH = 9
UNSUPPORTED_TAG = 10
UNSUPPORTED_SIMPLE_VALUE = 11
BAD_UUID_LENGTH = 12
INTEGER_OUT_OF_RANGE = 13
UNENCODABLE_VALUE = 14
MALFORMED_HEAD = 15
BAD_TAG_CONTENT = 16

DEFAULT_MAX_BYTES = 16 << 20
DEFAULT_MAX_DEPTH = 64
DEFAULT_MAX_ITEMS = 1_000_000
# Decoding recurses once per open container; past this the interpreter's own
# stack limit would be the one to stop it.
_DEPTH_CEILING = 512

_INT64_MAX = (1 << 63) - 1
_UINT64_MAX = (1 << 64) - 1

_TAG_DATE = 1
_TAG_UUID = 37

_MAJOR_PHRASES = ("an unsigned integer", "a negative integer", "a byte string", "a text string",
                  "an array", "a map", "a tag", "a simple value or float")


class CborError(ValueError):
    """A value that cannot be encoded, or input the decoder refuses.

    `code` is one of the module's constants; `offset` is the byte offset of
    the fault when decoding (None when encoding)."""

    def __init__(self, code, message, offset=None):
        super().__init__(message)
        self.code = code
        self.offset = offset


class Date:
    """A point in time as seconds since 1970-01-01 UTC (a 64-bit float)."""

    __slots__ = ("seconds",)

    def __init__(self, seconds):
        if isinstance(seconds, bool) or not isinstance(seconds, (int, float)):
            raise TypeError("Date takes a number of seconds")
        self.seconds = float(seconds)

    @classmethod
    def from_datetime(cls, moment):
        if moment.tzinfo is None:
            raise ValueError("a naive datetime names no point in time; give it a tzinfo")
        return cls(moment.timestamp())

    def to_datetime(self):
        return datetime.datetime.fromtimestamp(self.seconds, tz=datetime.timezone.utc)

    def __eq__(self, other):
        if not isinstance(other, Date):
            return NotImplemented
        return self.seconds == other.seconds or (math.isnan(self.seconds) and math.isnan(other.seconds))

    def __hash__(self):
        return hash(("Date", self.seconds))

    def __repr__(self):
        return "Date(%r)" % self.seconds


# ---------------------------------------------------------------- encoding

def _head(major, argument):
    initial = major << 5
    if argument < 24:
        return bytes((initial | argument,))
    if argument <= 0xFF:
        return bytes((initial | 24, argument))
    if argument <= 0xFFFF:
        return bytes((initial | 25,)) + argument.to_bytes(2, "big")
    if argument <= 0xFFFFFFFF:
        return bytes((initial | 26,)) + argument.to_bytes(4, "big")
    return bytes((initial | 27,)) + argument.to_bytes(8, "big")


def _text(text, path):
    try:
        raw = text.encode("utf-8")
    except UnicodeEncodeError:
        raise CborError(INVALID_UTF8, "string is not valid UTF-8 (at %s)" % (path or "/")) from None
    return _head(3, len(raw)) + raw


def _encode_into(out, value, path, depth, max_depth):
    # bool before int: True is an int in Python.
    if isinstance(value, bool):
        out.append(b"\xf5" if value else b"\xf4")
    elif isinstance(value, int):
        if value < -(1 << 63) or value > _UINT64_MAX:
            raise CborError(INTEGER_OUT_OF_RANGE,
                            "integer %d outside the 64-bit range (at %s)" % (value, path or "/"))
        out.append(_head(0, value) if value >= 0 else _head(1, -1 - value))
    elif isinstance(value, float):
        out.append(b"\xfb" + struct.pack(">d", value))
    elif isinstance(value, str):
        out.append(_text(value, path))
    elif isinstance(value, (bytes, bytearray, memoryview)):
        raw = bytes(value)
        out.append(_head(2, len(raw)))
        out.append(raw)
    elif isinstance(value, uuid.UUID):
        out.append(b"\xd8\x25\x50" + value.bytes)
    elif isinstance(value, Date):
        out.append(b"\xc1\xfb" + struct.pack(">d", value.seconds))
    elif isinstance(value, datetime.datetime):
        out.append(b"\xc1\xfb" + struct.pack(">d", Date.from_datetime(value).seconds))
    elif isinstance(value, dict):
        if depth >= max_depth:
            raise CborError(TOO_DEEP, "nesting deeper than %d (at %s)" % (max_depth, path or "/"))
        out.append(_head(5, len(value)))
        for key, element in value.items():
            if not isinstance(key, str):
                raise CborError(NON_TEXT_KEY, "map key %r is not a string (at %s)" % (key, path or "/"))
            out.append(_text(key, path + "/" + key))
            _encode_into(out, element, path + "/" + key, depth + 1, max_depth)
    elif isinstance(value, (list, tuple)):
        if depth >= max_depth:
            raise CborError(TOO_DEEP, "nesting deeper than %d (at %s)" % (max_depth, path or "/"))
        out.append(_head(4, len(value)))
        for index, element in enumerate(value):
            _encode_into(out, element, "%s/%d" % (path, index), depth + 1, max_depth)
    elif value is None:
        raise CborError(UNENCODABLE_VALUE, "None cannot be encoded (at %s)" % (path or "/"))
    else:
        raise CborError(UNENCODABLE_VALUE, "a %s cannot be encoded (at %s)"
                        % (type(value).__name__, path or "/"))


def encode(value, max_depth=DEFAULT_MAX_DEPTH):
    """The encoding of `value` as bytes. Raises CborError for what the
    daemon would refuse (None, non-text keys, strings with lone surrogates,
    integers outside 64 bits, nesting beyond `max_depth`)."""
    out = []
    _encode_into(out, value, "", 0, max_depth)
    return b"".join(out)


# ---------------------------------------------------------------- decoding

class _Decoder:
    def __init__(self, data, max_depth, max_items):
        self.data = data
        self.size = len(data)
        self.pos = 0
        self.items = 0
        self.max_depth = max_depth
        self.max_items = max_items

    def fail(self, code, message, offset):
        raise CborError(code, "%s at offset %d" % (message, offset), offset)

    def count_item(self, offset):
        self.items += 1
        if self.items > self.max_items:
            self.fail(TOO_MANY_ITEMS, "more than %d items" % self.max_items, offset)

    def head(self):
        offset = self.pos
        if offset >= self.size:
            self.fail(TRUNCATED, "input ends where an item should start", offset)
        initial = self.data[offset]
        self.pos += 1
        major, info = initial >> 5, initial & 0x1F
        if info < 24:
            return major, info, info, offset
        if info > 27:
            if info == 31 and major == 7:
                self.fail(INDEFINITE_LENGTH, "break code outside an indefinite-length item", offset)
            if info == 31 and 2 <= major <= 5:
                self.fail(INDEFINITE_LENGTH,
                          "indefinite-length item (%s)" % _MAJOR_PHRASES[major], offset)
            self.fail(MALFORMED_HEAD, "reserved additional information %d in the head of %s"
                      % (info, _MAJOR_PHRASES[major]), offset)
        width = 1 << (info - 24)
        if self.size - self.pos < width:
            self.fail(TRUNCATED, "input ends inside the head", offset)
        argument = int.from_bytes(self.data[self.pos:self.pos + width], "big")
        self.pos += width
        return major, info, argument, offset

    def payload(self, major, argument, offset):
        left = self.size - self.pos
        if argument > left:
            self.fail(TRUNCATED, "%s string declares %d bytes but %d remain"
                      % ("text" if major == 3 else "byte", argument, left), offset)
        start = self.pos
        self.pos += argument
        return self.data[start:self.pos]

    def text(self, argument, offset):
        raw = self.payload(3, argument, offset)
        try:
            return bytes(raw).decode("utf-8")
        except UnicodeDecodeError as error:
            # Reported where the bad sequence starts, as the daemon does.
            self.fail(INVALID_UTF8, "invalid UTF-8 in the text string that starts at %d" % offset,
                      self.pos - argument + error.start)

    def item(self, depth):
        major, info, argument, offset = self.head()
        self.count_item(offset)
        if major == 0:
            return argument
        if major == 1:
            if argument > _INT64_MAX:
                self.fail(INTEGER_OUT_OF_RANGE, "negative integer below INT64_MIN", offset)
            return -1 - argument
        if major == 2:
            return bytes(self.payload(2, argument, offset))
        if major == 3:
            return self.text(argument, offset)
        if major in (4, 5):
            return self.container(major == 5, argument, offset, depth)
        if major == 6:
            return self.tagged(argument, offset)
        return self.simple(info, argument, offset)

    def container(self, is_map, count, offset, depth):
        if depth >= self.max_depth:
            self.fail(TOO_DEEP, "nesting deeper than %d" % self.max_depth, offset)
        # Every element takes a byte at least and every pair two: a count the
        # rest cannot hold is refused before any element is read.
        left = self.size - self.pos
        if count > (left // 2 if is_map else left):
            self.fail(TRUNCATED, "%s declares %d %s but only %d bytes remain"
                      % ("map" if is_map else "array", count, "pairs" if is_map else "elements",
                         left), offset)
        declared = count * 2 if is_map else count
        if declared > self.max_items - min(self.items, self.max_items):
            self.fail(TOO_MANY_ITEMS, "more than %d items" % self.max_items, offset)
        if not is_map:
            return [self.item(depth + 1) for _ in range(count)]
        result = {}
        for _ in range(count):
            key_major, _info, key_argument, key_offset = self.head()
            self.count_item(key_offset)
            if key_major != 3:
                self.fail(NON_TEXT_KEY, "map key is %s, not a text string"
                          % _MAJOR_PHRASES[key_major], key_offset)
            key = self.text(key_argument, key_offset)
            value = self.item(depth + 1)
            if key in result:
                self.fail(DUPLICATE_KEY, "duplicate map key %r" % key, key_offset)
            result[key] = value
        return result

    def tagged(self, tag, offset):
        if tag not in (_TAG_DATE, _TAG_UUID):
            self.fail(UNSUPPORTED_TAG, "unsupported tag %d" % tag, offset)
        major, info, argument, content_offset = self.head()
        if tag == _TAG_UUID:
            if major != 2:
                self.fail(BAD_TAG_CONTENT, "UUID tag encloses %s, not a byte string"
                          % _MAJOR_PHRASES[major], offset)
            raw = self.payload(2, argument, content_offset)
            if len(raw) != 16:
                self.fail(BAD_UUID_LENGTH, "UUID has %d bytes, not 16" % len(raw), offset)
            return uuid.UUID(bytes=bytes(raw))
        if major == 0:
            return Date(float(argument))
        if major == 1:
            if argument > _INT64_MAX:
                self.fail(INTEGER_OUT_OF_RANGE, "negative integer below INT64_MIN", content_offset)
            return Date(float(-1 - argument))
        if major == 7 and info in (25, 26, 27):
            return Date(self.simple(info, argument, content_offset))
        self.fail(BAD_TAG_CONTENT, "date tag encloses %s, not a number" % _MAJOR_PHRASES[major],
                  offset)

    def simple(self, info, argument, offset):
        if info == 20:
            return False
        if info == 21:
            return True
        if info == 25:
            return struct.unpack(">e", argument.to_bytes(2, "big"))[0]
        if info == 26:
            return struct.unpack(">f", argument.to_bytes(4, "big"))[0]
        if info == 27:
            return struct.unpack(">d", argument.to_bytes(8, "big"))[0]
        name = {22: " (null)", 23: " (undefined)"}.get(argument, "")
        self.fail(UNSUPPORTED_SIMPLE_VALUE, "unsupported simple value %d%s" % (argument, name), offset)


def decode(data, max_bytes=DEFAULT_MAX_BYTES, max_depth=DEFAULT_MAX_DEPTH,
           max_items=DEFAULT_MAX_ITEMS):
    """The one item that fills `data` (bytes-like). Raises CborError.

    max_depth counts arrays and maps open at once (a flat list is depth 1);
    max_items counts every element, key and value and the top item (a tag
    and its content are one)."""
    if max_depth > _DEPTH_CEILING:
        raise ValueError("max_depth above %d" % _DEPTH_CEILING)
    data = memoryview(data).cast("B") if not isinstance(data, bytes) else data
    if len(data) > max_bytes:
        raise CborError(TOO_LARGE, "input of %d bytes exceeds the limit of %d"
                        % (len(data), max_bytes), max_bytes)
    decoder = _Decoder(data, max_depth, max_items)
    value = decoder.item(0)
    if decoder.pos != decoder.size:
        decoder.fail(TRAILING_BYTES, "%d trailing bytes after the item" % (decoder.size - decoder.pos),
                     decoder.pos)
    return value
