"""Values and messages as they travel: the D-Bus wire format, in little-endian order to the others and
in either order from them.

Python's bool, int, float, str, bytes, datetime, list and dict with string keys are the values. None has
no place: a member that is None is left out of its dictionary.
"""

import datetime
import struct

CALL, REPLY, ERROR, SIGNAL = 1, 2, 3, 4
NO_REPLY_EXPECTED = 1

# What the daemon takes, and more than it sends.
MOST_BYTES = 1 << 20
# The daemon's values have 32 levels at most, each of them a dictionary, an entry and a variant.
MOST_LEVELS = 100

_FIXED = {"y": "B", "n": "h", "q": "H", "i": "i", "u": "I", "x": "q", "t": "Q", "d": "d", "h": "I"}
_BASIC = "ynqiuxtdhbsog"
_ALIGNMENT = {"y": 1, "n": 2, "q": 2, "i": 4, "u": 4, "x": 8, "t": 8, "d": 8, "h": 4, "b": 4, "s": 4,
              "o": 4, "g": 1, "a": 4, "(": 8, "{": 8, "v": 1}
_EPOCH = datetime.datetime(1970, 1, 1, tzinfo=datetime.timezone.utc)


class WireError(ValueError):
    """Bytes that are no message, or a value that cannot travel."""


def end_of_type(signature, start):
    """Where the single complete type that begins at `start` ends."""
    letter = signature[start:start + 1]
    if letter == "a":
        is_dictionary = signature[start + 1:start + 2] == "{"
        return _end_of_members(signature, start + 1) if is_dictionary else end_of_type(signature, start + 1)
    if letter == "(":
        return _end_of_members(signature, start)
    if letter == "" or letter not in _BASIC + "v":
        raise WireError(f"{signature!r} is no signature")
    return start + 1


def _end_of_members(signature, start):
    """Of a structure or of an entry of a dictionary, whose key is of a basic type."""
    is_entry = signature[start] == "{"
    closing, count, at = "}" if is_entry else ")", 0, start + 1
    while signature[at:at + 1] != closing:
        if is_entry and count == 0 and signature[at:at + 1] not in list(_BASIC):
            raise WireError(f"{signature!r} has a key that is none")
        at = end_of_type(signature, at)
        count += 1
    # A member without content would let an array never end.
    if count == 0 or (is_entry and count != 2):
        raise WireError(f"{signature!r} is no signature")
    return at + 1


def types_of(signature):
    types, at = [], 0
    while at < len(signature):
        end = end_of_type(signature, at)
        types.append(signature[at:end])
        at = end
    return types


def type_of(value):
    """As what a value travels inside a variant."""
    if isinstance(value, bool):
        return "b"
    if isinstance(value, int):
        if not -(1 << 63) <= value < 1 << 64:
            raise WireError(f"{value} does not fit into 64 bits")
        return "x" if value < 1 << 63 else "t"
    for kind, code in ((float, "d"), (str, "s"), ((bytes, bytearray), "ay"),
                       (datetime.datetime, "(sx)"), (dict, "a{sv}"), ((list, tuple), "av")):
        if isinstance(value, kind):
            return code
    raise WireError(f"{type(value).__name__} is no kind of value that the daemon knows")


def _nanoseconds(moment):
    since = (moment if moment.tzinfo else moment.astimezone()) - _EPOCH
    return ((since.days * 86400 + since.seconds) * 1_000_000 + since.microseconds) * 1000


class Writer:
    def __init__(self):
        self.data = bytearray()

    def align(self, count):
        self.data += bytes(-len(self.data) % count)

    def write(self, code, value):
        letter = code[0]
        self.align(_ALIGNMENT[letter])
        if letter in _FIXED:
            try:
                self.data += struct.pack("<" + _FIXED[letter], value)
            except struct.error as error:
                raise WireError(f"{value!r} is no {code}: {error}") from None
        elif letter == "b":
            self.data += struct.pack("<I", bool(value))
        elif letter in "so":
            text = self._bytes_of(value)
            self.data += struct.pack("<I", len(text)) + text + b"\0"
        elif letter == "g":
            text = self._bytes_of(value)
            self.data += bytes([len(text)]) + text + b"\0"
        elif letter == "v":
            kind = type_of(value)
            self.write("g", kind)
            self.write(kind, value)
        elif letter == "a":
            self._array(code[1:], value)
        else:
            self._structure(code, value)

    @staticmethod
    def _bytes_of(text):
        try:
            encoded = text.encode("utf-8")
        except UnicodeEncodeError:
            raise WireError(f"{text!r} is no text") from None
        if 0 in encoded:
            raise WireError("a text with a zero byte cannot travel")
        return encoded

    def _array(self, code, value):
        at = len(self.data)
        self.data += bytes(4)
        self.align(_ALIGNMENT[code[0]])
        start = len(self.data)
        if code == "y":
            self.data += value
        elif code[0] == "{":
            key, content = types_of(code[1:-1])
            for name, member in value.items():
                if member is None:
                    continue
                self.align(8)
                self.write(key, name)
                self.write(content, member)
        else:
            for element in value:
                self.write(code, element)
        struct.pack_into("<I", self.data, at, len(self.data) - start)

    def _structure(self, code, value):
        if isinstance(value, datetime.datetime):
            value = ("date", _nanoseconds(value))
        for kind, member in zip(types_of(code[1:-1]), value):
            self.write(kind, member)


class Reader:
    """Reads what another program wrote; anything that is not as it should be is a WireError."""

    def __init__(self, data, order="<", start=0):
        self._data = data
        self._order = order
        self._at = start
        self._levels = 0

    def _take(self, count):
        end = self._at + count
        if end > len(self._data):
            raise WireError("the message is too short")
        part = self._data[self._at:end]
        self._at = end
        return part

    def align(self, count):
        self._take(-self._at % count)

    def _number(self, form):
        return struct.unpack(self._order + form, self._take(struct.calcsize(form)))[0]

    def _text(self, length):
        try:
            text = self._take(length).decode("utf-8")
        except UnicodeDecodeError:
            raise WireError("a text is no UTF-8") from None
        if self._take(1) != b"\0":
            raise WireError("a text does not end")
        return text

    def read(self, code):
        self._levels += 1
        if self._levels > MOST_LEVELS:
            raise WireError("values in values too deep")
        value = self._read(code)
        self._levels -= 1
        return value

    def _read(self, code):
        letter = code[0]
        self.align(_ALIGNMENT[letter])
        if letter in _FIXED:
            return self._number(_FIXED[letter])
        if letter == "b":
            return self._number("I") != 0
        if letter in "so":
            return self._text(self._number("I"))
        if letter == "g":
            return self._text(self._number("B"))
        if letter == "v":
            kinds = types_of(self.read("g"))
            if len(kinds) != 1:
                raise WireError("a variant holds one value")
            return self.read(kinds[0])
        if letter == "a":
            return self._array(code[1:])
        members = [self.read(kind) for kind in types_of(code[1:-1])]
        return _moment(members) if code == "(sx)" else tuple(members)

    def _array(self, code):
        length = self._number("I")
        self.align(_ALIGNMENT[code[0]])
        if code == "y":
            return bytes(self._take(length))
        end = self._at + length
        if end > len(self._data):
            raise WireError("an array is longer than its message")
        elements = []
        while self._at < end:
            elements.append(self._entry(code) if code[0] == "{" else self.read(code))
        if self._at != end:
            raise WireError("an array does not end where it says")
        return dict(elements) if code[0] == "{" else elements

    def _entry(self, code):
        self.align(8)
        key, content = types_of(code[1:-1])
        return self.read(key), self.read(content)


def _moment(members):
    if members[0] != "date":
        return tuple(members)
    try:
        return _EPOCH + datetime.timedelta(microseconds=members[1] // 1000)
    except OverflowError:
        return tuple(members)


_FIELDS = {"path": (1, "o"), "interface": (2, "s"), "member": (3, "s"), "error": (4, "s"),
           "reply_to": (5, "u"), "signature": (8, "g"), "descriptors": (9, "u")}
_NAMES = {number: name for name, (number, _) in _FIELDS.items()}


class Message:
    """`fields` by the names above; `body` holds a value for each type of its signature."""

    def __init__(self, kind, serial, fields, body=(), flags=0):
        self.kind = kind
        self.serial = serial
        self.flags = flags
        self.fields = fields
        self.body = body

    def encoded(self):
        body = Writer()
        for code, value in zip(types_of(self.fields.get("signature", "")), self.body):
            body.write(code, value)
        head = Writer()
        head.data += struct.pack("<cBBBII", b"l", self.kind, self.flags, 1, len(body.data), self.serial)
        fields = Writer()
        fields.data += head.data + bytes(4)  # alignment counts from the begin of the message
        for name, value in self.fields.items():
            number, code = _FIELDS[name]
            fields.align(8)
            fields.write("y", number)
            fields.write("g", code)
            fields.write(code, value)
        struct.pack_into("<I", fields.data, 12, len(fields.data) - 16)
        fields.align(8)
        message = bytes(fields.data + body.data)
        if len(message) > MOST_BYTES:
            raise WireError(f"a message of {len(message)} bytes is too large")
        return message


def length_of(head):
    """How many bytes the message that begins with these 16 has."""
    order = _order_of(head)
    body, _, fields = struct.unpack(order + "III", head[4:16])
    length = 16 + (fields + 7) // 8 * 8 + body
    if length > MOST_BYTES:
        raise WireError(f"a message of {length} bytes is too large")
    return length


def _order_of(data):
    orders = {ord("l"): "<", ord("B"): ">"}
    if data[0] not in orders or data[3] != 1:
        raise WireError("these bytes begin no message")
    return orders[data[0]]


def decoded(data):
    order = _order_of(data)
    if len(data) != length_of(data[:16]):
        raise WireError("the message has another length than it says")
    kind, flags = data[1], data[2]
    length, serial = struct.unpack(order + "II", data[4:12])
    reader = Reader(data, order, 12)
    fields = {}
    for number, value in reader.read("a(yv)"):
        if number in _NAMES:
            if not isinstance(value, int if number in (5, 9) else str):
                raise WireError(f"the field {_NAMES[number]} is of another type")
            fields[_NAMES[number]] = value
    body = Reader(data[len(data) - length:], order)
    codes = types_of(fields.get("signature", ""))
    return Message(kind, serial, fields, [body.read(code) for code in codes], flags)
