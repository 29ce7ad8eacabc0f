"""To be a client of the Spacekeep daemon, or a service that gives space, in Python.

A client asks for space:

    with spacekeep.Client() as client:
        answer = client.purge("/home", 500_000_000, urgency=2, finish_early=True)
        print(answer["SPACEKEEP_AMOUNT"], "bytes were freed")

A service owns data that it can give up. It derives from Service, overrides what applies, and is handed
to serve(), which speaks with the daemon until the process is asked to end, or to serve_listening(), when the
service manager starts the program on demand.

Needs nothing but Python's own library. What can go wrong is an Error.
"""

from .client import Client
from .connection import SOCKET
from .errors import (Disconnected, Error, Failed, NotAllowed, NotSupported, Refused, TimedOut,
                     Unreachable)
from .listening import ListeningHost, serve_listening
from .served import Job, Service
from .service import Host, serve

__all__ = ["Client", "Disconnected", "Error", "Failed", "Host", "Job", "ListeningHost", "NotAllowed",
           "NotSupported", "Refused", "SOCKET", "Service", "TimedOut", "Unreachable", "serve",
           "serve_listening"]
