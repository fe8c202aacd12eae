#!/usr/bin/python3
"""The examples of examples/gate/ in front of the gate: nginx, Caddy, both at once, and clients in four languages.

usage: proxies.py nginx|caddy|both|clients SOURCE-DIRECTORY GATE TOOL
GATE and TOOL: built with the redirection linked in. All runs below one throw-away directory, on Unix sockets, as the
user who calls it; of the examples, only paths and addresses are replaced. Exit status 77: skipped, for the reason
printed.
"""
import http.client
import http.server
import json
import os
import pwd
import shutil
import signal
import socket
import socketserver
import sqlite3
import subprocess
import sys
import tempfile
import threading
import time
import unittest

KIND, SOURCE, GATE, TOOL = sys.argv[1:5]
EXAMPLES = os.path.join(SOURCE, "examples/gate")
USER = pwd.getpwuid(os.getuid()).pw_name
PREFLIGHT = {"Origin": "https://example.net", "Access-Control-Request-Method": "GET"}
FORGED = {"X-Token-User": "forged", "X-Token-Uid": "4711", "X-Token-Function": "forged", "X_Token_User": "forged"}


class UnixConnection(http.client.HTTPConnection):
    def __init__(self, path):
        super().__init__("example.org")
        self.path = path

    def connect(self):
        self.sock = socket.socket(socket.AF_UNIX)
        self.sock.settimeout(10)
        self.sock.connect(self.path)


def listens(path):
    with socket.socket(socket.AF_UNIX) as end:
        return end.connect_ex(path) == 0


class Application(http.server.BaseHTTPRequestHandler):
    """Tells what reaches it."""

    def answer(self):
        body = self.rfile.read(int(self.headers.get("Content-Length", 0)))
        text = json.dumps({"method": self.command, "path": self.path, "body": body.decode(),
                           "headers": {name.lower(): value for name, value in self.headers.items()}}).encode()
        self.send_response(200)
        self.send_header("Content-Length", str(len(text)))
        self.end_headers()
        if self.command != "HEAD":
            self.wfile.write(text)

    do_GET = do_HEAD = do_POST = do_DELETE = do_OPTIONS = answer

    def address_string(self):
        return "a Unix socket"

    def log_message(self, *arguments):
        pass


class ApplicationServer(socketserver.ThreadingMixIn, socketserver.UnixStreamServer):
    daemon_threads = True


class Scene(unittest.TestCase):
    """A store and the gate, which all cases share. Each has a token of its own."""

    @classmethod
    def setUpClass(cls):
        cls.directory = tempfile.mkdtemp(prefix="gate-")
        cls.addClassCleanup(shutil.rmtree, cls.directory)
        cls.environment = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "VEMO_REDIRECT_DIR": cls.at("session"),
                           "GATE_SOCKET": cls.at("calls"), "HOME": cls.directory}
        cls.tool("init")
        cls.start_gate()

    def setUp(self):
        self.id = self.token()

    @classmethod
    def at(cls, name):
        return os.path.join(cls.directory, name)

    @classmethod
    def start(cls, path, *command):
        """Starts a program that listens at a path, and ends with the last case."""
        log = open(cls.at(os.path.basename(command[0]) + ".log"), "w+b")
        cls.addClassCleanup(log.close)
        program = subprocess.Popen(command, env=cls.environment, cwd=cls.directory, stdin=subprocess.DEVNULL,
                                   stdout=log, stderr=log)
        cls.addClassCleanup(cls.end, program)
        for _ in range(500):
            if listens(path):
                return program
            if program.poll() is not None:
                break
            time.sleep(0.01)
        log.seek(0)
        raise AssertionError(f"{command[0]} does not listen: {log.read().decode()}")

    @staticmethod
    def end(program):
        if program.poll() is None:
            program.terminate()
            try:
                program.wait(5)
            except subprocess.TimeoutExpired:
                program.kill()
                program.wait()

    @classmethod
    def start_gate(cls):
        cls.gate = cls.start(cls.at("calls"), GATE, "--socket", cls.at("calls"), "--status-socket", cls.at("status"),
                             "--user", "nobody", "--once-header", "X-Request-Once")

    @classmethod
    def tool(cls, *arguments):
        return subprocess.run([TOOL, *arguments], env=cls.environment, check=True, stdin=subprocess.DEVNULL,
                              stdout=subprocess.PIPE).stdout.decode().strip()

    def token(self, uses=3):
        return self.tool("create", "--uid", str(os.getuid()), "--function", "50 % off", "--uses", str(uses),
                         "--allow", "Example.File:get,put", "--allow", "Example.Page:get")

    def uses(self, id):
        with sqlite3.connect("file:" + self.at("session/vemo-access-token.db") + "?mode=ro", uri=True) as database:
            return database.execute("SELECT count FROM token WHERE tid = ?", (id,)).fetchone()[0]

    @classmethod
    def example(cls, name, *replacements):
        """The path of an example with other paths and addresses in it."""
        with open(os.path.join(EXAMPLES, name)) as file:
            text = file.read()
        for old, new in replacements:
            if old not in text:
                raise AssertionError(f"there is no {old} in {name}")
            text = text.replace(old, new)
        with open(cls.at(name), "w") as file:
            file.write(text)
        return cls.at(name)

    @classmethod
    def start_application(cls):
        server = ApplicationServer(cls.at("application"), Application)
        threading.Thread(target=server.serve_forever, kwargs={"poll_interval": 0.01}).start()
        cls.addClassCleanup(server.server_close)
        cls.addClassCleanup(server.shutdown)

    @classmethod
    def start_nginx(cls):
        os.makedirs(cls.at("www/pages/inner"))
        with open(cls.at("www/pages/inner/index.html"), "w") as file:
            file.write("a page\n")
        server = cls.example("nginx.conf", ("/run/vemo-access-token-gate/calls.sock", cls.at("calls")),
                             ("/run/application/http.sock", cls.at("application")), ("/srv/www", cls.at("www")),
                             ("listen 80;", f"listen unix:{cls.at('nginx')};"))
        kinds = ("client_body", "proxy", "fastcgi", "uwsgi", "scgi")
        with open(cls.at("main.conf"), "w") as file:
            file.write("daemon off; master_process off; error_log stderr;\n"
                       f"pid {cls.at('nginx.pid')}; events {{}}\n"
                       "http { access_log off;" + "".join(f"{kind}_temp_path {cls.at(kind)}.temp;" for kind in kinds) +
                       f"include {server}; }}\n")
        cls.start(cls.at("nginx"), "nginx", "-p", cls.directory, "-e", "stderr", "-c", cls.at("main.conf"))

    @classmethod
    def start_caddy(cls):
        cls.environment.update(XDG_CONFIG_HOME=cls.at("config"), XDG_DATA_HOME=cls.at("data"))
        site = cls.example("Caddyfile", ("/run/vemo-access-token-gate/calls.sock", cls.at("calls")),
                           ("/run/application/http.sock", cls.at("application")),
                           ("example.org {", f"http://example.org {{\n\tbind unix/{cls.at('caddy')}"))
        with open(cls.at("main"), "w") as file:
            file.write("{\n\tadmin off\n}\nimport " + site + "\n")
        cls.start(cls.at("caddy"), "caddy", "run", "--adapter", "caddyfile", "--config", cls.at("main"))

    def answer(self, socket, method="GET", path="/", id=None, headers=None, body=None):
        """The status, the headers and the text of an answer."""
        connection = UnixConnection(self.at(socket))
        headers = dict(headers or {})
        if id:
            headers["Authorization"] = "Bearer " + id
        connection.request(method, path, body, headers)
        answer = connection.getresponse()
        text = answer.read()
        connection.close()
        return answer.status, answer.headers, text


class Clients(Scene):
    def test_tell_the_user_or_why_not(self):
        id = self.token(uses=4)
        interpreters = {"grant.sh": ["curl"], "grant.py": ["python3"], "grant.js": ["node"], "grant.php": ["php"]}
        for client, [interpreter] in interpreters.items():
            if not shutil.which(interpreter):
                print("left out:", client, "needs", interpreter)
                continue
            for api, expected in (("Example.File", (0, USER, "")), ("Example.Mail", (1, "", "refused"))):
                with self.subTest(client=client, api=api):
                    self.assertEqual(self.ask(client, api, id), expected)
            with self.subTest(client=client, gate="away"):
                status, output, error = self.ask(client, "Example.File", id, {"GATE_SOCKET": self.at("away")})
                self.assertEqual((status, output, error.partition(":")[0]), (2, "", "no answer"))

    def ask(self, client, api, id, environment={}):
        result = subprocess.run([os.path.join(EXAMPLES, client), api, "get"], input=id + "\n", text=True,
                                env={**self.environment, **environment}, stdout=subprocess.PIPE,
                                stderr=subprocess.PIPE)
        return result.returncode, result.stdout.strip(), result.stderr.strip()


class Proxy:
    """What both proxies are asked."""

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.start_application()
        getattr(cls, "start_" + KIND)()

    def request(self, method="GET", path="/files/a?b=c", id=None, headers=None, body=None):
        """The status, the headers, and what the application told, if it was asked."""
        status, headers, text = self.answer(KIND, method, path, id, headers, body)
        return status, headers, json.loads(text) if text.startswith(b'{"method"') else None

    def users(self, told):
        """What the application gets of the user's headers and the id."""
        return {name: value for name, value in told["headers"].items()
                if name.replace("_", "-").startswith("x-token-") or name == "authorization"}

    def test_grants_and_refuses(self):
        granted = {"x-token-user": USER, "x-token-uid": str(os.getuid()), "x-token-function": "50%20%25%20off"}
        status, _, told = self.request(id=self.id)
        self.assertEqual((status, told["method"], told["path"], self.users(told)),
                         (200, "GET", "/files/a?b=c", granted))
        self.assertEqual(self.uses(self.id), 2)

        # Who forges the headers, in whatever case, gets one's own.
        for forged in (FORGED, {name.lower(): value for name, value in FORGED.items()}):
            other = self.token()
            status, _, told = self.request(id=other, headers=forged)
            self.assertEqual((status, self.users(told)), (200, granted))

        status, headers, told = self.request()
        self.assertEqual((status, headers["WWW-Authenticate"], told), (401, "Bearer", None))
        for case, arguments in {"unknown": {"id": "0" * 127}, "method": {"id": self.id, "method": "DELETE"},
                                "no such method": {"id": self.id, "method": "OPTIONS"},
                                "preflight without a method": {"id": self.id, "method": "OPTIONS",
                                                               "headers": {"Origin": "https://example.net"}}}.items():
            with self.subTest(case):
                status, _, told = self.request(headers=arguments.pop("headers", FORGED), **arguments)
                self.assertEqual((status, told), (403, None))
        self.assertEqual(self.uses(self.id), 2)

    def test_lets_preflights_through_without_a_user(self):
        status, _, told = self.request("OPTIONS", headers={**PREFLIGHT, **FORGED}, id=self.id)
        self.assertEqual((status, told["method"], self.users(told)), (200, "OPTIONS", {}))
        self.assertEqual(self.uses(self.id), 3)

    def test_carries_bodies_and_large_cookies(self):
        body = "b" * 100000
        status, _, told = self.request("POST", id=self.id, body=body)
        self.assertEqual((status, told["method"], told["body"]), (200, "POST", body))
        cookie = "session=" + "c" * 30 * 1024
        status, _, told = self.request(id=self.id, headers={"Cookie": cookie})
        self.assertEqual((status, told["headers"]["cookie"]), (200, cookie))
        self.assertEqual(self.uses(self.id), 1)

    def test_lets_nobody_through_while_the_store_fails_or_the_gate_is_away(self):
        database = self.at("session/vemo-access-token.db")
        self.assertEqual(self.request(id=self.id)[0], 200)
        with sqlite3.connect(database, isolation_level=None) as other:
            other.execute("BEGIN EXCLUSIVE")
            status, headers, told = self.request(id=self.id)
            self.assertEqual((status, headers["Retry-After"], told), (503, "1", None))
            other.execute("ROLLBACK")
        other.close()
        self.assertEqual(self.uses(self.id), 2)

        self.end(self.gate)
        self.assertEqual(self.gate.returncode, 0)
        status, _, told = self.request(id=self.id)
        self.assertEqual((status, told), (self.AWAY, None))
        self.assertEqual(self.uses(self.id), 2)

        self.start_gate()
        self.assertEqual(self.request(id=self.id)[0], 200)
        self.assertEqual(self.uses(self.id), 1)


class Nginx(Proxy, Scene):
    AWAY = 503

    def test_spends_one_use_where_nginx_asks_twice(self):
        self.assertEqual(self.request(path="/pages/inner/", id=self.id)[0], 200)
        self.assertEqual(self.uses(self.id), 2)
        # The client cannot choose the key.
        key = {"X-Request-Once": "chosen"}
        for left in (1, None):
            self.assertEqual(self.request(id=self.id, headers=key)[0], 200)
        self.assertEqual(self.request(id=self.id, headers=key)[0], 403)

    def test_lets_nobody_through_where_no_call_is_named(self):
        self.assertEqual(self.request(path="/else", id=self.id)[0], 503)


class Caddy(Proxy, Scene):
    AWAY = 502

    def test_asks_under_a_key_that_the_client_cannot_choose(self):
        for status in (200, 200, 200, 403):
            self.assertEqual(self.request(id=self.id, headers={"X-Request-Once": "chosen"})[0], status)


class Both(Scene):
    """The two proxies, a client of the gate's and the tool spend the uses of one token, while its status is asked."""

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.start_application()
        cls.start_nginx()
        cls.start_caddy()

    def test_grant_as_often_as_the_token_has_uses(self):
        uses = 200
        id = self.token(uses)
        ends = {"nginx": lambda: self.answer("nginx", path="/files/a", id=id)[0],
                "caddy": lambda: self.answer("caddy", path="/files/a", id=id)[0],
                "client": lambda: self.answer("calls", path="/grant/Example.Page/get", id=id)[0],
                "tool": lambda: self.grant_by_tool(id)}
        told = {name: [] for name in (*ends, "health", "metrics")}
        is_over = threading.Event()

        def spend(name):
            while 403 not in told[name]:
                told[name].append(ends[name]())

        def look(name):
            while not is_over.is_set():
                told[name].append(self.answer("status", path="/" + name))

        spenders = [threading.Thread(target=spend, args=(name,)) for name in list(ends) * 2]
        lookers = [threading.Thread(target=look, args=(name,)) for name in ("health", "metrics")]
        for thread in spenders + lookers:
            thread.start()
        for thread in spenders:
            thread.join()
        is_over.set()
        for thread in lookers:
            thread.join()

        granted = {name: told[name].count(200) for name in ends}
        self.assertEqual({name: set(told[name]) for name in ends}, {name: {200, 403} for name in ends})
        self.assertEqual(sum(granted.values()), uses)
        self.assertEqual({answer[0] for name in ("health", "metrics") for answer in told[name]}, {200})
        line = f'vemo_gate_calls_total{{outcome="granted"}} {uses - granted["tool"]}\n'
        for _ in range(300): # the figures are up to a second old
            metrics = self.answer("status", path="/metrics")[2].decode()
            if line in metrics:
                break
            time.sleep(0.01)
        self.assertIn(line, metrics)

    def grant_by_tool(self, id):
        result = subprocess.run([TOOL, "grant", "-", "Example.File", "get"], env=self.environment, input=id.encode(),
                                stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        return {0: 200, 1: 403}.get(result.returncode, result.returncode)


KINDS = {"nginx": Nginx, "caddy": Caddy, "both": Both, "clients": Clients}
for program in {"clients": [], "both": ["nginx", "caddy"]}.get(KIND, [KIND]):
    if not shutil.which(program, path="/usr/sbin:/usr/bin"):
        print(f"skipped: {program} is not installed")
        sys.exit(77)
suite = unittest.defaultTestLoader.loadTestsFromTestCase(KINDS[KIND])
sys.exit(not unittest.TextTestRunner(verbosity=2).run(suite).wasSuccessful())
