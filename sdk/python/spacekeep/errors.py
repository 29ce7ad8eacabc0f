"""What can go wrong between a program and the daemon. The text is for a person."""


class Error(Exception):
    """Any of those below."""


class Unreachable(Error):
    """Nobody listens at the socket, or somebody else than the daemon does."""


class NotAllowed(Error):
    """The daemon turned the connection away: this user does not hold "CLIENT_ENTITLEMENT"."""


class Refused(Error):
    """The daemon answered with nothing: this user has not the right for the operation, or the request
    names no local volume. The daemon's log tells which."""


class Disconnected(Error):
    """The connection ended before the answer came."""


class TimedOut(Error):
    """The caller's own deadline passed. The daemon finishes the work all the same."""


class NotSupported(Error):
    """The daemon does not offer this operation."""


class Failed(Error):
    """The daemon reported a failure, in words."""
