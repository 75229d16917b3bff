"""The web API behind its real server, in a network and a process namespace of its own. Needs root."""

import base64
import json
import os
import signal
import socket
import sqlite3
import ssl
import subprocess
import threading
import time

from appliance import main_in_namespaces
from client import ADDRESS, PASSWORD, ROOT, Served

CALLS = 10000 if os.environ.get("ISCSIWEBAPI_LONG") else 2000
CLIENTS = 64


def conforms(value, schema, schemas, where="answer"):
    """Raises unless a value has the form that a schema of the description gives, and nothing besides."""
    if "$ref" in schema:
        return conforms(value, schemas[schema["$ref"].rpartition("/")[2]], schemas, where)
    if "allOf" in schema:
        merged = {"type": "object", "required": [], "properties": {}}
        for part in schema["allOf"]:
            part = schemas[part["$ref"].rpartition("/")[2]] if "$ref" in part else part
            merged["required"] += part["required"]
            merged["properties"].update(part["properties"])
        return conforms(value, merged, schemas, where)
    kinds = {"object": dict, "array": list, "string": str, "integer": int, "boolean": bool}
    if type(value) is not kinds[schema["type"]]:
        raise AssertionError(f"{where}: {value!r} is no {schema['type']}")
    if "enum" in schema and value not in schema["enum"]:
        raise AssertionError(f"{where}: {value!r} is none of {schema['enum']}")
    if schema["type"] == "array":
        for number, element in enumerate(value):
            conforms(element, schema["items"], schemas, f"{where}[{number}]")
    elif "properties" in schema:
        if set(schema.get("required", ())) - set(value) or set(value) - set(schema["properties"]):
            raise AssertionError(f"{where}: has {sorted(value)}, described are {sorted(schema['properties'])}")
        for name, element in value.items():
            conforms(element, schema["properties"][name], schemas, f"{where}.{name}")


def over_limit(schema):
    """Values that a field's schema does not allow."""
    if "enum" in schema:
        yield "~"
    if schema["type"] == "string":
        yield 1
        yield "x" * (schema["maxLength"] + 1)
        yield "nul\0"
        if schema["minLength"] > 0:
            yield ""
    elif schema["type"] == "integer":
        yield "1"
        yield 1.5
        yield schema["maximum"] + 1
        yield schema["minimum"] - 1
    elif schema["type"] == "boolean":
        yield 1
        yield "true"
    elif schema["type"] == "array":
        yield {}
        if schema["minItems"] > 0:
            yield []
        yield [0]


class WebApi(Served):
    def routes(self, description):
        for path, methods in description["paths"].items():
            for method, operation in methods.items():
                yield method.upper(), path, operation

    def answer_of(self, raw, path):
        """The description's schema of an answer checks it."""
        status, headers, text = raw
        if status not in (400, 413, 431, 501): # the server's own, among others
            self.assertEqual(headers["Cache-Control"], "no-store")
            self.assertEqual(headers["X-Content-Type-Options"], "nosniff")
        if status == 204:
            return None
        value = json.loads(text)
        if status >= 300:
            self.assertEqual(headers["Content-Type"], "application/problem+json", path)
            self.assertEqual((value["status"], value["type"]), (status, "about:blank"))
        return value

    def test_nothing_is_answered_to_a_stranger(self):
        admin, viewer, stranger, ended = (self.client(who) for who in ("admin", "viewer", None, "admin"))
        description = admin.ok("GET", "/openapi.json")
        admin.ok("POST", "/luns", name="vm", type=15, location=self.volume, size=1 << 20)
        state = self.luns()
        with sqlite3.connect(os.path.join(self.env["ISCSI_HOST_STATE"], "state.db")) as database:
            database.execute("UPDATE sessions SET created = created - 90000, last_used = last_used - 90000 WHERE id = "
                             "(SELECT max(id) FROM sessions)")
        database.close()
        open_routes = set()
        for method, path, operation in self.routes(description):
            target = ROOT + path.replace("{lun}", "vm").replace("{", "").replace("}", "")
            for who in (stranger, ended):
                status, headers, text = who.raw(method, target)
                if operation["x-role"] == "anyone":
                    open_routes.add((method, path))
                    self.assertIn(status, (200, 400))
                else:
                    self.assertEqual((status, json.loads(text)["code"]), (401, 18990205), target)
                    self.assertEqual(headers["WWW-Authenticate"], "Bearer")
            if operation["x-role"] == "admin":
                self.assertEqual(viewer.raw(method, target)[0], 403, target)
        self.assertEqual(open_routes, {("GET", "/health"), ("POST", "/session")})
        self.assertEqual(self.luns(), state)
        self.assertEqual([lun["name"] for lun in viewer.ok("GET", "/luns")], ["vm"])
        for header in ("", "Bearer", "Bearer ", "Basic " + base64.b64encode(b"admin:" + PASSWORD.encode()).decode(),
                       "Bearer ' OR 1=1", "Bearer " + "0" * 64, "Bearer " + "x" * 5000):
            self.assertEqual(stranger.raw("GET", ROOT + "/luns", headers={"Authorization": header})[0], 401, header)
        viewer.ok("DELETE", "/session")
        self.assertEqual(viewer.call("GET", "/session")[0], 401)

    def test_log_ins_are_slowed_down(self):
        stranger = self.client()
        seen = {stranger.call("POST", "/session", account="admin", password=f"guess {number}")[0] for number in range(6)}
        self.assertEqual(seen, {401, 429})
        status, headers, text = stranger.raw("POST", ROOT + "/session", json.dumps({"account": "admin", "password": PASSWORD}),
                                             {"Content-Type": "application/json"})
        self.assertEqual((status, json.loads(text)["code"]), (429, 18990013))
        self.assertGreater(int(headers["Retry-After"]), 0)
        self.assertNotIn(b"token", text)

    def test_answers_are_as_described(self):
        admin = self.client("admin")
        description = admin.ok("GET", "/openapi.json")
        schemas = description["components"]["schemas"]
        told = set()

        def ask(method, path, at=None, **fields):
            value = admin.ok(method, at or path, **fields)
            responses = description["paths"][path][method.lower()]["responses"]
            if "204" in responses:
                self.assertIsNone(value, path)
            else:
                conforms(value, responses["200"]["content"]["application/json"]["schema"], schemas, f"{method} {path}")
            told.add((method, path))
            return value

        ask("GET", "/health")
        ask("GET", "/session")
        ask("POST", "/luns", name="vm", type=15, location=self.volume, size=1 << 20)
        snapshot = ask("POST", "/luns/{lun}/snapshots", "/luns/vm/snapshots", name="one")
        self.assertEqual(snapshot["taken_by"], "admin")
        one = "/snapshots/" + snapshot["uuid"]
        ask("POST", "/targets", name="t")
        ask("POST", "/luns/{lun}/map", "/luns/vm/map", targets=["t"])
        ask("GET", "/luns/{lun}", "/luns/lun%231")
        ask("GET", "/luns")
        ask("GET", "/luns", status=True)
        ask("PATCH", "/luns/{lun}", "/luns/vm", size=2 << 20)
        ask("GET", "/targets", lun="vm")
        ask("GET", "/targets/{target}", "/targets/t")
        ask("PUT", "/targets/{target}/masks", "/targets/t/masks", masks=[{"iqn": "iqn.2001-01.org.example:a", "permission": "r"}])
        ask("PATCH", "/targets/{target}/masks", "/targets/t/masks", add=[{"iqn": "default", "permission": "-"}])
        ask("GET", "/targets/{target}/masks", "/targets/t/masks")
        ask("GET", "/snapshots", lun="vm")
        ask("GET", "/snapshots/{snapshot}", one)
        ask("POST", "/snapshots/{snapshot}/lock", one + "/lock", app_key="k")
        self.assertEqual(admin.call("DELETE", one)[0], 409)
        ask("POST", "/snapshots/{snapshot}/unlock", one + "/unlock", app_key="k")
        ask("PUT", "/luns/{lun}/retention", "/luns/vm/retention", newest=3)
        ask("GET", "/luns/{lun}/retention", "/luns/vm/retention")
        ask("GET", "/luns/{lun}/retention/verdicts", "/luns/vm/retention/verdicts", newest=0, daily=1)
        ask("DELETE", "/luns/{lun}/retention", "/luns/vm/retention")
        schedule = ask("POST", "/schedules", lun="vm", rule="1h")
        ask("GET", "/schedules")
        ask("DELETE", "/schedules/{schedule}", f"/schedules/{schedule['schedule_id']}")
        ask("GET", "/events", count=5)
        ask("DELETE", "/snapshots/{snapshot}", one)
        self.assertEqual(admin.call("DELETE", "/luns/vm")[0], 409)
        ask("POST", "/luns/{lun}/unmap", "/luns/vm/unmap", targets=["t"])
        ask("DELETE", "/luns/{lun}", "/luns/vm")
        ask("DELETE", "/targets/{target}", "/targets/t")
        ask("GET", "/nodes")
        ask("GET", "/nodes/{node}", "/nodes/local")
        ask("GET", "/nodes/local/status")
        ask("GET", "/nodes/local/key")
        ask("GET", "/vluns")
        ask("DELETE", "/session")
        self.assertGreater(len(told), 35)

    def test_input_is_checked_as_described(self):
        admin = self.client("admin")
        description = admin.ok("GET", "/openapi.json")
        tried = 0
        for method, path, operation in self.routes(description):
            target = path.replace("{", "no-").replace("}", "")
            body = operation.get("requestBody", {}).get("content", {}).get("application/json", {}).get("schema")
            if body:
                fields, required = body["properties"], set(body.get("required", ()))
            else:
                query = [entry for entry in operation.get("parameters", ()) if entry["in"] == "query"]
                fields = {entry["name"]: entry["schema"] for entry in query}
                required = {entry["name"] for entry in query if entry["required"]}
            status, value = admin.call(method, target, **{"no-such": "1"})
            self.assertEqual((status, value["code"]), (400, 18990201), (method, path))
            self.assertIn("no-such", value["detail"])
            if required:
                self.assertRegex(admin.call(method, target)[1]["detail"], "is missing", (method, path))
            for name, schema in fields.items():
                for wrong in over_limit(schema):
                    if not body and (isinstance(wrong, (list, dict)) or schema["type"] == "string" and wrong == 1 or
                                     schema["type"] == "integer" and wrong == "1" or wrong == "true"):
                        continue # what a query cannot say
                    status, value = admin.call(method, target, **{name: wrong})
                    tried += 1
                    self.assertIn(status, (400, 404, 422), (method, path, name, wrong, value))
                    # The server itself refuses a NUL in a query.
                    self.assertRegex(value["detail"], f"^{name}|is missing|no proper HTTP", (method, path, name, wrong))
        self.assertGreater(tried, 150)
        self.assertEqual(self.luns(), [])

    def test_requests_that_are_none(self):
        admin = self.client("admin")
        lun = {"name": "a", "type": 7, "location": self.volume, "size": 1 << 20}

        def post(body, kind="application/json", path="/luns"):
            value = self.answer_of(admin.raw("POST", ROOT + path, body, {"Content-Type": kind} if kind else {}), path)
            return value["status"] if value and "status" in value and "code" in value else 200

        for body, status in (("x" * (1 << 20), 400), ("[" * 100000, 400), ("", 400),
                             ("null", 400), ("[]", 400), ('{"name":"a"', 400), (b'{"name":"\xff"}', 400),
                             ('{"name":"a","name":"b"}', 400), (json.dumps({**lun, "name": "a\r\nSet-Cookie: x=1"}), 422),
                             (json.dumps({**lun, "name": "../../a"}), 422), (json.dumps({**lun, "name": ".."}), 422),
                             (json.dumps({**lun, "location": self.volume + "/../volume"}), 422),
                             (json.dumps({**lun, "size": 10**400}), 400), (json.dumps({**lun, "size": -1}), 422)):
            self.assertEqual(post(body), status, body[:60])
        self.assertEqual(post(json.dumps(lun), kind="text/plain"), 415)
        self.assertEqual(post(json.dumps(lun), kind=None), 415)
        self.assertEqual(post(json.dumps(lun), path="/luns?size=1"), 400)
        self.assertEqual((self.luns(), self.files()), ([], []))
        self.assertEqual(post(json.dumps(lun), kind="Application/JSON; charset=utf-8"), 200)

        for path, status in (("/luns/../luns", 400), ("/luns/%2e%2e/luns", 400), ("/luns/..%2f..%2fetc%2fpasswd", 404),
                             ("/luns/%2e%2e%2f", 404), ("/luns/a%00", 400), ("/luns/%ff", 400), ("/luns/a%0d%0aX:y", 400),
                             ("/luns/a?status=1", 400), ("/luns?status=true&status=true", 400), ("/luns/%zz", 404),
                             ("/luns/" + "a" * 5000, 404), ("/luns/" + "a" * 9000, 431), ("/iscsi-webapi", 404)):
            value = self.answer_of(admin.raw("GET", ROOT + path), path[:60])
            self.assertEqual(value["status"], status, (path[:60], value))
        for target in ("/", "/iscsi-webapi", "/api/v1", "/api/v1/../../iscsi-webapi", "/none", "//api/v1/health"):
            self.assertIn(admin.raw("GET", target)[0], (400, 404), target)
        self.assertEqual(self.answer_of(admin.raw("BREW", ROOT + "/luns"), "")["status"], 501)
        self.assertEqual(self.answer_of(admin.raw("DELETE", ROOT + "/luns"), "")["status"], 405)
        self.assertNotIn("Set-Cookie", admin.raw("GET", ROOT + "/luns/a%0d%0aSet-Cookie:x")[1])

    def talk(self, *lines):
        """What the server says to these bytes; the connection, when it stays silent."""
        context = ssl._create_unverified_context()
        connection = context.wrap_socket(socket.create_connection((ADDRESS, 5443), timeout=120))
        self.addCleanup(connection.close)
        connection.sendall("\r\n".join(lines).encode())
        return connection

    def test_bodies_without_a_length(self):
        head = ("POST /api/v1/session HTTP/1.1", "Host: a")
        for lines, status in (((*head, "", ""), b"411"), ((*head, "Content-Length: x", "", ""), b"400"),
                              ((*head, "Content-Length: -1", "", ""), b"400"),
                              ((*head, f"Content-Length: {(1 << 20) + 1}", "", ""), b"413"),
                              ((*head, "Content-Length: 99999999999999999999", "", ""), b"4"),
                              ((*head, "Content-Length: 2", "Content-Length: 3", "", "{}"), b"400"),
                              ((*head, "Content-Length: 2", "Transfer-Encoding: chunked", "", "{}"), b"400")):
            self.assertRegex(self.talk(*lines).recv(4096), rb"^HTTP/1\.1 " + status, lines)
        with socket.create_connection((ADDRESS, 5443), timeout=120) as plain:
            plain.sendall(b"GET /api/v1/health HTTP/1.1\r\nHost: a\r\n\r\n")
            self.assertNotIn(b'"ok"', plain.recv(4096))

    def programs(self):
        """The process IDs of the requests that are being answered."""
        children = subprocess.run(["pgrep", "-P", str(self.server.pid), "-x", "iscsi-webapi"], capture_output=True, check=False)
        return [int(pid) for pid in children.stdout.split()]

    def wait_for(self, condition):
        deadline = time.monotonic() + 120
        while not (value := condition()):
            self.assertLess(time.monotonic(), deadline)
            time.sleep(0.02)
        return value

    def test_slow_clients_hold_up_nobody(self):
        for number in range(100):
            self.talk("POST /api/v1/session HTTP/1.1", "Host: a", "Content-Type: application/json",
                      "Content-Length: 100", "", '{"account"') if number % 2 else self.talk("GET /api/v1/health HT")
        started = time.monotonic()
        self.assertEqual(self.client().ok("GET", "/health")["status"], "ok")
        self.client("viewer").ok("GET", "/luns")
        self.assertLess(time.monotonic() - started, 20)  # then the server ends the slow ones
        self.wait_for(lambda: not self.programs())

    def test_a_client_that_leaves_does_not_stop_its_request(self):
        token = self.client("admin").headers["Authorization"]
        viewer = self.client("viewer")
        body = json.dumps({"name": "vm", "type": 15, "location": self.volume, "size": 1 << 20})
        database = sqlite3.connect(os.path.join(self.env["ISCSI_HOST_STATE"], "state.db"), isolation_level=None)
        self.addCleanup(database.close)
        self.wait_for(lambda: not self.programs()) # the log-ins' are not the one
        database.execute("BEGIN IMMEDIATE") # the request waits for its turn
        leaving = self.talk("POST /api/v1/luns HTTP/1.1", "Host: a", "Authorization: " + token,
                            "Content-Type: application/json", f"Content-Length: {len(body)}", "", body)
        program = self.wait_for(self.programs)[0]

        def is_ready():
            with open(f"/proc/{program}/status", encoding="ascii") as status:
                caught = next(int(line.split()[1], 16) for line in status if line.startswith("SigCgt"))
            return caught & 1 << (signal.SIGTERM - 1)

        self.wait_for(is_ready)
        leaving.close()
        os.kill(program, signal.SIGTERM) # as the server does when it notices
        database.execute("ROLLBACK")
        self.wait_for(lambda: [lun["name"] for lun in viewer.ok("GET", "/luns")] == ["vm"])
        self.wait_for(lambda: not self.programs())

    def test_certificate(self):
        pem = os.path.join(self.env["ISCSI_HOST_STATE"], "web", "server.pem")
        self.assertEqual((os.stat(pem).st_mode & 0o777, os.stat(os.path.dirname(pem)).st_mode & 0o777), (0o600, 0o700))

        def show():
            return subprocess.run([os.environ["ISCSI_HOST"], "certificate", "show"], env=self.env, capture_output=True,
                                  text=True, check=True).stdout

        before = show()
        der = subprocess.run("openssl s_client -connect 127.0.0.1:5443 </dev/null 2>/dev/null | openssl x509 -noout -pubkey |"
                             "openssl pkey -pubin -outform DER | openssl dgst -sha256 -binary", shell=True,
                             capture_output=True, check=True).stdout
        self.assertIn("sha256//" + base64.b64encode(der).decode() + "\n", before)
        for version in ("-tls1", "-tls1_1"):
            old = subprocess.run(["openssl", "s_client", version, "-cipher", "ALL:@SECLEVEL=0", "-connect", "127.0.0.1:5443"],
                                 stdin=subprocess.DEVNULL, capture_output=True, check=False)
            self.assertNotEqual(old.returncode, 0, version)

        mine, other = (os.path.join(self.folder, name) for name in ("mine", "other"))
        for name in (mine, other):
            subprocess.run(["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-subj", "/CN=mine", "-addext",
                            "subjectAltName=DNS:localhost", "-keyout", name + ".key", "-out", name + ".crt"],
                           check=True, capture_output=True)
        for certificate, key in ((mine + ".crt", other + ".key"), (mine + ".crt", mine + ".crt"), (mine + ".crt", "/dev/zero"),
                                 (mine + ".crt", "/none")):
            refused = subprocess.run([os.environ["ISCSI_HOST"], "certificate", "set", certificate, key], env=self.env,
                                     capture_output=True, text=True, check=False)
            self.assertEqual(refused.returncode, 1, (certificate, key))
            self.assertNotIn("PRIVATE", refused.stderr)
        self.assertEqual(show(), before)
        self.run_host("certificate", "set", mine + ".crt", mine + ".key")
        self.assertRegex(show(), r"subject +CN = mine\n")

    def test_many_clients_at_once(self):
        """Mixed reads and changes: every call succeeds, and every change lasts."""
        admin = self.client("admin")
        admin.ok("POST", "/targets", name="shared")
        admin.ok("PUT", "/targets/shared/masks", masks=[])
        tokens = [self.client("admin").headers for _ in range(4)]
        failures, kept, iqns = [], {}, set()

        def work(number):
            client = self.client()
            client.headers = dict(tokens[number % len(tokens)])
            name, iqn = f"lun-{number}", f"iqn.2001-01.org.example:{number}"
            client.ok("POST", "/luns", name=name, type=7, location=self.volume, size=1 << 20)
            client.ok("PATCH", "/targets/shared/masks", add=[{"iqn": iqn, "permission": "rw"}])
            size, schedule = 1 << 20, None
            for turn in range(CALLS // CLIENTS - 3):
                if turn % 8 == 3:
                    size += 512
                    client.ok("PATCH", "/luns/" + name, size=size)
                elif turn % 8 == 7:
                    if schedule:
                        client.ok("DELETE", f"/schedules/{schedule}")
                        schedule = None
                    else:
                        schedule = client.ok("POST", "/schedules", lun=name, rule=f"{turn}h")["schedule_id"]
                else:
                    client.ok("GET", ("/luns", "/luns/" + name, "/schedules", "/session", "/targets/shared/masks")[turn % 5])
            kept[name] = (size, schedule)
            iqns.add(iqn)

        def guarded(number):
            try:
                work(number)
            except Exception as failure: # pylint: disable=broad-except
                failures.append(f"client {number}: {failure!r}")

        threads = [threading.Thread(target=guarded, args=(number,)) for number in range(CLIENTS)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        self.assertEqual(failures, [])
        schedules = {entry["lun_name"]: entry["schedule_id"] for entry in admin.ok("GET", "/schedules")}
        self.assertEqual({lun["name"]: (lun["size"], schedules.get(lun["name"])) for lun in admin.ok("GET", "/luns")}, kept)
        self.assertEqual({mask["iqn"] for mask in admin.ok("GET", "/targets/shared/masks")}, iqns)
        self.assertEqual(len(kept), CLIENTS)
        self.assertEqual(len(self.files()), CLIENTS)


if __name__ == "__main__":
    main_in_namespaces()
