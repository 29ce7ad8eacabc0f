"""A service at a listening socket."""

import os
import socket
import struct
import tempfile
import threading
import time
import unittest

import spacekeep
from spacekeep import connection, listening
from spacekeep.served import INTERFACE

PATIENCE_SECONDS = 20


class Cache(spacekeep.Service):
    def __init__(self):
        self.purging = threading.Event()

    def purgeable(self, job):
        return 1000 * job.urgency

    def purge(self, job):
        self.purging.set()
        return 1 if job.wait(PATIENCE_SECONDS) else 0

    def periodic(self, job):
        raise OSError("no disk")


def process_at(path):
    with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as plain:
        plain.connect(path)
        return struct.unpack("3i", plain.getsockopt(socket.SOL_SOCKET, socket.SO_PEERCRED, 12))[0]


class Listening(unittest.TestCase):
    def start(self, **options):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.path = os.path.join(folder.name, "service")
        self.listening = socket.create_server(self.path, family=socket.AF_UNIX)
        self.addCleanup(self.listening.close)
        self.service = Cache()
        self.host = spacekeep.ListeningHost(self.service, listening=self.listening, **options)
        self.running = threading.Thread(target=self.host.run)
        self.running.start()
        self.addCleanup(self.end)

    def end(self):
        self.host.stop()
        self.running.join(PATIENCE_SECONDS)
        self.assertFalse(self.running.is_alive())

    def connect(self):
        made = connection.Connection(connection.connect(self.path))
        self.addCleanup(made.close)
        return made

    def ask(self, caller, member, *values, signature="ia{sv}"):
        return caller.call(INTERFACE, member, signature, values, PATIENCE_SECONDS)

    def test_answers_every_caller(self):
        self.start()
        for urgency in (1, 2):
            answer = self.ask(self.connect(), "servicePurgeable", urgency, {})
            self.assertEqual(answer, [[{"SPACEKEEP_AMOUNT": 1000 * urgency}]])

    def test_answers_pings_while_it_purges_and_a_cancel_ends_the_purge(self):
        self.start()
        caller = self.connect()
        answers = []
        purging = threading.Thread(target=lambda: answers.append(
            self.ask(caller, "servicePurge", 1, {"SPACEKEEP_AMOUNT": 5})))
        purging.start()
        self.assertTrue(self.service.purging.wait(PATIENCE_SECONDS))
        self.ask(caller, "servicePing", signature="")
        self.assertEqual(answers, [])
        self.ask(caller, "serviceCancelPurge", signature="")
        purging.join(PATIENCE_SECONDS)
        self.assertEqual(answers, [[[{"SPACEKEEP_AMOUNT": 1}]]])

    def test_a_purge_whose_caller_is_gone_is_cancelled(self):
        self.start()
        caller = self.connect()
        caller.call_later(INTERFACE, "servicePurge", "ia{sv}", (1, {}), lambda answer: None)
        self.assertTrue(self.service.purging.wait(PATIENCE_SECONDS))
        caller.close()
        # Handlers run one after another, so an answer to this one means that the purge has ended.
        began = time.monotonic()
        self.ask(self.connect(), "servicePurgeable", 1, {})
        self.assertLess(time.monotonic() - began, PATIENCE_SECONDS / 2)

    def test_a_handler_that_fails_fails_its_one_call(self):
        self.start()
        caller = self.connect()
        with self.assertLogs("spacekeep", "ERROR"), self.assertRaisesRegex(spacekeep.Failed, "no disk"):
            self.ask(caller, "servicePeriodic", 1, {})
        self.ask(caller, "servicePurgeable", 1, {})

    def test_arguments_of_another_kind_are_refused_in_words(self):
        self.start()
        with self.assertRaisesRegex(spacekeep.Failed, "servicePurge takes 'ia{sv}', not 's'"):
            self.ask(self.connect(), "servicePurge", "much", signature="s")

    def test_whoever_comes_when_it_is_full_is_cut_off(self):
        self.start()
        for _ in range(listening._MOST_CONNECTIONS):
            self.ask(self.connect(), "servicePing", signature="")
        with self.assertRaises((OSError, spacekeep.Error)):
            self.ask(self.connect(), "servicePing", signature="")

    def test_ends_when_nothing_was_asked_for_long_enough(self):
        self.start(stop_when_idle_seconds=0.2)
        self.ask(self.connect(), "servicePurgeable", 1, {})
        self.running.join(PATIENCE_SECONDS)
        self.assertFalse(self.running.is_alive())

    def test_who_connects_is_told_that_this_process_serves_and_not_the_one_that_made_the_socket(self):
        with tempfile.TemporaryDirectory() as folder:
            path = os.path.join(folder, "service")
            with socket.create_server(path, family=socket.AF_UNIX) as handed_over:
                other = os.fork()
                if other == 0:
                    handed_over.listen(1)
                    os._exit(0)
                os.waitpid(other, 0)
                self.assertEqual(process_at(path), other)
                host = spacekeep.ListeningHost(Cache(), listening=handed_over)
                self.assertEqual(process_at(path), os.getpid())
                host.stop()
                host.run()

    def test_without_a_socket_it_says_how_to_get_one(self):
        with self.assertRaisesRegex(RuntimeError, "systemd-socket-activate"):
            spacekeep.ListeningHost(Cache())


if __name__ == "__main__":
    unittest.main()
