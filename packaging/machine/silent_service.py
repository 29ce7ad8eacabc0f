"""A service that checks in with the daemon and never answers its ping.

    silent_service.py SOCKET SECONDS

Ends when the daemon hangs up, or after SECONDS.
"""

import os
import select
import socket
import struct
import sys


def padded(data, alignment):
    return data + b"\0" * (-len(data) % alignment)


def text(value):
    value = value.encode()
    return struct.pack("<I", len(value)) + value + b"\0"


def signature(value):
    return bytes([len(value)]) + value.encode() + b"\0"


def field(code, kind, value):
    return bytes([code]) + signature(kind) + value


def header(body, fields):
    """A method call; each field begins at a multiple of 8."""
    array = b""
    for one in fields:
        array = padded(array, 8) + one
    start = b"l\x01\0\x01" + struct.pack("<III", len(body), 1, len(array))
    return padded(start + array, 8)


def check_in():
    body = padded(text("com.example.silent"), 4) + struct.pack("<I", 0)
    entries = b""
    for key in ("PURGE",):
        entry = padded(text(key) + signature("b"), 4) + struct.pack("<I", 1)
        entries = padded(entries, 8) + entry
    body += struct.pack("<I", len(entries))
    body = padded(body, 8) + entries
    # Four bytes of a string's length come before it, so these start right after the kind.
    fields = [
        bytes([1, 1]) + b"o\0" + text("/com/quorvel/Spacekeep"),
        bytes([2, 1]) + b"s\0" + text("com.quorvel.SpacekeepClientProtocol"),
        bytes([3, 1]) + b"s\0" + text("clientCheckin"),
        field(8, "g", signature("sha{sv}")),
        bytes([9, 1]) + b"u\0" + struct.pack("<I", 1),
    ]
    return header(body, fields) + body


def main():
    daemon = socket.socket(socket.AF_UNIX)
    daemon.connect(sys.argv[1])
    daemon.sendall(b"\0AUTH EXTERNAL " + str(os.geteuid()).encode().hex().encode() + b"\r\n")
    if not daemon.recv(256).startswith(b"OK"):
        return "the daemon does not let me in"
    daemon.sendall(b"NEGOTIATE_UNIX_FD\r\n")
    if not daemon.recv(256).startswith(b"AGREE"):
        return "the daemon takes no descriptors"
    daemon.sendall(b"BEGIN\r\n")
    mine, endpoint = socket.socketpair()
    socket.send_fds(daemon, [check_in()], [endpoint.fileno()])
    endpoint.close()
    print("checked in, and silent from now on", flush=True)
    end = select.poll()
    end.register(daemon, select.POLLRDHUP | select.POLLHUP)
    hung_up = end.poll(int(sys.argv[2]) * 1000)
    mine.close()
    return 0 if hung_up else "the daemon is still there"


sys.exit(main())
