"""Provisioning and pairing with a server behind a real forward proxy, and the collection of crash logs."""
import os
import pathlib
import signal
import subprocess
import sys
import tempfile
import unittest

from forward_proxy import ForwardProxy
from harness import BIN, DESCRIPTION, ServiceTest
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

    def fails(self, verb, url):
        """Domain, code and description of the error of a request that fails; the service then still answers."""
        status, dictionary, error = self.service.answer(verb, url)
        self.assertEqual((status, dictionary, self.service.orloctl("call", "x")[0]), (-1, None, 4))
        return error["domain"], error["code"], error["description"]

    def test_provisioning_passes_through_the_proxy_or_without_one(self):
        success = (0, {"exitStatus": 0, "response": {"name": "corvoSCProv", "statusCode": 0}})
        self.assertEqual(self.service.orloctl("provision", self.url("plain")), success)
        self.describe(status=3)  # no proxy to be had: the server is tried all the same
        self.assertEqual(self.service.orloctl("provision", self.url("plain/")), success)
        self.assertEqual(self.server.posts, [("/plain/provision", b"", True), ("/plain/provision", b"", False)])

    def test_provisioning_fails_with_the_reason(self):
        rows = [(self.url(behaviour), code, {}) for behaviour, code in (
            ("status-503", 503), ("status-302", 302), ("status-404", 404), ("endless", 23))]
        rows += [(f"https://127.0.0.1:{self.secured.server_port}/plain", 60, {})]  # behind the tunnel of the proxy
        rows += [(self.url("plain"), 5, {"HTTPProxy": proxy}) for proxy in ("", "user:secret@127.0.0.1")]
        rows += [("file:///etc/hostname", 1, {}), ("corvo", 3, {})]
        for url, expected, changes in rows:
            with self.subTest(url, changes=changes):
                self.describe(**changes)
                domain, code, description = self.fails("provision", url)
                self.assertEqual((domain, code, "secret" in description), ("BWCErrorDomain", expected, False))
        self.describe()
        self.proxy.close()
        self.assertEqual(self.fails("provision", self.url("plain"))[:2], ("BWCErrorDomain", 7))
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
                self.assertEqual(self.service.orloctl("pair", self.url("plain")),
                                 (0, {"exitStatus": 0, "response": {"name": "corvoSCPair", "statusCode": 0}}))
                self.assertEqual(self.service.read(FIRMWARE), PATCH)
                arguments, ignored, *descriptors = self.service.read("calibrated").decode().splitlines()
                self.assertEqual(arguments, "-ns /tmp/q21_isp_load.txt")
                self.assertEqual(int(ignored.split()[1], 16) >> (signal.SIGPIPE - 1) & 1, 0)
                self.assertEqual(descriptors, ["0", "1", "2", "3"])  # the last one is the listing's own
        self.assertEqual(self.server.posts, [("/plain/pair", b"", True), ("/plain/pair/result", b"0", True)] * 2)

    def test_pairing_fails_with_the_updater_and_the_server_hears_of_it(self):
        command = "VanterUpdaterExecCommand failed:"
        for step, reason in (("create", "Failed to create Vanter obj::error:"), ("isDone", command),
                             ("queryInfo", command), ("performNextStage", command)):
            with self.subTest(step):
                self.describe(fail=step)
                answer = self.service.orloctl("pair", self.url("plain"))[1]
                error, told = answer["response"]["error"], [message["text"] for message in answer["messages"]]
                self.assertEqual((error["domain"], error["code"]), ("BWCErrorDomain", -1))
                self.assertEqual((told[0].startswith(reason), told[-1], len(told)),
                                 (True, "Corvo SC pairing failed!!!", 3), told)
        results = [body for path, body, _ in self.server.posts if path == "/plain/pair/result"]
        self.assertEqual(results, [b"-1"] * 4)
        self.assertEqual(self.fails("pair", self.url("deaf"))[:2], ("BWCErrorDomain", 500))
        self.assertEqual(self.service.read(FIRMWARE), b"as delivered")
        self.assertFalse((self.root / "calibrated").exists())


class CrashLogs(ServiceTest):
    def setUp(self):
        super().setUp()
        self.logs, self.varrow = "private/var/logs/", "private/var/mobile/Library/Logs/Varrow/"
        (self.root / self.logs).mkdir(parents=True)
        self.copies = self.root / "copies"
        self.service.write("System/Library/Quennel/SystemVersion.plist",
                           b"<plist><dict><key>ProductBuildVersion</key><string>21A55</string></dict></plist>")

    def collect(self):
        return self.service.orloctl("crash-logs", "-o", self.copies)

    def test_the_collected_files_are_listed_and_copied(self):
        panic = b'{"os_version": "Quennel 3.1 (21A55)"}\npanic\n'
        rows = (  # newest first
            (self.logs + "a.log", b"first\x00\xff", False, "a.log", "2023-11-14T22:13:20Z"),
            (self.logs + "panic-full-1.ips", panic, True, "panic-full-1.ips", "2023-11-14T22:13:19Z"),
            (self.varrow + "a.log", b"second", False, "2-a.log", "2023-11-14T22:13:19Z"),
        )
        expected = []
        for number, (name, contents, is_panic, copy, date) in enumerate(rows):
            self.service.write(name, contents)
            os.utime(self.root / name, ns=(0, 1_700_000_000_000_000_000 - number))
            expected.append({"name": "/" + name, "date": date, "size": len(contents), "panic": is_panic,
                             "copy": str(self.copies / copy)})
        self.assertEqual(self.collect(), (0, {"exitStatus": 0, "status": 0, "logs": expected}))
        for name, contents, _, copy, _ in rows:
            self.assertEqual((self.copies / copy).read_bytes(), contents)
            self.assertEqual((self.copies / copy).stat().st_mtime_ns, (self.root / name).stat().st_mtime_ns)
        self.assertEqual(len(os.listdir(self.copies)), 3)

    def test_what_cannot_be_looked_at_is_missed_and_said_so(self):
        header = b'{"os_version": "21A55"}\n'
        self.service.write(self.logs + "panic-huge.log", header)
        os.truncate(self.root / self.logs / "panic-huge.log", 1 << 42)  # a hole, more than memory or a disk holds
        os.mkfifo(self.root / self.logs / "fifo.log")
        os.symlink("/etc/hostname", self.root / self.logs / "out.log")
        (self.root / self.varrow).parent.mkdir(parents=True)
        os.symlink("/", self.root / self.varrow.rstrip("/"))
        status, answer = self.collect()
        self.assertEqual((status, [log["size"] for log in answer["logs"]]), (2, [1 << 42]))
        self.assertEqual((self.copies / "panic-huge.log").stat().st_size, 1 << 42)
        with open(self.copies / "panic-huge.log", "rb") as copy:
            self.assertEqual(copy.read(len(header) + 1), header + b"\0")
        self.assertEqual({entry["name"] for entry in answer["missed"] if entry["note"]},
                         {f"/{self.logs}fifo.log", f"/{self.logs}out.log", f"/{self.varrow}"})
        self.service.environment["VELTRA_DEVICE_ROOT"] = "/missing"
        done = self.service.run(BIN / "orloctl", "crash-logs", stderr=subprocess.PIPE)
        self.assertEqual((done.returncode, done.stdout), (2, ""))
        self.assertIn("device root /missing: No such file", done.stderr)

    def test_a_log_that_cannot_be_copied_holds_up_no_other(self):
        copies = self.copies
        (copies / "directory.log").mkdir(parents=True)
        os.symlink(copies / "victim", copies / "link.log")
        os.mkfifo(copies / "fifo.log")
        (copies / "earlier.log").write_bytes(b"earlier")
        os.link(copies / "earlier.log", copies / "hard link")
        no_text = b"\xff" * 251 + b".log"  # a legal name; as text it is three times as long
        longest = b"a" * 250 + b".ips"
        for name in (b"directory.log", b"link.log", b"fifo.log", b"earlier.log", no_text, longest):
            self.service.write(self.logs + os.fsdecode(name), name[:9])
        self.service.write(self.varrow + os.fsdecode(longest), b"second")
        previous = os.umask(0)
        self.addCleanup(os.umask, previous)
        status, answer = self.collect()
        self.assertEqual((status, answer["exitStatus"], len(answer["logs"])), (2, 2, 7))
        self.assertIn(str(copies), answer["problem"])
        copied = {"earlier.log": b"earlier.l", "\ufffd" * 83 + ".log": no_text[:9], os.fsdecode(longest): longest[:9],
                  "2-" + "a" * 249 + ".ips": b"second"}
        failed = {"directory.log", "link.log", "fifo.log"}
        self.assertEqual({log["copy"] for log in answer["logs"] if "copy" in log}, {f"{copies}/{name}" for name in copied})
        self.assertEqual({log["note"].split(": ")[0] for log in answer["logs"] if "note" in log},
                         {f"not copied to {copies}/{name}" for name in failed})
        self.assertEqual(set(os.listdir(copies)), copied.keys() | failed | {"hard link"})
        for name, contents in copied.items():
            self.assertEqual((copies / name).read_bytes(), contents)
            self.assertEqual((copies / name).stat().st_mode & 0o7777, 0o600)
        self.assertEqual((copies / "hard link").read_bytes(), b"earlier")

    def test_the_list_for_people(self):
        crash_logs = [BIN / "orloctl", "crash-logs"]
        self.assertEqual(self.service.run(*crash_logs).stdout, "status: 45\nlogs: none\n")
        self.assertEqual(self.service.run(*crash_logs, "-o", self.copies).returncode, 0)
        self.service.write(self.logs + "a\n.log", b"x" * 1000)
        os.utime(self.root / self.logs / "a\n.log", (0, 1_700_000_000))
        self.assertEqual(
            self.service.run(*crash_logs).stdout,
            "status: 0\nlogs:\n  DATE                          SIZE  PANIC  NAME\n"
            "  2023-11-14T22:13:20Z          1000  false  /private/var/logs/a\\n.log\n",
        )
        (self.copies / "a\n.log").mkdir()
        done = self.service.run(*crash_logs, "-o", self.copies, stderr=subprocess.PIPE)
        self.assertEqual((done.returncode, len(done.stdout.splitlines())), (2, 4), done)
        self.assertIn("/private/var/logs/a\\n.log  not copied to ", done.stdout)
        self.assertTrue(done.stderr.startswith("orloctl: Not all logs were copied to "), done.stderr)

    def test_a_device_without_logs_is_a_success(self):
        self.assertEqual(self.service.orloctl("crash-logs"), (0, {"exitStatus": 0, "status": 45, "logs": []}))
        status, answer = self.service.orloctl("crash-logs", "-o", "/dev/null/folder")
        self.assertEqual((status, answer["exitStatus"], "/dev/null/folder" in answer["problem"]), (2, 2, True))


if __name__ == "__main__":
    unittest.main()
