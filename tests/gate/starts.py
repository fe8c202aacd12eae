#!/usr/bin/python3 -B
"""How the gate is started, by hand and by systemd, and the problems that it can meet. scene.py has the usage."""
import fcntl
import glob
import os
import shutil
import subprocess
import time

import scene

PATH = "/grant/Example.File/get"


class ByHand(scene.Scene):
    def setUp(self):
        self.id = self.token()

    def start_one(self, **options):
        gate = self.start_gate(**options)
        self.addCleanup(self.end, gate)
        return gate

    def call(self):
        return self.answer("calls", path=PATH, id=self.id)[0]

    def test_it_serves_and_ends_without_standard_streams(self):
        gate = self.start_one(preexec_fn=lambda: os.closerange(0, 3))
        self.serves_and_logs()
        self.assertEqual(self.end(gate), 0)

    def serves_and_logs(self):
        """The gate starts, but calls fail with a line in the log while others could open the lock."""
        self.assertEqual(self.call(), 200)
        os.chmod(self.at("session.lock"), 0o666)
        self.assertEqual(self.call(), 503)
        os.chmod(self.at("session.lock"), 0o600)
        self.assertEqual(self.call(), 200)

    def test_a_log_that_nobody_reads_does_not_end_it(self):
        reader, writer = os.pipe()
        self.start_one(stderr=writer)
        os.close(writer)
        os.close(reader)
        self.serves_and_logs()

    def test_the_time_that_it_waits_for_locks_ends_with_the_last_call_that_waits(self):
        self.start_one()
        with open(self.at("session.lock"), "a") as lock, scene.connected(self.at("calls")) as client:
            fcntl.flock(lock, fcntl.LOCK_EX)
            client.sendall(f"GET {PATH} HTTP/1.1\r\nHost: gate\r\nAuthorization: Bearer {self.id}\r\n\r\n".encode())
            time.sleep(0.2)
        self.assertTrue(self.is_soon('vemo_gate_calls_total{outcome="cancelled"}', 1))
        time.sleep(1)
        self.assertEqual(self.call(), 200)
        self.assertTrue(self.is_soon('vemo_gate_calls_total{outcome="granted"}', 1))
        self.assertTrue(0.1 < self.metric("vemo_gate_wait_seconds_total") < 0.9)

    def test_what_cannot_be_is_refused(self):
        for arguments, sentence in (
                *((("--once-header", name), f'"{name}" is no name of a header')
                  for name in ("", "X-Request-Once:", "X Once", "X\u00e9")),
                (("--status-socket", self.at("calls")), "--socket and --status-socket name the same path")):
            with self.subTest(arguments):
                result = subprocess.run([*self.gate_command(), *arguments], env=self.environment, timeout=5, text=True,
                                        stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
                self.assertEqual((result.returncode, result.stdout), (2, f"vemo-access-token-gate: {sentence}\n"))


class BySystemd(scene.Scene):
    """The gate's units: systemd finds nothing wrong with them, and passes both sockets to the gate."""
    PROGRAMS = ("systemd-analyze", "systemd-socket-activate")

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        with open(os.path.join(os.path.dirname(scene.GATE), "vemo-access-token-gate.service")) as unit:
            lines = [f"ExecStart={scene.GATE}\n" if line.startswith("ExecStart=") else line for line in unit]
        with open(cls.at("vemo-access-token-gate.service"), "w") as unit:
            unit.writelines(lines)
        for unit in glob.glob(os.path.join(scene.SOURCE, "deployment/systemd/*.socket")):
            shutil.copy(unit, cls.directory)

    def analyze(self, *arguments):
        return subprocess.run(["systemd-analyze", *arguments, *glob.glob(self.at("*.service"))], env=self.environment,
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)

    def test_it_has_nothing_to_say_against_the_units(self):
        # systemd-analyze looks up manual pages with man, which may not be installed.
        result = self.analyze("--man=no", "verify", *glob.glob(self.at("*.socket")))
        self.assertEqual((result.returncode, result.stdout), (0, ""))

    def test_the_service_keeps_little_of_roots_power(self):
        result = self.analyze("security", "--offline=true", "--threshold=15", "--no-pager")
        self.assertEqual(result.returncode, 0, result.stdout)
        self.assertIn("Overall exposure level", result.stdout)

    def test_it_hands_over_both_sockets(self):
        self.start("calls", "systemd-socket-activate", "--fdname=calls:status", "-l", self.at("calls"),
                   "-l", self.at("status"), "-E", "VEMO_REDIRECT_DIR", scene.GATE, "--user", "nobody")
        self.assertEqual(self.answer("status", path="/health")[::2], (200, "healthy\n"))
        self.assertEqual(self.answer("calls", path="/grant/Example.File")[0], 401)


if __name__ == "__main__":
    scene.main()
