"""What a service is made of, and how the daemon's calls reach it."""

import logging
import queue
import threading
import time

INTERFACE = "com.quorvel.SpacekeepServiceProtocol"

log = logging.getLogger("spacekeep")

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
        self._waiting = 0  # and at work
        self._lock = threading.Lock()
        threading.Thread(target=self._run, name="spacekeep-service", daemon=True).start()

    def add(self, invocation, work, job=None):
        with self._lock:
            self._jobs.add(job)
            self._waiting += 1
        self._work.put((invocation, work, job))

    def cancel_all(self):
        with self._lock:
            for job in self._jobs - {None}:
                job.cancel()

    def is_busy(self):
        with self._lock:
            return self._waiting > 0

    def end(self):
        self._work.put(None)

    def _run(self):
        while (item := self._work.get()) is not None:
            invocation, work, job = item
            _answer(invocation, work)
            with self._lock:
                self._jobs.discard(job)
                self._waiting -= 1


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


class Served:
    """One service, called over any number of connections."""

    def __init__(self, service):
        self._service = service
        self._worker = _Worker()
        self._last_call = time.monotonic()

    def cancel_all(self):
        self._worker.cancel_all()

    def end(self):
        self._worker.end()

    def idle_seconds(self):
        """Since the last call; none while there is work."""
        return 0.0 if self._worker.is_busy() else time.monotonic() - self._last_call

    def called(self, invocation):
        """Answers whether there is such a method. For a connection's own thread."""
        self._last_call = time.monotonic()
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
