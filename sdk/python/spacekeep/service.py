"""A program that owns data it can give up, and makes itself known while it runs."""

import os
import random
import signal
import socket
import threading
import time

from .client import INTERFACE as CLIENT_INTERFACE
from .client import open_connection
from .connection import SOCKET, Connection, contents_of
from .errors import Error
from .served import Served, log
from .wire import WireError

_FIRST_PAUSE_SECONDS = 0.1
_LONGEST_PAUSE_SECONDS = 30.0
_NO_ANSWER = ("the check-in is not answered: does this user hold \"SERVICE_ENTITLEMENT\"? The daemon's "
              "log tells")


class Host:
    """Keeps one service checked in: whenever the daemon went away, again, after a pause that grows
    from 0.1 to 30 seconds and is drawn at random."""

    def __init__(self, service_id, service, *, socket_path=None, does_purge=True, does_periodic=False,
                 notifications=(), on_status=None, patience_seconds=10):
        """`on_status` gets each change as two texts: "connecting", "checking in", "serving", "refused",
        "waiting" or "stopped", and why. After `patience_seconds` without an answer to the check-in it is
        told so, and the host goes on waiting."""
        if not service_id:
            raise ValueError("a service needs an ID")
        self._id = service_id
        self._served = Served(service)
        self._path = socket_path or _socket_from_environment()
        self._info = {"PURGE": bool(does_purge), "PERIODIC": bool(does_periodic),
                      "SPACEKEEP_NOTIFICATIONS": list(notifications)}
        self._on_status = on_status or (lambda state, text: log.info("%s %s", state, text))
        self._stopped = threading.Event()
        self._changed = threading.Event()  # something for run() to look at
        self._failures = 0
        self._patience_seconds = patience_seconds

    def run(self):
        """Serves until stop(). Once."""
        while not self._stopped.is_set():
            why = self._serve_once()
            if self._stopped.is_set():
                break
            pause = self._next_pause()
            self._on_status("waiting", f"{why}; next try in {pause:.1f} s")
            self._stopped.wait(pause)
        self._served.end()
        self._on_status("stopped", "")

    def stop(self):
        """From any other thread: cancels what runs, and lets run() return."""
        self._stopped.set()
        self._served.cancel_all()
        self._changed.set()

    def _next_pause(self):
        longest = min(_LONGEST_PAUSE_SECONDS, _FIRST_PAUSE_SECONDS * 2 ** min(self._failures, 16))
        self._failures += 1
        return longest * random.uniform(0.5, 1)

    def _serve_once(self):
        """From a connection to its end. Answers why it ended."""
        self._on_status("connecting", self._path)
        self._changed.clear()
        try:
            daemon = open_connection(self._path, on_closed=self._changed.set)
        except Error as error:
            return str(error)
        ours, theirs = socket.socketpair()
        attempt = _Attempt(daemon, self._changed)
        threading.Thread(target=self._open_endpoint, args=(ours, attempt), daemon=True,
                         name="spacekeep-endpoint").start()
        self._on_status("checking in", self._id)
        try:
            daemon.call_later(CLIENT_INTERFACE, "clientCheckin", "sha{sv}", (self._id, 0, self._info),
                              attempt.answered, [theirs.fileno()])
        finally:
            theirs.close()
        try:
            return self._wait_for_end(attempt)
        finally:
            attempt.close()
            self._served.cancel_all()

    def _open_endpoint(self, ours, attempt):
        """The daemon may take its time to come back over the endpoint, and may never do so."""
        try:
            attempt.keep(Connection(ours, serves=True, on_call=self._served.called,
                                    on_closed=attempt.ended))
        except (OSError, WireError):
            attempt.ended()

    def _wait_for_end(self, attempt):
        answered = stays = reminded = False
        deadline = time.monotonic() + self._patience_seconds
        while not self._stopped.is_set():
            is_patient = not (answered or reminded)
            self._changed.wait(max(0.0, deadline - time.monotonic()) if is_patient else None)
            self._changed.clear()
            if attempt.daemon.closed:
                return "the daemon has closed the connection"
            if attempt.answers and not answered:
                answered = True
                problem, stays = self._tell(attempt.answers[0])
                if problem:
                    return problem
            if attempt.over and (reminded or answered and not stays):
                return _NO_ANSWER if reminded else "the daemon has let the service go"
            if not answered and not reminded and time.monotonic() >= deadline:
                reminded = True
                self._changed.set()  # what is over already is looked at once more
                self._on_status("checking in", _NO_ANSWER)
        return "stopped"

    def _tell(self, message):
        """Answers what is wrong, if the service cannot stay, and whether it stays without being
        called: a declared service waits for another daemon."""
        try:
            registered, problems = contents_of(message)
        except (Error, ValueError) as error:
            return f"the check-in failed: {error}", False
        if problems:
            return problems[0], False
        if registered:
            self._failures = 0
            self._on_status("serving", "")
            return None, False
        self._on_status("refused", f"a descriptor file declares {self._id}, so it cannot check in")
        return None, True

class _Attempt:
    """What one try to be served consists of. `changed` is set whenever something is new."""

    def __init__(self, daemon, changed):
        self.daemon = daemon
        self.answers = []
        self.over = False
        self._changed = changed
        self._lock = threading.Lock()
        self._endpoint = None
        self._given_up = False

    def answered(self, message):
        self.answers.append(message)
        self._changed.set()

    def ended(self):
        self.over = True
        self._changed.set()

    def keep(self, endpoint):
        with self._lock:
            self._endpoint = endpoint
            late = self._given_up
        if late:
            endpoint.close()

    def close(self):
        with self._lock:
            self._given_up = True
            endpoint = self._endpoint
        self.daemon.close()
        if endpoint is not None:
            endpoint.close()


def _socket_from_environment():
    """For tests; not in programs with more rights than their starter."""
    plain = os.getuid() == os.geteuid() and os.getgid() == os.getegid()
    return plain and os.environ.get("SPACEKEEP_SOCKET") or SOCKET


def serve(service_id, service, **options):
    """Serves until SIGTERM or SIGINT; options as of Host. From the main thread."""
    host = Host(service_id, service, **options)
    stop_at_signals(host)
    host.run()


def stop_at_signals(host):
    def stop(*_):
        # The signal may have come while this very thread held a lock that stop() needs.
        threading.Thread(target=host.stop, daemon=True).start()

    for number in (signal.SIGTERM, signal.SIGINT):
        signal.signal(number, stop)
