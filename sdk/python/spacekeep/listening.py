"""A program that a descriptor file declares, and that the service manager starts when the daemon first
calls it."""

import os
import select
import socket
import threading

from .connection import AUTHENTICATION_SECONDS, Connection, daemon_users, peer_of
from .served import Served, log
from .service import stop_at_signals
from .wire import WireError

_FIRST_DESCRIPTOR = 3  # sd_listen_fds(3)
_MOST_CONNECTIONS = 16


def handed_over_socket():
    """The listening socket that the service manager left. Raises RuntimeError when there is none."""
    if os.environ.get("LISTEN_PID") != str(os.getpid()) or os.environ.get("LISTEN_FDS", "0") == "0":
        raise RuntimeError("no socket was handed over: let the service manager start this program, or "
                           "systemd-socket-activate --listen=PATH")
    return socket.socket(fileno=_FIRST_DESCRIPTOR)


def take_over(listening):
    """Who connects is told by the kernel that the process which listened last is at the other end: that
    shall be this one, and not the service manager."""
    listening.listen(socket.SOMAXCONN)


class ListeningHost:
    """Serves one service at a listening socket. The daemon, root and the process's own user may call;
    everybody else is cut off, and so is whoever comes when 16 are there."""

    def __init__(self, service, *, listening=None, stop_when_idle_seconds=None):
        self._listening = listening if listening is not None else handed_over_socket()
        take_over(self._listening)
        self._served = Served(service)
        self._stop_when_idle_seconds = stop_when_idle_seconds
        self._waker, self._wake = socket.socketpair()
        self._lock = threading.Lock()
        self._connections = set()
        self._free = threading.Semaphore(_MOST_CONNECTIONS)

    def run(self):
        """Serves until stop(), or until nothing was asked for long enough. Once."""
        self._listening.setblocking(False)
        while True:
            rest = self._rest_seconds()
            ready = [] if rest == 0 else select.select([self._listening, self._wake], [], [], rest)[0]
            if self._wake in ready or self._rest_seconds() == 0:
                break
            if ready:
                self._accept()
        self._served.cancel_all()
        with self._lock:
            connections = list(self._connections)
        for connection in connections:
            connection.close()
        self._served.end()
        self._waker.close()
        self._wake.close()

    def stop(self):
        """From any other thread: cancels what runs, and lets run() return."""
        self._served.cancel_all()
        try:
            self._waker.send(b"x")
        except OSError:
            pass  # it has ended by itself

    def _rest_seconds(self):
        """Until it has been idle for long enough; none: for ever."""
        if self._stop_when_idle_seconds is None:
            return None
        return max(0.0, self._stop_when_idle_seconds - self._served.idle_seconds())

    def _accept(self):
        try:
            plain = self._listening.accept()[0]
        except OSError as error:
            log.warning("accept: %s", error)
            return
        if peer_of(plain) not in daemon_users() or not self._free.acquire(blocking=False):
            plain.close()
            return
        threading.Thread(target=self._open, args=(plain,), daemon=True, name="spacekeep-accept").start()

    def _open(self, plain):
        """A peer may take its time to say who it is."""
        plain.settimeout(AUTHENTICATION_SECONDS)
        ended = threading.Event()

        def closed():
            ended.set()
            self._free.release()
            self._served.cancel_all()  # nobody waits for the answers any more

        try:
            connection = Connection(plain, serves=True, on_call=self._served.called, on_closed=closed)
        except (OSError, WireError):
            self._free.release()
            return
        with self._lock:
            self._connections.add(connection)
        ended.wait()
        with self._lock:
            self._connections.discard(connection)


def serve_listening(service, **options):
    """Serves until SIGTERM or SIGINT, or until idle; options as of ListeningHost. From the main
    thread."""
    host = ListeningHost(service, **options)
    stop_at_signals(host)
    host.run()
