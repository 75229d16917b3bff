"""A call of the web API, beside a CGI program that does nothing and a static file, all three on one server with one configuration."""
import json
import os
import secrets
import shutil
import socket
import ssl
import statistics
import subprocess
import time
import urllib.request
from contextlib import contextmanager

from machines import ADDRESS, VOLUME, run
from report import heading, row

HERE = os.path.dirname(os.path.abspath(__file__))
INSTALLED = "/usr/libexec/iscsi-host/webapi"
PLACE = "/run/bench-web"  # what the server is given in place of INSTALLED
PORT = 5443
ROUNDS, SECONDS = 9, 0.5


@contextmanager
def undisturbed():
    """Programs that start meanwhile run before all others: otherwise a busy machine lets a program of 1 ms through and makes one of
    4 ms wait, and the ratio says more about the machine than about the programs."""
    os.sched_setscheduler(0, os.SCHED_RR, os.sched_param(1))
    try:
        yield
    finally:
        os.sched_setscheduler(0, os.SCHED_OTHER, os.sched_param(0))


@contextmanager
def server():
    """The web API's server, which besides answers below /bench/ from a folder."""
    os.makedirs(f"{PLACE}/files/bench")
    for part in ("cgi", "errors"):
        os.symlink(f"{INSTALLED}/{part}", f"{PLACE}/{part}")
    shutil.copy(f"{HERE}/empty_cgi", f"{PLACE}/files/bench/empty")
    with open(f"{PLACE}/iscsi-webapi.conf", "w", encoding="ascii") as configuration:
        configuration.write(f"""include "{INSTALLED}/iscsi-webapi.conf"
$HTTP["url"] =~ "^/bench/" {{
    server.document-root = "{PLACE}/files"
    url.rewrite-once = ()
    cgi.assign = ("/empty" => "")
}}
""")
    daemon = subprocess.Popen(["iscsi-host", "web", "run"], env=dict(os.environ, ISCSI_HOST_WEBAPI=PLACE),
                              stdin=subprocess.DEVNULL, stderr=subprocess.DEVNULL, start_new_session=True)
    try:
        for _ in range(200):
            with socket.socket() as probe:
                if probe.connect_ex((ADDRESS, PORT)) == 0:
                    break
            time.sleep(0.05)
        yield f"https://{ADDRESS}:{PORT}"
    finally:
        daemon.terminate()
        daemon.wait()


def log_in(base):
    """A session's token."""
    password = secrets.token_hex(8)
    run("iscsi-host", "account", "add", "bench", "--role", "admin", "--password-file", "-", input=password + "\n")
    unchecked = ssl.create_default_context()
    unchecked.check_hostname, unchecked.verify_mode = False, ssl.CERT_NONE
    body = json.dumps({"account": "bench", "password": password}).encode()
    request = urllib.request.Request(f"{base}/api/v1/session", body, {"Content-Type": "application/json"})
    with urllib.request.urlopen(request, context=unchecked, timeout=30) as answer:
        return json.load(answer)["token"]


def measured(urls, clients, token):
    """For each URL the medians of the time of an answer and of answers per second, taken in turn."""
    rounds = [[json.loads(run(f"{HERE}/https_load", url, str(clients), str(SECONDS), env=dict(os.environ, TOKEN=token)))
               for url in urls] for _ in range(ROUNDS)]
    return [[statistics.median(one[key] for one in column) for key in ("median_us", "per_second", "bytes")]
            for column in zip(*rounds)]


def api_calls(count=100):
    heading(f"An API call (list of {count} LUNs) beside an empty CGI program; TLS, one connection a client")
    for number in range(len(json.loads(run("iscsictl", "lun", "list", "--json"))), count):
        run("iscsictl", "lun", "create", f"api-{number}", "--location", VOLUME, "--size", "16M")
    with undisturbed(), server() as base:
        token = log_in(base)
        luns = f"{base}/api/v1/luns"
        size = int(measured([luns], 1, token)[0][2])
        with open(f"{PLACE}/files/bench/static", "wb") as static:
            static.write(b" " * size)
        for clients in (1, 8):
            ours, empty, static = measured([luns, f"{base}/bench/empty", f"{base}/bench/static"], clients, token)
            if ours[2] != size:
                raise SystemExit(f"the list has {ours[2]} bytes, and had {size}")
            who = f"{clients} client{'s' if clients > 1 else ''}"
            own = ours[0] - empty[0]
            row(f"time of an answer, {who}", ours[0] / 1000, empty[0] / 1000, "ms", ours[0] / empty[0])
            row("  our own part of it", own / 1000, empty[0] / 1000, "ms", own / empty[0], 2)
            row("  beside a static file of that size", ours[0] / 1000, static[0] / 1000, "ms", ours[0] / static[0])
            row(f"answers, {who}", ours[1], empty[1], "/s", empty[1] / ours[1])
