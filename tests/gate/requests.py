#!/usr/bin/python3 -B
"""What clients can send to the gate, and what they get for it: both of its processes, as they ship.

scene.py tells the usage.
"""
import collections
import contextlib
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
BLANK_ID = "x " * 70 + "x"  # nobody's id can come so


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


GOOD = call()

# What a client sends, and all that comes back, response by response. The client then sends nothing more and reads on
# until the gate ends the connection. CLOSE: the response says that it does.
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
    *(("a call behind one of Connection: " + options, call("Connection: " + options + "\r\n") + GOOD, [GRANTED + CLOSE])
      for options in ("close", "x,\tCLOSE ,y", "keep-alive\r\nConnection: close")),
    ("a call behind one that nearly closes", call("Connection: closed, x-close\r\n") + GOOD, [GRANTED, GRANTED]),
    ("nothing", "", []),
    ("half a call", GOOD[:-1], [MALFORMED + CLOSE]),
    ("a call and a half", GOOD + GOOD[:20], [GRANTED, MALFORMED + CLOSE]),
    ("a call and a NUL", GOOD + "\0", [GRANTED, MALFORMED + CLOSE]),
    ("an empty line first", "\r\n" + GOOD, [MALFORMED + CLOSE]),
    # methods
    *((method, by(method), [GRANTED]) for method in
      ("POST", "PUT", "DELETE", "PATCH", "OPTIONS", "PROPFIND", "get", "M-SEARCH", "X" * 1000)),
    ("HEAD", by("HEAD"), [GRANTED]),
    ("HEAD that wants a record", call("Accept: application/json\r\n", line=LINE.replace("GET", "HEAD")), [RECORD]),
    ("CONNECT", by("CONNECT") + GOOD, [NOT_ALLOWED, GRANTED]),
    ("CONNECT to a host", call(line="CONNECT example.org:443 HTTP/1.1\r\n"), [NOT_ALLOWED]),
    ("TRACE", by("TRACE"), [NOT_ALLOWED]),
    ("a method that is no token", by("GE(T"), [MALFORMED + CLOSE]),
    ("a method alone", call(line="GET\r\n"), [MALFORMED + CLOSE]),
    ("no method", call(line=" /grant/Api/get HTTP/1.1\r\n"), [MALFORMED + CLOSE]),
    # other protocols and versions
    ("TLS 1.3", "\x16\x03\x01\x02\x00\x01\x00\x01\udcfc\x03\x03" + "".join(map(chr, range(128))), [MALFORMED + CLOSE]),
    ("SSL 2", "\udc80\x2e\x01\x00\x02" + "\0" * 44, [MALFORMED + CLOSE]),
    ("HTTP/2 preface", "PRI * HTTP/2.0\r\n\r\nSM\r\n\r\n", [MALFORMED + CLOSE]),
    ("HTTP/0.9", "GET /grant/Api/get\r\n", [MALFORMED + CLOSE]),
    ("HTTP/0.9 with headers", call(line="GET /grant/Api/get\r\n"), [MALFORMED + CLOSE]),
    ("a newer version", call(line="GET /grant/Api/get HTTP/1.2\r\n"), [MALFORMED + CLOSE]),
    ("a version and a blank", call(line="GET /grant/Api/get HTTP/1.1 \r\n"), [MALFORMED + CLOSE]),
    ("a version in small letters", call(line="GET /grant/Api/get http/1.1\r\n"), [MALFORMED + CLOSE]),
    ("a version of another size", call(line="GET /grant/Api/get HTTP/1.10\r\n"), [MALFORMED + CLOSE]),
    ("an offered upgrade", call("Connection: Upgrade, HTTP2-Settings\r\nUpgrade: h2c\r\n"), [GRANTED]),
    ("HTTP/1.0", call(line="GET /grant/Api/get HTTP/1.0\r\n") + GOOD, [GRANTED + CLOSE]),
    ("HTTP/1.0 without Host", call(line="GET /grant/Api/get HTTP/1.0\r\n", host=""), [GRANTED + CLOSE]),
    ("HTTP/1.0 that goes on", call("Connection: Keep-Alive\r\n", line="GET /grant/Api/get HTTP/1.0\r\n") + GOOD,
     [GRANTED + " keep-alive", GRANTED]),
    ("HTTP/1.0 in chunks", call("Transfer-Encoding: chunked\r\n", line="GET /grant/Api/get HTTP/1.0\r\n"),
     [MALFORMED + CLOSE]),
    ("a proxy's preface", "PROXY UNIX\r\n" + GOOD, [MALFORMED + CLOSE]),
    # bodies
    *(("a length of " + length, call("Content-Length: " + length + "\r\n") + GOOD, [GRANTED, GRANTED]) for length in
      ("0", "000")),
    *(("a body of " + length + " that does not come", call("Content-Length: " + length + "\r\n"), [GRANTED + CLOSE])
      for length in ("10", "9" * 18)),
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
    ("bare LF behind a header", GOOD.replace(HOST, "Host: gate\n"), [MALFORMED + CLOSE]),
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
    ("a DEL in a value", call("X: \x7f\r\n"), [MALFORMED + CLOSE]),
    ("a name beyond ASCII", call("X\u00e4: 1\r\n"), [MALFORMED + CLOSE]),
    ("a value beyond ASCII", call("X: \u00e4\udcff\r\n"), [GRANTED]),
    ("a tab in a value", call("X: a\tb\r\n"), [GRANTED]),
    ("no Host", call(host=""), [MALFORMED + CLOSE]),
    ("two Hosts", call(HOST), [MALFORMED + CLOSE]),
    ("an empty Host", call(host="Host:\r\n"), [GRANTED]),
    # targets
    *((text, target(text), [GRANTED]) for text in
      ("/grant/Api", "/grant/Api?/put", "/grant/Api/get/", "/grant/Api/get/x/../../%00//?y=/z", "/grant/%41pi/ge%74",
       "/grant/Example.Page/\u00e4++", "/grant/Example.Page/%c3%A4%2b+?x=%zz")),
    *((repr(text), target(text), [REFUSED]) for text in
      ("/grant/Api/get%2500", "/grant/%252F/%25", "/grant/.../..%20", "/grant/" + "a" * 512 + "/" + "a" * 512)),
    *((text, target(text), [MALFORMED]) for text in
      ("/grant", "/grant/", "/grant/?x", "/grant//Api/get", "//grant/Api/get", "/grants/Api", "/Grant/Api", "/health",
       "/grant/Api/", "/grant/Api//get", "/grant/Api/?get",  # the API alone would allow more than a method
       "/grant/Api%2Fget", "/grant/Api/%2f", "/grant/Api%00", "/grant/Api/get%00", "/grant/Api/get%7", "/grant/Api%",
       "/grant/Api%4/1", "/grant/Api%4g", "/grant/Api/%xx", "/grant/Api%-1", "/grant/Api#/get", "/grant/Api/get?x#y",
       "/grant/./Api/get", "/grant/Other/../Api/get", "/grant/Other/%2e./Api", "/grant/Api/%2e%2E/x", "/grant/Api/..",
       "/grant/Api/.", "http://gate/grant/Api/get", "*", "\\grant\\Api\\get")),
    *((repr(text), target(text), [MALFORMED + CLOSE]) for text in
      ("/grant/Api/get\0", "/grant/Api/get x", "/grant/Api/get\tx", " /grant/Api/get")),
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
    ("3,000 headers", call("X: 1\r\n" * 3000), [TOO_LARGE + CLOSE]),
    ("the largest head", head_of(65536), [REFUSED]),
    ("too large a head", head_of(65537), [TOO_LARGE + CLOSE]),
    ("a header without an end", LINE + "X: " + "x" * 200000, [TOO_LARGE + CLOSE]),
    # ids
    *(("an unknown id of %d bytes" % size, bearer("Bearer " + "x" * size), [REFUSED]) for size in
      (1, 126, 127, 128, 255, 256, 1023, 1025, 8000)),
    ("the longest id", bearer("Bearer " + LONGEST_ID), [GRANTED]),
    ("the beginning of an id", bearer("Bearer {id:.126}"), [REFUSED]),
    ("an id and a letter", bearer("Bearer {id}x"), [REFUSED]),
    ("an id with blanks in it", bearer("Bearer " + BLANK_ID), [REFUSED]),
    ("an id and a word", bearer("Bearer {id} x"), [REFUSED]),
    ("two ids in one header", bearer("Bearer {id}, Bearer {id}"), [REFUSED]),
    ("a quoted id", bearer('Bearer "{id}"'), [REFUSED]),
    ("a pattern for ids", bearer("Bearer %"), [REFUSED]),
    ("an id that ends a statement", bearer("Bearer ';DROP/**/TABLE/**/token;--"), [REFUSED]),
    ("an id with blanks around it", call(auth="AUTHORIZATION: \tBEARER   {id}\t \r\n"), [GRANTED]),
    ("no header for an id", call(auth=""), [UNAUTHORIZED]),
    *(("a credential of " + repr(text), bearer(text), [UNAUTHORIZED]) for text in
      ("", "Bearer", "Bearer ", "Bearer\t{id}", "Bearer:{id}", "{id}", "Basic {id}", "Token {id}", "bearer{id}")),
    ("two headers for an id", call(AUTH), [MALFORMED]),
    ("a second, empty header", call("authorization:\r\n"), [MALFORMED]),
    ("a header for proxies", call(auth="Proxy-" + AUTH), [UNAUTHORIZED]),
    # records
    ("a record", call("Accept: application/json\r\n"), [RECORD]),
    ("a record among others", call("Accept: text/html, Application/JSON;q=0.1\r\n"), [RECORD]),
    ("a record in the second of two headers", call("Accept: text/*\r\nACCEPT:application/json\r\n"), [RECORD]),
    ("another header", call("X: close, application/json\r\n") + GOOD, [GRANTED, GRANTED]),
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
    """The responses in what was received, in words. Each must have what all have."""
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
        if kind == "application/json" and (size == 0 or '"function":"' + scene.FUNCTION in body):
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
        """All that a client gets that sends nothing more, in words."""
        with contextlib.suppress(OSError):
            client.shutdown(socket.SHUT_WR)
        received = b""
        with contextlib.suppress(ConnectionResetError):
            while more := client.recv(65536):
                received += more
        client.close()
        return responses(received, sent)

    def test_each_is_answered_exactly(self):
        self.assertGreaterEqual(len(ROWS), 100)
        self.assertEqual(len({row[0] for row in ROWS}), len(ROWS))
        before, told = self.told(), collections.Counter(["200"])  # that answer
        idle = [self.connect() for _ in range(100)]  # more than the descriptors that it was started with
        for name, text, expected in ROWS:
            with self.subTest(name):
                left = self.left()
                received = self.received(self.connect(text), text)
                told.update(one[:3] for one in received)
                self.assertEqual(received, [GRANTED if one == AGAIN else one for one in expected])
                spent = sum(one.startswith(GRANTED) and one != AGAIN for one in expected)
                self.assertEqual(self.left(), left - spent)
        with self.subTest("a call, byte by byte"):
            for byte in self.bytes(GOOD):
                idle[0].sendall(bytes([byte]))
            self.assertEqual(self.received(idle[0], GOOD), [GRANTED])
            told["200"] += 1
        with self.subTest("what no head begins with, before it has ended"):
            idle[1].sendall(b"\r\n")
            self.assertTrue(idle[1].recv(4096).startswith(b"HTTP/1.1 400 "))
            told["400"] += 1
        self.assertEqual(self.told() - before, told)

    def told(self):
        """How often each status was answered, as the gate counts it."""
        text = self.answer("status", path="/metrics")[2]
        lines = re.findall(r'^vemo_gate_responses_total{status="(\d+)"} (\d+)$', text, re.MULTILINE)
        return collections.Counter({status: int(number) for status, number in lines})

    def test_nothing_is_spent_while_another_program_holds_the_database(self):
        left = self.left()
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
        self.assertEqual(self.left(), left - 1)
        self.assertTrue(self.is_soon('vemo_gate_calls_total{outcome="cancelled"}', 3))


if __name__ == "__main__":
    scene.main()
