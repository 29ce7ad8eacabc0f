"""Two ends of a connection, and a host in front of a daemon of the test's making."""

import os
import socket
import tempfile
import threading
import unittest

import spacekeep
from spacekeep import client, connection, wire

PATIENCE_SECONDS = 20


def pair(on_call=None):
    """The end that calls, and the end that serves."""
    one, other = socket.socketpair()
    served = []
    thread = threading.Thread(
        target=lambda: served.append(connection.Connection(other, serves=True, on_call=on_call)))
    thread.start()
    calling = connection.Connection(one)
    thread.join(PATIENCE_SECONDS)
    return calling, served[0]


class Calls(unittest.TestCase):
    def setUp(self):
        self.calling, self.served = pair(self._serve)
        self.addCleanup(self.calling.close)
        self.addCleanup(self.served.close)
        self.kept = []

    def _serve(self, call):
        if call.member == "echo":
            call.reply(call.signature, *call.arguments)
        elif call.member == "fail":
            call.fail("com.example.Error", "in words")
        elif call.member == "raise":
            raise RuntimeError("broken")
        elif call.member == "keep":
            self.kept.append(call)
        else:
            return False
        return True

    def call(self, member, *values, signature="", timeout=PATIENCE_SECONDS):
        return self.calling.call("com.example", member, signature, values, timeout)

    def test_are_answered(self):
        self.assertEqual(self.call("echo", {"a": 1}, "b", signature="a{sv}s"), [{"a": 1}, "b"])

    def test_fail_in_words(self):
        with self.assertRaisesRegex(spacekeep.Failed, "in words"):
            self.call("fail")

    def test_of_what_is_not_there_are_told_so(self):
        with self.assertRaisesRegex(spacekeep.NotSupported, "no com.example.nothing here"):
            self.call("nothing")

    def test_after_a_broken_handler_are_answered_too(self):
        with self.assertRaisesRegex(spacekeep.Failed, "broken"):
            self.call("raise")
        self.assertEqual(self.call("echo"), [])

    def test_may_be_answered_late_and_in_any_order(self):
        answers = {}
        done = threading.Semaphore(0)

        def ask(number):
            answers[number] = self.call("keep", number, signature="u")
            done.release()

        for number in range(8):
            threading.Thread(target=ask, args=(number,)).start()
        while len(self.kept) < 8:
            self.call("echo")
        for call in reversed(self.kept):
            call.reply("u", *call.arguments)
        for _ in range(8):
            self.assertTrue(done.acquire(timeout=PATIENCE_SECONDS))
        self.assertEqual(answers, {number: [number] for number in range(8)})

    def test_end_with_the_callers_patience_and_an_answer_after_that_harms_nobody(self):
        with self.assertRaises(spacekeep.TimedOut):
            self.call("keep", timeout=0.05)
        self.kept[0].reply()
        self.assertEqual(self.call("echo"), [])

    def test_that_cannot_be_sent_fail_at_once_and_the_connection_goes_on(self):
        for values in (("x" * (2 << 20),), ({"a": object()},)):
            with self.assertRaises(ValueError):
                self.call("echo", *values, signature="s" if isinstance(values[0], str) else "a{sv}")
        self.assertEqual(self.call("echo"), [])

    def test_end_with_the_connection(self):
        failure = []

        def ask():
            try:
                self.call("keep", timeout=None)
            except spacekeep.Error as error:
                failure.append(error)

        asking = threading.Thread(target=ask)
        asking.start()
        while not self.kept:
            self.call("echo")
        self.served.close()
        asking.join(PATIENCE_SECONDS)
        self.assertIsInstance(failure[0], spacekeep.Disconnected)
        with self.assertRaises(spacekeep.Disconnected):
            self.call("echo")


class FirstWords(unittest.TestCase):
    def talk(self, said):
        """What the serving end answers to these bytes."""
        one, other = socket.socketpair()
        with one:
            one.settimeout(PATIENCE_SECONDS)
            one.sendall(said)
            one.shutdown(socket.SHUT_WR)
            try:
                connection.Connection(other, serves=True).close()
            except (OSError, wire.WireError):
                pass
            answer = b""
            try:
                while part := one.recv(4096):
                    answer += part
            except ConnectionResetError:
                pass  # it did not read everything, which is an end too
            return answer

    def test_may_all_come_at_once(self):
        answer = self.talk(b"\0AUTH EXTERNAL 30\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n")
        self.assertRegex(answer, rb"^OK [0-9a-f]{32}\r\nAGREE_UNIX_FD\r\n$")

    def test_may_be_said_in_two_steps(self):
        self.assertRegex(self.talk(b"\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"), rb"^DATA\r\nOK ")

    def test_of_another_kind_are_turned_down(self):
        self.assertEqual(self.talk(b"\0AUTH ANONYMOUS\r\nHELLO\r\n"), b"REJECTED EXTERNAL\r\nERROR\r\n")

    def test_without_end_are_cut_off(self):
        self.assertEqual(self.talk(b"\0" + b"x" * 100000), b"")
        self.assertEqual(self.talk(b"\0" + b"HELLO\r\n" * 1000).count(b"ERROR"), 16)


class NoDaemon(unittest.TestCase):
    def test_is_said(self):
        with self.assertRaisesRegex(spacekeep.Unreachable, "nobody listens at /nowhere/x"):
            spacekeep.Client("/nowhere/x")

    def test_that_closes_at_once_is_a_missing_right(self):
        with tempfile.TemporaryDirectory() as folder:
            path = os.path.join(folder, "socket")
            with socket.create_server(path, family=socket.AF_UNIX) as server:
                threading.Thread(target=lambda: server.accept()[0].close()).start()
                with self.assertRaisesRegex(spacekeep.NotAllowed, "CLIENT_ENTITLEMENT"):
                    spacekeep.Client(path)

    def test_that_says_nothing_is_not_waited_for(self):
        patience, connection.AUTHENTICATION_SECONDS = connection.AUTHENTICATION_SECONDS, 0.1
        self.addCleanup(setattr, connection, "AUTHENTICATION_SECONDS", patience)
        with tempfile.TemporaryDirectory() as folder:
            path = os.path.join(folder, "socket")
            with socket.create_server(path, family=socket.AF_UNIX):
                with self.assertRaises(spacekeep.Error):
                    spacekeep.Client(path)


class Jobs(unittest.TestCase):
    def test_take_what_is_missing_or_of_another_kind_as_absent(self):
        for amount, wanted in ((5, 5), (5.9, 5), (-5, 0), (True, 0), ("5", 0), (None, 0), (float("nan"), 0),
                               (float("inf"), (1 << 64) - 1)):
            with self.subTest(amount=amount):
                self.assertEqual(spacekeep.Job(1, {"SPACEKEEP_AMOUNT": amount}).amount, wanted)
        self.assertEqual(spacekeep.Job(1, {"SPACEKEEP_VOLUME": 5}).volume, "")

    def test_know_when_they_are_not_wanted_any_more(self):
        job = spacekeep.Job(1, {})
        self.assertFalse(job.cancelled())
        job.cancel()
        self.assertTrue(job.wait(PATIENCE_SECONDS))


class Hosts(unittest.TestCase):
    def test_try_again_until_they_are_stopped(self):
        states = []
        host = spacekeep.Host("a.b", spacekeep.Service(), socket_path="/nowhere/x",
                              on_status=lambda state, text: states.append(state))
        running = threading.Thread(target=host.run)
        running.start()
        while states.count("waiting") < 3:
            running.join(0.01)
        host.stop()
        running.join(PATIENCE_SECONDS)
        self.assertFalse(running.is_alive())
        self.assertEqual(states[:2], ["connecting", "waiting"])
        self.assertEqual(states[-1], "stopped")

    def test_need_an_id(self):
        with self.assertRaisesRegex(ValueError, "ID"):
            spacekeep.Host("", spacekeep.Service())


class OneDaemon:
    """Takes connections and treats each check-in as the test says."""

    def __init__(self, folder, check_in):
        self.path = os.path.join(folder, "socket")
        self.connections = []
        self._check_in = check_in
        self._server = socket.create_server(self.path, family=socket.AF_UNIX)
        threading.Thread(target=self._accept, daemon=True).start()

    def _accept(self):
        while True:
            try:
                plain = self._server.accept()[0]
            except OSError:
                return
            self.connections.append(connection.Connection(plain, serves=True, on_call=self._serve))

    def _serve(self, call):
        self._check_in(call)
        return True

    def close(self):
        self._server.shutdown(socket.SHUT_RDWR)
        self._server.close()
        for one in self.connections:
            one.close()


class CheckIns(unittest.TestCase):
    def states_when(self, check_in, enough, **options):
        """What a host tells in front of a daemon that checks in like this, until that is enough."""
        states = []
        told = threading.Condition()

        def tell(*state):
            with told:
                states.append(state)
                told.notify()

        with tempfile.TemporaryDirectory() as folder:
            daemon = OneDaemon(folder, check_in)
            host = spacekeep.Host("a.b", spacekeep.Service(), socket_path=daemon.path, on_status=tell,
                                  **options)
            running = threading.Thread(target=host.run)
            running.start()
            with told:
                self.assertTrue(told.wait_for(lambda: enough(states), PATIENCE_SECONDS), states)
            host.stop()
            running.join(PATIENCE_SECONDS)
            self.assertFalse(running.is_alive())
            daemon.close()
        return states

    def test_say_who_they_are_and_what_they_want(self):
        asked = []

        def check_in(call):
            asked.append((call.interface, call.member, call.signature, call.arguments))
            call.reply("aa{sv}as", [], [])

        self.states_when(check_in, lambda states: len(states) == 3, does_periodic=True,
                         notifications=["SPACEKEEP_CACHE_ENABLED"])
        info = {"PURGE": True, "PERIODIC": True, "SPACEKEEP_NOTIFICATIONS": ["SPACEKEEP_CACHE_ENABLED"]}
        self.assertEqual(asked, [(client.INTERFACE, "clientCheckin", "sha{sv}", ["a.b", 0, info])])

    def test_of_a_declared_service_wait_for_another_daemon(self):
        states = self.states_when(lambda call: call.reply("aa{sv}as", [], []),
                                  lambda states: len(states) == 3)
        self.assertEqual([state for state, _ in states],
                         ["connecting", "checking in", "refused", "stopped"])

    def test_that_fail_are_tried_again(self):
        states = self.states_when(lambda call: call.reply("aa{sv}as", [], ["too many"]),
                                  lambda states: [one[0] for one in states].count("waiting") == 2)
        self.assertTrue(states[2][1].startswith("too many; next try in "), states)

    def test_without_an_answer_say_which_right_may_be_missing(self):
        states = self.states_when(lambda call: None, lambda states: states[-1][0] == "waiting",
                                  patience_seconds=0.1)
        self.assertIn("SERVICE_ENTITLEMENT", states[2][1])
        self.assertEqual([state for state, _ in states[:4]],
                         ["connecting", "checking in", "checking in", "waiting"])


class Requests(unittest.TestCase):
    """What a client sends, and what it makes of the answers."""

    def setUp(self):
        self.asked = []
        self.answer = [{"SPACEKEEP_AMOUNT": 5}]
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        daemon = OneDaemon(folder.name, self._serve)
        self.addCleanup(daemon.close)
        self.client = spacekeep.Client(daemon.path)
        self.addCleanup(self.client.close)

    def _serve(self, call):
        self.asked.append((call.interface, call.member, *call.arguments))
        if call.member in ("clientSetState", "clientCancelPurge"):
            call.reply()
        else:
            call.reply("av" if call.member == "clientGetState" else "aa{sv}", self.answer)

    def test_say_only_what_the_caller_said(self):
        self.client.purge("/data", 7)
        self.client.purge("/data", 1 << 63, urgency=2, timeout_seconds=3, token="t", finish_early=False)
        self.client.purgeable("/data", itemized=True)
        self.client.history(before=9, limit=2, volume="/data")
        self.client.cancel("t")
        interface = client.INTERFACE
        self.assertEqual(self.asked, [
            (interface, "clientPurge", {"SPACEKEEP_VOLUME": "/data", "SPACEKEEP_AMOUNT": 7}),
            (interface, "clientPurge", {
                "SPACEKEEP_VOLUME": "/data", "SPACEKEEP_AMOUNT": 1 << 63, "SPACEKEEP_URGENCY": 2,
                "SPACEKEEP_PURGE_TIMEOUT": 3, "SPACEKEEP_TOKEN": "t", "SPACEKEEP_FINISH_EARLY": False}),
            (interface, "clientItemizedPurgeableSpace", {"SPACEKEEP_VOLUME": "/data"}),
            (client.HISTORY_INTERFACE, "clientHistory", {
                "SPACEKEEP_BEFORE": 9, "SPACEKEEP_LIMIT": 2, "SPACEKEEP_VOLUME": "/data"}),
            (interface, "clientCancelPurge", {"SPACEKEEP_TOKEN": "t"})])

    def test_are_refused_with_no_dictionary_and_not_with_an_empty_one(self):
        self.answer = [{}]
        self.assertEqual(self.client.purge("/data", 7), {})
        self.answer = []
        with self.assertRaisesRegex(spacekeep.Refused, "clientPurge"):
            self.client.purge("/data", 7)

    def test_for_a_state_that_is_not_there_give_none(self):
        self.answer = []
        self.assertIsNone(self.client.state("mine"))
        self.answer = [{"a": 1}]
        self.assertEqual(self.client.state("mine"), {"a": 1})
        self.client.set_state("mine", None)
        self.client.set_state("mine", [1])
        self.assertEqual(self.asked[2:], [(client.INTERFACE, "clientSetState", [], "mine"),
                                          (client.INTERFACE, "clientSetState", [[1]], "mine")])


class Surface(unittest.TestCase):
    def test_what_is_offered_is_there(self):
        for name in spacekeep.__all__:
            self.assertTrue(hasattr(spacekeep, name), name)
        self.assertEqual(client.INTERFACE, "com.quorvel.SpacekeepClientProtocol")


if __name__ == "__main__":
    unittest.main()
