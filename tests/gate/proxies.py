#!/usr/bin/python3 -B
"""The examples of examples/gate/ with the gate: nginx, Caddy, clients in four languages, and a front end on
another machine. Only paths and addresses are replaced in the examples. scene.py has the usage.
"""
import http.server
import json
import os
import shutil
import socketserver
import ssl
import subprocess
import threading

import scene

EXAMPLES = os.path.join(scene.SOURCE, "examples/gate")
GATE_SOCKET = "/run/vemo-access-token-gate/calls.sock"  # in the examples
APPLICATION = "/run/application/http.sock"
KEY = ("-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1", "-nodes", "-keyout")
PREFLIGHT = {"Origin": "https://example.net", "Access-Control-Request-Method": "GET"}
FORGED = {"X-Token-User": "forged", "X-Token-Uid": "4711", "X-Token-Function": "forged", "X_Token_User": "forged"}


class Application(http.server.BaseHTTPRequestHandler):
    """Answers each request with a description of it."""

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


class Scene(scene.Scene):
    """The gate, and an application behind the proxies of a class."""

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.start_gate()
        server = ApplicationServer(cls.at("application"), Application)
        threading.Thread(target=server.serve_forever, kwargs={"poll_interval": 0.01}).start()
        cls.addClassCleanup(server.server_close)
        cls.addClassCleanup(server.shutdown)

    def setUp(self):
        self.id = self.token()

    @classmethod
    def file(cls, name, text):
        """The path of a new file with this text."""
        os.makedirs(os.path.dirname(cls.at(name)), exist_ok=True)
        with open(cls.at(name), "w") as file:
            file.write(text)
        return cls.at(name)

    @classmethod
    def example(cls, name, *replacements):
        """The path of an example with other paths and addresses in it."""
        with open(os.path.join(EXAMPLES, name)) as file:
            text = file.read()
        for old, new in replacements:
            if old not in text:
                raise AssertionError(f"there is no {old} in {name}")
            text = text.replace(old, new)
        return cls.file(name, text)

    @classmethod
    def start_nginx(cls, name, site):
        temporary = "".join(f"{kind}_temp_path {cls.at(name)}.{kind};"
                            for kind in ("client_body", "proxy", "fastcgi", "uwsgi", "scgi"))
        main = cls.file(name + ".main", f"daemon off; master_process off; error_log stderr; pid {cls.at(name)}.pid;\n"
                                        f"events {{}}\nhttp {{ access_log off; {temporary} include {site}; }}\n")
        cls.start(name, "nginx", "-p", cls.directory, "-e", "stderr", "-c", main)


class Clients(Scene):
    def test_tell_the_user_or_why_not(self):
        id = self.token(uses=4)
        interpreters = {"grant.sh": "curl", "grant.py": "python3", "grant.js": "node", "grant.php": "php"}
        for client, interpreter in interpreters.items():
            if not shutil.which(interpreter):
                print("left out:", client, "needs", interpreter)
                continue
            for api, expected in (("Example.File", (0, scene.OWNER, "")), ("Example.Mail", (1, "", "refused"))):
                with self.subTest(client=client, api=api):
                    self.assertEqual(self.ask(client, api, id), expected)
            with self.subTest(client=client, gate="away"):
                status, output, error = self.ask(client, "Example.File", id, self.at("away"))
                self.assertEqual((status, output, error.partition(":")[0]), (2, "", "no answer"))

    def ask(self, client, api, id, gate=None):
        result = subprocess.run([os.path.join(EXAMPLES, client), api, "get"], input=id + "\n", text=True,
                                env={**self.environment, "GATE_SOCKET": gate or self.at("calls")},
                                stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        return result.returncode, result.stdout.strip(), result.stderr.strip()


def users(asked):
    """The headers about the user and the id that reach the application."""
    return {name: value for name, value in asked["headers"].items()
            if name.replace("_", "-").startswith("x-token-") or name == "authorization"}


GRANTED = {"x-token-user": scene.OWNER, "x-token-uid": "0", "x-token-function": scene.FUNCTION_IN_HEADERS}


class Proxy:
    """The tests of both proxies."""

    def request(self, method="GET", path="/files/a?b=c", id=None, headers=None, body=None):
        """The status, the headers, and the application's description of the request, if it got there."""
        status, headers, text = self.answer(self.PROGRAMS[0], method, path, id, headers, body)
        return status, headers, json.loads(text) if text.startswith('{"method"') else None

    def test_grants_and_refuses(self):
        status, _, asked = self.request(id=self.id)
        self.assertEqual((status, asked["method"], asked["path"], users(asked)),
                         (200, "GET", "/files/a?b=c", GRANTED))
        self.assertEqual(self.uses(self.id), 2)

        # Forged headers, in any case, are replaced by the token's own.
        for forged in (FORGED, {name.lower(): value for name, value in FORGED.items()}):
            status, _, asked = self.request(id=self.token(), headers=forged)
            self.assertEqual((status, users(asked)), (200, GRANTED))

        status, headers, asked = self.request()
        self.assertEqual((status, headers["WWW-Authenticate"], asked), (401, "Bearer", None))
        for case, arguments in {"unknown": {"id": "0" * 127}, "method": {"id": self.id, "method": "DELETE"},
                                "no such method": {"id": self.id, "method": "OPTIONS"},
                                "preflight without a method": {"id": self.id, "method": "OPTIONS",
                                                               "headers": {"Origin": "https://example.net"}}}.items():
            with self.subTest(case):
                status, _, asked = self.request(**{"headers": FORGED, **arguments})
                self.assertEqual((status, asked), (403, None))
        self.assertEqual(self.uses(self.id), 2)

    def test_lets_preflights_through_without_a_user(self):
        status, _, asked = self.request("OPTIONS", headers={**PREFLIGHT, **FORGED}, id=self.id)
        self.assertEqual((status, asked["method"], users(asked)), (200, "OPTIONS", {}))
        self.assertEqual(self.uses(self.id), 3)

    def test_carries_bodies_and_large_cookies(self):
        body = "b" * 100000
        status, _, asked = self.request("POST", id=self.id, body=body)
        self.assertEqual((status, asked["method"], asked["body"]), (200, "POST", body))
        cookie = "session=" + "c" * 30 * 1024
        status, _, asked = self.request(id=self.id, headers={"Cookie": cookie})
        self.assertEqual((status, asked["headers"]["cookie"]), (200, cookie))
        self.assertEqual(self.uses(self.id), 1)

    def test_asks_under_a_key_that_the_client_cannot_choose(self):
        for status in (200, 200, 200, 403):
            self.assertEqual(self.request(id=self.id, headers={"X-Request-Once": "chosen"})[0], status)

    def test_lets_nobody_through_while_the_store_fails_or_the_gate_is_away(self):
        self.assertEqual(self.request(id=self.id)[0], 200)
        with self.database() as other:
            other.execute("BEGIN EXCLUSIVE")
            status, headers, asked = self.request(id=self.id)
            self.assertEqual((status, headers["Retry-After"], asked), (503, "1", None))
        self.assertEqual(self.uses(self.id), 2)

        self.assertEqual(self.end(self.gate), 0)
        status, _, asked = self.request(id=self.id)
        self.assertEqual((status, asked), (self.AWAY, None))
        self.assertEqual(self.uses(self.id), 2)

        self.start_gate()
        self.assertEqual(self.request(id=self.id)[0], 200)
        self.assertEqual(self.uses(self.id), 1)


class Nginx(Proxy, Scene):
    PROGRAMS = ("nginx",)
    AWAY = 503

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.file("www/pages/inner/index.html", "a page\n")
        site = cls.example("nginx.conf", (GATE_SOCKET, cls.at("calls")), (APPLICATION, cls.at("application")),
                           ("/srv/www", cls.at("www")), ("listen 80;", f"listen unix:{cls.at('nginx')};"))
        cls.start_nginx("nginx", site)

    def test_spends_one_use_where_nginx_asks_twice(self):
        self.assertEqual(self.request(path="/pages/inner/", id=self.id)[0], 200)
        self.assertEqual(self.uses(self.id), 2)

    def test_lets_nobody_through_where_no_call_is_named(self):
        self.assertEqual(self.request(path="/else", id=self.id)[0], 503)


class Caddy(Proxy, Scene):
    PROGRAMS = ("caddy",)
    AWAY = 502

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.environment.update(XDG_CONFIG_HOME=cls.at("config"), XDG_DATA_HOME=cls.at("data"))
        site = cls.example("Caddyfile", (GATE_SOCKET, cls.at("calls")), (APPLICATION, cls.at("application")),
                           ("example.org {", f"http://example.org {{\n\tbind unix/{cls.at('caddy')}"))
        cls.start("caddy", "caddy", "run", "--adapter", "caddyfile", "--config",
                  cls.file("main", "{\n\tadmin off\n}\nimport " + site + "\n"))


class ManyMachines(Scene):
    """A front end asks the gate of another machine: two instances of nginx, and a certificate authority of the test."""
    PROGRAMS = ("nginx", "openssl")

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.openssl("req", "-x509", *KEY, "authority.key", "-out", "authority.pem", "-subj", "/CN=authority",
                    "-addext", "keyUsage=critical,keyCertSign,cRLSign")
        for name in ("tokens.example", "front-end", "foreign"):
            signed = () if name == "foreign" else ("-CA", "authority.pem", "-CAkey", "authority.key")
            cls.openssl("req", "-x509", *KEY, name + ".key", "-out", name + ".pem", "-subj", "/CN=" + name, *signed,
                        "-addext", "subjectAltName=DNS:" + name, "-addext", "basicConstraints=critical,CA:FALSE")
        keys = ("/etc/nginx/tokens", cls.directory)
        cls.start_nginx("tls", cls.example("nginx-token-machine.conf", (GATE_SOCKET, cls.at("calls")), keys,
                                           ("8443", "unix:" + cls.at("tls")), ("/server.", "/tokens.example.")))
        cls.start_nginx("front", cls.example("nginx-front-end.conf", ("tokens.example:8443", "unix:" + cls.at("tls")),
                                             keys, ("8080", "unix:" + cls.at("front")),
                                             ("127.0.0.1:8000", "unix:" + cls.at("application"))))

    @classmethod
    def openssl(cls, *arguments):
        subprocess.run(["openssl", *arguments], cwd=cls.directory, check=True, stderr=subprocess.PIPE)

    def test_grant_what_a_certificate_and_a_token_allow(self):
        for id, status in ((None, 401), ("0" * 127, 403)):
            self.assertEqual(self.answer("front", path="/page", id=id)[0], status)
        status, _, text = self.answer("front", path="/page", id=self.id, headers=FORGED)
        self.assertEqual((status, users(json.loads(text))), (200, GRANTED))
        self.assertEqual(self.uses(self.id), 2)

    def test_answer_none_but_front_ends_and_nothing_but_calls(self):
        for name, path, status in ((None, "/grant/Example.File/get", 400), ("foreign", "/grant/Example.File/get", 400),
                                   ("front-end", "/metrics", 404)):
            tls = ssl.create_default_context(cafile=self.at("authority.pem"))
            tls.verify_flags |= ssl.VERIFY_X509_STRICT # the default in newer versions of Python
            if name:
                tls.load_cert_chain(self.at(name + ".pem"), self.at(name + ".key"))
            self.assertEqual(self.answer("tls", path=path, id=self.id, tls=tls)[0], status)
        self.assertEqual(self.uses(self.id), 3)

    def test_grant_nothing_without_the_gate(self):
        self.end(self.gate)
        status, headers, _ = self.answer("front", path="/page", id=self.id)
        self.assertEqual((status, headers["Retry-After"]), (503, "1"))
        self.start_gate()
        self.assertEqual(self.uses(self.id), 3)


if __name__ == "__main__":
    scene.main()
