"""What travels, there and back, and what must not come through."""

import datetime
import math
import random
import struct
import unittest

from spacekeep import wire

MOMENT = datetime.datetime(2026, 11, 21, 12, 30, 15, 250, tzinfo=datetime.timezone.utc)


def there_and_back(value):
    writer = wire.Writer()
    writer.write("v", value)
    return wire.Reader(bytes(writer.data)).read("v")


def nested(levels):
    value = 1
    for _ in range(levels):
        value = {"within": value}
    return value


class Values(unittest.TestCase):
    def test_every_kind_comes_back_as_it_was(self):
        for value in (True, False, 0, -1, 1 << 62, (1 << 64) - 1, -(1 << 63), 0.5, -math.inf, "", "text",
                      "ä€😀", b"", b"\0bytes", MOMENT, [], [1, "two", [3.5]], {}, {"a": {"b": [True]}}):
            with self.subTest(value=value):
                back = there_and_back(value)
                self.assertEqual(back, value)
                self.assertIs(type(back), type(value))

    def test_none_is_left_out_of_a_dictionary(self):
        self.assertEqual(there_and_back({"a": None, "b": 1}), {"b": 1})

    def test_thirty_two_levels_come_through(self):
        self.assertEqual(there_and_back(nested(32)), nested(32))

    def test_many_more_do_not(self):
        with self.assertRaisesRegex(wire.WireError, "too deep"):
            there_and_back(nested(200))

    def test_what_has_no_place_is_named(self):
        for value, words in ((1 << 64, "64 bits"), (object(), "object"), ("a\0b", "zero byte"),
                             ("\udc80", "no text"), ({1}, "set")):
            with self.subTest(value=value), self.assertRaisesRegex(wire.WireError, words):
                there_and_back(value)


class Signatures(unittest.TestCase):
    def test_fall_into_their_types(self):
        self.assertEqual(wire.types_of("ia{sv}aa{sv}(sx)v"), ["i", "a{sv}", "aa{sv}", "(sx)", "v"])
        self.assertEqual(wire.types_of(""), [])

    def test_that_are_none_are_refused(self):
        for signature in ("a", "(", ")", "()", "a()", "{sv}", "a{s}", "a{vs}", "a{asv}", "a{svv}", "z",
                          "(i", "a{sv", "i}"):
            with self.subTest(signature=signature), self.assertRaises(wire.WireError):
                wire.types_of(signature)


def sample():
    info = {"SPACEKEEP_VOLUME": "/data", "SPACEKEEP_AMOUNT": 5, "list": [1, MOMENT, b"x", {"k": 0.5}]}
    fields = {"path": "/a/b", "interface": "a.b", "member": "servicePurge", "signature": "ia{sv}"}
    return wire.Message(wire.CALL, 7, fields, (3, info))


class Messages(unittest.TestCase):
    def test_come_back_as_they_were(self):
        data = sample().encoded()
        self.assertEqual(wire.length_of(data[:16]), len(data))
        back = wire.decoded(data)
        self.assertEqual((back.kind, back.serial, back.fields, tuple(back.body)),
                         (wire.CALL, 7, sample().fields, sample().body))

    def test_of_the_other_byte_order_are_read(self):
        # A reply with serial 2 to serial 1, that holds the number 5.
        fields = b"\x05\x01u\0" + struct.pack(">I", 1) + b"\x08\x01g\0\x01u\0\0"
        data = b"B\x02\0\x01" + struct.pack(">III", 4, 2, 15) + fields + struct.pack(">I", 5)
        back = wire.decoded(data)
        self.assertEqual((back.fields["reply_to"], back.body), (1, [5]))

    def test_that_are_cut_are_refused(self):
        data = sample().encoded()
        for end in range(16, len(data)):
            with self.subTest(end=end), self.assertRaises(wire.WireError):
                wire.decoded(data[:end])

    def test_with_changed_bytes_are_read_or_refused_and_nothing_else(self):
        chance = random.Random(5)
        refused = 0
        for _ in range(20000):
            data = bytearray(sample().encoded())
            for _ in range(chance.randint(1, 4)):
                data[chance.randrange(len(data))] = chance.choice((0, 1, 255, chance.randrange(256)))
            try:
                wire.decoded(bytes(data))
            except wire.WireError:
                refused += 1
        self.assertGreater(refused, 1000)
        self.assertLess(refused, 20000)

    def test_that_are_too_large_are_neither_sent_nor_awaited(self):
        with self.assertRaisesRegex(wire.WireError, "too large"):
            wire.Message(wire.CALL, 1, {"signature": "s"}, ("x" * wire.MOST_BYTES,)).encoded()
        with self.assertRaisesRegex(wire.WireError, "too large"):
            wire.length_of(b"l\x01\0\x01" + struct.pack("<III", 0xFFFFFFFF, 1, 0xFFFFFFF0))


if __name__ == "__main__":
    unittest.main()
