#!/usr/bin/python3 -B
"""The gate's answers agree with the uses that are spent, whatever happens to the gate. scene.py has the usage.

There are VEMO_TEST_FACTOR times as many kills (a whole number); VEMO_TEST_SEED chooses other moments for them.
"""
import collections
import concurrent.futures
import contextlib
import fcntl
import os
import random
import signal
import threading
import time

import scene

USES = 1000000
PATH = "/grant/Api/get"
UNANSWERED = "the connection ended"
TURNED_AWAY = "no connection"


class Exactness(scene.Scene):
    def setUp(self):
        self.ids = [self.token(USES) for _ in range(2)]
        self.answers = collections.Counter()
        self.start_gate()
        self.addCleanup(lambda: self.end(self.gate))

    @contextlib.contextmanager
    def clients(self, connect_each_time=False):
        """Clients that call one token after another until the block ends, or the connection."""
        is_over = threading.Event()

        def spend(number):
            client = None
            while not is_over.is_set():
                number += 1
                answer = TURNED_AWAY
                with contextlib.suppress(ConnectionRefusedError):
                    client = client or scene.connected(self.at("calls"))
                    answer = self.call(client, self.ids[number % len(self.ids)])
                self.answers[answer] += 1
                if connect_each_time and client:
                    client.close()
                    client = None
                elif not isinstance(answer, int):
                    break
            if client:
                client.close()

        with concurrent.futures.ThreadPoolExecutor(8) as pool:
            spenders = pool.map(spend, range(8))
            try:
                yield
            finally:
                is_over.set()
            list(spenders)  # raises the exception of any of them

    @staticmethod
    def call(client, id):
        try:
            client.sendall(f"GET {PATH} HTTP/1.1\r\nHost: gate\r\nAuthorization: Bearer {id}\r\n\r\n".encode())
            received = client.recv(4096)
        except ConnectionError:
            return UNANSWERED
        except TimeoutError:
            return "no answer, and no end"
        return int(received[9:12]) if received else UNANSWERED

    def expect_answers(self, *answers):
        self.assertEqual(set(self.answers), set(answers), self.answers)

    def test_grants_are_the_uses_spent_beside_the_tool(self):
        self.ids.append(self.token(100))
        before = self.uses()
        by_tool = collections.Counter()
        with self.clients():
            for number in range(30):
                by_tool[self.grant_by_tool(self.ids[number % 3]), number % 3 == 2] += 1
                for path in ("/health", "/metrics"):
                    self.assertEqual(self.answer("status", path=path)[0], 200, "nothing is in the way of a look")
            self.assertTrue(scene.is_within(10, lambda: self.answers[403]), "the third token has few uses")
        self.assertEqual(before - self.uses(), self.answers[200] + by_tool[200, False] + by_tool[200, True])
        self.assertEqual(by_tool[200, False], 20, "nothing is in the way of the tool")
        self.expect_answers(200, 403)
        print(f"\nfigure: gate beside the tool: {self.answers[200]} and {by_tool[200, False] + by_tool[200, True]} "
              "grants, all of them exact")

    def test_calls_are_answered_while_another_program_holds_the_lock(self):
        before = self.uses()
        with open(self.at("session.lock"), "a") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX)
            self.assertEqual(self.answer("calls", path=PATH, id=self.ids[0])[0], 503)
            self.assertEqual(self.uses(), before)
        time.sleep(0.02)
        # The gate got the lock after the caller had its answer, and must have released it.
        self.assertTrue(scene.is_within(0.5, self.is_lock_free))
        self.assertEqual(self.answer("calls", path=PATH, id=self.ids[0])[0], 200)
        self.assertEqual(self.uses(), before - 1)

    def is_lock_free(self):
        with open(self.at("session.lock"), "a") as lock, contextlib.suppress(BlockingIOError):
            fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)
            return True

    def test_nobody_is_turned_away_while_another_gate_takes_over(self):
        before = self.uses()
        with self.clients(connect_each_time=True):
            for _ in range(5):
                last = self.gate
                self.start_gate()
                self.assertEqual(self.end(last), 0)
        self.assertEqual(before - self.uses(), self.answers[200])
        self.expect_answers(200)

    def test_nothing_answered_is_lost_when_the_one_that_holds_the_tokens_is_killed(self):
        self.kill_some("parent", lambda: self.gate.pid)

    def test_nothing_answered_is_lost_when_the_one_that_reads_http_is_killed(self):
        self.kill_some("child", self.child)

    def child(self):
        with open(f"/proc/{self.gate.pid}/task/{self.gate.pid}/children") as children:
            return int(children.read())

    def kill_some(self, name, victim):
        """When one process dies, the other ends too. Without an answer, only the calls under way may be spent."""
        kills = 10 * int(os.environ.get("VEMO_TEST_FACTOR", 1))
        moments = random.Random(os.environ.get("VEMO_TEST_SEED", "1"))
        made = 0
        for _ in range(kills):
            before, unanswered = self.uses() + self.answers[200], self.answers[UNANSWERED]
            with self.clients():
                time.sleep(moments.uniform(0, 0.1))
                os.kill(victim(), signal.SIGKILL)
                self.assertNotEqual(self.gate.wait(10), 0)
            extra = before - self.uses() - self.answers[200]
            self.assertGreaterEqual(extra, 0, "a use was answered and not spent")
            self.assertLessEqual(extra, self.answers[UNANSWERED] - unanswered)
            made += extra
            self.start_gate()
        self.assertLessEqual(set(self.answers), {200, UNANSWERED, TURNED_AWAY})
        print(f"\nfigure: gate, its {name} killed: {kills} kills among {self.answers[200]} grants; nothing answered "
              f"was lost; of {self.answers[UNANSWERED]} calls without an answer {made} were made")


if __name__ == "__main__":
    scene.main()
