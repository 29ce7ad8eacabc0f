"""A program that asks the daemon for space."""

from .connection import SOCKET, Connection, connect, not_allowed
from .errors import Disconnected, Refused
from .wire import WireError

INTERFACE = "com.quorvel.SpacekeepClientProtocol"
HISTORY_INTERFACE = "com.quorvel.SpacekeepHistoryProtocol"


class Client:
    """One connection to the daemon; requests from several threads run side by side. Each answer is a
    dictionary; what goes wrong raises an Error."""

    def __init__(self, socket_path=SOCKET):
        self._path = socket_path
        self._answered = False
        self._connection = open_connection(socket_path)

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def close(self):
        self._connection.close()

    def purge(self, volume, amount, *, urgency=None, timeout_seconds=None, token=None,
              finish_early=None, deadline_seconds=None):
        """Frees about `amount` bytes. What is left out is not sent, and the daemon's default holds:
        urgency 3, waits of twice the urgency in seconds, every urgency waited out."""
        return self.call("clientPurge", {
            "SPACEKEEP_VOLUME": volume, "SPACEKEEP_AMOUNT": amount, "SPACEKEEP_URGENCY": urgency,
            "SPACEKEEP_PURGE_TIMEOUT": timeout_seconds, "SPACEKEEP_TOKEN": token,
            "SPACEKEEP_FINISH_EARLY": finish_early}, deadline_seconds)

    def purgeable(self, volume, *, urgency=None, itemized=False, deadline_seconds=None):
        """How much could be freed: "SPACEKEEP_TOTAL_AVAILABLE", and each service under its ID."""
        member = "clientItemizedPurgeableSpace" if itemized else "clientPurgeableSpace"
        return self.call(member, {"SPACEKEEP_VOLUME": volume, "SPACEKEEP_URGENCY": urgency},
                         deadline_seconds)

    def cancel(self, token):
        """The daemon accepts every cancel request; it does not stop a purge that runs."""
        self._call("clientCancelPurge", "a{sv}", ({"SPACEKEEP_TOKEN": token},))

    def state(self, key):
        """The value of a key of the client state; None when it has none."""
        (values,) = self._call("clientGetState", "s", (key,))
        return values[0] if values else None

    def set_state(self, key, value):
        """None removes the key. When this is back, the change is on the disk."""
        self._call("clientSetState", "avs", ([] if value is None else [value], key))

    def history(self, *, before=None, limit=None, volume=None, deadline_seconds=None):
        """What the daemon has done: "SPACEKEEP_ENTRIES", newest first, and "SPACEKEEP_NEXT", the
        `before` of the older ones, when there are more. An older daemon raises NotSupported."""
        return self.call("clientHistory", {
            "SPACEKEEP_BEFORE": before, "SPACEKEEP_LIMIT": limit, "SPACEKEEP_VOLUME": volume},
            deadline_seconds, HISTORY_INTERFACE)

    def call(self, member, info, deadline_seconds=None, interface=INTERFACE):
        """Any operation that takes a request dictionary and answers with one."""
        (answers,) = self._call(member, "a{sv}", (info,), deadline_seconds, interface)
        if not answers:
            raise Refused(f"the daemon refused {member}: this user has not the right, or the request "
                          "names no local volume")
        return answers[0]

    def _call(self, member, signature, values, deadline_seconds=None, interface=INTERFACE):
        try:
            answer = self._connection.call(interface, member, signature, values, deadline_seconds)
        except Disconnected:
            # The daemon looks at rights when it knows who is there, and then just closes.
            if self._answered:
                raise
            raise not_allowed(self._path) from None
        self._answered = True
        return answer


def open_connection(socket_path, on_closed=None):
    """To the daemon. Raises Unreachable or NotAllowed."""
    plain = connect(socket_path)
    try:
        return Connection(plain, on_closed=on_closed)
    except (OSError, WireError):
        raise not_allowed(socket_path) from None
