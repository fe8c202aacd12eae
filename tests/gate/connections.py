#!/usr/bin/python3 -B
"""The gate's process that reads HTTP, by itself: its connections, its questions to the other process, and its limits.

usage: connections.py COMMAND...
COMMAND runs HttpServer. The test acts as its clients and as the other process, and moves its clock.
"""
import itertools
import mmap
import os
import re
import resource
import signal
import socket
import struct
import subprocess
import sys
import unittest

CALL = b"GET /grant/Api/get HTTP/1.1\r\nHost: gate\r\nAuthorization: Bearer id\r\n\r\n"
KEYED = CALL[:-2] + b"X-Once: key\r\n\r\n"
NO_CALL = b"GET /grant/Api HTTP/1.1\r\nHost: gate\r\n\r\n"

# The messages, as in gate/Messages.h, and their heads, as in gate/Messages.cpp.
GRANT, CANCEL, HEALTH, FIGURES = range(4)
GRANTED, REFUSED, FAILED, LATE, CANCELLED, TOLD, STOP = range(7)
REQUEST = struct.Struct("=QqBBHHH")
REPLY = struct.Struct("=QBBHHHHHI")
ALL_FIGURES = struct.pack("=22Q", *range(22))  # the last is the size of the store


def received(client):
    """The next bytes; none at the end of the connection."""
    return client.recv(32768)


def status(client):
    return int(received(client)[9:12])


def is_open(client):
    try:
        return client.recv(1, socket.MSG_DONTWAIT) != b""
    except BlockingIOError:
        return True


class Connections(unittest.TestCase):
    def setUp(self):
        self.numbers = itertools.count()
        self.link, link = socket.socketpair(socket.AF_UNIX, socket.SOCK_SEQPACKET)
        self.link.settimeout(30)
        clock = os.memfd_create("how far the clock is ahead, in ns")
        os.truncate(clock, 8)
        self.later = memoryview(mmap.mmap(clock, 8)).cast("q")
        with link, self.listener("calls") as calls, self.listener("status") as statuses, open(clock):
            given = [each.fileno() for each in (link, calls, statuses)] + [clock]
            self.server = subprocess.Popen([*sys.argv[1:], *map(str, given)], pass_fds=given)

    def tearDown(self):
        self.link.close()
        self.assertEqual(self.server.wait(30), 0)

    def address(self, name):
        """Without a file."""
        return f"\0gate-test {os.getpid()} {name}"

    def listener(self, name):
        listener = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM | socket.SOCK_NONBLOCK)
        listener.bind(self.address(name))
        listener.listen(2048)
        return listener

    def client(self, sent=b"", user=1000, where="calls"):
        """A client of this user that has sent this."""
        client = socket.socket(socket.AF_UNIX)
        self.addCleanup(client.close)
        client.setsockopt(socket.SOL_SOCKET, socket.SO_RCVTIMEO, struct.pack("ll", 30, 0))
        client.bind(self.address(f"client {next(self.numbers)} of {user}"))
        client.connect(self.address(where))
        client.sendall(sent)
        return client

    def asked(self, kind=GRANT):
        """The number of the next request to the other process. Those for figures, one a second, are answered here."""
        for _ in range(10):
            number, _, ask, *_ = REQUEST.unpack_from(self.link.recv(4096))
            if ask != FIGURES:
                self.assertEqual(ask, kind)
                return number
            self.answer(number, TOLD, figures=ALL_FIGURES)
        self.fail("nothing else is asked")

    def answer(self, number, outcome, figures=b""):
        user = b"anna" if outcome == GRANTED else b""
        self.link.send(REPLY.pack(number, outcome, 0, len(user), 0, 0, len(figures), 0, 0) + user + figures)

    def settle(self):
        """Returns when the server has handled all earlier events."""
        with self.client(NO_CALL, 0, "status") as client:
            self.assertEqual(status(client), 404)

    def pass_time(self, seconds):
        self.later[0] += int(seconds * 1e9)
        self.answer(0, LATE)  # wakes it up
        self.settle()

    def metric(self, name):
        with self.client(b"GET /metrics HTTP/1.1\r\nHost: gate\r\n\r\n", 0, "status") as client:
            return int(re.search(f"^{name} (.*)$", received(client).decode(), re.MULTILINE)[1])

    def fill(self, client, text, most):
        """Sends a text again and again, up to so many bytes, until the server accepts no more. How many it accepted."""
        sent = refused = 0
        while refused < 20 and sent < most:
            try:
                sent += client.send(text, socket.MSG_DONTWAIT)
                refused = 0
            except BlockingIOError:
                refused += 1
                self.settle()
        return sent

    def test_connections_that_are_too_slow_are_closed(self):
        for sent, seconds in ((b"", 75), (b"G", 5), (CALL[:-1], 5), (NO_CALL, 75), (NO_CALL + b"G", 5)):
            with self.subTest(sent), self.client(sent) as slow:
                if sent.startswith(NO_CALL):
                    self.assertEqual(status(slow), 401)
                self.settle()
                self.pass_time(seconds - 0.5)
                self.assertTrue(is_open(slow))
                self.pass_time(1)
                self.assertFalse(is_open(slow))

    def test_little_is_kept_for_a_client_that_does_not_read(self):
        greedy = self.client()
        much = 4 << 20  # more than the buffers of all sockets
        self.assertLess(self.fill(greedy, NO_CALL * 300, much), much)
        self.pass_time(6)
        with self.assertRaises(BrokenPipeError):
            greedy.send(NO_CALL, socket.MSG_DONTWAIT)

    def test_a_client_that_reads_late_is_served(self):
        late = self.client()
        sent = self.fill(late, NO_CALL, float("inf")) // len(NO_CALL)
        late.shutdown(socket.SHUT_WR)
        self.assertGreater(sent, 1000, "more than the server holds")
        answers = b"".join(iter(lambda: received(late), b""))
        self.assertEqual(answers.count(b"HTTP/1.1 401"), sent)

    def test_the_oldest_idle_connection_is_closed_to_make_room(self):
        oldest = self.client(user=2)
        idle = [self.client(user=1) for _ in range(768)]
        self.settle()
        self.assertTrue(is_open(idle[0]))
        one = self.client(user=1)
        self.settle()
        self.assertEqual(received(idle[0]), b"", "the oldest connection of the user who has too many")
        idle += [self.client(user=2) for _ in range(254)]
        self.settle()  # with the last connection that there is room for
        self.assertTrue(is_open(oldest))
        self.assertTrue(all(map(is_open, idle[1:])))
        idle.append(self.client(user=2))
        self.settle()
        self.assertEqual(received(oldest), b"", "the oldest connection of all")
        self.assertEqual(status(self.client(NO_CALL, user=3)), 401)
        one.send(NO_CALL)
        self.assertEqual(status(one), 401)
        self.assertTrue(all(map(is_open, idle[768:])))

    def test_calls_with_the_same_key_within_five_seconds_are_one(self):
        for outcome, expected in ((GRANTED, 200), (REFUSED, 403)):
            first = self.client(KEYED)
            number = self.asked()
            second = self.client(KEYED)
            self.settle()
            self.answer(number, outcome)
            self.assertEqual((status(first), status(second)), (expected, expected))
            self.pass_time(3)
            self.assertEqual(status(self.client(KEYED)), expected)
            self.pass_time(2)
        self.assertEqual(self.metric("vemo_gate_repeated_total"), 4)
        later = self.client()
        for outcome in (FAILED, LATE):  # nothing was spent
            later.send(KEYED)
            self.answer(self.asked(), outcome)
            self.assertEqual(status(later), 503)

    def test_a_later_call_keeps_its_key_when_an_earlier_one_is_answered(self):
        for outcome, expected in ((GRANTED, 200), (LATE, 503)):
            earlier = self.client(KEYED)
            number = self.asked()
            self.pass_time(5)
            later = self.client(KEYED)
            later_number = self.asked()
            self.answer(number, outcome)
            self.assertEqual(status(earlier), expected)
            again = self.client(KEYED)
            self.settle()
            self.answer(later_number, REFUSED)
            self.assertEqual((status(later), status(again)), (403, 403))
            self.pass_time(5)

    def test_the_key_of_a_client_that_has_gone_is_kept_until_its_call_is_decided(self):
        for is_cancelled in (True, False):
            gone = self.client(KEYED)
            number = self.asked()
            gone.close()
            self.assertEqual(self.asked(CANCEL), number)
            again = [self.client(KEYED) for _ in range(2)]
            self.settle()
            if is_cancelled:
                self.answer(number, CANCELLED)
                cancelled, number = number, self.asked()
                self.assertGreater(number, cancelled)
            self.answer(number, GRANTED)
            self.assertEqual([status(each) for each in (*again, self.client(KEYED))], [200] * 3)
            self.pass_time(6)

    def test_the_figures_that_were_received_are_shown_and_no_others(self):
        call = self.client(CALL)
        self.answer(self.asked(), REFUSED)  # asked() also answers the request for figures
        self.assertEqual(status(call), 403)
        self.assertEqual(self.metric("vemo_gate_store_bytes"), 21)
        prober = self.client(b"GET /health HTTP/1.1\r\nHost: gate\r\n\r\n", 0, "status")
        number = self.asked(HEALTH)
        prober.close()
        self.assertEqual(self.asked(CANCEL), number)
        self.answer(number, TOLD)
        self.assertEqual(self.metric("vemo_gate_store_bytes"), 21)

    def test_the_queue_to_the_other_process_has_a_limit(self):
        for _ in range(3000):
            self.client(CALL).close()
        self.assertEqual(status(self.client(CALL)), 503)
        for _ in range(2000):  # the other process goes on
            self.link.recv(4096)
        last = self.client(CALL.replace(b"id", b"last"))
        while b"last" not in (request := self.link.recv(4096)):
            pass
        self.answer(REQUEST.unpack_from(request)[0], REFUSED)
        self.assertEqual(status(last), 403)

    def test_clients_that_have_connected_are_served_before_it_stops(self):
        self.settle()
        self.server.send_signal(signal.SIGSTOP)
        clients = [self.client(CALL) for _ in range(200)]
        self.answer(0, STOP)
        self.server.send_signal(signal.SIGCONT)
        for _ in clients:
            self.answer(self.asked(), GRANTED)
        for client in clients:
            self.assertIn(b"\r\nConnection: close\r\n", received(client))
            self.assertEqual(received(client), b"")


if __name__ == "__main__":
    resource.setrlimit(resource.RLIMIT_NOFILE, (resource.getrlimit(resource.RLIMIT_NOFILE)[1],) * 2)
    unittest.main(argv=sys.argv[:1], verbosity=2)
