#!/usr/bin/python3 -B
"""What clients can send to the gate, and its answers, with both processes as they ship.

scene.py has the usage.
"""
import collections
import contextlib
import json
import re
import resource
import socket
import time

import scene

LINE = "GET /grant/Api/get HTTP/1.1\r\n"
HOST = "Host: gate\r\n"
AUTH = "Authorization: Bearer {id}\r\n"

GRANTED = f"200 OK; X-Token-User: {scene.OWNER}; X-Token-Uid: 0; X-Token-Function: {scene.FUNCTION_IN_HEADERS}"
RECORD = GRANTED + "; a record"
AGAIN = GRANTED + " again"  # the answer that was given before
UNAUTHORIZED = "401 Unauthorized; WWW-Authenticate: Bearer; a token is needed: Authorization: Bearer ID\n"
MALFORMED = "400 Bad Request; malformed\n"
REFUSED = "403 Forbidden; refused\n"
NOT_ALLOWED = "405 Method Not Allowed; Allow: GET, HEAD; not by this method\n"
TOO_LONG = "414 URI Too Long; too long\n"
TOO_LARGE = "431 Request Header Fields Too Large; too large\n"
NOT_NOW = "503 Service Unavailable; Retry-After: 1; not now; nothing was spent\n"
CLOSE = " close"

USES = 1000
LONGEST_ID = "x" * 1024
BLANK_ID = "x " * 70 + "x"  # a header cannot carry this id


def call(headers="", line=LINE, auth=AUTH, host=HOST):
    return line + host + auth + headers + "\r\n"


def target(text):
    return call(line="GET " + text + " HTTP/1.1\r\n")


def by(method):
    return call(line=method + " /grant/Api/get HTTP/1.1\r\n")


def bearer(text):
    return call(auth="Authorization: " + text + "\r\n")


def once(key):
    return "X-Request-Once: " + key + "\r\n"


def head_of(size):
    empty = call("X: \r\n", auth="Authorization: Bearer x\r\n")
    return empty.replace("X: ", "X: " + "x" * (size - len(empty)))


def headers(text):
    """A call with these headers too, and text that would be another call if they marked the end of a body."""
    return call(text + "\r\n") + "0\r\n\r\n" + GOOD


def rows(name, send, expected, *texts):
    """Rows for texts that are sent in the same form and get the same answer."""
    return [(f"{name} {text!r}", send(text), expected) for text in texts]


GOOD = call()
OLD = "GET /grant/Api/get HTTP/1.0\r\n"

# What a client sends, and all responses. The client then sends nothing more and reads until the gate ends the
# connection. CLOSE: the response says that the gate ends it.
ROWS = [
    ("a call", GOOD, [GRANTED]),
    ("twenty calls in one packet", GOOD * 20, [GRANTED] * 20),
    ("a refusal between calls", GOOD + target("/grant/Other") + GOOD, [GRANTED, REFUSED, GRANTED]),
    ("a call without an id between calls", GOOD + call(auth="") + GOOD, [GRANTED, UNAUTHORIZED, GRANTED]),
    ("a call behind a malformed target", target("/other") + GOOD, [MALFORMED, GRANTED]),
    ("a call behind a body", call("Content-Length: 4\r\n") + "body" + GOOD, [GRANTED + CLOSE]),
    ("a call as a body", call("Content-Length: 999\r\n") + GOOD, [GRANTED + CLOSE]),
    ("a call as a chunk", call("Transfer-Encoding: chunked\r\n") + "ff\r\n" + GOOD, [GRANTED + CLOSE]),
    ("nothing", "", []),
    ("half a call", GOOD[:-1], [MALFORMED + CLOSE]),
    ("a call and a half", GOOD + GOOD[:20], [GRANTED, MALFORMED + CLOSE]),
    ("a call and a NUL", GOOD + "\0", [GRANTED, MALFORMED + CLOSE]),
    # methods
    *rows("the method", by, [GRANTED], "POST", "PUT", "DELETE", "PATCH", "OPTIONS", "PROPFIND", "get", "M-SEARCH",
          "X" * 1000, "HEAD"),
    ("HEAD that wants a record", call("Accept: application/json\r\n", line=LINE.replace("GET", "HEAD")), [RECORD]),
    ("CONNECT", by("CONNECT") + GOOD, [NOT_ALLOWED, GRANTED]),
    ("CONNECT to a host", call(line="CONNECT example.org:443 HTTP/1.1\r\n"), [NOT_ALLOWED]),
    ("TRACE", by("TRACE"), [NOT_ALLOWED]),
    # other protocols and versions
    *rows("what begins with", lambda text: text + "\r\n" + GOOD, [MALFORMED + CLOSE],
          # an empty line, TLS 1.3, SSL 2, a proxy, HTTP/2, HTTP/0.9
          "", "\x16\x03\x01\x02\x00\x01\x00\x01\udcfc\x03\x03", "\udc80\x2e\x01\x00\x02\0\0", "PROXY UNIX",
          "PRI * HTTP/2.0\r\n\r\nSM\r\n", "GET /grant/Api/get"),
    *rows("the first line", lambda text: call(line=text + "\r\n"), [MALFORMED + CLOSE],
          "GET /grant/Api/get", "GET /grant/Api/get HTTP/1.2", "GET /grant/Api/get HTTP/1.1 ",
          "GET /grant/Api/get http/1.1", "GET /grant/Api/get HTTP/1.10", "GET", " /grant/Api/get HTTP/1.1",
          "GE(T /grant/Api/get HTTP/1.1"),
    ("an offered upgrade", call("Connection: Upgrade, HTTP2-Settings\r\nUpgrade: h2c\r\n"), [GRANTED]),
    ("HTTP/1.0", call(line=OLD) + GOOD, [GRANTED + CLOSE]),
    ("HTTP/1.0 without Host", call(line=OLD, host=""), [GRANTED + CLOSE]),
    ("HTTP/1.0 that goes on", call("Connection: Keep-Alive\r\n", line=OLD) + GOOD, [GRANTED + " keep-alive", GRANTED]),
    ("HTTP/1.0 in chunks", call("Transfer-Encoding: chunked\r\n", line=OLD), [MALFORMED + CLOSE]),
    # bodies, and other reasons to end a connection
    *rows("behind", headers, [GRANTED + CLOSE], "Content-Length: 10", "Content-Length: " + "9" * 18,
          "Content-Length: 5\r\nExpect: 100-continue", "Transfer-Encoding:chunked", "Transfer-Encoding: CHUNKED",
          "Transfer-Encoding:\t chunked \t", "Connection: close", "Connection: x,\tCLOSE ,y",
          "Connection: keep-alive\r\nConnection: close"),
    *rows("a call behind", lambda text: call(text + "\r\n") + GOOD, [GRANTED, GRANTED], "Content-Length: 0",
          "Content-Length: 000", "Expect: 100-continue", "Transfer_Encoding: chunked", "Connection: closed, x-close",
          "X: close, application/json", "X: \u00e4\udcff", "X: a\tb"),
    *rows("a length of", lambda text: headers("Content-Length: " + text), [MALFORMED + CLOSE], "", "-1", "+1", "1.0",
          "0x10", "1e1", "1 1", "4, 4", "1000000000000000000", "18446744073709551616", "\u0661",
          "4\r\nContent-Length: 5", "4\r\nContent-Length: 4", "4\r\nTransfer-Encoding: chunked"),
    *rows("coded as", lambda text: headers("Transfer-Encoding:" + text), [MALFORMED + CLOSE], "", " identity", " gzip",
          " chunked, gzip", " gzip, chunked", " chunked, identity", " chunked;q=1", " chunked, chunked", " xchunked",
          " \"chunked\"", " chunked\r\nTransfer-Encoding: chunked", " chunked\r\nTransfer-Encoding: identity",
          " chunked\r\nContent-Length: 4", "\x0bchunked"),
    # lines
    *rows("the header", headers, [MALFORMED + CLOSE], "Transfer-Encoding : chunked", "X: a\r\n b", " X: a", "X", ": x",
          "X : a", "X: a\rb", "X: a\0b", "X\0: a", "X: \x07", "X: \x7f", "X\u00e4: 1", "X: a\nX: b", "X: a\r",
          "Host: gate"),
    ("bare LF everywhere", GOOD.replace("\r\n", "\n"), [MALFORMED + CLOSE]),
    ("bare LF behind the first line", GOOD.replace("\r\n", "\n", 1), [MALFORMED + CLOSE]),
    ("bare LF at the end", GOOD[:-2] + "\n", [MALFORMED + CLOSE]),
    ("bare CR for a line", GOOD.replace("\r\n", "\r"), [MALFORMED + CLOSE]),
    ("a folded id", call(auth="Authorization: Bearer\r\n {id}\r\n"), [MALFORMED + CLOSE]),
    ("a NUL behind the id", bearer("Bearer {id}\0"), [MALFORMED + CLOSE]),
    ("no Host", call(host=""), [MALFORMED + CLOSE]),
    ("an empty Host", call(host="Host:\r\n"), [GRANTED]),
    # targets
    *rows("the target", target, [GRANTED],
          "/grant/Api", "/grant/Api?/put", "/grant/Api/get/", "/grant/Api/get/x/../../%00//?y=/z", "/grant/%41pi/ge%74",
          "/grant/Example.Page/\u00e4++", "/grant/Example.Page/%c3%A4%2b+?x=%zz"),
    *rows("the target", target, [REFUSED],
          "/grant/Api/get%2500", "/grant/%252F/%25", "/grant/.../..%20", "/grant/" + "a" * 512 + "/" + "a" * 512),
    *rows("the target", target, [MALFORMED],
          "/grant", "/grant/", "/grant/?x", "/grant//Api/get", "//grant/Api/get", "/grants/Api", "/Grant/Api",
          "/grant/Api/", "/grant/Api//get", "/grant/Api/?get",  # the API alone would allow more than a method
          "/grant/Api%2Fget", "/grant/Api/%2f", "/grant/Api%00", "/grant/Api/get%00", "/grant/Api/get%7", "/grant/Api%",
          "/grant/Api%4/1", "/grant/Api%4g", "/grant/Api/%xx", "/grant/Api%-1", "/grant/Api#/get", "/grant/Api/get?x#y",
          "/grant/./Api/get", "/grant/Other/../Api/get", "/grant/Other/%2e./Api", "/grant/Api/%2e%2E/x", "/health",
          "/grant/Api/..", "/grant/Api/.", "http://gate/grant/Api/get", "*", "\\grant\\Api\\get"),
    *rows("the target", target, [MALFORMED + CLOSE],
          "/grant/Api/get\0", "/grant/Api/get x", "/grant/Api/get\tx", " /grant/Api/get"),
    ("too long an API", target("/grant/" + "a" * 513), [TOO_LONG]),
    ("too long a method", target("/grant/Api/" + "a" * 513), [TOO_LONG]),
    ("the longest line", target("/grant/Api/get/" + "a" * (16384 - 28)), [GRANTED]),
    ("the longest line, of one word", "G" * 16384 + "\n", [MALFORMED + CLOSE]),
    ("too long a line", target("/grant/Api/get/" + "a" * (16385 - 28)), [TOO_LONG + CLOSE]),
    ("too long a line, of one word", "G" * 16385 + "\n", [TOO_LONG + CLOSE]),
    ("a line without an end", "G" * 100000, [TOO_LONG + CLOSE]),
    # headers
    ("255 headers more", call("X: 1\r\n" * 254), [GRANTED]),
    ("too many headers", call("X: 1\r\n" * 255), [TOO_LARGE + CLOSE]),
    ("the largest head", head_of(65536), [REFUSED]),
    ("too large a head", head_of(65537), [TOO_LARGE + CLOSE]),
    ("a header without an end", LINE + "X: " + "x" * 200000, [TOO_LARGE + CLOSE]),
    # ids
    *rows("an unknown id of this size:", lambda size: bearer("Bearer " + "x" * size), [REFUSED],
          1, 126, 127, 128, 255, 256, 1023, 1025, 8000),
    *rows("the credential", lambda text: bearer("Bearer " + text), [REFUSED], "{id:.126}", "{id}x", BLANK_ID, "{id} x",
          "{id}, Bearer {id}", '"{id}"', "%", "';DROP/**/TABLE/**/token;--"),
    ("the longest id", bearer("Bearer " + LONGEST_ID), [GRANTED]),
    ("an id with blanks around it", call(auth="AUTHORIZATION: \tBEARER   {id}\t \r\n"), [GRANTED]),
    ("no header for an id", call(auth=""), [UNAUTHORIZED]),
    *rows("the credential", bearer, [UNAUTHORIZED],
          "", "Bearer", "Bearer ", "Bearer\t{id}", "Bearer:{id}", "{id}", "Basic {id}", "Token {id}", "bearer{id}"),
    ("two headers for an id", call(AUTH), [MALFORMED]),
    ("a second, empty header", call("authorization:\r\n"), [MALFORMED]),
    ("a header for proxies", call(auth="Proxy-" + AUTH), [UNAUTHORIZED]),
    # records
    *rows("a record by", lambda text: call(text + "\r\n"), [RECORD], "Accept: application/json",
          "Accept: text/html, Application/JSON;q=0.1", "Accept: text/*\r\nACCEPT:application/json"),
    ("what looks like a record", call("Accept: application/json-seq, */*\r\n"), [GRANTED]),
    # keys of repetitions
    ("a key", call(once("1")) * 3, [GRANTED] + [AGAIN] * 2),
    ("an empty key", call(once("")) * 2, [GRANTED] * 2),
    ("the longest key", call(once("k" * 128)) * 2, [GRANTED, AGAIN]),
    ("too long a key", call(once("k" * 129)), [MALFORMED]),
    ("two keys", call(once("2") + once("2").lower()), [MALFORMED]),
    ("a key with a NUL", call(once("3\0")), [MALFORMED + CLOSE]),
    ("a key for other calls", call(once("4")) + call(once("4"), line="GET /grant/Api HTTP/1.1\r\n")
     + call(once("4"), line="GET /grant/Other/get HTTP/1.1\r\n") + call(once("4"), auth="Authorization: Bearer x\r\n")
     + call(once("4") + "Accept: application/json\r\n"), [GRANTED, GRANTED, REFUSED, REFUSED, RECORD]),
    ("a key of a refusal", target("/grant/Other").replace("\r\n\r\n", "\r\n" + once("5") + "\r\n") + call(once("5")),
     [REFUSED, GRANTED]),
]


def few_descriptors():
    resource.setrlimit(resource.RLIMIT_NOFILE, (64, resource.getrlimit(resource.RLIMIT_NOFILE)[1]))


def responses(received, sent):
    """The responses in the received bytes, in words. Each must have the lines that all have in common."""
    found = []
    while received:
        head, separator, received = received.partition(b"\r\n\r\n")
        match = re.fullmatch(rb"HTTP/1\.1 (\d+ [A-Za-z -]+)\r\nDate: \w{3}, \d\d \w{3} \d{4} [\d:]{8} GMT\r\n(.*?)"
                             rb"Cache-Control: no-store\r\n(Content-Type: (text/plain|application/json)\r\n)?"
                             rb"Content-Length: (\d+)(\r\nConnection: ([a-z-]+))?", head, re.DOTALL)
        if not match or not separator:
            return found + [repr(head)]
        status, special, _, kind, size, _, connection = (part.decode() if part else "" for part in match.groups())
        size = int(size) if not sent.startswith("HEAD") else 0
        body, received = received[:size].decode(), received[size:]
        text = [status, *special.split("\r\n")[:-1]]
        if kind == "application/json" and (size == 0 or json.loads(body)["function"] == scene.FUNCTION):
            text.append("a record")
        elif body:
            text.append(body)
        found.append("; ".join(text) + (" " + connection if connection else ""))
    return found


class Requests(scene.Scene):
    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.id = cls.token(USES)
        with cls.database() as database:
            for id in (LONGEST_ID, BLANK_ID):
                database.execute("INSERT INTO token SELECT ?, bind_sid, uid, deadline, count, create_time, function, "
                                 "webapi_allow, extra FROM token LIMIT 1", (id,))
        cls.start_gate(preexec_fn=few_descriptors)

    def connect(self, text=""):
        """A client that has sent this."""
        client = scene.connected(self.at("calls"))
        self.addCleanup(client.close)
        with contextlib.suppress(BrokenPipeError):
            client.sendall(self.bytes(text))
        return client

    def bytes(self, text):
        return text.replace("{id:.126}", self.id[:126]).replace("{id}", self.id).encode(errors="surrogateescape")

    def received(self, client, sent):
        """All that a client gets after it has ended its sending, in words."""
        with contextlib.suppress(OSError):
            client.shutdown(socket.SHUT_WR)
        received = b""
        with contextlib.suppress(ConnectionResetError):
            while more := client.recv(65536):
                received += more
        client.close()
        return responses(received, sent)

    def test_each_is_answered_exactly(self):
        self.assertEqual(len({row[0] for row in ROWS}), len(ROWS))
        before, expected_counts = self.counts(), collections.Counter(["200"])  # of this request for the counts
        idle = [self.connect() for _ in range(100)]  # more than the gate's descriptors at its start
        for name, text, expected in ROWS:
            with self.subTest(name):
                left = self.uses()
                received = self.received(self.connect(text), text)
                expected_counts.update(one[:3] for one in received)
                self.assertEqual(received, [GRANTED if one == AGAIN else one for one in expected])
                spent = sum(one.startswith(GRANTED) and one != AGAIN for one in expected)
                self.assertEqual(self.uses(), left - spent)
        with self.subTest("a call, byte by byte"):
            for byte in self.bytes(GOOD):
                idle[0].sendall(bytes([byte]))
            self.assertEqual(self.received(idle[0], GOOD), [GRANTED])
            expected_counts["200"] += 1
        with self.subTest("a wrong beginning of a head, before its end"):
            idle[1].sendall(b"\r\n")
            self.assertTrue(idle[1].recv(4096).startswith(b"HTTP/1.1 400 "))
            expected_counts["400"] += 1
        self.assertEqual(self.counts() - before, expected_counts)

    def counts(self):
        """How often each status was answered, as the gate counts it."""
        text = self.answer("status", path="/metrics")[2]
        lines = re.findall(r'^vemo_gate_responses_total{status="(\d+)"} (\d+)$', text, re.MULTILINE)
        return collections.Counter({status: int(number) for status, number in lines})

    def test_nothing_is_spent_while_another_program_holds_the_database(self):
        left = self.uses()
        with self.database() as holder:
            holder.execute("BEGIN IMMEDIATE")
            half = self.connect(GOOD)
            half.shutdown(socket.SHUT_WR)
            gone = [half, self.connect(GOOD), self.connect(call(once("gone")))]
            self.assertTrue(self.is_soon("vemo_gate_connections", 4), "these and the one that asks")
            for client in gone:
                client.close()
            began = time.monotonic()
            self.assertEqual(self.received(self.connect(GOOD), GOOD), [NOT_NOW])
            took = time.monotonic() - began
            self.assertTrue(0.9 < took < 1.5, took)
            self.assertTrue(self.is_soon("vemo_gate_connections", 1))
            waiting = [self.connect(call(once("gone"))) for _ in range(2)]
            self.assertTrue(self.is_soon("vemo_gate_connections", 3))
            holder.execute("COMMIT")
        for client in waiting:
            self.assertEqual(self.received(client, GOOD), [GRANTED])
        self.assertEqual(self.uses(), left - 1)
        self.assertTrue(self.is_soon('vemo_gate_calls_total{outcome="cancelled"}', 3))

    def test_a_look_at_its_health_waits_for_another_program_but_not_for_long(self):
        with self.database() as holder:
            holder.execute("BEGIN EXCLUSIVE")
            self.assertEqual(self.answer("status", path="/health")[::2], (503, "the token database cannot be read\n"))
            look = scene.connected(self.at("status"))
            look.sendall(b"GET /health HTTP/1.1\r\nHost: gate\r\n\r\n")
            time.sleep(0.1)
            holder.execute("COMMIT")
        self.assertEqual(self.received(look, ""), ["200 OK; healthy\n"])


if __name__ == "__main__":
    scene.main()
