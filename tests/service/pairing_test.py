"""Provisioning and pairing with a server behind a real forward proxy."""
import pathlib
import signal
import sys
import tempfile
import unittest

from forward_proxy import ForwardProxy
from harness import DESCRIPTION, SUCCESS, ServiceTest
from hostile_server import HostileServer
from lab import Authority

FIRMWARE, CALIBRATION = "var/lib/vanter/firmware.bin", "usr/local/bin/q21isp"
PATCH = b"\x00patch\xff" * 1000


class Pairing(ServiceTest):
    def setUp(self):
        super().setUp()
        folder = tempfile.TemporaryDirectory(prefix="veltra-net-")
        self.addCleanup(folder.cleanup)
        folder = pathlib.Path(folder.name)
        self.server = self.closing(HostileServer(None, None, b"the ticket"))
        self.secured = self.closing(HostileServer(*Authority(folder).certify("store"), b"the ticket"))
        self.proxy = self.closing(ForwardProxy(folder, f"ConnectPort {self.secured.server_port}"))
        self.describe()
        self.service.write("var/mobile/Vanter.BE-Prod.fw", PATCH)
        self.service.write(FIRMWARE, b"as delivered")
        self.calibrate("echo started >&3")

    def calibrate(self, script):
        """Makes the calibration tool, whose descriptor 3 is a file of the test."""
        self.service.write(CALIBRATION, f"#!/bin/sh\nexec 3>{self.root}/calibrated\n{script}\n".encode(), 0o755)

    def describe(self, status=1, fail=None, **proxy):
        settings = {}
        for scheme in ("HTTP", "HTTPS"):
            settings |= {scheme + "Enable": 1, scheme + "Proxy": "127.0.0.1", scheme + "Port": self.proxy.port}
        self.service.describe(
            reverseProxy={"events": [{"status": status, "afterMs": 0}], "proxy": settings | proxy},
            vanter={"firmware": "/" + FIRMWARE} | ({"fail": fail} if fail else {}),
        )

    def url(self, behaviour):
        return f"http://127.0.0.1:{self.server.server_port}/{behaviour}"

    def test_provisioning_passes_through_the_proxy_or_without_one(self):
        self.assertEqual(self.service.answer("provision", self.url("plain")), SUCCESS)
        self.describe(status=3)  # no proxy to be had: the server is tried all the same
        self.assertEqual(self.service.answer("provision", self.url("plain/")), SUCCESS)
        self.assertEqual(self.server.posts, [("/plain/provision", b"", True), ("/plain/provision", b"", False)])

    def test_provisioning_fails_with_the_reason(self):
        rows = [(self.url("status-503"), 503, {}), (self.url("status-302"), 302, {}), (self.url("endless"), 23, {})]
        rows += [(f"https://127.0.0.1:{self.secured.server_port}/plain", 60, {})]  # behind the tunnel of the proxy
        rows += [(self.url("plain"), 5, {"HTTPProxy": proxy}) for proxy in ("", "user:secret@127.0.0.1")]
        rows += [("file:///etc/hostname", 1, {}), ("corvo", 3, {})]
        for url, expected, changes in rows:
            with self.subTest(url, changes=changes):
                self.describe(**changes)
                error = self.service.answer("provision", url)[2]
                self.assertEqual((error["domain"], error["code"]), ("BWCErrorDomain", expected))
                self.assertNotIn("secret", error["description"])
        self.describe()
        self.proxy.close()
        self.assertEqual(self.service.answer("provision", self.url("plain"))[2]["code"], 7)
        self.assertEqual(self.secured.posts, [])

    def test_pairing_installs_the_patch_calibrates_and_tells_the_server(self):
        """The tool gets a clean start, however the service was started."""
        self.calibrate('(echo "$@"; grep SigIgn /proc/self/status) >&3; exec ls /proc/self/fd >&3 3>&-')
        for case, change in (("standard error closed", "os.close(2)"),
                             ("nobody reads standard error", "r, w = os.pipe(); os.dup2(w, 2)")):
            with self.subTest(case):
                self.service.stop()
                # Python ignores SIGPIPE, and what it executes inherits that.
                self.service.start(sys.executable, "-c",
                                   f"import os, sys; {change}; os.execv(sys.argv[1], sys.argv[1:])")
                description = self.service.read(DESCRIPTION)
                (self.root / DESCRIPTION).unlink()  # of which the console is told
                self.assertEqual(self.service.orloctl("call", "x")[0], 4)
                self.service.write(DESCRIPTION, description)
                self.service.write(FIRMWARE, b"as delivered")
                self.assertEqual(self.service.answer("pair", self.url("plain")), SUCCESS)
                self.assertEqual(self.service.read(FIRMWARE), PATCH)
                arguments, ignored, *descriptors = self.service.read("calibrated").decode().splitlines()
                self.assertEqual(arguments, "-ns /tmp/q21_isp_load.txt")
                self.assertEqual(int(ignored.split()[1], 16) >> (signal.SIGPIPE - 1) & 1, 0)
                self.assertEqual(descriptors, ["0", "1", "2", "3"])  # the last one is the listing's own
        self.assertEqual(self.server.posts, [("/plain/pair", b"", True), ("/plain/pair/result", b"0", True)] * 2)
        self.assertEqual(self.service.answer("pair", self.url("deaf"))[2]["code"], 500)

    def test_a_ticket_arrives_byte_for_byte_or_not_at_all(self):
        self.describe(status=3, fail="create")
        for behaviour, ticket, code in (
            ("plain", b"\0a\r\n\0", -1), ("plain", b"", -1), ("chunked", b"a\0b", -1), ("status-204", b"", -1),
            ("status-404", None, 404), ("half", None, 18),
        ):
            with self.subTest((behaviour, ticket)):
                self.server.trust_object = ticket
                self.server.posts.clear()
                answer = self.service.orloctl("-v", "pair", self.url(behaviour))[1]
                self.assertEqual(answer["response"]["error"]["code"], code)
                told = [f"value of ticket is:<{ticket.hex()}>"] if ticket is not None else []
                self.assertEqual([message["text"] for message in answer["messages"] if "ticket is" in message["text"]], told)
                results = [(f"/{behaviour}/pair/result", b"-1", False)] if told else []
                self.assertEqual(self.server.posts, [(f"/{behaviour}/pair", b"", False), *results])



if __name__ == "__main__":
    unittest.main()
