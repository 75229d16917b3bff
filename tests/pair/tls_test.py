"""Sending inside TLS: what passes on the wire, who is refused, and what happens when stunnel ends or is not there."""
import contextlib
import json
import os
import re
import signal
import socket
import struct
import subprocess
import threading

from cases import MIB, main
from pair import BRIDGE_ADDRESS, kill, run, wait_until
from replication_cases import SLOWEST, ReplicationTest

TLS_PORT, DATA_PORT, WEB_PORT = 3263, 3261, 5443
PATTERN = 0xA5
STUNNEL = "/usr/bin/stunnel4"
ETH_P_ALL = 3


def is_listening(address, port):
    with socket.socket() as probe:
        return probe.connect_ex((address, port)) == 0


class Wire:
    """While it is entered: what passes between the two appliances."""

    def __init__(self, one, two):
        self.ends = {socket.inet_aton(one.address), socket.inet_aton(two.address)}
        self.served, self.has_pattern = set(), False  # ports of `two` that got data, and whether the pattern was among it
        self.address, self.card = socket.inet_aton(two.address), two.name
        self.needle = bytes([PATTERN]) * 64

    def __enter__(self):
        self.socket = socket.socket(socket.AF_PACKET, socket.SOCK_RAW, socket.htons(ETH_P_ALL))
        self.socket.setsockopt(socket.SOL_SOCKET, 33, 64 * MIB)  # SO_RCVBUFFORCE
        self.socket.bind((self.card, 0))
        self.socket.settimeout(0.2)
        self.ending = False
        self.reader = threading.Thread(target=self._read)
        self.reader.start()
        return self

    def __exit__(self, *failure):
        self.ending = True
        self.reader.join()
        self.socket.close()

    def _read(self):
        while True:
            try:
                self._take(self.socket.recv(1 << 17))
            except socket.timeout:
                if self.ending:
                    return

    def _take(self, frame):
        if frame[12:14] != b"\x08\x00" or frame[23] != socket.IPPROTO_TCP or {frame[26:30], frame[30:34]} != self.ends:
            return
        tcp = 14 + (frame[14] & 15) * 4
        data = frame[tcp + (frame[tcp + 12] >> 4) * 4:]
        if data and frame[30:34] == self.address:
            self.served.add(struct.unpack_from(">H", frame, tcp + 2)[0])
            self.has_pattern = self.has_pattern or self.needle in data


class Tls(ReplicationTest):
    def send_encrypted(self, snapshot):
        self.one.iscsictl("replication", "send", self.task, snapshot, "--encrypted", "--watch", timeout=240)

    def refuse_encrypted(self, snapshot, *options, says):
        """Its sending fails for a reason that is told or logged."""
        logged = len(self.one.log_lines)
        result = self.one.run("iscsictl", "replication", "send", self.task, snapshot, "--encrypted", *options, check=False)
        wait_until(lambda: re.search(says, result.stderr + "".join(self.one.log_lines[logged:])), f"the log says {says}")
        self.give_up()

    def give_up(self):
        """No further tries of a sending that failed."""
        kill(self.one.processes("iscsictl"))
        self.wait_idle()

    def check(self, address, port, **options):
        return self.one.iscsictl("node", "check", self.two.address, "--address", address, "--port", str(port), **options)

    def refuse_check(self, address, port, says):
        self.refused(self.one, "node", "check", self.two.address, "--address", address, "--port", str(port), says=says)

    def servers(self, appliance):
        """Its stunnels that do not belong to a sending."""
        def leads(pid):
            with contextlib.suppress(ProcessLookupError):
                return os.getpgid(pid) == pid
        return [pid for pid in appliance.processes("stunnel4") if leads(pid)]

    def senders(self, appliance):
        return set(appliance.processes("stunnel4")) - set(self.servers(appliance))

    def tls(self, appliance):
        status = json.loads(appliance.host("status", "--json"))
        return status["tls_port"] or status["tls_problem"]

    def restart_stunnel(self):
        """Kills the one that serves; the supervisor's next one."""
        old = self.servers(self.two)
        os.kill(old[0], signal.SIGKILL)
        wait_until(lambda: self.servers(self.two) not in ([], old) and self.tls(self.two) == TLS_PORT, "stunnel serves again")

    def exchange_key(self, key):
        """Gives the second appliance this ROD key; the one that it had."""
        change = ("import sqlite3, sys; state = sqlite3.connect('/var/lib/iscsi-host/state.db', isolation_level=None);"
                  "print(*state.execute(\"SELECT value FROM settings WHERE key = 'rod_key'\").fetchone());"
                  "state.execute(\"UPDATE settings SET value = ? WHERE key = 'rod_key'\", sys.argv[1:])")
        return self.two.run("python3", "-c", change, key).stdout.strip()

    def test_wire(self):
        self.change(self.one, 1, 1024, PATTERN)
        with Wire(self.one, self.two) as encrypted:
            self.send_encrypted(first := self.take("first"))
        self.expect_replica(first)
        self.assertEqual((encrypted.served, encrypted.has_pattern), ({TLS_PORT, WEB_PORT}, False))
        self.assertEqual(self.senders(self.one), set())

        self.change(self.one, 5, 1024, PATTERN)
        with Wire(self.one, self.two) as plain:
            self.send(second := self.take("second"))
        self.expect_replica(second)
        self.assertEqual((plain.served, plain.has_pattern), ({DATA_PORT, WEB_PORT}, True))

    def test_strangers(self):
        snapshot = self.take("kept")
        for port in (0, DATA_PORT, TLS_PORT):
            self.check(self.two.address, port)
        self.refuse_check(self.two.address, 3299, "nothing answers at 192.0.2.12:3299")
        self.refuse_check(self.two.address, WEB_PORT, "no iSCSI portal answers at 192.0.2.12:5443")
        self.refuse_encrypted(snapshot, "--port", "3299", says="192.0.2.12:3299.*refused")

        # The peer's key is another one than its stunnel was started with.
        right = self.exchange_key("another")
        self.refuse_check(self.two.address, TLS_PORT, "18991104")
        self.refuse_encrypted(snapshot, says="192.0.2.12:3263 has another ROD key")
        self.exchange_key(right)
        self.check(self.two.address, TLS_PORT)

        # Who has no key, but a certificate.
        run("openssl", "req", "-new", "-x509", "-nodes", "-subj", "/CN=two", "-keyout", "/tmp/key.pem", "-out", "/tmp/cert.pem")
        stranger = subprocess.Popen(["openssl", "s_server", "-accept", f"{BRIDGE_ADDRESS}:{TLS_PORT}", "-cert", "/tmp/cert.pem", "-key",
                                     "/tmp/key.pem", "-tls1_3", "-quiet"], stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                                    stderr=subprocess.DEVNULL)
        try:
            wait_until(lambda: is_listening(BRIDGE_ADDRESS, TLS_PORT), "the stranger listens")
            self.refuse_encrypted(snapshot, "--address", BRIDGE_ADDRESS, says="192.0.2.1:3263: the TLS handshake failed")
        finally:
            stranger.kill()
        self.assertEqual(stranger.communicate()[0], b"", "it was told nothing")
        self.send_encrypted(snapshot)
        self.expect_replica(snapshot)

    def test_killed(self):
        for name, disturb in (
                ("server", self.restart_stunnel),
                ("tunnel", lambda: kill(self.senders(self.one))),
                ("worker", lambda: self.one.kill("iscsictl"))):
            with self.subTest(name):
                self.change(self.one, 0, 32 * 1024, len(name) + ord(name[0]))
                snapshot = self.take(name)
                self.slow(SLOWEST)
                self.one.iscsictl("replication", "send", self.task, snapshot, "--encrypted")
                wait_until(lambda: self.sending()["sent_size"] > 4 * MIB, "data flows")
                before = self.senders(self.one)
                self.assertEqual(len(before), 1)
                disturb()
                wait_until(lambda: not before & self.senders(self.one), "the sender's stunnel ends")
                self.full_speed()
                self.give_up()
                self.send_encrypted(snapshot)
                self.expect_replica(snapshot)

    def test_without_stunnel(self):
        snapshot = self.take("kept")
        for appliance in (self.two, self.one):
            appliance.run("mount", "--bind", "/dev/null", STUNNEL)
        os.kill(self.servers(self.two)[0], signal.SIGKILL)
        try:
            self.refuse_encrypted(snapshot, says="stunnel is not installed")
            self.one.run("umount", STUNNEL)
            wait_until(lambda: self.tls(self.two) == "stunnel is not installed", "it is missed")
            self.refuse_encrypted(snapshot, says="the peer takes no encrypted sendings")
            self.send(snapshot)
            self.expect_replica(snapshot)
        finally:
            self.one.run("umount", STUNNEL, check=False)
            self.two.run("umount", STUNNEL)
        wait_until(lambda: self.tls(self.two) == TLS_PORT, "it serves again")
        warnings = [line for line in self.two.log_lines if "no encrypted sendings to this appliance" in line]
        self.assertEqual(len(warnings), 1, warnings)


if __name__ == "__main__":
    main()
