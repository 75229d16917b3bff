"""A client of the web API, and an appliance with its web server."""

import http.client
import json
import os
import signal
import socket
import ssl
import subprocess
import time
import urllib.parse

from appliance import Appliance, ISCSI_HOST

ADDRESS = "127.0.0.1"
IDLE_LIMIT = 4  # seconds; the server keeps an idle connection for ten
PASSWORD = "correct horse battery"
ROOT = "/api/v1"


class Client:
    """One connection, kept as long as the server keeps it; a session when one was opened."""

    def __init__(self, pem=None, port=5443, source=None):
        context = ssl.create_default_context(cafile=pem) if pem else ssl._create_unverified_context()
        self.connection = http.client.HTTPSConnection("localhost", port, timeout=300, context=context, source_address=source)
        self.headers = {}
        self.used = time.monotonic()

    def login(self, account, password=PASSWORD):
        self.headers["Authorization"] = "Bearer " + self.ok("POST", "/session", account=account, password=password)["token"]
        return self

    def raw(self, method, target, body=None, headers=None):
        """Status, headers and body as they came."""
        if time.monotonic() - self.used > IDLE_LIMIT:
            self.connection.close()  # the server may be doing the same
        try:
            self.connection.request(method, target, body=body, headers={**self.headers, **(headers or {})})
            response = self.connection.getresponse()
        except (http.client.RemoteDisconnected, ConnectionResetError, BrokenPipeError):
            # The server ends a connection after so many requests; it answered none of the kind that changes something then.
            self.connection.close()
            if method != "GET":
                raise
            self.connection.request(method, target, body=body, headers={**self.headers, **(headers or {})})
            response = self.connection.getresponse()
        answer = response.status, response.headers, response.read()
        self.used = time.monotonic()
        return answer

    def call(self, method, path, **fields):
        """Status and JSON value."""
        if method in ("GET", "DELETE"):
            query = urllib.parse.urlencode({name: str(value).lower() if isinstance(value, bool) else value
                                            for name, value in fields.items()})
            status, _, text = self.raw(method, ROOT + path + ("?" + query if query else ""))
        else:
            status, _, text = self.raw(method, ROOT + path, json.dumps(fields), {"Content-Type": "application/json"})
        return status, json.loads(text) if text else None

    def ok(self, method, path, **fields):
        status, value = self.call(method, path, **fields)
        if status not in (200, 204):
            raise AssertionError(f"{method} {path}: {status} {value}")
        return value


class Served(Appliance):
    """An appliance whose daemons and web server run, with one account for each role."""

    def setUp(self):
        super().setUp()
        self.run_host("init")
        for role in ("admin", "viewer"):
            subprocess.run([ISCSI_HOST, "account", "add", role, "--role", role, "--password-file", "-"], env=self.env,
                           input=PASSWORD + "\n", text=True, check=True, stdout=subprocess.DEVNULL)
        self.run_host("boot")
        self.addCleanup(self.run_host, "stop")
        self.run_host("web", "set", "--address", ADDRESS)
        self.serve()

    def serve(self):
        with open(os.path.join(self.folder, "web.log"), "ab") as log:
            self.server = subprocess.Popen([ISCSI_HOST, "web", "run"], env=self.env, stderr=log)
        self.addCleanup(self.server.wait)
        self.addCleanup(self.server.send_signal, signal.SIGTERM)
        deadline = time.monotonic() + 120
        while True:
            try:
                return socket.create_connection((ADDRESS, 5443)).close()
            except ConnectionRefusedError:
                if self.server.poll() is not None or time.monotonic() > deadline:
                    with open(os.path.join(self.folder, "web.log"), encoding="utf-8") as text:
                        raise AssertionError(text.read()) from None
                time.sleep(0.05)

    def client(self, account=None, **kwargs):
        client = Client(os.path.join(self.env["ISCSI_HOST_STATE"], "web", "server.pem"), **kwargs)
        self.addCleanup(client.connection.close)
        return client.login(account) if account else client
