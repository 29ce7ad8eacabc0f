"""One connection on a unix stream socket: who is at the other end, calls to it, calls from it."""

import itertools
import os
import pwd
import socket
import struct
import threading

from . import wire
from .errors import Disconnected, Failed, NotAllowed, NotSupported, TimedOut, Unreachable

SOCKET = "/run/spacekeep/spacekeep.sock"
OBJECT = "/com/quorvel/Spacekeep"
DAEMON_ACCOUNT = "_spacekeep"

AUTHENTICATION_SECONDS = 5
_SENDING_SECONDS = 30
_MOST_LINE_BYTES = 4096
_ID = b"73706163656b6565702d707974686f6e"

_KINDS = {"org.freedesktop.DBus.Error.UnknownMethod": NotSupported,
          "org.freedesktop.DBus.Error.UnknownInterface": NotSupported,
          "org.freedesktop.DBus.Error.NotSupported": NotSupported}


def connect(path):
    """A socket that is connected to the daemon, and to nobody else. Raises Unreachable."""
    plain = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
    plain.settimeout(AUTHENTICATION_SECONDS)
    try:
        plain.connect(path)
        uid = peer_of(plain)
    except OSError as error:
        plain.close()
        raise Unreachable(f"nobody listens at {path}: {error.strerror or error}; does the daemon "
                          "run?") from None
    if uid in daemon_users():
        return plain
    plain.close()
    raise Unreachable(f"{path} is served by user {uid}, who is not the daemon")


def peer_of(plain):
    form = "3i"
    facts = plain.getsockopt(socket.SOL_SOCKET, socket.SO_PEERCRED, struct.calcsize(form))
    return struct.unpack(form, facts)[1]


def daemon_users():
    users = {0, os.geteuid()}
    try:
        users.add(pwd.getpwnam(DAEMON_ACCOUNT).pw_uid)
    except KeyError:
        pass
    return users


def not_allowed(path):
    return NotAllowed(f"{path} closed the connection without an answer: this user does not hold "
                      "\"CLIENT_ENTITLEMENT\", or the daemon is ending")


class _Lines:
    """The talk before the first message. What comes behind it stays in `rest`."""

    def __init__(self, plain):
        self._socket = plain
        self.rest = b""

    def byte(self):
        return self._upto(1)

    def line(self):
        while b"\r\n" not in self.rest:
            if len(self.rest) > _MOST_LINE_BYTES:
                raise wire.WireError("a line without end")
            self._more()
        line, self.rest = self.rest.split(b"\r\n", 1)
        return line

    def say(self, text):
        self._socket.sendall(text + b"\r\n")

    def _upto(self, count):
        while len(self.rest) < count:
            self._more()
        part, self.rest = self.rest[:count], self.rest[count:]
        return part

    def _more(self):
        part = self._socket.recv(4096)
        if not part:
            raise ConnectionResetError("the other end has closed the connection")
        self.rest += part


def _introduce(lines):
    """As the one that connects (D-Bus specification, EXTERNAL)."""
    lines.say(b"\0AUTH EXTERNAL " + str(os.geteuid()).encode().hex().encode())
    if not lines.line().startswith(b"OK "):
        raise ConnectionRefusedError("the other end does not know this user")
    lines.say(b"NEGOTIATE_UNIX_FD")
    lines.line()
    lines.say(b"BEGIN")


def _receive(lines):
    """As the one that is connected to. The socket is one end of a pair whose other end went to the
    daemon alone, so whoever is there may speak."""
    lines.byte()
    for _ in range(16):
        line = lines.line()
        if line == b"BEGIN":
            return
        if line == b"AUTH EXTERNAL":
            lines.say(b"DATA")
        elif line.startswith((b"AUTH EXTERNAL ", b"DATA")):
            lines.say(b"OK " + _ID)
        elif line == b"NEGOTIATE_UNIX_FD":
            lines.say(b"AGREE_UNIX_FD")
        elif line.startswith(b"AUTH"):
            lines.say(b"REJECTED EXTERNAL")
        else:
            lines.say(b"ERROR")
    raise wire.WireError("the other end does not begin")


class Invocation:
    """A call from the other end, to be answered once, from any thread."""

    def __init__(self, connection, message):
        self._connection = connection
        self._message = message
        self.interface = message.fields.get("interface", "")
        self.member = message.fields.get("member", "")
        self.signature = message.fields.get("signature", "")
        self.arguments = message.body

    def reply(self, signature="", *values):
        self._answer(wire.REPLY, {"signature": signature} if signature else {}, values)

    def fail(self, name, text):
        self._answer(wire.ERROR, {"error": name, "signature": "s"}, (text,))

    def _answer(self, kind, fields, values):
        if self._message.flags & wire.NO_REPLY_EXPECTED:
            return
        fields = {"reply_to": self._message.serial, **fields}
        self._connection.send(kind, fields, values)


class _Pending:
    def __init__(self, done):
        self.done = done  # called with the message, or None when the connection has ended


class Connection:
    """Calls may come from any thread. `on_call` and what is called when a call is done run on the
    connection's own thread and must return at once; `on_closed` runs there last."""

    def __init__(self, plain, *, serves=False, on_call=None, on_closed=None):
        """Raises OSError or WireError when the other end does not take part."""
        self._socket = plain
        self._on_call = on_call
        self._on_closed = on_closed
        self._lock = threading.Lock()
        self._pending = {}
        self._serials = itertools.count(1)
        self._closed = False
        lines = _Lines(plain)
        try:
            (_receive if serves else _introduce)(lines)
        except BaseException:
            plain.close()
            raise
        self._buffer = lines.rest
        plain.settimeout(None)
        seconds = struct.pack("ll", _SENDING_SECONDS, 0)
        plain.setsockopt(socket.SOL_SOCKET, socket.SO_SNDTIMEO, seconds)
        threading.Thread(target=self._read, name="spacekeep-connection", daemon=True).start()

    @property
    def closed(self):
        return self._closed

    def close(self):
        try:
            self._socket.shutdown(socket.SHUT_RDWR)
        except OSError:
            pass

    def call_later(self, interface, member, signature, values, done, descriptors=()):
        """Sends a call; `done` gets the answer, or None at the end of the connection."""
        fields = {"path": OBJECT, "interface": interface, "member": member}
        if signature:
            fields["signature"] = signature
        if descriptors:
            fields["descriptors"] = len(descriptors)
        pending = _Pending(done)
        self.send(wire.CALL, fields, values, pending, descriptors)
        return pending

    def call(self, interface, member, signature, values, timeout_seconds=None):
        """Answers the values of the reply."""
        answered = threading.Event()
        answers = []

        def done(message):
            answers.append(message)
            answered.set()

        pending = self.call_later(interface, member, signature, values, done)
        if not answered.wait(timeout_seconds):
            self._forget(pending)
            raise TimedOut("the daemon has not answered in time; it goes on all the same")
        return contents_of(answers[0])

    def send(self, kind, fields, values, pending=None, descriptors=()):
        with self._lock:
            serial = next(self._serials) & 0xFFFFFFFF or next(self._serials)
            data = wire.Message(kind, serial, fields, values).encoded()
            if not self._closed:
                if pending is not None:
                    self._pending[serial] = pending
                if self._sent(data, descriptors):
                    return
                self._pending.pop(serial, None)
        if pending is not None:
            pending.done(None)

    def _sent(self, data, descriptors):
        try:
            if descriptors:
                sent = socket.send_fds(self._socket, [data], descriptors)
                data = data[sent:]
            self._socket.sendall(data)
            return True
        except OSError:
            self.close()  # half a message may be out: nothing can follow it
            return False

    def _forget(self, pending):
        with self._lock:
            self._pending = {serial: one for serial, one in self._pending.items() if one is not pending}

    def _read(self):
        try:
            while True:
                self._take(self._next())
        except (OSError, wire.WireError):
            pass
        finally:
            self._end()

    def _end(self):
        with self._lock:
            self._closed = True
            pending, self._pending = self._pending, {}
        self._socket.close()
        for one in pending.values():
            one.done(None)
        if self._on_closed is not None:
            self._on_closed()

    def _next(self):
        self._fill(16)
        length = wire.length_of(self._buffer)
        self._fill(length)
        data, self._buffer = self._buffer[:length], self._buffer[length:]
        return wire.decoded(data)

    def _fill(self, count):
        parts, have = [self._buffer], len(self._buffer)
        while have < count:
            part = self._socket.recv(65536)
            if not part:
                raise ConnectionResetError("the other end has closed the connection")
            parts.append(part)
            have += len(part)
        self._buffer = b"".join(parts)

    def _take(self, message):
        if message.kind == wire.CALL:
            self._serve(Invocation(self, message))
        elif message.kind in (wire.REPLY, wire.ERROR):
            with self._lock:
                pending = self._pending.pop(message.fields.get("reply_to"), None)
            if pending is not None:
                pending.done(message)


    def _serve(self, invocation):
        try:
            known = self._on_call is not None and self._on_call(invocation)
        except Exception as error:  # one bad call must not end the others
            invocation.fail("org.freedesktop.DBus.Error.Failed", str(error))
            return
        if not known:
            invocation.fail("org.freedesktop.DBus.Error.UnknownMethod",
                            f"there is no {invocation.interface}.{invocation.member} here")


def contents_of(message):
    """The values of a reply; raises what an error, or no reply, means."""
    if message is None:
        raise Disconnected("the connection ended before the answer came")
    if message.kind == wire.ERROR:
        text = message.body[0] if message.body and isinstance(message.body[0], str) else ""
        name = message.fields.get("error", "")
        raise _KINDS.get(name, Failed)(text or name)
    return message.body
