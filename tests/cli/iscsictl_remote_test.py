"""iscsictl --host, against a web server of the test's own that writes down what it is asked."""

import http.server
import json
import os
import re
import ssl
import stat
import subprocess
import threading
import unittest
import urllib.parse

from appliance import ISCSI_HOST, Appliance

PASSWORD = "correct horse battery"
TOKEN = "0123456789abcdef" * 4
UUID = "0b2a97bc-0359-4910-ae25-610bb1cdf056"

# Asked for by peers, browsers and probes; no person types them.
API_ONLY = {
    "GET /health", "GET /openapi.json", "GET /session",
    "POST /nodes", "POST /nodes/local/sessions", "GET /nodes/local/key",
    "POST /sinks/{lun}/open", "POST /sinks/{lun}/close",
    "POST /replications/tasks", "POST /replications/{task}/base-version", "POST /replications/{task}/arrival",
    "PATCH /replications/{task}/arrival", "POST /replications/{task}/arrival/end",
}

# Every verb, with all that makes it ask for something else.
VERBS = """
lun create a --location /v --size 1M
lun list
lun show a
lun update a --size 2M
lun delete a --yes
lun map a t
lun unmap a t
lun load a
lun unload a
lun clone a b
lun import a /d
lun import-cancel a
lun remote-clone a --node n --name b --location /v
lun remote-clone a --node n --name b --location /v --watch
snapshot list
snapshot show s
snapshot take a
snapshot restore s --yes
snapshot delete s --yes
snapshot lock s
snapshot unlock s
snapshot stop s
snapshot load s
snapshot unload s
snapshot clone s b
snapshot export s /d
snapshot export-cancel s
retention set a --keep 2
retention show a
retention remove a
retention dry-run a
schedule add --lun a --every 1h
schedule list
schedule remove 1
events
target create t
target list
target show t
target delete t --yes
target masks t
target masks t --clear
target masks t --add default=r
node list
node show n
node status
node check n --address h
node join h --account a --yes --password-file -
node remove n --yes
node trust n --yes
node login n --account a --password-file -
node logout n
vlun list
vlun show u
vlun create a
vlun bind u --node n --dst-lun d
vlun delete u
replication create a --node n --name b --location /v
replication list
replication show r
replication status r
replication send r s
replication stop r
replication promote r
replication demote r
replication unsynced r s
replication remove r
login --account a --password-file -
logout
"""


class Recorder(http.server.BaseHTTPRequestHandler):
    """Answers an empty object unless the server has an answer for "METHOD path"."""

    protocol_version = "HTTP/1.1"

    def answer(self):
        url = urllib.parse.urlsplit(self.path)
        body = self.rfile.read(int(self.headers.get("Content-Length") or 0))
        fields = json.loads(body) if body else dict(urllib.parse.parse_qsl(url.query))
        name = f"{self.command} {url.path.removeprefix('/api/v1')}"
        self.server.requests.append((name, fields, self.headers.get("Authorization")))
        status, kind, text = self.server.answers.get(name, (200, "application/json", "{}"))
        self.send_response(status)
        self.send_header("Content-Type", kind)
        self.send_header("Content-Length", str(len(text)))
        self.end_headers()
        self.wfile.write(text.encode())

    do_GET = do_POST = do_PUT = do_PATCH = do_DELETE = answer

    def log_message(self, *args):
        pass


class Remote(Appliance):
    def setUp(self):
        super().setUp()
        self.env |= {"XDG_STATE_HOME": os.path.join(self.folder, "user"), "HOME": self.folder}
        self.env.pop("ISCSICTL_TOKEN", None)
        self.run_host("certificate", "make")
        self.pin = re.search(r"sha256//\S+", self.host_says("certificate", "show")).group()
        self.server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Recorder)
        self.server.requests, self.server.answers = [], {}
        context = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
        context.load_cert_chain(os.path.join(self.env["ISCSI_HOST_STATE"], "web", "server.pem"))
        self.server.socket = context.wrap_socket(self.server.socket, server_side=True)
        thread = threading.Thread(target=self.server.serve_forever)
        thread.start()
        self.addCleanup(thread.join)
        self.addCleanup(self.server.server_close)
        self.addCleanup(self.server.shutdown)
        self.url = f"https://127.0.0.1:{self.server.server_port}"
        self.set_answer("POST /session", {"token": TOKEN})

    def host_says(self, *args):
        return subprocess.run([ISCSI_HOST, *args], env=self.env, check=True, capture_output=True, text=True, timeout=60).stdout

    def set_answer(self, request, value, status=200, kind="application/json"):
        self.server.answers[request] = (status, kind, value if isinstance(value, str) else json.dumps(value))

    def refuse(self, request, status, code, detail):
        self.set_answer(request, {"code": code, "detail": detail}, status, "application/problem+json")

    def login(self, *args):
        return self.ok("--host", self.url, "--fingerprint", self.pin, "login", "--account", "boss", "--password-file", "-",
                       *args, stdin=PASSWORD)

    def kept(self):
        folder = os.path.join(self.folder, "user", "iscsictl")
        return [os.path.join(folder, name) for name in os.listdir(folder)] if os.path.isdir(folder) else []

    def asked(self):
        return [name for name, _, _ in self.server.requests]


class Sessions(Remote):
    def test_life_of_a_session(self):
        self.assertEqual(self.login(), f"Logged in to 127.0.0.1:{self.server.server_port} as boss\n")
        self.assertEqual(self.server.requests, [("POST /session", {"account": "boss", "password": PASSWORD}, None)])
        [file] = self.kept()
        with open(file, encoding="utf-8") as opened:
            text = opened.read()
        self.assertIn(TOKEN, text)
        self.assertNotIn(PASSWORD, text)
        self.assertEqual([stat.S_IMODE(os.stat(path).st_mode) for path in (file, os.path.dirname(file))], [0o600, 0o700])

        self.ok("--host", self.url + "/", "lun", "list", "--status")
        self.assertEqual(self.server.requests[-1], ("GET /luns", {"status": "true"}, "Bearer " + TOKEN))
        self.env["ISCSICTL_TOKEN"] = "another"
        self.ok("--host", self.url, "node", "show", "a/..%? b")
        self.assertEqual(self.server.requests[-1], ("GET /nodes/a%2F..%25%3F%20b", {}, "Bearer another"))
        del self.env["ISCSICTL_TOKEN"]

        self.refuse("GET /luns", 401, 18990205, "the session has ended; log in again")
        self.fails(1, "--host", self.url, "lun", "list", says=r"has ended: type 'iscsictl --host \S+ login --account boss'")
        self.ok("--host", self.url, "logout")
        self.assertEqual(self.server.requests[-1], ("DELETE /session", {}, "Bearer " + TOKEN))
        self.fails(1, "--host", self.url, "lun", "list", says="there is no session")
        self.assertIsNone(self.server.requests[-1][2])

    def test_nothing_is_sent_to_a_stranger(self):
        self.fails(1, "--host", self.url, "lun", "list", says="not known yet: .*login")
        self.fails(2, "--host", self.url, "login", "--account", "a", "--password-file", "-", stdin=PASSWORD,
                   says=f"shows the key {re.escape(self.pin)}\n(.|\n)*--fingerprint or --yes is needed")
        other = "sha256//" + "A" * 43 + "="
        self.fails(1, "--host", self.url, "--fingerprint", other, "login", "--account", "a", "--password-file", "-",
                   stdin=PASSWORD, says="has changed")
        self.assertEqual((self.server.requests, self.kept()), ([], []))

        self.login()
        [file] = self.kept()
        with open(file, encoding="utf-8") as opened:
            text = opened.read().replace(self.pin, other)
        with open(file, "w", encoding="utf-8") as opened:
            opened.write(text)
        self.fails(1, "--host", self.url, "lun", "list", says="has changed")
        self.assertEqual(self.asked(), ["POST /session"])
        with open(file, "w", encoding="utf-8") as opened:
            opened.write(text[:20])
        self.fails(1, "--host", self.url, "lun", "list", says="damaged: delete it")

    def test_a_login_that_is_refused_leaves_nothing(self):
        self.refuse("POST /session", 401, 18990205, "account, password or one-time code is wrong")
        self.fails(1, "--host", self.url, "login", "--yes", "--account", "a", "--password-file", "-", stdin=PASSWORD,
                   says=r"Failed to login \(18990205\): account, password")
        self.assertEqual(self.kept(), [])

    def test_bad_urls(self):
        for url in ("http://h", "h", "https://", "https://h:0", "https://h:65536", "https://h:1x", "https://h/x",
                    "https://u@h", "https://[::1", "https://h h"):
            self.fails(2, "--host", url, "lun", "list", says="--host: ")
        self.fails(2, "login", "--account", "a", says="--host is required")
        self.fails(2, "logout", says="--host is required")


class Answers(Remote):
    def test_answers_that_are_none(self):
        self.login()
        for status, kind, text in ((200, "text/html", "<html>"), (200, "application/json", "[" * 5000), (500, "text/html", "x"),
                                   (500, "application/problem+json", '{"code":1e99}'), (302, "text/plain", ""),
                                   (200, "application/json", '{"a":1,"a":2}'), (403, "application/json", '{"code":0}')):
            self.set_answer("GET /luns", text, status, kind)
            self.fails(1, "--host", self.url, "lun", "list", says=r"^iscsictl: lun list: Bad response \(18990204\)")

    def test_a_refusal_reads_as_on_the_machine_itself(self):
        self.login()
        for args in (["lun", "show", "nosuch"], ["node", "show", "nosuch"]):
            here = self.run_cli(*args) if args[0] == "lun" else None
            self.refuse("GET /luns/nosuch", 404, 18990505, "no LUN has the UUID, name or index 'nosuch'")
            self.refuse("GET /nodes/nosuch", 404, 18991109, "no node has the UUID, host name or index 'nosuch'")
            there = self.run_cli("--host", self.url, *args)
            self.assertEqual(there.returncode, 1)
            if here:
                self.assertEqual(there.stderr, here.stderr)

    def test_what_a_clone_that_failed_says(self):
        self.login()
        clone = ["--host", self.url, "lun", "remote-clone", "a", "--node", "n", "--name", "b", "--location", "/v", "--watch"]
        self.set_answer("POST /luns/a/remote-clone", {"vlun_uuid": UUID, "dst_lun_uuid": UUID})
        for status, reason, says in (("failed", "No space left on device", "No space left"), ("stopped", "", "stopped before")):
            self.set_answer("GET /luns/a/remote-clone", {"is_running": False, "status": status, "reason": reason,
                                                         "first": 1, "second": 2})
            self.assertRegex(self.run_cli(*clone).stderr, rf"Failed to clone LUN \(18990552\): .*{says}")
        self.set_answer("GET /luns/a/remote-clone", {"is_running": False, "status": "complete", "first": 2, "second": 2})
        self.assertEqual(self.run_cli(*clone).stdout, f"Cloned a to n: LUN {UUID}\n")

    def test_join_compares_the_key_first(self):
        self.login()
        join = ["--host", self.url, "node", "join", "[::1]:5444", "--account", "boss", "--password-file", "-"]
        self.set_answer("GET /peer-key", {"pin": self.pin})
        self.set_answer("POST /nodes/join", {"uuid": UUID, "hostname": "::1"})
        self.fails(2, *join, stdin=PASSWORD, says="--fingerprint or --yes is needed")
        self.assertEqual(self.asked()[-1], "GET /peer-key")
        result = self.run_cli(*join, "--yes", "--otp", "123456", stdin=PASSWORD)
        self.assertEqual(self.server.requests[-1][1], {"hostname": "::1", "port": 5444, "account": "boss", "pin": self.pin,
                                                       "password": PASSWORD, "otp_code": "123456"})
        self.assertEqual(result.stdout, f"Paired with ::1: {UUID}\n")
        self.assertNotIn(PASSWORD, result.stderr)
        for address in ("", "h:", "h:x", ":5", "h/x", "a@h", "[h"):
            self.fails(2, "node", "join", address, "--account", "a", says="is not HOST or HOST:PORT")


class Table(Remote):
    def test_every_route_has_a_verb(self):
        self.set_answer("POST /luns/a/remote-clone", {"vlun_uuid": UUID, "dst_lun_uuid": UUID})
        self.set_answer("GET /luns/a/remote-clone", {"is_running": False, "status": "complete"})
        self.set_answer("GET /peer-key", {"pin": self.pin})
        self.set_answer("GET /luns/a", {"uuid": UUID})
        self.set_answer("GET /snapshots/s", {"uuid": UUID})
        self.set_answer("GET /nodes/n", {"hostname": "h", "port": 5443})
        self.set_answer("GET /replications/r/unsynced", {"is_completed": True})
        lines = [line.split() for line in VERBS.strip().splitlines()]
        nouns = set(self.ok("__complete", "").split()) - {"completion"}
        verbs = {f"{noun} {verb}".strip() for noun in nouns for verb in self.ok("__complete", noun, "").split() or [""]}
        self.assertEqual(verbs, {line[0] if line[0] in verbs else " ".join(line[:2]) for line in lines})
        for line in lines:
            result = self.run_cli("--host", self.url, "--fingerprint", self.pin, *line, stdin=PASSWORD)
            self.assertEqual(result.returncode, 0, (line, result.stderr))

        with open(os.environ["OPENAPI"], encoding="utf-8") as opened:
            paths = json.load(opened)["paths"]
        routes = {f"{method.upper()} {path}": re.compile(f"{method.upper()} " + re.sub(r"\{\w+\}", "[^/]+", path) + "$")
                  for path, methods in paths.items() for method in methods if method != "parameters"}
        reached = set()
        for name in self.asked():
            # A fixed word wins over a parameter.
            fits = sorted((route for route, pattern in routes.items() if pattern.match(name)), key=lambda r: r.count("{"))
            self.assertTrue(fits, name + " is no route")
            reached.add(fits[0])
        self.assertEqual(set(routes) - reached, API_ONLY)


if __name__ == "__main__":
    unittest.main()
