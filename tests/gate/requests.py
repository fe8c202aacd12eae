#!/usr/bin/python3
"""What clients can send to the gate, and what they get for it: both of its processes, as they ship.

usage: requests.py GATE TOOL
GATE and TOOL: built with the redirection linked in.
"""
import contextlib
import os
import pwd
import re
import resource
import signal
import socket
import sqlite3
import subprocess
import sys
import tempfile
import time
import unittest

GATE, TOOL = sys.argv[1:3]
USER = "nobody" if os.getuid() == 0 else pwd.getpwuid(os.getuid()).pw_name
ME = pwd.getpwuid(0).pw_name
USES = 1000

LINE = "GET /grant/Api/get HTTP/1.1\r\n"
HOST = "Host: gate\r\n"
AUTH = "Authorization: Bearer {id}\r\n"

GRANTED = "200 X-Token-User: " + ME + ", X-Token-Uid: 0, X-Token-Function: VPN;"
UNAUTHORIZED = "401 WWW-Authenticate: Bearer; a token is needed: Authorization: Bearer ID\n"
MALFORMED = "400 ; malformed\n"
REFUSED = "403 ; refused\n"
NOT_ALLOWED = "405 Allow: GET, HEAD; not by this method\n"
TOO_LONG = "414 ; too long\n"
TOO_LARGE = "431 ; too large\n"
CLOSE = " close"


def call(headers="", line=LINE, auth=AUTH, host=HOST):
    return line + host + auth + headers + "\r\n"


def target(text):
    return call(line="GET " + text + " HTTP/1.1\r\n")


def by(method):
    return call(line=method + " /grant/Api/get HTTP/1.1\r\n")


def bearer(text):
    return call(auth="Authorization: " + text + "\r\n")


GOOD = call()

# What is sent, and all that comes back, response by response. The client sends nothing more, but stays open for
# reading, so whatever is not answered ends the connection. After " close", the gate has said so.
ROWS = [
    ("a call", GOOD, [GRANTED]),
    ("two calls in one packet", GOOD + GOOD, [GRANTED, GRANTED]),
    ("twenty calls in one packet", GOOD * 20, [GRANTED] * 20),
    ("a refusal between calls", GOOD + target("/grant/Other") + GOOD, [GRANTED, REFUSED, GRANTED]),
    ("a call without an id between calls", GOOD + call(auth="") + GOOD, [GRANTED, UNAUTHORIZED, GRANTED]),
    ("a call behind a malformed target", target("/other") + GOOD, [MALFORMED, GRANTED]),
    ("a call behind a malformed head", call(" folded\r\n") + GOOD, [MALFORMED + CLOSE]),
    ("a call behind a body", call("Content-Length: 4\r\n") + "body" + GOOD, [GRANTED + CLOSE]),
    ("a call as a body", call("Content-Length: 999\r\n") + GOOD, [GRANTED + CLOSE]),
    ("a call behind chunks", call("Transfer-Encoding: chunked\r\n") + "0\r\n\r\n" + GOOD, [GRANTED + CLOSE]),
    ("a call as a chunk", call("Transfer-Encoding: chunked\r\n") + "ff\r\n" + GOOD, [GRANTED + CLOSE]),
    ("a call behind one that closes", call("Connection: close\r\n") + GOOD, [GRANTED + CLOSE]),
    ("nothing", "", []),
    ("half a call", GOOD[:-1], [MALFORMED + CLOSE]),
    ("a call and a half", GOOD + GOOD[:20], [GRANTED, MALFORMED + CLOSE]),
    ("an empty line first", "\r\n" + GOOD, [MALFORMED + CLOSE]),
    # methods
    *((method, by(method), [GRANTED]) for method in
      ("POST", "PUT", "DELETE", "PATCH", "OPTIONS", "PROPFIND", "get", "M-SEARCH", "X" * 1000)),
    ("HEAD", by("HEAD"), [GRANTED]),
    ("HEAD that wants a record", call("Accept: application/json\r\n", line=LINE.replace("GET", "HEAD")),
     [GRANTED + "..."]),
    ("CONNECT", by("CONNECT") + GOOD, [NOT_ALLOWED, GRANTED]),
    ("CONNECT to a host", call(line="CONNECT example.org:443 HTTP/1.1\r\n"), [NOT_ALLOWED]),
    ("TRACE", by("TRACE"), [NOT_ALLOWED]),
    ("a method that is no token", by("GE(T"), [MALFORMED + CLOSE]),
    ("no method", call(line=" /grant/Api/get HTTP/1.1\r\n"), [MALFORMED + CLOSE]),
    # other protocols and versions
    ("TLS 1.3", b"\x16\x03\x01\x02\x00\x01\x00\x01\xfc\x03\x03" + bytes(range(256)), [MALFORMED + CLOSE]),
    ("SSL 2", b"\x80\x2e\x01\x00\x02" + bytes(44), [MALFORMED + CLOSE]),
    ("HTTP/2 preface", "PRI * HTTP/2.0\r\n\r\nSM\r\n\r\n", [MALFORMED + CLOSE]),
    ("HTTP/0.9", "GET /grant/Api/get\r\n", [MALFORMED + CLOSE]),
    ("HTTP/0.9 with headers", call(line="GET /grant/Api/get\r\n"), [MALFORMED + CLOSE]),
    ("a newer version", call(line="GET /grant/Api/get HTTP/1.2\r\n"), [MALFORMED + CLOSE]),
    ("a version of another size", call(line="GET /grant/Api/get HTTP/1.10\r\n"), [MALFORMED + CLOSE]),
    ("an offered upgrade", call("Connection: Upgrade, HTTP2-Settings\r\nUpgrade: h2c\r\n"), [GRANTED]),
    ("HTTP/1.0", call(line="GET /grant/Api/get HTTP/1.0\r\n") + GOOD, [GRANTED + CLOSE]),
    ("HTTP/1.0 without Host", call(line="GET /grant/Api/get HTTP/1.0\r\n", host=""), [GRANTED + CLOSE]),
    ("HTTP/1.0 that goes on", call("Connection: keep-alive\r\n", line="GET /grant/Api/get HTTP/1.0\r\n") + GOOD,
     [GRANTED + " keep-alive", GRANTED]),
    ("HTTP/1.0 in chunks", call("Transfer-Encoding: chunked\r\n", line="GET /grant/Api/get HTTP/1.0\r\n"),
     [MALFORMED + CLOSE]),
    ("a proxy's preface", "PROXY UNIX\r\n" + GOOD, [MALFORMED + CLOSE]),
    # bodies
    ("a length of none", call("Content-Length: 0\r\n") + GOOD, [GRANTED, GRANTED]),
    ("a body that does not come", call("Content-Length: 1000000\r\n"), [GRANTED + CLOSE]),
    ("a body to be asked for", call("Content-Length: 5\r\nExpect: 100-continue\r\n"), [GRANTED + CLOSE]),
    ("no body to be asked for", call("Expect: 100-continue\r\n"), [GRANTED]),
    ("two lengths", call("Content-Length: 4\r\nContent-Length: 5\r\n") + "body", [MALFORMED + CLOSE]),
    ("two equal lengths", call("Content-Length: 4\r\nContent-Length: 4\r\n") + "body", [MALFORMED + CLOSE]),
    ("a list of lengths", call("Content-Length: 4, 4\r\n") + "body", [MALFORMED + CLOSE]),
    ("length and chunks", call("Content-Length: 4\r\nTransfer-Encoding: chunked\r\n") + "0\r\n\r\n",
     [MALFORMED + CLOSE]),
    ("chunks and length", call("Transfer-Encoding: chunked\r\nContent-Length: 4\r\n") + "0\r\n\r\n",
     [MALFORMED + CLOSE]),
    *(("a length of " + repr(length), call("Content-Length: " + length + "\r\n"), [MALFORMED + CLOSE]) for length in
      ("", "-1", "+1", "1.0", "0x10", "1e1", "1 1", "1000000000000000000", "18446744073709551616", "\u0661")),
    *(("coded as " + repr(coding), call("Transfer-Encoding:" + coding + "\r\n") + "0\r\n\r\n" + GOOD,
       [MALFORMED + CLOSE]) for coding in
      ("", " identity", " gzip", " chunked, gzip", " gzip, chunked", " chunked, identity", " chunked;q=1",
       " chunked, chunked", " xchunked", " \"chunked\"", " chunked\r\nTransfer-Encoding: chunked",
       " chunked\r\nTransfer-Encoding: identity", "\x0bchunked")),
    *(("coded as " + repr(coding), call("Transfer-Encoding:" + coding + "\r\n"), [GRANTED + CLOSE]) for coding in
      ("chunked", " CHUNKED", "\t chunked \t")),
    ("a coding whose name is not one", call("Transfer-Encoding : chunked\r\n"), [MALFORMED + CLOSE]),
    ("a coding by another name", call("Transfer_Encoding: chunked\r\n") + GOOD, [GRANTED, GRANTED]),
    # lines
    ("bare LF everywhere", GOOD.replace("\r\n", "\n"), [MALFORMED + CLOSE]),
    ("bare LF behind the first line", GOOD.replace("\r\n", "\n", 1), [MALFORMED + CLOSE]),
    ("bare LF at the end", GOOD[:-2] + "\n", [MALFORMED + CLOSE]),
    ("bare CR in a value", call("X: a\rb\r\n"), [MALFORMED + CLOSE]),
    ("bare CR for a line", GOOD.replace("\r\n", "\r"), [MALFORMED + CLOSE]),
    ("CR CR LF", GOOD[:-2] + "\r\r\n", [MALFORMED + CLOSE]),
    ("a folded header", call("X: a\r\n b\r\n"), [MALFORMED + CLOSE]),
    ("a folded id", call(auth="Authorization: Bearer\r\n {id}\r\n"), [MALFORMED + CLOSE]),
    ("a header that begins with a blank", call(" X: a\r\n"), [MALFORMED + CLOSE]),
    ("a header without a colon", call("X\r\n"), [MALFORMED + CLOSE]),
    ("a header without a name", call(": x\r\n"), [MALFORMED + CLOSE]),
    ("a blank ahead of the colon", call("X : a\r\n"), [MALFORMED + CLOSE]),
    ("a NUL in a value", call("X: a\0b\r\n"), [MALFORMED + CLOSE]),
    ("a NUL in a name", call("X\0: a\r\n"), [MALFORMED + CLOSE]),
    ("a NUL behind the id", bearer("Bearer {id}\0"), [MALFORMED + CLOSE]),
    ("a bell in a value", call("X: \x07\r\n"), [MALFORMED + CLOSE]),
    ("a value beyond ASCII", call("X: \u00e4\r\n"), [GRANTED]),
    ("a tab in a value", call("X: a\tb\r\n"), [GRANTED]),
    ("no Host", call(host=""), [MALFORMED + CLOSE]),
    ("two Hosts", call(HOST), [MALFORMED + CLOSE]),
    ("an empty Host", call(host="Host:\r\n"), [GRANTED]),
    # targets
    ("the API alone", target("/grant/Api"), [GRANTED]),
    ("what is ignored", target("/grant/Api/get/x/../../%00?y=/z"), [GRANTED]),
    ("an escaped letter", target("/grant/%41pi/ge%74"), [GRANTED]),
    ("an escaped slash", target("/grant/Api%2Fget"), [MALFORMED]),
    ("an escaped NUL", target("/grant/Api/get%00"), [MALFORMED]),
    ("an escaped escape", target("/grant/Api/get%2500"), [REFUSED]),
    ("an escape cut off", target("/grant/Api/get%7"), [MALFORMED]),
    ("an escape that is none", target("/grant/Api/%xx"), [MALFORMED]),
    ("a NUL", target("/grant/Api/get\0"), [MALFORMED + CLOSE]),
    ("a dot", target("/grant/./Api/get"), [MALFORMED]),
    ("two dots", target("/grant/Other/../Api/get"), [MALFORMED]),
    ("two escaped dots", target("/grant/Other/%2e./Api"), [MALFORMED]),
    ("two slashes ahead", target("//grant/Api/get"), [MALFORMED]),
    ("two slashes within", target("/grant//Api/get"), [MALFORMED]),
    ("an empty method", target("/grant/Api/"), [MALFORMED]),
    ("an empty method, and more", target("/grant/Api//get"), [MALFORMED]),
    ("no API", target("/grant/"), [MALFORMED]),
    ("another path", target("/grants/Api"), [MALFORMED]),
    ("the status", target("/health"), [MALFORMED]),
    ("a fragment", target("/grant/Api#/get"), [MALFORMED]),
    ("a blank", target("/grant/Api/get x"), [MALFORMED + CLOSE]),
    ("a tab", target("/grant/Api/get\tx"), [MALFORMED + CLOSE]),
    ("two blanks", target(" /grant/Api/get"), [MALFORMED + CLOSE]),
    ("an absolute form", target("http://gate/grant/Api/get"), [MALFORMED]),
    ("an asterisk", target("*"), [MALFORMED]),
    ("backslashes", target("\\grant\\Api\\get"), [MALFORMED]),
    ("the longest API", target("/grant/" + "a" * 512), [REFUSED]),
    ("too long an API", target("/grant/" + "a" * 513), [TOO_LONG]),
    ("too long a method", target("/grant/Api/" + "a" * 513), [TOO_LONG]),
    ("the longest line", target("/grant/Api/get/" + "a" * (16384 - 28)), [GRANTED]),
    ("too long a line", target("/grant/Api/get/" + "a" * (16385 - 28)), [TOO_LONG + CLOSE]),
    ("a line without an end", "G" * 100000, [TOO_LONG + CLOSE]),
    # headers
    ("255 headers more", call("X: 1\r\n" * 254), [GRANTED]),
    ("too many headers", call("X: 1\r\n" * 255), [TOO_LARGE + CLOSE]),
    ("3,000 headers", call("X: 1\r\n" * 3000), [TOO_LARGE + CLOSE]),
    ("nearly 64 KiB", call("X: " + "x" * 65000 + "\r\n"), [GRANTED]),
    ("more than 64 KiB", call("X: " + "x" * 65536 + "\r\n"), [TOO_LARGE + CLOSE]),
    ("a header without an end", LINE + "X: " + "x" * 200000, [TOO_LARGE + CLOSE]),
    # ids
    *(("an unknown id of %d bytes" % size, bearer("Bearer " + "x" * size), [REFUSED]) for size in
      (1, 126, 127, 128, 255, 256, 1024, 1025, 8000)),
    ("the beginning of an id", bearer("Bearer {id:.126}"), [REFUSED]),
    ("an id and a letter", bearer("Bearer {id}x"), [REFUSED]),
    ("an id and a word", bearer("Bearer {id} x"), [REFUSED]),
    ("two ids in one header", bearer("Bearer {id}, Bearer {id}"), [REFUSED]),
    ("a quoted id", bearer('Bearer "{id}"'), [REFUSED]),
    ("a pattern for ids", bearer("Bearer %"), [REFUSED]),
    ("an id that ends a statement", bearer("Bearer ';DROP/**/TABLE/**/token;--"), [REFUSED]),
    ("an id with blanks around it", bearer(" \tBEARER   {id}\t "), [GRANTED]),
    ("no header for an id", call(auth=""), [UNAUTHORIZED]),
    *(("a credential of " + repr(text), bearer(text), [UNAUTHORIZED]) for text in
      ("", "Bearer", "Bearer ", "Bearer\t{id}", "Bearer:{id}", "{id}", "Basic {id}", "Token {id}", "bearer{id}")),
    ("two headers for an id", call(AUTH), [MALFORMED]),
    ("a second, empty header", call("authorization:\r\n"), [MALFORMED]),
    ("a header for proxies", call(auth="Proxy-" + AUTH), [UNAUTHORIZED]),
    # records
    ("a record", call("Accept: application/json\r\n"), [GRANTED + "..."]),
    ("a record among others", call("Accept: text/html, Application/JSON;q=0.1\r\n"), [GRANTED + "..."]),
    ("what looks like a record", call("Accept: application/json-seq, */*\r\n"), [GRANTED]),
    # keys of repetitions
    ("a key", call("X-Once: 1\r\n") * 3, [GRANTED + "once"] + [GRANTED + "again"] * 2),
    ("an empty key", call("X-Once:\r\n") * 2, [GRANTED] * 2),
    ("the longest key", call("X-Once: " + "k" * 128 + "\r\n") * 2, [GRANTED, GRANTED + "again"]),
    ("too long a key", call("X-Once: " + "k" * 129 + "\r\n"), [MALFORMED]),
    ("two keys", call("X-Once: 2\r\nx-once: 2\r\n"), [MALFORMED]),
    ("a key with a NUL", call("X-Once: 3\0\r\n"), [MALFORMED + CLOSE]),
    ("a key of a refusal, for another call", target("/grant/Other").replace("\r\n\r\n", "\r\nX-Once: 4\r\n\r\n")
     + call("X-Once: 4\r\n"), [REFUSED, GRANTED]),
]


def few_descriptors():
    resource.setrlimit(resource.RLIMIT_NOFILE, (64, resource.getrlimit(resource.RLIMIT_NOFILE)[1]))


def responses(received, sent):
    """The responses in what was received, in words; each is checked for what all have."""
    found = []
    while received:
        head, separator, received = received.partition(b"\r\n\r\n")
        match = re.fullmatch(rb"HTTP/1\.1 (\d+) [A-Za-z -]+\r\nDate: \w{3}, \d\d \w{3} \d{4} [\d:]{8} GMT\r\n(.*?)"
                             rb"Cache-Control: no-store\r\n(Content-Type: (text/plain|application/json)\r\n)?"
                             rb"Content-Length: (\d+)(\r\nConnection: ([a-z-]+))?", head, re.DOTALL)
        if not match or not separator:
            return found + [repr(head)]
        size = int(match[5]) if not sent.startswith(b"HEAD") else 0
        body, received = received[:size], received[size:]
        special = match[2].decode().replace("\r\n", ", ")[:-2]
        text = match[1].decode() + " " + special + ";"
        if match[1] != b"200":
            text += " " + body.decode() if size else ""
        elif match[4] == b"application/json":
            text += "..." if b'"function":"VPN"' in body or size == 0 else "WHAT?"
        found.append(text + (" " + match[7].decode() if match[7] else ""))
    return found


class Gate(unittest.TestCase):
    def setUp(self):
        self.stack = contextlib.ExitStack()
        self.addCleanup(self.stack.close)
        memory = "/dev/shm"  # no disk that each call waits for
        self.directory = self.stack.enter_context(tempfile.TemporaryDirectory(
            prefix="vemo-gate.", dir=memory if os.access(memory, os.W_OK) else None))
        os.chmod(self.directory, 0o755)
        self.environment = dict(os.environ, VEMO_REDIRECT_DIR=self.directory + "/store")
        self.tool("init")
        self.id = self.tool("create", "--uid", "0", "--function", "VPN", "--allow", "Api:get", "--uses", str(USES))
        self.gate = subprocess.Popen(
            [GATE, "--socket", self.path("calls"), "--status-socket", self.path("status"), "--user", USER,
             "--once-header", "X-Once"], env=self.environment, preexec_fn=few_descriptors)
        self.stack.callback(self.stop)
        for _ in range(500):
            with contextlib.suppress(OSError):
                self.connect().close()
                break
            time.sleep(0.01)

    def stop(self):
        if self.gate.poll() is None:
            self.gate.send_signal(signal.SIGTERM)
        self.assertEqual(self.gate.wait(10), 0, "the gate is still there, and ends in order")

    def path(self, name):
        return os.path.join(self.directory, name)

    def tool(self, *arguments):
        return subprocess.run([TOOL, *arguments], env=self.environment, check=True, stdout=subprocess.PIPE,
                              text=True).stdout.strip()

    def database(self):
        return sqlite3.connect(self.path("store/vemo-access-token.db"), isolation_level=None)

    def uses(self):
        with contextlib.closing(self.database()) as database:
            return database.execute("SELECT count FROM token").fetchone()[0]

    def connect(self, name="calls"):
        client = socket.socket(socket.AF_UNIX)
        client.settimeout(10)
        try:
            client.connect(self.path(name))
        except OSError:
            client.close()
            raise
        return client

    def bytes(self, text):
        return text if isinstance(text, bytes) else text.replace("{id:.126}", self.id[:126]).replace(
            "{id}", self.id).encode()

    def exchange(self, sent, pieces=None, name="calls"):
        """All that comes back for what is sent, in one piece or in many."""
        with self.connect(name) as client:
            for piece in pieces or [sent]:
                with contextlib.suppress(BrokenPipeError):
                    client.sendall(piece)
            with contextlib.suppress(OSError):
                client.shutdown(socket.SHUT_WR)
            received = b""
            with contextlib.suppress(ConnectionResetError):
                while True:
                    more = client.recv(65536)
                    if not more:
                        break
                    received += more
            return received

    def metric(self, name):
        text = self.exchange(b"GET /metrics HTTP/1.1\r\nHost: gate\r\nConnection: close\r\n\r\n", name="status").decode()
        return float(re.search("^" + re.escape(name) + " (.*)$", text, re.MULTILINE)[1])

    def test_each_request_is_answered_exactly(self):
        self.assertGreaterEqual(len(ROWS), 100)
        self.assertEqual(len({row[0] for row in ROWS}), len(ROWS))
        left = USES
        for name, text, expected in ROWS:
            with self.subTest(name):
                sent = self.bytes(text)
                received = responses(self.exchange(sent), sent)
                self.assertEqual(received, [one.replace("once", "").replace("again", "") for one in expected])
                left -= sum(one.startswith("200") and not one.endswith("again") for one in expected)
                self.assertEqual(self.uses(), left)
        good = self.bytes(GOOD)
        self.assertEqual(responses(self.exchange(good, [good[i:i + 1] for i in range(len(good))]), good), [GRANTED])
        self.assertEqual(self.uses(), left - 1)

    @unittest.skipIf(min(resource.getrlimit(resource.RLIMIT_NOFILE)) < 1000, "few descriptors are allowed")
    def test_idle_clients_lock_nobody_out(self):
        good = self.bytes(GOOD)
        with contextlib.ExitStack() as stack:
            idle = [stack.enter_context(self.connect()) for _ in range(800)]  # of one user, 768 can be
            self.assertEqual(responses(self.exchange(good), good), [GRANTED])
            idle[-700].sendall(good)
            self.assertTrue(idle[-700].recv(100).startswith(b"HTTP/1.1 200 "))
            self.assertEqual(idle[0].recv(1), b"")

    def test_nothing_is_spent_while_another_program_holds_the_database(self):
        good = self.bytes(GOOD)
        with contextlib.closing(self.database()) as holder:
            holder.execute("BEGIN IMMEDIATE")
            gone = self.connect()
            gone.sendall(good)
            half = self.connect()
            half.sendall(good)
            half.shutdown(socket.SHUT_WR)
            keyed = self.connect()
            keyed.sendall(self.bytes(call("X-Once: 1\r\n")))
            time.sleep(0.1)
            for client in (gone, half, keyed):
                client.close()
            began = time.monotonic()
            received = self.exchange(good)
            self.assertEqual(responses(received, good), ["503 Retry-After: 1; not now; nothing was spent\n"])
            self.assertLess(0.9, time.monotonic() - began)
            self.assertLess(time.monotonic() - began, 1.5)
            waiting = [self.connect() for _ in range(2)]
            for client in waiting:
                client.sendall(self.bytes(call("X-Once: 1\r\n", line=LINE)))
            time.sleep(0.1)
            holder.execute("COMMIT")
        for client in waiting:
            self.assertTrue(client.recv(100).startswith(b"HTTP/1.1 200 "))
            client.close()
        self.assertEqual(self.uses(), USES - 1)
        while not self.metric('vemo_gate_calls_total{outcome="granted"}'): # what is told each second
            time.sleep(0.05)
        self.assertEqual(self.metric('vemo_gate_calls_total{outcome="cancelled"}'), 3)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
