"""A program that owns data it can give up."""

import logging
import os
import queue
import random
import signal
import socket
import threading
import time

from .client import INTERFACE as CLIENT_INTERFACE
from .client import open_connection
from .connection import SOCKET, Connection, contents_of
from .errors import Error
from .wire import WireError

INTERFACE = "com.quorvel.SpacekeepServiceProtocol"

log = logging.getLogger("spacekeep")

_FIRST_PAUSE_SECONDS = 0.1
_LONGEST_PAUSE_SECONDS = 30.0
_NO_ANSWER = ("the check-in is not answered: does this user hold \"SERVICE_ENTITLEMENT\"? The daemon's "
              "log tells")


_MOST_BYTES = (1 << 64) - 1


def _bytes_from(amount):
    """What is no number counts as absent, which is none."""
    if isinstance(amount, bool) or not isinstance(amount, (int, float)) or not amount > 0:
        return 0
    return int(min(amount, _MOST_BYTES))


class Job:
    """One request to a service: the volume (a mount point), the bytes asked for (purge), the urgency
    from 1, give what nobody will miss, to 4, and the whole request."""

    def __init__(self, urgency, info):
        volume = info.get("SPACEKEEP_VOLUME")
        self.volume = volume if isinstance(volume, str) else ""
        self.amount = _bytes_from(info.get("SPACEKEEP_AMOUNT"))
        self.urgency = urgency
        self.info = info
        self._cancelled = threading.Event()

    def cancelled(self):
        """Whether the work is not wanted any more. Look between files; answer what was freed."""
        return self._cancelled.is_set()

    def wait(self, seconds):
        """A sleep that a cancel ends; answers cancelled()."""
        return self._cancelled.wait(seconds)

    def cancel(self):
        """Also for tests of a service's own handlers."""
        self._cancelled.set()


class Service:
    """The data's owner. Override what applies. The first three answer a number of bytes, or a
    dictionary with "SPACEKEEP_AMOUNT" and further keys. They run on one thread, one at a time. A
    handler that raises fails its one call."""

    def purgeable(self, job):
        """How much could be freed on job.volume at job.urgency. Be quick."""
        return 0

    def purge(self, job):
        """Free about job.amount bytes on job.volume, and answer what was freed."""
        return 0

    def periodic(self, job):
        """Daily upkeep; the daemon waits 15 seconds for all services together."""
        return 0

    def notify(self, name, value):
        """One notification that was asked for."""

    def callback(self, info):
        """No dictionary by default."""
        return None

    # These two run while the others run, and must return at once: meanwhile the daemon waits.

    def cancel_requested(self):
        """After the jobs that run and wait were cancelled."""

    def pinged(self):
        pass


class _Worker:
    """Runs the handlers, off the thread that answers pings."""

    def __init__(self):
        self._work = queue.SimpleQueue()
        self._jobs = set()
        self._lock = threading.Lock()
        threading.Thread(target=self._run, name="spacekeep-service", daemon=True).start()

    def add(self, invocation, work, job=None):
        with self._lock:
            self._jobs.add(job)
        self._work.put((invocation, work, job))

    def cancel_all(self):
        with self._lock:
            for job in self._jobs - {None}:
                job.cancel()

    def end(self):
        self._work.put(None)

    def _run(self):
        while (item := self._work.get()) is not None:
            invocation, work, job = item
            _answer(invocation, work)
            with self._lock:
                self._jobs.discard(job)


def _answer(invocation, work):
    """Answers with what `work` gives, or with its failure. Nothing leaves the worker."""
    try:
        invocation.reply(*work())
    except Exception as error:  # the host serves on, whatever a handler does
        log.exception("a handler failed")
        invocation.fail("org.freedesktop.DBus.Error.Failed",
                        f"the service's handler ended with an exception: {error}")


def _optional(dictionary):
    """No dictionary travels as a list of none."""
    return "aa{sv}", [] if dictionary is None else [dictionary]


def _amount(answer):
    return _optional(answer if isinstance(answer, dict) else {"SPACEKEEP_AMOUNT": answer})


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
        self._service = service
        self._path = socket_path or _socket_from_environment()
        self._info = {"PURGE": bool(does_purge), "PERIODIC": bool(does_periodic),
                      "SPACEKEEP_NOTIFICATIONS": list(notifications)}
        self._on_status = on_status or (lambda state, text: log.info("%s %s", state, text))
        self._worker = _Worker()
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
        self._worker.end()
        self._on_status("stopped", "")

    def stop(self):
        """From any other thread: cancels what runs, and lets run() return."""
        self._stopped.set()
        self._worker.cancel_all()
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
            self._worker.cancel_all()

    def _open_endpoint(self, ours, attempt):
        """The daemon may take its time to come back over the endpoint, and may never do so."""
        try:
            attempt.keep(Connection(ours, serves=True, on_call=self._called,
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

    def _called(self, invocation):
        """Answers whether there is such a method."""
        if (invocation.interface, invocation.member) == ("org.freedesktop.DBus.Peer", "Ping"):
            invocation.reply()
            return True
        signature, serve = self._methods().get(invocation.member, (None, None))
        if serve is None or invocation.interface not in ("", INTERFACE):
            return False
        if invocation.signature == signature:
            serve(invocation)
        else:
            invocation.fail("org.freedesktop.DBus.Error.InvalidArgs",
                            f"{invocation.member} takes {signature!r}, not {invocation.signature!r}")
        return True

    def _methods(self):
        service = self._service
        return {
            "servicePurgeable": ("ia{sv}", lambda call: self._start(call, service.purgeable)),
            "servicePurge": ("ia{sv}", lambda call: self._start(call, service.purge)),
            "servicePeriodic": ("ia{sv}", lambda call: self._start(call, service.periodic)),
            "servicePing": ("", lambda call: _answer(call, lambda: service.pinged() or ())),
            "serviceCancelPurge": ("", self._cancel),
            "serviceNotify": ("a{sv}", lambda call: self._worker.add(
                call, lambda: self._notify(call.arguments[0]))),
            "serviceCallback": ("a{sv}", lambda call: self._worker.add(
                call, lambda: _optional(service.callback(call.arguments[0])))),
        }

    def _start(self, invocation, handler):
        job = Job(*invocation.arguments)
        self._worker.add(invocation, lambda: _amount(handler(job)), job)

    def _cancel(self, invocation):
        self._worker.cancel_all()
        _answer(invocation, lambda: self._service.cancel_requested() or ())

    def _notify(self, notification):
        for name, value in notification.items():
            self._service.notify(name, value)
        return ()


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

    def stop(*_):
        # The signal may have come while this very thread held a lock that stop() needs.
        threading.Thread(target=host.stop, daemon=True).start()

    for number in (signal.SIGTERM, signal.SIGINT):
        signal.signal(number, stop)
    host.run()
