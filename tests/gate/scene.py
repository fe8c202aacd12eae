"""What the tests of the gate as it ships share: a store, the gate on it, and its clients.

usage of each: NAME.py SOURCE-DIRECTORY GATE TOOL [CLASS...]
GATE and TOOL are built with the redirection linked in. All runs below a throw-away directory, on Unix sockets, as the
user who runs it. CLASS: the cases of this class only. Exit status 77: skipped, for the reason printed.
"""
import contextlib
import http.client
import os
import pwd
import re
import shutil
import socket
import sqlite3
import subprocess
import sys
import tempfile
import time
import unittest

SOURCE, GATE, TOOL = map(os.path.abspath, sys.argv[1:4])
PATH = "/usr/sbin:/usr/bin:/sbin:/bin"
OWNER = pwd.getpwuid(0).pw_name  # of all tokens
FUNCTION, FUNCTION_IN_HEADERS = "50 % \u00e4\r\n\x7f~!", "50%20%25%20%C3%A4%0D%0A%7F~!"


class UnixConnection(http.client.HTTPConnection):
    def __init__(self, path, tls):
        super().__init__("tokens.example" if tls else "example.org")
        self.path, self.tls = path, tls

    def connect(self):
        self.sock = connected(self.path)
        if self.tls:
            self.sock = self.tls.wrap_socket(self.sock, server_hostname=self.host)


def connected(path):
    client = socket.socket(socket.AF_UNIX)
    client.settimeout(10)
    try:
        client.connect(path)
    except OSError:
        client.close()
        raise
    return client


def is_within(seconds, condition):
    """Whether a condition becomes true within this time."""
    end = time.monotonic() + seconds
    while not condition():
        if time.monotonic() > end:
            return False
        time.sleep(0.01)
    return True


class Scene(unittest.TestCase):
    """A store, which all cases of a class share, and what is started around it."""
    PROGRAMS = ()  # that must be installed

    @classmethod
    def setUpClass(cls):
        for program in cls.PROGRAMS:
            if not shutil.which(program, path=PATH):
                raise unittest.SkipTest(f"{program} is not installed")
        memory = os.environ.get("TMPDIR", "/dev/shm")  # calls need not wait for a disk
        cls.directory = tempfile.mkdtemp(prefix="gate-", dir=memory if os.access(memory, os.W_OK) else None)
        cls.addClassCleanup(shutil.rmtree, cls.directory)
        cls.environment = {**os.environ, "PATH": PATH, "HOME": cls.directory, "GATE_SOCKET": cls.at("calls"),
                           "VEMO_REDIRECT_DIR": cls.at("session")}
        cls.tool("init")

    @classmethod
    def at(cls, name):
        return os.path.join(cls.directory, name)

    @classmethod
    def start(cls, name, *command, **options):
        """Starts a program that makes a socket and listens there, and ends with the last case."""
        before = cls.socket(name)
        with open(cls.at(os.path.basename(command[0]) + ".log"), "w+b") as log:
            program = subprocess.Popen(command, **{"env": cls.environment, "cwd": cls.directory, "stdout": log,
                                                   "stdin": subprocess.DEVNULL, "stderr": log, **options})
            cls.addClassCleanup(cls.end, program)
            is_within(5, lambda: cls.socket(name) not in (None, before) or program.poll() is not None)
            log.seek(0)
            if program.poll() is not None or cls.socket(name) in (None, before):
                raise AssertionError(f"{command[0]} does not listen: {log.read().decode()}")
        return program

    @classmethod
    def socket(cls, name):
        """The inode of the socket file where a program listens."""
        with contextlib.suppress(OSError), connected(cls.at(name)):
            return os.stat(cls.at(name)).st_ino

    @staticmethod
    def end(program):
        """Ends a program, and returns its exit status."""
        program.terminate()
        try:
            return program.wait(5)
        except subprocess.TimeoutExpired:
            program.kill()
            return program.wait()

    @classmethod
    def start_gate(cls, **options):
        cls.gate = cls.start("status", *cls.gate_command(), **options)  # the gate makes this socket last
        cls.answer("status", path="/health")  # both of its processes answer
        return cls.gate

    @classmethod
    def gate_command(cls):
        return (GATE, "--socket", cls.at("calls"), "--status-socket", cls.at("status"), "--user", "nobody",
                "--once-header", "X-Request-Once")

    @classmethod
    def tool(cls, *arguments):
        return subprocess.run([TOOL, *arguments], env=cls.environment, check=True, stdin=subprocess.DEVNULL,
                              stdout=subprocess.PIPE, text=True).stdout.strip()

    @classmethod
    def token(cls, uses=3):
        """The id of a new token."""
        return cls.tool("create", "--uid", "0", "--function", FUNCTION, "--uses", str(uses), "--allow", "Api:get",
                        "--allow", "Example.File:get,put", "--allow", "Example.Page:get,\u00e4++")

    @classmethod
    def grant_by_tool(cls, id):
        """The status that the gate would answer."""
        status = subprocess.run([TOOL, "grant", "-", "Api", "get"], env=cls.environment, input=id.encode(),
                                stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL).returncode
        return {0: 200, 1: 403}.get(status, status)

    @classmethod
    @contextlib.contextmanager
    def database(cls):
        path = cls.at("session/vemo-access-token.db")
        with contextlib.closing(sqlite3.connect(path, isolation_level=None)) as database:
            yield database

    @classmethod
    def uses(cls, id="*"):
        """The uses that are left of a token, or of all."""
        with cls.database() as database:
            return database.execute("SELECT coalesce(sum(count), 0) FROM token WHERE tid GLOB ?", (id,)).fetchone()[0]

    @classmethod
    def answer(cls, name, method="GET", path="/", id=None, headers=None, body=None, tls=None):
        """The status, the headers and the text of an answer on a socket."""
        headers = {**(headers or {}), **({"Authorization": "Bearer " + id} if id else {})}
        with contextlib.closing(UnixConnection(cls.at(name), tls)) as connection:
            connection.request(method, path, body, headers)
            answer = connection.getresponse()
            return answer.status, answer.headers, answer.read().decode()

    @classmethod
    def metric(cls, name):
        text = cls.answer("status", path="/metrics")[2]
        return float(re.search("^" + re.escape(name) + " (.*)$", text, re.MULTILINE)[1])

    @classmethod
    def is_soon(cls, name, value):
        """Whether a figure gets this value soon: figures can be a second old."""
        return is_within(3, lambda: cls.metric(name) == value)


def main():
    arguments = sys.argv[:1] + sys.argv[4:]
    result = unittest.main(argv=arguments, verbosity=2, exit=False).result
    if result.skipped and result.testsRun <= len(result.skipped):
        print("skipped:", result.skipped[0][1])
        sys.exit(77)
    sys.exit(not result.wasSuccessful())
