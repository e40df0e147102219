"""The Python client's CBOR codec and framing, without a daemon: the bytes it
writes, what it reads back, and what it refuses."""

import math
import struct
import unittest
import uuid

from qvclient import cbor
from qvclient.cbor import CborError, Date
from qvclient.frame import (FLAG_GOODBYE, FLAG_REPLY, FLAG_REPLY_EXPECTED, FrameError, FrameReader,
                            encode_frame)

U = uuid.UUID("97DB729D-7FE9-4CA9-9EE7-B42CB7B4CFBB")


class RoundTripTest(unittest.TestCase):
    def test_every_kind_reads_back_as_written(self):
        values = [
            0, 23, 24, 255, 256, 65535, 65536, 2**32 - 1, 2**32, 2**63 - 1, 2**64 - 1,
            -1, -24, -25, -256, -257, -(2**63),
            0.0, -0.0, 1.5, -2.25e300, float("inf"), float("-inf"),
            True, False,
            "", "a", "x" * 23, "x" * 24, "Grüße, 世界 🌍",
            b"", b"\x00\xff", bytes(300),
            U, Date(0), Date(-1.5), Date(1793610900.25),
            [], [1, [2, [3]]], {}, {"b": 1, "a": [U, {"c": b"d"}]},
        ]
        for value in values:
            with self.subTest(value=value):
                decoded = cbor.decode(cbor.encode(value))
                self.assertEqual(decoded, value)
                self.assertIs(type(decoded), type(value))
                if isinstance(value, float):
                    self.assertEqual(math.copysign(1, decoded), math.copysign(1, value))
        nan = cbor.decode(cbor.encode(float("nan")))
        self.assertTrue(math.isnan(nan))

    def test_maps_keep_their_order(self):
        value = {"z": 1, "a": 2, "m": 3}
        self.assertEqual(list(cbor.decode(cbor.encode(value))), ["z", "a", "m"])

    def test_tuples_and_datetimes_are_written_as_arrays_and_dates(self):
        import datetime
        moment = datetime.datetime(2026, 11, 2, 9, 15, tzinfo=datetime.timezone.utc)
        self.assertEqual(cbor.decode(cbor.encode((1, moment))), [1, Date(1793610900.0)])
        self.assertEqual(Date(1793610900.0).to_datetime(), moment)
        with self.assertRaises(ValueError):
            cbor.encode(datetime.datetime(2026, 1, 1))  # naive: no point in time


class WrittenBytesTest(unittest.TestCase):
    def test_heads_are_the_shortest(self):
        expected = {
            0: "00", 23: "17", 24: "1818", 255: "18ff", 256: "190100", 65535: "19ffff",
            65536: "1a00010000", 2**32: "1b0000000100000000", 2**64 - 1: "1bffffffffffffffff",
            -1: "20", -24: "37", -25: "3818", -(2**63): "3b7fffffffffffffff",
            "a": "6161", b"\x01": "4101", "x" * 24: "7818" + "78" * 24,
        }
        for value, hex_text in expected.items():
            with self.subTest(value=value):
                self.assertEqual(cbor.encode(value).hex(), hex_text)
        self.assertEqual(cbor.encode(list(range(24)))[:2].hex(), "9818")
        self.assertEqual(cbor.encode({"k": True})[:1].hex(), "a1")

    def test_scalars_with_fixed_forms(self):
        self.assertEqual(cbor.encode(True).hex(), "f5")
        self.assertEqual(cbor.encode(False).hex(), "f4")
        self.assertEqual(cbor.encode(1.5).hex(), "fb3ff8000000000000")
        self.assertEqual(cbor.encode(1.0).hex(), "fb3ff0000000000000", "floats stay 64-bit")
        self.assertEqual(cbor.encode(Date(1.0)).hex(), "c1fb3ff0000000000000")
        self.assertEqual(cbor.encode(U).hex(), "d82550" + U.hex)


class AcceptedOnReadTest(unittest.TestCase):
    def test_longer_heads_and_narrower_floats(self):
        cases = {
            "1801": 1, "190001": 1, "1b0000000000000001": 1, "3900ff": -256,
            "79000161": "a", "5a0000000141": b"A",
            "9900020102": [1, 2], "b900016161f5": {"a": True},
            "d9002550" + U.hex: U, "d8255810" + U.hex: U,
            "f93c00": 1.0, "f9c000": -2.0, "fa3fc00000": 1.5,
            "c101": Date(1.0), "c120": Date(-1.0), "c1f93e00": Date(1.5), "c1fa3fc00000": Date(1.5),
            "1bffffffffffffffff": 2**64 - 1,
        }
        for hex_text, value in cases.items():
            with self.subTest(hex=hex_text):
                self.assertEqual(cbor.decode(bytes.fromhex(hex_text)), value)
        self.assertTrue(math.isinf(cbor.decode(bytes.fromhex("f97c00"))))


class RefusedOnReadTest(unittest.TestCase):
    def assertRefused(self, hex_text, code, **limits):
        with self.assertRaises(CborError) as caught:
            cbor.decode(bytes.fromhex(hex_text), **limits)
        self.assertEqual(caught.exception.code, code, str(caught.exception))
        return caught.exception

    def test_malformed_input_is_refused_with_its_code(self):
        cases = [
            ("", cbor.TRUNCATED), ("18", cbor.TRUNCATED), ("6261", cbor.TRUNCATED),
            ("8201", cbor.TRUNCATED), ("a16161", cbor.TRUNCATED), ("d825", cbor.TRUNCATED),
            ("0102", cbor.TRAILING_BYTES), ("8000", cbor.TRAILING_BYTES),
            ("9fff", cbor.INDEFINITE_LENGTH), ("5f41ff", cbor.INDEFINITE_LENGTH),
            ("7fff", cbor.INDEFINITE_LENGTH), ("bfff", cbor.INDEFINITE_LENGTH),
            ("ff", cbor.INDEFINITE_LENGTH),
            ("1c", cbor.MALFORMED_HEAD), ("1f", cbor.MALFORMED_HEAD), ("3f", cbor.MALFORMED_HEAD),
            ("df", cbor.MALFORMED_HEAD), ("fc", cbor.MALFORMED_HEAD),
            ("c249010000000000000000", cbor.UNSUPPORTED_TAG), ("c074", cbor.UNSUPPORTED_TAG),
            ("f6", cbor.UNSUPPORTED_SIMPLE_VALUE), ("f7", cbor.UNSUPPORTED_SIMPLE_VALUE),
            ("e0", cbor.UNSUPPORTED_SIMPLE_VALUE), ("f820", cbor.UNSUPPORTED_SIMPLE_VALUE),
            ("a2616101616102", cbor.DUPLICATE_KEY), ("a10101", cbor.NON_TEXT_KEY),
            ("a1410101", cbor.NON_TEXT_KEY),
            ("62c080", cbor.INVALID_UTF8), ("63eda080", cbor.INVALID_UTF8),
            ("64f4908080", cbor.INVALID_UTF8), ("61ff", cbor.INVALID_UTF8),
            ("a162c08001", cbor.INVALID_UTF8),
            ("d8254f" + "00" * 15, cbor.BAD_UUID_LENGTH), ("d82551" + "00" * 17, cbor.BAD_UUID_LENGTH),
            ("d8256100", cbor.BAD_TAG_CONTENT), ("c16131", cbor.BAD_TAG_CONTENT),
            ("c1c101", cbor.BAD_TAG_CONTENT), ("c1f5", cbor.BAD_TAG_CONTENT),
            ("3b8000000000000000", cbor.INTEGER_OUT_OF_RANGE),
        ]
        for hex_text, code in cases:
            with self.subTest(hex=hex_text):
                self.assertRefused(hex_text, code)

    def test_faults_name_their_offset(self):
        error = self.assertRefused("a3616101616202616103", cbor.DUPLICATE_KEY)
        self.assertEqual(error.offset, 7)
        self.assertIn("offset 7", str(error))
        self.assertEqual(self.assertRefused("8263616263fe", cbor.MALFORMED_HEAD).offset, 5)
        self.assertEqual(self.assertRefused("6461e08080", cbor.INVALID_UTF8).offset, 2)

    def test_nesting_is_bounded_at_64(self):
        self.assertEqual(cbor.decode(bytes.fromhex("81" * 63 + "80")), cbor.decode(cbor.encode(
            nested_lists(64))))
        self.assertRefused("81" * 64 + "80", cbor.TOO_DEEP)
        self.assertRefused("a16161" * 64 + "a0", cbor.TOO_DEEP)
        self.assertEqual(cbor.decode(bytes.fromhex("81" * 3 + "80"), max_depth=4), [[[[]]]])
        self.assertRefused("81" * 4 + "80", cbor.TOO_DEEP, max_depth=4)
        with self.assertRaises(CborError) as caught:
            cbor.encode(nested_lists(65))
        self.assertEqual(caught.exception.code, cbor.TOO_DEEP)

    def test_counts_and_sizes_are_bounded_before_reading(self):
        # A count the input cannot hold fails at the head, before any element.
        self.assertRefused("9bffffffffffffffff", cbor.TRUNCATED)
        self.assertRefused("bb7fffffffffffffff00", cbor.TRUNCATED)
        self.assertRefused("5bffffffffffffffff", cbor.TRUNCATED)
        self.assertRefused("83010203", cbor.TOO_MANY_ITEMS, max_items=3)
        self.assertEqual(cbor.decode(bytes.fromhex("820102"), max_items=3), [1, 2])
        self.assertRefused("a1616101", cbor.TOO_MANY_ITEMS, max_items=2)
        self.assertRefused("8181818100", cbor.TOO_MANY_ITEMS, max_items=4)
        self.assertEqual(cbor.decode(b"\x41" + b"x", max_bytes=2), b"x")
        self.assertRefused("4278" + "78", cbor.TOO_LARGE, max_bytes=2)


class RefusedOnWriteTest(unittest.TestCase):
    def test_what_the_daemon_would_refuse_is_never_written(self):
        cases = [
            (None, cbor.UNENCODABLE_VALUE), ({"a": [1, None]}, cbor.UNENCODABLE_VALUE),
            (object(), cbor.UNENCODABLE_VALUE), ({1: 2}, cbor.NON_TEXT_KEY),
            ("\ud800", cbor.INVALID_UTF8), ({"\udfff": 1}, cbor.INVALID_UTF8),
            (2**64, cbor.INTEGER_OUT_OF_RANGE), (-(2**63) - 1, cbor.INTEGER_OUT_OF_RANGE),
        ]
        for value, code in cases:
            with self.subTest(value=value):
                with self.assertRaises(CborError) as caught:
                    cbor.encode(value)
                self.assertEqual(caught.exception.code, code)
        with self.assertRaises(CborError) as caught:
            cbor.encode({"rules": {"list": [1, None]}})
        self.assertIn("/rules/list/1", str(caught.exception))


def nested_lists(depth):
    value = []
    for _ in range(depth - 1):
        value = [value]
    return value


def header(flags=FLAG_REPLY, message_id=1, in_reply_to=1, length=1, magic=b"QVMB", version=1):
    return struct.pack("<4sHHQQI", magic, version, flags, message_id, in_reply_to, length)


class FrameTest(unittest.TestCase):
    def test_layout_of_a_request_and_a_goodbye(self):
        frame = encode_frame(FLAG_REPLY_EXPECTED, 0x0102, {"a": 1})
        self.assertEqual(frame.hex(), "51564d42" "0100" "0100" "0201000000000000"
                         "0000000000000000" "04000000" "a1616101")
        self.assertEqual(encode_frame(FLAG_GOODBYE, 7, {"ignored": 1}).hex(),
                         "51564d42010004000700000000000000000000000000000000000000")
        for bad in [dict(flags=3, message_id=1), dict(flags=0, message_id=0),
                    dict(flags=FLAG_REPLY, message_id=1), dict(flags=0, message_id=1, in_reply_to=2)]:
            with self.subTest(bad=bad), self.assertRaises(ValueError):
                encode_frame(body={}, **bad)

    def test_frames_are_cut_from_pieces_of_any_size(self):
        stream = (encode_frame(FLAG_REPLY, 1, {"n": 1}, in_reply_to=5)
                  + encode_frame(0, 2, [1, 2]) + encode_frame(FLAG_GOODBYE, 9))
        reader = FrameReader()
        frames = []
        for i in range(len(stream)):
            frames += reader.feed(stream[i:i + 1])
        self.assertTrue(reader.at_frame_boundary())
        reader.finish()
        self.assertEqual([(f.flags, f.message_id, f.in_reply_to, f.body) for f in frames],
                         [(FLAG_REPLY, 1, 5, {"n": 1}), (0, 2, 0, [1, 2]), (FLAG_GOODBYE, 9, 0, None)])

    def test_broken_rules_end_the_stream(self):
        body = b"\xa0"
        cases = {
            "bad magic": b"QVMX",
            "version": header(version=2) + body,
            "unknown flag": header(flags=0x8, in_reply_to=0) + body,
            "two flags": header(flags=0x3) + body,
            "zero id": header(message_id=0) + body,
            "reply without request id": header(in_reply_to=0) + body,
            "request id on a request": header(flags=FLAG_REPLY_EXPECTED) + body,
            "goodbye with body": header(flags=FLAG_GOODBYE, in_reply_to=0) + body,
            "over the limit": header(length=(16 << 20) + 1),
            "undecodable body": header(length=2) + b"\x01\x02",
            "id not increasing": header(message_id=4) + body + header(message_id=4) + body,
        }
        for name, data in cases.items():
            with self.subTest(name):
                reader = FrameReader()
                with self.assertRaises(FrameError):
                    reader.feed(data)
                with self.assertRaises(FrameError):
                    reader.feed(b"")  # broken for good
        reader = FrameReader()
        reader.feed(header()[:10])
        with self.assertRaises(FrameError):
            reader.finish()

    def test_bodies_are_decoded_within_limits(self):
        deep = b"\x81" * 64 + b"\x80"
        with self.assertRaises(FrameError):
            FrameReader().feed(header(length=len(deep)) + deep)
        many = cbor.encode(list(range(10)))
        with self.assertRaises(FrameError):
            FrameReader(max_items=10).feed(header(length=len(many)) + many)
        self.assertEqual(FrameReader(max_items=11).feed(header(length=len(many)) + many)[0].body,
                         list(range(10)))


if __name__ == "__main__":
    unittest.main()
