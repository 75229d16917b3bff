"""A web server that answers wrongly: the last segment of the path says how. Makes its key and certificate in the folder
given, prints its port, and ends with its standard input."""

import json
import os
import socketserver
import ssl
import subprocess
import sys
import threading

HEAD = b"HTTP/1.1 %d X\r\nContent-Type: %s\r\n"
JSON, PROBLEM = b"application/json", b"application/problem+json"
MIB = b"x" * (1 << 20)
ENDED = threading.Event()


def whole(body, kind=JSON, status=200):
    return [HEAD % (status, kind) + b"Content-Length: %d\r\n\r\n" % len(body) + body]


def chunked(chunks):
    yield HEAD % (200, JSON) + b"Transfer-Encoding: chunked\r\n\r\n"
    for chunk in chunks:
        yield b"%x\r\n%s\r\n" % (len(chunk), chunk)
    yield b"0\r\n\r\n"


def endless_headers():
    yield HEAD % (200, JSON)
    while True:
        yield b"X-Filler: " + b"x" * 1000 + b"\r\n"


def stalls(first):
    yield first
    ENDED.wait()


ANSWERS = {
    "good": lambda: whole(b'{"is_action_locked":true,"sync_progress":7}'),
    "empty": lambda: whole(b""),
    "none": lambda: [b"HTTP/1.1 204 X\r\n\r\n"],
    "silent": lambda: stalls(b""),
    "stalled": lambda: stalls(HEAD % (200, JSON) + b'Content-Length: 99\r\n\r\n{"is_'),
    "closed": lambda: [],
    "half": lambda: [HEAD % (200, JSON) + b'Content-Length: 99\r\n\r\n{"is_action'],
    "half-headers": lambda: [b"HTTP/1.1 200 OK\r\nContent-T"],
    "html": lambda: whole(b"<html>{}</html>", b"text/html"),
    "html-inside": lambda: whole(b"<html></html>"),
    "html-error": lambda: whole(b"<html></html>", b"text/html", 502),
    "garbage": lambda: [b"\x16\x03\x00 no HTTP at all\r\n\r\n"],
    "http09": lambda: [b'{"is_action_locked":true,"sync_progress":7}'],
    "chunk-garbage": lambda: [HEAD % (200, JSON) + b"Transfer-Encoding: chunked\r\n\r\nzz\r\n{}\r\n0\r\n\r\n"],
    "chunk-half": lambda: [HEAD % (200, JSON) + b"Transfer-Encoding: chunked\r\n\r\nff\r\n{}"],
    "huge": lambda: [HEAD % (200, JSON) + b"Content-Length: %d\r\n\r\n" % (65 << 20)] + [MIB] * 65,
    "huge-chunks": lambda: chunked([MIB] * 65),
    "headers": endless_headers,
    "redirect": lambda: [b"HTTP/1.1 302 X\r\nLocation: /api/v1/luns/good\r\nContent-Length: 0\r\n\r\n"],
    "huge-number": lambda: whole(b'{"is_action_locked":true,"sync_progress":18446744073709551616}'),
    "infinite": lambda: whole(b'{"is_action_locked":true,"sync_progress":1e999}'),
    "negative": lambda: whole(b'{"is_action_locked":true,"sync_progress":-1}'),
    "text-for-number": lambda: whole(b'{"is_action_locked":true,"sync_progress":"7"}'),
    "number-for-bool": lambda: whole(b'{"is_action_locked":1,"sync_progress":7}'),
    "missing": lambda: whole(b'{"sync_progress":7}'),
    "array": lambda: whole(b"[7]"),
    "null": lambda: whole(b"null"),
    "deep": lambda: whole(b'{"a":' * 1000 + b"7" + b"}" * 1000),
    "deep-arrays": lambda: whole(b"[" * 1000000),
    "two": lambda: whole(b'{"is_action_locked":true,"sync_progress":7}{}'),
    "no-utf8": lambda: whole(b'{"is_action_locked":true,"sync_progress":\xff}'),
    "refused": lambda: whole(b'{"code":18990531,"title":"No such LUN","detail":"gone\\u001b[2J"}', PROBLEM, 404),
    "no-code": lambda: whole(b'{"title":"Busy"}', PROBLEM, 503),
    "code-zero": lambda: whole(b'{"code":0}', PROBLEM, 500),
    "code-text": lambda: whole(b'{"code":"18990531"}', PROBLEM, 500),
    "code-huge": lambda: whole(b'{"code":18990531000000}', PROBLEM, 500),
    "code-array": lambda: whole(b'[18990531]', PROBLEM, 500),
}


class Handler(socketserver.StreamRequestHandler):
    def handle(self):
        lines = []
        while (line := self.rfile.readline(65536).strip()):
            lines.append(line.decode("latin-1"))
        if not lines:
            return
        method, path, _ = lines[0].split(" ")
        if path.endswith("/deaf"):
            return
        length = sum(int(line.split(":")[1]) for line in lines if line.lower().startswith("content-length:"))
        body = self.rfile.read(length).decode("latin-1")
        name = path.split("/")[-1].split("?")[0]
        if name == "session" and method == "POST":
            token = "t0ken" if json.loads(body) == {"account": "a\"lice", "password": "s3cret", "otp_code": "123456"} else ""
            answer = whole(json.dumps({"token": token}).encode())
        elif name == "session":
            answer = ANSWERS["none"]() if "Authorization: Bearer t0ken" in lines else ANSWERS["refused"]()
        elif name in ANSWERS:
            answer = ANSWERS[name]()
        else:
            answer = whole(json.dumps({"lines": lines, "body": body}).encode())
        for part in answer:
            self.wfile.write(part)


class Server(socketserver.ThreadingTCPServer):
    daemon_threads = True

    def __init__(self, context):
        super().__init__(("127.0.0.1", 0), Handler)
        self.context = context

    def finish_request(self, request, client_address):
        with self.context.wrap_socket(request, server_side=True) as connection:
            super().finish_request(connection, client_address)

    def handle_error(self, request, client_address):
        """The client goes away in most tests."""


def main():
    folder = sys.argv[1]
    pem = os.path.join(folder, "server.pem")
    subprocess.run(["openssl", "req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1", "-nodes",
                    "-days", "1", "-subj", "/CN=other.example", "-keyout", pem, "-out", pem + ".crt"],
                   check=True, stderr=subprocess.DEVNULL)
    context = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
    context.load_cert_chain(pem + ".crt", pem)
    with Server(context) as server:
        threading.Thread(target=server.serve_forever, daemon=True).start()
        print(server.server_address[1], flush=True)
        sys.stdin.read()
        ENDED.set()


main()
